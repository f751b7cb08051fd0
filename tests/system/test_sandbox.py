"""The shipped unit: how much it exposes, and the service under its system call filter."""

import errno
import os
import re
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

import harness
import sandbox
from harness import PLAYBACK, SERVICE, START, Service, start_session, wait_for

MOST_EXPOSED = 1.5
REPORTER = 7


class ExposureTest(unittest.TestCase):
    def test_the_unit_exposes_little(self):
        harness.require("systemd-analyze")
        with tempfile.TemporaryDirectory() as directory:
            unit = Path(directory) / "halvox-reportingd.service"
            unit.write_text(sandbox.UNIT.read_text(encoding="utf-8").replace("@BINDIR@", "/usr/bin"))
            printed = subprocess.run(
                ["systemd-analyze", "security", "--offline=true", "--no-pager", str(unit)],
                capture_output=True, text=True, check=True).stdout
        exposure = float(re.search(r"Overall exposure level for \S+: ([0-9.]+)", printed)[1])
        self.assertLessEqual(exposure, MOST_EXPOSED, printed)
        # What is exposed is named in the unit with its reason.
        exposed = re.findall(r"^✗ ([A-Za-z]+)=", printed, re.MULTILINE)
        text = sandbox.UNIT.read_text(encoding="utf-8")
        for directive in exposed:
            self.assertIn(f"{directive}=", text)


    def test_the_examples_of_drop_ins_only_relax_it_for_their_purpose(self):
        harness.require("systemd-analyze")
        examples = sandbox.UNIT.parent / "examples"
        self.assertEqual(sorted(path.name for path in examples.iterdir()), ["link-nats.conf", "pipewire.conf"])
        for example in examples.iterdir():
            with self.subTest(example.name), tempfile.TemporaryDirectory() as directory:
                unit = Path(directory) / "halvox-reportingd.service"
                text = sandbox.UNIT.read_text(encoding="utf-8").replace("@BINDIR@/halvox-reportingd", str(SERVICE))
                unit.write_text(text)
                for name in ("halvox-reportingd.socket",):
                    shutil.copy(sandbox.UNIT.parent / name, directory)
                drop_ins = Path(directory) / "halvox-reportingd.service.d"
                drop_ins.mkdir()
                shutil.copy(example, drop_ins)
                verified = subprocess.run(
                    ["systemd-analyze", "verify", "--man=no", "--recursive-errors=no", str(unit)],
                    capture_output=True, text=True, check=False)
                self.assertEqual((verified.returncode, verified.stderr), (0, ""))


@unittest.skipIf(sandbox.missing() and not os.environ.get("CI"), sandbox.missing())
class SystemCallFilterTest(unittest.TestCase):
    def test_the_service_works_under_the_filter(self):
        # The search for leaks at the end traces the process, which the filter refuses.
        options = os.environ.get("ASAN_OPTIONS", "") + ":detect_leaks=0"
        with Service(command=sandbox.command_in_sandbox([str(SERVICE)]),
                     environment={"ASAN_OPTIONS": options}) as service:
            client = start_session(self, service, REPORTER)
            client.send({"run": 1}, category=PLAYBACK, event_type=START, reporters=[REPORTER])
            client.stop(REPORTER)
            wait_for("the message", lambda: service.events())
            service.stop()
            self.assertEqual(service.process.returncode, 0)
            self.assertNotIn("Operation not permitted", service.log())

    def test_what_the_service_does_not_need_is_refused(self):
        attempt = ("import ctypes, sandbox; sandbox.enter(sandbox.UNIT); libc = ctypes.CDLL(None, use_errno=True); "
                   "print(libc.mount(b'none', b'/', b'tmpfs', 0, None), ctypes.get_errno(), "
                   "libc.syscall(101, 0, 0, 0, 0), ctypes.get_errno())")  # 101 is ptrace
        printed = subprocess.run([sys.executable, "-c", attempt], check=True, capture_output=True, text=True,
                                 cwd=Path(__file__).parent).stdout
        self.assertEqual(printed.split(), ["-1", str(errno.EPERM)] * 2)


if __name__ == "__main__":
    unittest.main()
