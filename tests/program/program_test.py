#!/usr/bin/python3
"""The frame of the programs, seen from outside: what they say of themselves and how they fail."""

import os
import pathlib
import subprocess
import unittest

BIN = pathlib.Path(os.environ.get("MARU_BUILD", "build/release")).resolve() / "bin"
SERVICES = ("maruelasticd", "maruindexd", "maruwebd", "maruweb-host")
PROGRAMS = (*SERVICES, "maructl")
# What a program needs beside its options to come so far that it reads its configuration.
WORK = {"maruweb-host": ("0", "0"), "maructl": ("config",)}


def run(program, *arguments):
    return subprocess.run([BIN / program, *arguments], text=True, check=False, stdin=subprocess.DEVNULL,
                          stdout=subprocess.PIPE, stderr=subprocess.PIPE)


class ProgramTest(unittest.TestCase):
    def assert_usage(self, program, *arguments):
        done = run(program, *arguments)
        self.assertEqual((2, ""), (done.returncode, done.stdout), arguments)
        self.assertIn("--help", done.stderr)

    def test_help_and_version(self):
        for program in PROGRAMS:
            done = run(program, "--version")
            self.assertEqual((0, ""), (done.returncode, done.stderr))
            self.assertRegex(done.stdout, rf"^{program} \d+\.\d+\.\d+\n$")
            done = run(program, "--help")
            self.assertEqual((0, ""), (done.returncode, done.stderr))
            self.assertIn("--config FILE", done.stdout)
            self.assertEqual(program in SERVICES, "--foreground" in done.stdout, program)

    def test_a_wrong_command_line(self):
        for program in PROGRAMS:
            self.assert_usage(program, "--frobnicate", *WORK.get(program, ()))
            self.assert_usage(program, *WORK.get(program, ()), "--config")
        self.assert_usage("maruindexd", "--crawl-hours", "721")
        self.assert_usage("maruindexd", "--share", "docs")
        self.assert_usage("maruweb-host", "3")
        self.assert_usage("maructl")
        self.assert_usage("maructl", "search")
        self.assert_usage("maructl", "search", "--limit", "0", "word")
        self.assert_usage("maructl", "preference")
        self.assert_usage("maructl", "preference", "set", "alice", "enable_history")

    def test_what_ends_a_program_is_said_once(self):
        for program in PROGRAMS:
            for more in ((), ("--foreground",)) if program in SERVICES else ((),):
                done = run(program, "--config", "/nowhere.conf", *more, *WORK.get(program, ()))
                self.assertEqual(3 if program == "maructl" else 1, done.returncode, program)
                self.assertEqual("", done.stdout)
                [line] = done.stderr.splitlines()
                self.assertTrue(line.startswith(program + ": "), line)
                self.assertIn("/nowhere.conf", line)

    def test_the_host_is_started_by_its_server_only(self):
        done = run("maruweb-host", "0", "0")
        self.assertEqual((1, "maruweb-host: only maruwebd can start it\n"), (done.returncode, done.stderr))


if __name__ == "__main__":
    unittest.main()
