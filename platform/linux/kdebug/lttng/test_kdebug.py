"""The tracepoint provider with a real session daemon, in a scratch directory of its own.

This module gives up being root for good; see isolation.py. All that is started is stopped by process
id.
"""

import os
import shutil
import socket
import subprocess
import tempfile
import time
import unittest
from pathlib import Path

import isolation

TOOLS = ["lttng-sessiond", "lttng", "babeltrace2", "setpriv"]
MISSING = [tool for tool in TOOLS if shutil.which(tool) is None]
DEADLINE = 30.0
# However a test ends, the kernel also ends the programs that it started.
WITH_US = ["setpriv", "--pdeathsig", "KILL", "--"]


def setUpModule():
    isolation.enter()


def wait_for(what, condition):
    end = time.monotonic() + DEADLINE
    while not condition():
        if time.monotonic() > end:
            raise AssertionError(f"waited {DEADLINE:.0f} s in vain for {what}")
        time.sleep(0.02)


@unittest.skipIf(MISSING, f"not installed: {', '.join(MISSING)}")
class KdebugTest(unittest.TestCase):
    def setUp(self):
        self.home = Path(tempfile.mkdtemp(prefix="halvox-lttng-"))
        self.addCleanup(shutil.rmtree, self.home, ignore_errors=True)
        self.environment = dict(os.environ, HOME=str(self.home), LTTNG_HOME=str(self.home))

    def start(self, *command, **options):
        process = subprocess.Popen(
            WITH_US + [str(part) for part in command],
            env=dict(self.environment, **options.pop("environment", {})), text=True, **options)

        def stop():
            process.terminate()
            process.wait(DEADLINE)
            for stream in (process.stdin, process.stdout):
                if stream is not None:
                    stream.close()

        self.addCleanup(stop)
        return process

    def run_tool(self, *command):
        return subprocess.run(WITH_US + [str(part) for part in command], env=self.environment,
                              capture_output=True, text=True, timeout=DEADLINE, check=False)

    def start_daemon(self):
        self.start("lttng-sessiond", "--no-kernel",
                   stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        wait_for("the session daemon", lambda: self.lttng_quietly("list").returncode == 0)

    def lttng_quietly(self, *arguments):
        return self.run_tool("lttng", "--no-sessiond", "-n", *arguments)

    def lttng(self, *arguments):
        result = self.lttng_quietly(*arguments)
        self.assertEqual(result.returncode, 0, result.stdout + result.stderr)
        return result.stdout

    def start_session(self):
        self.lttng("create", "session", "-o", self.home / "trace")
        self.lttng("enable-event", "-u", "halvox:kdebug")
        self.lttng("start")

    def recorded(self):
        self.lttng("stop")
        self.lttng("destroy")
        result = self.run_tool("babeltrace2", self.home / "trace")
        self.assertEqual(result.returncode, 0, result.stderr)
        return [line[line.index("halvox:"):] for line in result.stdout.splitlines()]

    def start_probe(self, **environment):
        probe = self.start(isolation.program("halvox_kdebug_probe"), environment=environment,
                           bufsize=1, stdin=subprocess.PIPE, stdout=subprocess.PIPE)
        self.assertEqual(probe.stdout.readline(), "ready\n")
        return probe

    def emit(self, probe, count):
        for _ in range(count):
            probe.stdin.write("\n")
            self.assertEqual(probe.stdout.readline(), "emitted\n")

    def test_events_of_a_running_session_are_recorded(self):
        self.start_daemon()
        self.start_session()
        # Waits for the daemon, so that no event is emitted before it listens.
        probe = self.start_probe(LTTNG_UST_REGISTER_TIMEOUT="10000")

        self.emit(probe, 3)

        rest = "arg1 = 0, arg2 = 1, arg3 = 2, arg4 = 18446744073709551615 }"
        lines = self.recorded()
        self.assertEqual(len(lines), 3, lines)
        for line, code in zip(lines, ("0x21044814", "0x21044818", "0x2104481C")):
            self.assertIn(f"halvox:kdebug: {{ cpu_id = ", line)
            self.assertTrue(line.endswith(f"{{ code = {code}, {rest}"), line)

    def test_daemon_that_starts_later_finds_the_process(self):
        probe = self.start_probe()
        self.start_daemon()
        wait_for("the process to be listed", lambda: "halvox:kdebug" in self.lttng("list", "-u"))
        self.start_session()

        self.emit(probe, 1)

        self.assertEqual(len(self.recorded()), 1)

    def test_daemon_that_hangs_does_not_hold_up_the_start(self):
        (self.home / ".lttng").mkdir(mode=0o755)
        with socket.socket(socket.AF_UNIX) as hung:
            path = self.home / ".lttng" / "lttng-ust-sock-8"
            hung.bind(str(path))
            os.chmod(path, 0o777)
            hung.listen()

            start = time.monotonic()
            self.start_probe()
            elapsed = time.monotonic() - start

        self.assertLess(elapsed, 2.0)  # it would be three seconds and more


if __name__ == "__main__":
    unittest.main()
