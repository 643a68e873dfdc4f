"""What the web server's end-to-end tests share: a maruwebd with the plug-in that misbehaves."""

import http.client
import json
import os
import pathlib
import socket
import sys

HERE = pathlib.Path(__file__).resolve().parent
sys.path.insert(0, str(HERE.parent / "road"))

from road import BUILD, PATIENCE, RoadTest, Services, wait_until  # noqa: E402

PLUGIN = BUILD / "lib" / "libserver_test_plugin.so"
PAGES = pathlib.Path("/tmp/pages")
CALL = "/webapi/Test.Server/1/"
# For what would be in the way if the server waited for it; longer than any test waits.
LONG = 20 * PATIENCE * 1000


class WebTest(RoadTest):
    """One web server for the class, with alice and carol signed in."""

    @classmethod
    def prepare(cls, services):
        PAGES.mkdir(exist_ok=True)
        (PAGES / "index.html").write_text("<!doctype html><title>page</title>")
        services.configure(plugin=PLUGIN, page_dir=PAGES)
        services.start_web()
        cls.alice = services.sign_in("alice")
        cls.carol = services.sign_in("carol")

    def call(self, method, params=None, token=None):
        """A call of the test plug-in, as alice: its status and what it answered."""
        body = {} if params is None else params
        status, answer = self.services.http("POST", CALL + method, body, token or self.alice)
        return status, answer["data"] if answer["success"] else answer["error"]

    def begin_call(self, method, params, token=None):
        """A call whose answer nobody waits for yet: its connection."""
        return self.services.begin(self.services.connect(), "POST", CALL + method, params,
                                   token or self.alice)

    def raw(self, data=b""):
        """A plain connection on which `data` was sent."""
        connection = socket.create_connection(("127.0.0.1", self.services.port), PATIENCE)
        self.addCleanup(connection.close)
        connection.sendall(data)
        return connection

    def request(self, verb, path, headers=None, body=None):
        """One request with the headers as they are given: the response and its text."""
        connection = self.services.connect()
        self.addCleanup(connection.close)
        connection.request(verb, path, body, headers or {})
        response = connection.getresponse()
        return response, response.read()

    def metric(self, name):
        return self.services.metric(name)

    def wait_until_idle(self):
        self.services.wait_until_idle()


def responses(connection, count):
    """The next responses on a plain connection, as (status, text)."""
    reader = connection.makefile("rb")
    result = []
    for _ in range(count):
        status = int(reader.readline().split()[1])
        headers = http.client.parse_headers(reader)
        result.append((status, reader.read(int(headers["Content-Length"]))))
    return result


def refusal(text):
    return json.loads(text)["error"]["code"]


def processes():
    """All processes of this sandbox: id to (name, state, parent)."""
    result = {}
    for entry in os.listdir("/proc"):
        if not entry.isdigit():
            continue
        try:
            stat = pathlib.Path("/proc", entry, "stat").read_text()
        except OSError:
            continue
        name, rest = stat.split("(", 1)[1].rsplit(")", 1)
        result[int(entry)] = (name, rest.split()[0], int(rest.split()[1]))
    return result


def web_processes():
    return [pid for pid, (name, _, _) in processes().items() if name.startswith("maruweb")]


def mounts():
    return sorted(pathlib.Path("/proc/self/mounts").read_text().splitlines())


__all__ = ["BUILD", "CALL", "LONG", "PAGES", "PATIENCE", "Services", "WebTest", "mounts",
           "processes", "refusal", "responses", "wait_until", "web_processes"]
