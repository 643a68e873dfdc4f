"""Random trees with random owners, modes and ACLs."""

import os
import random
import struct

UIDS = (0, 5, 60001, 60002, 60003, 60099, 65534)
GIDS = (0, 60, 60001, 60002, 60100, 60101, 60102, 60099, 65534)
# What an ACL's entries are called in the attribute.
USER_OBJ, USER, GROUP_OBJ, GROUP, MASK, OTHER = 0x01, 0x02, 0x04, 0x08, 0x10, 0x20
ACL_ATTRIBUTE = "system.posix_acl_access"


class Trees:
    """Makes trees, and gives rights. The names of all files and folders hold the word "needle"."""

    def __init__(self, source):
        self.random = source if isinstance(source, random.Random) else random.Random(source)

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
            os.setxattr(path, ACL_ATTRIBUTE, self.acl(is_folder))
        else:
            mode = 0
            for _ in range(3):
                mode = mode << 3 | self.bits(is_folder)
            os.chmod(path, mode)

    def grow(self, folder, depth, endings=(".txt",)):
        for number in range(self.random.randrange(1, 4)):
            path = os.path.join(folder, f"needle-{number}{self.random.choice(endings)}")
            with open(path, "w", encoding="utf-8") as file:
                file.write("needle")
            self.set_rights(path, False)
        for number in range(self.random.randrange(3) if depth else 0):
            ending = self.random.choice(endings) if len(endings) > 1 else ""
            path = os.path.join(folder, f"needle folder {number}{ending}")
            os.mkdir(path)
            self.grow(path, depth - 1, endings)
            self.set_rights(path, True)
