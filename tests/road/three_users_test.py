#!/usr/bin/python3
"""The same query as alice, bob and carol over HTTP: three different answers, each exactly right."""

import unittest

import road

# What of the share rules no file's own rights say: who may use private, and whose home is whose.
CLOSED_SHARES = {"alice": ("/mnt/private/",), "bob": (), "carol": ()}

# A word of each sample in "languages", as somebody might type it.
WORDS = {"lighthouse": "english.txt", "Leuchtturmwärter": "deutsch.html", "gardien": "français.html",
         "farero": "español.txt", "latarnik": "polski.txt", "корабли": "русский.txt",
         "πλοία": "ελληνικά.txt", "המגדלור": "עברית.txt", "حارس": "العربية.html",
         "दीपक": "हिन्दी.txt", "灯台": "日本語.txt", "灯塔": "中文.html", "등대지기는": "한국어.txt",
         "Übergänge": "latin1.txt"}


def right_answer(user):
    """All sample files that hold the word and that the user can open; carol, an administrator,
    sees with root's eyes."""
    def harbour_files():
        found = []
        for path in road.readable(everything):
            if path.endswith((".txt", ".html")) and not path.startswith(CLOSED_SHARES[user]):
                with open(path, encoding="utf-8", errors="replace") as file:
                    if "harbour" in file.read().lower():
                        found.append(path)
        return found

    everything = road.everything_under(road.SHARES)
    return road.as_user(None if user == "carol" else user, harbour_files)


class ThreeUsersTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        services.index()
        services.start_daemon()
        services.start_web()
        cls.tokens = {user: services.sign_in(user) for user in CLOSED_SHARES}

    def found(self, user, keyword="harbour", **more):
        data = road.search(self.services, self.tokens[user], keyword, **more)
        return data["total"], [road.disk_path(hit) for hit in data["hits"]], data["hits"]

    def test_totals_and_hits(self):
        answers = {}
        for user in self.tokens:
            total, paths, hits = self.found(user)
            expected = right_answer(user)
            self.assertEqual(sorted(expected), sorted(paths), user)
            self.assertEqual(len(expected), total, user)
            self.assertTrue(all(hit["readable"] for hit in hits), user)
            answers[user] = set(paths)
        rights = "/mnt/docs/rights/"
        self.assertLess({rights + "family-group.txt", "/mnt/homes/alice/diary.txt"}, answers["alice"])
        self.assertLess({rights + "opened-to-bob.txt", "/mnt/private/plans.txt"}, answers["bob"])
        self.assertLess(answers["alice"] | answers["bob"], answers["carol"])
        for hidden in ("closed-by-mask.txt", "closed/below.txt"):
            self.assertNotIn(rights + hidden, answers["alice"] | answers["bob"])

    def test_pages_follow_one_another(self):
        for user in self.tokens:
            total, whole, _ = self.found(user)
            pages = []
            for start in range(0, total + 3, 3):
                page_total, paths, _ = self.found(user, **{"from": start, "size": 3})
                self.assertEqual(total, page_total)
                self.assertEqual(min(3, max(0, total - start)), len(paths))
                pages += paths
            self.assertEqual(whole, pages, user)

    def test_what_a_hit_tells(self):
        _, paths, hits = self.found("alice", highlight=[
            {"field": "MARUMDTextContent", "frag_length": 100, "num_fragments": 3}])
        hits = dict(zip(paths, hits))
        own = hits["/mnt/docs/rights/owner-alice.txt"]
        self.assertEqual("alice", own["MARUMDOwnerUserName"])
        self.assertEqual("/docs/rights/owner-alice.txt", own["MARUMDSharePath"])
        self.assertEqual(False, own["additional"]["is_mount_point"])
        self.assertEqual("root", hits["/mnt/docs/rights/everyone.txt"]["MARUMDOwnerUserName"])
        self.assertIn("harbour", str(own["highlight"]))

    def test_named_shares(self):
        for user, inside in (("alice", 0), ("bob", 2), ("carol", 2)):
            self.assertEqual(inside, self.found(user, indice=["private"])[0], user)
            own = self.found(user, indice=["homes"])[1]
            expected = [user] if user != "carol" else ["alice", "bob", "carol"]
            self.assertEqual([f"/mnt/homes/{name}/diary.txt" for name in expected], sorted(own))
        self.assertEqual(0, self.found("carol", indice=["no such share"])[0])

    def test_words_in_many_scripts(self):
        for word, name in WORDS.items():
            self.assertIn("/mnt/docs/languages/" + name, self.found("alice", word)[1], word)

    def test_who_is_refused(self):
        request = road.search_request("harbour")
        for token in (None, "forged", self.tokens["alice"][:-2]):
            status, answer = self.services.http("POST", road.SEARCH_PATH, request, token)
            self.assertEqual((401, 10401), (status, answer["error"]["code"]))
        status, _ = self.services.http("POST", "/session", {"user": "bob", "password": "alice"})
        self.assertEqual(401, status)
        del request["search_weight_list"]
        status, answer = self.services.http("POST", road.SEARCH_PATH, request, self.tokens["bob"])
        self.assertEqual(400, status)
        self.assertEqual({"code": 120, "data": {"name": "search_weight_list", "reason": "required"}},
                         answer["error"])


if __name__ == "__main__":
    unittest.main()
