#!/usr/bin/python3
"""The exam with the real thing: what a user can list and open through Samba is what a search finds.

Random settings and random trees, several users. The seed is printed; MARU_SEED repeats a run,
MARU_CONFIGURATIONS says how many there are.
"""

import collections
import os
import random
import re
import signal
import subprocess
import unittest

import road
import smb
import smb_settings

ROOT = road.SHARES / "exam"
FIRST = int(os.environ.get("MARU_FIRST", 0))
CONFIGURATIONS = range(FIRST, FIRST + int(os.environ.get("MARU_CONFIGURATIONS", 24)))
# So many configurations, one is also asked for over HTTP.
HTTP_EVERY = 8


def entries_below(folder):
    """(path, is a folder) of all there is below, and of itself as "", with root's eyes."""
    entries = [("", True)]
    for parent, folders, files in os.walk(folder):
        for name in folders + files:
            path = os.path.relpath(os.path.join(parent, name), folder)
            entries.append((path, name in folders))
    return entries


def through_samba(client, user, share):
    """The volume paths of what the user can list or open of the share."""
    if not share.personal:
        found = client.readable(share.name, entries_below(share.folder))
        return {f"/volume1/{share.name}/{path}".rstrip("/") for path in found}
    paths = set()
    for owner in smb_settings.USERS if share.personal == "any" else (user,):
        served = f"{share.folder}/{owner}{share.inside}"
        found = client.readable(owner if share.name == "homes" else share.name, entries_below(served))
        top = f"/volume1/{share.name}/{owner}{share.inside}"
        paths |= {f"{top}/{path}".rstrip("/") for path in found}
    return paths


def over_http(services, token, share):
    """What the web server finds for the user in the share and calls readable."""
    data = road.search(services, token, "needle", indice=[share.name], size=5000)
    paths = [hit["MARUMDPath"] for hit in data["hits"] if hit["readable"]]
    assert data["total"] == len(data["hits"]), data
    return set(paths)


def through_search(user, share):
    def ask():
        [messages] = road.exchange(road.daemon_search("needle", [f"fileindex_{share.name}"], 0, 5000))
        assert messages[-1]["success"], messages[-1]
        total = next(message["total"] for message in messages if "total" in message)
        paths = [message["MARUMDPath"] for message in messages if "MARUMDPath" in message]
        return total, paths

    total, paths = road.as_user(user, ask)
    assert total == len(paths) == len(set(paths)), (total, paths)
    return set(paths)


class SambaTest(road.RoadTest):
    @classmethod
    def prepare(cls, services):
        cls.seed = int(os.environ.get("MARU_SEED", random.SystemRandom().randrange(1 << 32)))
        print(f"MARU_SEED={cls.seed} {CONFIGURATIONS}", flush=True)
        services.configure(admin_group="daemon")
        smb.enter_own_network()
        cls.samba = smb.Server(services.logs / "smbd.log")
        cls.addClassCleanup(cls.samba.stop)
        cls.samba.add_users(smb_settings.USERS)
        services.start_daemon()
        services.start_web()
        cls.tokens = {user: services.sign_in(user) for user in smb_settings.USERS}
        cls.counts = collections.Counter()

    def put_in_force(self, world):
        with open(smb.SETTINGS, "w", encoding="utf-8") as settings:
            settings.write(world.text())
        self.samba.stop()
        # What it keeps of a removed ACL looks like one.
        smb.SHARE_ACLS.unlink(missing_ok=True)
        for share in world.shares:
            if share.has_acl:
                subprocess.run(["sharesec", share.name, "-a", "S-1-1-0:DENIED/0/FULL"], check=True,
                               stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        os.utime(smb.SETTINGS)
        self.samba.start()
        self.services.index()
        self.services.running["maruwebd"].send_signal(signal.SIGHUP)

    def withheld(self):
        """Share → reason, as the operator is told."""
        shown = subprocess.run([road.BUILD / "bin/maructl", "shares"], text=True, check=False,
                               stdout=subprocess.PIPE).stdout
        rows = shown.partition("\nWITHHELD")[2].splitlines()[1:]
        return {name: reason for name, reason in (re.split("  +", row, 1) for row in rows if row)}

    def compare(self, number, world):
        withheld = self.withheld()
        for share in world.shares:
            self.counts["shares"] += 1
            if share.name in withheld:
                self.counts["withheld"] += 1
                self.assertRegex(withheld[share.name], f"guests|nobody's account|{share.withheld or 'no reason'}",
                                 f"configuration {number}: [{share.name}] should not be withheld")
            for user in smb_settings.USERS:
                found = through_search(user, share)
                expected = through_samba(self.clients[user], user, share) \
                    if share.name not in withheld else set()
                named = {path for path in expected if "needle" in os.path.basename(path)}
                self.counts["decisions"] += len(entries_below(share.folder))
                self.counts["readable"] += len(named)
                self.judge(number, world, share, user, found - named, named - found)
                if number % HTTP_EVERY == 0:
                    self.compare_over_http(share, user, found)

    def compare_over_http(self, share, user, found):
        """The web server takes new settings a moment after they are there."""
        def agrees():
            return over_http(self.services, self.tokens[user], share) == found

        road.wait_until(agrees, f"{user} to see the same over HTTP: {sorted(found)}\n{share.text()}")

    def judge(self, number, world, share, user, leaks, misses):
        self.counts["leaks"] += len(leaks)
        self.counts["misses"] += len(misses)
        if leaks or misses:
            print(f"configuration {number}, {user}: leaks {sorted(leaks)[:4]}, misses "
                  f"{sorted(misses)[:4]}\n{world.global_text}\n{share.text()}", flush=True)
            for path in [*leaks, *misses][:3]:
                subprocess.run(["getfacl", "-pn", share.folder + path[9 + len(share.name):]], check=False)
                subprocess.run(["namei", "-lm", share.folder], check=False)

    def test_search_agrees_with_samba(self):
        for number in CONFIGURATIONS:
            world = smb_settings.World(random.Random(f"{self.seed} {number}"), ROOT / str(number))
            world.make()
            self.put_in_force(world)
            self.clients = {user: smb.Client(user) for user in smb_settings.USERS}
            self.compare(number, world)
        print(dict(self.counts), flush=True)
        self.assertEqual((0, 0), (self.counts["leaks"], self.counts["misses"]))
        self.assertGreater(self.counts["readable"], self.counts["decisions"] / 20)


if __name__ == "__main__":
    unittest.main()
