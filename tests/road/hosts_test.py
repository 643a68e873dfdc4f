#!/usr/bin/python3
"""Samba's rules by the client's address: each share is open from one address alone, and what is
told over HTTP depends on where the request comes from, whoever's it is."""

import contextlib
import http.client
import json
import os
import socket
import struct
import threading
import unittest

import fake_daemon
import road

HERE, THERE = "127.0.0.1", "127.0.0.2"
RULES = {"docs": f"hosts deny = {THERE}", "photo": f"hosts allow = {THERE}\n\thosts deny = ALL"}
OPEN = {HERE: "docs", THERE: "photo"}
USERS = ("alice", "bob", "carol")
API = "/webapi/MARU.Seeker.Elastic."
INDICATE = {"search_weight_list": [], "criteria_list": [], "keyword": "hostbright",
            "file_type": ["document"]}


def add_rules():
    with open("/etc/samba/smb.conf", encoding="utf-8") as settings:
        text = settings.read()
    for share, rules in RULES.items():
        text = text.replace(f"[{share}]\n", f"[{share}]\n\t{rules}\n")
        with open(f"/mnt/{share}/host{share}.txt", "w", encoding="utf-8") as file:
            file.write(f"hostbright host{share}\n")
    with open("/etc/samba/smb.conf", "w", encoding="utf-8") as settings:
        settings.write(text)


def say(connection, *buffers, beside=()):
    """What the daemon answers to a line, or b"" when it hangs up."""
    with contextlib.suppress(BrokenPipeError, ConnectionResetError):
        connection.sendmsg(buffers, beside)
        return connection.recv(1 << 16)
    return b""


def connected():
    connection = socket.socket(socket.AF_UNIX)
    connection.settimeout(road.PATIENCE)
    connection.connect(road.SOCKET)
    return connection


def line_of(request):
    return json.dumps(request).encode() + b"\n"


INDICE = [f"fileindex_{share}" for share in RULES]
SEARCH = road.daemon_search("hostbright", INDICE)


def impostures():
    """What comes of naming an address without being root."""
    line = line_of(SEARCH)
    answers = []
    for text in (b"\x01client 127.0.0.2\n", b"\x01client 127.0.0.2\n" + line, b"\x01\n", b"\x01"):
        with connected() as connection:
            answers.append(say(connection, text).decode())
    root = (socket.SOL_SOCKET, socket.SCM_CREDENTIALS, struct.pack("3i", os.getpid(), 0, os.getgid()))
    with connected() as connection:
        try:
            answers.append(say(connection, b"\x01client 127.0.0.2\n", line, beside=[root]).decode())
        except PermissionError:
            answers.append("")
    return answers


def many_descriptors():
    """A search with descriptors beside it, over and over."""
    files = [os.open("/etc/passwd", os.O_RDONLY) for _ in range(50)]
    beside = (socket.SOL_SOCKET, socket.SCM_RIGHTS, struct.pack("50i", *files))
    with connected() as connection:
        return [b'"success":true' in say(connection, line_of(SEARCH), beside=[beside])
                for _ in range(20)]


def looks_into(process):
    """What of another process can be looked into."""
    seen = []
    for name in ("fd", "mem", "environ", "fdinfo"):
        with contextlib.suppress(OSError):
            path = f"/proc/{process}/{name}"
            seen.append(len(os.listdir(path)) if os.path.isdir(path) else os.open(path, os.O_RDONLY))
    return seen


class HostsTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        add_rules()
        services.index()
        services.start_daemon()
        services.start_web()
        cls.tokens = {user: services.sign_in(user) for user in USERS}

    def call(self, user, address, method, params, **headers):
        connection = http.client.HTTPConnection("127.0.0.1", self.services.port,
                                                timeout=road.PATIENCE, source_address=(address, 0))
        headers |= {"Content-Type": "application/json", "Authorization": "Bearer " + self.tokens[user]}
        connection.request("POST", API + method, json.dumps(params), headers)
        return self.services.finish(connection)

    def data(self, user, address, method, params, **headers):
        status, answer = self.call(user, address, method, params, **headers)
        self.assertEqual((200, True), (status, answer["success"]), answer)
        return answer["data"]

    def hits(self, user, address, **headers):
        data = self.data(user, address, "Search/1/search", road.search_request("hostbright"), **headers)
        self.assertEqual(data["total"], len(data["hits"]))
        return {hit["MARUMDSharePath"].split("/")[1]: hit for hit in data["hits"]}

    def test_search_and_counts(self):
        for _ in range(5):
            for user in USERS:
                for address, share in OPEN.items():
                    self.assertEqual({share}, set(self.hits(user, address)), (user, address))
                    counts = self.data(user, address, "Indicate/1/indicate", INDICATE)
                    self.assertEqual(1, counts["document"], (user, address))

    def test_suggestions(self):
        for user in USERS:
            for address, share in OPEN.items():
                data = self.data(user, address, "Term/1/suggest",
                                 {"terms": "host", "suggester": ["completion", "name", "spelling"]})
                terms = str(data["suggestions"])
                self.assertIn(f"host{share}", terms, (user, address))
                [other] = set(RULES) - {share}
                self.assertNotIn(f"host{other}", terms, (user, address))
                available = self.data(user, address, "Term/1/list_avail_db", {})["indices"]
                self.assertIn(f"fileindex_{share}", available)
                self.assertNotIn(f"fileindex_{other}", available)

    def test_highlight(self):
        for user in USERS:
            for address, share in OPEN.items():
                hit = self.hits(user, address)[share]
                params = {"full_path": hit["MARUMDPath"], "doc_id": hit["doc_id"],
                          "keyword": "hostbright",
                          "highlight": {"field": "MARUMDTextContent", "frag_length": 100,
                                        "num_fragments": 2}}
                self.assertIn("hostbright", str(self.data(user, address, "Highlight/1/highlight", params)))
                [elsewhere] = set(OPEN) - {address}
                status, answer = self.call(user, elsewhere, "Highlight/1/highlight", params)
                self.assertEqual((403, 507), (status, answer["error"]["code"]), (user, address))

    def test_who_speaks_to_the_daemon_is_here(self):
        for user in ("alice", "bob", "MaruSeeker"):
            total, paths = road.all_found(user, "hostbright", INDICE)
            self.assertEqual((1, ["/mnt/docs/hostdocs.txt"]), (total, paths), user)

    def test_an_address_is_roots_to_say(self):
        self.assertEqual([""] * 5, road.as_user("alice", impostures))
        with connected() as connection:
            answer = say(connection, b"\x01client 127.0.0.2\n", line_of(SEARCH)).decode()
        self.assertIn("/volume1/photo/hostphoto.txt", answer)
        self.assertNotIn("hostdocs", answer)
        for nowhere in (b"", b"unknown", b"127.0.0.2 "):
            with connected() as connection:
                answer = say(connection, b"\x01client " + nowhere + b"\n", line_of(SEARCH)).decode()
            self.assertIn('"total":0', answer)

    def test_descriptors_are_thrown_away(self):
        folder = f"/proc/{self.services.running['maruelasticd'].pid}/fd"
        before = len(os.listdir(folder))
        self.assertEqual([True] * 20, road.as_user("alice", many_descriptors))
        road.wait_until(lambda: len(os.listdir(folder)) <= before, "the daemon to hold no more")

    def test_nobody_looks_into_their_request(self):
        self.services.stop("maruelasticd")
        try:
            with fake_daemon.FakeDaemon(fake_daemon.silence) as daemon:
                asking = threading.Thread(target=self.call, args=(
                    "alice", HERE, "Search/1/search", road.search_request("hostbright")))
                asking.start()
                road.wait_until(lambda: daemon.peers, "the request to ask the daemon")
                self.assertEqual([], road.as_user("alice", looks_into, daemon.peers[0]))
            asking.join()
        finally:
            self.services.start_daemon()

    def start_web(self, behind_proxy):
        self.services.stop("maruwebd")
        self.services.configure(behind_proxy=behind_proxy)
        self.services.start_web()
        type(self).tokens = {user: self.services.sign_in(user) for user in USERS}

    def test_behind_a_proxy_the_client_is_whom_it_saw(self):
        self.start_web("yes")
        self.addCleanup(self.start_web, "no")
        self.assertEqual({}, self.hits("alice", HERE))
        for address, share in OPEN.items():
            for claim in (address, f"192.0.2.1, {address}", f"::ffff:{address}"):
                self.assertEqual({share}, set(self.hits("alice", HERE, **{"X-Forwarded-For": claim})))
        self.assertEqual({}, self.hits("alice", HERE, **{"X-Forwarded-For": f"{HERE}, nobody"}))


if __name__ == "__main__":
    unittest.main()
