"""The system under test: the programs of the build, as they really run, in the sandbox."""

import contextlib
import json
import os
import pathlib
import select
import shutil
import subprocess
import sys
import tempfile
import time

TOP = pathlib.Path(__file__).resolve().parent.parent
sys.path.insert(0, str(TOP / "tests/road"))

import road  # noqa: E402  the services, as the road tests start them

# Groups of processes by what a process calls itself; maruwebd's first process counts as its host.
GROUPS = {"maruelasticd": "daemon", "maruindexd": "indexer", "maruwebd": "host", "maruweb-host": "host",
          "maruweb-front": "front", "maruweb-request": "children"}
INDEX = road.STATE / "index"


def program(name):
    return str(road.BUILD / "bin" / name)


def reachable(name):
    """A program where every account of the sandbox can reach it."""
    return pathlib.Path("/run/project", pathlib.Path(program(name)).relative_to(TOP))


def run_json(*command, given=None):
    """Runs a program that prints one JSON object."""
    done = subprocess.run([str(word) for word in command], input=given, stdout=subprocess.PIPE,
                          text=True, check=True)
    return json.loads(done.stdout)


def memory_below(top):
    """MB of memory of their own that a process and all below it have now."""
    parents, used = {}, {}
    for status in pathlib.Path("/proc").glob("[0-9]*/status"):
        with contextlib.suppress(OSError, KeyError):
            lines = dict(line.split(":", 1) for line in status.read_text(encoding="utf-8").splitlines())
            pid = int(lines["Pid"])
            parents[pid] = int(lines["PPid"])
            used[pid] = int(lines["RssAnon"].split()[0]) + int(lines["RssShmem"].split()[0])

    def is_below(pid):
        while pid != top and pid in parents:
            pid = parents[pid]
        return pid == top

    return sum(size for pid, size in used.items() if is_below(pid)) / 1024


def timed(command):
    """Runs a command to its end: seconds, CPU seconds and the peak memory (MB) of all its processes."""
    start = time.monotonic()
    peak = 0.0
    with tempfile.TemporaryFile() as errors:
        process = subprocess.Popen([str(word) for word in command], stdin=subprocess.DEVNULL,
                                   stdout=subprocess.DEVNULL, stderr=errors)
        with open(os.pidfd_open(process.pid)) as end:
            while not select.select([end], [], [], 0.1)[0]:
                peak = max(peak, memory_below(process.pid))
        seconds = time.monotonic() - start
        _, status, used = os.wait4(process.pid, 0)
        process.returncode = os.waitstatus_to_exitcode(status)
        if process.returncode != 0:
            errors.seek(0)
            raise RuntimeError(errors.read()[-500:].decode(errors="replace") or "it failed")
    return {"seconds": seconds, "cpu": used.ru_utime + used.ru_stime,
            "peak": peak or used.ru_maxrss / 1024}


def size_mb(*folders, size=lambda status: status.st_size):
    total = 0
    for folder in folders:
        for parent, _, names in os.walk(folder):
            for name in names:
                with contextlib.suppress(OSError):
                    total += size(os.lstat(os.path.join(parent, name)))
    return total / 1e6


def disk_mb(folder):
    """What it takes on the disk: files with holes are smaller than they look."""
    return size_mb(folder, size=lambda status: status.st_blocks * 512)


def read_all(folder):
    """Brings all files into the page cache."""
    for parent, _, names in os.walk(folder):
        for name in names:
            with contextlib.suppress(OSError):
                pathlib.Path(parent, name).read_bytes()


def count_files(folder):
    return sum(len(names) for _, _, names in os.walk(folder))


def processes():
    """(pid, group) of the processes that run one of our programs."""
    for entry in pathlib.Path("/proc").iterdir():
        if entry.name.isdigit():
            with contextlib.suppress(OSError):
                name = (entry / "comm").read_text(encoding="utf-8").strip()
                if name in GROUPS:
                    yield int(entry.name), GROUPS[name]


def cpu_seconds():
    """CPU used so far by each group of processes."""
    ticks = os.sysconf("SC_CLK_TCK")
    used = dict.fromkeys(GROUPS.values(), 0.0)
    for pid, group in processes():
        with contextlib.suppress(OSError):
            text = pathlib.Path(f"/proc/{pid}/stat").read_text(encoding="utf-8", errors="replace")
            own_user, own_system, user, system = map(int, text.rpartition(")")[2].split()[11:15])
            used[group] += (own_user + own_system) / ticks
            used["children" if group == "host" else group] += (user + system) / ticks
    return used


def memory_mb():
    """Memory of each group of processes, what they share counted once (PSS)."""
    used = {}
    for pid, group in processes():
        with contextlib.suppress(OSError):
            rollup = pathlib.Path(f"/proc/{pid}/smaps_rollup").read_text(encoding="utf-8")
            used[group] = used.get(group, 0) + int(rollup.split("Pss:")[1].split()[0]) / 1024
    return used


class System:
    """A share's index, which stays in `work` from run to run, and the services on it."""

    def __init__(self, share, work):
        self.share = share
        self.folder = road.SHARES / share
        self.work = work
        state = work / "maruseeker"
        state.mkdir(exist_ok=True)
        shutil.chown(state, "MaruSeeker", "MaruSeeker")
        subprocess.run(["mount", "--bind", state, road.STATE], check=True)
        for path in road.STATE.iterdir():
            if path.is_file():
                path.unlink()
        self.services = road.Services()
        self.tokens = {}

    def wipe(self):
        shutil.rmtree(INDEX, ignore_errors=True)

    def crawl(self):
        return timed([program("maruindexd"), "--once"])

    def start(self):
        self.services.start_daemon()
        self.services.start_web()

    def stop(self):
        self.services.stop_all()
        self.tokens.clear()

    def token(self, user):
        """Of a user's session; "alice#2" is another one of alice's."""
        if user not in self.tokens:
            self.tokens[user] = self.services.sign_in(user.partition("#")[0])
        return self.tokens[user]

    def load(self, bodies, user="alice", connections=1, rounds=1, path=road.SEARCH_PATH,
             expected='"success":true', may_fail=False):
        """Sends the requests so many times on each connection, None as a GET; times in microseconds."""
        lines = "".join("\n" if body is None else json.dumps(body) + "\n" for body in bodies)
        return self.loaded(["http", self.services.port, self.token(user), path, connections, rounds,
                            expected], lines, may_fail)

    def daemon_load(self, queries, user="alice", rounds=1, **more):
        """The same searches asked at the daemon's socket, as the plug-in asks them."""
        lines = []
        for words in queries:
            request = road.daemon_search(words, ["fileindex_" + self.share], size=50)
            request["data"] |= more
            lines.append(json.dumps(request) + "\n")
        return road.as_user(user, self.loaded, ["daemon", road.SOCKET, 1, rounds, '"success":true'],
                            "".join(lines))

    @staticmethod
    def loaded(arguments, lines, may_fail=False):
        result = run_json(reachable("maru-bench-load"), *arguments, given=lines)
        if result["failed"] and not may_fail:
            raise RuntimeError(f"{result['failed']} requests failed")
        return result
