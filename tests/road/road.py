"""The services as they really run, inside the sandbox, and what a test needs to walk whole roads.

Every test file runs in a sandbox of its own: shares, settings and state are its alone. The programs
come from MARU_BUILD; their logs stand in MARU_BUILD/road/.
"""

import contextlib
import http.client
import json
import os
import pathlib
import pwd
import shutil
import socket
import subprocess
import sys
import time
import unittest

BUILD = pathlib.Path(os.environ.get("MARU_BUILD", "build/release")).resolve()
SOCKET = "/var/run/maruelasticd.sock"
STATE = pathlib.Path("/var/lib/maruseeker")
SETTINGS = pathlib.Path("/etc/maruseeker/maruseeker.conf")
SHARES = pathlib.Path("/mnt")
# Long enough for a loaded machine; nothing waits this long when all is well.
PATIENCE = 60


def in_sandbox():
    """Whether the sandbox's accounts exist and this process can become them."""
    try:
        return os.geteuid() == 0 and pwd.getpwnam("alice").pw_uid == 60001
    except KeyError:
        return False


def wait_until(holds, what):
    """Waits until `holds()` is true; an AssertionError names `what` when it does not come true."""
    end = time.monotonic() + PATIENCE
    while not holds():
        if time.monotonic() > end:
            raise AssertionError(f"waited in vain for {what}")
        time.sleep(0.02)


def as_user(name, function, *arguments):
    """Calls the function in a child process that is that user in everything; its result must be
    JSON. None for the name: as root."""
    reader, writer = os.pipe()
    child = os.fork()
    if child == 0:
        status = 1
        try:
            if name:
                account = pwd.getpwnam(name)
                os.setgroups(os.getgrouplist(name, account.pw_gid))
                os.setresgid(*[account.pw_gid] * 3)
                os.setresuid(*[account.pw_uid] * 3)
            with os.fdopen(writer, "w") as stream:
                json.dump(function(*arguments), stream)
            status = 0
        except BaseException as error:  # nothing may run twice: the child ends here, whatever comes
            print(f"as {name}: {error!r}", file=sys.stderr)
        finally:
            os._exit(status)
    os.close(writer)
    with os.fdopen(reader) as stream:
        text = stream.read()
    _, status = os.waitpid(child, 0)
    assert status == 0, f"the work as {name} failed"
    return json.loads(text)


def readable(paths):
    """Which of the files and folders this process can open for reading, in the order given."""
    result = []
    for path in paths:
        with contextlib.suppress(OSError):
            os.close(os.open(path, os.O_RDONLY | os.O_NONBLOCK | os.O_NOFOLLOW))
            result.append(path)
    return result


def everything_under(folder):
    """The paths of all files and folders below a folder."""
    return sorted(os.path.join(parent, name) for parent, folders, files in os.walk(folder)
                  for name in folders + files)


class Services:
    """The services of one test class: maruindexd on demand, maruelasticd, maruwebd."""

    def __init__(self):
        with socket.socket() as probe:
            probe.bind(("127.0.0.1", 0))
            self.port = probe.getsockname()[1]
        self.logs = BUILD / "road" / pathlib.Path(sys.argv[0]).stem
        shutil.rmtree(self.logs, ignore_errors=True)
        self.logs.mkdir(parents=True)
        self.running = {}
        self.configure(listen_port=self.port)

    @staticmethod
    def configure(**settings):
        """Sets settings of maruseeker.conf, before the services start."""
        lines = SETTINGS.read_text(encoding="utf-8").splitlines()
        lines = [line for line in lines if line.split("=")[0].strip() not in settings]
        lines += [f"{name} = {value}" for name, value in settings.items()]
        SETTINGS.write_text("\n".join(lines) + "\n", encoding="utf-8")

    def log(self, name):
        return self.logs / f"{name}.log"

    def fail(self, name, what):
        tail = "".join(self.log(name).read_text(errors="replace").splitlines(True)[-20:])
        raise AssertionError(f"{name} {what}; the end of its log:\n{tail}")

    def index(self):
        """One crawl of all shares, to its end."""
        with open(self.log("maruindexd"), "ab") as log:
            result = subprocess.run([BUILD / "bin/maruindexd", "--once"], stdout=log, stderr=log,
                                    stdin=subprocess.DEVNULL, check=False)
        if result.returncode != 0:
            self.fail("maruindexd", f"--once ended with status {result.returncode}")

    def start(self, name, is_ready):
        with open(self.log(name), "ab") as log:
            process = subprocess.Popen([BUILD / "bin" / name, "--foreground"], stdout=log,
                                       stderr=log, stdin=subprocess.DEVNULL)
        self.running[name] = process

        def ready_or_dead():
            if process.poll() is not None:
                self.fail(name, f"ended with status {process.returncode}")
            return is_ready()

        wait_until(ready_or_dead, f"{name} to be ready")

    def start_daemon(self):
        self.start("maruelasticd", lambda: os.path.exists(SOCKET))

    def start_web(self):
        def answers():
            with contextlib.suppress(OSError, http.client.HTTPException):
                return self.http("GET", "/healthz")[0] == 200
            return False

        self.start("maruwebd", answers)

    def stop(self, name):
        process = self.running.pop(name)
        process.terminate()
        process.wait(PATIENCE)

    def stop_all(self):
        for name in list(self.running):
            self.stop(name)

    def connect(self, timeout=5 * PATIENCE):
        return http.client.HTTPConnection("127.0.0.1", self.port, timeout=timeout)

    def http(self, verb, path, body=None, token=None):
        """One request; its HTTP status and its answer, parsed when it is JSON."""
        return self.finish(self.begin(self.connect(), verb, path, body, token))

    @staticmethod
    def begin(connection, verb, path, body=None, token=None):
        headers = {"Content-Type": "application/json"} if body is not None else {}
        if token:
            headers["Authorization"] = "Bearer " + token
        connection.request(verb, path, None if body is None else json.dumps(body), headers)
        return connection

    @staticmethod
    def finish(connection):
        with contextlib.closing(connection):
            response = connection.getresponse()
            text = response.read()
        is_json = "json" in (response.getheader("Content-Type") or "")
        return response.status, json.loads(text) if is_json else text

    def metric(self, name):
        text = self.http("GET", "/metrics")[1].decode()
        return int(next(line.split()[1] for line in text.splitlines() if line.split()[0] == name))

    def wait_until_idle(self):
        wait_until(lambda: self.metric("maruweb_children_busy") == 0, "all requests to end")

    def sign_in(self, user):
        status, answer = self.http("POST", "/session", {"user": user, "password": user})
        assert status == 200 and answer["success"], (status, answer)
        return answer["data"]["token"]


SEARCH_PATH = "/webapi/MARU.Seeker.Elastic.Search/1/search"


def search_request(keyword, **more):
    return {"search_weight_list": [], "keyword": keyword, "indice": [], "from": 0, "size": 50,
            "fields": [], "file_type": "", **more}


def search(services, token, keyword, **more):
    """A search over HTTP that must succeed: its data, {"hits", "total"}."""
    status, answer = services.http("POST", SEARCH_PATH, search_request(keyword, **more), token)
    assert status == 200 and answer["success"], (status, answer)
    return answer["data"]


def disk_path(hit):
    """Where a hit's file lies in this sandbox."""
    volume, share_path = hit["MARUMDPath"][1:].split("/", 1)
    assert volume == "volume1", hit
    return str(SHARES / share_path)


def exchange(*requests):
    """Speaks with the daemon's socket by hand: each request's messages up to the one that says
    whether it succeeded."""
    with socket.socket(socket.AF_UNIX) as connection:
        connection.settimeout(PATIENCE)
        connection.connect(SOCKET)
        stream = connection.makefile("rw", encoding="utf-8", errors="surrogateescape")
        replies = []
        for request in requests:
            stream.write(json.dumps(request) + "\n")
            stream.flush()
            messages = []
            while not messages or "success" not in messages[-1]:
                line = stream.readline()
                assert line.endswith("\n"), f"the daemon broke off after {messages[-3:]}"
                messages.append(json.loads(line))
            replies.append(messages)
        return replies


def daemon_search(keyword, indice, start=0, size=500, filters=None):
    """A search as it is asked for at the daemon's socket."""
    data = {"pre_query": {"keyword": keyword, "criteria_list": [], "file_type": "",
                          "search_weight_list": []},
            "indice": indice, "from": start, "size": size, "default_search_op": "AND", "fields": [],
            "load_field": ["MARUMDPath", "MARUMDFSName", "MARUMDExtension", "MARUMDIsDir",
                           "MARUMDFSSize"],
            "lazy_field": ["MARUMDTextContent"],
            "collector": {"agent": "others", "uid": os.getuid(), "has_criteria": False}}
    if filters:
        data["filters"] = filters
    return {"command": "search", "data": data}


def all_found(user, keyword, indice, filters=None):
    """All pages of a search at the daemon's socket as that user: the total and the disk paths."""
    def ask():
        paths = []
        while True:
            [messages] = exchange(daemon_search(keyword, indice, len(paths), 500, filters))
            assert messages[-1]["success"], messages[-1]
            total = next(message["total"] for message in messages if "total" in message)
            hits = [disk_path(message) for message in messages if "MARUMDPath" in message]
            paths += hits
            if not hits or len(paths) >= total:
                return total, paths

    return as_user(user, ask)


class RoadTest(unittest.TestCase):
    """A test class with services of its own; `prepare` starts them."""

    @classmethod
    def setUpClass(cls):
        if not in_sandbox():
            raise unittest.SkipTest("needs the sandbox's accounts: run it with tools/sandbox")
        cls.services = Services()
        cls.addClassCleanup(cls.services.stop_all)
        cls.prepare(cls.services)

    @classmethod
    def prepare(cls, services):
        raise NotImplementedError
