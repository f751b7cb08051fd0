"""Real streams of a private PipeWire, from the application to the service's store."""

import signal
import time
import unittest

import audio
from harness import stop_process, wait_for


def message(events, name):
    """The payloads of the messages with that name, under the event name that all services share."""
    return [payload for event, payload in events if event == f"com.tarno.halvox.{name}"]


@unittest.skipIf(audio.missing(), audio.missing())
class RealAudioTest(audio.ReporterTestCase):
    def wait_for_message(self, name, count=1):
        return wait_for(f"{count} of {name} in the store", lambda: (
            found := message(self.service.events(), name)) and len(found) >= count and found)

    def volumes(self):
        return [(payload["RQSessionVolume"], payload["RQSessionVolumePlayingState"])
                for payload in message(self.service.events(), "Volume.State")]

    def test_playback_is_recorded_under_both_names_with_its_volumes(self):
        # Long enough for everything that follows; it is stopped afterwards.
        began = time.monotonic()
        player = self.play(60, volume=0.5, role="Music")
        self.wait_for_message("Volume.State")
        seen = time.monotonic()
        control = self.audio.run("pw-cli", "s", "pw-play", "Props", "{ volume: 0.25 }")
        self.assertEqual(control.wait(30), 0)
        self.wait_for_message("Volume.State", 2)
        least = time.monotonic() - seen
        stop_process(player)
        stop = self.wait_for_message("Session_Playback.Stop")[0]
        most = time.monotonic() - began

        self.assertEqual(self.volumes(), [(0.5, 1), (0.25, 1), (0.25, 0)])
        names = [name for name, _ in self.service.events()]
        self.assertEqual([name.replace("com.tarno.halvox.", "com.tarno.longformaudio.")
                          for name in names[::2]], names[1::2])
        start = message(self.service.events(), "Session_Playback.Start")[0]
        played = stop["hvreporting_timestamp"] - start["hvreporting_timestamp"]
        self.assertTrue(least <= played <= most, (least, played, most))
        self.assertEqual(start["HostApplicationDisplayID"], "pw-play")
        route = message(self.service.events(), "RouteChange.State")[0]
        self.assertEqual(route["active_devices"], "Demo speakers")

    def test_a_sandboxed_application_is_recorded_under_the_id_of_its_sandbox(self):
        player = audio.Player(self.audio, "anything", 1024, "org.example.Sandboxed")
        self.stack.callback(player.stop)

        start = self.wait_for_message("Session_Playback.Start")[0]

        self.assertEqual(start["HostApplicationDisplayID"], "org.example.Sandboxed")
        self.assertIn("portal_app_id = org.example.Sandboxed;", self.reporter.log())

    def test_capture_is_recorded(self):
        recorder = self.audio.run("pw-record", "--media-role", "Communication", "-P",
                                  "{ stream.capture.sink=true }", self.audio.directory / "out.wav")
        self.stack.callback(stop_process, recorder)
        self.wait_for_message("Session_Record.Start")
        stop_process(recorder, signal.SIGINT)
        self.wait_for_message("Session_Record.Stop")

        names = [name for name, _ in self.service.events()]
        self.assertIn("com.tarno.telephony.Session_Record.Start", names)

    def test_a_stream_is_still_reported_after_the_service_was_killed(self):
        player = self.play(30, volume=0.5)
        self.wait_for_message("Volume.State")
        self.service.stop(signal.SIGKILL)
        self.service.start()
        self.wait_for_message("Volume.State", 2)
        stop_process(player)
        self.wait_for_message("Session_Playback.Stop")

        self.assertEqual(self.volumes(), [(0.5, 1), (0.5, 1), (0.5, 0)])
        self.assertEqual(len(message(self.service.events(), "Session_Playback.Start")), 1)

    def test_sessions_end_with_pipewire_and_new_ones_are_made_when_it_returns(self):
        self.play(30)
        self.wait_for_message("Session_Playback.Start")
        self.audio.restart()
        self.wait_for_message("Session_Playback.Stop")
        wait_for("the reporter to follow PipeWire again",
                 lambda: self.reporter.log().count("following PipeWire") == 2)
        self.play(30)
        self.wait_for_message("Session_Playback.Start", 2)
        self.assertEqual(len(self.reporters()), 1)

    def test_a_terminated_reporter_stops_and_destroys_its_sessions(self):
        for number in (signal.SIGTERM, signal.SIGINT):
            with self.subTest(signal=number):
                self.assert_ends_its_sessions_on(number)
                self.reporter = self.stack.enter_context(audio.Reporter(self.audio, self.service))

    def assert_ends_its_sessions_on(self, number):
        before = len(message(self.service.events(), "Session_Playback.Stop"))
        player = self.play(30)
        self.wait_for_message("Session_Playback.Start", before + 1)

        self.assertEqual(stop_process(self.reporter.process, number), 0)

        self.wait_for_message("Session_Playback.Stop", before + 1)
        self.assertEqual(self.reporters(), [])
        stop_process(player)

    def test_a_reporter_sleeps_while_its_streams_only_run(self):
        stop_process(self.reporter.process)
        self.reporter = self.stack.enter_context(
            audio.Reporter(self.audio, self.service, "--no-xruns"))
        self.play(30)
        self.wait_for_message("Volume.State")
        wait_for("the reporter to become idle", lambda: self.wake_ups(seconds=0.5) == 0)

        self.assertEqual(self.wake_ups(seconds=2), 0)

    def test_what_a_stalled_player_missed_is_recorded_as_an_issue(self):
        player = self.play(30)
        self.wait_for_message("Volume.State")
        player.send_signal(signal.SIGSTOP)
        issues = self.wait_for_message("Session_Playback.IssueDetector", 2)
        player.send_signal(signal.SIGCONT)

        self.assertEqual({(issue["issue_type"], issue["node"], issue["rtaid_client"])
                          for issue in issues}, {("xrun", "pw-play", "pw-play")})
        self.assertGreater(min(issue["any_channel_silence_seconds"] for issue in issues), 0)

    def test_watching_for_xruns_wakes_a_few_times_a_second(self):
        self.play(30)
        self.wait_for_message("Volume.State")

        self.assertLess(self.wake_ups(seconds=3) / 3, 60)

    def wake_ups(self, seconds):
        before = self.reporter.voluntary_switches()
        time.sleep(seconds)
        return self.reporter.voluntary_switches() - before

    def reporters(self):
        client = self.service.client()
        self.addCleanup(client.close)
        return client.reporters()


if __name__ == "__main__":
    unittest.main()
