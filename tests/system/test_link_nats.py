"""The back-end of the real-time link with real NATS servers, read back by a plain subscriber."""

import re
import subprocess
import tempfile
import time
import unittest
from pathlib import Path

from harness import SERVICE, Service, require, wait_for
from nats import (DRIVER, LONG_DEADLINE, TLS_GREETING, Driver, Operator, Server, SilentServer, cluster, free_ports,
                  numbers_of, read_stream, try_read_stream)

SUBJECT = "halvox.playback_session"
APIUSAGE = 12  # the service type of that name
REFUSED = 500  # messages, more than the seconds that a test takes
EX_CONFIG = 78
# Limits in seconds for a back-end on an idle machine, and the allowance for a busy one. Each limit
# is far from the values that it must be distinguished from: messages are given up after 30 s, a
# silent server after 2 s.
FLUSH_TIME = 5 + 4
PROMPTLY = 1.5


def balance(counters):
    """Received messages that no counter accounts for."""
    no_fates = ("received", "published again")
    return counters["received"] - sum(value for name, value in counters.items() if name not in no_fates)


def describe_gaps(numbers):
    """The places where the numbers are not consecutive from 0."""
    breaks = [(index, number) for index, number in enumerate(numbers) if index and number != numbers[index - 1] + 1]
    return f"{len(numbers)} numbers, {len(set(numbers))} of them different, breaks at {breaks[:10]}"


class NatsTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        require("nats-server")
        if not DRIVER.exists():
            raise unittest.SkipTest("the link to NATS is not in this build")


class DeliveryTest(NatsTest):
    def test_messages_arrive_in_order_none_missing_none_twice(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(7)
            found, _, servers = driver.found(7)
            self.assertTrue(found)
            self.assertIn(server.url, servers)
            self.assertEqual(driver.send(7, 19_000), (19_000, 0, ""))
            # A flush has five seconds, and a slow machine needs them for its last messages alone.
            driver.wait_until_acknowledged(18_000)
            self.assertEqual(driver.send(7, 1000, 19_000), (1000, 0, ""))
            driver.flush(7)
            records = read_stream(server.url)
            counters = driver.end()

            self.assertEqual(numbers_of(records, f"{SUBJECT}.7"), list(range(20_000)))
            self.assertEqual(len({record["id"] for record in records}), 20_000)
            self.assertEqual(driver.flushed(f"{SUBJECT}.7"), [(20_000, 0)])
            self.assertEqual(counters["acknowledged"], 20_000)
            self.assertEqual(balance(counters), 0)

    def test_a_message_says_where_it_comes_from(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(-3)
            driver.found(-3)
            driver.send(-3, 1, 5)
            driver.flush(-3)
            message = read_stream(server.url)[0]["message"]
            driver.end()

            self.assertEqual(message["sessionInfo"]["TLMReportingSessionInfoSessionID"], -3)
            self.assertIs(message["sessionInfo"]["TLMReportingSessionInfoBatchEvent"], True)
            self.assertEqual(message["userInfo"]["TLMReportingUserInfoServiceName"], "playback_session")
            self.assertEqual((message["category"], message["type"]), (4, 1))
            self.assertEqual(message["payload"]["number"], 5)

    def test_a_session_that_does_not_batch_waits_for_nothing(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(8, batch=False, service="apiusage_session")
            driver.found(8)
            driver.send(8, 1000)
            driver.flush(8)
            records = wait_for("the messages", lambda: len(all := read_stream(server.url)) == 1000 and all)
            driver.end()

            self.assertEqual(numbers_of(records, "halvox.apiusage_session.8"), list(range(1000)))
            self.assertEqual(driver.flushed("halvox.apiusage_session.8"), [])

    def test_a_flush_waits_for_no_other_session(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(1, count=2)
            driver.found(1)
            driver.found(2)
            driver.send(1, 100)
            driver.send(2, 50)
            driver.flush(2)
            driver.flush(1)
            driver.end()

            self.assertEqual(driver.flushed(f"{SUBJECT}.1"), [(100, 0)])
            self.assertEqual(driver.flushed(f"{SUBJECT}.2"), [(50, 0)])

    def test_a_single_message_needs_no_session(self):
        with Server() as server, Driver(server.url) as driver:
            self.assertEqual(driver.ask("one alarms"), "sent 1 0 ".strip())
            records = wait_for("the stream", lambda: try_read_stream(server.url))
            driver.end()

            self.assertEqual([record["subject"] for record in records], ["halvox.alarms.-1"])

    def test_a_service_name_makes_one_token_of_the_subject(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(4, service="a.b*>" + "x" * 3000)
            driver.found(4)
            driver.send(4, 1)
            driver.flush(4)
            subject = read_stream(server.url)[0]["subject"]
            driver.end()

            self.assertEqual(subject, "halvox.a_b__" + "x" * (128 - 5) + ".4")

    def test_accepted_messages_are_sent_before_the_end(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(9)
            driver.found(9)
            driver.send(9, 2000)
            counters = driver.end()  # it has three seconds

            self.assertEqual(numbers_of(read_stream(server.url), f"{SUBJECT}.9"), list(range(2000)))
            self.assertEqual(counters["acknowledged"], 2000)

    def test_what_comes_after_the_end_is_refused(self):
        with Server() as server, Driver(server.url) as driver:
            counters = driver.end()  # it sends one more message

            self.assertEqual(counters["failed: refused"], 1)
            self.assertNotIn("a message was taken after the end", driver.log)


class FailureTest(NatsTest):
    @staticmethod
    def lose_the_server_after_ten_messages(server, driver):
        driver.start(1)
        driver.found(1)
        driver.send(1, 10)
        driver.flush(1)
        server.kill()

    def test_no_server_at_the_address_is_reported_soon_and_tried_again(self):
        port = free_ports(1)[0]
        with Driver(f"nats://127.0.0.1:{port}") as driver:
            driver.start(1)
            found, seconds, _ = driver.found(1)
            self.assertFalse(found)
            self.assertLess(seconds, 9)
            # A discovery that begins more than a second after an attempt uses its result and starts
            # another attempt.
            error = wait_for("a refusal", lambda: self._refusal(driver))
            with Server(port=port):
                driver.start(2)
                self.assertTrue(driver.found(2)[0])
                driver.send(2, 3)
                driver.flush(2)
                counters = driver.end()

            self.assertIn("cannot connect to a NATS server", error)
            self.assertEqual(driver.flushed(f"{SUBJECT}.2"), [(3, 0)])
            self.assertEqual(balance(counters), 0)

    @staticmethod
    def _refusal(driver):
        taken, refused, error = driver.send(1, 3)
        return (taken, refused) == (0, 3) and error

    def test_a_silent_server_holds_no_thread_and_no_other_server(self):
        with SilentServer() as silent, Driver(silent.url) as driver:
            driver.start(1)
            wait_for("the attempt", lambda: silent.accepted)
            before = driver.threads()
            driver.start(2, count=1000)
            self.assertEqual(driver.threads(), before)
            for session in (1, 2, 1001):
                found, seconds, _ = driver.found(session)
                self.assertFalse(found)
                self.assertLess(seconds, 9)
            self.assertLess(len(silent.accepted), 10)
            driver.end()

        with SilentServer() as silent, Server() as server:
            with Driver(silent.url, server.url) as driver:
                driver.start(1, count=1000)
                self.assertTrue(driver.found(1000)[0])
                driver.start(2000)
                self.assertLess(driver.found(2000)[1], PROMPTLY)
                driver.send(2000, 2000)
                driver.flush(2000)
                driver.end()
                self.assertEqual(driver.flushed(f"{SUBJECT}.2000"), [(2000, 0)])

    def test_messages_wait_for_a_server_that_comes_back(self):
        with Server() as server, Driver(server.url) as driver:
            self.lose_the_server_after_ten_messages(server, driver)
            taken, refused, _ = driver.send(1, 100, 10)
            server.start()
            driver.wait_until_acknowledged(110)
            driver.flush(1)
            records = read_stream(server.url)
            counters = driver.end()

            self.assertEqual((taken, refused), (100, 0))
            self.assertEqual(numbers_of(records, f"{SUBJECT}.1"), list(range(110)))
            self.assertEqual(driver.flushed(f"{SUBJECT}.1"), [(10, 0), (100, 0)])
            self.assertEqual(balance(counters), 0)

    def test_a_stream_that_is_missing_when_its_server_returns_is_created_again(self):
        with Server() as server, Driver(server.url) as driver:
            self.lose_the_server_after_ten_messages(server, driver)
            server.lose_files()
            driver.send(1, 100, 10)
            server.start()
            driver.wait_until_acknowledged(110)
            records = read_stream(server.url)
            counters = driver.end()

            self.assertEqual(numbers_of(records, f"{SUBJECT}.1"), list(range(10, 110)))
            self.assertEqual(balance(counters), 0)

    def test_messages_on_their_way_survive_the_end_of_their_server(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(1, count=2)
            driver.found(1)
            driver.found(2)
            for start in range(0, 20_000, 1000):
                if start == 6000:
                    server.pause()
                for session in (1, 2):
                    self.assertEqual(driver.send(session, 1000, start)[1], 0)
                if start == 6000:  # now some messages are certainly on their way
                    server.kill()
            server.start()
            driver.wait_until_acknowledged(40_000)
            driver.flush(1)
            driver.flush(2)
            records = read_stream(server.url)
            counters = driver.end()

            for session in (1, 2):
                numbers = numbers_of(records, f"{SUBJECT}.{session}")
                self.assertTrue(numbers == list(range(20_000)), describe_gaps(numbers))
                self.assertEqual(driver.flushed(f"{SUBJECT}.{session}"), [(20_000, 0)])
            self.assertGreater(counters["published again"], 0)
            self.assertEqual(balance(counters), 0)

    def test_a_message_that_no_stream_takes_is_given_up_when_its_time_is_over(self):
        """The stream exists, but somebody created it for other subjects."""
        with Server() as server:
            with Driver(server.url, extra='subject = "other"') as driver:
                driver.start(1)
                self.assertTrue(driver.found(1)[0])
                driver.end()
            with Driver(server.url) as driver:
                driver.start(1)
                self.assertTrue(driver.found(1)[0])
                driver.send(1, 100)
                seconds = driver.flush(1)
                counters = driver.end()

            self.assertLess(seconds, FLUSH_TIME)
            self.assertEqual(driver.flushed(f"{SUBJECT}.1"), [(0, 100)])
            # The refusal of the first may arrive before the last were tried.
            untried = counters.get("failed: the service ended", 0)
            self.assertGreater(counters["not acknowledged"], 0)
            self.assertEqual(counters["not acknowledged"] + untried, 100)
            self.assertEqual(balance(counters), 0)

    def test_what_finds_no_room_while_the_server_is_away_is_refused(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(1)
            driver.found(1)
            server.kill()
            taken, refused, error = driver.send(1, 80_000)
            seconds = driver.flush(1)
            counters = driver.end()

            self.assertGreater(taken, 10_000)
            self.assertGreater(refused, 0)
            self.assertIn("the queue to NATS is full", error)
            self.assertLess(seconds, FLUSH_TIME)
            acknowledged, lost = driver.flushed(f"{SUBJECT}.1")[0]
            self.assertEqual((acknowledged, lost), (0, taken))
            self.assertEqual(balance(counters), 0)

    def test_a_server_that_stops_reading_holds_no_caller(self):
        with Server() as server, Driver(server.url) as driver:
            driver.start(1)
            driver.found(1)
            server.pause()
            try:
                driver.send(1, 50_000)
                self.assertLess(driver.flush(1), FLUSH_TIME)
                driver.end()
            finally:
                server.resume()
            self.assertEqual(balance(driver.counters), 0)


class EndTest(NatsTest):
    """The end does not wait for servers that never answer."""

    def assert_ends_promptly(self, driver):
        begun = time.monotonic()
        counters = driver.end()
        self.assertLess(time.monotonic() - begun, PROMPTLY)
        self.assertEqual(balance(counters), 0)
        return counters

    def test_servers_that_never_speak(self):
        with SilentServer() as one, SilentServer() as two, SilentServer() as three:
            with Driver(one.url, two.url, three.url) as driver:
                driver.start(1)
                wait_for("the attempt", lambda: one.accepted or two.accepted or three.accepted)
                self.assertEqual(driver.send(1, 10), (10, 0, ""))

                counters = self.assert_ends_promptly(driver)

                self.assertEqual(counters["failed: the service ended"], 10)

    def test_a_server_that_never_ends_the_handshake_of_tls(self):
        with SilentServer(TLS_GREETING) as silent, Driver(silent.url) as driver:
            driver.start(1)
            wait_for("the attempt", lambda: silent.accepted)

            self.assert_ends_promptly(driver)

    def test_a_silent_server_in_the_place_of_one_that_has_ended(self):
        port = free_ports(1)[0]
        with Server() as server, Driver(server.url, f"nats://127.0.0.1:{port}") as driver:
            driver.start(1)
            self.assertTrue(driver.found(1)[0])
            with SilentServer(TLS_GREETING, port) as silent:
                server.kill()
                wait_for("the attempt", lambda: silent.accepted)

                self.assert_ends_promptly(driver)


class ServiceTest(NatsTest):
    """The whole service: messages of clients' sessions reach the stream."""

    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        if not SERVICE.exists():
            raise unittest.SkipTest("no service in this build")

    @staticmethod
    def service(url, extra=""):
        return Service(
            config=f'[link]\nbackend = "nats"\nservers = ["{url}"]\n{extra}\n[log]\nlevel = "info"\n')

    @staticmethod
    def run_session(service, reporter, messages, service_type=1):
        client = service.client()
        client.create(reporter)
        client.set_type(service_type, reporter)
        client.start_later(reporter)
        for number in range(messages):
            client.send({"number": number}, reporters=[reporter])
        assert client.stop(reporter) is True
        return client

    def messages_of(self, url, reporter):
        """The numbered messages, without the summary at the end, in the order of the stream."""
        return [record["message"] for record in try_read_stream(url)
                if record["subject"].endswith(f".{reporter}")
                and isinstance(record["message"]["payload"].get("number"), int)]

    def test_stop_flushes_the_messages_of_a_session_in_order(self):
        with Server() as server, self.service(server.url) as service:
            client = self.run_session(service, 5, 2000)
            wait_for("the flush", lambda: "flushed halvox." in service.log())
            messages = self.messages_of(server.url, 5)
            client.close()

            self.assertTrue([message["payload"]["number"] for message in messages] == list(range(2000)))
            self.assertIn(" acknowledged, 0 not", service.log())
            self.assertIn("continuing with backends!", service.log())

    def test_a_session_of_api_usage_is_sent_unbatched(self):
        with Server() as server, self.service(server.url) as service:
            client = self.run_session(service, 6, 100, service_type=APIUSAGE)
            messages = wait_for("the messages", lambda: len(all := self.messages_of(server.url, 6)) == 100 and all)
            client.close()

            info = messages[0]["sessionInfo"]
            self.assertIs(info["TLMReportingSessionInfoBatchEvent"], False)
            self.assertIs(info["TLMReportingSessionInfoContainsRealtimeEvents"], True)
            self.assertNotIn("flushed halvox.", service.log())

    def test_clients_notice_nothing_of_a_missing_server(self):
        with self.service(f"nats://127.0.0.1:{free_ports(1)[0]}", "spool = false") as service:
            client = self.run_session(service, 7, 10)
            wait_for("the discovery to fail", lambda: "failed to find backend" in service.log())
            recorded = service.wait_for_events(10)
            client.close()

            self.assertGreaterEqual(len(recorded), 10)
            self.assertIn("no backends found, this session won't get sent to the server", service.log())

    def test_refused_messages_have_at_most_one_line_a_second(self):
        with Server(extra="max_payload: 4096\n") as server, self.service(server.url) as service:
            client = service.client()
            client.create(7)
            client.start_later(7)
            wait_for("the link", lambda: "connected to NATS" in service.log())
            begun = time.monotonic()
            for number in range(REFUSED):
                client.send({"number": number, "text": "x" * 6000}, reporters=[7])
            self.assertIs(client.stop(7), True)
            wait_for("the end of the link", lambda: "flushed halvox." in service.log())
            seconds = time.monotonic() - begun
            self.assertEqual(service.stop(), 0)

            lines = service.log().count("error sending message")
            self.assertGreaterEqual(lines, 1)
            self.assertLessEqual(lines, 1 + seconds)
            failed = re.findall(r"counted link, failed: (\d+)$", service.log(), re.MULTILINE)
            self.assertGreaterEqual(int(failed[-1]), REFUSED)

    def test_the_service_ends_without_waiting_for_a_silent_server(self):
        with SilentServer() as silent, self.service(silent.url) as service:
            client = service.client()
            client.create(8)
            client.start_later(8)
            wait_for("the attempt", lambda: silent.accepted)
            begun = time.monotonic()

            self.assertEqual(service.stop(), 0)

            self.assertLess(time.monotonic() - begun, PROMPTLY)
            self.assertIn("a NATS server does not answer; closing without it", service.log())

    def test_the_service_says_which_back_ends_it_has(self):
        with Server() as server, self.service(server.url) as service:
            wait_for("the line about the back-ends",
                     lambda: "link: nats" in service.log())


class ClusterTest(NatsTest):
    SESSIONS = 40
    MESSAGES = 1000

    def setUp(self):
        self.servers = cluster()
        for server in self.servers:
            self.addCleanup(server.__exit__)
        for server in self.servers:
            server.start()
        with Driver(self.servers[0].url, extra="replicas = 3") as driver:
            self._wait_until_ready(driver)
            driver.end()
        self.leader = wait_for("the stream's leader", self._leader)
        self.follower = next(server for server in self.servers if server is not self.leader)

    def test_what_a_flush_called_acknowledged_survives_the_server_in_use(self):
        """The server also leads the stream: the worst case for messages on their way."""
        self._send_and_kill(in_use=self.leader)

    def test_what_a_flush_called_acknowledged_survives_the_leader_behind_the_server_in_use(self):
        self._send_and_kill(in_use=self.follower)

    def _send_and_kill(self, in_use):
        """Kills the leader when half of the messages have arrived."""
        with Driver(in_use.url, extra="replicas = 3") as driver:
            for session in range(1, self.SESSIONS + 1):
                driver.start(session)
                self.assertTrue(driver.found(session)[0])
                driver.ask_later(f"send {session} {self.MESSAGES} 0")
                if session == self.SESSIONS // 2:
                    self.leader.pause()  # in the middle of the messages, so that some are on their way
                driver.answer()
                if session == self.SESSIONS // 2:
                    self.leader.kill()
                driver.flush(session)
            # Messages that a flush gave up waiting for are confirmed when there is a leader again.
            driver.wait_until_acknowledged(self.SESSIONS * self.MESSAGES)
            driver.end()
        records = wait_for("the stream", lambda: try_read_stream(self.follower.url), LONG_DEADLINE, pause=0.5)
        self._check(driver, records)

    def _leader(self):
        """The server that says that it leads. No other has: the stream is new."""
        line = "JetStream cluster new stream leader for '$G > HALVOX'"
        return next((server for server in self.servers if line in server.log()), None)

    def _check(self, driver, records):
        confirmed = 0
        for session in range(1, self.SESSIONS + 1):
            numbers = numbers_of(records, f"{SUBJECT}.{session}")
            self.assertTrue(numbers == list(range(self.MESSAGES)), describe_gaps(numbers))
            (acknowledged, lost), = driver.flushed(f"{SUBJECT}.{session}")
            self.assertEqual(acknowledged + lost, self.MESSAGES)
            confirmed += acknowledged
        self.assertEqual(len({record["id"] for record in records}), len(records))
        self.assertEqual(driver.counters["acknowledged"], self.SESSIONS * self.MESSAGES)
        self.assertGreater(driver.counters["published again"], 0)
        self.assertEqual(balance(driver.counters), 0)
        # Only the flushes of a few sessions end while the stream has no leader.
        print(f"flushes reported {confirmed} of {self.SESSIONS * self.MESSAGES} as acknowledged")
        self.assertGreaterEqual(confirmed, self.SESSIONS * self.MESSAGES * 9 // 10)

    def _wait_until_ready(self, driver):
        """The cluster elects a leader before streams can be created."""
        def ready():
            driver.start(100_000)
            return driver.found(100_000)[0]
        wait_for("a leader", ready, LONG_DEADLINE)


class SecurityTest(NatsTest):
    @classmethod
    def setUpClass(cls):
        super().setUpClass()
        require("openssl")

    def directory(self):
        return Path(self.enterContext(tempfile.TemporaryDirectory(prefix="halvox-tls-")))

    def certificate(self, names="DNS:localhost,IP:127.0.0.1"):
        directory = self.directory()
        subprocess.run(
            ["openssl", "req", "-x509", "-newkey", "rsa:2048", "-nodes", "-days", "2",
             "-subj", "/CN=halvox test", "-addext", f"subjectAltName={names}",
             "-keyout", directory / "key.pem", "-out", directory / "cert.pem"],
            check=True, capture_output=True)
        return directory / "cert.pem", directory / "key.pem"

    def test_tls_with_the_authority_that_signed(self):
        certificate, key = self.certificate()
        tls = f'tls {{ cert_file: "{certificate}", key_file: "{key}" }}'
        with Server(tls) as server:
            with Driver(server.url, extra=f'[link.tls]\nca = "{certificate}"') as driver:
                driver.start(1)
                self.assertTrue(driver.found(1)[0])
                driver.send(1, 10)
                driver.flush(1)
                driver.end()
                self.assertEqual(driver.flushed(f"{SUBJECT}.1"), [(10, 0)])

    def test_tls_with_another_authority_finds_no_server(self):
        certificate, key = self.certificate()
        other, _ = self.certificate()
        tls = f'tls {{ cert_file: "{certificate}", key_file: "{key}" }}'
        with Server(tls) as server:
            with Driver(server.url, extra=f'[link.tls]\nca = "{other}"') as driver:
                driver.start(1)
                self.assertFalse(driver.found(1)[0])
                driver.end()
                self.assertTrue(any("cannot connect to a NATS server" in line for line in driver.log))

    def assert_reached(self, is_reached, url, extra):
        """Whether the link counts the server as found with these settings. Yields the log of the
        driver program."""
        with Driver(url, extra=extra) as driver:
            driver.start(1)
            self.assertEqual(driver.found(1)[0], is_reached)
            if is_reached:
                driver.send(1, 10)
                driver.flush(1)
            driver.end()
            self.assertEqual(driver.flushed(f"{SUBJECT}.1"), [(10, 0)] if is_reached else [])
        return driver.log

    def test_a_certificate_must_be_for_the_name_in_the_address(self):
        certificate, key = self.certificate("DNS:localhost")
        with Server(f'tls {{ cert_file: "{certificate}", key_file: "{key}" }}') as server:
            by_name = server.url.replace("127.0.0.1", "localhost")
            self.assert_reached(True, by_name, f'[link.tls]\nca = "{certificate}"')
            log = self.assert_reached(False, server.url, f'[link.tls]\nca = "{certificate}"')
            self.assert_reached(True, server.url, f'[link.tls]\nca = "{certificate}"\nverify = false')

        self.assertTrue(any("cannot connect to a NATS server" in line and "mismatch" in line
                            for line in log), log)

    def test_a_credentials_file_of_the_servers_operator_is_let_in(self):
        operator = Operator(self.directory())
        credentials = operator.credentials("reporter")
        with Server(operator.config) as server:
            self.assert_reached(True, server.url, f'credentials = "{credentials}"')

    def test_a_credentials_file_of_another_operator_finds_no_server(self):
        operator, other = Operator(self.directory()), Operator(self.directory())
        credentials = other.credentials("reporter")
        with Server(operator.config) as server:
            log = self.assert_reached(False, server.url, f'credentials = "{credentials}"')

        self.assertTrue(any("uthoriz" in line for line in log), log)

    def test_wrong_credentials_are_no_server(self):
        with Server('authorization { user: "a", password: "right" }') as server:
            wrong = server.url.replace("nats://", "nats://a:wrong@")
            right = server.url.replace("nats://", "nats://a:right@")
            with Driver(wrong) as driver:
                driver.start(1)
                self.assertFalse(driver.found(1)[0])
                driver.end()
                self.assertTrue(any("uthoriz" in line for line in driver.log), driver.log)
            with Driver(right) as driver:
                driver.start(1)
                self.assertTrue(driver.found(1)[0])
                driver.end()

    def test_a_device_needs_only_the_permissions_of_the_fleet_guide(self):
        device = ('{ user: "device", password: "d", permissions: {'
                  ' publish: ["fleet.device4711.>", "$JS.API.STREAM.INFO.FLEET"], subscribe: ["_INBOX.>"] } }')
        users = f'authorization {{ users: [ {{ user: "admin", password: "a" }}, {device} ] }}'
        with Server(users) as server:
            admin, device = (server.url.replace("nats://", f"nats://{user}@")
                             for user in ("admin:a", "device:d"))
            with Driver(admin, extra='stream = "FLEET"\nsubject = "fleet"') as driver:
                driver.start(1)
                self.assertTrue(driver.found(1)[0])
                driver.end()
            subject = "fleet.device4711"
            with Driver(device, extra=f'stream = "FLEET"\nsubject = "{subject}"') as driver:
                driver.start(1)
                self.assertTrue(driver.found(1)[0])
                driver.send(1, 10)
                driver.flush(1)
                driver.end()

            self.assertEqual(driver.flushed(f"{subject}.playback_session.1"), [(10, 0)])
            self.assertEqual(numbers_of(read_stream(admin, "FLEET"), f"{subject}.playback_session.1"),
                             list(range(10)))

    def test_a_credentials_file_that_is_missing_finds_no_server(self):
        with Server() as server, Driver(server.url, extra='credentials = "/nowhere/user.creds"') as driver:
            driver.start(1)
            self.assertFalse(driver.found(1)[0])
            driver.end()


if __name__ == "__main__":
    unittest.main()
