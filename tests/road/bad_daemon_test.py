#!/usr/bin/python3
"""A daemon that is down, deaf, mute or mad: the documented code, and the next request works."""

import os
import socket
import threading
import unittest

import fake_daemon
import road

METHODS = {
    "search": (road.SEARCH_PATH, road.search_request("harbour")),
    "suggest": ("/webapi/MARU.Seeker.Elastic.Term/1/suggest", {"terms": "harb", "suggest_num": 5}),
    "list_avail_db": ("/webapi/MARU.Seeker.Elastic.Term/1/list_avail_db", {}),
}


class BadDaemonTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        services.index()
        services.start_web()
        cls.token = services.sign_in("bob")

    def search(self):
        path, request = METHODS["search"]
        return self.services.http("POST", path, request, self.token)

    def assert_fails(self, status, code):
        got_status, answer = self.search()
        self.assertEqual((status, code), (got_status, answer["error"]["code"]))

    def assert_next_works(self):
        hit = {"MARUMDPath": "/volume1/docs/welcome.txt", "MARUMDOwnerUserID": "12abc"}
        with fake_daemon.FakeDaemon(fake_daemon.replies({"total": 7}, hit, {"success": True})):
            status, answer = self.search()
        self.assertEqual((200, 7), (status, answer["data"]["total"]))
        [hit] = answer["data"]["hits"]
        self.assertEqual("/docs/welcome.txt", hit["MARUMDSharePath"])

    def test_no_daemon_at_all(self):
        self.assertFalse(os.path.exists(road.SOCKET))
        status, answer = self.search()
        self.assertEqual((200, {"hits": [], "total": 0}), (status, answer["data"]))
        self.assert_next_works()

    def test_a_socket_with_nobody_listening(self):
        with socket.socket(socket.AF_UNIX) as deaf:
            deaf.bind(road.SOCKET)
            os.chmod(road.SOCKET, 0o666)
            self.assert_fails(503, 605)
        os.unlink(road.SOCKET)
        self.assert_next_works()

    def test_garbage_and_broken_answers(self):
        not_an_object = fake_daemon.replies("total", 5, None)
        deep = lambda connection, *_: connection.sendall(b"[" * 100_000 + b"\n")
        hang_up = lambda *_: None
        for behaviour in (fake_daemon.garbage, fake_daemon.half_a_message, deep, hang_up):
            with fake_daemon.FakeDaemon(behaviour):
                self.assert_fails(502, 121)
            self.assert_next_works()
        for behaviour in (fake_daemon.list_reply, not_an_object):
            with fake_daemon.FakeDaemon(behaviour):
                status, answer = self.search()
                self.assertIn((status, answer["error"]["code"]), ((502, 121), (500, 117)))
            self.assert_next_works()

    def test_an_answer_that_fails_half_way_keeps_its_hits(self):
        hit = {"MARUMDPath": "/volume1/docs/welcome.txt", "MARUMDOwnerUserID": "0"}
        failure = {"success": False, "error": {"code": 1, "msg": "x"}}
        behaviour = fake_daemon.replies({"total": 3}, hit, failure)
        with fake_daemon.FakeDaemon(behaviour):
            status, answer = self.search()
        self.assertEqual((200, 3, 1), (status, answer["data"]["total"], len(answer["data"]["hits"])))
        with fake_daemon.FakeDaemon(fake_daemon.replies({"success": True})):
            self.assertEqual({"hits": []}, self.search()[1]["data"])

    def test_what_the_daemon_is_asked(self):
        with fake_daemon.FakeDaemon(fake_daemon.replies({"total": 0}, {"success": True})) as daemon:
            self.search()
            path, request = METHODS["search"]
            self.services.http("POST", path, request, self.services.sign_in("carol"))
        of_bob, of_carol = daemon.requests
        self.assertEqual("search", of_bob["command"])
        self.assertEqual([{"name": "permission", "data": "bob"}], of_bob["data"]["filters"])
        self.assertEqual(["fileindex_" + name for name in ("docs", "homes", "photo", "private")],
                         of_bob["data"]["indice"])
        self.assertNotIn("filters", of_carol["data"])
        self.assertEqual({"agent": "others", "uid": 60002, "has_criteria": False},
                         of_bob["data"]["collector"])

    def test_one_that_never_answers_blocks_nobody(self):
        """The time-out is a minute: all kinds of silence are waited for at once."""
        results = []

        def ask(path, request):
            results.append(self.services.http("POST", path, request, self.token))

        def behave(connection, request, ended):
            is_search = request["command"] == "search"
            stalls = not is_search or request["data"]["pre_query"]["keyword"] == "stall"
            (fake_daemon.stalled_message if stalls else fake_daemon.silence)(connection, request, ended)

        calls = [*METHODS.values(), (road.SEARCH_PATH, road.search_request("stall"))]
        with fake_daemon.FakeDaemon(behave) as daemon:
            threads = [threading.Thread(target=ask, args=call) for call in calls]
            for thread in threads:
                thread.start()
            road.wait_until(lambda: len(daemon.requests) == len(calls), "all requests")
            # Meanwhile others are served.
            self.assertEqual(200, self.services.http("GET", "/session", token=self.token)[0])
            self.assertEqual(200, self.services.http("GET", "/healthz")[0])
            for thread in threads:
                thread.join()
        for status, answer in results:
            self.assertEqual((502, 121), (status, answer["error"]["code"]))
        self.assertEqual(len(calls), len(results))
        self.assert_next_works()


if __name__ == "__main__":
    unittest.main()
