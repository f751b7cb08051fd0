"""A flood of single messages, which wait for one second, affects only the client that sent it."""

import unittest

from gi.repository import Gio

import harness
from harness import Service, connect_to_store, wait_for

MIB = 1024 * 1024
FLOOD = 60
OTHERS = 10
LIMIT = 4  # MiB
LIMITS_EXCEEDED = "org.freedesktop.DBus.Error.LimitsExceeded"


def stored(service):
    """The sender and number of each stored message, in the order of the store."""
    if not service.database.exists():
        return []
    with connect_to_store(service.database) as database:
        return database.execute(
            "SELECT json_extract(payload, '$.from'), json_extract(payload, '$.number')"
            " FROM link_messages").fetchall()


def numbers_from(rows, sender):
    return sorted(number for name, number in rows if name == sender)


class LinkFlood(unittest.TestCase):
    def service_with(self, config=""):
        service = Service(config)
        self.addCleanup(service.__exit__)
        return service.start()

    def client(self, service):
        client = service.client()
        self.addCleanup(client.close)
        return client

    @staticmethod
    def flood(client, sender, count, reporters=None, size=MIB):
        """Sends without waiting for answers. Returns the pending answers by number."""
        lists = [] if reporters is None else [reporters]
        return [client.call_later(
            "sendMessage", "a{sv}uqaax",
            harness.variants({"from": sender, "number": number, "bulk": "x" * size}),
            harness.PLAYBACK, harness.START, lists) for number in range(count)]

    def answered(self, pending):
        """The numbers of the messages that were answered without an error. The other answers name
        the limit."""
        harness.iterate_until("all answers", lambda: all(one.done for one in pending))
        for error in (one.error for one in pending if one.error):
            self.assertEqual(Gio.dbus_error_get_remote_error(error), LIMITS_EXCEEDED)
            self.assertIn(f"client_history_megabytes = {LIMIT}", error.message)
        return [number for number, one in enumerate(pending) if one.error is None]

    def arrived(self, service, expected):
        """All rows, after the expected ones and a fence have arrived. Single messages are written
        by several threads, so the fence may overtake a message that was sent before it."""
        fence = self.client(service)
        fence.send({"from": "fence", "number": 0})
        return wait_for("all messages and the fence", pause=0.1, condition=lambda: len(
            rows := stored(service)) > expected and numbers_from(rows, "fence") and rows)

    def test_all_that_was_answered_arrives_beside_a_flood(self):
        service = self.service_with()
        flooder, other = self.client(service), self.client(service)
        flood = self.flood(flooder, "flooder", FLOOD)
        others = self.flood(other, "other", OTHERS)

        self.assertEqual(self.answered(flood), list(range(FLOOD)))
        self.assertEqual(self.answered(others), list(range(OTHERS)))

        rows = self.arrived(service, FLOOD + OTHERS)
        self.assertEqual(numbers_from(rows, "other"), list(range(OTHERS)))
        self.assertEqual(numbers_from(rows, "flooder"), list(range(FLOOD)))

    def flood_past_the_limit(self, reporters):
        service = self.service_with(f"[limits]\nclient_history_megabytes = {LIMIT}\n")
        owner, flooder, other = (self.client(service) for _ in range(3))
        owner.create(7)  # never started, so its messages are sent as single messages
        flood = self.flood(flooder, "flooder", FLOOD, reporters)
        others = self.flood(other, "other", OTHERS, reporters, size=1024)

        answered = self.answered(flood)
        self.assertEqual(self.answered(others), list(range(OTHERS)))
        self.assertIs(owner.configure({"calm": True}, 7), True)
        self.assertLess(len(answered), FLOOD)
        self.assertGreater(len(answered), 0)

        rows = self.arrived(service, len(answered) + OTHERS)
        self.assertEqual(numbers_from(rows, "other"), list(range(OTHERS)))
        self.assertEqual(numbers_from(rows, "flooder"), answered)
        self.assertIsNone(flooder.send({"from": "flooder", "number": FLOOD}), "room again")

    def test_flood_past_the_limit_is_refused_and_what_was_answered_arrives(self):
        self.flood_past_the_limit(reporters=None)

    def test_flood_to_a_session_of_another_client_is_charged_to_the_sender(self):
        self.flood_past_the_limit(reporters=[7])

    def test_what_was_answered_arrives_after_its_client_has_disconnected(self):
        service = self.service_with()
        client = service.client()
        self.assertEqual(self.answered(self.flood(client, "gone", OTHERS)), list(range(OTHERS)))
        client.close()

        rows = self.arrived(service, OTHERS)
        self.assertEqual(numbers_from(rows, "gone"), list(range(OTHERS)))


if __name__ == "__main__":
    unittest.main()
