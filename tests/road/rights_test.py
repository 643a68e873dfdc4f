#!/usr/bin/python3
"""Thousands of generated trees with random owners, modes and ACLs: what the daemon shows a user
against what a process of that user can really open.

The seed is printed; MARU_SEED repeats a run.
"""

import os
import random
import shutil
import struct
import unittest

import road

ROOT = road.SHARES / "trees"
BATCHES = 4
TREES = 800
USERS = ("alice", "bob", "carol")
UIDS = (0, 60001, 60002, 60003, 60099)
GIDS = (0, 60001, 60002, 60100, 60101, 60102, 60099)
# What an ACL's entries are called in the attribute.
USER_OBJ, USER, GROUP_OBJ, GROUP, MASK, OTHER = 0x01, 0x02, 0x04, 0x08, 0x10, 0x20


class Trees:
    """Makes and changes trees below ROOT."""

    def __init__(self, seed):
        self.random = random.Random(seed)

    def bits(self, is_folder):
        """Three permission bits, more often open than closed: a closed folder hides all the rest."""
        usual = 5 if is_folder else 4
        return self.random.choice((usual, usual, 7, self.random.randrange(8), 0))

    def acl(self, is_folder):
        """The raw attribute of an access ACL with named entries, as the kernel takes it."""
        entries = [(USER_OBJ, self.bits(is_folder), 0xFFFFFFFF)]
        for uid in sorted(self.random.sample(UIDS, self.random.randrange(3))):
            entries.append((USER, self.bits(is_folder), uid))
        entries.append((GROUP_OBJ, self.bits(is_folder), 0xFFFFFFFF))
        for gid in sorted(self.random.sample(GIDS, self.random.randrange(3))):
            entries.append((GROUP, self.bits(is_folder), gid))
        entries.append((MASK, self.bits(is_folder), 0xFFFFFFFF))
        entries.append((OTHER, self.bits(is_folder), 0xFFFFFFFF))
        return struct.pack("<I", 2) + b"".join(struct.pack("<HHI", *entry) for entry in entries)

    def set_rights(self, path, is_folder):
        if self.random.random() < 0.3:
            return
        os.chown(path, self.random.choice(UIDS), self.random.choice(GIDS))
        if self.random.random() < 0.4:
            os.setxattr(path, "system.posix_acl_access", self.acl(is_folder))
        else:
            mode = 0
            for _ in range(3):
                mode = mode << 3 | self.bits(is_folder)
            os.chmod(path, mode)

    def grow(self, folder, depth):
        for number in range(self.random.randrange(1, 4)):
            path = os.path.join(folder, f"needle-{number}.txt")
            with open(path, "w", encoding="utf-8") as file:
                file.write("needle")
            self.set_rights(path, False)
        for number in range(self.random.randrange(3) if depth else 0):
            path = os.path.join(folder, f"needle folder {number}")
            os.mkdir(path)
            self.grow(path, depth - 1)
            self.set_rights(path, True)

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
                    os.removexattr(path, "system.posix_acl_access") \
                        if "system.posix_acl_access" in os.listxattr(path) else None
                    self.set_rights(path, name in folders)


class RightsTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        seed = int(os.environ.get("MARU_SEED", random.SystemRandom().randrange(1 << 32)))
        print(f"MARU_SEED={seed}", flush=True)
        cls.trees = Trees(seed)
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
