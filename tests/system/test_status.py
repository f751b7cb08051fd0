"""halvoxctl status: the state of a service, and what its files say without one."""

import contextlib
import fcntl
import json
import os
import pty
import struct
import subprocess
import termios
import unittest

from harness import CTL, DEADLINE, Service, start_service, wait_for

CONFIG = "[drivers]\nalsa = false\npipewire = false\n[link]\nbackend = \"none\"\n"


def shown_at(service, columns):
    """The lines of the status at a terminal of that width, and the exit status."""
    ours, theirs = pty.openpty()
    fcntl.ioctl(theirs, termios.TIOCSWINSZ, struct.pack("HHHH", 24, columns, 0, 0))
    text = b""
    process = subprocess.Popen([CTL, "status"], stdin=subprocess.DEVNULL, stdout=theirs,
                               stderr=subprocess.STDOUT, env=service.ctl_environment())
    os.close(theirs)
    with contextlib.suppress(OSError):  # the terminal ends with its program
        while chunk := os.read(ours, 4096):
            text += chunk
    os.close(ours)
    return text.decode().splitlines(), process.wait(DEADLINE)


class StatusTest(unittest.TestCase):
    def status(self, service, status=0):
        return json.loads(service.ctl("status", "--json", status=status).stdout)

    def test_a_running_service_shows_its_state(self):
        service, client = start_service(self, CONFIG)
        client.create(7)

        shown = self.status(service)

        self.assertTrue(shown["running"])
        self.assertEqual((shown["clients"], shown["sessions"]), (1, 1))
        self.assertEqual(shown["process"], service.process.pid)
        self.assertEqual(shown["places"]["socket"], str(service.socket))
        self.assertEqual(shown["places"]["configuration"], str(service.config))
        self.assertEqual(shown["places"]["database"], str(service.database))
        self.assertGreater(shown["disk"]["database_bytes"], 0)
        self.assertEqual(shown["disk"]["database_limit_bytes"], 512 << 20)
        self.assertEqual([one["why"] for one in shown["off"]],
                         ['link.backend is "none"', 'listener.bus is "none"',
                          "device.InternalBuild is not true", "drivers.alsa is false",
                          "drivers.pipewire is false", 'link.backend is not "nats"',
                          "diagnostics.trace_points is not true",
                          "features.Acoustat.Tracing is not true"])
        self.assertGreater(shown["cost"]["wakeups"], 0)

    def test_what_was_refused_is_shown_with_its_reason(self):
        service, client = start_service(self, CONFIG)
        with self.assertRaises(Exception):
            client.call("noSuchRequest")

        losses = self.status(service)["losses"]

        self.assertIn({"piece": "connection", "reason": "requests refused: unknown method",
                       "total": 1}, losses)

    def test_without_a_service_it_shows_what_the_files_say(self):
        service, client = start_service(self, CONFIG)
        client.create(7)
        wait_for("the database", service.database.exists)
        service.stop()

        shown = self.status(service, status=69)
        text = service.ctl("status", status=69).stdout

        self.assertFalse(shown["running"])
        self.assertIn(f"no service at {service.socket}", shown["problem"])
        self.assertIsNone(shown["process"])
        self.assertIsNone(shown["uptime_seconds"])
        self.assertGreater(shown["disk"]["database_bytes"], 0)
        self.assertIn("The service does not run", text)
        self.assertIn(f"no service at {service.socket}", text)
        self.assertIn(str(service.database), text)

    def test_it_fits_a_terminal_with_and_without_a_service(self):
        with Service(CONFIG) as service:
            for state, expected in (("running", 0), ("stopped", 69)):
                if state == "stopped":
                    service.stop()
                for columns in (80, 40):
                    with self.subTest(state=state, columns=columns):
                        lines, status = shown_at(service, columns)
                        self.assertEqual(status, expected)
                        self.assertLessEqual(max(map(len, lines)), columns)
                        self.assertIn("drivers.pipewire", " ".join(lines))


if __name__ == "__main__":
    unittest.main()
