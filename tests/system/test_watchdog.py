"""The service manager's watchdog: keep-alive messages while the service makes progress, and only then."""

import ctypes
import os
import re
import select
import shutil
import socket
import tempfile
import unittest
from pathlib import Path

from harness import Service, iterate_until, service_command, start_session, wait_for

KEEP_ALIVE = b"WATCHDOG=1"
LIMIT = 0.3  # seconds; as WatchdogSec= of a unit, but for a test
REPORTER = 7
UNITS = Path(__file__).parents[2] / "packaging/systemd"

PTRACE_DETACH, PTRACE_SEIZE, PTRACE_INTERRUPT = 17, 0x4206, 0x4207
WALL = 0x40000000  # of waitpid(): threads, too


class Manager:
    """Receives the messages as systemd does."""

    def __init__(self, directory):
        self.path = str(directory / "manager")
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self._socket.bind(self.path)

    def wait_for(self, text):
        wait_for(f"the message {text}", lambda: text in self.received())

    def received(self, seconds=0.0):
        """The messages so far; waits that long for the first."""
        messages = []
        while select.select([self._socket], [], [], seconds)[0]:
            messages += self._socket.recv(4096).split(b"\n")
            seconds = 0
        return messages

    def close(self):
        self._socket.close()


class FrozenThread:
    """Stops one thread of another process while the others run. Use as a context manager."""

    def __init__(self, process, name):
        tasks = Path(f"/proc/{process.pid}/task")
        self._thread, = [int(task.name) for task in tasks.iterdir() if (task / "comm").read_text().strip() == name]
        self._libc = ctypes.CDLL(None, use_errno=True)
        # A thread that sleeps between two jobs holds no lock that the other threads need.
        wait_for(f"the thread {name} to sleep",
                 lambda: (tasks / str(self._thread) / "stat").read_text().rpartition(")")[2].split()[0] == "S")

    def _ptrace(self, request):
        if self._libc.ptrace(request, self._thread, None, None) != 0:
            raise OSError(ctypes.get_errno(), os.strerror(ctypes.get_errno()))

    def __enter__(self):
        try:
            self._ptrace(PTRACE_SEIZE)
        except PermissionError as error:
            raise unittest.SkipTest(f"this machine does not permit ptrace: {error}") from error
        self._ptrace(PTRACE_INTERRUPT)
        os.waitpid(self._thread, WALL)
        return self

    def __exit__(self, *_):
        self._ptrace(PTRACE_DETACH)


class WatchdogTest(unittest.TestCase):
    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        self.addCleanup(shutil.rmtree, self.directory, True)
        self.manager = Manager(self.directory)
        self.addCleanup(self.manager.close)
        # The harness has a socket of its own, which it closes when the service is ready.
        variables = [f"NOTIFY_SOCKET={self.manager.path}", f"WATCHDOG_USEC={int(LIMIT * 1e6)}"]
        self.service = Service(command=["env", *variables, *service_command()])
        self.addCleanup(shutil.rmtree, self.service.directory, True)
        self.service.start(wait=False)
        self.addCleanup(self.service.stop)
        self.manager.wait_for(b"READY=1")

    def test_an_idle_service_sends_keep_alives(self):
        for _ in range(5):
            self.manager.wait_for(KEEP_ALIVE)

    def test_a_stuck_reporting_queue_ends_them_until_it_goes_on(self):
        client = start_session(self, self.service, REPORTER)
        self.assertTrue(client.valid(REPORTER))
        with FrozenThread(self.service.process, "server"):
            stop = client.call_later("stopReportingSessionForID", "x", REPORTER)
            wait_for("the line in the log", lambda: "the reporting queue is stuck" in self.service.log())
            self.manager.received()

            self.assertEqual(self.manager.received(2 * LIMIT), [])

        self.manager.wait_for(KEEP_ALIVE)
        iterate_until("the answer to the stop", lambda: stop.done)

    def test_a_stopped_service_sends_none(self):
        self.manager.wait_for(KEEP_ALIVE)

        self.service.stop()

        self.assertIn(b"STOPPING=1", self.manager.received())
        self.assertEqual(self.manager.received(), [])


class UnitsTest(unittest.TestCase):
    def test_both_units_have_a_watchdog_that_restarts_the_service(self):
        for unit in "halvox-reportingd.service.in", "user/halvox-reportingd.service.in":
            text = (UNITS / unit).read_text(encoding="utf-8")
            for line in "Type=notify", "WatchdogSec=5min", "Restart=on-failure":
                self.assertTrue(re.search(rf"^{line}$", text, re.MULTILINE), f"{unit}: {line}")


if __name__ == "__main__":
    unittest.main()
