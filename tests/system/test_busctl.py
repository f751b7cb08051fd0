"""busctl, systemd's command-line client, uses the whole protocol and can introspect it."""

import subprocess
import unittest

import harness
from harness import BUS_NAME, INTERFACE, OBJECT, Service


class Busctl(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        harness.require("busctl")

    def setUp(self):
        self.service = Service()
        self.enterContextCompat(self.service)

    def enterContextCompat(self, manager):
        manager.__enter__()
        self.addCleanup(manager.__exit__, None, None, None)

    def busctl(self, *arguments):
        return subprocess.run(
            ["busctl", f"--address={self.service.address}", "--timeout=10", *arguments],
            capture_output=True, text=True, timeout=harness.DEADLINE, check=False)

    def call(self, member, *arguments):
        return self.busctl("call", BUS_NAME, OBJECT, INTERFACE, member, *arguments)

    def test_each_request_is_answered(self):
        for member, arguments, expected in (
            ("createReportingSession", ("x", "5"), "b true"),
            ("setServiceType", ("qx", "3", "5"), "b true"),
            ("getServiceNameForReporterID", ("x", "5"), "q 65535"),  # a new connection: session 5 has ended
            ("setConfiguration", ("a{sv}x", "1", "HostApplicationDisplayID", "s", "me", "5"), "b true"),
            ("startReportingSessionForID", ("x", "5"), "b true"),
            ("sendMessage", ("a{sv}uqaax", "1", "volume", "d", "0.5", "4", "1", "1", "1", "5"), ""),
            ("stopReportingSessionForID", ("x", "5"), "b true"),
            ("destroyReportingSession", ("x", "5"), "b true"),
            ("reporterIDValid", ("x", "5"), 'a{sv} 2 "reporterID" x 0 "serviceType" q 65535'),
            ("getAllReporters", (), "ax 0"),
        ):
            with self.subTest(member=member):
                result = self.call(member, *arguments)
                self.assertEqual((result.returncode, result.stderr), (0, ""))
                self.assertEqual(result.stdout.strip(), expected)

    def test_introspection_shows_the_interface(self):
        result = self.busctl("introspect", BUS_NAME, OBJECT, INTERFACE)

        self.assertEqual(result.returncode, 0, result.stderr)
        for member, signature in (("createReportingSession", "x"), ("sendMessage", "a{sv}uqaax"),
                                  ("reporterIDValid", "x"), ("getAllReporters", "-")):
            self.assertRegex(result.stdout, rf"\.{member}\s+method\s+{signature.replace('{', '.').replace('}', '.')}")

    def test_tree_leads_to_the_object(self):
        result = self.busctl("tree", BUS_NAME)

        self.assertEqual(result.returncode, 0, result.stderr)
        self.assertIn(OBJECT, result.stdout)

    def test_unknown_member_is_named_in_the_error(self):
        result = self.call("makeCoffee", "x", "1")

        self.assertNotEqual(result.returncode, 0)
        self.assertIn("makeCoffee", result.stderr)


if __name__ == "__main__":
    unittest.main()
