"""What people would use instead, on the same files and the same words. Each rival is indexed and asked
as its own documentation shows; one that is not there or fails is reported and left out."""

import contextlib
import json
import os
import pathlib
import shutil
import sqlite3
import statistics
import subprocess
import time

import system

MAX_TEXT = 4 << 20
HITS = 50


def text_of(path):
    data = path.read_bytes()[:MAX_TEXT]
    return "" if b"\0" in data[:4096] else data.decode("utf-8", "replace")


def files_of(folder):
    return sorted(path for path in folder.rglob("*") if path.is_file() and not path.is_symlink())


def quietly(*command, **options):
    return subprocess.run([str(word) for word in command], check=True, stdin=subprocess.DEVNULL,
                          stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, **options).stdout


class Rival:
    """`index` builds an index of a folder in `work`, anew; `ask` answers one query, and may return
    the seconds that the rival itself says it took."""

    name = ""
    packages = ()

    def __init__(self, work):
        self.work = work / self.name.replace(" ", "-")
        shutil.rmtree(self.work, ignore_errors=True)
        self.work.mkdir(parents=True)

    def index(self, folder):
        raise NotImplementedError

    def ask(self, words):
        raise NotImplementedError

    def size(self):
        return system.size_mb(self.work)

    def crawl(self, folder):
        shutil.rmtree(self.work)
        self.work.mkdir()
        result = self.index(folder)
        result["size"] = self.size()
        return result

    def p50(self, queries, rounds):
        times = []
        for _ in range(rounds):
            for words in queries:
                start = time.perf_counter()
                own = self.ask(words)
                times.append(own if own is not None else time.perf_counter() - start)
        return statistics.median(times) * 1e6


class Engine(Rival):
    """The bare engine with so many writers."""

    name = "bare engine"
    writers = 1

    def index(self, folder):
        return system.timed([system.program("maru-bench-engine"), "index", folder, self.work / "db",
                             self.writers, 500])

    def measure(self, queries, rounds, totals):
        file = self.work / "queries"
        file.write_text("\n".join(queries) + "\n", encoding="utf-8")
        return system.run_json(system.program("maru-bench-engine"), "search", self.work / "db", file,
                               rounds, totals)


class EngineMerged(Engine):
    name = "bare engine, 2 writers"
    writers = 2


class Recoll(Rival):
    name = "recoll"
    packages = ("recollcmd",)

    def index(self, folder):
        (self.work / "recoll.conf").write_text(
            f"topdirs = {folder}\nidxflushmb = 100\nlogfilename = /dev/null\n", encoding="utf-8")
        return system.timed(["recollindex", "-c", self.work])

    def ask(self, words):
        quietly("recollq", "-c", self.work, "-n", HITS, words)


class Omega(Rival):
    name = "omega"
    packages = ("xapian-omega",)

    def index(self, folder):
        return system.timed(["omindex", "--db", self.work / "default", "--url", "/", folder])

    def ask(self, words):
        (self.work / "omega.conf").write_text(
            f"database_dir {self.work}\ntemplate_dir /var/lib/omega/templates\n"
            f"log_dir {self.work}\ncdb_dir {self.work}\n", encoding="utf-8")
        environment = dict(os.environ, OMEGA_CONFIG_FILE=str(self.work / "omega.conf"))
        quietly("/usr/lib/cgi-bin/omega/omega", f"P={words}", f"HITSPERPAGE={HITS}",
                env=environment)


class Fts5(Rival):
    """SQLite's full-text table, in process."""

    name = "SQLite FTS5"

    def index(self, folder):
        before = os.times()
        start = time.monotonic()
        with contextlib.closing(sqlite3.connect(self.work / "db")) as database:
            database.execute("CREATE VIRTUAL TABLE files USING fts5(path, text)")
            database.executemany("INSERT INTO files VALUES (?, ?)",
                                 ((str(path), text_of(path)) for path in files_of(folder)))
            database.commit()
        after = os.times()
        return {"seconds": time.monotonic() - start,
                "cpu": after.user + after.system - before.user - before.system, "peak": 0}

    def ask(self, words):
        with contextlib.closing(sqlite3.connect(self.work / "db")) as database:
            start = time.perf_counter()
            database.execute("SELECT path FROM files WHERE files MATCH ? ORDER BY rank LIMIT ?",
                             (words, HITS)).fetchall()
            return time.perf_counter() - start


class Groonga(Rival):
    name = "groonga"
    packages = ("groonga-bin", "groonga-tokenizer-mecab")

    def index(self, folder):
        commands = self.work / "load.grn"
        with open(commands, "w", encoding="utf-8") as out:
            out.write("table_create Files TABLE_NO_KEY\ncolumn_create Files path COLUMN_SCALAR Text\n"
                      "column_create Files text COLUMN_SCALAR Text\n"
                      "table_create Words TABLE_PAT_KEY ShortText --default_tokenizer TokenBigram"
                      " --normalizer NormalizerAuto\n"
                      "column_create Words files COLUMN_INDEX|WITH_POSITION Files text\n"
                      "load --table Files\n[\n")
            rows = (json.dumps({"path": str(path), "text": text_of(path)}) for path in files_of(folder))
            out.write(",\n".join(rows) + "\n]\n")
        result = system.timed(["groonga", "--file", commands, "-n", self.work / "db"])
        commands.unlink()
        return result

    def ask(self, words):
        condition = " ".join(words.split())
        answer = quietly("groonga", self.work / "db", "select", "Files", "--match_columns", "text",
                         "--query", f"'{condition}'", "--output_columns", "path,_score",
                         "--sort_keys", "-_score", "--limit", HITS)
        return json.loads(answer)[0][2]


class Sphinx(Rival):
    name = "sphinx"
    packages = ("sphinxsearch", "mariadb-client-core")
    port = 19306

    def configure(self, folder):
        rows = self.work / "rows.tsv"
        with open(rows, "w", encoding="utf-8") as out:
            for number, path in enumerate(files_of(folder), 1):
                out.write(f"{number}\t{path}\t{' '.join(text_of(path).split())}\n")
        (self.work / "sphinx.conf").write_text(f"""
source files {{
  type = tsvpipe
  tsvpipe_command = cat {rows}
  tsvpipe_attr_string = path
  tsvpipe_field = text
}}
index files {{
  source = files
  path = {self.work}/files
  min_prefix_len = 2
}}
indexer {{
  mem_limit = 512M
  max_file_field_buffer = 32M
}}
searchd {{
  listen = 127.0.0.1:{self.port}:mysql41
  pid_file = {self.work}/pid
  log = /dev/null
}}
""", encoding="utf-8")
        return rows

    def index(self, folder):
        rows = self.configure(folder)
        result = system.timed(["indexer", "--config", self.work / "sphinx.conf", "--all"])
        rows.unlink()
        return result

    def p50(self, queries, rounds):
        daemon = subprocess.Popen(["searchd", "--config", str(self.work / "sphinx.conf"),
                                   "--nodetach"], stdout=subprocess.DEVNULL)
        try:
            system.road.wait_until(lambda: (self.work / "pid").exists(), "searchd")
            time.sleep(1)
            return super().p50(queries, rounds)
        finally:
            daemon.terminate()
            daemon.wait()

    def ask(self, words):
        rows = quietly("mariadb", "-h127.0.0.1", f"-P{self.port}", "-N", "-e",
                       f"SELECT path FROM files WHERE MATCH('{words}') LIMIT {HITS}; SHOW META")
        times = [line.split("\t")[1] for line in rows.decode().splitlines()
                 if line.startswith("time\t")]
        return float(times[0])


ALL = (Engine, EngineMerged, Recoll, Omega, Fts5, Groonga, Sphinx)
SMOKE = (Engine, EngineMerged, Fts5)


def install(rivals):
    """Installs the rivals' packages, before the sandbox; what cannot be had is left out there."""
    for rival in rivals:
        if rival.packages:
            subprocess.run([str(pathlib.Path(__file__).parent.parent / "tools/install-packages"),
                            *rival.packages], check=False)
