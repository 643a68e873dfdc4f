#!/usr/bin/python3
"""Inside the sandbox: measures one corpus and writes the figures as JSON.

roads.py OPTIONS-AS-JSON, which bench/run writes: share, roads, rivals, runs, rounds, queries, output.
"""

import json
import pathlib
import statistics
import subprocess
import sys
import threading
import time

import rivals
import system
from system import road


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
        """A rival's figure, or None with the reason noted."""
        if name in self.failed:
            return None
        try:
            return work()
        except (OSError, RuntimeError, ValueError, subprocess.CalledProcessError, LookupError,
                AssertionError) as error:
            self.failed[name] = f"{type(error).__name__}: {error}"[:300]
            return None

    def bodies(self, **more):
        return [road.search_request(words, **more) for words in self.queries]

    def crawl(self):
        folder = self.system.folder
        ours, theirs = [], {name: [] for name in self.rivals}
        for run in range(self.options["runs"]):
            self.system.wipe()
            ours.append(self.system.crawl())
            for name, rival in self.rivals.items():
                if run == 0 or theirs[name]:
                    result = self.tried(name, lambda rival=rival: rival.crawl(folder))
                    theirs[name] += [result] if result else []
        figures = {"files": system.count_files(folder), "mb": system.size_mb(folder),
                   "ours": median_of(ours) | {"size": system.size_mb(system.INDEX)},
                   "rivals": {name: median_of(results) for name, results in theirs.items() if results}}
        again = [self.system.crawl() for _ in range(3)]
        figures["again"] = median_of(again)
        return figures

    def search(self):
        rounds, ours = self.options["rounds"], {"alone": [], "loaded": [], "daemon": []}
        theirs = {name: [] for name in self.rivals}
        engine = self.rivals.get("bare engine")
        self.system.load(self.bodies(), rounds=2)
        figures = {}
        for run in range(self.options["runs"]):
            before = system.cpu_seconds()
            ours["alone"].append(self.system.load(self.bodies(), rounds=rounds))
            after = system.cpu_seconds()
            figures["cpu"] = {name: (after[name] - before[name]) * 1e6 / rounds / len(self.queries)
                              for name in after}
            ours["loaded"].append(self.system.load(self.bodies(), connections=8, rounds=rounds))
            ours["daemon"].append(self.daemon_times(rounds))
            for name, rival in self.rivals.items():
                if rival is engine:
                    result = {kind: rival.measure(self.queries, rounds, kind)
                              for kind in ("best", "exact")}
                    both = self.both_cores(rival, rounds)
                    theirs[name].append({"p50": result["best"]["p50"], "p95": result["best"]["p95"],
                                         "exact": result["exact"]["p50"], "per_second": both})
                elif name != "bare engine, 2 writers" and (run == 0 or theirs[name]):
                    some = self.queries if rounds > 1 else self.queries[:5]
                    p50 = self.tried(name, lambda rival=rival, some=some: rival.p50(some, 1))
                    theirs[name] += [{"p50": p50}] if p50 else []
        figures["still"] = self.still(rounds)
        figures |= {kind: median_of(results) for kind, results in ours.items()}
        figures["rivals"] = {name: median_of(results) for name, results in theirs.items() if results}
        return figures

    def both_cores(self, engine, rounds):
        """Searches per second of the bare engine with a process for each core."""
        results = []
        threads = [threading.Thread(target=lambda: results.append(
            engine.measure(self.queries, rounds, "best"))) for _ in range(2)]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        return sum(result["per_second"] for result in results)

    def daemon_times(self, rounds, **more):
        """The same searches asked at the daemon's socket, as the plug-in asks them."""
        times = []
        index = ["fileindex_" + self.options["share"]]
        with road.socket.socket(road.socket.AF_UNIX) as connection:
            connection.connect(road.SOCKET)
            stream = connection.makefile("rwb")
            for _ in range(rounds):
                for words in self.queries:
                    request = road.daemon_search(words, index, size=50,
                                                 filters=[{"name": "permission", "data": "alice"}])
                    request["data"] |= more
                    line = json.dumps(request).encode() + b"\n"
                    start = time.perf_counter()
                    stream.write(line)
                    stream.flush()
                    while b'"success"' not in stream.readline():
                        pass
                    times.append((time.perf_counter() - start) * 1e6)
        times.sort()
        return {"p50": times[len(times) // 2], "p95": times[len(times) * 95 // 100]}

    def still(self, rounds):
        """What an answer costs that needs no search: a method that the plug-in refuses at once."""
        connection = self.system.services.connect()
        times = []
        for _ in range(30 * rounds):
            start = time.perf_counter()
            connection.request("GET", "/healthz")
            connection.getresponse().read()
            times.append((time.perf_counter() - start) * 1e6)
        return statistics.median(times)

    def fragments(self):
        highlight = {"field": "MARUMDTextContent", "frag_length": 100, "num_fragments": 3}
        bodies = self.bodies(highlight=[highlight])
        results = [self.system.load(bodies, rounds=self.options["rounds"])
                   for _ in range(self.options["runs"])]
        daemon = [self.daemon_times(self.options["rounds"], highlight=[highlight])
                  for _ in range(self.options["runs"])]
        return median_of(results) | {"daemon": median_of(daemon)["p50"]}

    def rights(self):
        """alice reads one file in a hundred, bob every other, carol all."""
        results = {user: [] for user in ("alice", "bob", "carol")}
        for _ in range(self.options["runs"]):
            for user, some in results.items():
                some.append(self.system.load(self.bodies(), user=user, rounds=self.options["rounds"]))
        return {user: median_of(some) for user, some in results.items()}

    def burst(self):
        """Twenty searches of one id, as somebody types; then the last one alone."""
        words = self.queries[12]
        token = self.system.token("alice")

        def ask(serial, query_id):
            request = road.search_request(words[:3] + "*", query_id=query_id, query_serial=serial)
            return self.system.services.begin(self.system.services.connect(), "POST",
                                              road.SEARCH_PATH, request, token)

        def measured(serials, query_id):
            before = sum(system.cpu_seconds().values())
            connections = [ask(serial, query_id) for serial in serials]
            start = time.perf_counter()
            others = []
            for connection in connections[:-1]:
                threads = threading.Thread(target=lambda c=connection: others.append(
                    (self.system.services.finish(c), time.perf_counter() - start)))
                threads.start()
                connection.thread = threads
            self.system.services.finish(connections[-1])
            for connection in connections[:-1]:
                connection.thread.join()
            time.sleep(0.2)
            return (sum(system.cpu_seconds().values()) - before,
                    max((seconds for _, seconds in others), default=0))

        count = self.options["rounds"]
        bursts = [measured(range(1, 21), f"burst{i}") for i in range(count)]
        alone = [measured([1], f"alone{i}") for i in range(count)]
        return {"cpu": sum(cpu for cpu, _ in bursts) / max(sum(cpu for cpu, _ in alone), 0.001),
                "stops_ms": statistics.median(seconds for _, seconds in bursts) * 1e3}

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
        """From nothing running to the first answer, the files in the page cache."""
        times = []
        for _ in range(self.options["runs"]):
            self.system.stop()
            start = time.monotonic()
            self.system.start()
            road.search(self.system.services, self.system.token("alice"), self.queries[10])
            times.append(time.monotonic() - start)
        return {"seconds": statistics.median(times)}

    def memory(self):
        self.system.stop()
        self.system.start()
        self.system.load(self.bodies()[:1])
        time.sleep(1)
        rest, most = system.memory_mb(), {}
        loader = threading.Thread(target=lambda: self.system.load(
            self.bodies(), connections=8, rounds=self.options["rounds"] * 3))
        loader.start()
        while loader.is_alive():
            for name, used in system.memory_mb().items():
                most[name] = max(most.get(name, 0), used)
            time.sleep(0.05)
        return {"rest": rest, "load": most}

    def growth(self):
        short = [words for words in self.queries if words.endswith("*") and len(words) == 3]
        rounds = self.options["rounds"]
        return {"search": self.system.load(self.bodies(), rounds=rounds),
                "prefix": self.system.load([road.search_request(words) for words in short],
                                           rounds=rounds * 5)}

    def run(self):
        wanted = self.options["roads"]
        if "crawl" in wanted:
            self.figures["crawl"] = self.crawl()
        else:
            self.system.crawl()
            engine = self.rivals.get("bare engine")
            if engine and "search" in wanted:
                engine.crawl(self.system.folder)
        self.system.start()
        try:
            for name in wanted:
                if name != "crawl":
                    print(f"bench: {self.options['share']}: {name}", file=sys.stderr, flush=True)
                    self.figures[name] = getattr(self, name)()
        finally:
            self.system.stop()
        self.figures["failed"] = self.failed


if __name__ == "__main__":
    given = json.loads(pathlib.Path(sys.argv[1]).read_text(encoding="utf-8"))
    roads = Roads(given)
    roads.run()
    pathlib.Path(given["output"]).write_text(json.dumps(roads.figures, indent=1), encoding="utf-8")
