"""What people would use instead, on the same files and the same words. Each rival is indexed and asked
as its own documentation shows; one that is not there or fails is reported and left out."""

import contextlib
import json
import os
import pathlib
import socket
import sqlite3
import struct
import subprocess
import sys

import system
from rival import HITS, Engine, EngineMerged, Rival, files_of, text_of

# Suffixes whose text omindex knows how to find.
KNOWN_TO_OMEGA = {"html", "htm", "xhtml", "svg", "xml", "txt", "md", "csv", "js", "css", "pl", "pod"}


def quietly(*command, **options):
    return subprocess.run([str(word) for word in command], check=True, stdin=subprocess.DEVNULL,
                          stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, **options).stdout


class Recoll(Rival):
    """Asked through its Python module, in process."""

    name = "recoll"
    packages = ("recollcmd", "python3-recoll")

    def index(self, folder):
        (self.work / "recoll.conf").write_text(
            f"topdirs = {folder}\nlogfilename = /dev/null\nmaxTermExpand = 1000000\n"
            "maxXapianClauses = 1000000\n", encoding="utf-8")
        return system.timed(["recollindex", "-c", self.work])

    @contextlib.contextmanager
    def opened(self):
        from recoll import recoll
        self.database = recoll.connect(confdir=str(self.work))
        yield
        self.database.close()

    def ask(self, words):
        query = self.database.query()
        query.execute(words, stemming=0)
        return len([hit.url for hit in query.fetchmany(HITS)])


class Omega(Rival):
    """A CGI program: every query starts it anew."""

    name = "omega"
    packages = ("xapian-omega",)

    def index(self, folder):
        suffixes = {path.suffix[1:] for path in files_of(folder)} - KNOWN_TO_OMEGA
        plain = [f"--mime-type={suffix}:text/plain" for suffix in sorted(suffixes)
                 if suffix not in ("png", "gif", "jpg", "woff", "woff2", "ico")]
        result = system.timed(["omindex", "--db", self.work / "default", "--url", "/", *plain, folder])
        (self.work / "hits").write_text("$set{flag_wildcard,1}$hitlist{$field{url} $percentage\n}",
                                        encoding="utf-8")
        (self.work / "omega.conf").write_text(
            f"database_dir {self.work}\ntemplate_dir {self.work}\nlog_dir {self.work}\n"
            f"cdb_dir {self.work}\n", encoding="utf-8")
        return result

    def ask(self, words):
        environment = dict(os.environ, OMEGA_CONFIG_FILE=str(self.work / "omega.conf"))
        answer = quietly("/usr/lib/cgi-bin/omega/omega", f"P={words}", "DEFAULTOP=and", "FMT=hits",
                         f"HITSPERPAGE={HITS}", env=environment)
        return answer.count(b"%") or answer.count(b"\n/")


class Fts5(Rival):
    """SQLite's full-text table, in process."""

    name = "SQLite FTS5"

    def index(self, folder):
        return system.timed([sys.executable, __file__, folder, self.work / "db"])

    @staticmethod
    def fill(folder, file):
        with contextlib.closing(sqlite3.connect(file)) as database:
            database.execute("CREATE VIRTUAL TABLE files USING fts5(path UNINDEXED, text)")
            database.executemany("INSERT INTO files VALUES (?, ?)",
                                 ((os.fsencode(path), text_of(path)) for path in files_of(folder)))
            database.commit()

    @contextlib.contextmanager
    def opened(self):
        with contextlib.closing(sqlite3.connect(self.work / "db")) as self.database:
            yield

    def ask(self, words):
        return len(self.database.execute(
            "SELECT path FROM files WHERE files MATCH ? ORDER BY rank LIMIT ?",
            (words, HITS)).fetchall())


class Groonga(Rival):
    """One process that takes one command a line."""

    name = "groonga"
    packages = ("groonga-bin",)

    def index(self, folder):
        commands = self.work / "load.grn"
        with open(commands, "w", encoding="utf-8") as out:
            out.write("table_create Files TABLE_NO_KEY\ncolumn_create Files path COLUMN_SCALAR Text\n"
                      "column_create Files text COLUMN_SCALAR Text\n"
                      "table_create Words TABLE_PAT_KEY ShortText --default_tokenizer TokenBigram"
                      " --normalizer NormalizerAuto\n"
                      "column_create Words files COLUMN_INDEX|WITH_POSITION Files text\n"
                      "load --table Files\n[\n")
            rows = (json.dumps({"path": os.fsencode(path).decode("utf-8", "replace"),
                                "text": text_of(path)}) for path in files_of(folder))
            out.write(",\n".join(rows) + "\n]\n")
        result = system.timed(["groonga", "--file", commands, "-n", self.work / "db"])
        commands.unlink()
        return result

    @contextlib.contextmanager
    def opened(self):
        with subprocess.Popen(["groonga", str(self.work / "db")], stdin=subprocess.PIPE,
                              stdout=subprocess.PIPE) as self.process:
            yield
            self.process.stdin.close()

    def ask(self, words):
        self.process.stdin.write(
            f"select Files --match_columns text --query '{words}' --output_columns path,_score"
            f" --sort_keys -_score --limit {HITS} --cache no\n".encode())
        self.process.stdin.flush()
        (status, *_), *tables = json.loads(self.process.stdout.readline())
        if status != 0:
            raise RuntimeError(f"it answers {status}")
        return len(tables[0][0]) - 2


class Sphinx(Rival):
    """Its daemon, asked in SphinxQL over the protocol of MySQL."""

    name = "sphinx"
    packages = ("sphinxsearch",)
    port = 19306

    def index(self, folder):
        rows = self.work / "rows.tsv"
        with open(rows, "w", encoding="utf-8") as out:
            for number, path in enumerate(files_of(folder), 1):
                name = os.fsencode(path).decode("utf-8", "replace")
                out.write(f"{number}\t{name}\t{' '.join(text_of(path).split())}\n")
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
  log = {self.work}/log
  binlog_path =
}}
""", encoding="utf-8")
        result = system.timed(["indexer", "--config", self.work / "sphinx.conf", "--all"])
        rows.unlink()
        return result

    @contextlib.contextmanager
    def opened(self):
        daemon = subprocess.Popen(["searchd", "--config", str(self.work / "sphinx.conf"),
                                   "--nodetach"], stdout=subprocess.DEVNULL)
        try:
            system.road.wait_until(self.connects, "searchd")
            with self.connection:
                yield
        finally:
            daemon.terminate()
            daemon.wait()

    def connects(self):
        with contextlib.suppress(OSError):
            self.connection = socket.create_connection(("127.0.0.1", self.port))
            self.stream = self.connection.makefile("rwb")
            self.receive()
            self.send(struct.pack("<IIB23x", 0x8200, 1 << 24, 33) + b"bench\0\0", 1)
            return self.receive()[0] == 0
        return False

    def send(self, body, number=0):
        self.stream.write(len(body).to_bytes(3, "little") + bytes([number]) + body)
        self.stream.flush()

    def receive(self):
        head = self.stream.read(4)
        if len(head) < 4:
            raise OSError("it hung up")
        return self.stream.read(int.from_bytes(head[:3], "little"))

    def ask(self, words):
        self.send(b"\3" + f"SELECT path FROM files WHERE MATCH('{words}') LIMIT {HITS}".encode())
        first = self.receive()
        if first[0] == 0xff:
            raise RuntimeError(first[9:].decode(errors="replace"))
        packets, ends = 0, 0
        while ends < 2:
            is_end = self.receive()[0] == 0xfe
            ends += is_end
            packets += not is_end
        return packets - first[0]


ALL = (Engine, EngineMerged, Recoll, Omega, Fts5, Groonga, Sphinx)
SMOKE = (Engine, EngineMerged, Fts5)


def install(rivals):
    """Installs the rivals' packages, before the sandbox; what cannot be had is left out there."""
    for rival in rivals:
        if rival.packages:
            subprocess.run([str(pathlib.Path(__file__).parent.parent / "tools/install-packages"),
                            *rival.packages], check=False, stdout=sys.stderr)


if __name__ == "__main__":
    Fts5.fill(pathlib.Path(sys.argv[1]), sys.argv[2])
