"""The files that are indexed: taken from Debian packages, unpacked into the build folder and never
installed, so that they are the same on every machine with the same packages."""

import os
import pathlib
import re
import shutil
import subprocess
import sys

SMALL = ("linux-doc-6.1", "postgresql-doc-15", "python3.11-doc", "git-doc")
LARGE = "linux-source-6.1"
COPIES = 16
CAROL, WORK, ROOT = 60003, 60102, 0
LONG_WORD = re.compile(rb"[A-Za-z]{9,}")


def say(text):
    print(f"bench: {text}", file=sys.stderr, flush=True)


def unpack(packages, folder):
    """Downloads packages and unpacks them below the folder."""
    folder.mkdir(parents=True)
    subprocess.run(["apt-get", "download", "-q", "-o", "APT::Sandbox::User=root", *packages],
                   cwd=folder, check=True, stdout=subprocess.DEVNULL)
    for archive in sorted(folder.glob("*.deb")):
        subprocess.run(["dpkg-deb", "-x", archive, folder], check=True)
        archive.unlink()


def copy_files(source, target, change=lambda name, data: data, keep=lambda path: True):
    """Copies the plain files of a folder; `change` may alter what is in them."""
    count = 0
    for path in sorted(source.rglob("*")):
        if path.is_symlink() or not path.is_file() or not keep(path):
            continue
        place = target / path.relative_to(source)
        place.parent.mkdir(parents=True, exist_ok=True)
        place.write_bytes(change(path.name, path.read_bytes()))
        count += 1
    return count


def make_small(target, _corpora):
    packed = target.with_suffix(".packed")
    shutil.rmtree(packed, ignore_errors=True)
    unpack(SMALL, packed)
    copy_files(packed / "usr/share/doc", target, keep=lambda path: path.suffix != ".gz")
    shutil.rmtree(packed)


def make_large(target, _corpora):
    packed = target.with_suffix(".packed")
    shutil.rmtree(packed, ignore_errors=True)
    unpack([LARGE], packed)
    target.mkdir(parents=True)
    [archive] = (packed / "usr/src").glob("*.tar.xz")
    subprocess.run(["tar", "-xJf", archive, "-C", target], check=True)
    shutil.rmtree(packed)


def make_tiny(target, _corpora):
    """The project's own sources and pages."""
    top = pathlib.Path(__file__).resolve().parent.parent
    for room in ("docs", "index", "platform", "daemon", "server"):
        copy_files(top / room, target / room)


def make_rights(of):
    """carol may read all, bob half, alice one in a hundred. In every other folder that has no folders
    the folder's mode says so, elsewhere each file's."""
    def build(target, corpora):
        copy_files(make(of, corpora), target)
        number = 0
        for place, (folder, folders, names) in enumerate(sorted(os.walk(target))):
            by_folder = place % 2 == 1 and not folders
            if by_folder:
                shutil.chown(folder, CAROL, WORK)
                os.chmod(folder, 0o750 if place % 4 == 1 else 0o700)
            for name in sorted(names):
                path = pathlib.Path(folder, name)
                number += not by_folder
                shutil.chown(path, CAROL, WORK if by_folder or number % 2 == 0 else ROOT)
                path.chmod(0o644 if by_folder or number % 60 == 0 else 0o640)
    return build


def make_copies(count):
    """So many copies, in each but the first of which the long words are other words: what grows is the
    number of files and the vocabulary."""
    def build(target, corpora):
        small = make("small", corpora)
        for number in range(count):
            letter = bytes([ord("a") + number]) if number else b""
            copy_files(small, target / f"copy{number}",
                       lambda name, data, letter=letter: LONG_WORD.sub(rb"\g<0>" + letter, data)
                       if name.endswith((".html", ".txt")) else data)
    return build


MAKERS = {"small": make_small, "large": make_large, "tiny": make_tiny,
          "rights": make_rights("small"), "tinyrights": make_rights("tiny"),
          "copies1": make_copies(1), "copies4": make_copies(4), "copies16": make_copies(COPIES)}
# Corpora that are asked another's queries.
QUERIES_OF = {"rights": "small", "tinyrights": "tiny", "copies1": "small", "copies4": "small", "copies16": "small"}


def make(name, corpora):
    """The folder of a corpus, made unless it is there."""
    target = corpora / name
    if not target.is_dir():
        say(f"making the corpus {name}")
        half = corpora / (name + ".half")
        shutil.rmtree(half, ignore_errors=True)
        MAKERS[name](half, corpora)
        half.rename(target)
    return target


UNSEEN = re.compile(r"<(script|style)\b.*?</\1>|<[^>]*>", re.S)
WORD = re.compile(r"\b[a-z]{3,14}\b")


def words_of(folder, steps=10):
    """Words of a sample of a corpus, as people see them, with the number of its documents that have each;
    and the size of the sample."""
    documents = {}
    paths = sorted(path for path in folder.rglob("*") if path.is_file() and not path.is_symlink())
    sample = paths[::max(1, min(steps, len(paths) // 200))]
    for path in sample:
        text = path.read_bytes()[:200_000].decode("utf-8", "replace")
        if path.suffix in (".html", ".svg"):
            text = UNSEEN.sub(" ", text)
        for word in set(WORD.findall(text)):
            documents[word] = documents.get(word, 0) + 1
    return documents, len(sample)


def distinct(folder, count=600):
    """So many words of a corpus, no two alike, of all frequencies."""
    documents, _ = words_of(folder)
    some = sorted(documents, key=lambda word: (documents[word], word))
    return some[::max(1, len(some) // count)][:count]


def queries(folder):
    """The 30 queries of a corpus, out of its own words: 5 rare, 5 medium and 5 common words, 5 pairs,
    4 threes, 6 prefixes."""
    documents, sample = words_of(folder)

    def pick(low, high, count):
        some = sorted(word for word, number in documents.items()
                      if low * sample <= number <= high * sample and number > 1)
        some = some or sorted(documents)
        return [some[i * (len(some) - 1) // max(count - 1, 1)] for i in range(count)]

    rare, medium, common = pick(0, 0.004, 5), pick(0.01, 0.05, 10), pick(0.15, 0.9, 10)
    return (rare + medium[:5] + common[:5]
            + [f"{common[i]} {medium[5 + i]}" for i in range(5)]
            + [f"{common[i]} {common[5 + i]} {medium[i]}" for i in range(4)]
            + [f"{medium[i][:2 + i % 4]}*" for i in range(6)])
