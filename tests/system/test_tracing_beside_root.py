"""The tests of traces pass while root has a tracer's daemon, whatever it does, and leave it alone."""

import json
import os
import subprocess
import sys
import unittest
from pathlib import Path

from harness import BIN, WITH_US, require

HERE = Path(__file__).parent
KDEBUG = HERE.parents[1] / "platform/linux/kdebug/lttng"
TESTS = ["test_tracing.KernelTraceTest.test_matching_by_process_takes_events_of_any_thread",
         "test_tracing.PerformanceTraceTest.test_trace_becomes_an_archive_that_other_tools_read",
         "test_tracing.ToolTest.test_program_is_traced_shown_and_exported",
         "test_tracing_failures", "test_kdebug"]


def setUpModule():
    require("unshare", "mount", "lttng-sessiond", "lttng")
    if os.getuid() != 0:
        raise unittest.SkipTest("only root can put a daemon in the place of root's")
    if subprocess.run(["unshare", "--mount", "true"], stderr=subprocess.DEVNULL).returncode != 0:
        raise unittest.SkipTest("this process may not mount anything")


class BesideRootsDaemonTest(unittest.TestCase):
    def run_beside(self, kind):
        """The report of the module roots_daemon about these tests."""
        commands = [sys.executable, "-m", "unittest", "-v", *TESTS]
        unit = BIN / "halvox_lttng_test"
        if unit.exists():
            commands += ["--", str(unit), "--gtest_filter=SessionDaemonTest.*"]
        done = subprocess.run(
            [*WITH_US, "unshare", "--mount", "--", sys.executable, "-m", "roots_daemon", kind,
             *commands],
            cwd=HERE, env={**os.environ, "PYTHONPATH": f"{HERE}:{KDEBUG}", "HALVOX_BIN": str(BIN)},
            stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True, timeout=240, check=False)
        self.assertEqual(done.returncode, 0, done.stdout)
        report = json.loads(done.stdout.splitlines()[-1])
        self.assertEqual(set(report["statuses"]), {0}, done.stdout)
        self.assertNotIn("skipped", done.stdout.lower())
        return report

    def test_one_that_hangs_is_not_met(self):
        report = self.run_beside("hangs")

        self.assertGreater(report["met before"], 0)
        self.assertEqual(report["met"], 0)

    def test_one_that_records_keeps_its_session_and_gets_no_other(self):
        report = self.run_beside("records")

        self.assertEqual(report["sessions"], ["roots"])


if __name__ == "__main__":
    unittest.main()
