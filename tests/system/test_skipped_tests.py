"""What scripts/test prints about tests that were skipped."""

import subprocess
import tempfile
import unittest
from pathlib import Path

SCRIPT = Path(__file__).parents[2] / "scripts/lib/skipped_tests.py"
LOG = """Start testing: Nov 22 02:00 UTC
----------------------------------------------------------
1/4 Testing: A.Passes
1/4 Test: A.Passes
Output:
[       OK ] A.Passes (0 ms)
2/4 Testing: B.IsSkipped
2/4 Test: B.IsSkipped
Output:
[ RUN      ] B.IsSkipped
/src/BTest.cpp:30: Skipped
this process may not mount a file system

[  SKIPPED ] B.IsSkipped (0 ms)
3/4 Testing: system.test_c
3/4 Test: system.test_c
Output:
test_one (test_c.C.test_one) ... ok
test_two (test_c.C.test_two) ... skipped "nats-server isn't installed"
4/4 Testing: system.test_d
4/4 Test: system.test_d
Output:
setUpModule (test_d) ... skipped 'LTTng is not in this build'
"""


class SkippedTestsTest(unittest.TestCase):
    def said(self, log):
        with tempfile.NamedTemporaryFile("w", suffix=".log") as file:
            file.write(log)
            file.flush()
            return subprocess.run([str(SCRIPT), file.name], check=True, capture_output=True,
                                  text=True).stdout

    def test_each_is_said_with_its_reason(self):
        self.assertEqual(self.said(LOG), """3 skipped:
  B.IsSkipped: this process may not mount a file system
  system.test_c, test_two: nats-server isn't installed
  system.test_d, setUpModule: LTTng is not in this build
""")

    def test_without_any_nothing_is_said(self):
        self.assertEqual(self.said(LOG[:LOG.index("2/4 Testing")]), "")


if __name__ == "__main__":
    unittest.main()
