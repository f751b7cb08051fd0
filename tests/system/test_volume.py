"""How long a stream played at which volume, and the session summary of internal builds."""

import contextlib
import json
import os
import signal
import subprocess
import time
import unittest

import audio
import harness
from harness import CTL, Service, stop_process, wait_for

INTERNAL = "[device]\nInternalBuild = true\n"
DIRECTORY = "private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Reporting"
LONGEST_NAME = 255
# Seconds. With a sanitizer, programs need several times as long to notice a change of the volume.
TOLERANCE = 0.2 if not os.environ.get("HALVOX_SANITIZE") else 0.8

HOSTILE_NAMES = {
    "a path upwards": "../../../../../../tmp/halvox-escaped",
    "an absolute path": "/tmp/halvox-escaped",
    "this directory": ".",
    "the directory above": "..",
    "a hidden file": ".profile",
    "5,000 characters": "a" * 5000,
    "5,000 slashes": "b" + "/" * 5000,
    "5,000 dots": "." * 5000,
    "5,000 characters of several bytes": "\u97f3" * 5000,
    "control characters": "a\nb\tc\x7f\u0085d\x1b[2J",
    "a pattern": "%s%n*?[a-z]",
    "nothing": "",
    "bytes": b"../\x00\xff",
    "a number": 17,
    "a table": {"../a": "/" * 5000},
}


def summaries(service):
    """The names of the summary files that exist."""
    directory = service.directory / "state" / "root" / DIRECTORY
    return sorted(os.listdir(directory)) if directory.exists() else []


def files_outside(service):
    """All files and links below the service's directory that are not summaries, and those in /tmp."""
    found = {os.path.join(path, name) for path, _, names in os.walk(service.directory)
             for name in names if not path.endswith(DIRECTORY)}
    return {name for name in found if "halvox.db" not in name} | {
        os.path.join("/tmp", name) for name in os.listdir("/tmp") if "halvox-escaped" in name}


def shown(service, *arguments):
    """The output of halvoxctl summary for the service's summaries."""
    result = subprocess.run([CTL, "summary", *arguments], capture_output=True, text=True,
                            timeout=harness.DEADLINE,
                            env={**os.environ, "HALVOX_CONFIG": str(service.config)})
    if result.returncode != 0:
        raise AssertionError(result.stderr)
    return result.stdout


@unittest.skipIf(audio.missing(), audio.missing())
class PlayedVolumeTest(unittest.TestCase):
    def setUp(self):
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        self.service = stack.enter_context(Service(INTERNAL))
        self.audio = stack.enter_context(audio.Audio())
        stack.enter_context(audio.Reporter(self.audio, self.service))
        self.stack = stack

    def payloads(self, name):
        return [payload for event, payload in self.service.events()
                if event == f"com.tarno.halvox.{name}"]

    def control(self):
        """A pw-cli that is already connected, so that its commands take effect at once."""
        process = subprocess.Popen(["pw-cli"], env=self.audio.environment, text=True,
                                   stdin=subprocess.PIPE, stdout=subprocess.DEVNULL,
                                   stderr=subprocess.DEVNULL)
        self.stack.callback(process.stdin.close)
        self.stack.callback(stop_process, process)

        def tell(command):
            process.stdin.write(command + "\n")
            process.stdin.flush()
        return tell

    def play_at_two_volumes(self, first, then, properties="{}"):
        """A tone at volume 0.5 for some seconds and then at 0.25.

        Returns its volume messages, and the time at each volume by this process's clock, which a
        busy machine makes longer.
        """
        tell = self.control()
        player = self.audio.run("pw-play", "--volume", "0.5", "--media-role", "Music",
                                "--properties", properties, self.audio.tone(30))
        self.stack.callback(stop_process, player)
        state = wait_for("the stream to play", lambda: self.payloads("Volume.State"), pause=0.002)[0]
        begun = state["hvreporting_timestamp"]  # when the service noticed it
        time.sleep(max(begun + first - time.time(), 0))  # what is measured, not a wait
        tell("s pw-play Props { volume: 0.25 }")
        turned = time.time()
        time.sleep(then)
        player.send_signal(signal.SIGINT)
        stopped = time.time()
        player.wait(harness.DEADLINE)
        wait_for("the session's end", lambda: summaries(self.service))
        intervals = wait_for("both intervals", lambda: len(
            found := self.payloads("Volume.Summary")) >= 2 and found)
        return intervals, (turned - begun, stopped - turned)

    def test_three_seconds_at_one_volume_and_two_at_another_are_two_intervals(self):
        intervals, played = self.play_at_two_volumes(first=3, then=2)

        print("\nplayed", played, "reported", [interval["play_seconds"] for interval in intervals], flush=True)
        self.assertEqual([interval["RQSessionVolume"] for interval in intervals], [0.5, 0.25])
        for interval, seconds in zip(intervals, played, strict=True):
            self.assertAlmostEqual(interval["play_seconds"], seconds, delta=TOLERANCE)
            self.assertRegex(interval["session_selected_format"], r"^\w+ 48000 Hz 1 ch$")
            self.assertEqual(interval["active_devices"], "Demo speakers")
            self.assertEqual(interval["RQSessionVolumeOperationProcess"], "pw-cat")
        playing = [payload["RQSessionVolumePlayingState"] for payload in self.payloads("Volume.State")]
        self.assertEqual(playing, [1, 1, 0])

    def test_the_summary_of_a_stream_with_a_hostile_name_has_its_intervals(self):
        before = files_outside(self.service)
        begun = time.time()

        _, played = self.play_at_two_volumes(
            1, 1, '{ application.id = "../../../../tmp/halvox-escaped" }')

        self.assertEqual(files_outside(self.service), before)
        session = json.loads(shown(self.service, "--json"))
        self.assertEqual(session["volume_intervals"], 2)
        self.assertEqual(session["service"], "longformaudio")
        # The session is a little longer than the tones in it.
        self.assertGreater(session["seconds"], sum(played) - TOLERANCE)
        self.assertLess(session["seconds"], time.time() - begun)
        self.assertIn("longformaudio", shown(self.service))


class SummaryFileTest(unittest.TestCase):
    def service(self, config):
        service = Service(config)
        self.addCleanup(service.__exit__, None, None, None)
        return service.start()

    def run_session(self, service, reporter, name):
        client = service.client()
        self.addCleanup(client.close)
        client.create(reporter)
        client.configure({"HostApplicationDisplayID": name}, reporter)
        client.start_later(reporter)
        client.send({"name": name}, reporters=[reporter])
        self.assertIs(client.stop(reporter), True)

    def test_no_application_name_leaves_the_directory_or_the_summary_out(self):
        service = self.service(INTERNAL)
        before = files_outside(service)
        for reporter, (what, name) in enumerate(HOSTILE_NAMES.items(), start=1):
            with self.subTest(name=what):
                known = set(summaries(service))
                self.run_session(service, reporter, name)
                new = set(summaries(service)) - known

                self.assertEqual(len(new), 1)
                self.assertRegex(new.pop(), r"(?s)^\d{8}-\d{6}[+-]\d{4}-halvox-[^/\x00-\x1f\x7f]*\.json$")
        self.assertEqual(files_outside(service), before)
        self.assertLessEqual(max(len(os.fsencode(name)) for name in summaries(service)), LONGEST_NAME)
        sessions = shown(service, "--json", "--last", "100").splitlines()
        self.assertEqual(len(sessions), len(HOSTILE_NAMES))
        self.assertEqual({json.loads(session)["messages"] for session in sessions}, {1})

    def test_builds_that_are_not_internal_leave_no_summary(self):
        service = self.service("")

        self.run_session(service, 1, "com.example.player")

        self.assertEqual(summaries(service), [])
        with self.assertRaisesRegex(AssertionError, "on internal builds only"):
            shown(service)


if __name__ == "__main__":
    unittest.main()
