#!/usr/bin/env python3
"""Requests and sessions on a real web server: what they get, and what they cannot do to others."""

import concurrent.futures
import json
import subprocess
import unittest

from web import CALL, LONG, PAGES, WebTest, processes, refusal, responses, wait_until

JSON = {"Content-Type": "application/json"}


class SessionTest(WebTest):
    def sign_in(self, user, password, **headers):
        return self.request("POST", "/session", {**JSON, **headers},
                            json.dumps({"user": user, "password": password}))

    def test_a_cookie_and_a_token_say_who_one_is(self):
        response, text = self.sign_in("bob", "bob")
        answer = json.loads(text)
        self.assertEqual((answer["data"]["user"], answer["data"]["uid"]), ("bob", 60002))
        cookie = response.getheader("Set-Cookie")
        self.assertEqual(cookie, f"maruseeker_session={answer['data']['token']}; Path=/; HttpOnly; "
                                 "SameSite=Strict")
        by_cookie = {"Cookie": cookie.split(";")[0]}
        for headers in (by_cookie, {"Authorization": "Bearer " + answer["data"]["token"]}):
            _, text = self.request("GET", "/session", headers)
            self.assertEqual(json.loads(text),
                             {"success": True, "data": {"user": "bob", "uid": 60002, "is_admin": False}})
        response, _ = self.request("DELETE", "/session", by_cookie)
        self.assertIn("Max-Age=0", response.getheader("Set-Cookie"))
        response, text = self.request("GET", "/session", by_cookie)
        self.assertEqual((response.status, refusal(text)), (401, 10401))

    def test_administrators_are_told_apart_at_every_request(self):
        self.assertEqual(self.call("echo", {"text": ""}, self.carol)[1]["is_admin"], True)
        subprocess.run(["gpasswd", "-d", "carol", "administrators"], check=True, capture_output=True)
        self.addCleanup(subprocess.run, ["gpasswd", "-a", "carol", "administrators"], check=True,
                        capture_output=True)
        self.assertEqual(self.call("echo", {"text": ""}, self.carol)[1]["is_admin"], False)

    def test_nobody_else_gets_in(self):
        for user, password in (("alice", "wrong"), ("nobody-here", "x"), ("MaruSeeker", "x")):
            response, text = self.sign_in(user, password)
            self.assertEqual((response.status, refusal(text)), (401, 10401), user)
            self.assertIsNone(response.getheader("Set-Cookie"))
        for token in ("", "x", self.alice[:-1], self.alice[::-1], "x" * 5000):
            self.assertEqual(self.call("echo", {"text": ""}, token or " ")[1]["code"], 10401)
        for body in ("", "[]", "{}", '{"user": "alice"}', '{"user": 1, "password": "x"}',
                     '{"user": "a\\u0000b", "password": "x"}', '{"user": "", "password": ""}',
                     json.dumps({"user": "alice", "password": "x" * 2000})):
            response, text = self.request("POST", "/session", JSON, body)
            self.assertEqual((response.status, refusal(text)), (400, 10400), body[:40])

    def test_guessing_is_slowed_down(self):
        with concurrent.futures.ThreadPoolExecutor(12) as pool:
            statuses = list(pool.map(lambda n: self.sign_in("bob", f"guess {n}")[0].status, range(12)))
        self.assertEqual(sorted(statuses), [401] * 5 + [429] * 7)
        self.assertEqual(self.sign_in("bob", "bob")[0].status, 429)
        self.assertEqual(self.sign_in("alice", "alice")[0].status, 200)

    def test_a_session_ends_with_its_account(self):
        subprocess.run(["useradd", "-M", "dora"], check=True)
        subprocess.run(["chpasswd"], input="dora:dora", text=True, check=True)
        changes = (["chpasswd", "dora:other"], ["usermod", "-L", "dora"],
                   ["usermod", "-e", "2000-01-01", "dora"], ["userdel", "dora"])
        for command in changes:
            subprocess.run(["usermod", "-e", "", "dora"], check=True, capture_output=True)
            subprocess.run(["chpasswd"], input="dora:dora", text=True, check=True)
            token = self.services.sign_in("dora")
            self.assertEqual(self.call("echo", {"text": "here"}, token)[1]["user"], "dora")
            if command[0] == "chpasswd":
                subprocess.run(command[:1], input=command[1], text=True, check=True)
            else:
                subprocess.run(command, check=True, capture_output=True)
            for _ in range(2):
                self.assertEqual(self.call("echo", {"text": "gone"}, token)[1]["code"], 10401, command)

    def test_pages_of_other_sites_can_do_nothing(self):
        cookie = {"Cookie": "maruseeker_session=" + self.alice, **JSON}
        host = f"127.0.0.1:{self.services.port}"
        for headers, status in (({}, 200), ({"Origin": "http://" + host}, 200),
                                ({"Sec-Fetch-Site": "same-origin"}, 200),
                                ({"Origin": "http://evil.example"}, 403),
                                ({"Origin": "null"}, 403), ({"Sec-Fetch-Site": "cross-site"}, 403),
                                ({"Content-Type": "text/plain"}, 415)):
            response, _ = self.request("POST", CALL + "echo", {**cookie, **headers}, '{"text": ""}')
            self.assertEqual(response.status, status, headers)
        response, _ = self.sign_in("alice", "alice", Origin="http://evil.example")
        self.assertEqual(response.status, 403)


class CallTest(WebTest):
    def test_answers_and_errors(self):
        status, data = self.call("echo", {"text": "hello"})
        self.assertEqual((status, data["text"], data["user"], data["uid"]), (200, "hello", "alice", 60001))
        self.assertEqual(self.call("echo", {"text": 1}),
                         (400, {"code": 120, "data": {"name": "text", "reason": "type"}}))
        for code, status in ((507, 403), (605, 503), (121, 502), (1600, 409), (800, 500)):
            self.assertEqual(self.call("error", {"code": code}), (status, {"code": code}))
        for path in ("Test.Server/1/nope", "Test.Server/2/echo", "Nope/1/echo", "Test.Server/1"):
            status, answer = self.services.http("POST", "/webapi/" + path, {}, self.alice)
            self.assertEqual((status, answer["error"]), (404, {"code": 10404}), path)

    def test_parameters_are_one_json_object(self):
        headers = {"Authorization": "Bearer " + self.alice, **JSON}
        for body, status in (("", 200), ("{}", 200), (" {\n} ", 200), ("[]", 400), ("1", 400),
                             ("{} {}", 400), ('{"a": 1, "a": 2}', 400), ("{'a': 1}", 400),
                             ("[" * 100000, 400), ('{"a": 1e999}', 400)):
            response, _ = self.request("POST", CALL + "silent", headers, body)
            self.assertEqual(response.status, 500 if status == 200 else status, body[:20])

    def test_names_that_are_no_text(self):
        text = b"caf\xe9 \xf0\x9f\x92\x80 \xc3\xa4".decode("utf-8", "surrogateescape")
        status, data = self.call("echo", {"text": text})
        self.assertEqual((status, data["text"]), (200, text))
        self.assertEqual(bytes(data["bytes"]), b"caf\xe9 \xf0\x9f\x92\x80 \xc3\xa4")

    def test_every_end_of_a_child_is_told(self):
        for method, params, status, code in (("crash", {}, 500, 117), ("throw", {}, 500, 117),
                                             ("silent", {}, 500, 117), ("exit", {"status": 0}, 500, 117),
                                             ("kill", {}, 409, 1600)):
            self.assertEqual(self.call(method, params), (status, {"code": code}), method)
        self.assertEqual(self.call("echo", {"text": "well"})[0], 200)

    def test_a_greedy_plugin_ends_alone(self):
        self.assertEqual(self.call("hungry"), (500, {"code": 117}))

    def test_a_newer_query_ends_an_older_one_of_its_user_only(self):
        older = self.begin_call("slow", {"ms": LONG})
        wait_until(lambda: self.metric("maruweb_children_busy") == 1, "the query to run")
        pid = self.call("inspect")[1]["pid"]
        stranger = self.services.sign_in("bob")
        ended = {}
        for candidate in range(2, pid):
            self.assertIn(self.call("kill", {"pid": candidate}, stranger)[1], (1, 3), "EPERM or ESRCH")
        for candidate in range(2, pid):
            ended[candidate] = self.call("kill", {"pid": candidate})[1]
        self.assertEqual(list(ended.values()).count(0), 1, "no process but the query can be reached")
        status, answer = self.services.finish(older)
        self.assertEqual((status, answer["error"]), (409, {"code": 1600}))

    def inspected(self, token=None, **params):
        """What a request sees once no other is under way."""
        self.wait_until_idle()
        return self.call("inspect", params, token)[1]

    def test_a_child_is_confined(self):
        for seen in (self.inspected(), self.inspected()):
            self.assertLess(seen["pid"], 10000)
            # Standard input, output, error, the host, the request, and the folder that the method looks at.
            self.assertLessEqual(set(seen["descriptors"]), set("012345"))
            self.assertNotIn("tmp", seen, "a /tmp of its own")
            self.assertEqual(seen["umask"], 0o077)
            self.assertEqual((seen["euid_before"], seen["becomes_user"], seen["euid"],
                              seen["reads_shadow"]), (0, True, 60001, False))
            self.assertEqual(sorted(seen["shares"]), ["docs", "homes", "photo", "private"])

    def test_a_child_stays_for_its_user(self):
        first = self.inspected()["pid"]
        self.assertEqual(self.inspected()["pid"], first)
        self.assertNotEqual(self.inspected(self.carol)["pid"], first, "never for another")
        self.assertEqual(self.call("throw"), (500, {"code": 117}), "by the same child")
        second = self.inspected(last="yes")["pid"]
        self.assertNotEqual(second, first, "what threw is not trusted again")
        self.assertNotEqual(self.inspected()["pid"], second, "nor does one serve again that must not")

    def test_a_child_rests_while_others_may_end_it(self):
        first = self.inspected()["pid"]
        slow = self.begin_call("slow", {"ms": LONG})
        wait_until(lambda: self.metric("maruweb_children_busy") == 1, "the query to run")
        second = self.call("inspect")[1]["pid"]
        third = self.call("inspect")[1]["pid"]
        self.assertEqual(len({first, second, third}), 3)
        others = set()
        for _ in range(3):
            others.add(self.call("inspect", {}, self.carol)[1]["pid"])
            wait_until(lambda: self.metric("maruweb_children_busy") == 1, "the query alone to run")
        self.assertEqual(len(others), 1, "another user's requests end nobody of hers")
        slow.close()
        self.wait_until_idle()
        self.assertIn(self.call("inspect")[1]["pid"], (second, third))
        slow = self.begin_call("slow", {"ms": LONG}, self.carol)
        wait_until(lambda: self.metric("maruweb_children_busy") == 1, "the administrator's query to run")
        fourth = self.call("inspect")[1]["pid"]
        self.assertNotEqual(self.call("inspect")[1]["pid"], fourth, "an administrator may end anybody's")
        slow.close()

    def test_no_request_is_lost_when_a_child_has_served_its_time(self):
        connection = self.raw()
        for _ in range(1100):
            connection.sendall(b"POST %secho HTTP/1.1\r\nHost: x\r\nAuthorization: Bearer %s\r\nContent-Type: "
                               b"application/json\r\nContent-Length: 11\r\n\r\n{\"text\":\"\"}"
                               % (CALL.encode(), self.alice.encode()))
            self.assertEqual(responses(connection, 1)[0][0], 200)

    def test_slow_requests_hold_nobody_up(self):
        slow = [self.begin_call("slow", {"ms": LONG}) for _ in range(20)]
        self.assertEqual(self.call("echo", {"text": "quick"})[0], 200)
        wait_until(lambda: self.metric("maruweb_children_busy") == 20, "the quick one only to end")
        for connection in slow:
            connection.close()
        self.wait_until_idle()

    def test_one_session_cannot_take_all(self):
        slow = [self.begin_call("slow", {"ms": LONG}) for _ in range(64)]
        wait_until(lambda: self.metric("maruweb_children_busy") == 64, "all to run")
        self.assertEqual(self.call("echo", {"text": ""}), (429, {"code": 10429}))
        self.assertEqual(self.call("echo", {"text": ""}, self.carol)[0], 200)
        for connection in slow:
            connection.close()
        self.wait_until_idle()
        self.assertEqual(self.call("echo", {"text": ""})[0], 200)

    def test_what_a_request_leaves_behind_delays_nothing(self):
        for keep in ("", "all"):
            self.assertEqual(self.call("fork", {"ms": LONG, "all": keep}), (200, "forked"))
        self.wait_until_idle()

    def test_an_answer_is_not_held_up_and_what_follows_is_done(self):
        self.assertEqual(self.call("follow"), (200, False))
        self.assertEqual(self.call("follow", {"ms": 2000}), (200, True))
        self.assertEqual(self.call("follow"), (200, False), "the answer came before the file")
        wait_until(lambda: self.call("follow") == (200, True), "what follows to be done")

    def test_a_client_that_leaves_ends_its_request(self):
        for sent_ahead in (b"", b"GET /healthz HTTP/1.1\r\nHost: x\r\n\r\n"):
            body = json.dumps({"ms": LONG}).encode()
            connection = self.raw(b"POST %sslow HTTP/1.1\r\nHost: x\r\nAuthorization: Bearer %s\r\n"
                                  b"Content-Type: application/json\r\nContent-Length: %d\r\n\r\n%s"
                                  % (CALL.encode(), self.alice.encode(), len(body), body) + sent_ahead)
            wait_until(lambda: self.metric("maruweb_children_busy") == 1, "the request to run")
            connection.close()
            self.wait_until_idle()

    def test_no_zombie_stays(self):
        for method in ("crash", "kill", "echo"):
            self.call(method)
        self.wait_until_idle()
        wait_until(lambda: not [name for name, state, _ in processes().values()
                                if state == "Z" and name.startswith("maruweb")], "zombies to go")

    def test_long_answers_and_bodies(self):
        for size in (65000, 65536, 20_000_000):
            status, data = self.call("huge", {"size": size})
            self.assertEqual((status, len(data)), (200, size))
        self.assertEqual(self.call("huge", {"size": 70_000_000}), (500, {"code": 117}))
        text = "x" * 1_000_000
        self.assertEqual(self.call("echo", {"text": text})[1]["text"], text)

    def test_a_client_that_does_not_read_is_left(self):
        connection = self.begin_call("huge", {"size": 30_000_000})
        self.assertEqual(self.call("echo", {"text": "next"})[0], 200)
        connection.close()
        self.wait_until_idle()


class HttpTest(WebTest):
    def call_text(self, params, more=b""):
        body = json.dumps(params).encode()
        return (b"POST %secho HTTP/1.1\r\nHost: x\r\nAuthorization: Bearer %s\r\n%sContent-Type: "
                b"application/json\r\nContent-Length: %d\r\n\r\n%s"
                % (CALL.encode(), self.alice.encode(), more, len(body), body))

    def test_requests_one_after_another_and_sent_ahead(self):
        connection = self.raw(b"".join(self.call_text({"text": str(n)}) for n in range(5)))
        answers = responses(connection, 5)
        self.assertEqual([json.loads(text)["data"]["text"] for _, text in answers], list("01234"))
        connection.sendall(b"HEAD /healthz HTTP/1.1\r\nHost: x\r\nConnection: close\r\n\r\n")
        head = connection.makefile("rb").read()
        self.assertTrue(head.startswith(b"HTTP/1.1 200 OK") and head.endswith(b"\r\n\r\n"), head)

    def test_bodies_in_chunks_and_on_demand(self):
        body = b'6\r\n{"text\r\n7\r\n": "a"}\r\n0\r\n\r\n'
        head = self.call_text({}, b"Transfer-Encoding: chunked\r\n")
        head = head[:head.index(b"Content-Length")] + b"\r\n"
        self.assertEqual(json.loads(responses(self.raw(head + body), 1)[0][1])["data"]["text"], "a")
        for more in (b"", b"Connection: close\r\n"):
            text = self.call_text({"text": "b"}, more + b"Expect: 100-continue\r\n")
            head, body = text.split(b"\r\n\r\n", 1)
            connection = self.raw(head + b"\r\n\r\n")
            self.assertEqual(connection.recv(100), b"HTTP/1.1 100 Continue\r\n\r\n", more)
            connection.sendall(body)
            self.assertEqual(json.loads(responses(connection, 1)[0][1])["data"]["text"], "b")

    def test_what_is_no_request_is_refused_and_cut_off(self):
        huge = b"POST %secho HTTP/1.1\r\nHost: x\r\nContent-Length: 2000000\r\n\r\n" % CALL.encode()
        both = self.call_text({}, b"Transfer-Encoding: chunked\r\n")
        for data, status in ((b"garbage\r\n\r\n", 400), (b"\x16\x03\x01\x02\x00\x01\x00\r\n\r\n", 400),
                             (b"GET / HTTP/9.9\r\n\r\n", 400), (b"GET /\x00 HTTP/1.1\r\n\r\n", 400),
                             (huge + b"x" * 2000000, 413), (both, 400),
                             (b"GET / HTTP/1.1\r\nContent-Length: -1\r\n\r\n", 400),
                             (b"GET / HTTP/1.1\r\nX: " + b"x" * 20000 + b"\r\n\r\n", 431)):
            connection = self.raw(data)
            received, text = responses(connection, 1)[0]
            self.assertEqual((received, refusal(text)), (status, 10000 + status), data[:60])
            self.assertEqual(connection.recv(1), b"")

    def test_a_body_that_nobody_wants_is_not_asked_for(self):
        connection = self.raw(b"POST /session HTTP/1.1\r\nHost: x\r\nContent-Type: text/plain\r\n"
                              b"Expect: 100-continue\r\nContent-Length: 1000\r\n\r\n")
        self.assertEqual(responses(connection, 1)[0][0], 415)

    def test_stalled_connections_hold_nobody_up(self):
        starts = (b"", b"POST ", self.call_text({"text": "x" * 100})[:-50])
        for n in range(1100):
            self.raw(starts[n % 3])
        self.assertEqual(self.call("echo", {"text": "through"})[0], 200)
        self.assertLessEqual(self.metric("maruweb_connections"), 1001)

    def test_pages(self):
        response, text = self.request("GET", "/")
        self.assertEqual(response.status, 200)
        self.assertEqual(text, (PAGES / "index.html").read_bytes())
        self.assertEqual(response.getheader("Content-Type"), "text/html; charset=utf-8")
        self.assertIn("frame-ancestors 'none'", response.getheader("Content-Security-Policy"))
        self.assertEqual(response.getheader("X-Content-Type-Options"), "nosniff")
        self.assertEqual(response.getheader("Referrer-Policy"), "no-referrer")
        again, text = self.request("GET", "/", {"If-None-Match": response.getheader("ETag")})
        self.assertEqual((again.status, text), (304, b""))
        for path in ("/../../etc/passwd", "/%2e%2e/etc/passwd", "//etc/passwd", "/img/../index.html"):
            self.assertEqual(self.request("GET", path)[0].status, 404, path)
        response, text = self.request("PUT", "/")
        self.assertEqual((response.status, response.getheader("Allow")), (405, "GET, HEAD"))

    def test_the_api_is_described(self):
        _, text = self.request("GET", "/openapi.json")
        self.assertIn("/webapi/MARU.Seeker.Elastic.Search/1/search", json.loads(text)["paths"])


if __name__ == "__main__":
    unittest.main()
