#!/usr/bin/python3
"""The daemon's socket, used by hand: the kernel's word on who asks decides, not the request's."""

import json
import os
import random
import socket
import unittest

import road

INDICE = ["fileindex_docs", "fileindex_homes", "fileindex_photo", "fileindex_private"]


def permission(name):
    return [{"name": "permission", "data": name}]


def errors_of(lines):
    """Sends raw lines over one connection each; what comes back, or None for a dropped one."""
    answers = []
    for line in lines:
        with socket.socket(socket.AF_UNIX) as connection:
            connection.settimeout(road.PATIENCE)
            connection.connect(road.SOCKET)
            connection.sendall(line.encode("latin-1") + b"\n")
            answer = connection.makefile("rb").readline()
            answers.append(json.loads(answer) if answer else None)
    return answers


class SocketTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        services.index()
        services.start_daemon()
        services.start_web()

    def test_no_filter_shows_more_than_the_web_does(self):
        web = {}
        for user in ("alice", "bob"):
            data = road.search(self.services, self.services.sign_in(user), "harbour")
            web[user] = sorted(road.disk_path(hit) for hit in data["hits"])
        self.assertNotEqual(web["alice"], web["bob"])
        for filters in (None, permission("alice")):
            total, found = road.all_found("alice", "harbour", INDICE, filters)
            self.assertEqual((len(web["alice"]), web["alice"]), (total, sorted(found)))
        both = set(web["alice"]) & set(web["bob"])
        others = [permission(name) for name in ("bob", "carol", "root", "MaruSeeker", "no such user")]
        others.append(permission("bob") + permission("alice"))
        for filters in others:
            total, found = road.all_found("alice", "harbour", INDICE, filters)
            self.assertLessEqual(set(found), both, filters)
            self.assertEqual(len(found), total, filters)

    def test_root_and_the_service_see_all_and_can_narrow_it(self):
        everything = road.all_found(None, "harbour", INDICE)
        self.assertEqual(everything, road.all_found("MaruSeeker", "harbour", INDICE))
        for user in ("alice", "bob"):
            own = road.all_found(user, "harbour", INDICE)
            self.assertEqual(own, road.all_found("MaruSeeker", "harbour", INDICE, permission(user)))
            self.assertLess(set(own[1]), set(everything[1]))

    def test_an_account_of_the_machine_sees_what_is_open_to_all(self):
        total, found = road.all_found("nobody", "harbour", INDICE)
        everything = road.everything_under(road.SHARES)
        expected = [path for path in road.as_user("nobody", road.readable, everything)
                    if not path.startswith("/mnt/private/")]
        self.assertLessEqual(set(found), set(expected))
        self.assertEqual(len(found), total)
        self.assertIn("/mnt/docs/rights/everyone.txt", found)

    def test_bad_requests_are_answered(self):
        good = road.daemon_search("harbour", INDICE)
        wrong_type = {**good, "data": {**good["data"], "size": "many"}}
        bad = ["abc", "[]", "{}", '{"command": 5}', '{"command": "no such"}',
               '{"command": "search"} trailing', '{"command": "search", "command": "search"}',
               '{"command": "search", "data": []}', json.dumps(wrong_type), "\xff\xfe",
               "[" * 100_000, '{"command": "search", "data": {"from": 1e400}}']
        noise = random.Random(7)
        bad += ["".join(chr(noise.randrange(11, 256)) for _ in range(200)) for _ in range(20)]
        for line, answer in zip(bad, road.as_user("alice", errors_of, bad)):
            self.assertIsNotNone(answer, line[:60])
            self.assertFalse(answer["success"], line[:60])
            self.assertIsInstance(answer["error"]["code"], int)
            self.assertTrue(answer["error"]["msg"])
        self.assertTrue(road.as_user("alice", road.exchange, good)[0][-1]["success"])

    def test_clients_that_stall_or_hang_up_disturb_nobody(self):
        stalled = []
        whole = json.dumps(road.daemon_search("harbour", INDICE)).encode() + b"\n"
        for text in (b"", b'{"command"', whole):
            for _ in range(30):
                connection = socket.socket(socket.AF_UNIX)
                connection.connect(road.SOCKET)
                connection.sendall(text)
                stalled.append(connection)
        for connection in stalled[::2]:
            connection.close()
        self.assertGreater(road.all_found("alice", "harbour", INDICE)[0], 0)
        for connection in stalled[1::2]:
            connection.close()
        self.assertEqual(0o666, os.stat(road.SOCKET).st_mode & 0o777)


if __name__ == "__main__":
    unittest.main()
