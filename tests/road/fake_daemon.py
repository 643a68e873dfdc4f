#!/usr/bin/python3
"""A search daemon that does what a script tells it: what a real one will not do on demand.

In a test: `with FakeDaemon(garbage): ...`. For a person:

    ./run --without-daemon -- tests/road/fake_daemon.py garbage

with a shell inside, or any other of the behaviours below, in place of the real daemon.
"""

import contextlib
import json
import os
import socket
import struct
import subprocess
import sys
import threading

import road


def send(connection, message):
    connection.sendall(json.dumps(message).encode() + b"\n")


def replies(*messages):
    """Answers each request with these messages."""
    def behave(connection, _request, _ended):
        for message in messages:
            send(connection, message)

    return behave


def garbage(connection, _request, _ended):
    """Answers with a line that is no JSON."""
    connection.sendall(b"abc {\xff\x00\n")


def list_reply(connection, _request, _ended):
    """Answers with JSON of the wrong kind."""
    send(connection, [])


def half_a_message(connection, _request, _ended):
    """Begins an answer and hangs up in the middle of a message."""
    send(connection, {"total": 2})
    connection.sendall(b'{"MARUMDPath": "/volume1/do')


def stalled_message(connection, _request, ended):
    """Begins a message and never ends it."""
    connection.sendall(b'{"tot')
    ended.wait()


def silence(_connection, _request, ended):
    """Never answers."""
    ended.wait()


class FakeDaemon:
    """Listens at the daemon's socket and treats each request as `behaviour` says: a function of the
    connection, the parsed request and an event that is set when the daemon is to end."""

    def __init__(self, behaviour):
        self.behaviour = behaviour
        self.requests = []
        # The processes that asked, in turn.
        self.peers = []
        self.ended = threading.Event()
        self.threads = []

    def __enter__(self):
        with contextlib.suppress(FileNotFoundError):
            os.unlink(road.SOCKET)
        self.listening = socket.socket(socket.AF_UNIX)
        self.listening.bind(road.SOCKET)
        os.chmod(road.SOCKET, 0o666)
        self.listening.listen(64)
        self.threads.append(threading.Thread(target=self.accept))
        self.threads[0].start()
        return self

    def __exit__(self, *_):
        self.ended.set()
        self.listening.shutdown(socket.SHUT_RDWR)
        for thread in self.threads:
            thread.join()
        self.listening.close()
        os.unlink(road.SOCKET)

    def accept(self):
        while not self.ended.is_set():
            with contextlib.suppress(OSError):
                connection, _ = self.listening.accept()
                thread = threading.Thread(target=self.serve, args=(connection,))
                self.threads.append(thread)
                thread.start()

    def serve(self, connection):
        with connection, contextlib.suppress(OSError), connection.makefile("rb") as stream:
            line = stream.readline()
            if line.startswith(b"\x01client "):
                line = stream.readline()
            request = json.loads(line or b"null")
            credentials = connection.getsockopt(socket.SOL_SOCKET, socket.SO_PEERCRED, 12)
            self.peers.append(struct.unpack("3i", credentials)[0])
            self.requests.append(request)
            self.behaviour(connection, request, self.ended)


BEHAVIOURS = {function.__name__: function
              for function in (garbage, list_reply, half_a_message, stalled_message, silence)}

if __name__ == "__main__":
    if len(sys.argv) < 2 or sys.argv[1] not in BEHAVIOURS:
        sys.exit(f"usage: fake_daemon.py {'|'.join(BEHAVIOURS)} [COMMAND...]")
    with FakeDaemon(BEHAVIOURS[sys.argv[1]]):
        sys.exit(subprocess.call(sys.argv[2:] or ["bash"]))
