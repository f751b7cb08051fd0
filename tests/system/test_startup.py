"""A start that cannot succeed reports the reason in one line and has an exit status of its own."""

import contextlib
import os
import re
import shutil
import signal
import sqlite3
import subprocess
import tempfile
import unittest
from pathlib import Path

import harness
from harness import BIN, SERVICE, Service, wait_for

EX_USAGE, EX_DATAERR, EX_NOINPUT, EX_UNAVAILABLE, EX_CANTCREAT, EX_CONFIG = 64, 65, 66, 69, 73, 78


class Startup(unittest.TestCase):
    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        self.addCleanup(shutil.rmtree, self.directory, True)

    def run_service(self, config, arguments=()):
        path = self.directory / "halvox.toml"
        if config is not None:
            path.write_text(config)
        return subprocess.run(
            [str(SERVICE), *arguments],
            env={**os.environ, "HALVOX_CONFIG": str(path), "XDG_RUNTIME_DIR": str(self.directory),
                 "XDG_STATE_HOME": str(self.directory / "state")},
            capture_output=True, text=True, timeout=harness.DEADLINE, check=False)

    def config(self, **changes):
        settings = {"socket": self.directory / "r.sock", "directory": self.directory / "store", **changes}
        return (f'[listener]\nsocket = "{settings["socket"]}"\n'
                f'[storage]\ndirectory = "{settings["directory"]}"\n')

    def assert_refused(self, result, status, *texts):
        self.assertEqual(result.returncode, status, result.stderr)
        for text in texts:
            self.assertIn(str(text), result.stderr)

    def test_wrong_configuration_names_file_line_column_key_and_expectation(self):
        result = self.run_service('[storage]\nretention_days = "many"\n')

        self.assert_refused(result, EX_CONFIG, f"{self.directory}/halvox.toml:2:", "retention_days",
                            "expected", "many")

    def test_unknown_key_is_refused(self):
        result = self.run_service("[storage]\nretention_dais = 3\n")

        self.assert_refused(result, EX_CONFIG, "halvox.toml:2:", "retention_dais", "retention_days")

    def test_broken_syntax_names_the_line(self):
        result = self.run_service("[storage]\n\nretention_days = = 3\n")

        self.assert_refused(result, EX_CONFIG, "halvox.toml:3:")

    def test_key_of_100_000_words_is_refused_and_ends_nothing_else(self):
        words = ".".join(["a"] * 100_000)
        for text in (f"{words} = 1\n", f"[{words}]\n", f"a = {{{words} = 1}}\n"):
            result = self.run_service("# one line\n" + text)

            self.assert_refused(result, EX_CONFIG, "halvox.toml:2:", "levels of tables")
            self.assertEqual(result.stderr.count("\n"), 1)
            self.assertLess(len(result.stderr), 1000)

    def test_unreadable_configuration(self):
        (self.directory / "halvox.toml").mkdir()
        result = self.run_service(None)

        self.assert_refused(result, EX_NOINPUT, "halvox.toml")

    def test_named_configuration_that_is_missing(self):
        result = self.run_service(None)

        self.assert_refused(result, EX_NOINPUT, "halvox.toml")

    def test_help_and_version_answer_without_starting_anything(self):
        for arguments, shown in ((["--help"], "Usage: halvox-reportingd"), (["-h"], "--version"),
                                 (["--help"], "halvox.toml"),
                                 (["--version"], "halvox-reportingd ")):
            with self.subTest(arguments=arguments):
                result = self.run_service(None, arguments)

                self.assertEqual((result.returncode, result.stderr), (0, ""))
                self.assertIn(shown, result.stdout)
        self.assertEqual(list(self.directory.iterdir()), [])

    def test_each_program_shows_one_version_and_the_commit_that_was_built(self):
        made = BIN.parent / "generated/platform/linux/version/Commit.cpp"
        commit = " \\([0-9a-f]{12,}\\)" if re.search('return ".+"', made.read_text()) else ""
        versions = set()
        for name in "halvox-reportingd", "halvoxctl", "halvox-pipewire-reporter":
            if not (BIN / name).exists():
                continue
            shown = subprocess.run([BIN / name, "--version"], capture_output=True, text=True, check=True).stdout
            found = re.fullmatch(f"{name} ([0-9.]+){commit}", shown.splitlines()[0])
            self.assertTrue(found, shown)
            versions.add(found[1])
        self.assertEqual(len(versions), 1, versions)

    def test_the_service_names_each_optional_part_as_built_or_not(self):
        shown = self.run_service(None, ["--version"]).stdout
        built = "".join(re.findall("^Built with: (.*)$", shown, re.MULTILINE)).split(", ")
        absent = "".join(re.findall("^Built without: (.*)$", shown, re.MULTILINE)).split(", ")

        for part, module in (("NATS link", "halvox-link-nats"), ("PipeWire counters", "halvox-drivers-pipewire"),
                             ("LTTng trace points", "halvox-kdebug-lttng"),
                             ("LTTng traces", "halvox-tracing-lttng")):
            with self.subTest(part):
                self.assertIn(part, built if (BIN / f"{module}.so").exists() else absent)

    def test_unknown_argument_is_named_before_the_configuration_is_looked_at(self):
        result = self.run_service("this is wrong", ["--bogus"])

        self.assert_refused(result, EX_USAGE, "--bogus")
        self.assertEqual((result.stdout, result.stderr.count("\n")), ("", 1))

    def test_arguments_are_refused(self):
        result = self.run_service(self.config(), ["--verbose"])

        self.assert_refused(result, EX_USAGE, "--verbose")

    def test_missing_socket_directory(self):
        result = self.run_service(self.config(socket=self.directory / "no" / "such" / "r.sock"))

        self.assert_refused(result, EX_CANTCREAT, self.directory / "no" / "such")

    def test_socket_of_a_live_service_is_left_alone(self):
        with Service() as service:
            result = self.run_service(self.config(socket=service.socket))

            self.assert_refused(result, EX_UNAVAILABLE, service.socket)
            client = service.client()
            self.assertEqual(client.reporters(), [])
            client.close()

    def test_socket_without_a_service_is_replaced(self):
        service = Service(directory=self.directory).start()
        service.stop(signal.SIGKILL)
        self.assertTrue(service.socket.exists())

        service.start()

        client = service.client()
        self.assertEqual(client.reporters(), [])
        client.close()
        self.assertEqual(service.stop(), 0)
        self.assertFalse(service.socket.exists(), "an orderly end removes the socket")

    def test_database_of_a_newer_version_is_not_touched(self):
        store = self.directory / "store"
        store.mkdir()
        with contextlib.closing(sqlite3.connect(store / "halvox.db")) as database:
            database.execute("PRAGMA user_version = 9999")
            database.execute("CREATE TABLE precious (x)")
            database.commit()
        before = (store / "halvox.db").read_bytes()

        result = self.run_service(self.config())

        self.assert_refused(result, EX_DATAERR, "halvox.db", "version 9999")
        self.assertEqual((store / "halvox.db").read_bytes(), before)

    def test_damaged_database_is_set_aside_and_a_new_one_begun(self):
        damage = b"this is not a database, but somebody's lost work" * 100
        service = Service(directory=self.directory)
        service.database.parent.mkdir()
        service.database.write_bytes(damage)

        service.start()
        client = service.client()
        client.send({"a": 1})
        client.close()
        service.wait_for_events(2)
        self.assertEqual(service.stop(), 0)

        kept = [path for path in service.database.parent.iterdir()
                if "damaged" in path.name and path.read_bytes() == damage]
        self.assertEqual(len(kept), 1)
        self.assertIn("damaged", service.log())

    def test_storage_directory_that_cannot_be_made(self):
        (self.directory / "file").write_text("in the way")
        result = self.run_service(self.config(directory=self.directory / "file" / "store"))

        self.assert_refused(result, EX_CANTCREAT, self.directory / "file")

    def test_second_service_on_the_same_store_is_refused(self):
        with Service() as service:
            result = self.run_service(self.config(directory=service.database.parent))

            self.assert_refused(result, EX_UNAVAILABLE, service.database.parent)

    def test_bus_that_is_not_there(self):
        result = subprocess.run(
            [str(SERVICE)], timeout=harness.DEADLINE, capture_output=True, text=True, check=False,
            env={**os.environ, "HALVOX_CONFIG": str(self.bus_config()),
                 "XDG_RUNTIME_DIR": str(self.directory),
                 "DBUS_SESSION_BUS_ADDRESS": f"unix:path={self.directory}/no-bus"})

        self.assert_refused(result, EX_UNAVAILABLE, "no-bus")

    def bus_config(self):
        path = self.directory / "bus.toml"
        path.write_text(self.config().replace("[storage]", 'bus = "session"\n[storage]'))
        return path


class SocketDirectoryAppears(unittest.TestCase):
    def test_report_signal_logs_all_counters_and_the_service_continues(self):
        with Service() as service:
            service.process.send_signal(signal.SIGUSR1)
            wait_for("the counters", lambda: "counted files, files written: 0" in service.log())
            self.assertTrue(service.client().create(7))

    def test_ready_service_says_what_it_is_made_of(self):
        with Service() as service:
            for line in ("serving ", "link: ", "trace points: ", "traces: "):
                wait_for(f"the line {line}", lambda wanted=line: wanted in service.log())


if __name__ == "__main__":
    unittest.main()
