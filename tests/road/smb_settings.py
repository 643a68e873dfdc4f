"""Random shares in Samba's settings, out of the parameters that bear on rights, and what lies in
them."""

import dataclasses
import os
import pathlib
import shutil

import trees

USERS = ("alice", "bob", "carol")
ENDINGS = (".txt", ".txt", ".bak", ".BAK", ".secret", " Übung", " ÜBUNG", ".d")
PATTERNS = ("/*.bak/", "/*.secret/*.BAK", "*.d", "/needle-1*/", "/*folder 0*/*.bak/", "/* übung/",
            "/needle-?.txt/", "/nothing/", "/*/")
NAMES = ("alice", "ALICE", "bob", "Bob", "carol", "@family", "+work", "@work", "+Work", "&family", "*",
         "60001", "BOX\\alice", "box\\bob", "WORKGROUP\\alice", "\"Unix User\\bob\"",
         "@\"Unix Group\\family\"", "\"Unix Group\\work\"", "S-1-22-1-60001", "S-1-22-2-60102",
         "nobody", "@no such", "%S", "%U")
HOSTS = ("ALL", "EXCEPT", "127.", "127.0.0.1", "127.0.0.0/24", "127.0.0.0/255.0.0.0", "127.0.0.2/31",
         "10.", "10.0.0.0/8", "192.168.1.7", "localhost", "::1", "::ffff:127.0.0.1", "fe80::/64")
# What withholds a share: only such a share may be missing.
WITHHOLDING = {
    "vfs objects = acl_xattr": "acl_xattr",
    "preexec = /bin/false\n\tpreexec close = yes": "preexec",
    "root preexec = /bin/false\n\troot preexec close = yes": "preexec",
    "hosts deny = LOCAL 127.0.0.*": "hosts",
    "hosts allow = 10. .example.org": "hosts",
    "include = /etc/samba/%U.conf": "client",
    "veto files = /*%U*/": "user",
    "path = needle": "absolute",
    "path = /mnt/%m": "client",
}


@dataclasses.dataclass
class Share:
    name: str
    # Where it lies, or, of personal folders, what holds them.
    folder: str
    lines: list
    # Of personal folders: how Samba calls the share of one.
    personal: str = ""
    inside: str = ""
    withheld: str = ""
    has_acl: bool = False

    def text(self):
        return f"[{self.name}]\n" + "".join(f"\t{line}\n" for line in self.lines)


class World:
    """One smb.conf and its trees below `root`."""

    def __init__(self, random, root):
        self.random = random
        self.root = pathlib.Path(root)
        self.trees = trees.Trees(random)
        self.shares = []
        self.global_text = ""

    def chance(self, probability):
        return self.random.random() < probability

    def names(self):
        return ", ".join(self.random.sample(NAMES, self.random.randrange(1, 4)))

    def hosts(self):
        return self.random.choice((" ", ", ")).join(
            self.random.sample(HOSTS, self.random.randrange(1, 5)))

    def rules(self):
        """Lines that any section may have."""
        pick = self.random.choice
        rules = []
        for line, probability in (
                (f"valid users = {self.names()}, {pick(USERS)}", 0.25),
                (f"invalid users = {self.names()}", 0.15),
                (f"admin users = {self.names()}", 0.12),
                (f"read list = {self.names()}", 0.1),
                ("read only = no", 0.3),
                (f"veto files = {pick(PATTERNS)}", 0.35),
                (f"case sensitive = {pick(('yes', 'no', 'auto'))}", 0.2),
                (f"force user = {pick((*USERS, 'root', 'nobody', 'games', 'no such'))}", 0.18),
                (f"force group = {pick(('work', '+work', '+family', '@work', 'no such', 'family'))}",
                 0.2),
                ("guest only = yes", 0.1),
                ("guest ok = yes", 0.1),
                ("hide unreadable = yes", 0.1),
                ("hide files = /*.txt/", 0.1),
                ("available = no", 0.04),
                ("browseable = no", 0.1),
                (f"hosts allow = {self.hosts()}", 0.15),
                (f"hosts deny = {self.hosts()}", 0.15)):
            if self.chance(probability):
                rules.append(line)
        return rules

    def global_rules(self):
        rules = ["server role = standalone server", "netbios name = BOX", "map to guest = Never",
                 "load printers = no", "disable spoolss = yes", "log level = 1",
                 f"guest account = {self.random.choice(('nobody', 'nobody', 'games', 'bob'))}"]
        for line in (f"veto files = {self.random.choice(PATTERNS[:-1])}", "case sensitive = yes",
                     f"force user = {self.random.choice(USERS)}", "guest only = yes",
                     f"hosts allow = {self.hosts()}", f"hosts deny = {self.hosts()}",
                     f"invalid users = {self.names()}", f"admin users = {self.names()}"):
            if self.chance(0.06):
                rules.append(line)
        return rules

    def place(self, name):
        """A folder for a share, below others that may be closed; and how its path is written."""
        above = self.root / f"above {name}"
        folder = above / "needle"
        folder.mkdir(parents=True)
        if self.chance(0.25):
            os.chown(above, *self.random.choice(((60001, 60001), (60002, 60102), (0, 60101))))
            above.chmod(self.random.choice((0o700, 0o710, 0o750, 0o701, 0o744)))
        written = str(folder)
        if self.chance(0.15):
            written = str(self.root / f"link {name}")
            os.symlink(folder, written)
        elif self.chance(0.2):
            written = self.random.choice((f"{above}/./needle/", f"{above}//needle"))
        return folder, written

    def plain(self, name):
        if self.shares and self.chance(0.25):
            # In another share, or the same folder once more.
            outer = self.random.choice(self.shares)
            inside = [str(path) for path in sorted(pathlib.Path(outer.folder).iterdir())
                      if path.is_dir() and not path.is_symlink()]
            folder = self.random.choice([outer.folder, *inside])
            written = folder
        else:
            folder, written = self.place(name)
            self.trees.grow(str(folder), 2, ENDINGS)
            self.trees.set_rights(str(folder), True)
        share = Share(name, str(folder), [f"path = {written}", *self.rules()])
        if self.chance(0.12):
            line, share.withheld = self.random.choice(sorted(WITHHOLDING.items()))
            share.lines.append(line)
        elif self.chance(0.06):
            share.withheld, share.has_acl = "sharesec", True
        return share

    def personal(self, name, is_homes):
        folder, _ = self.place(name)
        inside = self.random.choice(("", "", "/needle files"))
        for user in (*USERS, "stranger"):
            home = folder / user
            (pathlib.Path(f"{home}{inside}")).mkdir(parents=True)
            if user in USERS:
                os.chown(home, *[60001 + USERS.index(user)] * 2)
            home.chmod(self.random.choice((0o700, 0o755, 0o755, 0o750, 0o711)))
            self.trees.grow(str(home), 0, ENDINGS)
            self.trees.grow(f"{home}{inside}", 1, ENDINGS)
        variable = self.random.choice(("%S", "%U") if is_homes else ("%U", "%u"))
        lines = [f"path = {folder}/{variable}{inside}", *self.rules()]
        if is_homes and self.chance(0.6):
            lines = [line for line in lines if not line.startswith("valid users")]
            lines.append("valid users = %S")
        share = Share(name, str(folder), lines, "own" if variable != "%S" else "any", inside)
        share.withheld = "own|admits others|another's"
        return share

    def make(self):
        shutil.rmtree(self.root.parent, ignore_errors=True)
        self.root.mkdir(parents=True)
        for number in range(self.random.randrange(3, 7)):
            self.shares.append(self.plain(f"needle{number}"))
        if self.chance(0.5):
            self.shares.append(self.personal("needle own", False))
        if self.chance(0.5):
            self.shares.append(self.personal("homes", True))
        self.shares.sort(key=lambda share: share.name)
        self.global_text = "".join(f"\t{line}\n" for line in self.global_rules())

    def text(self):
        return f"[global]\n{self.global_text}" + "".join(share.text() for share in self.shares)
