"""halvoxctl streams: what the store says of sessions of the real service, and of real audio."""

import json
import re
import signal
import unittest

import audio
from harness import Service, stop_process, wait_for
from terminal import lines_at_terminal

SESSION_PLAYBACK = 0x08000004
VOLUME = 14
START, STOP, ISSUE, STATE = 1, 2, 7, 18

SQL_XRUNS = """
SELECT count(*) AS reports, ifnull(sum(payload ->> 'xrun_milliseconds'), 0) AS lost
FROM analytics_events
WHERE name LIKE 'com.tarno.halvox.%.IssueDetector' AND payload ->> 'issue_type' = 'xrun'"""
SQL_VOLUMES = """
SELECT payload ->> 'HostApplicationDisplayID' AS application, payload ->> 'RQSessionVolume' AS volume,
       sum(payload ->> 'play_seconds') AS seconds
FROM analytics_events WHERE name = 'com.tarno.halvox.Volume.Summary' GROUP BY 1, 2 ORDER BY 1, 2"""


class StreamsTest(unittest.TestCase):
    def setUp(self):
        self.service = Service("[drivers]\nalsa = false\npipewire = false\n")
        self.service.__enter__()
        self.addCleanup(self.service.__exit__)

    def ctl(self, *arguments, **options):
        return self.service.ctl(*arguments, **options)

    def json(self, *arguments):
        return [json.loads(line) for line in self.ctl(*arguments, "--json").stdout.splitlines()]

    def streams(self, *arguments):
        return self.json("streams", *arguments)

    def wait_for_ends(self, count):
        return wait_for(f"{count} streams to have ended", lambda: (
            found := self.streams()) and len(found) >= count
            and all(stream["ended"] for stream in found) and found)

    def client(self):
        client = self.service.client()
        self.addCleanup(client.close)
        return client

    def begin(self, client, session, application="player"):
        client.begin(session, 7, application)
        client.send({"run": 1}, SESSION_PLAYBACK, START, [session])

    def set_volume(self, client, session, volume, playing):
        client.send({"RQSessionVolume": volume, "RQSessionVolumePlayingState": int(playing)},
                    VOLUME, STATE, [session])

    def end(self, client, session):
        client.send({"run": 1}, SESSION_PLAYBACK, STOP, [session])
        client.stop(session)

    def test_totals_are_those_of_sql(self):
        client = self.client()
        for session in (7, 8):
            self.begin(client, session, f"app{session}")
            self.set_volume(client, session, 0.5, True)
        for session, milliseconds in ((7, 1.5), (7, 1.5), (8, 40)):
            client.send({"issue_type": "xrun", "xrun_milliseconds": milliseconds, "missed_cycles": 2,
                         "xrun_role": "victim"}, SESSION_PLAYBACK, ISSUE, [session])
        # The service reports only what took longer than a second.
        time_before = wait_for("the first messages", lambda: self.json(
            "sql", "SELECT max(time) AS time FROM halvox_events")[0]["time"])
        wait_for("a second to pass", lambda: self.now() - time_before > 1.2)
        self.set_volume(client, 7, 0.25, True)
        self.set_volume(client, 7, 0.25, False)
        self.set_volume(client, 8, 0.5, False)
        for session in (7, 8):
            self.end(client, session)
        streams = self.wait_for_ends(2)

        self.assertEqual([stream["session_id"] for stream in streams], [7, 8])
        self.assertEqual([stream["end"] for stream in streams], ["stopped", "stopped"])
        self.assertEqual([stream["xruns"]["as_victim"] for stream in streams], [2, 1])
        counted = self.json("sql", SQL_XRUNS)[0]
        self.assertEqual(sum(stream["xruns"]["reports"] for stream in streams), counted["reports"])
        self.assertEqual(sum(stream["xruns"]["milliseconds"] for stream in streams), counted["lost"])
        reported = self.json("sql", SQL_VOLUMES)
        self.assertEqual(len(reported), 2)
        for row, stream in zip(reported, streams):
            volume = stream["volumes"][0]
            self.assertEqual((row["application"], row["volume"]),
                             (stream["application"], volume["volume"]))
            self.assertAlmostEqual(row["seconds"], volume["seconds"], places=4)

    def now(self):
        self.ctl("send", "--id", 7, "--category", "Playback", "--type", "Simple", "{}")
        return self.json("sql", "SELECT max(time) AS time FROM halvox_events")[0]["time"] or 0

    def test_a_stream_that_runs_is_shown_as_running(self):
        client = self.client()
        self.begin(client, 7)
        stream = wait_for("the stream", self.streams)[0]
        self.assertEqual((stream["end"], stream["ended"]), ("still running", None))
        self.end(client, 7)
        self.assertEqual(self.wait_for_ends(1)[0]["id"], stream["id"])

    def test_a_client_that_vanishes_is_gone(self):
        client = self.client()
        self.begin(client, 7)
        wait_for("the stream", self.streams)
        client.close()
        # The end of the session is recorded a moment before that of its client.
        wait_for("the client to be gone", lambda: [
            stream["end"] for stream in self.streams()] == ["client gone"])

    def test_a_service_that_is_killed_is_gone(self):
        self.begin(self.client(), 7)
        wait_for("the stream", self.streams)
        self.service.stop(signal.SIGKILL)
        self.assertEqual([stream["end"] for stream in self.streams()], ["service gone"])
        self.service.start()
        self.begin(self.client(), 7)
        streams = wait_for("the second stream", lambda: len(found := self.streams()) == 2 and found)
        self.assertEqual([stream["end"] for stream in streams], ["service gone", "still running"])

    def test_filters_select(self):
        client = self.client()
        for session in (7, 8):
            self.begin(client, session, f"app{session}")
            client.send({"active_devices": f"Device {session}", "device_node_names": [f"node.{session}"]},
                        10, STATE, [session])
        client.send({"issue_type": "xrun"}, SESSION_PLAYBACK, ISSUE, [8])
        for session in (7, 8):
            self.end(client, session)
        self.wait_for_ends(2)
        self.assertTrue(wait_for("the xrun", lambda: self.streams("--glitched")))

        def shown(*arguments):
            return [stream["session_id"] for stream in self.streams(*arguments)]

        self.assertEqual(shown("--app", "app7"), [7])
        self.assertEqual(shown("--app", "app*"), [7, 8])
        self.assertEqual(shown("--device", "Device 8"), [8])
        self.assertEqual(shown("--device", "node.7", "--device", "*8"), [7, 8])
        self.assertEqual(shown("--glitched"), [8])
        self.assertEqual(shown("--last", "1"), [8])
        self.assertEqual(shown("--since", "1h"), [7, 8])
        self.assertEqual(shown("--until", "1h"), [])

    def test_show_tells_the_story(self):
        client = self.client()
        self.begin(client, 7)
        self.set_volume(client, 7, 0.5, True)
        client.send({"issue_type": "xrun", "xrun_milliseconds": 21.3, "missed_cycles": 2,
                     "xrun_role": "victim", "late_node": "browser", "late_process": "web"},
                    SESSION_PLAYBACK, ISSUE, [7])
        self.end(client, 7)
        stream = self.wait_for_ends(1)[0]

        text = self.ctl("streams", "show", stream["id"]).stdout
        self.assertIn("It lost 21 ms in 1 xrun: 1 because another one was late.\n", text)
        self.assertIn("It lost 21 ms in 2 cycles: browser was late, of process web.\n", text)
        lines = self.json("streams", "show", 7)
        self.assertEqual(lines[0], {**stream, "moments_not_shown": 0})
        self.assertEqual([line["moment"] for line in lines[1:]],
                         ["began", "start", "volume", "xrun", "stop", "ended"])

    def test_an_unknown_stream_is_an_error(self):
        self.begin(self.client(), 7)
        wait_for("the stream", self.streams)
        result = self.ctl("streams", "show", 999, "--json", status=1)
        self.assertIn("no stream or session has the ID 999", result.stderr)
        self.assertEqual(json.loads(result.stdout)["error"]["kind"], "refused")
        self.ctl("streams", "show", "x", status=2)
        self.ctl("streams", "--database", self.service.directory / "none", status=2)

    def test_texts_of_clients_cannot_control_the_terminal(self):
        client = self.client()
        self.begin(client, 7, "a\u001b[31m\u202eb")
        client.send({"active_devices": "\u2066x\n\u0007"}, 10, STATE, [7])
        self.end(client, 7)
        stream = self.wait_for_ends(1)[0]
        for arguments in (["streams"], ["streams", "show", stream["id"]], ["streams", "--json"]):
            text = self.ctl(*arguments).stdout
            self.assertNotRegex(text.replace("\n", ""), "[\u0000-\u001f\u007f-\u009f\u202a-\u202e\u2066-\u2069]")
            self.assertIn("a\\u001b[31m\\u202eb", text.lower())
        self.assertEqual(stream["application"], "a\u001b[31m\u202eb")

    def test_a_table_fits_the_terminal(self):
        client = self.client()
        self.begin(client, 7, "an application with a long name, of which not all fits the terminal")
        client.send({"active_devices": "A device whose description is long"}, 10, STATE, [7])
        self.end(client, 7)
        self.wait_for_ends(1)
        whole = self.ctl("streams").stdout
        self.assertIn("of which not all fits", whole)
        for width in (40, 80, 120, 160):
            lines = lines_at_terminal(self.service, "streams", columns=width)
            self.assertEqual(len(lines), 2)
            for line in lines:
                self.assertLessEqual(len(line), width, line)
            self.assertTrue(width == 160 or "…" in lines[1], lines[1])


@unittest.skipIf(audio.missing(), audio.missing())
class RealStreamsTest(audio.ReporterTestCase):
    def streams(self):
        result = self.service.ctl("streams", "--json")
        return [json.loads(line) for line in result.stdout.splitlines()]

    def wait_for(self, what, condition):
        return wait_for(what, lambda: self.service.database.exists()
                        and (found := self.streams()) and condition(found) and found)

    def test_a_stream_with_a_glitch_and_two_volumes(self):
        player = self.play(60, volume=0.5)
        self.wait_for("the first volume", lambda found: found[0]["volumes"])
        player.send_signal(signal.SIGSTOP)
        self.wait_for("the glitch", lambda found: found[0]["xruns"]["reports"] > 0)
        player.send_signal(signal.SIGCONT)
        control = self.audio.run("pw-cli", "s", "pw-play", "Props", "{ volume: 0.25 }")
        self.assertEqual(control.wait(30), 0)
        self.wait_for("the second volume", lambda found: len(found[0]["volumes"]) == 2)
        stop_process(player)
        stream = self.wait_for("the end", lambda found: found[0]["ended"])[0]

        self.assertEqual(stream["end"], "stopped")
        self.assertEqual(stream["application"], "pw-play")
        self.assertEqual(stream["direction"], "playback")
        self.assertEqual([volume["volume"] for volume in stream["volumes"]], [0.5, 0.25])
        self.assertAlmostEqual(sum(volume["seconds"] for volume in stream["volumes"]),
                               stream["ran_seconds"], delta=0.1)
        self.assertEqual(stream["routes"][0]["devices"], "Demo speakers")
        self.assertTrue(re.fullmatch(r"S16LE \d+ Hz 1 ch", stream["formats"][0]["format"]))
        self.assertGreater(stream["xruns"]["milliseconds"], 0)

    def test_a_killed_reporter_is_a_client_that_is_gone(self):
        self.play(60)
        self.wait_for("the stream", lambda found: found[0]["volumes"])
        stop_process(self.reporter.process, signal.SIGKILL)
        self.wait_for("the client to be gone", lambda found: found[0]["end"] == "client gone")
