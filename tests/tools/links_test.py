#!/usr/bin/python3
"""Which libraries the programs are made of, those of their libraries included."""

import os
import pathlib
import subprocess
import unittest

BUILD = pathlib.Path(os.environ["MARU_BUILD"])


def libraries(program):
    said = subprocess.run(["ldd", BUILD / program], text=True, check=True, stdout=subprocess.PIPE)
    return {line.split()[0].split(".so")[0] for line in said.stdout.splitlines()}


class LinksTest(unittest.TestCase):
    def test_soci_is_for_who_keeps_a_history_or_what_was_opened(self):
        for program in ("bin/maructl", "bin/maruindexd", "bin/maruwebd", "lib/libmarusystem.so"):
            self.assertNotIn("libsoci_core", libraries(program), program)
        for program in ("bin/maruelasticd", "bin/maruweb-host", "lib/maruseeker.so"):
            self.assertIn("libsoci_core", libraries(program), program)

    def test_the_facade_is_for_the_plug_in_and_who_loads_it(self):
        for program in ("bin/maructl", "bin/maruindexd", "bin/maruwebd", "bin/maruelasticd"):
            self.assertNotIn("libmaruplatform", libraries(program), program)


if __name__ == "__main__":
    unittest.main()
