"""Why messages are where they are."""

import json
import signal
import unittest

from harness import start_service, wait_for

SESSION_PLAYBACK, SESSION_GENERIC, VOLUME, ERROR = 0x08000004, 0x08000001, 14, 11
START, STOP, ISSUE, JOULEBOOK, STATE = 1, 2, 7, 8, 18
HAPTICS, LONG_FORM, TEST = 3, 7, 11


class Explaining(unittest.TestCase):
    config = ""

    def setUp(self):
        self.service, self.client = start_service(self, self.config)

    def session(self, reporter, service_type=LONG_FORM, application="player"):
        self.client.begin(reporter, service_type, application)

    def ctl(self, *arguments, **options):
        return self.service.ctl(*arguments, **options)

    def explain(self, target):
        lines = self.ctl("explain", target, "--json", "--socket", self.service.socket).stdout.splitlines()
        return [json.loads(line) for line in lines]

    def sinks(self, explanation):
        return {sink["sink"]: sink for sink in explanation["sinks"]}

    def wait_for_link(self, session, count):
        wait_for(f"{count} link messages", lambda: len(self.service.link_messages(session)) >= count)

    def record(self, target, sink):
        """The ID of the newest record in a sink."""
        return self.sinks(self.explain(target)[0])[sink]["record"]


class ExplainTest(Explaining):
    def test_an_event_shows_what_its_messages_did(self):
        self.session(7)
        for n in (1, 1, 2, 2, 2):
            self.client.send({"n": n}, SESSION_PLAYBACK, START, [7])
        self.wait_for_link(7, 2)
        self.service.wait_for_events(10)

        [event] = self.explain("com.tarno.longformaudio.Session_Playback.Start")

        self.assertEqual(event["explains"], "event")
        sinks = self.sinks(event)
        self.assertEqual(sinks["events, name of all services"]["messages"], 5)
        self.assertEqual(sinks["events, name of the service type"]["messages"], 5)
        self.assertEqual(sinks["link, in a session"]["messages"], 2)
        self.assertIn("Dropped by the session, because they repeat", sinks["link, in a session"]["why"])
        self.assertEqual(sinks["power log"]["took"], "no")
        self.assertIn("A service has this store open.", " ".join(event["unknown"]))

    def test_a_record_names_the_message_that_it_repeats(self):
        self.session(7)
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.wait_for_link(7, 1)
        self.service.wait_for_events(4)
        newest = self.record("Session_Playback.Start", "events, name of all services")

        found = [one for one in self.explain(newest) if one["explains"] == "record"]
        sinks = self.sinks(found[0])
        link = sinks["link, in a session"]
        self.assertEqual(link["took"], "no")
        self.assertRegex(link["why"], r"Session 7 dropped it: it repeats record \d+\.")
        self.assertEqual(sinks["events, name of all services"]["took"], "yes")
        self.assertEqual(sinks["summary of the session"]["took"], "no")

    def sentences(self, record):
        found = [one for one in self.explain(record) if one["explains"] == "record"]
        return " ".join(found[0]["sessions"])

    def test_no_session_is_named_if_several_may_have_dropped_a_message(self):
        for session in (7, 8):
            self.session(session)
            self.client.send({"n": 1}, SESSION_PLAYBACK, START, [session])
            self.wait_for_link(session, 1)
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.service.wait_for_events(6)
        newest = self.record("Session_Playback.Start", "events, name of all services")

        sentences = self.sentences(newest)
        self.assertIn("The store does not show which of them dropped this one.", sentences)
        self.assertNotRegex(sentences, "Session [78] dropped")
        for session in (7, 8):
            found = [one for one in self.explain(session) if one["explains"] == "session"][0]
            self.assertIn("1 further message cannot be attributed", " ".join(found["unknown"]))

    def test_a_message_after_the_service_was_killed_is_not_said_to_differ(self):
        self.session(7)
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.wait_for_link(7, 1)
        first = self.record("Session_Playback.Start", "link, in a session")
        self.service.stop(signal.SIGKILL)
        self.service.start()
        self.client = self.service.client()
        self.addCleanup(self.client.close)
        self.session(7)
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.wait_for_link(7, 2)
        newest = self.record("Session_Playback.Start", "link, in a session")

        self.assertNotEqual(newest, first)
        sentences = self.sentences(newest)
        self.assertIn("but the session did not drop it", sentences)
        self.assertNotIn("differs", sentences)

    def test_the_summary_took_what_its_session_recorded(self):
        self.session(7)
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.service.wait_for_events(2)
        self.wait_for_link(7, 1)
        newest = self.record("Session_Playback.Start", "events, name of all services")
        before = [one for one in self.explain(newest) if one["explains"] == "record"][0]
        self.assertEqual(self.sinks(before)["summary of the session"]["took"], "unknown")

        self.client.stop(7)
        self.wait_for_link(7, 2)

        after = [one for one in self.explain(newest) if one["explains"] == "record"][0]
        summary = self.sinks(after)["summary of the session"]
        self.assertEqual(summary["took"], "yes", summary)
        self.assertGreater(summary["record"], 0)

    def test_errors_are_no_repetitions(self):
        self.session(7)
        for _ in range(2):
            self.client.send({"n": 1}, ERROR, STATE, [7])
        self.wait_for_link(7, 2)
        self.service.wait_for_events(4)
        [event] = self.explain("Error.State")
        self.assertEqual(self.sinks(event)["link, in a session"]["messages"], 2)
        self.assertIn("never drop them", " ".join(event["sessions"]))

    def test_the_power_log_and_the_metrics_are_named_by_their_records(self):
        self.session(8, HAPTICS)
        self.client.send({"EngineOnTime": 4.5}, SESSION_GENERIC, JOULEBOOK, [8])
        self.client.send({"issue_type": "glitch", "node": "mixer"}, SESSION_PLAYBACK, ISSUE, [8])
        self.service.wait_for_events(4)
        wait_for("the power event", lambda: self.ctl("power").stdout)
        wait_for("the metric", lambda: self.ctl("metrics").stdout)
        for name, sink in (("Session_Generic.Joulebook", "power log"),
                           ("Session_Playback.IssueDetector", "issue metrics")):
            newest = self.record(name, "events, name of all services")
            found = [one for one in self.explain(newest) if one["explains"] == "record"]
            self.assertEqual(self.sinks(found[0])[sink]["took"], "yes", found)

    def test_a_session_shows_its_messages_by_name(self):
        self.session(7)
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.client.send({"n": 1}, SESSION_PLAYBACK, START, [7])
        self.client.send({"n": 1}, VOLUME, STATE, [7])
        self.wait_for_link(7, 2)
        self.service.wait_for_events(6)

        session = [one for one in self.explain(7) if one["explains"] == "session"][0]
        text = " ".join(session["sessions"])
        self.assertIn("Session_Playback.Start: 2 messages, 2 recorded as events of all services, 2 as "
                      "events of the service type, 1 through the link, 1 dropped by the session as "
                      "repetitions.", text)
        self.assertIn("Its application is player.", text)
        self.assertIn("The running service has session 7 now.", text)

        self.client.destroy(7)
        self.wait_for_link(7, 3)
        session = [one for one in self.explain(7) if one["explains"] == "session"][0]
        self.assertIn("The running service has no session 7 now.", " ".join(session["sessions"]))
        self.assertEqual(self.sinks(session)["summary of the session"]["took"], "yes")

    def test_single_messages_and_test_sessions(self):
        self.client.send({"n": 1}, VOLUME, STATE)  # no session is active
        self.wait_for_link(-1, 1)
        self.session(9, TEST)
        self.client.send({"n": 2}, SESSION_PLAYBACK, START, [9])
        self.service.wait_for_events(4)

        sinks = self.sinks(self.explain("com.tarno.standalone.Volume.State")[0])
        self.assertEqual(sinks["link, single message"]["messages"], 1)
        sinks = self.sinks(self.explain("com.tarno.test.Session_Playback.Start")[0])
        self.assertIn("sessions of type test do not use the link", sinks["link, in a session"]["why"])

    def test_what_is_not_stored_is_an_error(self):
        self.session(7)
        self.client.send({"n": 1}, VOLUME, STATE, [7])
        self.service.wait_for_events(2)
        self.assertIn("no stored message is of a session 99", self.ctl("explain", 99, status=1).stderr)
        self.assertIn("is not in the store", self.ctl("explain", "nonesuch", status=1).stderr)
        [event] = self.explain("Volume.Start")
        self.assertEqual(self.sinks(event)["events, name of all services"]["took"], "no")


class UnwantedTest(Explaining):
    config = '[analytics]\nwanted = ["com.tarno.halvox.*"]\n[link]\nbackend = "none"\n'

    def test_the_settings_that_decide_are_named(self):
        self.session(7)
        self.client.send({"n": 1}, VOLUME, STATE, [7])
        self.service.wait_for_events(1)
        sinks = self.sinks(self.explain("com.tarno.longformaudio.Volume.State")[0])
        self.assertIn("No pattern of analytics.wanted matches",
                      sinks["events, name of the service type"]["why"])
        self.assertEqual(sinks["link, in a session"]["took"], "unknown")
        self.assertIn('link.backend is "none"', sinks["link, in a session"]["why"])


if __name__ == "__main__":
    unittest.main()
