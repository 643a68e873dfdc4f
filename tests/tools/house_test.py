#!/usr/bin/python3
"""tools/check-house finds the breaches of a made-up house, and nothing else in it."""

import pathlib
import shutil
import subprocess
import tempfile
import unittest

CHECK = pathlib.Path(__file__).resolve().parents[2] / "tools/check-house"
ORDERLY = {
    "tools/README.md": "The tools.\n",
    "tools/packages": "# The list.\ng++\n",
    "docs/dependencies.md": "| g++ | the compiler |\n",
    ".clang-format": "DisableFormat: true\nSortIncludes: Never\n",
    "src/include/common/error.h": "#pragma once\n",
    "common/README.md": "May include: nothing.\n",
    "index/README.md": "The index.\n\nMay include: `index/store/`,\n`common/error.h`.\n\nIt uses `daemon/` not.\n",
    "index/reader.h": "#pragma once\n#include <sys/stat.h>\n\n#include \"index/store/store.h\"\n",
    "index/reader.cpp": "#include \"index/reader.h\"\n\n#include \"common/error.h\"\n",
    "index/store/README.md": "May include: the `xapian` engine.\n",
    "index/store/store.h": "#pragma once\n#include <xapian.h>\n",
    "daemon/README.md": "May include: `index/`.\n",
    "daemon/main.cpp": "#include \"index/reader.h\"\n",
    "tests/README.md": "Tests include any room.\n",
    "tests/index/store_test.cpp": "#include <xapian.h>\n\n#include \"index/store/store.h\"\n",
}


class HouseTest(unittest.TestCase):
    def breaches(self, **changes):
        """What the check says of the orderly house with these files changed; None takes one away."""
        with tempfile.TemporaryDirectory() as folder:
            top = pathlib.Path(folder)
            for name, text in {**ORDERLY, **changes}.items():
                if text is not None:
                    (top / name).parent.mkdir(parents=True, exist_ok=True)
                    (top / name).write_text(text, encoding="utf-8")
            shutil.copy(CHECK, top / "tools")
            done = subprocess.run([top / "tools/check-house"], text=True, check=False,
                                  stdout=subprocess.PIPE)
        said = done.stdout.splitlines()
        self.assertEqual(0 if said == ["The house is in order."] else 1, done.returncode)
        return said

    def assert_breach(self, expected, **changes):
        [said] = self.breaches(**changes)
        self.assertIn(expected, said)

    def test_an_orderly_house(self):
        self.assertEqual(["The house is in order."], self.breaches())

    def test_arrows_between_rooms(self):
        self.assert_breach("index/reader.cpp:1: index/ may not include daemon/core.h or daemon/", **{
            "index/reader.cpp": "#include \"daemon/core.h\"\n"})

    def test_arrows_within_a_room(self):
        self.assert_breach("store.h:2: index/store/ may not include index/reader.h or index/", **{
            "index/store/store.h": "#pragma once\n#include \"index/reader.h\"\n"})
        self.assert_breach("daemon/main.cpp:1: daemon/ may not include index/store/store.h", **{
            "daemon/main.cpp": "#include \"index/store/store.h\"\n"})

    def test_no_ring_of_folders(self):
        self.assert_breach("a ring of folders: ", **{
            "index/README.md": "May include: `index/store/`, `daemon/`, `common/error.h`.\n"})

    def test_a_library_belongs_to_whose_readme_names_it(self):
        self.assert_breach("index/reader.cpp:1: index/ may not include xapian", **{
            "index/reader.cpp": "#include <xapian/document.h>\n"})

    def test_the_plug_ins_headers_keep_their_folders_rules(self):
        self.assert_breach("src/include/common/error.h:2: common/ may not include index/reader.h", **{
            "src/include/common/error.h": "#pragma once\n#include \"index/reader.h\"\n"})

    def test_a_folder_with_sources_says_what_it_may_include(self):
        for text in (None, "The store.\n", "Here: May include: `xapian`.\n"):
            self.assert_breach("index/store/ has no README.md with", **{"index/store/README.md": text})
        self.assert_breach("tools/ has no README.md", **{"tools/README.md": None})

    def test_a_readme_names_what_is_there(self):
        self.assert_breach("daemon/README.md: there is no index/shelf/", **{
            "daemon/README.md": "May include: `index/`, `index/shelf/`.\n"})

    def test_format_marks_lengths_and_packages(self):
        self.assert_breach("daemon/main.cpp: run clang-format", **{
            ".clang-format": "BasedOnStyle: Google\nIncludeBlocks: Preserve\n",
            "daemon/main.cpp": "int  x;\n"})
        self.assert_breach("daemon/main.cpp:1: a left-over mark", **{"daemon/main.cpp": "// TO" "DO\n"})
        self.assert_breach("daemon/main.cpp: 601 lines", **{"daemon/main.cpp": "\n" * 600 + ";\n"})
        self.assert_breach("does not say what jq is for", **{"tools/packages": "g++\njq\n"})


if __name__ == "__main__":
    unittest.main()
