#!/usr/bin/env python3
"""The web server's own life: starting, ending, shares that come and go, TLS."""

import contextlib
import http.client
import os
import pathlib
import signal
import ssl
import subprocess
import unittest

from web import BUILD, LONG, PAGES, PATIENCE, WebTest, mounts, processes, wait_until, web_processes

SMB_CONF = pathlib.Path("/etc/samba/smb.conf")


class LifeTest(WebTest):
    def setUp(self):
        if "maruwebd" not in self.services.running:
            self.prepare(self.services)

    def part(self, name):
        """The process id of the front or the host."""
        return next(pid for pid, entry in processes().items() if entry[0] == "maruweb-" + name)

    def test_nothing_stays_behind(self):
        self.services.stop("maruwebd")
        before = mounts()
        self.prepare(self.services)
        self.assertEqual(mounts(), before, "its mounts are its own")
        running = self.begin_call("slow", {"ms": LONG})
        self.call("fork", {"ms": LONG})
        process = self.services.running.pop("maruwebd")
        process.terminate()
        self.assertEqual(process.wait(PATIENCE), 0)
        self.assertEqual(web_processes(), [])
        self.assertEqual(mounts(), before)
        running.close()

    def test_a_request_under_way_may_end(self):
        running = self.begin_call("slow", {"ms": 1000})
        wait_until(lambda: self.metric("maruweb_children_busy") == 1, "the request to run")
        self.services.stop("maruwebd")
        self.assertEqual(self.services.finish(running)[0], 200)

    def test_all_end_when_one_ends(self):
        for name in ("front", "host"):
            self.setUp()
            process = self.services.running.pop("maruwebd")
            os.kill(self.part(name), signal.SIGKILL)
            self.assertEqual(process.wait(PATIENCE), 1)
            self.assertEqual(web_processes(), [])
            self.assertIn(f"The {name} was ended by signal 9", self.services.log("maruwebd").read_text())
        self.setUp()
        process = self.services.running.pop("maruwebd")
        process.kill()
        process.wait(PATIENCE)
        wait_until(lambda: not web_processes(), "the others to end with the first")

    def test_privileges(self):
        def status(name):
            lines = pathlib.Path("/proc", str(self.part(name)), "status").read_text().splitlines()
            return dict(line.split(":\t", 1) for line in lines)

        front, host = status("front"), status("host")
        kept = sum(1 << bit for bit in (0, 2, 5, 6, 7))  # chown dac_read_search kill setgid setuid
        self.assertEqual([int(host[key], 16) for key in ("CapPrm", "CapEff", "CapBnd")], [kept] * 3)
        self.assertEqual([int(front[key], 16) for key in ("CapPrm", "CapEff", "CapBnd")], [0] * 3)
        self.assertEqual((front["Uid"], front["Groups"].strip()), ("\t".join(["59999"] * 4), ""))
        self.assertEqual((front["NoNewPrivs"], host["NoNewPrivs"]), ("1", "1"))
        if "libasan" not in pathlib.Path("/proc", str(self.part("host")), "maps").read_text():
            self.assertLess(int(host["VmRSS"].split()[0]), 10_000, "what is forked so often is small")

    def test_shares_come_and_go(self):
        new = pathlib.Path("/mnt/new")
        new.mkdir(exist_ok=True)
        before = SMB_CONF.read_text()
        self.addCleanup(SMB_CONF.write_text, before)

        def shares():
            return self.call("inspect")[1]["shares"]

        self.assertNotIn("new", shares())
        SMB_CONF.write_text(before + "\n[new]\n\tpath = /mnt/new\n")
        wait_until(lambda: "new" in shares(), "the share to be there")
        SMB_CONF.write_text(before)
        self.services.running["maruwebd"].send_signal(signal.SIGHUP)
        wait_until(lambda: "new" not in shares(), "the share to be gone")

    def test_the_page_is_read_again_on_demand(self):
        page = PAGES / "later.txt"
        self.addCleanup(page.unlink)
        page.write_text("later")
        self.assertEqual(self.request("GET", "/later.txt")[0].status, 404)
        self.services.running["maruwebd"].send_signal(signal.SIGHUP)
        wait_until(lambda: self.request("GET", "/later.txt")[0].status == 200, "the page")

    def test_it_says_why_it_does_not_start(self):
        def start(*arguments):
            result = subprocess.run([BUILD / "bin/maruwebd", *arguments], capture_output=True,
                                    text=True, timeout=PATIENCE, check=False)
            return result.returncode, result.stdout + result.stderr

        self.services.stop("maruwebd")
        self.assertEqual(start("--version")[0], 0)
        self.assertIn("--config", start("--help")[1])
        self.assertNotEqual(start("--config", "/nonexistent")[0], 0)
        settings = pathlib.Path("/etc/maruseeker/maruseeker.conf").read_text()
        for line, reason in (("plugin = /nonexistent.so", "plug-in cannot be loaded"),
                             ("listen_address = 0.0.0.0", "beyond loopback"),
                             ("web_account = nobody-here", "no account nobody-here")):
            name = line.split()[0]
            kept = [old for old in settings.splitlines() if old.split("=")[0].strip() != name]
            path = pathlib.Path("/tmp/bad.conf")
            path.write_text("\n".join([*kept, line, ""]))
            status, text = start("--config", path, "--foreground")
            self.assertEqual(status, 1, text)
            self.assertIn(reason, text)
            self.assertEqual(web_processes(), [])

    def test_tls(self):
        subprocess.run("openssl req -x509 -newkey rsa:2048 -nodes -days 2 -subj /CN=localhost "
                       "-addext subjectAltName=IP:127.0.0.1 -keyout /tmp/key -out /tmp/certificate",
                       shell=True, check=True, capture_output=True)
        os.chmod("/tmp/key", 0o600)
        settings = pathlib.Path("/etc/maruseeker/maruseeker.conf")
        self.addCleanup(settings.write_text, settings.read_text())
        self.addCleanup(self.services.stop, "maruwebd")
        self.services.stop("maruwebd")
        self.services.configure(tls_certificate="/tmp/certificate", tls_key="/tmp/key")
        context = ssl.create_default_context(cafile="/tmp/certificate")

        def ask(verb, path, body=None):
            with contextlib.closing(http.client.HTTPSConnection(
                    "127.0.0.1", self.services.port, timeout=PATIENCE, context=context)) as secure:
                secure.request(verb, path, body, {"Content-Type": "application/json"})
                return secure.getresponse()

        def answers():
            try:
                return ask("GET", "/healthz").status == 200
            except OSError:
                return False

        self.services.start("maruwebd", answers)
        response = ask("POST", "/session", '{"user": "alice", "password": "alice"}')
        self.assertIn("; Secure", response.getheader("Set-Cookie"))
        plain = self.raw(b"GET / HTTP/1.1\r\nHost: x\r\n\r\n")
        self.assertNotIn(b"HTTP", plain.recv(1000))


if __name__ == "__main__":
    unittest.main()
