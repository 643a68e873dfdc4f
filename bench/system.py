"""The system under test: the programs of the build, as they really run, in the sandbox."""

import contextlib
import json
import os
import pathlib
import resource
import shutil
import subprocess
import sys
import time

TOP = pathlib.Path(__file__).resolve().parent.parent
sys.path.insert(0, str(TOP / "tests/road"))

import road  # noqa: E402  the services, as the road tests start them

# Groups of processes; maruwebd's are its front, its host and the children that the host has waited for.
PROGRAMS = {"maruelasticd": "daemon", "maruindexd": "indexer"}
FRONT_USER = "59999"
INDEX = road.STATE / "index"


def program(name):
    return str(road.BUILD / "bin" / name)


def run_json(*command):
    """Runs a program that prints one JSON object."""
    done = subprocess.run([str(word) for word in command], stdout=subprocess.PIPE, check=True)
    return json.loads(done.stdout)


def timed(command, **options):
    """Runs a command to its end: seconds, CPU seconds and the peak memory (MB) of its largest
    process."""
    before = resource.getrusage(resource.RUSAGE_CHILDREN)
    start = time.monotonic()
    report = subprocess.run(["/usr/bin/env", "python3", __file__, *[str(word) for word in command]],
                            stdin=subprocess.DEVNULL, stdout=subprocess.PIPE,
                            stderr=subprocess.PIPE, check=False, **options)
    seconds = time.monotonic() - start
    after = resource.getrusage(resource.RUSAGE_CHILDREN)
    if report.returncode != 0:
        raise RuntimeError(report.stderr.decode(errors="replace")[-500:] or "it failed")
    cpu = after.ru_utime + after.ru_stime - before.ru_utime - before.ru_stime
    return {"seconds": seconds, "cpu": cpu, "peak": int(report.stdout.split()[-1]) / 1024}


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


def count_files(folder):
    return sum(len(names) for _, _, names in os.walk(folder))


def processes():
    """(pid, group) of the processes that run one of our programs."""
    for entry in pathlib.Path("/proc").iterdir():
        if entry.name.isdigit():
            with contextlib.suppress(OSError):
                program_name = os.path.basename(os.readlink(entry / "exe"))
                status = (entry / "status").read_text(encoding="utf-8")
                if program_name == "maruwebd":
                    user = status.split("\nUid:\t")[1].split()[1]
                    yield int(entry.name), "front" if user == FRONT_USER else "host"
                elif program_name in PROGRAMS:
                    yield int(entry.name), PROGRAMS[program_name]


def cpu_seconds():
    """CPU used so far by each group of processes."""
    ticks = os.sysconf("SC_CLK_TCK")
    used = dict.fromkeys((*PROGRAMS.values(), "front", "host", "children"), 0.0)
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
        if user not in self.tokens:
            self.tokens[user] = self.services.sign_in(user)
        return self.tokens[user]

    def load(self, bodies, user="alice", connections=1, rounds=1, path=road.SEARCH_PATH):
        """Sends the requests so many times on each connection; times in microseconds."""
        file = self.work / "bodies.jsonl"
        file.write_text("".join(json.dumps(body) + "\n" for body in bodies), encoding="utf-8")
        result = run_json(program("maru-bench-load"), self.services.port, self.token(user), path,
                          file, connections, rounds)
        if result["failed"]:
            raise RuntimeError(f"{result['failed']} requests failed")
        return result

    def daemon_times(self, queries, rounds, user="alice", **more):
        """The same searches asked at the daemon's socket, as the plug-in asks them."""
        def ask():
            times = []
            with road.socket.socket(road.socket.AF_UNIX) as connection:
                connection.connect(road.SOCKET)
                stream = connection.makefile("rwb")
                for words in queries * rounds:
                    request = road.daemon_search(words, ["fileindex_" + self.share], size=50)
                    request["data"] |= more
                    line = json.dumps(request).encode() + b"\n"
                    start = time.perf_counter()
                    stream.write(line)
                    stream.flush()
                    while b'"success"' not in stream.readline():
                        pass
                    times.append((time.perf_counter() - start) * 1e6)
            return times

        times = sorted(road.as_user(user, ask))
        return {"p50": times[len(times) // 2], "p95": times[len(times) * 95 // 100]}


if __name__ == "__main__":
    # A process of its own for a command, so that its peak is the command's alone.
    status = subprocess.run(sys.argv[1:], stdout=subprocess.DEVNULL, check=False).returncode
    print(resource.getrusage(resource.RUSAGE_CHILDREN).ru_maxrss)
    sys.exit(status)
