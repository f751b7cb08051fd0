"""What the link to NATS keeps in the store while no server takes messages, with real servers."""

import shutil
import sqlite3
import unittest

from harness import SERVICE, Service, connect_to_store, require, wait_for
from nats import DRIVER, LONG_DEADLINE, Server, free_ports, try_read_stream

KEPT = "SELECT ifnull(sum(messages - sent), 0) FROM link_spool"
MUSIC = 7  # a service type that is not traced


class SpoolTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        require("nats-server")
        if not DRIVER.exists() or not SERVICE.exists():
            raise unittest.SkipTest("the link to NATS is not in this build")

    def service(self, url, extra=""):
        service = Service(f'[link]\nbackend = "nats"\nservers = ["{url}"]\n{extra}\n[log]\nlevel = "info"\n')
        self.addCleanup(shutil.rmtree, service.directory, True)
        self.addCleanup(service.stop)
        return service

    def client(self, service):
        client = service.client()
        self.addCleanup(client.close)
        return client

    def server(self, port=None):
        server = Server(port=port)
        self.addCleanup(server.__exit__)
        return server

    @staticmethod
    def begin(client, reporter):
        client.create(reporter)
        client.set_type(MUSIC, reporter)
        client.start_later(reporter)
        client.valid(reporter)  # is answered after the start has been carried out

    @staticmethod
    def send(client, reporter, first, count):
        for number in range(first, first + count):
            client.send({"number": number}, reporters=[reporter])
        client.valid(reporter)

    @staticmethod
    def kept(service):
        with connect_to_store(service.database) as database:
            return database.execute(KEPT).fetchone()[0]

    def wait_until_kept(self, service, count):
        def are_kept():
            try:
                return self.kept(service) >= count
            except sqlite3.OperationalError:  # the file is being made
                return False
        wait_for(f"{count} kept messages", are_kept)

    @staticmethod
    def numbers(server, reporter):
        return [record["message"]["payload"]["number"] for record in try_read_stream(server.url)
                if record["subject"].endswith(f".{reporter}")
                and isinstance(record["message"]["payload"].get("number"), int)]

    def assert_arrive(self, server, reporter, count):
        """Each message once, in order."""
        wait_for(f"{count} messages of {reporter}", lambda: len(self.numbers(server, reporter)) >= count,
                 LONG_DEADLINE, pause=0.2)
        self.assertEqual(self.numbers(server, reporter), list(range(count)))

    def test_an_outage_loses_nothing_of_sessions_before_during_and_after_it(self):
        server = self.server().start()
        service = self.service(server.url).start()
        client = self.client(service)
        self.begin(client, 1)
        self.send(client, 1, 0, 200)
        wait_for("the first messages", lambda: len(self.numbers(server, 1)) == 200)
        server.kill()
        self.send(client, 1, 200, 500)
        self.begin(client, 2)
        self.send(client, 2, 0, 100)
        self.assertIs(client.stop(2), True)
        self.begin(client, 3)
        self.send(client, 3, 0, 50)
        self.wait_until_kept(service, 650)
        server.start()
        self.send(client, 3, 50, 50)

        self.assert_arrive(server, 1, 700)
        self.assert_arrive(server, 2, 100)
        self.assert_arrive(server, 3, 100)
        wait_for("an empty spool", lambda: self.kept(service) == 0)
        self.assertEqual(service.log().count("failed to find backend"), 0)

    def test_a_service_sends_what_it_kept_before_its_restart(self):
        server = self.server(free_ports(1)[0])
        service = self.service(server.url).start()
        client = self.client(service)
        self.begin(client, 1)
        self.send(client, 1, 0, 300)
        self.wait_until_kept(service, 300)
        self.assertIn("continuing with backends!", service.log())
        self.assertEqual(service.stop(), 0)
        server.start()
        service.start()

        self.assert_arrive(server, 1, 300)
        wait_for("an empty spool", lambda: self.kept(service) == 0)

    def test_a_killed_service_has_kept_what_a_silent_server_did_not_acknowledge(self):
        server = self.server().start()
        service = self.service(server.url).start()
        client = self.client(service)
        self.begin(client, 1)
        self.send(client, 1, 0, 100)
        wait_for("the first messages", lambda: len(self.numbers(server, 1)) == 100)
        server.pause()
        self.send(client, 1, 100, 400)
        self.wait_until_kept(service, 400)
        service.process.kill()
        service.process.wait()
        server.resume()
        service.start()

        self.assert_arrive(server, 1, 500)

    def test_a_clean_end_keeps_what_was_not_sent(self):
        server = self.server().start()
        service = self.service(server.url).start()
        client = self.client(service)
        self.begin(client, 1)
        self.send(client, 1, 0, 100)
        wait_for("the first messages", lambda: len(self.numbers(server, 1)) == 100)
        server.kill()
        self.send(client, 1, 100, 100)
        self.assertEqual(service.stop(), 0)
        server.start()
        service.start()

        self.assert_arrive(server, 1, 200)

    def test_without_a_server_the_log_stays_quiet(self):
        service = self.service(f"nats://127.0.0.1:{free_ports(1)[0]}").start()
        client = self.client(service)
        self.begin(client, 1)
        self.send(client, 1, 0, 2000)
        self.wait_until_kept(service, 2000)
        wait_for("a line about them", lambda: "; messages wait in the store" in service.log())
        self.assertEqual(service.stop(), 0)

        lines = [line for line in service.log().splitlines() if "NATS" in line]
        self.assertLess(len(lines), 20, lines)


if __name__ == "__main__":
    unittest.main()
