#!/usr/bin/python3
"""Inside the sandbox: measures one corpus and writes the figures as JSON.

roads.py OPTIONS-AS-JSON, which bench/run writes: share, roads, rivals, runs, rounds, queries, work,
output, may_drop_caches.
"""

import concurrent.futures
import json
import os
import pathlib
import shutil
import sqlite3
import statistics
import subprocess
import sys
import threading
import time

import rivals
import system
from system import road


def say(text):
    print(f"bench:   {text}", file=sys.stderr, flush=True)


def median_of(results):
    return {key: statistics.median(result[key] for result in results) for key in results[0]}


class Roads:
    """The roads, each a method that puts figures into `figures[road]`."""

    def __init__(self, options):
        self.options = options
        self.work = pathlib.Path(options["work"])
        self.work.mkdir(parents=True, exist_ok=True)
        self.system = system.System(options["share"], self.work)
        self.queries = options["queries"]
        self.figures = {}
        self.failed = {}
        chosen = {rival.name: rival for rival in rivals.ALL if rival.name in options["rivals"]}
        self.rivals = {name: rival(self.work) for name, rival in chosen.items()}

    def tried(self, name, work):
        """A rival's figure or a road's, or None with the reason noted."""
        if name in self.failed:
            return None
        try:
            return work()
        except (OSError, RuntimeError, ValueError, LookupError, AssertionError, ImportError,
                subprocess.CalledProcessError, sqlite3.Error) as error:
            self.failed[name] = f"{type(error).__name__}: {error}"[:300]
            return None

    def bodies(self, **more):
        return [road.search_request(words, **more) for words in self.queries]

    def crawl(self):
        """From nothing to the finished index, by turns; then, unchanged, once more."""
        folder = self.system.folder
        system.read_all(folder)
        ours, theirs = [], {name: [] for name in self.rivals}
        for run in range(self.options["runs"]):
            self.system.wipe()
            ours.append(self.system.crawl())
            for name, rival in self.rivals.items():
                if run == 0 or theirs[name]:
                    say(f"crawl: {name}")
                    result = self.tried(name, lambda rival=rival: rival.crawl(folder))
                    theirs[name] += [result] if result else []
        return {"files": system.count_files(folder), "mb": system.size_mb(folder),
                "ours": median_of(ours) | {"size": system.disk_mb(system.INDEX)},
                "rivals": {name: median_of(results) for name, results in theirs.items() if results},
                "again": median_of([self.system.crawl() for _ in range(3)])}

    def search(self):
        """The same searches of everybody, by turns; of us alone, eight at once, and of the daemon."""
        rounds = self.options["rounds"]
        ours = {kind: [] for kind in ("alone", "loaded", "front", "child", "daemon", "cpu")}
        theirs = {name: [] for name in self.rivals}
        for name, rival in self.rivals.items():
            if not rival.is_indexed():
                say(f"search: {name} indexes first")
                self.tried(name, lambda rival=rival: rival.crawl(self.system.folder))
        self.system.load(self.bodies(), rounds=2)
        for _ in range(self.options["runs"]):
            before = system.cpu_seconds()
            alone = self.system.load(self.bodies(), rounds=rounds)
            ours["alone"].append(alone | {"hits": alone["hits"] / rounds})
            after = system.cpu_seconds()
            ours["cpu"].append({group: (after[group] - before[group]) * 1e6 / rounds
                                / len(self.queries) for group in after})
            ours["loaded"].append(self.system.load(self.bodies(), connections=8, rounds=rounds))
            ours["front"].append(self.front(rounds))
            ours["child"].append(self.child(rounds))
            ours["daemon"].append(self.system.daemon_load(self.queries, rounds=rounds))
            for name, rival in self.rivals.items():
                result = self.tried(name, lambda rival=rival: rival.search(self.queries, rounds))
                theirs[name] += [result] if result else []
        return {kind: median_of(results) for kind, results in ours.items()} | {
            "rivals": {name: median_of(results) for name, results in theirs.items() if results}}

    def front(self, rounds):
        """An answer that the front gives by itself."""
        load = self.system.load([None], rounds=30 * rounds, path="/healthz", expected=" 200 ")
        return {"p50": load["p50"]}

    def child(self, rounds):
        """An answer for which a child becomes the user and the plug-in refuses the request at once."""
        refused = road.search_request("x", query_id="a/b", query_serial=1)
        load = self.system.load([refused], rounds=30 * rounds, expected='"code":120')
        return {"p50": load["p50"]}

    def fragments(self):
        highlight = {"field": "MARUMDTextContent", "frag_length": 100, "num_fragments": 3}
        bodies = self.bodies(highlight=[highlight])
        results = [self.system.load(bodies, rounds=self.options["rounds"])
                   for _ in range(self.options["runs"])]
        daemon = [self.system.daemon_load(self.queries, rounds=self.options["rounds"],
                                          highlight=[highlight])
                  for _ in range(self.options["runs"])]
        return median_of(results) | {"daemon": median_of(daemon)["p50"]}

    def rights(self):
        """The same searches by users who may read different parts of the files."""
        results = {user: [] for user in ("alice", "bob", "carol")}
        files = [path for path in road.everything_under(self.system.folder) if os.path.isfile(path)]
        parts = {user: len(road.as_user(user, road.readable, files)) * 100 / len(files)
                 for user in results}
        for _ in range(self.options["runs"]):
            for user, some in results.items():
                some.append(self.system.load(self.bodies(), user=user, rounds=self.options["rounds"]))
        return {user: median_of(some) | {"percent": parts[user]} for user, some in results.items()}

    def burst(self):
        """Twenty searches of one id, as somebody types, against the last of them alone."""
        words = self.queries[12][:3] + "*"
        token = self.system.token("alice")

        def send(serial, query_id):
            request = road.search_request(words, query_id=query_id, query_serial=serial)
            return self.system.services.begin(self.system.services.connect(), "POST",
                                              road.SEARCH_PATH, request, token)

        def ended(connection):
            self.system.services.finish(connection)
            return time.perf_counter()

        def one(serials, query_id):
            """Milliseconds from the newest request until all older ones have ended."""
            *older, newest = [send(serial, query_id) for serial in serials]
            start = time.perf_counter()
            with concurrent.futures.ThreadPoolExecutor(len(older) + 1) as pool:
                ends = list(pool.map(ended, [newest, *older]))
            return (max(ends[1:], default=start) - start) * 1e3

        def many(count, serials, name):
            """The median of `one`, and the CPU seconds of each."""
            before = sum(system.cpu_seconds().values())
            times = [one(serials, f"{name}{number}") for number in range(count)]
            time.sleep(0.2)
            return statistics.median(times), (sum(system.cpu_seconds().values()) - before) / count

        count = self.options["rounds"] + 2
        many(count, [1], "warm")
        _, alone = many(10 * count, [1], "alone")
        stops, whole = many(count, range(1, 21), "burst")
        return {"cpu": whole / alone, "stops_ms": stops}

    def methods(self):
        """Highlight of one document, counts per type, suggestions."""
        rounds = self.options["rounds"]
        token = self.system.token("alice")
        figures = {}
        for words in self.queries[10:15]:
            data = road.search(self.system.services, token, words)
            hit = data["hits"][0]
            calls = {
                "highlight": ("Highlight/1/highlight", {
                    "full_path": hit["MARUMDPath"], "doc_id": hit["doc_id"], "keyword": words,
                    "search_weight_list": [],
                    "highlight": {"field": "MARUMDTextContent", "frag_length": 100,
                                  "num_fragments": 3}}),
                "indicate": ("Indicate/1/indicate", {
                    "search_weight_list": [], "criteria_list": [], "keyword": words,
                    "file_type": ["document", "code", "image", "folder", "other"]}),
                "suggest": ("Term/1/suggest", {"terms": words[:4]}),
            }
            for name, (path, body) in calls.items():
                result = self.tried(name, lambda path=path, body=body: self.system.load(
                    [body], path="/webapi/MARU.Seeker.Elastic." + path, rounds=rounds * 10))
                if result:
                    figures.setdefault(name, []).append(result["p50"])
        return {name: statistics.median(some) for name, some in figures.items()}

    def cold(self):
        """Seconds from nothing running to the first answer, with the index in the page cache and,
        where the machine permits it, without."""
        def first_answer():
            self.system.stop()
            if dropped:
                subprocess.run(["sync"], check=True)
                pathlib.Path("/proc/sys/vm/drop_caches").write_text("3", encoding="ascii")
            start = time.monotonic()
            self.system.start()
            road.search(self.system.services, self.system.token("alice"), self.queries[10])
            return time.monotonic() - start

        figures, dropped = {}, False
        figures["cached"] = statistics.median(first_answer() for _ in range(self.options["runs"]))
        if self.options["may_drop_caches"] and os.access("/proc/sys/vm/drop_caches", os.W_OK):
            dropped = True
            figures["uncached"] = statistics.median(
                first_answer() for _ in range(self.options["runs"]))
        return figures

    def distinct(self):
        """Words asked once each."""
        return self.system.load([road.search_request(words) for words in self.options["distinct"]])

    def clients(self):
        """Sixty-four clients at once, of three users in eight sessions."""
        sessions = [f"{user}#{number}" for number in range(3) for user in ("alice", "bob", "carol")][:8]
        for session in sessions:
            self.system.token(session)
        with concurrent.futures.ThreadPoolExecutor(len(sessions)) as pool:
            results = list(pool.map(lambda session: self.system.load(
                self.bodies(), user=session, connections=8, rounds=1, may_fail=True), sessions))
        return median_of(results) | {name: sum(row[name] for row in results)
                                     for name in ("per_second", "failed")}

    def changes(self):
        """The same searches while nothing changes, and while four files a second do."""
        # The sandbox gives the corpus to read only; what is written there goes with the road.
        subprocess.run(["mount", "-o", "remount,bind,rw", self.system.folder], check=True)
        self.system.services.start("maruindexd", lambda: True)
        folder = self.system.folder / "changing"
        folder.mkdir(exist_ok=True)
        words = " ".join(self.queries)
        over = threading.Event()

        def change():
            number = 0
            while not over.wait(0.25):
                number += 1
                (folder / f"{number % 40}.txt").write_text(f"{number} {words}", encoding="utf-8")

        quiet, busy = [], []
        try:
            time.sleep(2)
            for _ in range(self.options["runs"]):
                quiet.append(self.system.load(self.bodies(), rounds=self.options["rounds"]))
                over.clear()
                writer = threading.Thread(target=change)
                writer.start()
                busy.append(self.system.load(self.bodies(), rounds=self.options["rounds"]))
                over.set()
                writer.join()
                time.sleep(2)
        finally:
            over.set()
            self.system.services.stop("maruindexd")
            shutil.rmtree(folder)
        return {"quiet": median_of(quiet), "busy": median_of(busy)}

    def memory(self):
        """Of every group of processes, the indexer that follows changes among them, in MB."""
        self.system.stop()
        self.system.start()
        self.system.services.start("maruindexd", lambda: True)
        self.system.load(self.bodies()[:1])
        before = -1.0
        for _ in range(60):
            now = sum(system.cpu_seconds().values())
            if now == before:
                break
            before = now
            time.sleep(1)
        rest, most = system.memory_mb(), {}
        loader = threading.Thread(target=lambda: self.system.load(
            self.bodies(), connections=8, rounds=self.options["rounds"] * 3))
        loader.start()
        while loader.is_alive():
            for group, used in system.memory_mb().items():
                most[group] = max(most.get(group, 0), used)
            time.sleep(0.05)
        self.system.services.stop("maruindexd")
        return {"rest": rest, "load": most}

    def growth(self):
        short = [words for words in self.queries if words.endswith("*") and len(words) == 3]
        rounds = self.options["rounds"]
        return {"search": self.system.load(self.bodies(), rounds=rounds),
                "prefix": self.system.load([road.search_request(words) for words in short],
                                           rounds=rounds * 5)}

    def run(self):
        wanted = list(self.options["roads"])
        if "crawl" in wanted:
            wanted.remove("crawl")
            self.figures["crawl"] = self.crawl()
        else:
            self.system.crawl()
        self.system.start()
        try:
            for name in wanted:
                say(name)
                figures = self.tried(name, getattr(self, name))
                if figures:
                    self.figures[name] = figures
        finally:
            self.system.stop()
        self.figures["failed"] = self.failed


if __name__ == "__main__":
    given = json.loads(pathlib.Path(sys.argv[1]).read_text(encoding="utf-8"))
    roads = Roads(given)
    roads.run()
    pathlib.Path(given["output"]).write_text(json.dumps(roads.figures, indent=1), encoding="utf-8")
