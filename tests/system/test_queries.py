"""Questions in SQL about the store, and the plain database that any program can read."""

import contextlib
import json
import os
import sqlite3
import subprocess
import unittest

from harness import CTL, DEADLINE, connect_to_store, start_service, wait_for

TABLES = ("analytics_events", "issue_metrics", "power_events", "link_messages", "snapshots")
MESSAGES = 600


class QueriesTest(unittest.TestCase):
    """A service that runs and has stored messages of two sessions."""

    def setUp(self):
        self.service, self.client = start_service(self)
        for session in (7, 8):
            self.client.begin(session, 7, f"org.app{session}")
        for number in range(MESSAGES):
            self.client.send({"number": number}, reporters=[7 + number % 2])
        wait_for("all messages", lambda: self.stored() == MESSAGES)

    def stored(self):
        return int(self.ctl("sql", "SELECT count(*) FROM link_messages"
                            " WHERE payload ->> 'number' IS NOT NULL").stdout.split()[1])

    def ctl(self, *arguments, **options):
        return self.service.ctl(*arguments, **options)

    def json(self, *arguments):
        return [json.loads(line) for line in self.ctl(*arguments, "--json").stdout.splitlines()]

    def test_queries_show_what_other_programs_read_with_the_extension(self):
        with connect_to_store(self.service.database) as store:
            for session in (7, 8):
                sql = f"SELECT time, payload FROM link_messages WHERE session_id = {session}"
                self.assertEqual([(row["time"], row["payload"]) for row in self.json("sql", sql)],
                                 store.execute(sql).fetchall())

    def test_events_can_be_asked_for_by_application(self):
        # The events of the client's messages name the application of their session.
        rows = self.json("sql", "SELECT DISTINCT application FROM halvox_events"
                                " WHERE payload ->> 'number' IS NOT NULL ORDER BY 1")
        applications = [row["application"] for row in rows]
        self.assertEqual(applications, ["org.app7", "org.app8"])
        for application in applications:
            [row] = self.json("sql", "SELECT count(*) AS n FROM halvox_events"
                                     f" WHERE application = '{application}'")
            self.assertGreater(row["n"], 0)
        payloads = self.json("sql", "SELECT DISTINCT payload ->> 'HostApplicationDisplayID' AS a"
                                    " FROM analytics_events"
                                    " WHERE payload ->> 'number' IS NOT NULL ORDER BY 1")
        self.assertEqual(applications, [row["a"] or "" for row in payloads])

    def test_statements_come_from_the_input(self):
        self.assertEqual(self.ctl("sql", stdin="SELECT 1 AS a;\nSELECT 2 AS b").stdout,
                         "a\n1\nb\n2\n")

    def test_the_store_cannot_be_changed(self):
        for sql in ("DELETE FROM message_blocks", "DROP VIEW snapshots", "BEGIN"):
            self.assertIn("only SELECT is allowed", self.ctl("sql", sql, status=2).stderr)

    def test_a_reader_that_waits_does_not_keep_the_log_from_being_reused(self):
        slow = subprocess.Popen(
            [CTL, "sql", "SELECT a.payload, b.payload FROM link_messages AS a, link_messages AS b"
                         " LIMIT 20000"],
            stdout=subprocess.PIPE, env={**os.environ, "HALVOX_CONFIG": str(self.service.config)})
        self.addCleanup(slow.wait, DEADLINE)
        self.addCleanup(slow.stdout.close)
        # The first line comes when the statement has ended. halvoxctl then waits until the rest is read.
        slow.stdout.readline()

        def log_is_copied_whole():
            with contextlib.closing(sqlite3.connect(self.service.database)) as database:
                busy, pages, copied = database.execute("PRAGMA wal_checkpoint(RESTART)").fetchone()
            return not busy and pages == copied
        self.client.send({"more": 1}, reporters=[7])
        wait_for("a checkpoint that no reader prevents", log_is_copied_whole)
        self.assertIsNone(slow.poll())

    def test_an_export_is_a_plain_database_with_the_same_rows(self):
        file = self.service.directory / "plain.db"
        [answer] = self.json("export", "--format", "sqlite", "--to", str(file))
        total = 0
        with contextlib.closing(sqlite3.connect(file)) as plain, \
                connect_to_store(self.service.database) as store:
            for table in TABLES:
                rows = plain.execute(f"SELECT * FROM {table}").fetchall()
                self.assertEqual(rows, store.execute(f"SELECT * FROM {table}").fetchall(), table)
                total += len(rows)
        self.assertEqual(answer["records"], total)
        self.assertGreaterEqual(total, 3 * MESSAGES)
        self.assertIn("--force", self.ctl("export", "--to", str(file), status=2).stderr)
        self.ctl("export", "--to", str(file), "--force")


if __name__ == "__main__":
    unittest.main()
