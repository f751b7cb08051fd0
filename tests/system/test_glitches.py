"""Cycles that a player misses on purpose: who was late, who suffered, and how many there were."""

import contextlib
import dataclasses
import time
import unittest

import audio
from harness import Service, require, wait_for

FRAMES = 8192
RATE = 48000
# PipeWire reports its cycles once a second, and the reporter sends at most one report a second.
SETTLED = 3
STALL = 1.5
CULPRIT, VICTIMS = "culprit", ("victim-a", "victim-b")


@dataclasses.dataclass
class Moment:
    """The reports by the name of the node, and the cycles, until a moment when no report is due."""

    reports: dict
    cycles: list

    def reports_since(self, before):
        return {name: own[len(before.reports[name]):] for name, own in self.reports.items()}

    def xruns_since(self, before):
        return self.cycles[-1][1] - before.cycles[-1][1]

    def late_since(self, before):
        """The cycles in which a node was late."""
        return [cycle for cycle in self.cycles[len(before.cycles):] if cycle[2]]


@unittest.skipIf(audio.missing(), audio.missing())
class GlitchTest(unittest.TestCase):
    def run_streams(self, counts_xruns):
        """Starts three streams on one device, and waits until they run without a glitch."""
        require("pkg-config")
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        self.audio = stack.enter_context(audio.Audio(counts_xruns))
        # The service finds PipeWire where a user's programs do.
        runtime = self.audio.environment["XDG_RUNTIME_DIR"]
        self.service = stack.enter_context(Service(environment={"XDG_RUNTIME_DIR": runtime}))
        stack.enter_context(audio.Reporter(self.audio, self.service))
        self.profile = audio.Profile(self.audio)
        stack.callback(self.profile.stop)
        self.players = {}
        for name in (CULPRIT, *VICTIMS):
            self.players[name] = audio.Player(self.audio, name, FRAMES)
            stack.callback(self.players[name].stop)
        self.serials = wait_for("the three streams to start", self.started_serials)
        self.before = wait_for("cycles without a glitch", self.settled, 120)

    def messages(self, name):
        """The payloads of the messages with that name, oldest first."""
        return [payload for event, payload in self.service.events()
                if event == f"com.tarno.halvox.{name}"]

    def started_serials(self):
        serials = [start["object_serial"] for start in self.messages("Session_Playback.Start")]
        return serials if len(serials) == 3 else None

    def reports(self):
        """The reports of missed cycles by the name of the node, oldest first."""
        reports = {name: [] for name in self.players}
        for issue in self.messages("Session_Playback.IssueDetector"):
            reports[issue["node"]].append(issue)
        return reports

    def glitches_between(self, begin, end):
        """Whether a node or the device missed a cycle between the two times of the profile."""
        cycles = self.profile.cycles()
        return any(late or xruns > cycles[place][1]
                   for place, (when, xruns, late) in enumerate(cycles[1:]) if begin < when <= end)

    def settled(self):
        """The present moment, or nothing when a report may be due: the machine may be so busy
        that cycles are missed at any time."""
        begin = time.monotonic_ns()
        self.wait_for_cycle_after(begin + SETTLED * 1_000_000_000)
        reports, end = self.reports(), time.monotonic_ns()
        self.wait_for_cycle_after(end)
        if self.glitches_between(begin, end):
            return None
        return Moment(reports, [cycle for cycle in self.profile.cycles() if cycle[0] <= end])

    def wait_for_cycle_after(self, moment):
        wait_for("the profile to go on",
                 lambda: (cycles := self.profile.cycles()) and cycles[-1][0] > moment)

    def begin_stall(self, seconds, least):
        """Lets the culprit stall and waits until the profiler shows at least that many cycles."""
        self.players[CULPRIT].stall(seconds)
        wait_for("the stall to be profiled", lambda: len(
            Moment({}, self.profile.cycles()).late_since(self.before)) >= least)

    def stall(self):
        """Lets the culprit stall. Returns the missed cycles, the xruns and the reports of that."""
        # The last cycle may be cut short by the end of the stall.
        self.begin_stall(STALL, int(STALL * RATE / FRAMES) - 2)
        return self.outcome()

    def outcome(self):
        """The missed cycles, the xruns and the reports since the streams ran without a glitch."""
        after = wait_for("cycles without a glitch", self.settled, 120)
        return (after.late_since(self.before), after.xruns_since(self.before),
                after.reports_since(self.before))

    def check_shares(self, missed, reports):
        """Each stream reports all cycles that the device missed."""
        for name, own in reports.items():
            self.assertEqual(sum(report["missed_cycles"] for report in own), len(missed), name)
            for report in own:
                self.assertAlmostEqual(report["xrun_milliseconds"],
                                       report["missed_cycles"] * FRAMES / RATE * 1000, places=3)
                self.assertAlmostEqual(report["any_channel_silence_seconds"] * 1000,
                                       report["xrun_milliseconds"], places=3)

    def check_roles(self, reports):
        """The culprit is named by all. Roles are weighed, because a busy machine may make others
        late too, but not in most cycles of the stall."""
        serial = reports[CULPRIT][0]["object_serial"]
        for name, own in reports.items():
            cycles = {}
            for report in own:
                key = report["xrun_role"], report["late_node"], report["late_object_serial"]
                cycles[key] = cycles.get(key, 0) + report["missed_cycles"]
            role = "culprit" if name == CULPRIT else "victim"
            self.assertEqual(max(cycles, key=cycles.get), (role, CULPRIT, serial), name)

    def check_circumstances(self, reports):
        for own in reports.values():
            for report in own:
                self.assertEqual(
                    (report["issue_type"], report["quantum"], report["rate"],
                     report["device_node_name"], report["late_process"]),
                    ("xrun", FRAMES, RATE, "demo-speakers", "halvox_audio_client"))
        # Two streams of one program differ in their serials.
        serials = [{report["object_serial"] for report in own} for own in reports.values()]
        self.assertEqual(sorted(serial for own in serials for serial in own), sorted(self.serials))

    def test_the_shares_add_up_to_what_the_driver_counted(self):
        self.run_streams(counts_xruns=True)

        missed, xruns, reports = self.stall()

        self.assertEqual(len(missed), xruns)
        self.check_shares(missed, reports)
        self.check_roles(reports)
        self.check_circumstances(reports)
        self.check_statistics(xruns)

    def check_statistics(self, xruns):
        """The counters of a stream's session say whose they are, and have the driver's xruns."""
        for player in self.players.values():
            player.stop()
        simple = wait_for("the counters of three sessions", lambda: (
            found := self.messages("IOReporting.Simple")) and len(found) == 3 and found)
        self.assertEqual(sorted(counters["object_serial"] for counters in simple),
                         sorted(self.serials))
        for counters in simple:
            self.assertGreaterEqual(counters["demo-speakers_Speaker_PipeWire_Simple_xruns"], xruns)
        for kind in ("Simple", "Histogram", "State"):
            for counters in self.messages(f"IOReporting.{kind}"):
                self.assertNotIn("", counters.values(), kind)

    def test_an_xrun_of_the_device_is_shared_by_all_streams_that_ran_on_it(self):
        self.run_streams(counts_xruns=True)

        self.audio.cause_xrun()

        _, counted, reports = self.outcome()
        self.assertGreater(counted, 0)
        for name, own in reports.items():
            self.assertEqual(sum(report["missed_cycles"] for report in own), counted, name)
            # A busy machine may make a player late as well.
            self.assertIn(("device", "demo-speakers"),
                          [(report["xrun_role"], report["late_node"]) for report in own])

    def test_a_culprit_that_is_killed_while_it_stalls_is_still_named(self):
        self.run_streams(counts_xruns=False)
        self.begin_stall(60, 3)

        self.players[CULPRIT].kill()

        missed, _, reports = self.outcome()
        # Its last second is lost with it, because the profiler reports late.
        self.check_shares(missed, {name: reports[name] for name in VICTIMS})
        self.check_roles(reports)

    def test_the_shares_add_up_on_a_driver_that_counts_no_xruns(self):
        self.run_streams(counts_xruns=False)

        missed, xruns, reports = self.stall()

        self.assertEqual(xruns, 0)
        self.check_shares(missed, reports)
        self.check_roles(reports)


if __name__ == "__main__":
    unittest.main()
