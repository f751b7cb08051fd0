"""`halvoxctl verify` finds what is damaged or missing in a store, and nothing else."""

import contextlib
import json
import os
import signal
import sqlite3
import subprocess
import threading
import unittest
from pathlib import Path

import harness
from harness import CTL, Service, wait_for

SESSION_GENERIC, JOULEBOOK, HAPTICS = 0x08000001, 8, 3
SUMMARIES = "root/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Reporting"


class Verify(unittest.TestCase):
    def service(self, config=""):
        service = Service(config)
        self.addCleanup(service.__exit__, None, None, None)
        return service.start()

    def verify(self, service, status=0):
        """The differences, as pairs of place and text, and the totals."""
        shown = service.ctl("verify", "--json", status=status).stdout
        *differences, totals = map(json.loads, shown.splitlines())
        self.assertEqual(totals["differences"], len(differences))
        return [(one["place"], one["difference"]) for one in differences], totals

    def send(self, service, count):
        client = service.client()
        client.create(7)
        client.start_later(7)
        for number in range(count):
            client.send({"number": number}, reporters=[7])
        client.stop(7)
        client.close()

    def test_a_store_is_in_order_while_the_service_runs_and_after_its_end(self):
        service = self.service()
        self.send(service, 500)
        wait_for("the events", lambda: service.database.exists() and len(service.events()) >= 1000)
        differences, totals = self.verify(service)
        self.assertEqual(differences, [])
        self.assertGreaterEqual(totals["records"], 1000)
        self.assertEqual(service.stop(), 0)
        self.assertEqual(self.verify(service)[0], [])

    def test_text_output_says_what_was_verified(self):
        service = self.service()
        self.assertEqual(service.stop(), 0)
        self.assertRegex(service.ctl("verify").stdout,
                         r"^verified \d+ records, 0 captures and 0 summary files: no differences\n$")

    def test_a_store_that_does_not_exist_is_an_error(self):
        service = self.service()
        service.ctl("verify", "--database", service.directory / "none", status=2)

    def test_a_deleted_row_is_found_and_named(self):
        service = self.service()
        self.send(service, 500)
        self.assertEqual(service.stop(), 0)
        with contextlib.closing(sqlite3.connect(service.database)) as database, database:
            [(block,)] = database.execute("SELECT min(id) FROM message_blocks").fetchall()
            database.execute("DELETE FROM message_blocks WHERE id = ?", (block,))
        differences, _ = self.verify(service, status=1)
        self.assertIn(f"message_spans, row {block}", [place for place, _ in differences])

    def test_missing_captures_and_truncated_summaries_are_found(self):
        service = self.service("[device]\nInternalBuild = true\n")
        client = service.client()
        client.create(7)
        client.set_type(HAPTICS, 7)
        client.start_later(7)
        for seconds in (1.0, 2.0):
            client.send({"Haptic_Active_Hardware_Time_Seconds": seconds}, SESSION_GENERIC, JOULEBOOK, [7])
        client.stop(7)
        client.close()
        state = service.database.parent
        wait_for("the record of the capture",
                 lambda: len(service.ctl("snapshots", "--json").stdout.splitlines()) == 1)
        [capture] = (state / "snapshots").glob("*.tar.zst")
        [summary] = (state / SUMMARIES).glob("*.json")
        self.assertEqual(service.stop(), 0)
        differences, totals = self.verify(service)
        self.assertEqual((differences, totals["captures"], totals["summaries"]), ([], 1, 1))

        os.truncate(summary, summary.stat().st_size // 2)
        [(place, _)], _ = self.verify(service, status=1)
        self.assertEqual(place, str(summary))
        summary.unlink()
        os.truncate(capture, capture.stat().st_size // 2)
        [(place, _)], _ = self.verify(service, status=1)
        self.assertEqual(place, str(capture))
        capture.unlink()
        self.assertEqual(self.verify(service, status=1)[0],
                         [(str(capture), "this capture is recorded, but is missing")])

    def test_a_truncated_log_is_found_once_the_service_was_killed(self):
        service = self.service()
        self.send(service, 100)
        wait_for("the events", lambda: service.database.exists() and len(service.events()) >= 200)
        service.process.send_signal(signal.SIGKILL)
        service.process.wait(harness.DEADLINE)
        log = Path(f"{service.database}-wal")
        os.truncate(log, log.stat().st_size - 5000)
        [(place, what)], _ = self.verify(service, status=1)
        self.assertTrue(place.startswith(f"{log}, offset "), place)
        self.assertIn("is missing; the commits from there on are lost", what)

    def test_a_store_is_in_order_after_each_of_several_kills_under_load(self):
        service = Service()
        self.addCleanup(service.__exit__, None, None, None)
        stored = 0
        for _ in range(3):
            service.start()
            sender = threading.Thread(target=self.send_until_the_end, args=(service,))
            sender.start()
            wait_for("more events", lambda: self.stored(service) > stored + 300)
            service.process.send_signal(signal.SIGKILL)
            service.process.wait(harness.DEADLINE)
            sender.join(harness.DEADLINE)
            stored = self.stored(service)
            self.assertEqual(self.verify(service)[0], [])

    def send_until_the_end(self, service):
        client = service.client()
        client.create(1)
        number = 0
        with contextlib.suppress(Exception):
            while True:
                client.send({"number": number, "text": "x" * (number % 700)}, reporters=[1])
                number += 1

    def stored(self, service):
        if not service.database.exists():
            return 0
        query = "SELECT count(*) AS count FROM analytics_events"
        result = subprocess.run([CTL, "sql", "--json", query], capture_output=True, text=True, check=False,
                                env=service.ctl_environment(), timeout=harness.DEADLINE)
        return json.loads(result.stdout)["count"] if result.returncode == 0 else 0


if __name__ == "__main__":
    unittest.main()
