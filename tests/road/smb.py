"""Samba itself, as an examiner: smbd on a loopback of its own, and what a user can list and open
through it."""

import contextlib
import ctypes
import fcntl
import os
import pathlib
import socket
import struct
import subprocess
import time

from samba import NTSTATUSError
from samba.credentials import Credentials
from samba.samba3 import libsmb_samba_internal as libsmb
from samba.samba3 import param

SETTINGS = "/etc/samba/smb.conf"
SHARE_ACLS = pathlib.Path("/var/lib/samba/share_info.tdb")
ADDRESS = "127.0.0.1"
PORT = 445
CLONE_NEWNET = 0x40000000
SIOCSIFFLAGS = 0x8914
IFF_UP = 1
# What says that the server has gone, rather than no.
BROKEN = ("NT_STATUS_CONNECTION_DISCONNECTED", "NT_STATUS_CONNECTION_RESET", "NT_STATUS_IO_TIMEOUT")


def enter_own_network():
    """A network namespace with nothing but a loopback: SMB has a fixed port."""
    libc = ctypes.CDLL(None, use_errno=True)
    if libc.unshare(CLONE_NEWNET) != 0:
        raise OSError(ctypes.get_errno(), "unshare")
    with socket.socket() as any_socket:
        fcntl.ioctl(any_socket, SIOCSIFFLAGS, struct.pack("16sH14x", b"lo", IFF_UP))


class Server:
    """smbd with the settings as they are when it starts."""

    def __init__(self, log):
        self.log = pathlib.Path(log)
        self.process = None

    def add_users(self, users):
        for user in users:
            subprocess.run(["smbpasswd", "-s", "-a", user], input=f"{user}\n{user}\n", text=True,
                           check=True, stdout=subprocess.DEVNULL)

    def start(self):
        # A guest account of before would stay one.
        for folder in ("/var/cache/samba", "/var/lib/samba", "/run/samba"):
            for cache in pathlib.Path(folder).glob("gencache*"):
                cache.unlink()
        with open(self.log, "wb") as log:
            # It ends its process group with itself.
            self.process = subprocess.Popen(
                ["smbd", "--foreground", "--no-process-group", "--debug-stdout", "-d", "1"],
                stdout=log, stderr=log, stdin=subprocess.DEVNULL, start_new_session=True)
        end = time.monotonic() + 30
        while True:
            with contextlib.suppress(OSError):
                socket.create_connection((ADDRESS, PORT), 1).close()
                return
            if self.process.poll() is not None or time.monotonic() > end:
                raise AssertionError(f"smbd does not start:\n{self.log.read_text(errors='replace')}")
            time.sleep(0.01)

    def stop(self):
        if self.process:
            self.process.terminate()
            self.process.wait(30)
            self.process = None


class Client:
    """One user's eyes through SMB."""

    def __init__(self, user):
        self.settings = param.get_context()
        self.settings.load(SETTINGS)
        self.credentials = Credentials()
        self.credentials.guess(self.settings)
        self.credentials.set_username(user)
        self.credentials.set_password(user)

    def connect(self, share):
        """None when the user is not admitted."""
        with contextlib.suppress(NTSTATUSError):
            return libsmb.Conn(ADDRESS, share, self.settings, self.credentials)
        return None

    def readable(self, share, entries):
        """Which of (path, is a folder) the user can open, or list. Paths are relative to the share."""
        found = []
        connection = self.connect(share)
        for path, is_folder in entries:
            for _ in range(3):
                if connection is None:
                    return found
                try:
                    look = connection.list if is_folder else connection.loadfile
                    look(path.replace("/", "\\"))
                    found.append(path)
                    break
                except NTSTATUSError as error:
                    if error.args[1] not in BROKEN and not self.is_broken(connection):
                        break
                    # Some security descriptors end the process that serves the connection.
                    connection = self.connect(share)
        return found

    @staticmethod
    def is_broken(connection):
        try:
            connection.echo()
            return False
        except (NTSTATUSError, AttributeError):
            return True
