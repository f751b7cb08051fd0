"""The installed examples build without warnings and run as they are, and the service records what they
report."""

import json
import os
import subprocess
import sys
import unittest

import harness
from harness import DEADLINE, WITH_US, start_service, start_session, wait_for
from installation import Installation, run

WARNINGS = "-Wall -Wextra -Wconversion -Wshadow -Werror"
NO_DRIVERS = "[drivers]\nalsa = false\npipewire = false\n"


class ExamplesTest(Installation):
    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        cls.examples = cls.prefix / "share/doc/halvox/examples"

    def setUp(self):
        self.service, self.client = start_service(self, NO_DRIVERS)

    def run_example(self, *command):
        environment = {**self.environment(), "HALVOX_SOCKET": str(self.service.socket)}
        return subprocess.run([str(part) for part in command], capture_output=True, check=True,
                              timeout=DEADLINE, env=environment)

    def payloads(self, name):
        """Waits for a message of that name and returns the payloads of all."""
        name = f"com.tarno.halvox.{name}"
        return wait_for(name, lambda: [payload for found, payload in self.service.events() if found == name])

    def stream(self, application):
        """Waits until the store says that the only stream of the application was stopped."""
        def stopped():
            lines = self.service.ctl("streams", "--app", application, "--json").stdout.splitlines()
            return [one for one in map(json.loads, lines) if one["end"] == "stopped"]
        found, = wait_for(f"the end of {application}", stopped)
        return found


class CompiledExamplesTest(ExamplesTest):
    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        if os.environ.get("HALVOX_SANITIZE"):
            raise unittest.SkipTest("a sanitized library needs sanitized programs")
        cls.build = cls.directory / "build"
        run("cmake", "-S", cls.examples, "-B", cls.build, f"-DCMAKE_PREFIX_PATH={cls.prefix}",
            f"-DCMAKE_C_FLAGS={WARNINGS} -pedantic", f"-DCMAKE_CXX_FLAGS={WARNINGS}")
        run("cmake", "--build", cls.build)

    def test_the_player_plays_a_tone_and_reports_a_stream(self):
        played = self.run_example(self.build / "player")

        self.assertEqual((len(played.stdout), played.stderr), (48000 * 2, b""))
        stream = self.stream("com.example.player")
        self.assertEqual((stream["service"], stream["direction"]), ("longformaudio", "playback"))
        self.assertEqual(self.payloads("Session_Setup.Setup")[0]["session_selected_format"],
                         "S16LE 48000 Hz 1 ch")
        self.assertEqual(self.payloads("Volume.State")[0]["RQSessionVolume"], 0.25)
        self.assertEqual(self.payloads("Session_Playback.Stop")[0]["frames"], 48000)

    def test_the_player_says_that_nobody_answered(self):
        environment = {**self.environment(), "HALVOX_SOCKET": str(self.directory / "none.sock")}

        done = subprocess.run([str(self.build / "player")], capture_output=True, check=False,
                              timeout=DEADLINE, env=environment)

        self.assertEqual((done.returncode, done.stderr),
                         (1, b"player: 0 of 4 messages were answered\n"))

    def test_the_real_time_sender_reports_the_one_loud_block(self):
        self.run_example(self.build / "realtime_sender")

        message, = self.payloads("DSP_Performance.Simple")
        self.assertEqual((message["peak"], message["frame"], message["HostApplicationDisplayID"]),
                         (1.5, 20 * 480, "com.example.limiter"))


class ScriptExamplesTest(ExamplesTest):
    def test_the_python_program_reports_a_recording(self):
        done = self.run_example(sys.executable, self.examples / "report.py")

        self.assertEqual(done.stdout, b"reported\n")
        stream = self.stream("com.example.recorder")
        self.assertEqual((stream["service"], stream["direction"]), ("telephony", "capture"))
        self.assertEqual(self.payloads("Session_Record.Start")[0]["sample_rate"], 16000)
        self.assertEqual(self.payloads("Session_Record.Stop")[0]["seconds"], 0.5)

    def test_the_python_program_says_that_there_is_no_service(self):
        environment = {**os.environ, "HALVOX_SOCKET": str(self.directory / "none.sock")}

        done = subprocess.run([sys.executable, self.examples / "report.py"], capture_output=True, text=True,
                              check=False, timeout=DEADLINE, env=environment)

        self.assertEqual(done.returncode, 1)
        self.assertIn("report.py: Could not connect", done.stderr)

    def test_the_shell_script_reports_a_route_to_the_sessions_that_run(self):
        harness.require("busctl")
        player = start_session(self, self.service, 7)
        self.assertTrue(player.valid(7))

        done = self.run_example(self.examples / "report-route.sh", "USB headset")

        self.assertEqual(done.stdout, b"sessions: ax 1 7\n")
        self.assertEqual(self.payloads("RouteChange.State")[0]["active_devices"], "USB headset")
        sent = wait_for("the message on the session's link", lambda: [
            payload for category, _, payload in self.service.link_messages(7) if category == 10])
        self.assertEqual(sent[0]["active_devices"], "USB headset")

    def test_the_shell_script_fails_without_a_device(self):
        done = subprocess.run([self.examples / "report-route.sh"], capture_output=True, check=False,
                              timeout=DEADLINE)

        self.assertNotEqual(done.returncode, 0)
        self.assertIn(b"usage: report-route.sh DEVICE", done.stderr)


class TextfileExampleTest(ExamplesTest):
    def setUp(self):
        """The service starts after the daemon, as the documents advise."""
        self.textfiles = self.directory / self.id()
        self.textfiles.mkdir()
        self.daemon = subprocess.Popen(
            [*WITH_US, sys.executable, str(self.examples / "textfile_driver.py"), str(self.textfiles)],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        self.addCleanup(self.end_daemon)
        self.assertEqual(self.daemon.stdout.readline(), "ready\n")
        self.service, self.client = start_service(self, f'{NO_DRIVERS}textfiles = "{self.textfiles}"\n')

    def end_daemon(self):
        self.daemon.stdin.close()
        self.daemon.wait(DEADLINE)
        self.daemon.stdout.close()

    def pulse(self, microseconds):
        self.daemon.stdin.write(f"{microseconds}\n")
        self.daemon.stdin.flush()
        self.assertEqual(self.daemon.stdout.readline(), "written\n")

    def test_a_session_reports_what_the_daemon_counted_while_it_ran(self):
        self.pulse(300)
        self.client.create(1)
        self.client.start_later(1)
        self.assertTrue(self.client.valid(1))
        for latency in (400, 700, 5000):
            self.pulse(latency)
        self.client.stop(1)

        prefix = "ExampleActuator_Haptics_Stats"
        self.assertEqual(self.payloads("IOReporting.Simple")[0][f"{prefix}_Simple_pulses"], 3)
        self.assertEqual(self.payloads("IOReporting.Histogram")[0][f"{prefix}_Histogram_latency"],
                         "count=4,lower=0,upper=9223372036854775807,min=0,max=2000,unit=us::"
                         "0-500:1;500-1000:1;2000-9223372036854775807:1")


if __name__ == "__main__":
    unittest.main()
