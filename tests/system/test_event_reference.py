"""The page about events describes everything that the service and the reporter really record."""

import contextlib
import json
import signal
import sys
import time
import unittest
from pathlib import Path

import audio
from harness import DEADLINE, Service, stop_process, wait_for

sys.path.insert(0, str(Path(__file__).resolve().parents[1]))

from event_reference import EventReference  # noqa: E402

SESSION_GENERIC, JOULEBOOK, HAPTICS = 0x08000001, 8, 3
# Messages that this test sends itself.
OWN = "Session_Generic.Joulebook"
# Issue metrics have no keys for `fields`.
METRIC = "0x5B0003"


@unittest.skipIf(audio.missing(), audio.missing())
class EventReferenceTest(unittest.TestCase):
    def setUp(self):
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        self.stack = stack
        self.audio = stack.enter_context(audio.Audio())
        # The service finds PipeWire where a user's programs do.
        runtime = self.audio.environment["XDG_RUNTIME_DIR"]
        self.service = stack.enter_context(Service("[device]\nInternalBuild = true\n",
                                                   environment={"XDG_RUNTIME_DIR": runtime}))
        for domain, key in (("com.tarno.halvox", "device_name"),
                            ("com.tarno.pavisk", "spatial-audio-accessory-feature")):
            self.ctl("preferences", "set", domain, key, "Kitchen")
        # The second run reports that the first one was killed.
        stop_process(self.service.process, signal.SIGKILL)
        self.service.start()

    def ctl(self, *arguments):
        return self.service.ctl(*arguments).stdout

    def json(self, *arguments):
        return [json.loads(line) for line in self.ctl(*arguments, "--json").splitlines()]

    def fields(self):
        return self.json("fields") if self.service.database.exists() else []

    def wait_for_events(self, *names):
        for name in names:
            wait_for(f"{name} in the store", lambda name=name: any(
                place["name"] == name for field in self.fields() for place in field["in"]), 60)

    def run_haptics(self):
        """A client whose messages make power events and a capture."""
        client = self.service.client()
        client.create(7)
        client.set_type(HAPTICS, 7)
        client.start_later(7)
        for message in ({"EngineOnTime": 4.5},
                        {"Haptic_Active_Hardware_Time_Seconds": 1.0, "Active_Clients": 2},
                        {"Haptic_Active_Hardware_Time_Seconds": 2.0}):
            client.send(message, SESSION_GENERIC, JOULEBOOK, [7])
        client.stop(7)
        client.close()
        self.wait_for_events("Oxbow_Haptics", "LeakedHapticsSessionInfo", "snapshot",
                             "com.tarno.halvox.hvreportingclientuptime")

    def run_streams(self):
        """Playback at two volumes and capture, both with a glitch."""
        self.stack.enter_context(audio.Reporter(self.audio, self.service))
        player = self.audio.play(120, volume=0.5)
        self.stack.callback(stop_process, player)
        recorder = self.audio.run("pw-record", "-P", "{ stream.capture.sink=true }",
                                  self.audio.directory / "out.wav")
        self.stack.callback(stop_process, recorder)
        self.wait_for_events("Volume.State")
        began = time.monotonic()
        self.wait_for_events("Session_Record.Start", "RouteChange.State")
        # Only a time of more than half a second at one volume is summarised.
        wait_for("the time at that volume", lambda: time.monotonic() - began > 0.6)
        control = self.audio.run("pw-cli", "s", "pw-play", "Props", "{ volume: 0.25 }")
        self.assertEqual(control.wait(DEADLINE), 0)
        player.send_signal(signal.SIGSTOP)
        self.wait_for_events("Session_Playback.IssueDetector", "Session_Record.IssueDetector")
        player.send_signal(signal.SIGCONT)
        stop_process(recorder, signal.SIGINT)
        stop_process(player)
        self.wait_for_events("Session_Record.Stop", "Session_Playback.Stop", "Volume.Summary")
        self.play_until_recorded("IOReporting.Simple", "IOReporting.Histogram", "IOReporting.State")

    def play_until_recorded(self, *names):
        """A session reports what the driver counted during it. On a busy machine that may be nothing,
        for instance because its readings came late."""
        recorded = set()
        for _ in range(10):
            recorded = {place["name"] for field in self.fields() for place in field["in"]}
            if recorded.issuperset(names):
                return
            player = self.audio.play(120)
            self.stack.callback(stop_process, player)
            began = time.monotonic()
            wait_for("some cycles of the stream", lambda began=began: time.monotonic() - began > 2)
            stop_process(player)
        self.fail(f"{set(names) - recorded} were never recorded")

    def test_everything_that_is_recorded_is_described(self):
        reference = EventReference()
        self.wait_for_events("com.tarno.reporting.lastrun")
        self.run_haptics()
        self.run_streams()

        seen = {}
        for field in self.fields():
            places = [place["name"] for place in field["in"] if place["name"] != OWN]
            for event in places:
                seen.setdefault(event, set()).add(field["key"])
            described = {event: reference.types_of(event, field["key"]) for event in places}
            self.assertNotIn(None, described.values(),
                             f"{field['key']} is not described in {described}")
            if OWN not in [place["name"] for place in field["in"]]:
                allowed = set().union(*described.values())
                # A number whose value is whole is stored as an integer.
                if "number" in allowed:
                    allowed.add("integer")
                self.assertLessEqual(set(field["types"]), allowed, field["key"])
        self.check_that_nothing_else_is_described(reference, seen)

    def check_that_nothing_else_is_described(self, reference, seen):
        self.assertTrue(self.json("metrics", "--id", METRIC))
        self.assertEqual(set(reference.events) - {METRIC}, set(seen))
        for event, keys in seen.items():
            for described in reference.events[event]:
                if described.is_always:
                    self.assertTrue(any(map(described.matches, keys)), f"{described.name} in {event}")


if __name__ == "__main__":
    unittest.main()
