"""Issues and power events, from a real client to the service's store."""

import contextlib
import json
import unittest

from harness import Follower, Service, connect_to_store, wait_for

ISSUE_DETECTOR = 7
JOULEBOOK = 8
METRIC = 0x5B0003
POWER_LOG = 28


class BridgesTest(unittest.TestCase):
    def setUp(self):
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        self.service = stack.enter_context(Service())
        self.client = self.service.client()
        stack.callback(self.client.close)
        self.client.create(7)
        self.client.start_later(7)

    def stored(self, query):
        if not self.service.database.exists():
            return []
        with connect_to_store(self.service.database) as store:
            return store.execute(query).fetchall()

    def rows(self, query, count):
        """Waits for that many rows of a query on the store, and returns them."""
        rows = wait_for(f"{count} rows of {query}",
                        lambda: len(found := self.stored(query)) >= count and found)
        self.assertEqual(len(rows), count)
        return rows

    def test_an_issue_is_kept_as_its_encoded_metric(self):
        self.client.send({"issue_type": "glitch", "rtaid_client": "x", "node": "mixer",
                          "any_channel_silence_seconds": 12},
                         event_type=ISSUE_DETECTOR, reporters=[7])

        rows = self.rows("SELECT metric_id, message FROM issue_metrics", 1)
        self.assertEqual(rows, [(METRIC, b"\x10\x0c\x1a\x06glitch\x22\x05mixer\x2a\x01x")])

    def test_power_events_are_kept_with_what_was_sent(self):
        self.client.send({"EngineOnTime": 4.5}, event_type=JOULEBOOK, reporters=[7])
        self.client.send({"Haptic_Active_Hardware_Time_Seconds": 30, "Active_Clients": 2},
                         event_type=JOULEBOOK, reporters=[7])

        rows = self.rows("SELECT category_id, event_name, payload FROM power_events", 2)
        self.assertEqual([row[:2] for row in rows],
                         [(POWER_LOG, "Oxbow_Haptics"), (POWER_LOG, "LeakedHapticsSessionInfo")])
        engine, leak = (json.loads(row[2]) for row in rows)
        self.assertGreater(engine.pop("TimestampEnd"), 0)
        self.assertEqual(engine, {"EngineOnDuration": 4.5, "ApplicationName": "Unknown"})
        self.assertEqual(leak, {"Haptic_Active_Hardware_Time_Seconds": 30, "Active_Clients": 2})

    def follow(self, command):
        follower = Follower(self.service, command)
        self.addCleanup(follower.close)
        return follower

    def test_metrics_are_followed_as_they_come(self):
        def send(node):
            self.client.send({"issue_type": "glitch", "rtaid_client": "x", "node": node,
                              "any_channel_silence_seconds": 3},
                             event_type=ISSUE_DETECTOR, reporters=[7])

        send("one")
        follower = self.follow("metrics")
        self.assertEqual(follower.records(1)[0]["fields"],
                         {"issue_type": "glitch", "node": "one", "rtaid_client": "x", "duration": 3})
        # Each message is sent only after the effect of the one before has been seen.
        for shown, node in enumerate(("two", "three"), 2):
            send(node)
            records = follower.records(shown)
            self.assertEqual(records[-1]["fields"]["node"], node)
        self.assertEqual([record["fields"]["node"] for record in records], ["one", "two", "three"])
        self.assertEqual({record["metric_id"] for record in records}, {METRIC})
        self.assertEqual(follower.leave(), 0)

    def test_power_events_are_followed_as_they_come(self):
        self.client.send({"EngineOnTime": 1}, event_type=JOULEBOOK, reporters=[7])
        follower = self.follow("power")
        follower.records(1)
        self.client.send({"Haptic_Active_Hardware_Time_Seconds": 2}, event_type=JOULEBOOK, reporters=[7])
        records = follower.records(2)

        self.assertEqual([(record["category_id"], record["event_name"]) for record in records],
                         [(POWER_LOG, "Oxbow_Haptics"), (POWER_LOG, "LeakedHapticsSessionInfo")])
        self.assertEqual(records[0]["payload"]["EngineOnDuration"], 1)
        self.assertEqual(records[1]["payload"], {"Haptic_Active_Hardware_Time_Seconds": 2})
        self.assertEqual(follower.leave(), 0)

    def test_other_messages_leave_no_metric_and_no_power_event(self):
        self.client.send({"issue_type": "glitch", "EngineOnTime": 4.5}, reporters=[7])
        self.client.send({}, event_type=ISSUE_DETECTOR, reporters=[7])

        self.assertEqual(self.rows("SELECT message FROM issue_metrics", 1),
                         [(b"\x10\x00\x1a\x00\x22\x00\x2a\x00",)])
        self.assertEqual(self.stored("SELECT * FROM power_events"), [])


if __name__ == "__main__":
    unittest.main()
