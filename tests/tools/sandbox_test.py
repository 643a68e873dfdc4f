#!/usr/bin/python3
"""The sandbox: what it holds, what it keeps out, and that nothing of it stays."""

import os
import pathlib
import signal
import subprocess
import tempfile
import unittest

SANDBOX = pathlib.Path(__file__).resolve().parents[2] / "tools/sandbox"


def run(*arguments):
    return subprocess.run([SANDBOX, *arguments], text=True, check=False, stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT)


@unittest.skipUnless(os.geteuid() == 0, "needs root")
class SandboxTest(unittest.TestCase):
    def test_each_user_reads_what_the_table_in_the_readme_says(self):
        readme = (SANDBOX.parent / "README.md").read_text(encoding="utf-8")
        expected = {"alice": set(), "bob": set()}
        for line in readme.splitlines():
            cells = [cell.strip() for cell in line.split("|")]
            if len(cells) == 6 and cells[1].endswith(".txt"):
                for user, cell in zip(("alice", "bob"), cells[2:4]):
                    if cell == "yes":
                        expected[user].add(cells[1])
        files = "cd /mnt/docs/rights; for f in *.txt */*.txt closed/below.txt passage/below.txt"
        files += " bobs-room/below.txt family-room/below.txt; do"
        for user, readable in expected.items():
            result = run("setpriv", f"--reuid={user}", f"--regid={user}", "--init-groups", "sh",
                         "-c", files + ' [ -r "$f" ] && echo "$f"; done; true')
            self.assertEqual(readable, set(result.stdout.split()), user)

    def test_status_folders_and_the_machine_untouched(self):
        with tempfile.TemporaryDirectory() as folder:
            named = pathlib.Path(folder) / "docs"
            named.mkdir()
            (named / "a file").touch()
            script = (f'ls /mnt/docs-2; touch /mnt/docs-2/new /usr/new; touch /trace {folder}x'
                      ' /etc/new; testparm -s 2>/dev/null | grep "path = /mnt/docs-2"; exit 7')
            result = run("--folder", str(named), "--", "bash", "-c", script)
            self.assertEqual(7, result.returncode)
            self.assertIn("a file\n", result.stdout)
            self.assertIn("path = /mnt/docs-2", result.stdout)
            self.assertEqual(2, result.stdout.count("Read-only file system"), result.stdout)
            self.assertEqual(["a file"], os.listdir(named))
        for trace in ("/trace", folder + "x", "/etc/new"):
            self.assertFalse(os.path.exists(trace), trace)
        self.assertEqual(125, run("--folder", "/nowhere", "true").returncode)
        self.assertEqual(125, run("--folder", "/", "true").returncode)

    def test_ending_it_ends_all_in_it(self):
        for number in (signal.SIGTERM, signal.SIGKILL):
            read_end, write_end = os.pipe()
            # Each of these holds the pipe's write end for as long as it lives.
            sandbox = subprocess.Popen(
                [SANDBOX, "bash", "-c", "setsid sleep 1000 & sleep 1000 & echo up; wait"],
                stdout=write_end)
            os.close(write_end)
            self.assertEqual(b"up\n", os.read(read_end, 10))
            sandbox.send_signal(number)
            self.assertEqual(b"", os.read(read_end, 10))
            os.close(read_end)
            sandbox.wait()


if __name__ == "__main__":
    unittest.main()
