"""halvoxctl export --format perfetto: Perfetto itself finds in the trace what the store has."""

import contextlib
import json
import os
import pty
import re
import shutil
import subprocess
import tempfile
import time
import unittest
from pathlib import Path

import perfetto
from harness import CTL, DEADLINE, Service, connect_to_store, wait_for
from player import begin_stream

SCHEMA = Path(__file__).resolve().parents[2] / "tools/export/perfetto_trace.proto"
VOLUME, PLAYBACK = 14, 0x08000004
STOP, ERROR, ISSUE, STATE = 2, 6, 7, 18
RESULTS = "private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Traces/tracing_results.ssj"
XRUNS = {7: (21.25, 40.0), 8: (3.5,)}
# The last one is still running.
APPLICATIONS = {7: "org.example.player", 8: "org.example.<browser>\u00e9", 9: "org.example.player"}


def play(client, session, application, xruns):
    """What a player reports that plays, changes its volume, has xruns and stops."""
    send = begin_stream(client, session, application, node="alsa.speakers")
    for volume in (0.75, 0.5):
        send({"RQSessionVolume": volume, "RQSessionVolumePlayingState": 1}, VOLUME, STATE)
    for milliseconds in xruns:
        send({"issue_type": "xrun", "xrun_milliseconds": milliseconds, "missed_cycles": 2,
              "quantum": 1024, "rate": 48000, "xrun_role": "victim", "device_node_name": "alsa.speakers",
              "late_node": "mixer", "late_process": "browser", "late_object_serial": 51},
             PLAYBACK, ISSUE)
    send({"code": -5}, PLAYBACK, ERROR)
    if session == 9:
        return
    send({"RQSessionVolume": 0.5, "RQSessionVolumePlayingState": 0}, VOLUME, STATE)
    send({"run": 1}, PLAYBACK, STOP)
    client.stop(session)


class PerfettoTestCase(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.stack = contextlib.ExitStack()
        cls.addClassCleanup(cls.stack.close)
        cls.directory = Path(cls.stack.enter_context(tempfile.TemporaryDirectory()))
        root = cls.directory / "root"
        state = cls.directory / "state"
        cls.service = cls.stack.enter_context(Service(
            f'[storage]\nroot = "{root}"\ndirectory = "{state}"\n'
            "[drivers]\nalsa = false\npipewire = false\n"))
        cls.service.database = state / "halvox.db"
        client = cls.service.client()
        cls.stack.callback(client.close)
        for session, application in APPLICATIONS.items():
            play(client, session, application, XRUNS.get(session, ()))

        def has_ended():
            ends = [stream["end"] for stream in cls.rows("streams")]
            return sorted(ends) == ["still running", "stopped", "stopped"]
        wait_for("the streams", has_ended, pause=0.1)
        cls.streams = {stream["session_id"]: stream for stream in cls.rows("streams")}
        cls.results = root / RESULTS
        cls.results.parent.mkdir(parents=True)
        cls.results.write_text(json.dumps({"product": "HVReporting", "version": 4, "unit": "ns",
                                           "values": {"IOStart": [1250.0, 2000.0], "None": []}}))
        cls.exported = time.time()
        cls.trace = cls.export()

    @classmethod
    def ctl(cls, *arguments):
        return cls.service.ctl(*arguments, text=False).stdout

    @classmethod
    def rows(cls, *arguments):
        if not cls.service.database.exists():
            return []
        return [json.loads(line) for line in cls.ctl(*arguments, "--json").splitlines()]

    @classmethod
    def export(cls, *arguments, name="streams.pftrace"):
        path = cls.directory / name
        cls.told = cls.ctl("export", "--format", "perfetto", "--force", "-o", path, *arguments).decode()
        return path


class SchemaTest(PerfettoTestCase):
    """What protoc reads, with our copy of the published schema."""

    @classmethod
    def setUpClass(cls):
        if not shutil.which("protoc"):
            raise unittest.SkipTest("protoc is not installed (scripts/setup installs it)")
        super().setUpClass()

    def decoded(self, path):
        with open(path, "rb") as trace:
            return subprocess.run(
                ["protoc", "--decode=perfetto.protos.Trace", f"--proto_path={SCHEMA.parent}",
                 str(SCHEMA)], stdin=trace, capture_output=True, text=True, check=True).stdout

    def test_every_field_is_one_of_the_schema(self):
        text = self.decoded(self.trace)
        unknown = [line for line in text.splitlines() if re.match(r"\s*\d+[:{ ]", line)]
        self.assertEqual(unknown, [])
        self.assertIn("primary_trace_clock: BUILTIN_CLOCK_REALTIME", text)
        self.assertEqual(text.count("name: \"xrun\"\n"), sum(map(len, XRUNS.values())))
        self.assertEqual(text.count("type: TYPE_SLICE_BEGIN"), text.count("type: TYPE_SLICE_END"))
        self.assertIn('process_name: "org.example.<browser>\\303\\251"', text)

    def test_a_summary_says_what_was_written(self):
        path = self.export(name="told.pftrace")
        self.assertEqual(self.told, f"{path}: 3 streams, 3 xruns, 2 trace intervals\n")
        [told] = self.rows("export", "--format", "perfetto", "--force", "-o", path)
        self.assertEqual(told, {"file": str(path), "streams": 3, "xruns": 3, "trace_intervals": 2})

    def test_the_standard_output_has_the_same_trace(self):
        arguments = ("--until", self.exported, "--database", self.service.database)
        path = self.export(*arguments, name="same.pftrace")
        # The first packet says when it was made.
        begin = self.decoded(path).index("track_descriptor")
        piped = self.directory / "piped.pftrace"
        piped.write_bytes(self.ctl("export", "--format", "perfetto", *arguments))
        self.assertEqual(self.decoded(piped)[begin:], self.decoded(path)[begin:])

    def test_a_terminal_gets_no_bytes_of_a_trace(self):
        master, slave = pty.openpty()
        self.addCleanup(os.close, master)
        with os.fdopen(slave, "wb") as terminal:
            result = subprocess.run([CTL, "export", "--format", "perfetto"], stdout=terminal,
                                    stderr=subprocess.PIPE, check=False, timeout=DEADLINE,
                                    env={**os.environ, "HALVOX_CONFIG": str(self.service.config)})
        self.assertEqual(result.returncode, 2)
        self.assertIn(b"is a terminal; name a file with -o", result.stderr)


class TraceProcessorTest(PerfettoTestCase):
    """What Perfetto's own importer makes of it."""

    @classmethod
    def setUpClass(cls):
        if reason := perfetto.missing():
            raise unittest.SkipTest(reason)
        super().setUpClass()
        # Each start of the engine takes seconds.
        cls.slices, cls.counters = cls.imported(cls.trace)

    SLICES = """SELECT process.name AS application, process_track.name AS track, slice.ts, slice.dur,
        slice.name, slice.depth, slice.arg_set_id AS arguments FROM slice
        JOIN process_track ON process_track.id = slice.track_id JOIN process USING (upid)
        ORDER BY slice.ts, slice.depth"""
    ARGUMENTS = "SELECT arg_set_id AS id, substr(key, 7) AS key, display_value AS value FROM args"
    COUNTERS = """SELECT process_counter_track.name AS track, unit, ts, value, process.name AS application
        FROM counter JOIN process_counter_track ON process_counter_track.id = counter.track_id
        JOIN process USING (upid) ORDER BY ts"""
    PROBLEMS = """SELECT name, value FROM stats
        WHERE value > 0 AND severity IN ('error', 'data_loss')"""

    @classmethod
    def imported(cls, path):
        """The slices with their arguments, and the counters."""
        slices, arguments, counters, problems = perfetto.Trace(path).query(
            cls.SLICES, cls.ARGUMENTS, cls.COUNTERS, cls.PROBLEMS)
        if problems:
            raise AssertionError(problems)
        for one in slices:
            one["arguments"] = {row["key"]: row["value"] for row in arguments
                                if row["id"] == one["arguments"]}
        return slices, counters

    def assert_time(self, nanoseconds, seconds):
        self.assertAlmostEqual(int(nanoseconds) / 1e9, seconds, places=5)

    def stream_slice(self, slices, session):
        [found] = [one for one in slices if one["arguments"].get("session_id") == str(session)]
        return found

    def test_streams_are_slices_in_the_process_of_their_application(self):
        for session, stream in self.streams.items():
            found = self.stream_slice(self.slices, session)
            self.assertEqual(found["application"], APPLICATIONS[session])
            self.assertEqual(found["track"], f"stream {stream['id']}, session {session}")
            self.assertEqual((found["name"], found["depth"]), ("longformaudio", 0))
            self.assert_time(found["ts"], stream["started"])
            self.assertEqual([found["arguments"][name] for name in ("end", "direction", "service")],
                             [stream["end"], "playback", "longformaudio"])
            self.assertEqual(found["arguments"]["xruns"], str(stream["xruns"]["reports"]))
            end = (int(found["ts"]) + int(found["dur"])) / 1e9
            if stream["ended"]:
                self.assertAlmostEqual(end, stream["ended"], places=5)
                self.assertAlmostEqual(float(found["arguments"]["ran_seconds"]), stream["ran_seconds"],
                                       places=5)
            else:
                self.assertGreaterEqual(end, self.exported)
        # One process for two streams of one application.
        processes, = perfetto.Trace(self.trace).query(
            "SELECT name FROM process WHERE name IS NOT NULL ORDER BY name")
        self.assertEqual([row["name"] for row in processes],
                         sorted({*APPLICATIONS.values(), "trace results"}))

    def test_runs_are_in_the_slice_of_the_stream(self):
        for session in (7, 8):
            track = self.stream_slice(self.slices, session)["track"]
            [runs] = [one for one in self.slices if one["track"] == track and one["name"] == "runs"]
            self.assertEqual(runs["depth"], 1)
            self.assertAlmostEqual(int(runs["dur"]) / 1e9, self.streams[session]["ran_seconds"], places=4)

    def test_xruns_are_those_of_sql(self):
        with connect_to_store(self.service.database) as store:
            rows = store.execute("""SELECT payload ->> 'hvreporting_timestamp', payload FROM link_messages
                WHERE payload ->> 'issue_type' = 'xrun' AND type = 7 ORDER BY 1""").fetchall()
        xruns = [one for one in self.slices if one["name"] == "xrun"]
        self.assertEqual(len(xruns), 3)
        for (stamp, payload), xrun in zip(rows, xruns, strict=True):
            payload = json.loads(payload)
            self.assert_time(xrun["ts"], stamp)
            self.assertEqual(int(xrun["dur"]), 0)
            arguments = xrun["arguments"]
            self.assertEqual(float(arguments.pop("milliseconds")), payload["xrun_milliseconds"])
            self.assertGreater(int(arguments.pop("message")), 0)
            self.assertEqual(arguments, {
                "missed_cycles": "2", "quantum": "1024", "rate": "48000", "role": "victim",
                "device": "alsa.speakers", "late_process": "browser", "late_node": "mixer",
                "late_object_serial": "51"})

    def test_volumes_are_counters(self):
        for session, values in ((7, [0.75, 0.5, 0.5, 0]), (9, [0.75, 0.5, 0])):
            track = f"volume of stream {self.streams[session]['id']}, session {session}"
            of_stream = [row for row in self.counters if row["track"] == track]
            self.assertEqual([row["value"] for row in of_stream], values)
            self.assertEqual({row["unit"] for row in of_stream}, {"linear"})
            self.assertEqual({row["application"] for row in of_stream}, {APPLICATIONS[session]})

    def test_devices_formats_and_errors_are_instants(self):
        track = self.stream_slice(self.slices, 7)["track"]
        names = [one["name"] for one in self.slices if one["track"] == track and int(one["dur"]) == 0]
        self.assertEqual(names, ["format: F32LE 48000 Hz 2 ch", "device: Speakers", "xrun", "xrun",
                                 "Session_Playback Error"])

    def test_times_are_real_times(self):
        clocks, bounds = perfetto.Trace(self.trace).query(
            "SELECT clock_name AS name, ts, clock_value AS value FROM clock_snapshot",
            "SELECT start_ts AS start, end_ts AS end FROM trace_bounds")
        self.assertEqual([(row["name"], row["ts"] == row["value"]) for row in clocks],
                         [("REALTIME", True)])
        first = min(stream["started"] for stream in self.streams.values())
        self.assertLess(abs(int(bounds[0]["start"]) / 1e9 - first), 1)
        self.assertLess(abs(int(bounds[0]["end"]) / 1e9 - self.exported), 60)

    def test_intervals_of_a_trace_are_slices_with_their_lengths(self):
        intervals = [one for one in self.slices if one["application"] == "trace results"]
        self.assertEqual([(one["name"], int(one["dur"])) for one in intervals],
                         [("IOStart", 1250), ("IOStart", 2000)])
        last = intervals[-1]
        self.assert_time(int(last["ts"]) + int(last["dur"]), self.results.stat().st_mtime)

    def test_a_time_and_an_application_select(self):
        stream = self.streams[7]
        middle = (stream["started"] + stream["ended"]) / 2
        path = self.export("--app", "*player", "--since", f"@{middle:.6f}", name="some.pftrace")
        slices, counters = self.imported(path)
        self.assertEqual({one["application"] for one in slices}, {APPLICATIONS[7]})
        self.assertEqual({one["arguments"].get("session_id") for one in slices if one["depth"] == 0},
                         {"7", "9"})
        found = self.stream_slice(slices, 7)
        self.assert_time(found["ts"], middle)
        self.assertAlmostEqual(float(found["arguments"]["started"]), stream["started"], places=3)
        self.assertGreaterEqual(min(int(row["ts"]) for row in slices + counters), int(found["ts"]))
        self.export("--until", f"@{min(one['started'] for one in self.streams.values()):.6f}",
                    "--database", self.service.database, name="none.pftrace")
        self.assertIn(": 0 streams, 0 xruns", self.told)


if __name__ == "__main__":
    unittest.main()
