"""What was answered is kept, whatever kills the service afterwards."""

import contextlib
import json
import os
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
from harness import Client, Service, wait_for


LOAD_SECONDS = 2


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
        reader = threading.Thread(
            target=lambda: answered.extend(
                (float(line.split()[0]), int(line.split()[1])) for line in sender.stdout))
        reader.start()
        wait_for("load", lambda: len(service.events()) > 2)
        time.sleep(LOAD_SECONDS)  # the quantity of load, not a wait for something

        killed = time.monotonic()
        service.process.send_signal(signal.SIGKILL)
        service.process.wait(harness.DEADLINE)
        sender.wait(harness.DEADLINE)
        reader.join(harness.DEADLINE)

        with contextlib.closing(sqlite3.connect(service.database)) as database:
            self.assertEqual(database.execute("PRAGMA integrity_check").fetchall(), [("ok",)])
            rows = database.execute("SELECT name, payload FROM analytics_events").fetchall()
        numbers = [json.loads(payload)["number"] for name, payload in rows
                   if name.startswith("com.tarno.halvox.")]
        self.assertEqual(numbers, sorted(numbers))
        owed = {number for when, number in answered if when < killed - 0.5}
        self.assertGreater(len(owed), 100, "the load was too short to show anything")
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


def send_until_the_end(address):
    """Sends numbered messages, one after the other, and prints when each was answered."""
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
