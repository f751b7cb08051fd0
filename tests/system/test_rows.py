"""Commands that show stored rows: following without a gap, cursors, and what a person at a terminal
sees."""

import itertools
import json
import os
import pty
import re
import select
import subprocess
import threading
import time
import unittest

import usage
from harness import (CTL, DEADLINE, WITH_US, Service, connect_to_store, require, stop_process,
                     wait_for)
from terminal import lines_at_terminal

ESCAPE = re.compile("\x1b\\[[0-9;]*m")
NUMBER = re.compile(rb'"number":(\d+)')


class WithMessages(unittest.TestCase):
    """A service with a session, whose messages have numbers."""

    config = ""

    def setUp(self):
        self.service = Service(self.config)
        self.service.__enter__()
        self.addCleanup(self.service.__exit__)
        self.begin()

    def begin(self):
        self.client = self.service.client()
        self.addCleanup(self.client.close)
        self.client.begin(7, 7, "org.example.player")

    def send(self, numbers, **more):
        for number in numbers:
            self.client.send({"number": number, **more}, reporters=[7])

    def wait_for_number(self, number):
        wait_for(f"message {number}", lambda: self.query(
            "SELECT count(*) FROM link_messages WHERE payload ->> 'number' = ?", number)[0][0])

    def query(self, sql, *arguments):
        with connect_to_store(self.service.database) as store:
            return store.execute(sql, arguments).fetchall()

    def environment(self, **more):
        return self.service.ctl_environment(**more)

    def ctl(self, *arguments, **options):
        return self.service.ctl(*arguments, **options)

    def numbers(self, *arguments):
        """The numbers of the messages that are shown as lines."""
        return [int(number) for number in re.findall(r"\bnumber=(\d+)", self.ctl(*arguments).stdout)]


class Tail:
    """A halvoxctl that follows. A thread reads its output: a follower that has to wait for its reader
    would be overtaken by the removal of rows."""

    # The store keeps at least twice as many messages, also when large blocks are removed.
    LAG = 300

    def __init__(self, test, command, since):
        self._since = since
        self._shown = 0
        self._errors = test.service.directory / f"errors-{id(self)}"
        with open(self._errors, "wb") as errors:
            self._process = subprocess.Popen(
                [*WITH_US, str(CTL), command, "--since", f"@{since:.6f}", "--follow", "--json"],
                stdin=subprocess.DEVNULL, stdout=subprocess.PIPE, stderr=errors,
                env=test.environment())
        self._lines = []
        self._reader = threading.Thread(target=self._read)
        self._reader.start()
        test.addCleanup(self.close)

    def _read(self):
        for line in self._process.stdout:
            self._lines.append(line)
            if number := NUMBER.search(line):
                self._shown = int(number[1])

    def may_be_sent(self, number):
        """False as long as this follower might be overtaken by the removal of rows."""
        if time.time() < self._since:
            self._shown = number
        return number - self._shown <= self.LAG

    def rows_to(self, number, times):
        """Waits until this number was shown that often. Returns all rows with numbers."""
        text = f'"number":{number},'.encode()
        wait_for(f"message {number}",
                 lambda: sum(text in line for line in self._lines[-20:]) == times)
        rows = [json.loads(line) for line in self._lines]
        return [row for row in rows if "number" in row["payload"]]

    def errors(self):
        return self._errors.read_text()

    def close(self):
        stop_process(self._process)
        self._reader.join(DEADLINE)
        self._process.stdout.close()


class TailTest(WithMessages):
    # So small that records are removed while the messages come.
    config = "retention_days = 30\nmax_megabytes = 6\n"
    MESSAGES = 2000

    def test_following_since_any_time_repeats_and_misses_nothing(self):
        self.send(range(500), text="x" * 100)
        times = [time.time()] * 500
        followers = []

        def send_all():
            for number in range(500, self.MESSAGES):
                # Followers are slow under sanitizers. The load waits for them.
                wait_for("the followers", lambda number=number: all(
                    follower.may_be_sent(number) for _, _, follower in list(followers)))
                times.append(time.time())
                # Random texts fill the store: they cannot be compressed much.
                self.client.send({"number": number, "text": os.urandom(3600).hex()}, reporters=[7])
        sender = threading.Thread(target=send_all)
        sender.start()
        # Some follow from the beginning of the load, some from a time shortly before or after they
        # start. Each runs while rows of few messages are joined and old ones are removed.
        for step in range(6):
            wait_for("more messages", lambda: len(times) >= 800 + step * 200)
            since = (times[500], times[-200], time.time() + 0.2)[(0, 1, 0, 2, 0, 1)[step]]
            for command in ("events", "link"):
                followers.append((command, since, Tail(self, command, since)))
        wait_for("the end of the load", lambda: not sender.is_alive(), deadline=4 * DEADLINE)
        self.wait_for_number(self.MESSAGES - 1)

        [[sealed]] = self.query("SELECT count(*) FROM message_spans")
        self.assertGreater(sealed, 3)
        [[oldest]] = self.query("SELECT min(payload ->> 'number') FROM link_messages")
        self.assertGreater(oldest, 500, "nothing was removed while the messages came")
        for command, since, follower in followers:
            table = "analytics_events" if command == "events" else "link_messages"
            stored = self.query(f"SELECT time, payload ->> 'number' FROM {table} WHERE time >= ?"
                                " AND payload ->> 'number' IS NOT NULL", since)
            names = 2 if command == "events" else 1
            shown = follower.rows_to(self.MESSAGES - 1, names)
            self.assertEqual(follower.errors(), "")
            ids = [int(re.fullmatch(rf"{command}:(\d+)@.*", row["cursor"])[1]) for row in shown]
            self.assertEqual(ids, sorted(set(ids)), "a row was repeated, or the order is wrong")
            rows = [(row["time"], row["payload"]["number"]) for row in shown]
            # What is still stored was shown, and nothing else since then.
            self.assertEqual(rows[-len(stored):], stored)
            # What has been removed meanwhile was shown without a gap.
            counts = {}
            for _, number in rows:
                counts[number] = counts.get(number, 0) + 1
            first = min(counts)
            self.assertEqual(sorted(counts), list(range(first, self.MESSAGES)),
                             f"{command}: the service lost {self.query('SELECT * FROM losses')}")
            # The time may lie between the two events of the first message.
            self.assertEqual({count for number, count in counts.items() if number != first}, {names})

    def test_a_reader_that_is_overtaken_by_the_removal_of_rows_is_told(self):
        process = subprocess.Popen(
            [*WITH_US, str(CTL), "link", "--json", "--follow"], stdout=subprocess.PIPE,
            stderr=subprocess.PIPE, env=self.environment())
        self.addCleanup(process.wait, DEADLINE)
        self.addCleanup(process.stderr.close)
        self.addCleanup(process.stdout.close)
        self.addCleanup(process.kill)
        numbers = itertools.count()

        def is_removed():
            # Nobody reads: the pipe is soon full, and the follower waits.
            for _ in range(500):
                self.client.send({"number": next(numbers), "text": os.urandom(600).hex()},
                                 reporters=[7])
            [[oldest]] = self.query("SELECT min(payload ->> 'number') FROM link_messages")
            return oldest > 2000
        wait_for("rows to be removed", is_removed)
        os.set_blocking(process.stdout.fileno(), False)

        def error():
            process.stdout.read()
            return select.select([process.stderr], [], [], 0.01)[0] and process.stderr.readline()
        self.assertEqual(wait_for("the message", error).decode(),
                         "halvoxctl link: rows are missing: the store removed them before they were"
                         " read\n")


class CursorTest(WithMessages):
    def cursor_after(self, *arguments):
        return re.search("^-- cursor: (.*)$", self.ctl(*arguments, "--show-cursor").stdout, re.M)[1]

    def test_each_run_continues_where_the_one_before_ended(self):
        self.send(range(5))
        self.wait_for_number(4)
        for command in ("events", "link"):
            grep = ("--grep", '"number"')
            cursor = self.cursor_after(command, *grep)
            self.assertEqual(self.numbers(command, "--after-cursor", cursor, *grep), [])
            # Nothing new: the same cursor is printed again.
            self.assertEqual(self.cursor_after(command, "--after-cursor", cursor, *grep), cursor)
            self.assertEqual(self.numbers(command, "--cursor", cursor, *grep), [4])
            self.assertEqual(self.numbers(command, "--cursor", cursor, "-r", *grep),
                             [4, 3, 2, 1, 0])
            self.assertEqual(self.numbers(command, "--after-cursor", cursor, "-r", *grep),
                             [3, 2, 1, 0])

    def test_a_cursor_survives_a_restart_of_the_service(self):
        self.send(range(3))
        self.wait_for_number(2)
        cursors = {command: self.cursor_after(command, "--grep", '"number"')
                   for command in ("events", "link")}
        self.client.close()
        self.service.stop()
        self.service.start()
        self.begin()
        self.send(range(3, 5))
        self.wait_for_number(4)
        for command, cursor in cursors.items():
            result = self.ctl(command, "--after-cursor", cursor, "--grep", '"number"')
            self.assertEqual(re.findall(r"number=(\d+)", result.stdout), ["3", "4"])
            self.assertEqual(result.stderr, "")

    def test_json_has_the_cursor_of_each_row(self):
        self.send(range(4))
        self.wait_for_number(3)
        for command in ("events", "link"):
            rows = [json.loads(line) for line in
                    self.ctl(command, "--json", "--grep", '"number"').stdout.splitlines()]
            for place, row in enumerate(rows):
                after = self.ctl(command, "--json", "--grep", '"number"', "--after-cursor",
                                 row["cursor"]).stdout.splitlines()
                self.assertEqual([json.loads(line) for line in after], rows[place + 1:])

    def test_a_cursor_of_a_removed_row_goes_on_with_the_next_and_says_so(self):
        # Two transactions, which make two rows of the store.
        self.send([0])
        self.wait_for_number(0)
        self.send(range(1, 5))
        self.wait_for_number(4)
        first = json.loads(self.ctl("link", "--json", "--grep", '"number"').stdout.splitlines()[0])
        self.client.close()
        self.service.stop()
        last = first["cursor"]
        with connect_to_store(self.service.database, "rw") as store:
            # As retention does: whole rows, from the oldest on.
            number = int(re.search(r":(\d+)@", last)[1])
            store.execute("DELETE FROM message_blocks WHERE id <= ?", (number,))
            store.commit()
        result = self.ctl("link", "--after-cursor", last, "--grep", '"number"')
        self.assertIn("was removed from the store; showing the rows after it", result.stderr)
        shown = [int(number) for number in re.findall(r"number=(\d+)", result.stdout)]
        self.assertEqual(shown, sorted(shown))
        self.assertEqual(shown[-1], 4)
        self.assertNotIn(0, shown)

    def test_a_wrong_cursor_is_refused(self):
        self.assertIn("is not a cursor", self.ctl("events", "--cursor", "x", status=2).stderr)
        self.send([0])
        self.wait_for_number(0)
        self.assertIn('begins with "events:"',
                      self.ctl("events", "--cursor", "link:1@5", status=2).stderr)


class OrderTest(WithMessages):
    def test_newest_first_is_the_opposite_order(self):
        self.send(range(300))
        self.wait_for_number(299)
        for command in ("events", "link"):
            self.assertEqual(self.numbers(command), list(range(300)))
            self.assertEqual(self.numbers(command, "-r"), list(reversed(range(300))))
            self.assertEqual(self.numbers(command, "-r", "-n", "2", "--grep", '"number"'), [299, 298])
            self.assertEqual(self.numbers(command, "-n", "2", "--grep", '"number"'), [298, 299])
        self.assertIn("--reverse", self.ctl("events", "-r", "-f", status=2).stderr)

    def test_each_message_is_shown_once_unless_all_names_are_asked_for(self):
        self.send(range(3))
        self.wait_for_number(2)
        self.assertEqual(self.numbers("events"), [0, 1, 2])
        self.assertEqual(self.numbers("events", "--all-names"), [0, 0, 1, 1, 2, 2])
        self.assertIn("com.tarno.longformaudio.", self.ctl("events", "-n", "1").stdout)
        # The name that was asked for is shown.
        self.assertEqual(self.numbers("events", "--name", "com.tarno.halvox.*"), [0, 1, 2])
        names = [json.loads(line)["name"] for line in self.ctl("events", "--json").stdout.splitlines()]
        self.assertEqual(len([name for name in names if name.endswith("Playback.Start")]), 6)

    def test_own_connections_are_shown_only_if_asked_for(self):
        self.ctl("list")
        wait_for("the event of the connection", lambda: self.query(
            "SELECT count(*) FROM analytics_events WHERE payload ->> 'processName' = 'halvoxctl'")[0][0])
        self.assertNotIn("processName=halvoxctl", self.ctl("events").stdout)
        self.assertIn("processName=halvoxctl", self.ctl("events", "--own").stdout)
        self.assertIn('"processName":"halvoxctl"', self.ctl("events", "--json").stdout)

    def test_utc_is_shown_and_taken(self):
        self.send([0])
        self.wait_for_number(0)
        line = self.ctl("link", "--utc", "-n", "1").stdout
        self.assertRegex(line, r"^\d{4}-\d\d-\d\d \d\d:\d\d:\d\d\.\d{3}Z  7  ")
        self.assertEqual(self.ctl("link", "--utc", "--since", line[:24], "-n", "1").stdout, line)

    @unittest.skipIf(os.environ.get("HALVOX_SANITIZE"), "sanitizers keep freed memory")
    def test_memory_does_not_grow_with_the_rows(self):
        self.send(range(2000), text="x" * 20000)
        self.wait_for_number(1999)
        peaks = []
        for arguments in (["-n", "10"], ["-r"], [], ["-n", "1900"]):
            status, _, _, peak = usage.run([*WITH_US, CTL, "events", *arguments], self.environment())
            self.assertEqual(status, 0)
            peaks.append(peak)
        # The payloads are 80 MB.
        self.assertLess(max(peaks) - peaks[0], 30, peaks)


class TerminalTest(WithMessages):
    def setUp(self):
        super().setUp()
        self.send(range(60), text="x" * 200)
        self.wait_for_number(59)

    def lines(self, *arguments, **more):
        return lines_at_terminal(self.service, *arguments, **more)

    def test_every_line_fits_the_terminal(self):
        for command in ("events", "link", "power", "metrics"):
            for columns in (40, 80, 132):
                for line in self.lines(command, "--no-pager", columns=columns):
                    self.assertLessEqual(len(ESCAPE.sub("", line)), columns, line)

    def test_long_values_are_cut_unless_they_are_asked_for(self):
        [line] = self.lines("link", "-n", "1", "--no-pager", "--grep", '"number"')
        self.assertTrue(line.endswith("…"), line)
        [line] = self.lines("link", "-n", "1", "--no-pager", "--full", "--grep", '"number"')
        self.assertIn("x" * 200, line)
        self.assertNotIn("…", line)
        # Without a terminal nothing is cut.
        self.assertNotIn("…", self.ctl("link").stdout)

    def test_columns_are_aligned(self):
        lines = self.lines("link", "--no-pager", "--grep", '"number"', NO_COLOR="1", columns=120)
        self.assertEqual(len(lines), 60)
        self.assertEqual(len({line.index("Playback/Start") for line in lines}), 1)

    def test_colours_are_for_terminals_without_no_color(self):
        self.assertIn("\x1b[", "".join(self.lines("events", "--no-pager")))
        self.assertNotIn("\x1b", "".join(self.lines("events", "--no-pager", NO_COLOR="1")))
        self.assertNotIn("\x1b", self.ctl("events").stdout)

    def test_a_pager_shows_the_output_of_a_terminal(self):
        pager = self.service.directory / "pager"
        pager.write_text('#!/bin/sh\necho "pager $1 LESS=$LESS"\nexec cat\n')
        pager.chmod(0o755)
        lines = self.lines("events", HALVOX_PAGER=f"{pager} word", PAGER="false")
        self.assertEqual(lines[0], "pager word LESS=FRSXMK")
        self.assertEqual(lines[1:], self.lines("events", "--no-pager"))
        self.assertEqual(self.lines("link", "--json", PAGER=str(pager))[0][:6], "pager ")
        for direct in (["--no-pager"], []):
            self.assertEqual(self.lines("link", *direct, PAGER="false" if direct else "cat"),
                             self.lines("link", "--no-pager"))

    def test_without_a_pager_that_runs_the_output_is_printed(self):
        self.assertEqual(self.lines("events", PAGER="/nowhere/pager"),
                         self.lines("events", "--no-pager"))

    def test_quitting_the_pager_early_leaves_no_errors(self):
        self.send(range(60, 2000), text="x" * 200)
        self.wait_for_number(1999)
        for command in (["events"], ["events", "-r"], ["link"], ["link", "--json"]):
            lines = self.lines(*command, HALVOX_PAGER="head -n 2")
            self.assertEqual(len(lines), 2)

    def test_less_shows_a_short_output_and_ends(self):
        require("less")
        text = "\n".join(self.lines("events", "-n", "3"))
        self.assertEqual(len(re.findall(r"number=\d+", text)), 3, text)

    def test_a_terminal_gets_messages_that_follow_without_a_pager(self):
        master, slave = pty.openpty()
        process = subprocess.Popen(
            [*WITH_US, str(CTL), "link", "-f", "-n", "0"], stdin=subprocess.DEVNULL, stdout=slave,
            stderr=subprocess.PIPE, env=self.environment(TERM="xterm", PAGER="false"))
        os.close(slave)
        self.addCleanup(process.wait, DEADLINE)
        self.addCleanup(process.stderr.close)
        self.addCleanup(process.kill)
        self.addCleanup(os.close, master)
        output = b""

        numbers = itertools.count(1000)

        def is_shown():
            nonlocal output
            # Until the follower has begun, stored messages count as old for it.
            self.send([next(numbers)])
            if select.select([master], [], [], 0.1)[0]:
                output += os.read(master, 65536)
            return b"number=10" in output
        wait_for("a message at the terminal", is_shown)


if __name__ == "__main__":
    unittest.main()
