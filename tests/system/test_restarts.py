"""Restarts of the service that clients of the library do not notice."""

import json
import subprocess
import unittest

import harness
from harness import BIN, Service, connect_to_store

CLIENTS = 4
RESTARTS = 20
EVENT = "com.tarno.halvox.Playback.Start"


class RestartTest(unittest.TestCase):
    def stored(self):
        """The numbers of the stored messages of each client, in the order of their storage."""
        with connect_to_store(self.service.database) as database:
            rows = database.execute("SELECT payload FROM analytics_events WHERE name = ?", (EVENT,)).fetchall()
        numbers = {client: [] for client in range(CLIENTS)}
        for payload, in rows:
            message = json.loads(payload)
            numbers[message["client"]].append(message["n"])
        return numbers

    def send(self):
        """Lets each client send messages. Returns while they are on their way."""
        self.clients.stdin.write("send\n")
        self.clients.stdin.flush()
        self.assertEqual(self.clients.stdout.readline(), "sent\n")

    def test_messages_that_the_library_accepted_arrive_once_over_many_restarts_under_load(self):
        self.service = self.enterContext(Service())
        self.clients = self.enterContext(subprocess.Popen(
            [BIN / "halvox_restart_client", self.service.socket, str(CLIENTS)],
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True))
        self.addCleanup(self.clients.kill)

        for _ in range(RESTARTS):
            self.send()
            self.assertEqual(self.service.stop(), 0)
            self.service.start()
        output, _ = self.clients.communicate(timeout=2 * harness.DEADLINE)

        self.assertEqual(self.service.stop(), 0)
        stored = self.stored()
        results = [json.loads(line) for line in output.splitlines()]
        self.assertEqual(len(results), CLIENTS)
        for result in results:
            self.assertTrue(result["flushed"])
            self.assertEqual((result["acknowledged"], result["lost"]), (result["accepted"], 0))
            self.assertGreaterEqual(result["reconnects"], RESTARTS)
            self.assertEqual(stored[result["client"]], list(range(result["accepted"])))


if __name__ == "__main__":
    unittest.main()
