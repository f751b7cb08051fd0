"""A link without back-ends: the session logs that once and drops its messages; no other client notices."""

import json
import re
import signal
import statistics
import time
import unittest

from harness import Service, start_session, wait_for
from nats import SilentServer, free_ports

MESSAGES = 300
REPORTER = 7
ATTEMPT = 2  # the seconds after which an attempt to reach a silent server ends
NO_BACKENDS = "no backends found, this session won't get sent to the server"
FAILED = "failed to find backend"
TIMED_OUT = "timed out waiting for backends"


def link(backend, *servers):
    """Without the spool, which takes the messages of a session whether a server is there or not."""
    return (f'[link]\nbackend = "{backend}"\nspool = false\n'
            + (f"servers = {json.dumps(servers)}\n" if servers else ""))


def counters(service, piece):
    """The counters of a piece of the running service, by name."""
    said = len(service.log())
    service.process.send_signal(signal.SIGUSR1)
    # Pieces are logged in the order of their names. The awaited line comes after those of the
    # pieces that are read.
    wait_for("the counters", lambda: "counted snapshots, stored: " in service.log()[said:])
    return {name: int(value) for name, value
            in re.findall(rf"counted {piece}, (.*): (\d+)$", service.log()[said:], re.MULTILINE)}


class AbsentLinkTest(unittest.TestCase):
    def service(self, config):
        service = Service(config)
        self.addCleanup(service.__exit__, None, None, None)
        return service.start()

    @staticmethod
    def latencies(*clients):
        """The seconds until the answers to numbered messages for the started session, by client.

        The clients take turns, so that other work of the machine affects all of them alike.
        """
        taken = [[] for _ in clients]
        for number in range(MESSAGES):
            for client, times in zip(clients, taken, strict=True):
                begin = time.perf_counter()
                client.send({"number": number}, reporters=[REPORTER])
                times.append(time.perf_counter() - begin)
        return taken

    def assert_nobody_notices(self, service, client):
        usual = self.service(link("local"))
        taken, expected = self.latencies(client, start_session(self, usual, REPORTER))

        print(f"\nmedian of an answer {statistics.median(taken) * 1e6:.0f} us, "
              f"with a back-end {statistics.median(expected) * 1e6:.0f} us, "
              f"longest {max(taken) * 1e3:.1f} and {max(expected) * 1e3:.1f} ms", flush=True)
        self.assertLess(statistics.median(taken), 2 * statistics.median(expected))
        # No answer waits for the discovery.
        self.assertLess(max(taken), ATTEMPT)
        self.assertEqual(len(service.wait_for_events(2 * MESSAGES)), 2 * MESSAGES)

    def assert_dropped_by_the_link_alone(self, service, client):
        self.assertIs(client.stop(REPORTER), True)
        # The summary of the session is an additional message.
        counted = wait_for("the link to drop all messages", lambda: (
            now := counters(service, "link"))["dropped: no back-end"] == MESSAGES + 1 and now)
        self.assertEqual(counted["received"], MESSAGES + 1)
        self.assertEqual(counted["sent"] + counted["failed"], 0)
        session = counters(service, "session")
        self.assertEqual((session["received"], session["recorded"]), (MESSAGES + 1, MESSAGES + 1))

    def assert_session_fails(self, config):
        service = self.service(config)
        client = start_session(self, service, REPORTER)

        self.assert_nobody_notices(service, client)
        wait_for("the discovery to fail", lambda: FAILED in service.log())
        self.assert_dropped_by_the_link_alone(service, client)

        # The back-end gives up before the session does, which waits nine seconds.
        self.assertLess(service.log().index(NO_BACKENDS), service.log().index(FAILED))
        self.assertEqual(service.log().count(FAILED), 1)
        self.assertNotIn(TIMED_OUT, service.log())

    def test_without_a_back_end_messages_are_dropped_by_the_link_alone(self):
        self.assert_session_fails(link("none"))

    def test_no_server_at_the_address_is_logged_and_clients_notice_nothing(self):
        self.assert_session_fails(link("nats", f"nats://127.0.0.1:{free_ports(1)[0]}"))

    def test_a_silent_server_delays_only_the_link(self):
        with SilentServer() as silent:
            self.assert_session_fails(link("nats", silent.url))


if __name__ == "__main__":
    unittest.main()
