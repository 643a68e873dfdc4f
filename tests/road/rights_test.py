#!/usr/bin/python3
"""Thousands of generated trees with random owners, modes and ACLs: what the daemon shows a user
against what a process of that user can really open.

The seed is printed; MARU_SEED repeats a run.
"""

import os
import random
import shutil
import unittest

import road
import trees

ROOT = road.SHARES / "trees"
BATCHES = 4
TREES = 800
USERS = ("alice", "bob", "carol")


class Grove(trees.Trees):
    """Many trees below ROOT."""

    def plant(self):
        shutil.rmtree(ROOT, ignore_errors=True)
        ROOT.mkdir()
        for number in range(TREES):
            tree = ROOT / f"needle tree {number}"
            tree.mkdir()
            self.grow(tree, 3)
            self.set_rights(tree, True)

    def change(self):
        """New rights for some of what is there, nothing else."""
        for parent, folders, files in os.walk(ROOT):
            for name in folders + files:
                if self.random.random() < 0.1:
                    path = os.path.join(parent, name)
                    os.removexattr(path, trees.ACL_ATTRIBUTE) \
                        if trees.ACL_ATTRIBUTE in os.listxattr(path) else None
                    self.set_rights(path, name in folders)


class RightsTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        seed = int(os.environ.get("MARU_SEED", random.SystemRandom().randrange(1 << 32)))
        print(f"MARU_SEED={seed}", flush=True)
        cls.trees = Grove(seed)
        with open("/etc/samba/smb.conf", "a", encoding="utf-8") as settings:
            settings.write(f"\n[trees]\n\tpath = {ROOT}\n")
        ROOT.mkdir()
        services.index()
        services.start_daemon()

    def compare(self, what):
        self.services.index()
        everything = road.everything_under(ROOT)
        for user in USERS:
            total, found = road.all_found(user, "needle", ["fileindex_trees"])
            expected = road.as_user(user, road.readable, everything)
            wrong = set(found) ^ set(expected)
            self.assertFalse(wrong, f"{what}, {user}: {len(wrong)} differ: {sorted(wrong)[:5]}")
            self.assertEqual(len(expected), len(found), f"{what}, {user}: hits twice")
            self.assertEqual(len(expected), total, f"{what}, {user}: total")
            self.assertTrue(0 < len(expected) < len(everything))

    def test_the_daemon_agrees_with_the_kernel(self):
        for batch in range(BATCHES):
            self.trees.plant()
            self.compare(f"batch {batch}")
            self.trees.change()
            self.compare(f"batch {batch} with changed rights")

    def test_the_share_folder_itself_closes_all(self):
        self.trees.plant()
        for mode in (0o700, 0o711):
            ROOT.chmod(mode)
            self.services.index()
            expected = road.as_user("alice", road.readable, road.everything_under(ROOT))
            total, found = road.all_found("alice", "needle", ["fileindex_trees"])
            self.assertEqual((len(expected), sorted(expected)), (total, sorted(found)))
        ROOT.chmod(0o755)


if __name__ == "__main__":
    unittest.main()
