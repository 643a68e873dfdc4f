#!/usr/bin/python3
"""Bursts of queries, of which the newest wins, and the history, which no answer waits for."""

import contextlib
import os
import pathlib
import pwd
import signal
import sqlite3
import threading
import unittest

import fake_daemon
import road

BURST = 20
ALICE = 60001
HISTORY = road.STATE / "history.db"


def processes_of(uid):
    """Process ids of a user, zombies included."""
    found = []
    for entry in pathlib.Path("/proc").glob("[0-9]*"):
        try:
            if entry.stat().st_uid == uid or f"\nUid:\t{uid}" in (entry / "status").read_text():
                found.append(int(entry.name))
        except OSError:
            pass
    return found


def zombies():
    found = []
    for entry in pathlib.Path("/proc").glob("[0-9]*/stat"):
        try:
            if entry.read_text().rsplit(")", 1)[1].split()[0] == "Z":
                found.append(entry.parent.name)
        except OSError:
            pass
    return found


class QueriesTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        services.index()
        services.start_web()
        cls.token = services.sign_in("alice")

    def send(self, serial, query_id):
        request = road.search_request("harbour", query_id=query_id, query_serial=serial)
        return self.services.begin(self.services.connect(), "POST", road.SEARCH_PATH, request,
                                   self.token)

    def left_behind(self):
        """What stands in the private /tmp of the processes that serve requests."""
        for name in pathlib.Path("/proc").glob("[0-9]*/comm"):
            with contextlib.suppress(OSError):
                if name.read_text() == "maruweb-host\n":
                    return os.listdir(name.parent / "root/tmp")
        raise AssertionError("there is no host")

    def assert_served_as_ever(self):
        hit = {"MARUMDPath": "/volume1/docs/welcome.txt", "MARUMDOwnerUserID": "0"}
        with fake_daemon.FakeDaemon(fake_daemon.replies({"total": 1}, hit, {"success": True})):
            data = road.search(self.services, self.token, "welcome", query_id="later",
                               query_serial=1)
            self.assertEqual(1, data["total"])
        road.wait_until(lambda: not processes_of(ALICE) and not zombies(), "no process left behind")
        self.assertEqual([], self.left_behind())

    def test_each_newer_query_ends_the_older_one(self):
        answer = threading.Event()

        def behave(connection, request, ended):
            answer.wait()
            fake_daemon.replies({"total": 0}, {"success": True})(connection, request, ended)

        with fake_daemon.FakeDaemon(behave) as daemon:
            connections = []
            for serial in range(1, BURST + 1):
                connections.append(self.send(serial, "typing"))
                road.wait_until(lambda: len(daemon.requests) == len(connections), "the query")
            for connection in connections[:-1]:
                status, older = self.services.finish(connection)
                self.assertEqual((409, 1600), (status, older["error"]["code"]))
            road.wait_until(lambda: len(processes_of(ALICE)) == 1, "the older ones to be gone")
            answer.set()
            status, newest = self.services.finish(connections[-1])
            self.assertEqual((200, {"hits": [], "total": 0}), (status, newest["data"]))
        self.assert_served_as_ever()

    def test_a_burst_at_once(self):
        def behave(connection, request, ended):
            ended.wait(0.2)
            fake_daemon.replies({"total": 0}, {"success": True})(connection, request, ended)

        with fake_daemon.FakeDaemon(behave):
            connections = [self.send(serial, "burst") for serial in range(1, BURST + 1)]
            answers = [self.services.finish(connection) for connection in connections]
        self.assertTrue(answers[-1][1]["success"], answers[-1])
        for status, answer in answers[:-1]:
            # Two that read the query file at the same moment may both be served.
            self.assertTrue(answer["success"] or (status, answer["error"]["code"]) == (409, 1600))
        self.assert_served_as_ever()

    def test_an_outdated_query_and_an_id_that_is_a_path(self):
        with fake_daemon.FakeDaemon(fake_daemon.silence) as daemon:
            newer = self.send(5, "outdated")
            road.wait_until(lambda: daemon.requests, "the newer query")
            for serial in (5, 4):
                status, answer = self.services.finish(self.send(serial, "outdated"))
                self.assertEqual((409, 1600), (status, answer["error"]["code"]))
            status, answer = self.services.finish(self.send(1, "../tmp/x"))
            self.assertEqual((400, 120), (status, answer["error"]["code"]))
            # The browser goes away: the process that serves it ends.
            newer.close()
            road.wait_until(lambda: not processes_of(ALICE), "the query to end with its client")
        self.assert_served_as_ever()

    def test_a_late_kill_meets_no_other_request(self):
        def served_by():
            """The process that serves a plain query, which nothing names afterwards."""
            self.services.wait_until_idle()
            with fake_daemon.FakeDaemon(fake_daemon.replies({"success": True})) as daemon:
                road.search(self.services, self.token, "harbour")
                self.services.wait_until_idle()
                return daemon.peers[0]

        def without_a_socket():
            road.search(self.services, self.token, "harbour", query_id="named", query_serial=1)

        def without_an_answer():
            with fake_daemon.FakeDaemon(lambda *_: None):
                self.assertEqual(502, self.services.finish(self.send(1, "named"))[0])

        def without_a_client():
            with fake_daemon.FakeDaemon(fake_daemon.silence) as daemon:
                query = self.send(1, "named")
                road.wait_until(lambda: daemon.requests, "the query")
                query.close()
                self.services.wait_until_idle()

        for abandon in (without_a_socket, without_an_answer, without_a_client):
            road.wait_until(lambda: served_by() == served_by(), "one process to serve two requests")
            before = served_by()
            abandon()
            self.assertNotEqual(before, served_by(), abandon.__name__)
        self.assert_served_as_ever()

    def test_a_stopped_process_is_ended(self):
        with fake_daemon.FakeDaemon(fake_daemon.silence) as daemon:
            query = self.send(1, "stopped")
            road.wait_until(lambda: daemon.requests, "the query")

            def stop_all():
                for pid in processes_of(ALICE):
                    with contextlib.suppress(OSError):
                        if pid != os.getpid():
                            os.kill(pid, signal.SIGSTOP)

            road.as_user("alice", stop_all)
            status, answer = self.services.finish(query)
            self.assertEqual((500, 117), (status, answer["error"]["code"]))
        self.assert_served_as_ever()


class HistoryTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        services.index()
        services.start_daemon()
        services.start_web()
        cls.token = services.sign_in("alice")
        road.search(services, cls.token, "first keyword")
        road.wait_until(cls.keywords, "the history")

    @classmethod
    def get(cls, token=None):
        return cls.services.http("POST", "/webapi/MARU.Seeker.Elastic.SearchHistory/1/get",
                                 {"limit": 0}, token or cls.token)

    @classmethod
    def keywords(cls, token=None):
        status, answer = cls.get(token)
        assert status == 200, answer
        return [row["keyword"] for row in answer["data"]["historys"]]

    def test_the_service_writes_it(self):
        road.wait_until(lambda: "first keyword" in self.keywords(), "the keyword in the history")
        bob = self.services.sign_in("bob")
        road.search(self.services, bob, "  of bob  ")
        journal = HISTORY.with_suffix(".journal")
        road.wait_until(journal.exists, "a line in the journal")
        for file in (HISTORY, journal):
            self.assertEqual(pwd.getpwnam("MaruSeeker").pw_uid, file.stat().st_uid)
            self.assertEqual(0, file.stat().st_mode & 0o077)
        road.wait_until(lambda: self.keywords(bob) == ["of bob"], "bob's keyword, trimmed")
        self.assertNotIn("of bob", self.keywords())

    def test_a_locked_database_delays_no_answer(self):
        database = sqlite3.connect(HISTORY, timeout=road.PATIENCE, isolation_level=None)
        database.execute("BEGIN EXCLUSIVE")
        # While the lock is held nothing can be written; the answer comes all the same, and who asks
        # for the history waits.
        road.search(self.services, self.token, "while locked")
        asking = threading.Thread(target=self.get)
        asking.start()
        road.search(self.services, self.token, "while somebody waits")
        database.execute("ROLLBACK")
        database.close()
        asking.join()
        road.wait_until(lambda: {"while locked", "while somebody waits"} <= set(self.keywords()),
                        "the keywords after the lock")

    def test_none_is_lost_and_none_is_doubled(self):
        words = [f"word {number}" for number in range(12)]
        errors = []

        def ask(word):
            try:
                for _ in range(2):
                    road.search(self.services, self.token, word)
            except AssertionError as error:
                errors.append(error)

        threads = [threading.Thread(target=ask, args=(word,)) for word in words]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        self.assertFalse(errors)
        road.wait_until(lambda: set(words) <= set(self.keywords()), "all keywords")
        self.assertEqual(len(set(self.keywords())), len(self.keywords()))


if __name__ == "__main__":
    unittest.main()
