#!/usr/bin/python3
"""Highlight, suggestions, counts per type, boosts and history over HTTP, as two users and carol."""

import os
import pwd
import sqlite3
import time
import unittest

import fake_daemon
import road

FOLDER = "/mnt/docs/methods"
# Words of which some stand only in what bob alone may read.
FILES = {
    "open.txt": ("root", 0o644, "Quillbright meets quillopen; a <i>markup</i> & more. Quillbright!"),
    "bobs.txt": ("bob", 0o600, "quillbright and quillsecret, known to bob alone"),
    "page.html": ("root", 0o644, "<title>Quillbright page</title><p>quillbright text</p>"),
    "song.mp3": ("root", 0o644, ""),
    "twin-a.txt": ("root", 0o644, "twinword"),
    "twin-b.txt": ("root", 0o644, "twinword"),
}


def path_of(method):
    return "/webapi/MARU.Seeker.Elastic." + method


class MethodsTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        os.mkdir(FOLDER, 0o755)
        for name, (owner, mode, text) in FILES.items():
            with open(f"{FOLDER}/{name}", "w", encoding="utf-8") as file:
                file.write(text)
            os.chown(file.name, pwd.getpwnam(owner).pw_uid, -1)
            os.chmod(file.name, mode)
        services.index()
        services.start_daemon()
        services.start_web()
        cls.tokens = {user: services.sign_in(user) for user in ("alice", "bob", "carol")}

    def call(self, user, method, **params):
        return self.services.http("POST", path_of(method), params, self.tokens[user])

    def data(self, user, method, **params):
        status, answer = self.call(user, method, **params)
        self.assertEqual((200, True), (status, answer["success"]), answer)
        return answer.get("data")

    def code(self, user, method, **params):
        status, answer = self.call(user, method, **params)
        self.assertFalse(answer["success"])
        return status, answer["error"]["code"]

    def hit(self, user, name, keyword="quillbright"):
        hits = road.search(self.services, self.tokens[user], keyword)["hits"]
        return next(hit for hit in hits if hit["MARUMDFSName"] == name)

    def highlight(self, hit, **options):
        return {"full_path": hit["MARUMDPath"], "doc_id": hit["doc_id"], "keyword": "quillbright",
                "highlight": {"field": "MARUMDTextContent", "frag_length": 100, "num_fragments": 2,
                              **options}}

    def test_highlight_marks_and_escapes(self):
        data = self.data("alice", "Highlight/1/highlight", **self.highlight(self.hit("alice", "open.txt")))
        [fragment] = data["fragments"]["MARUMDTextContent"]
        self.assertEqual("<mark>Quillbright</mark> meets quillopen; a &lt;i&gt;markup&lt;/i&gt; &amp; "
                         "more. <mark>Quillbright</mark>!", fragment)
        title = self.data("alice", "Highlight/1/highlight",
                          **self.highlight(self.hit("alice", "page.html"), field="MARUMDTitle"))
        self.assertEqual(["<mark>Quillbright</mark> page"], title["fragments"]["MARUMDTitle"])

    def test_highlight_of_what_one_may_not_read(self):
        secret = self.hit("bob", "bobs.txt")
        self.assertEqual((403, 507), self.code("alice", "Highlight/1/highlight", **self.highlight(secret)))
        self.assertIn("quillsecret", str(self.data("bob", "Highlight/1/highlight",
                                                   **self.highlight(secret))))
        # The path of a file one may read does not open the document of another.
        mixed = self.highlight(secret)
        mixed["full_path"] = "/volume1/docs/methods/open.txt"
        self.assertEqual((403, 507), self.code("alice", "Highlight/1/highlight", **mixed))
        private = dict(self.highlight(secret), full_path="/volume1/private/plans.txt")
        self.assertEqual((403, 507), self.code("alice", "Highlight/1/highlight", **private))
        self.data("carol", "Highlight/1/highlight", **self.highlight(secret))
        readable = self.highlight(self.hit("alice", "open.txt"))
        self.services.stop("maruelasticd")
        try:
            self.assertEqual((403, 507), self.code("alice", "Highlight/1/highlight",
                                                   **self.highlight(secret)))
            self.assertEqual((503, 605), self.code("alice", "Highlight/1/highlight", **readable))
            self.assertEqual((503, 605), self.code("alice", "Spotlight/1/boost", full_path="/volume1/docs/x"))
            self.assertIsNone(self.data("alice", "Term/1/suggest", terms="quill"))
            self.assertEqual({"document": 0}, self.data(
                "alice", "Indicate/1/indicate", search_weight_list=[], criteria_list=[],
                keyword="quillbright", file_type=["document"]))
        finally:
            self.services.start_daemon()

    def suggested(self, user, terms, **more):
        return [row["term"] for row in
                self.data(user, "Term/1/suggest", terms=terms, **more)["suggestions"]]

    def test_suggestions_hold_nothing_unreadable(self):
        completion = {"suggester": ["completion"]}
        self.assertEqual(["quillbright", "quillopen"], self.suggested("alice", "quill", **completion))
        self.assertIn("quillsecret", self.suggested("bob", "quill", **completion))
        self.assertEqual(1, len(self.suggested("bob", "quill", suggest_num=1, **completion)))
        spelling = {"suggester": ["spelling"]}
        self.assertIn("quillopen", self.suggested("alice", "quilopen", **spelling))
        self.assertEqual([], self.suggested("alice", "quillsecrt", **spelling))
        self.assertIn("quillsecret", self.suggested("bob", "quillsecrt", **spelling))
        self.assertNotIn("bobs", str(self.suggested("alice", "bobs")))
        for text in ("quill", "quillsecre", "bob", "plans"):
            self.assertNotIn("quillsecret", self.suggested("alice", text))
        names = {row["name"] for row in self.data("alice", "Term/1/list_avail_db")["suggesters"]}
        self.assertLessEqual({"completion", "name", "spelling", "history"}, names)
        self.assertNotIn("fileindex_private", self.data("alice", "Term/1/list_avail_db")["indices"])

    def test_counts_per_type_are_those_of_the_searches(self):
        types = ["document", "audio", "image", "video", "code"]
        for user in self.tokens:
            for keyword in ("quillbright", "harbour"):
                counts = self.data(user, "Indicate/1/indicate", search_weight_list=[], criteria_list=[],
                                   keyword=keyword, file_type=types)
                for kind in types:
                    total = road.search(self.services, self.tokens[user], keyword, file_type=kind)["total"]
                    self.assertEqual(total, counts[kind], (user, keyword, kind))
        self.assertEqual((400, 120), self.code("alice", "Indicate/1/indicate", keyword="x"))

    def first_twin(self, user):
        return road.search(self.services, self.tokens[user], "twinword")["hits"][0]["MARUMDFSName"]

    def test_opened_files_rise(self):
        before = self.first_twin("alice")
        other = "twin-b.txt" if before == "twin-a.txt" else "twin-a.txt"
        for _ in range(3):
            self.assertIsNone(self.data("alice", "Spotlight/1/boost",
                                        full_path=f"/volume1/docs/methods/{other}"))
        self.assertEqual(other, self.first_twin("alice"))
        self.services.stop("maruelasticd")
        self.services.start_daemon()
        self.assertEqual(other, self.first_twin("alice"), "remembered")
        # The module passes over what the daemon thinks of a path; the daemon says it.
        self.assertIsNone(self.data("alice", "Spotlight/1/boost", full_path="/volume1/docs/none"))
        [[reply]] = road.as_user("alice", road.exchange, {
            "command": "record_spotlight_open",
            "data": {"id": "fileindex_docs", "full_path": "/volume1/docs/methods/bobs.txt"}})
        self.assertFalse(reply["success"])

    def test_what_other_daemons_would_say(self):
        hit = self.hit("alice", "open.txt")
        calls = {
            "Highlight/1/highlight": self.highlight(hit),
            "Term/1/suggest": {"terms": "quill"},
            "Term/1/list_avail_db": {},
            "Indicate/1/indicate": {"search_weight_list": [], "criteria_list": [], "keyword": "q",
                                    "file_type": ["audio"]},
            "Spotlight/1/boost": {"full_path": "/volume1/docs/methods/open.txt"},
        }
        judged = ("Highlight", "Term")
        refusal = {"success": False, "error": {"code": 502, "msg": "x"}}
        self.services.stop("maruelasticd")
        try:
            for method, params in calls.items():
                with fake_daemon.FakeDaemon(fake_daemon.replies(refusal)):
                    if method.startswith(judged):
                        self.assertEqual((500, 502), self.code("alice", method, **params), method)
                    else:
                        self.assertIsNone(self.data("alice", method, **params), method)
                with fake_daemon.FakeDaemon(fake_daemon.replies({"success": True})):
                    self.assertIsNone(self.data("alice", method, **params), method)
                with fake_daemon.FakeDaemon(fake_daemon.list_reply):
                    status, answer = self.call("alice", method, **params)
                self.assertEqual(502 if method.startswith(judged) else 200, status, (method, answer))
                for behaviour in (fake_daemon.garbage, lambda *_: None):
                    with fake_daemon.FakeDaemon(behaviour):
                        self.assertEqual((502, 121), self.code("alice", method, **params), method)
        finally:
            self.services.start_daemon()


class HistoryTest(road.RoadTest):
    STRANGE = ["100%", "a_b", "quote ' and \"", "back\\slash", "emoji 🦊", "plain"]

    @classmethod
    def prepare(cls, services):
        services.index()
        services.start_daemon()
        services.start_web()
        cls.tokens = {user: services.sign_in(user) for user in ("alice", "bob")}

    def get(self, user, **params):
        status, answer = self.services.http("POST", path_of("SearchHistory/1/get"), params,
                                            self.tokens[user])
        self.assertEqual(200, status, answer)
        return answer["data"]

    def delete(self, user, ids):
        return self.services.http("POST", path_of("SearchHistory/1/delete"), {"id": ids},
                                  self.tokens[user])

    def keywords(self, user, **params):
        return [row["keyword"] for row in self.get(user, **params)["historys"]]

    def test_keywords_are_kept_found_and_removed(self):
        for keyword in self.STRANGE:
            road.search(self.services, self.tokens["alice"], keyword)
        road.wait_until(lambda: self.get("alice")["total"] == len(self.STRANGE), "the history")
        for text, expected in {"%": "100%", "_": "a_b", "'": self.STRANGE[2], '"': self.STRANGE[2],
                               "\\": "back\\slash", "🦊": "emoji 🦊"}.items():
            self.assertEqual([expected], self.keywords("alice", substr=text))
        self.assertEqual([], self.keywords("bob"))
        rows = self.get("alice", sort_by="keyword", sort_direction="DESC")["historys"]
        self.assertEqual(sorted(self.STRANGE, reverse=True), [row["keyword"] for row in rows])
        status, answer = self.services.http("POST", path_of("SearchHistory/1/get"),
                                            {"sort_by": "keyword; DROP TABLE search_history"},
                                            self.tokens["alice"])
        self.assertEqual((500, 9999), (status, answer["error"]["code"]))
        # Another user's ids delete nothing, and say nothing.
        self.assertEqual(200, self.delete("bob", [row["id"] for row in rows])[0])
        self.assertEqual(len(self.STRANGE), self.get("alice")["total"])
        self.assertEqual(200, self.delete("alice", [rows[0]["id"], 2**31 - 1])[0])
        self.assertEqual(len(self.STRANGE) - 1, self.get("alice")["total"])
        for ids, status, code in (([], 500, 9999), ([1.5], 400, 120), (["3"], 400, 120)):
            got, answer = self.delete("alice", ids)
            self.assertEqual((status, code), (got, answer["error"]["code"]))

    def test_ten_thousand_rows(self):
        uid = pwd.getpwnam("bob").pw_uid
        now = int(time.time())
        with sqlite3.connect(road.STATE / "history.db", timeout=30) as database:
            database.executemany("INSERT INTO search_history (uid, keyword, create_time) VALUES (?, ?, ?)",
                                 [(uid, f"word {i:05}", now - i) for i in range(10_000)])
        database.close()
        self.assertEqual(10_000, self.get("bob")["total"])
        self.assertEqual(50, len(self.keywords("bob")))
        seen = []
        for offset in range(0, 10_000, 2500):
            seen += self.keywords("bob", sort_by="create_time", sort_direction="desc", offset=offset,
                                  limit=2500)
        self.assertEqual([f"word {i:05}" for i in range(10_000)], seen)
        self.assertEqual(10_000, len(self.keywords("bob", limit=0)))
        self.assertEqual(10, self.get("bob", substr="word 0123")["total"])
        ids = [row["id"] for row in self.get("bob", limit=5000)["historys"]]
        self.assertEqual(200, self.delete("bob", ids)[0])
        self.assertEqual(5000, self.get("bob")["total"])


if __name__ == "__main__":
    unittest.main()
