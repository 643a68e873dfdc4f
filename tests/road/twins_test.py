#!/usr/bin/python3
"""Twins: a share, and one without what alice may not read. Whatever she asks, over HTTP or at the
daemon's socket, she is told the same of both.

The seed is printed; MARU_SEED repeats a run, MARU_QUESTIONS asks more or fewer.
"""

import json
import os
import pwd
import random
import shutil
import time
import unittest

import road

WHOLE, OWN = "photo", "docs"
QUESTIONS = int(os.environ.get("MARU_QUESTIONS", "150"))
# None begins like the names of the shares, which are words of their own folders.
WORDS = ("sail sails sailing sailor sale sales salt salty berry berries berth berths bertha rent rents "
         "report reports walk walked walking wall walls tide tides tidy").split()
KINDS = ["document", "code", "image", "audio", "folder", "other"]
SUGGESTERS = ["history", "completion", "name", "spelling"]
BOB = pwd.getpwnam("bob")


class Twins:
    """Makes the same tree in both shares, in the second without what alice may not read."""

    def __init__(self, seed):
        self.random = random.Random(seed)
        self.closed = []

    def word(self, closed):
        word = self.random.choice(WORDS)
        if self.random.random() < (0.3 if closed else 0.05):
            word += self.random.choice("abcdef")
        if closed and self.random.random() < 0.2:
            word = "x" + word
        return word

    def text(self, closed):
        count = 2500 if self.random.random() < 0.05 else self.random.randrange(3, 40)
        return " ".join(self.word(closed) for _ in range(count))

    def make(self, files):
        folders = [("", True), ("/shut", False)]
        self.put("/shut", None, False, 0o700, 0)
        self.put("/shut/inside.txt", self.text(True), False, 0o644, 0)
        for number in range(15):
            parent, seen = self.random.choice(folders)
            is_open = self.random.random() < 0.75
            path = f"{parent}/{self.word(not is_open)} {number}"
            folders.append((path, seen and is_open))
            self.put(path, None, seen and is_open, 0o755 if is_open else 0o700, number)
        for number in range(files):
            parent, seen = self.random.choice(folders)
            is_open = self.random.random() < 0.6
            closed = not (seen and is_open)
            suffix = self.random.choice(("txt", "txt", "md", "html", "jpg", "mp3"))
            path = f"{parent}/{self.word(closed)} {number}.{suffix}"
            self.put(path, self.text(closed), not closed, 0o644 if is_open else 0o600, number)
        # Writing into a folder changes its time.
        for share in (WHOLE, OWN):
            for path, _ in folders:
                if os.path.isdir(f"/mnt/{share}{path}"):
                    os.utime(f"/mnt/{share}{path}", (1_700_000_000,) * 2)

    def put(self, path, text, seen, mode, number):
        """A folder that alice cannot enter is hers to see, as everybody sees its name."""
        if not seen:
            self.closed.append(path)
        for share in (WHOLE, OWN) if seen else (WHOLE,):
            disk = f"/mnt/{share}{path}"
            if text is None:
                os.mkdir(disk)
            else:
                with open(disk, "w", encoding="utf-8") as file:
                    file.write(text)
                os.utime(disk, (1_700_000_000 + number % 7,) * 2)
            os.chown(disk, BOB.pw_uid, BOB.pw_gid)
            os.chmod(disk, mode)


def same_share(answer, share):
    """An answer without what names the twin: the share, and numbers that its index gave."""
    text = json.dumps(answer, sort_keys=True)
    text = text.replace(f"/volume1/{share}", "/volume1/twin").replace(f"/{share}/", "/twin/")
    answer = json.loads(text.replace(f"fileindex_{share}", "fileindex_twin"))

    def strip(value):
        if isinstance(value, dict):
            return {name: strip(item) for name, item in value.items() if name != "doc_id"}
        return [strip(item) for item in value] if isinstance(value, list) else value

    return strip(answer)


class TwinsTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        seed = int(os.environ.get("MARU_SEED", time.time_ns() % 1_000_000))
        print(f"MARU_SEED={seed}", flush=True)
        for share in (WHOLE, OWN):
            for entry in os.scandir(f"/mnt/{share}"):
                shutil.rmtree(entry) if entry.is_dir() else os.unlink(entry)
            os.chmod(f"/mnt/{share}", 0o755)
        cls.twins = Twins(seed)
        cls.twins.make(700)
        for share in (WHOLE, OWN):
            os.utime(f"/mnt/{share}", (1_700_000_000,) * 2)
        services.index()
        services.start_daemon()
        services.start_web()
        cls.tokens = {user: services.sign_in(user) for user in ("alice", "bob")}
        cls.random = cls.twins.random
        cls.asked = cls.told = 0
        # What bob opens is his own business; what alice opens is hers in both.
        for path in cls.twins.closed[:40]:
            cls.boost("bob", WHOLE, path)
        found = road.search(services, cls.tokens["alice"], "sail", indice=[OWN], size=5)["hits"]
        for hit in found:
            for share in (WHOLE, OWN):
                cls.boost("alice", share, hit["MARUMDPath"].removeprefix(f"/volume1/{OWN}"))

    @classmethod
    def boost(cls, user, share, path):
        cls.services.http("POST", "/webapi/MARU.Seeker.Elastic.Spotlight/1/boost",
                          {"full_path": f"/volume1/{share}{path}"}, cls.tokens[user])

    def ask(self, method, params):
        return self.services.http("POST", f"/webapi/MARU.Seeker.Elastic.{method}", params,
                                  self.tokens["alice"])

    def compare(self, question, about):
        """Asks of both and expects the same; the answers."""
        answers = {share: about(share) for share in (WHOLE, OWN)}
        mine, twins = (same_share(answers[share], share) for share in (WHOLE, OWN))
        self.assertEqual(twins, mine, question)
        type(self).asked += 1
        type(self).told += len(json.dumps(mine))
        return answers

    def keyword(self):
        words = [self.twins.word(self.random.random() < 0.5)
                 for _ in range(self.random.randrange(1, 4))]
        if self.random.random() < 0.4:
            words[-1] = words[-1][:self.random.randrange(1, 5)] + "*"
        if self.random.random() < 0.2:
            words.insert(0, f'"{self.random.choice(WORDS)} {self.random.choice(WORDS)}"')
        return self.random.choice((" ", " ", " OR ", " -")).join(words)

    def question(self):
        field = self.random.choice(["MARUMDTextContent", "MARUMDFSName"])
        return {"keyword": self.keyword(), "size": self.random.choice((0, 5, 50)),
                "from": self.random.choice((0, 0, 10)), "fields": ["MARUMDKind", "MARUMDModTime"],
                "file_type": self.random.choice(["", "", *KINDS]),
                "highlight": [{"field": field, "frag_length": 60, "num_fragments": 2}]}

    def test_searches_and_their_highlights(self):
        for _ in range(QUESTIONS):
            question = self.question()

            def search(share, question=question):
                return self.ask("Search/1/search", {**road.search_request(**question), "indice": [share]})

            answers = self.compare(question, search)
            hits = {share: answers[share][1]["data"]["hits"][:3] for share in answers}
            for number in range(len(hits[OWN])):
                def highlight(share, number=number, question=question, hits=hits):
                    hit = hits[share][number]
                    return self.ask("Highlight/1/highlight", {
                        "full_path": hit["MARUMDPath"], "doc_id": hit["doc_id"],
                        "keyword": question["keyword"], "highlight": question["highlight"][0]})

                self.compare(("highlight", question), highlight)

    def test_counts(self):
        for _ in range(QUESTIONS):
            keyword = self.keyword()
            self.compare(("indicate", keyword), lambda share, keyword=keyword: self.ask(
                "Indicate/1/indicate",
                {"keyword": keyword, "file_type": KINDS, "search_weight_list": [],
                 "criteria_list": [{"field": "MARUMDPath", "value": f"/volume1/{share}"}]}))

    def test_suggestions(self):
        for _ in range(QUESTIONS):
            typed = self.twins.word(self.random.random() < 0.5)
            typed = typed[:self.random.randrange(1, 7)]
            chosen = self.random.choice([[], *([name] for name in SUGGESTERS)])
            self.compare((typed, chosen), lambda share, typed=typed, chosen=chosen: self.ask(
                "Term/1/suggest", {"terms": typed, "suggest_num": 6, "indice": [share],
                                   **({"suggester": chosen} if chosen else {})}))

    def test_at_the_socket(self):
        searches = [self.question() for _ in range(QUESTIONS)]

        def ask(share):
            requests = []
            for question in searches:
                request = road.daemon_search(question["keyword"], ["fileindex_" + share],
                                             question["from"], question["size"])
                request["data"]["highlight"] = question["highlight"]
                request["data"]["sort"] = {"field": "MARUMDFSSize", "direction": "DESC"}
                requests.append(request)
                requests.append({"command": "indicate", "data": {
                    "keyword": question["keyword"], "indice": ["fileindex_" + share],
                    "criteria_list": [], "search_weight_list": [],
                    "queries": [{"name": kind, "query": {"filters": [
                        {"name": "file_type", "data": kind}]}} for kind in KINDS]}})
                requests.append({"command": "term_suggest", "data": {
                    "terms": question["keyword"].rstrip("*"), "indice": [share]}})
            return road.exchange(*requests)

        self.compare("the socket", lambda share: road.as_user("alice", ask, share))

    def test_behind_a_closed_folder(self):
        def highlight(path):
            return self.ask("Highlight/1/highlight", {
                "full_path": f"/volume1/{WHOLE}{path}", "doc_id": 3, "keyword": "sail",
                "highlight": {"field": "MARUMDFSName", "frag_length": 60, "num_fragments": 2}})

        shut = [path for path in self.twins.closed if os.path.isdir(f"/mnt/{WHOLE}{path}")]
        inside = [path for path in self.twins.closed if any(path.startswith(f + "/") for f in shut)]
        self.assertTrue(inside)
        for path in inside[:30]:
            self.assertEqual(highlight(path), highlight(path + "none"), path)

    @classmethod
    def tearDownClass(cls):
        print(f"{cls.asked} questions, {cls.told} bytes of answers", flush=True)
        super().tearDownClass()


if __name__ == "__main__":
    unittest.main()
