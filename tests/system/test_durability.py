"""Whatever was answered is kept, however the service is killed afterwards."""

import contextlib
import json
import os
import re
import shutil
import signal
import sqlite3
import subprocess
import sys
import threading
import time
import unittest
from pathlib import Path

import harness
from harness import Client, Service, connect_to_store, wait_for


# This number of messages is answered more than half a second before the kill.
OWED = 1000


class Durability(unittest.TestCase):
    def test_database_survives_kill_under_load_and_lacks_at_most_half_a_second(self):
        service = Service()
        self.addCleanup(shutil.rmtree, service.directory, True)
        service.start()
        sender = subprocess.Popen(
            ["/usr/bin/python3", __file__, "--send", service.address],
            stdout=subprocess.PIPE, text=True, cwd=Path(__file__).parent,
            env={**os.environ, "PYTHONDONTWRITEBYTECODE": "1"})
        self.addCleanup(sender.stdout.close)
        answered = []  # (monotonic time of the answer, number)

        def read_answers():
            for line in sender.stdout:
                when, number = line.split()
                answered.append((float(when), int(number)))

        reader = threading.Thread(target=read_answers)
        reader.start()
        wait_for("answers that are older than half a second",
                 lambda: len(answered) > OWED and answered[OWED][0] < time.monotonic() - 0.5)

        killed = time.monotonic()
        service.process.send_signal(signal.SIGKILL)
        service.process.wait(harness.DEADLINE)
        sender.wait(harness.DEADLINE)
        reader.join(harness.DEADLINE)

        with connect_to_store(service.database, "rw") as database:
            self.assertEqual(database.execute("PRAGMA integrity_check").fetchall(), [("ok",)])
            rows = database.execute("SELECT name, payload FROM analytics_events").fetchall()
        numbers = [json.loads(payload)["number"] for name, payload in rows
                   if name.startswith("com.tarno.halvox.")]
        self.assertEqual(numbers, sorted(numbers))
        owed = {number for when, number in answered if when < killed - 0.5}
        self.assertGreater(len(owed), OWED, "the load was too short to show anything")
        self.assertEqual(owed - set(numbers), set())

    def test_orderly_end_keeps_everything_and_a_new_start_adds_to_it(self):
        service = Service()
        self.addCleanup(shutil.rmtree, service.directory, True)
        for run in range(2):
            service.start()
            client = service.client()
            for number in range(100):
                client.send({"run": run, "number": number}, reporters=None)
            client.close()
            self.assertEqual(service.stop(), 0)

        payloads = [payload for name, payload in service.events() if ".halvox." in name]
        self.assertEqual([(payload["run"], payload["number"]) for payload in payloads],
                         [(run, number) for run in range(2) for number in range(100)])

    def reported_ends(self, service):
        """The events about how earlier runs ended, as `halvoxctl events` shows them."""
        shown = service.ctl("events", "--name", "com.tarno.reporting.lastrun", "--json").stdout
        return [json.loads(line)["payload"] for line in shown.splitlines()]

    def test_a_clean_stop_a_crash_and_a_power_cut_are_told_apart_at_the_next_start(self):
        service = Service()
        self.addCleanup(shutil.rmtree, service.directory, True)
        self.addCleanup(service.stop)
        service.start()
        self.assertEqual(service.stop(), 0)
        for run in (2, 3):
            service.start()
            wait_for("the new run in the store",
                     lambda run=run: len(self.runs(service)) == run)
            service.process.send_signal(signal.SIGKILL)
            service.process.wait(harness.DEADLINE)
        # As if the system had restarted after the last kill.
        with contextlib.closing(sqlite3.connect(service.database)) as database, database:
            database.execute("UPDATE run_records SET boot_id = 'an earlier one' WHERE ending IS NULL")
        service.start()
        wait_for("the second report", lambda: len(self.reported_ends(service)) == 2)
        ends = self.reported_ends(service)

        self.assertEqual([(end["run"], end["end"], end.get("missing_seconds")) for end in ends],
                         [(2, "crash", 0.5), (3, "power cut", None)])
        runs = self.runs(service)
        self.assertEqual([ending for *_, ending in runs], ["clean", "crash", "power cut", None])
        self.assertEqual([(end["start"], end["last_commit"]) for end in ends],
                         [(start, commit) for start, commit, _ in runs[1:3]])
        self.assertIn("the last run did not close the store (power cut)", service.log())

    def runs(self, service):
        with connect_to_store(service.database) as database:
            return database.execute("SELECT start, last_commit, ending FROM runs").fetchall()

    def fill(self, service, megabytes):
        """Puts events of earlier runs into the database of a service that does not run."""
        payload = json.dumps({"text": "x" * 8000})
        with contextlib.closing(sqlite3.connect(service.database)) as database:
            with database:
                database.execute("INSERT OR IGNORE INTO event_names(id, name) VALUES (9, 'old')")
                database.executemany(
                    "INSERT INTO analytics_records(time, name_id, payload) VALUES (?, 9, ?)",
                    ((time.time(), payload) for _ in range(megabytes * 1000 // 8)))
            database.execute("PRAGMA wal_checkpoint(TRUNCATE)")

    def stopped_service_with_a_store_of(self, megabytes):
        service = Service()
        self.addCleanup(shutil.rmtree, service.directory, True)
        service.start()
        self.assertEqual(service.stop(), 0)
        self.fill(service, megabytes)
        return service

    def test_start_after_an_orderly_end_does_not_read_the_database(self):
        service = self.stopped_service_with_a_store_of(40)
        self.addCleanup(service.stop)
        service.start()
        read = int(re.search(r"rchar: (\d+)",
                             Path(f"/proc/{service.process.pid}/io").read_text())[1])
        self.assertGreater(service.database.stat().st_size, 40_000_000)
        self.assertLess(read, 8_000_000)

    def test_damage_after_a_kill_is_found_while_the_service_already_serves(self):
        service = self.stopped_service_with_a_store_of(40)
        service.start()
        service.process.send_signal(signal.SIGKILL)
        service.process.wait(harness.DEADLINE)
        self.assertTrue(Path(f"{service.database}-wal").exists(), "the end was an orderly one")
        with open(service.database, "r+b") as file:
            file.seek(20_000_000)
            file.write(b"\xa5" * 40_000)

        self.addCleanup(service.stop)
        service.start()
        client = service.client()
        client.send({"number": 1}, reporters=None)
        wait_for("the new database", lambda: "to the new database" in service.log(), 120)
        client.send({"number": 2}, reporters=None)
        service.wait_for_payload(lambda payload: payload.get("number") == 2)

        numbers = [payload["number"] for name, payload in service.events() if ".halvox." in name]
        self.assertEqual(numbers, [1, 2])
        self.assertEqual(len(list(service.database.parent.glob("halvox.db.damaged-*Z"))), 1)


def send_until_the_end(address):
    """Sends numbered messages, one after the other, and prints the time of each answer."""
    client = Client.to_socket(address)
    client.create(1)
    number = 0
    with contextlib.suppress(Exception):
        while True:
            client.send({"number": number}, reporters=[1])
            print(time.monotonic(), number, flush=False)
            number += 1
    sys.stdout.flush()


if __name__ == "__main__":
    if sys.argv[1:2] == ["--send"]:
        send_until_the_end(sys.argv[2])
    else:
        unittest.main()
