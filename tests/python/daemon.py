"""A real daemon for one test, and a false one that answers as the test wants."""

from __future__ import annotations

import os
import pathlib
import select
import signal
import socket
import subprocess
import tempfile
import threading
import unittest
from collections.abc import Callable

PROGRAM = os.environ["TALLOW_DAEMON_PROGRAM"]
READY_SECONDS = 120.0


class DaemonTest(unittest.TestCase):
    """Each test has a directory of its own, and a daemon if it starts one."""

    def setUp(self) -> None:
        scratch = tempfile.TemporaryDirectory(prefix="tallow-python-")
        self.addCleanup(scratch.cleanup)
        self.directory = pathlib.Path(scratch.name)
        self.runtime = self.directory / "run"
        self.runtime.mkdir(mode=0o700)

    def start_daemon(self) -> subprocess.Popen[bytes]:
        """Starts the daemon, and waits until it says that it is ready."""
        notify = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self.addCleanup(notify.close)
        notify.bind(str(self.directory / "notify"))
        environment = os.environ | {
            "STATE_DIRECTORY": str(self.directory / "state"),
            "RUNTIME_DIRECTORY": str(self.runtime),
            "NOTIFY_SOCKET": str(self.directory / "notify"),
        }
        log = (self.directory / "log").open("wb")
        self.addCleanup(log.close)
        daemon = subprocess.Popen([PROGRAM], env=environment, stderr=log)
        self.addCleanup(self.stop, daemon)
        ended = os.pidfd_open(daemon.pid)
        self.addCleanup(os.close, ended)
        ready, _, _ = select.select([notify, ended], [], [], READY_SECONDS)
        self.assertIn(notify, ready, (self.directory / "log").read_text(errors="replace"))
        self.assertTrue(notify.recv(256).startswith(b"READY=1"))
        (self.directory / "notify").unlink()
        return daemon

    @staticmethod
    def stop(daemon: subprocess.Popen[bytes]) -> None:
        if daemon.poll() is None:
            daemon.send_signal(signal.SIGKILL)
        daemon.wait()


class FalseDaemon:
    """Accepts one connection on a socket and lets a function of the test speak on it."""

    def __init__(self, path: pathlib.Path, speak: Callable[[socket.socket], None]) -> None:
        self._listener = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        self._listener.bind(str(path))
        self._listener.listen()
        self._speak = speak
        self._thread = threading.Thread(target=self._serve, name="false daemon")
        self._thread.start()

    def _serve(self) -> None:
        connection, _ = self._listener.accept()
        with connection:
            self._speak(connection)

    def stop(self) -> None:
        self._thread.join(timeout=60)
        self._listener.close()


def read_line(connection: socket.socket) -> bytes:
    line = b""
    while not line.endswith(b"\r\n"):
        line += connection.recv(1)
    return line


def greet(connection: socket.socket) -> None:
    """The daemon's part of the authentication."""
    read_line(connection)
    connection.sendall(b"OK 0123456789abcdef0123456789abcdef\r\n")
    read_line(connection)
