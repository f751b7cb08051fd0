"""What happens to messages: which events are wanted, which repeat, and what a session sums up."""

import contextlib
import json
import time
import unittest
from pathlib import Path

from harness import PLAYBACK, START, STOP, UPTIME_EVENT, Service, wait_for

HAPTICS = 3
ERROR_CATEGORY, VOLUME = 11, 14
ERROR_TYPE = 6
# The category and type of a summary event, as the link shows them.
NO_CATEGORY, UNKNOWN = 0xFFFF, 0xFFFF
STAMPS = {"hvreporting_timestamp", "systemuptime_sec", "processuptime_ms"}


class MessagesTest(unittest.TestCase):
    def started(self, config="", service_type=None):
        """A service, and a client with a started session 7."""
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        service = stack.enter_context(Service(config))
        client = service.client()
        stack.callback(client.close)
        client.create(7)
        if service_type is not None:
            client.set_type(service_type, 7)
        client.start_later(7)
        return service, client

    def summary(self, service):
        """The summary event, which is the last message of a stop."""
        def last():
            return next((payload for category, event_type, payload in service.link_messages(7)
                         if (category, event_type) == (NO_CATEGORY, UNKNOWN)), None)
        return wait_for("the summary event", last)

    def values_through_link(self, service):
        """Category, type and value of all messages before the summary event."""
        self.summary(service)
        return [(category, event_type, payload["value"])
                for category, event_type, payload in service.link_messages(7)
                if "value" in payload and event_type != UNKNOWN]


class UptimeEventTest(MessagesTest):
    def uptime_events(self, service, count):
        return wait_for(f"{count} uptime events", lambda: len(found := [
            payload for name, payload in service.all_events() if name == UPTIME_EVENT]) >= count
            and found)

    def check_uptime(self, config):
        with Service(config) as service:
            before = time.monotonic()
            client = service.client()
            client.reporters()  # is answered after the client has been registered
            registered = time.monotonic()
            wait_for("a quarter of a second", lambda: time.monotonic() > registered + 0.25)
            closing = time.monotonic()
            client.close()
            events = self.uptime_events(service, 1)
            after = time.monotonic()

        self.assertEqual(len(events), 1)
        self.assertEqual(set(events[0]), {"processName", "seconds"})
        self.assertEqual(events[0]["processName"], Path("/proc/self/comm").read_text().rstrip("\n"))
        self.assertIsInstance(events[0]["seconds"], float)
        # The service uses the wall clock, not this one.
        self.assertGreaterEqual(events[0]["seconds"], closing - registered - 0.05)
        self.assertLessEqual(events[0]["seconds"], after - before + 0.05)

    def test_a_client_that_disconnects_is_reported_with_its_name_and_uptime(self):
        self.check_uptime("")

    def test_the_uptime_is_recorded_even_if_no_event_is_wanted(self):
        self.check_uptime("[analytics]\nwanted = []\n")

    def test_each_client_is_reported_when_it_disconnects_and_not_before(self):
        with Service() as service:
            first, second = service.client(), service.client()
            second.reporters()
            first.close()
            self.assertEqual(len(self.uptime_events(service, 1)), 1)
            second.reporters()
            second.close()
            self.assertEqual(len(self.uptime_events(service, 2)), 2)


class WantedTest(MessagesTest):
    def names_with(self, wanted):
        service, client = self.started(f"[analytics]\nwanted = {json.dumps(wanted)}\n", HAPTICS)
        client.send({"value": 1}, PLAYBACK, START, [7])
        client.send({"value": 2}, PLAYBACK, STOP, [7])
        client.send({"value": 3}, VOLUME, START, [7])
        client.stop(7)
        self.assertEqual(self.values_through_link(service),
                         [(PLAYBACK, START, 1), (PLAYBACK, STOP, 2), (VOLUME, START, 3)])
        service.stop()  # delivers the messages that are still on their way
        return [name for name, _ in service.events()]

    def test_all_events_are_recorded_when_all_are_wanted(self):
        self.assertEqual(self.names_with(["*"]), [
            "com.tarno.halvox.Playback.Start", "com.tarno.haptics.Playback.Start",
            "com.tarno.halvox.Playback.Stop", "com.tarno.haptics.Playback.Stop",
            "com.tarno.halvox.Volume.Start", "com.tarno.haptics.Volume.Start"])

    def test_only_events_with_a_wanted_name_are_recorded(self):
        self.assertEqual(self.names_with(["com.tarno.haptics.*", "com.tarno.*.Volume.St[a-c]rt"]), [
            "com.tarno.haptics.Playback.Start", "com.tarno.haptics.Playback.Stop",
            "com.tarno.halvox.Volume.Start", "com.tarno.haptics.Volume.Start"])

    def test_nothing_is_recorded_when_nothing_is_wanted_and_the_link_gets_all(self):
        self.assertEqual(self.names_with([]), [])


class SuppressionTest(MessagesTest):
    def test_a_repeat_goes_to_the_events_but_not_through_the_link(self):
        service, client = self.started()
        for value in (1, 1, 2, 1, 1):
            client.send({"value": value}, PLAYBACK, START, [7])
        client.stop(7)

        # Only the last message counts: the same content after another message is not a repeat.
        self.assertEqual([value for _, _, value in self.values_through_link(service)], [1, 2, 1])
        events = [payload["value"] for name, payload in service.wait_for_events(10)
                  if name == "com.tarno.halvox.Playback.Start"]
        self.assertEqual(events, [1, 1, 2, 1, 1])

    def test_messages_of_another_category_or_type_are_no_repeats(self):
        service, client = self.started()
        sent = [(PLAYBACK, START), (PLAYBACK, STOP), (VOLUME, START), (PLAYBACK, START)]
        for category, event_type in sent:
            client.send({"value": 1}, category, event_type, [7])
        client.stop(7)

        self.assertEqual([kind[:2] for kind in self.values_through_link(service)], sent[:3])

    def test_errors_are_never_taken_for_repeats(self):
        service, client = self.started()
        sent = [(PLAYBACK, ERROR_TYPE)] * 3 + [(ERROR_CATEGORY, START)] * 3
        for category, event_type in sent:
            client.send({"value": 1}, category, event_type, [7])
        client.stop(7)

        self.assertEqual([kind[:2] for kind in self.values_through_link(service)], sent)

    def test_sessions_do_not_take_each_others_messages_for_repeats(self):
        service, client = self.started()
        client.create(8)
        client.start_later(8)
        client.send({"value": 1}, PLAYBACK, START, [8, 7])
        client.stop(7)

        self.assertEqual(self.values_through_link(service), [(PLAYBACK, START, 1)])


class SummaryEventTest(MessagesTest):
    def test_it_holds_every_value_of_every_key_in_order(self):
        service, client = self.started(service_type=HAPTICS)
        client.send({"value": 1, "device": "speaker", "sample rate": 48000}, PLAYBACK, START, [7])
        client.send({"value": 2, "gain": 0.5}, PLAYBACK, START, [7])
        client.send({"value": 2, "gain": 0.5}, PLAYBACK, START, [7])  # a repeat
        client.send({"value": -3, "device": "a,b"}, PLAYBACK, STOP, [7])
        client.stop(7)

        summary = self.summary(service)
        stamps = {key: summary.pop(key) for key in STAMPS}
        self.assertEqual(summary, {
            "HV_Session_Summary_Event": str(HAPTICS),
            "value": "1,2,-3",
            "device": "speaker,a,b",
            "sample_rate": "48000",
            "gain": "0.5",
            "audiotag": "UndefinedUnknown",  # the session's own message, which counts like any other
        })
        for key, text in stamps.items():
            values = [float(one) for one in text.split(",")]
            self.assertEqual(len(values), 3, key)
            self.assertEqual(values, sorted(values), key)

    def test_it_holds_the_volume_messages_of_the_stop(self):
        service, client = self.started()
        def set_playing(playing):
            client.send({"RQSessionVolume": 0.25, "RQSessionVolumePlayingState": playing},
                        VOLUME, START, [7])

        set_playing(1)
        begun = time.monotonic()
        wait_for("an interval that is long enough", lambda: time.monotonic() > begun + 0.75)
        set_playing(0)
        client.stop(7)

        summary = self.summary(service)
        self.assertEqual(summary["RQSessionVolume"], "0.25,0.25,0.25")
        self.assertEqual(summary["RQSessionVolumeBucketed"], "0.25")
        self.assertEqual(summary["active_devices"], "Unknown")
        self.assertGreaterEqual(float(summary["play_seconds"]), 0.7)

    def test_it_goes_through_the_link_alone(self):
        service, client = self.started()
        client.send({"value": 1}, PLAYBACK, START, [7])
        client.stop(7)
        self.summary(service)
        service.stop()

        self.assertEqual([name for name, _ in service.events()],
                         ["com.tarno.halvox.Playback.Start", "com.tarno.unknown.Playback.Start"])

    def test_a_session_without_messages_has_none(self):
        service, client = self.started()
        client.stop(7)
        service.stop()

        self.assertEqual(service.link_messages(7), [])


if __name__ == "__main__":
    unittest.main()
