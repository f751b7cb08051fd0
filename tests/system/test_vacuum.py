"""halvoxctl vacuum: deleting old records of a running service, and of a store without one."""

import json
import os
import threading
import time
import unittest

from harness import DEADLINE, connect_to_store, start_service, variants, wait_for

STORAGE = "com.tarno.halvox.Storage"


def count(service, condition="1"):
    with connect_to_store(service.database) as store:
        return store.execute("SELECT count(*) FROM link_messages WHERE " + condition).fetchone()[0]


def database_bytes(service):
    return sum(path.stat().st_size for path in service.database.parent.glob("halvox.db*")
               if not path.name.endswith("-shm"))


class VacuumTest(unittest.TestCase):
    def send(self, client, numbers):
        for number in numbers:
            # Texts that differ, so that compression leaves something to delete.
            client.send({"number": number, "text": os.urandom(2000).hex()}, reporters=[7])

    def started(self, messages):
        service, client = start_service(self)
        client.begin(7, 7, "org.example.player")
        self.send(client, range(messages))
        wait_for("all messages", lambda: count(service) == messages)
        return service, client

    def test_a_running_service_deletes_down_to_a_size_and_goes_on(self):
        service, client = self.started(1500)
        before = database_bytes(service)
        self.assertGreater(before, 2 << 20)

        shown = json.loads(service.ctl("vacuum", "--to", "1M", "--json").stdout)

        self.assertLessEqual(shown["bytes"], 1 << 20)
        self.assertLessEqual(database_bytes(service), 1 << 20)
        self.assertGreaterEqual(shown["bytes_before"], 2 << 20)
        self.assertGreater(count(service, "payload ->> 'number' = 1499"), 0)
        self.assertEqual(count(service, "payload ->> 'number' = 0"), 0)
        self.send(client, [1500])
        wait_for("a message after it", lambda: count(service, "payload ->> 'number' = 1500"))

    def test_older_records_are_deleted_and_newer_ones_stay(self):
        service, client = self.started(20)
        with connect_to_store(service.database) as store:
            last, = store.execute("SELECT max(time) FROM link_messages").fetchone()
        wait_for("a later time", lambda: time.time() > last + 0.002)
        cut = time.time()
        self.send(client, range(20, 30))
        wait_for("all messages", lambda: count(service) == 30)

        service.ctl("vacuum", "--older", f"@{cut:.6f}")

        self.assertEqual((count(service), count(service, "payload ->> 'number' < 20")), (10, 0))

    def test_messages_that_come_meanwhile_are_all_stored(self):
        service, client = self.started(1500)
        done = []
        vacuum = threading.Thread(target=lambda: done.append(service.ctl("vacuum", "--to", "1M")))
        vacuum.start()
        for number in range(5000, 5200):
            client.send({"number": number}, reporters=[7])
        vacuum.join()

        self.assertEqual(len(done), 1, "the vacuum failed")
        self.assertIn("a vacuum begins", service.log())
        self.assertIn("the vacuum has ended", service.log())
        wait_for("the messages", lambda: count(service, "payload ->> 'number' >= 5000") == 200)

    def test_without_a_service_halvoxctl_does_it(self):
        service, _ = self.started(1500)
        service.stop()

        shown = json.loads(service.ctl("vacuum", "--to", "1M", "--json").stdout)

        self.assertLessEqual(shown["bytes"], 1 << 20)
        service.start()
        self.assertGreater(count(service, "payload ->> 'number' = 1499"), 0)

    def test_a_killed_service_leaves_a_log_that_is_applied_first(self):
        service, _ = self.started(10)
        service.process.kill()
        service.process.wait(DEADLINE)

        service.ctl("vacuum", "--older", "1h")

        self.assertEqual(count(service), 10)

    def test_what_is_asked_wrongly_is_refused(self):
        service, client = start_service(self)
        for arguments in ([], ["--to", "much"], ["--older", "2999-01-01"]):
            with self.subTest(arguments=arguments):
                service.ctl("vacuum", *arguments, status=2)
        for options, complaint in (({"olderr": 1}, "expected the options"),
                                   ({"to": 100}, "must be at least 1048576")):
            with self.assertRaisesRegex(Exception, complaint):
                client.call("BeginVacuum", "a{sv}", variants(options), interface=STORAGE)


if __name__ == "__main__":
    unittest.main()
