"""What a rival is, and the first of them: the bare engine."""

import concurrent.futures
import contextlib
import os
import shutil
import time

import system

MAX_TEXT = 4 << 20
HITS = 50


def text_of(path):
    data = path.read_bytes()[:MAX_TEXT]
    return "" if b"\0" in data[:4096] else data.decode("utf-8", "replace")


def files_of(folder):
    return sorted(path for path in folder.rglob("*") if path.is_file() and not path.is_symlink())


class Rival:
    """`index` builds an index of a folder in `work`, anew; `ask` answers one query and returns how many
    hits it shows."""

    name = ""
    packages = ()

    def __init__(self, work):
        self.work = work / self.name.replace(" ", "-")
        self.work.mkdir(parents=True, exist_ok=True)

    def index(self, folder):
        raise NotImplementedError

    def ask(self, words):
        raise NotImplementedError

    @contextlib.contextmanager
    def opened(self):
        """What must be there while it is asked."""
        yield

    def crawl(self, folder):
        shutil.rmtree(self.work)
        self.work.mkdir()
        result = self.index(folder)
        result["size"] = system.disk_mb(self.work)
        (self.work / "complete").touch()
        return result

    def is_indexed(self):
        return (self.work / "complete").exists()

    def search(self, queries, rounds):
        """p50, p95 and p99 in microseconds; how many hits all queries show."""
        times = []
        with self.opened():
            hits = sum(self.ask(words) for words in queries)
            for words in queries * rounds:
                start = time.perf_counter()
                self.ask(words)
                times.append((time.perf_counter() - start) * 1e6)
        if hits == 0:
            raise RuntimeError("finds nothing")
        times.sort()
        return {f"p{part}": times[(len(times) - 1) * part // 100] for part in (50, 95, 99)} | {
            "hits": hits}


class Engine(Rival):
    """The bare engine with so many writers."""

    name = "bare engine"
    writers = 1

    def index(self, folder):
        return system.timed([system.program("maru-bench-engine"), "index", folder, self.work / "db",
                             self.writers, 500])

    def measure(self, rounds, totals):
        return system.run_json(system.program("maru-bench-engine"), "search", self.work / "db",
                               self.work / "queries", rounds, totals)

    def search(self, queries, rounds):
        """The best 50; `exact`: with exact totals; `per_second`: with a process for each core."""
        (self.work / "queries").write_text("\n".join(queries) + "\n", encoding="utf-8")
        self.measure(1, "exact")  # brings the index into the page cache
        best, exact = (self.measure(rounds, totals) for totals in ("best", "exact"))
        cores = os.cpu_count()
        with concurrent.futures.ThreadPoolExecutor(cores) as pool:
            all_cores = pool.map(lambda _: self.measure(rounds, "best"), range(cores))
        return {"p50": best["p50"], "p95": best["p95"], "p99": best["p99"], "exact": exact["p50"],
                "hits": best["shown"] / rounds,
                "per_second": sum(result["per_second"] for result in all_cores)}


class EngineMerged(Engine):
    name = "bare engine, 2 writers"
    writers = 2
