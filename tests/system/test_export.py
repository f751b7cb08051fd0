"""halvoxctl export: what other programs read is what the store has."""

import base64
import contextlib
import csv
import io
import json
import os
import pty
import resource
import signal
import subprocess
import tempfile
import unittest
from pathlib import Path

from harness import CTL, DEADLINE, WITH_US, Service, connect_to_store, stop_process, wait_for

SESSION_PLAYBACK = 0x08000004
START, STOP, ISSUE, JOULEBOOK = 1, 2, 7, 8
LONG_FORM_AUDIO = 7  # service type
# What the views of the store call the kinds, and their columns without those that are not exported.
TABLES = {
    "events": ("analytics_events", ("time", "name", "payload")),
    "metrics": ("issue_metrics", ("time", "metric_id", "message")),
    "power": ("power_events", ("time", "category_id", "event_name", "payload")),
    "link": ("link_messages", ("time", "session_id", "client_name", "service_name", "category",
                               "type", "payload")),
    "snapshots": ("snapshots", ("time", "signature", "path")),
    "losses": ("losses", ("time", "piece", "reason", "count")),
}
# What must survive: numbers at their limits, texts of any characters, nesting.
HOSTILE = {"large": 2**63 - 1, "small": -2**63, "fraction": 0.1, "whole": 1.0, "none": {},
           "text": "\"quoted\", \\ \n\r\t\x01\u2028\u202e=1+2 \U0001f600", "list": [1, [2.5, "x"]],
           "": "empty key"}
# A name that a spreadsheet would run.
FORMULA = "=HYPERLINK(\"http://x\",\"y\")"
APPLICATIONS = {7: "org.example.player", 8: FORMULA}


def exact(text):
    """Parses JSON and keeps numbers as they are written."""
    return json.loads(text, parse_int=str, parse_float=str)


def plain(value):
    """The JSON value of an AnyValue of OpenTelemetry."""
    if not value:
        return None
    [(kind, content)] = value.items()
    if kind == "kvlistValue":
        return {member["key"]: plain(member["value"]) for member in content["values"]}
    return [plain(item) for item in content["values"]] if kind == "arrayValue" else content


def attributes(of):
    return {one["key"]: plain(one["value"]) for one in of["attributes"]}


class ExportTestCase(unittest.TestCase):
    service = None

    @classmethod
    def start(cls):
        """Starts the service for all tests of a class. Returns a client."""
        cls.service = Service("[drivers]\nalsa = false\npipewire = false\n")
        cls.service.__enter__()
        cls.addClassCleanup(cls.service.__exit__)
        client = cls.service.client()
        cls.addClassCleanup(client.close)
        return client

    @classmethod
    def environment(cls):
        return cls.service.ctl_environment(TZ="UTC")

    def export(self, *arguments, status=0):
        result = subprocess.run([CTL, "export", *map(str, arguments)], capture_output=True,
                                check=False, timeout=DEADLINE, env=self.environment())
        self.assertEqual(result.returncode, status, result.stderr)
        return result

    def lines(self, *arguments):
        return self.split(self.export("--format", "jsonl", *arguments).stdout)

    @staticmethod
    def split(text):
        """The lines of an export. Payloads may hold what Python takes for other line ends."""
        *lines, rest = text.decode().split("\n")
        assert rest == "", rest
        return lines

    def rows(self, kind):
        """The rows of the store in the form of the exported lines, with exact numbers."""
        table, columns = TABLES[kind]
        with connect_to_store(self.service.database) as store:
            for row in store.execute(f"SELECT {', '.join(columns)} FROM {table}"):
                yield {name: self.cell(name, value) for name, value in zip(columns, row)}

    @staticmethod
    def cell(name, value):
        if name in ("payload", "signature"):
            return exact(value)
        if name == "message":
            return value.hex()
        return str(value) if isinstance(value, int) else value


class ExportTest(ExportTestCase):
    """A service that runs, with records of two applications."""

    @classmethod
    def setUpClass(cls):
        client = cls.start()
        for session, application in APPLICATIONS.items():
            client.begin(session, LONG_FORM_AUDIO, application)
            for message, kind in (({"run": 1}, START), (HOSTILE, JOULEBOOK),
                                  ({"issue_type": "xrun", "node": "mixer",
                                    "rtaid_client": application}, ISSUE),
                                  ({"EngineOnTime": 4.5}, JOULEBOOK), ({"run": 1}, STOP)):
                client.send(message, SESSION_PLAYBACK, kind, [session])
            client.stop(session)

        def is_complete():
            if not cls.service.database.exists():
                return False
            with connect_to_store(cls.service.database) as store:
                return store.execute("SELECT count(*) FROM link_messages"
                                     " WHERE payload ->> 'run' = 1 AND type = 2").fetchone()[0] == 2
        wait_for("the last messages", is_complete)

    def setUp(self):
        directory = tempfile.TemporaryDirectory(prefix="halvox-export-")
        self.addCleanup(directory.cleanup)
        self.directory = Path(directory.name)

    def test_lines_have_the_rows_of_the_store_one_by_one(self):
        lines = [exact(line) for line in self.lines()]
        for kind, (_, columns) in TABLES.items():
            exported = [line for line in lines if line["kind"] == kind]
            rows = list(self.rows(kind))
            self.assertEqual(len(exported), len(rows), kind)
            for line, row in zip(exported, rows):
                line["time"] = float(line["time"])
                self.assertEqual({name: line[name] for name in columns}, row)
        # The test is worth nothing without records.
        self.assertLessEqual({"events", "metrics", "power", "link"}, {line["kind"] for line in lines})
        self.assertTrue(any("large" in line.get("payload", ()) for line in lines))
        ids = [int(line["id"]) for line in lines if line["kind"] in ("events", "link")]
        self.assertEqual(ids, sorted(set(ids)))

    def test_lines_have_the_application_of_events(self):
        with connect_to_store(self.service.database) as store:
            expected = [row[0] or "" for row in
                        store.execute("SELECT application FROM halvox_events")]
        self.assertEqual([exact(line)["application"] for line in self.lines("--kind", "events")],
                         expected)
        self.assertIn(FORMULA, expected)

    def test_a_table_is_read_back_by_another_reader(self):
        text = self.export("--format", "csv").stdout.decode()
        self.assertEqual(text.count("\r\n"), len(self.lines()) + 1)
        rows = list(csv.DictReader(io.StringIO(text, newline=""), strict=True))
        lines = [exact(line) for line in self.lines()]
        self.assertEqual(len(rows), len(lines))
        for row, line in zip(rows, lines):
            self.assertEqual((row["kind"], row["id"], row["time"]),
                             (line["kind"], line["id"], line["time"]))
            if "payload" in line:
                self.assertEqual(exact(row["payload"]), line["payload"])
            if line["kind"] == "link":
                self.assertEqual([row[name] for name in TABLES["link"][1][1:-1]],
                                 [line[name] for name in TABLES["link"][1][1:-1]])
            if line["kind"] == "metrics":
                self.assertEqual((row["metric_id"], row["payload"]),
                                 (line["metric_id"], line["message"]))

    def test_a_table_has_no_cell_that_a_spreadsheet_runs(self):
        text = self.export("--format", "csv").stdout.decode()
        rows = list(csv.DictReader(io.StringIO(text, newline="")))
        self.assertIn("'" + FORMULA, {row["application"] for row in rows})
        # Numbers may be negative.
        numbers = {"session_id", "time"}
        for row in rows:
            for name in row.keys() - numbers:
                self.assertNotIn(row[name][:1], set("=+-@\t\r"), row)

    def test_times_kinds_and_applications_select(self):
        every = [exact(line) for line in self.lines()]
        middle = every[len(every) // 2]["time"]
        later = [exact(line) for line in self.lines("--since", f"@{middle}")]
        earlier = [exact(line) for line in self.lines("--until", f"@{middle}")]
        self.assertEqual(earlier + later, every)
        self.assertTrue(earlier and later)
        self.assertEqual({exact(line)["kind"] for line in self.lines("--kind", "link", "--kind",
                                                                    "power")}, {"link", "power"})
        of_player = [exact(line) for line in self.lines("--app", "org.example.*")]
        self.assertEqual({line["session_id"] for line in of_player if line["kind"] == "link"}, {"7"})
        self.assertEqual({line["application"] for line in of_player if line["kind"] == "events"},
                         {APPLICATIONS[7]})
        # Each message has two events and one link message, also the summary at the end of a session.
        of_session = [line for line in every if line["kind"] == "link" and line["session_id"] == "7"]
        self.assertEqual([line for line in of_player if line["kind"] == "link"], of_session)

    def test_every_format_selects_the_same_records(self):
        selection = ("--kind", "events", "--app", "org.example.*")
        file = self.directory / "plain.db"
        told = self.export("-o", file, *selection).stdout.decode()
        count = len(self.lines(*selection))
        self.assertGreater(count, 0)
        self.assertEqual(told, f"{file}: {count} records\n")
        table = self.export("--format", "csv", *selection).stdout.decode()
        self.assertEqual(table.count("\r\n"), count + 1)

    def test_requests_of_opentelemetry_have_every_record(self):
        requests = [exact(line) for line in self.split(self.export("--format", "otlp-json").stdout)]
        records = []
        for request in requests:
            self.assertEqual(list(request), ["resourceLogs"])
            [of_resource] = request["resourceLogs"]
            self.assertEqual(attributes(of_resource["resource"]),
                             {"service.name": "halvox-reportingd"})
            [of_scope] = of_resource["scopeLogs"]
            self.assertEqual(of_scope["scope"]["name"], "halvoxctl")
            records += of_scope["logRecords"]
        lines = [exact(line) for line in self.lines()]
        self.assertEqual(len(records), len(lines))
        for record, line in zip(records, lines):
            known = attributes(record)
            self.assertEqual((known["halvox.kind"], known["halvox.record.id"]),
                             (line["kind"], line["id"]))
            self.assertIsInstance(record["observedTimeUnixNano"], str)
            self.assertAlmostEqual(int(record["observedTimeUnixNano"]) / 1e9, float(line["time"]),
                                   places=5)
            if "payload" in line:
                self.assertEqual(plain(record["body"]), line["payload"])
                stamp = line["payload"].get("hvreporting_timestamp", line["time"])
                if "," not in stamp:  # the summary of a session has all stamps as a text
                    self.assertAlmostEqual(int(record["timeUnixNano"]) / 1e9, float(stamp), places=5)
            if line["kind"] == "events":
                self.assertEqual(record["eventName"], line["name"])
                self.assertEqual(record["severityText"] == "WARN", "IssueDetector" in line["name"])
            if line["kind"] == "link":
                self.assertEqual(known["halvox.session.id"], line["session_id"])
            if line["kind"] == "metrics":
                self.assertEqual(base64.b64decode(record["body"]["bytesValue"]).hex(), line["message"])

    def test_a_file_appears_when_it_is_complete_and_is_not_overwritten(self):
        file = self.directory / "records.jsonl"
        self.export("--format", "jsonl", "-o", file)
        whole = file.read_bytes()
        self.assertEqual(self.split(whole), self.lines())
        self.assertIn(b"--force", self.export("--format", "jsonl", "-o", file, status=2).stderr)
        self.export("--format", "jsonl", "-o", file, "--force", "--kind", "power")
        self.assertLess(file.stat().st_size, len(whole))
        self.assertEqual(os.listdir(self.directory), ["records.jsonl"])

    def run_with_small_files(self, form, file, **options):
        """Exports where no file may have more than two KiB."""
        return subprocess.run(
            [CTL, "export", "--format", form, "-o", file], capture_output=True, text=True, check=False,
            preexec_fn=lambda: resource.setrlimit(resource.RLIMIT_FSIZE, (2048, 2048)),
            timeout=DEADLINE, env=self.environment(), **options)

    def test_a_file_that_becomes_too_large_leaves_nothing(self):
        file = self.directory / "records"
        for form in ("jsonl", "csv", "sqlite"):
            # Python ignores the signal for such files, and so does the program then.
            result = self.run_with_small_files(form, file, restore_signals=False)
            self.assertEqual(result.returncode, 74, result.stderr)
            self.assertIn(str(file), result.stderr)
            self.assertEqual(os.listdir(self.directory), [])

    def test_an_export_that_is_killed_while_it_writes_leaves_nothing(self):
        result = self.run_with_small_files("jsonl", self.directory / "records")
        self.assertEqual(result.returncode, -signal.SIGXFSZ)
        self.assertEqual(os.listdir(self.directory), [])

    def test_the_standard_output_may_be_full(self):
        with open("/dev/full", "wb") as full:
            result = subprocess.run([CTL, "export", "--format", "jsonl"], stdout=full,
                                    stderr=subprocess.PIPE, check=False, timeout=DEADLINE,
                                    env=self.environment())
        self.assertEqual(result.returncode, 74)
        self.assertEqual(result.stderr.splitlines(),
                         [b"halvoxctl export: the standard output cannot be written"])

    def test_a_reader_that_goes_away_ends_it(self):
        process = subprocess.Popen([*WITH_US, CTL, "export", "--format", "csv", "-o", "/dev/stdout"],
                                   stdout=subprocess.PIPE, env=self.environment())
        process.stdout.close()
        self.assertEqual(process.wait(DEADLINE), -13)

    def test_nothing_is_shown_beside_the_records(self):
        self.assertEqual(self.export("--format", "jsonl").stderr, b"")

    def test_without_a_store_it_says_so(self):
        result = self.export("--format", "jsonl", "--database", self.directory, status=69)
        self.assertIn(b"halvox.db", result.stderr)


class LargeStoreTest(ExportTestCase):
    """A store of more bytes than an export may hold."""

    MESSAGES = 12_000
    BYTES = 2000

    @classmethod
    def setUpClass(cls):
        client = cls.start()
        client.begin(7, LONG_FORM_AUDIO, "org.example.player")
        filler = os.urandom(cls.BYTES // 2).hex()
        for number in range(cls.MESSAGES):
            client.send({"number": number, "filler": filler[number % 500:]}, SESSION_PLAYBACK, START, [7])

        def is_complete():
            with connect_to_store(cls.service.database) as store:
                return store.execute("SELECT count(*) FROM link_messages").fetchone()[0] == cls.MESSAGES
        wait_for("all messages", is_complete, pause=0.2)

    def peak(self, *arguments):
        """The most memory that an export uses, in KiB, and how many bytes it writes."""
        process = subprocess.Popen([*WITH_US, CTL, "export", *arguments],
                                   stdout=subprocess.PIPE, env=self.environment())
        self.addCleanup(stop_process, process)
        most = total = 0
        with process.stdout:
            while chunk := process.stdout.read1(1 << 16):
                total += len(chunk)
                # The program waits in a write, or has ended.
                for line in Path(f"/proc/{process.pid}/status").read_text().splitlines():
                    if line.startswith("VmHWM:"):
                        most = max(most, int(line.split()[1]))
        self.assertEqual(process.wait(DEADLINE), 0)
        return most, total

    FORMATS = ("jsonl", "csv", "otlp-json")

    @unittest.skipIf(os.environ.get("HALVOX_SANITIZE"), "sanitizers keep freed memory")
    def test_memory_does_not_grow_with_the_store(self):
        for form in self.FORMATS:
            few, _ = self.peak("--format", form, "--until", self.early())
            most, total = self.peak("--format", form)
            with self.subTest(form, few_kib=few, most_kib=most, megabytes=total >> 20):
                self.assertGreater(total, 2 * self.MESSAGES * self.BYTES)
                self.assertLess(most - few, 8 << 10)

    @unittest.skipIf(os.environ.get("HALVOX_SANITIZE"), "sanitizers keep freed memory")
    def test_memory_of_a_trace_does_not_grow_with_the_store(self):
        few, _ = self.peak("--format", "perfetto", "--until", self.early())
        most, total = self.peak("--format", "perfetto")
        # The messages that wait for their link message are held: at most 4,096 or 16 MiB.
        self.assertLess(most - few, 24 << 10)
        self.assertGreater(total, 0)

    def early(self):
        """A time after some two percent of the records."""
        with connect_to_store(self.service.database) as store:
            return "@" + str(store.execute(
                "SELECT time FROM link_messages LIMIT 1 OFFSET ?", (self.MESSAGES // 50,)).fetchone()[0])

    def test_a_terminal_shows_how_far_it_has_come(self):
        master, slave = pty.openpty()
        with os.fdopen(master, "rb", buffering=0) as terminal:
            with os.fdopen(slave, "wb") as errors:
                result = subprocess.run([CTL, "export", "--format", "jsonl"], stdout=subprocess.DEVNULL,
                                        stderr=errors, check=False, timeout=DEADLINE,
                                        env=self.environment())
            # A terminal passes output on some time after it was written. It reports an error when it
            # has passed on everything and nobody has it open any more.
            shown = ""
            with contextlib.suppress(OSError):
                while piece := terminal.read(1 << 16):
                    shown += piece.decode()
        self.assertEqual(result.returncode, 0)
        self.assertRegex(shown, r"^\r\x1b\[K\d+ records read, until \d{4}-\d\d-\d\d ")
        self.assertTrue(shown.endswith("\r\x1b[K"), shown)


if __name__ == "__main__":
    unittest.main()
