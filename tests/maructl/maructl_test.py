#!/usr/bin/python3
"""The operators' command, before a search daemon that says what the test wants."""

import pathlib
import subprocess
import sys
import unittest

sys.path.insert(0, str(pathlib.Path(__file__).resolve().parents[1] / "road"))

import road  # noqa: E402
from fake_daemon import FakeDaemon, garbage, replies  # noqa: E402

GOOD, NO, USAGE, FAILED = 0, 1, 2, 3


def maructl(*arguments):
    """Its exit status, and what it said on standard output and standard error together."""
    done = subprocess.run([road.BUILD / "bin/maructl", *arguments], check=False,
                          stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
    return done.returncode, done.stdout.decode(errors="replace")


@unittest.skipUnless(road.in_sandbox(), "needs the sandbox")
class MaructlTest(unittest.TestCase):
    def test_preferences_are_kept_by_their_type(self):
        self.assertEqual((GOOD, "yes\n"), maructl("preference", "get", "alice", "enable_history"))
        self.assertEqual((GOOD, ""), maructl("preference", "set", "alice", "enable_history", "no"))
        self.assertEqual((GOOD, ""), maructl("preference", "set", "alice", "max_history_num", "7"))
        self.assertEqual((GOOD, "no\n"), maructl("preference", "get", "alice", "enable_history"))
        self.assertEqual((GOOD, "7\n"), maructl("preference", "get", "alice", "max_history_num"))
        self.assertEqual((GOOD, "100\n"), maructl("preference", "get", "bob", "max_history_num"))
        for key, value in (("enable_history", "2"), ("max_history_num", "yes"),
                           ("max_history_num", "0"), ("no_such_key", "1")):
            self.assertEqual(FAILED, maructl("preference", "set", "alice", key, value)[0], key)
        self.assertEqual((FAILED, "maructl: no such user: nobody-here\n"),
                         maructl("preference", "get", "nobody-here", "enable_history"))

    def test_shares_tell_who_may_enter_and_what_is_indexed(self):
        (road.STATE / "index/fileindex_docs").mkdir(parents=True)
        with open("/etc/samba/smb.conf", "a", encoding="utf-8") as settings:
            settings.write("\n[odd]\n\tpath = somewhere\n")
        status, said = maructl("shares")
        said, withheld = said.split("\n\n")
        self.assertIn("\nodd       its path somewhere is not absolute\n", withheld)
        rows = {line.split()[0]: line.split()[2:] for line in said.splitlines()}
        self.assertEqual(GOOD, status, said)
        self.assertEqual(["yes", "everyone"], rows["docs"])
        self.assertEqual(["not", "yet", "bob"], rows["private"])

    def test_a_search_prints_paths_or_says_why_not(self):
        hits = [{"MARUMDPath": "/volume1/docs/a"}, {"MARUMDPath": "/volume1/docs/b c"}]
        with FakeDaemon(replies({"total": 2}, *hits, {"success": True})) as daemon:
            self.assertEqual((GOOD, "/volume1/docs/a\n/volume1/docs/b c\n"),
                             maructl("search", "two", "words", "--limit", "5"))
            self.assertEqual((GOOD, "/volume1/docs/a\0/volume1/docs/b c\0"),
                             maructl("search", "-0", "word"))
        data = daemon.requests[0]["data"]
        self.assertEqual(("two words", 5), (data["pre_query"]["keyword"], data["size"]))
        with FakeDaemon(replies({"total": 0}, {"success": True})):
            self.assertEqual((NO, ""), maructl("search", "word"))
        error = {"success": False, "error": {"code": 120, "msg": "no such field"}}
        with FakeDaemon(replies(error)):
            self.assertEqual((FAILED, "maructl: no such field\n"), maructl("search", "word"))
        with FakeDaemon(garbage):
            self.assertEqual(FAILED, maructl("search", "word")[0])
        self.assertEqual(USAGE, maructl("search")[0])

    def test_services_that_do_not_run_are_told(self):
        status, said = maructl("status")
        self.assertEqual(NO, status)
        self.assertIn("Search daemon  the search daemon does not answer at " + road.SOCKET, said)
        self.assertIn("Indexer        does not run", said)


if __name__ == "__main__":
    unittest.main()
