"""What PipeWire's sinks count during a session reaches the store, with a real PipeWire."""

import contextlib
import json
import re
import subprocess
import time
import unittest
from pathlib import Path

import audio
from harness import Service, connect_to_store, require, stop_process, wait_for

SINK = "demo-speakers_Speaker_PipeWire_"
GENERIC = 1
SECONDS = 5
# The name of the thread that follows PipeWire, as the kernel shows it.
THREAD = "halvox-pipewire"
# PipeWire reports cycles in batches, at least one batch in this number of seconds.
BATCH = 1.0


@unittest.skipIf(audio.missing(), audio.missing())
class DriverStatisticsTest(unittest.TestCase):
    def setUp(self):
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        self.stack = stack
        self.audio = stack.enter_context(audio.Audio())
        self.service = self.start_service()
        self.client = self.service.client()
        stack.callback(self.client.close)

    def start_service(self):
        # The service finds PipeWire where a user's programs do. Its own socket is elsewhere and has
        # a full path.
        runtime = self.audio.environment["XDG_RUNTIME_DIR"]
        return self.stack.enter_context(Service(environment={"XDG_RUNTIME_DIR": runtime}))

    def play(self, seconds):
        player = self.audio.play(seconds)
        self.stack.callback(stop_process, player)
        return player

    def start_session(self, reporter):
        self.client.create(reporter)
        self.client.set_type(GENERIC, reporter)
        self.client.configure({"test": "driver statistics"}, reporter)
        # The answer comes when the session ends. The next answer shows that the session has
        # started.
        self.client.start_later(reporter)
        self.assertTrue(self.client.valid(reporter))

    def end_session(self, reporter):
        self.client.stop(reporter)

    def statistics(self, kind):
        """The payloads of that type in the store, oldest first."""
        return [payload for name, payload in self.service.events()
                if name == f"com.tarno.halvox.IOReporting.{kind}"]

    def wait_for_statistics(self, kind, count=1):
        return wait_for(f"{count} IOReporting messages of type {kind}", lambda: (
            found := self.statistics(kind)) and len(found) >= count and found)[count - 1]

    def sink_state(self):
        dump = subprocess.run(["pw-cli", "info", "demo-speakers"], env=self.audio.environment,
                              capture_output=True, text=True, timeout=30).stdout
        return re.search(r'state: "(\w+)"', dump)[1]

    def wait_for_sink(self, *states):
        wait_for(f"the sink to be {' or '.join(states)}", lambda: self.sink_state() in states)

    def wait_until_all_is_told(self):
        self.wait_for_sink("idle", "suspended")
        wait_for("the last cycles to be reported", lambda: self.wake_ups_during(1.5 * BATCH) == 0)

    def cycle_length(self, player):
        """The seconds of a cycle while the player runs, measured with PipeWire's own tool."""
        log = self.audio.directory / "profiler.log"
        profiler = self.audio.run("pw-profiler", "-o", log)
        self.assertEqual(player.wait(30), 0)
        stop_process(profiler)
        # The fourth column is the clock, in microseconds.
        return float(log.read_text().splitlines()[0].split("\t")[3]) / 1e6

    def wake_ups(self):
        """How often the thread that follows PipeWire has gone to sleep so far."""
        for task in Path(f"/proc/{self.service.process.pid}/task").iterdir():
            if (task / "comm").read_text().strip() == THREAD:
                status = (task / "status").read_text()
                return int(re.search(r"^voluntary_ctxt_switches:\s*(\d+)", status, re.M)[1])
        raise AssertionError(f"the service has no thread {THREAD}")

    def wake_ups_during(self, seconds):
        before = self.wake_ups()
        time.sleep(seconds)
        return self.wake_ups() - before

    def test_a_session_that_spans_a_playback_ends_with_what_the_sink_counted(self):
        require("pw-profiler")
        self.wait_for_sink("idle", "suspended")
        self.audio.tone(SECONDS)
        self.start_session(1)
        start = time.monotonic()
        length = self.cycle_length(self.play(SECONDS))
        self.wait_for_sink("idle", "suspended")
        # A busy machine misses cycles, and a playback then takes longer than its sound.
        longest = time.monotonic() - start
        self.wait_until_all_is_told()
        self.end_session(1)

        simple = self.wait_for_statistics("Simple")
        cycles = simple[SINK + "Simple_cycles"]
        self.assertGreaterEqual(cycles * length, 0.95 * SECONDS)
        self.assertLessEqual(cycles * length, 1.05 * longest)
        xruns = simple.get(SINK + "Simple_xruns", 0)
        self.check_histogram("busytime", cycles, xruns)
        self.check_histogram("waittime", cycles, xruns)
        self.check_state(cycles * length, longest)
        self.check_link()

    def check_link(self):
        """The same message was sent to the real-time link."""
        query = "SELECT type, payload FROM link_messages WHERE category = 12"

        def sent():
            with connect_to_store(self.service.database) as store:
                return {kind: json.loads(payload) for kind, payload in store.execute(query)}

        messages = wait_for("three messages on the link", lambda: len(found := sent()) == 3 and found)
        for number, kind in ((16, "Simple"), (17, "Histogram"), (18, "State")):
            stored = self.statistics(kind)[0]
            self.assertEqual({key: messages[number][key] for key in stored if key.startswith(SINK)},
                             {key: value for key, value in stored.items() if key.startswith(SINK)})

    def check_histogram(self, name, cycles, xruns):
        text = self.wait_for_statistics("Histogram")[SINK + f"Histogram_{name}"]
        head, buckets = re.fullmatch(
            r"count=11,lower=0,upper=9223372036854775807,(min=\d+,max=\d+),unit=us::(.+)", text).groups()
        smallest, greatest = (int(part.split("=")[1]) for part in head.split(","))
        parts = [re.fullmatch(r"(\d+)-(\d+):(\d+)", part).groups() for part in buckets.split(";")]
        lower, upper, hits = zip(*((int(number) for number in part) for part in parts))
        # The first cycle of a node has no times, and a missed one may have none.
        self.assertLessEqual(sum(hits), cycles, text)
        self.assertGreaterEqual(sum(hits), cycles - 2 - xruns, text)
        # The last bucket is open: only its lower bound is known.
        highest = lower[-1] if upper[-1] == 9223372036854775807 else upper[-1]
        self.assertEqual((smallest, greatest), (lower[0], highest), text)

    def check_state(self, seconds, longest):
        text = self.wait_for_statistics("State")[SINK + "State_state"]
        states = {name: (int(transitions), int(residency) / 1e6, float(duty)) for
                  name, transitions, residency, duty in re.findall(
                      r"name:(\w+),transition:(\d+),residency:(\d+),duty_cycle:([\d.]+);", text)}
        transitions, residency, duty = states["running"]
        self.assertEqual(transitions, 1, text)
        # The state comes from the sink and the cycles from the profiler: two independent measures
        # of the same time. They differ by the cycles that a busy machine missed.
        self.assertGreaterEqual(residency, 0.95 * seconds, text)
        self.assertLessEqual(residency, 1.05 * longest, text)
        total = sum(state[1] for state in states.values())
        self.assertAlmostEqual(duty, residency / total, delta=0.01, msg=text)
        self.assertAlmostEqual(sum(state[2] for state in states.values()), 1, delta=0.01, msg=text)

    def test_a_session_without_playback_reports_no_cycles(self):
        self.wait_for_sink("idle", "suspended")
        self.start_session(1)
        self.end_session(1)

        # The state is reported nevertheless.
        self.assertIn(SINK + "State_state", self.wait_for_statistics("State"))
        self.assertEqual(self.statistics("Simple"), [])
        self.assertEqual(self.statistics("Histogram"), [])

    def test_nothing_wakes_the_service_while_no_session_is_open(self):
        self.play(30)
        self.wait_for_sink("running")
        wait_for("the thread to become idle", lambda: self.wake_ups_during(0.5) == 0)
        self.assertEqual(self.wake_ups_during(2 * BATCH), 0)

        self.start_session(1)
        wait_for("cycles to be reported", lambda: self.wake_ups_during(3 * BATCH) >= 2)
        self.end_session(1)
        wait_for("the thread to become idle again", lambda: self.wake_ups_during(0.5) == 0)
        self.assertEqual(self.wake_ups_during(2 * BATCH), 0)
        self.assertEqual(self.sink_state(), "running")

    def test_sessions_at_once_count_what_each_spans(self):
        def play_during(session):
            self.start_session(session)
            self.assertEqual(self.play(1).wait(30), 0)
            self.wait_until_all_is_told()
            self.end_session(session)
            return self.wait_for_statistics("Simple", session)[SINK + "Simple_cycles"]

        self.start_session(3)
        first = play_during(1)
        second = play_during(2)
        self.end_session(3)
        both = self.wait_for_statistics("Simple", 3)[SINK + "Simple_cycles"]

        # The playbacks may take longer than their sound. Therefore only the sum is certain.
        self.assertGreater(min(first, second), 0)
        self.assertEqual(both, first + second)

    def test_a_pipewire_that_restarts_is_found_again_and_counted(self):
        self.start_session(1)
        self.audio.restart()
        wait_for("the service to follow PipeWire again",
                 lambda: self.service.log().count("following PipeWire") == 2)
        self.assertEqual(self.play(1).wait(30), 0)
        self.wait_until_all_is_told()
        self.end_session(1)

        simple = self.wait_for_statistics("Simple")
        self.assertGreater(simple[SINK + "Simple_cycles"], 0)
        self.assertEqual(simple["pipewire_Speaker_PipeWire_Simple_connections"], 1)
        self.assertEqual(simple["pipewire_Rx_PipeWire_Simple_connections"], 1)


if __name__ == "__main__":
    unittest.main()
