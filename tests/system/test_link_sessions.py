"""Which sessions have the real-time link, and in which order it is opened, used and closed."""

import json
import shutil
import unittest

import harness
import nats
from harness import Service, connect_to_store, wait_for

MUSIC = 7  # a service type that is not traced
SINGLE = -1  # the session ID of messages outside of any session
SUMMARY = 65535
WAITING = "waiting to find backends"
LIST = "list of backends"
NONE = "no backends found, this session won't get sent to the server"
CONTINUING = "continuing with backends!"
FAILED = "failed to find backend"


def stored(service):
    """Session, type and payload of each stored message of the link, in the order of the store."""
    with connect_to_store(service.database) as database:
        rows = database.execute("SELECT session_id, type, payload FROM link_messages").fetchall()
    return [(session, kind, json.loads(payload)) for session, kind, payload in rows]


class LinkTest(unittest.TestCase):
    def service_with(self, config=""):
        service = Service(config)
        self.addCleanup(shutil.rmtree, service.directory, True)
        service.start()
        self.addCleanup(service.stop)
        return service

    def client(self, service):
        client = service.client()
        self.addCleanup(client.close)
        return client

    @staticmethod
    def start(client, reporter):
        """Creates a session unless it exists, and starts it. Returns the answer, which is held
        back."""
        client.create(reporter)
        client.set_type(MUSIC, reporter)
        return LinkTest.start_again(client, reporter)

    @staticmethod
    def start_again(client, reporter):
        started = client.start_later(reporter)
        client.valid(reporter)  # is answered after the start has been carried out
        return started


class LinkSessions(LinkTest):
    def setUp(self):
        self.service = self.service_with()
        self.reporting = self.client(self.service)

    def say(self, reporter):
        self.reporting.send({"from": reporter}, reporters=[reporter])

    def heard(self):
        """The sessions of which a message was stored, among everything that was sent before.

        Queues of sessions run concurrently, so only the end of the service shows that no further
        message comes. What is expected is awaited before.
        """
        self.service.stop()
        return {(session, payload["from"]) for session, _, payload in stored(self.service)
                if "from" in payload}

    def wait_for(self, *expected):
        def are_there():
            found = {(session, payload.get("from")) for session, _, payload in stored(self.service)}
            return found >= set(expected)
        wait_for(f"messages of {expected}", are_there)

    def test_five_sessions_have_the_link_and_the_sixth_has_not(self):
        for reporter in range(1, 7):
            self.start(self.reporting, reporter)
        for reporter in range(1, 7):
            self.say(reporter)

        linked = [(reporter, reporter) for reporter in range(1, 6)]
        self.wait_for(*linked)
        self.service.wait_for_payload(lambda payload: payload.get("from") == 6)
        self.assertEqual(self.heard(), set(linked))

    def test_a_stop_makes_room_for_another(self):
        for reporter in range(1, 6):
            self.start(self.reporting, reporter)
        self.reporting.stop(1)
        self.start(self.reporting, 6)
        self.say(6)
        self.wait_for((6, 6))

    def test_destroyed_sessions_keep_their_places_for_good(self):
        for reporter in range(1, 6):
            self.start(self.reporting, reporter)
        for reporter in range(1, 6):
            self.reporting.destroy(reporter)
        self.start(self.reporting, 6)
        self.say(6)
        self.reporting.stop(6)  # releases its own place, but the others' remain
        self.start_again(self.reporting, 6)
        self.say(6)
        self.service.wait_for_events(4)
        self.assertEqual(self.heard(), set())

    def test_sessions_of_a_client_that_left_keep_their_places_for_good(self):
        leaving = self.service.client()
        for reporter in range(1, 6):
            self.start(leaving, reporter)
        leaving.close()
        wait_for("the end of its sessions", lambda: self.reporting.reporters() == [])
        self.start(self.reporting, 6)
        self.say(6)
        self.service.wait_for_events(2)
        self.assertEqual(self.heard(), set())

    def test_new_sessions_have_the_link_while_at_most_five_are_started(self):
        for reporter in range(1, 6):
            self.start(self.reporting, reporter)
        self.reporting.create(20)
        self.start(self.reporting, 6)
        self.reporting.create(21)
        self.say(20)
        self.say(21)
        self.wait_for((SINGLE, 20))
        self.assertEqual(self.heard(), {(SINGLE, 20)})

    def test_a_restarted_session_forgets_its_history(self):
        started = self.start(self.reporting, 7)
        for text in ("first", "first", "same"):
            self.reporting.send({"a": text}, reporters=[7])
        self.reporting.stop(7)
        self.assertIs(started.wait(), True)
        started = self.start_again(self.reporting, 7)
        self.assertFalse(started.done)
        for text in ("same", "same", "second"):
            self.reporting.send({"a": text}, reporters=[7])
        self.reporting.stop(7)
        self.assertIs(started.wait(), True)
        wait_for("both summaries", lambda: [kind for _, kind, _ in stored(self.service)].count(SUMMARY) == 2)

        rows = [(session, kind, payload["a"]) for session, kind, payload in stored(self.service)
                if "a" in payload]
        self.assertEqual(rows, [
            (7, harness.START, "first"), (7, harness.START, "same"), (7, SUMMARY, "first,same"),
            # The first message of a run is neither compared with the last message of the previous
            # run nor summed up with it.
            (7, harness.START, "same"), (7, harness.START, "second"), (7, SUMMARY, "same,second")])


class LinkOrder(LinkTest):
    ROUNDS = 30

    def link_lines(self, service):
        lines = []
        for line in service.log().splitlines():
            lines += [word for word in (WAITING, LIST, NONE, CONTINUING, FAILED) if word in line]
        return lines

    def check_order(self, config, answer, outcome):
        """The log lines of each start are in the order of the steps."""
        service = self.service_with(config)
        client = self.client(service)
        for number in range(1, self.ROUNDS + 1):
            started = self.start(client, number)
            wait_for("the end of the start", lambda: self.link_lines(service).count(outcome) == number)
            client.stop(number)
            started.wait()
        self.assertEqual(self.link_lines(service), [WAITING, answer, outcome] * self.ROUNDS)

    def test_local_link_waits_before_it_lists(self):
        self.check_order("", LIST, CONTINUING)

    def test_absent_link_waits_before_it_fails(self):
        self.check_order('[link]\nbackend = "none"\n', NONE, FAILED)

    def test_connected_nats_link_waits_before_it_lists(self):
        harness.require("nats-server")
        with nats.Server() as server:
            self.check_order(f'[link]\nbackend = "nats"\nservers = ["{server.url}"]\n',
                             LIST, CONTINUING)

    def test_many_starts_at_once_each_wait_before_they_list(self):
        service = self.service_with()
        clients = [self.client(service) for _ in range(5)]
        for _ in range(self.ROUNDS):
            pending = [self.start(client, number) for number, client in enumerate(clients, 1)]
            for number, client in enumerate(clients, 1):
                client.stop(number)
            for answer in pending:
                answer.wait()
        total = self.ROUNDS * len(clients)
        wait_for("the end of all starts", lambda: self.link_lines(service).count(CONTINUING) == total)
        open_waits = 0
        for line in self.link_lines(service):
            open_waits += {WAITING: 1, LIST: -1}.get(line, 0)
            self.assertGreaterEqual(open_waits, 0)


if __name__ == "__main__":
    unittest.main()
