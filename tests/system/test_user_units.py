"""Where the system has no service, the PipeWire reporter's unit gives a user one: its socket, its records."""

import os
import re
import subprocess
import unittest

import harness
from harness import WITH_US, wait_for
from installation import Installation, run

SESSION = """\
create 7
start 7
send --id 7 --category Session_Playback --type Start {"volume": 0.25}
stop 7
"""


class UserUnitsTest(Installation):
    def unit(self, name, manager="user"):
        return (self.prefix / "lib/systemd" / manager / name).read_text(encoding="utf-8")

    def settings(self, text, key):
        return re.findall(rf"^{key}=(.*)$", text, re.MULTILINE)

    def setUp(self):
        self.home = self.directory / "home"
        self.runtime = self.directory / "run"
        for directory in self.home, self.runtime / "halvox":
            directory.mkdir(parents=True, exist_ok=True, mode=0o700)
        self.login = {"HOME": str(self.home), "XDG_RUNTIME_DIR": str(self.runtime), "PATH": os.environ["PATH"],
                      "HALVOX_CONFIG": ""}
        for name in "ASAN_OPTIONS", "LSAN_OPTIONS":
            if name in os.environ:
                self.login[name] = os.environ[name]

    def start_at_first_connection(self):
        """Starts the user's service as its socket unit does."""
        listen, = self.settings(self.unit("halvox-reportingd.socket"), "ListenStream")
        command, = self.settings(self.unit("halvox-reportingd.service"), "ExecStart")
        log = self.directory / "service.log"
        with open(log, "wb") as output:
            process = subprocess.Popen(
                [*WITH_US, "systemd-socket-activate", "--listen=" + listen.replace("%t", str(self.runtime)),
                 *(f"--setenv={name}" for name in self.login), command],
                env=self.login, stdin=subprocess.DEVNULL, stdout=output, stderr=output)
        self.addCleanup(process.wait, harness.DEADLINE)
        self.addCleanup(process.terminate)
        wait_for("the activation socket", lambda: "Listening on" in log.read_text(errors="replace"))

    def test_the_users_programs_find_the_service_and_its_records(self):
        harness.require("systemd-socket-activate")
        self.start_at_first_connection()
        halvoxctl = str(self.prefix / "bin/halvoxctl")

        subprocess.run([halvoxctl, "run", "-"], input=SESSION, text=True, env=self.login, check=True,
                       timeout=harness.DEADLINE, stdout=subprocess.DEVNULL)

        store = self.home / ".local/state/halvox/halvox.db"
        wait_for("the store of the user", store.exists)
        wait_for("the message of the session", lambda: "0.25" in run(
            halvoxctl, "sql", "SELECT payload FROM link_messages", env=self.login))

    def test_the_socket_gives_way_to_the_service_of_the_system(self):
        systems, = self.settings(self.unit("halvox-reportingd.socket", "system"), "ListenStream")
        users = self.unit("halvox-reportingd.socket")

        self.assertEqual(self.settings(users, "ConditionPathExists"), ["!" + systems])
        self.assertEqual(self.settings(users, "SocketMode"), ["0600"])

    def test_the_file_that_a_user_s_socket_gives_way_to_goes_with_the_socket_of_the_system(self):
        for manager in "system", "user":
            socket = self.unit("halvox-reportingd.socket", manager)
            self.assertEqual(self.settings(socket, "RemoveOnStop"), ["yes"], manager)
        # systemd keeps the directory of the socket, which belongs to the service, too.
        service = self.unit("halvox-reportingd.service", "system")
        self.assertEqual(self.settings(service, "Requires"), ["halvox-reportingd.socket"])

    def test_the_reporter_asks_for_the_socket_and_runs_without_it(self):
        if not (self.prefix / "bin/halvox-pipewire-reporter").exists():
            self.skipTest("built without the reporter")
        reporter = self.unit("halvox-pipewire-reporter.service")

        self.assertEqual(self.settings(reporter, "Wants"), ["halvox-reportingd.socket"])
        self.assertIn("halvox-reportingd.socket", self.settings(reporter, "After"))
        self.assertEqual(self.settings(reporter, "Requires"), [])


if __name__ == "__main__":
    unittest.main()
