"""Settings take effect while the service runs: preferences from files, notifications by files."""

import ctypes
import datetime
import json
import os
import re
import shutil
import tempfile
import time
import unittest
from pathlib import Path

from harness import Service, connect_to_store, iterate_until, wait_for

DOMAIN = "com.tarno.halvox"
NOTIFICATION = "com.tarno.halvox.reporting"
# The time within which a change must be effective everywhere.
SOON = 1.0
# Changes within this time of each other are one change for the service. It includes a margin.
ONE_SAVE = 0.04
SETUP = 8, 5  # category and type


def exchange(first, second):
    """Exchanges the names of two files in one step."""
    current_directory, exchange_flag = -100, 2
    libc = ctypes.CDLL(None, use_errno=True)
    if libc.renameat2(current_directory, os.fsencode(first), current_directory, os.fsencode(second),
                      exchange_flag) != 0:
        raise OSError(ctypes.get_errno(), "renameat2", str(first))


class Settings(unittest.TestCase):
    def setUp(self):
        self.service = Service('[log]\nlevel = "debug"\n')
        self.service.__enter__()
        self.addCleanup(self.service.__exit__)
        state = self.service.directory / "state"
        self.file = state / "preferences" / "mobile" / f"{DOMAIN}.toml"
        self.notify = state / "notify"

    def ctl(self, *arguments):
        return self.service.ctl(*arguments).stdout

    def set_device_name(self, name):
        self.ctl("preferences", "set", DOMAIN, "device_name", name)

    def client(self):
        client = self.service.client()
        self.addCleanup(client.close)
        return client

    def log_since(self, mark):
        return self.service.log()[mark:]

    def mark(self):
        return len(self.service.log())

    def wait_for_change(self, mark, count=1):
        """The log from the mark on, after that many changes have been handled."""
        def handled():
            log = self.log_since(mark)
            return log if len(re.findall(r"defaults (\(null\)|\{)", log)) >= count else None
        return wait_for("a handled change", handled)

    def wait_for_state(self, mark, name):
        """The log from the mark on, after a state with that name has been sent."""
        def handled():
            log = self.log_since(mark)
            return log if re.search(rf"defaults \{{.*{name}.*\}}", log) else None
        return wait_for(f"the state {name}", handled)

    def assert_reached(self, log, sessions):
        for session in sessions:
            self.assertEqual(log.count(f"sending message for session owned by {session}\n"), 1, log)

    def wait_for_message(self, mark, session):
        """The time at which the session received a message, in seconds since 1970."""
        line = wait_for(f"a message of session {session}", lambda: re.search(
            rf"^(\S+) .*sending message for session owned by {session}$", self.log_since(mark), re.M))
        return datetime.datetime.fromisoformat(line[1].replace("Z", "+00:00")).timestamp()

    def setup_messages(self):
        """The state messages in the link's store: session (-1: a single message) and payload."""
        if not self.service.database.exists():
            return []
        with connect_to_store(self.service.database) as store:
            rows = store.execute("SELECT session_id, payload FROM link_messages"
                                 " WHERE category = ? AND type = ? ORDER BY session_id", SETUP)
            return [(session, json.loads(payload)) for session, payload in rows]

    def test_a_changed_preference_reaches_every_session_of_every_client(self):
        first, second = self.client(), self.client()
        for client, session in ((first, 101), (first, 102), (second, 103)):
            client.create(session)
        first.start_later(101)
        iterate_until("a started session",
                      lambda: "1 active reporting session(s)" in self.service.log())
        mark = self.mark()

        self.set_device_name("Kitchen")

        log = self.wait_for_change(mark)
        for session in (101, 102, 103):
            self.wait_for_message(mark, session)
        self.assertRegex(log, r"defaults \{.*device_name.*Kitchen.*\}")
        self.assert_reached(self.log_since(mark), (101, 102, 103))
        sent = wait_for("three stored messages",
                        lambda: len(found := self.setup_messages()) >= 3 and found)
        self.assertEqual([session for session, _ in sent], [-1, -1, 101])
        self.assertEqual([payload["device_name"] for _, payload in sent], ["Kitchen"] * 3)

    def test_a_changed_preference_is_everywhere_within_a_second(self):
        client = self.client()
        for session in (101, 102):
            client.create(session)
        delays = []
        # A busy machine may delay some of the tries, but not all.
        for number in range(5):
            mark = self.mark()
            self.set_device_name(f"number {number}")
            changed = self.file.stat().st_mtime
            delays.append(max(self.wait_for_message(mark, session) for session in (101, 102)) - changed)
            # Wait for everything that this change causes, so that it does not disturb the next one.
            self.wait_for_state(mark, f"number {number}")

        self.assertLess(min(delays), SOON, delays)

    def test_a_started_session_receives_the_preference_that_is_set(self):
        self.set_device_name("Kitchen")
        client = self.client()
        client.create(101)
        mark = self.mark()

        client.start_later(101)

        iterate_until("a message at the start", lambda: "sending message for session owned by 101\n"
                      in self.log_since(mark))

    def test_a_removed_preference_is_sent_as_no_state(self):
        self.set_device_name("Kitchen")
        self.wait_for_change(0)
        client = self.client()
        client.create(101)
        mark = self.mark()

        self.ctl("preferences", "unset", DOMAIN, "device_name")

        log = self.wait_for_change(mark)
        self.assertIn("defaults (null)", log)
        self.wait_for_message(mark, 101)

    def test_a_posted_notification_sends_the_state(self):
        client = self.client()
        client.create(101)
        mark = self.mark()

        self.ctl("notify", NOTIFICATION)

        self.wait_for_change(mark)
        self.wait_for_message(mark, 101)

    def test_one_save_is_one_message_however_it_is_saved(self):
        self.ctl("notify", NOTIFICATION)
        # The state of this change comes with or after everything that the post has caused.
        self.set_device_name("one")
        self.wait_for_state(0, "one")
        client = self.client()
        client.create(101)
        other = self.file.with_suffix(".new")

        def rewrite():
            self.file.write_text('device_name = "two"\n')

        def replace():
            other.write_text('device_name = "three"\n')
            os.rename(other, self.file)

        def move_away():
            os.rename(self.file, other)
            self.file.write_text('device_name = "four"\n')

        for save, name in ((rewrite, "two"), (replace, "three"), (move_away, "four")):
            with self.subTest(name):
                mark = self.save_at_once(save)
                self.assertIn(name, self.wait_for_change(mark))
                # A post of our own comes after everything that the save may have caused.
                os.utime(self.notify / NOTIFICATION)
                self.wait_for_change(mark, 2)
                self.assertEqual(len(re.findall(r"feature \d+ changes", self.log_since(mark))), 2)

    def save_at_once(self, save):
        """Saves a file, and again if a delay made two changes of one save. Returns the end of the
        log before the save."""
        for number in range(20):
            mark = self.mark()
            begin = time.monotonic()
            save()
            if time.monotonic() - begin < ONE_SAVE:
                return mark
            self.wait_for_change(mark)
            self.set_device_name(f"again {number}")
            self.wait_for_state(mark, f"again {number}")
        self.fail("this machine cannot save a file at once")

    def assert_told_and_mended(self, spoil, reason):
        """A broken file is logged once, changes nothing, and works again after it is fixed."""
        self.set_device_name("before")
        self.wait_for_change(0)
        client = self.client()
        client.create(101)
        mark = self.mark()

        spoil()

        wait_for("the reason in the log", lambda: re.search(reason, self.log_since(mark)))
        client.start_later(101)
        iterate_until("a start without it", lambda: "active reporting session(s)" in self.log_since(mark))
        self.assertNotRegex(self.log_since(mark), r"feature \d+ changes")
        self.assertNotIn("sending message for session owned by 101\n", self.log_since(mark))
        self.assertEqual(len(re.findall(reason, self.log_since(mark))), 1)

        mark = self.mark()
        if self.file.is_dir():
            self.file.rmdir()
        self.file.write_text('device_name = "after"\n')
        self.wait_for_state(mark, "after")
        self.assertIn("can be read again", self.log_since(mark))

    def test_a_broken_preference_file(self):
        self.assert_told_and_mended(lambda: self.file.write_text("device_name = \n"),
                                    rf"{DOMAIN}\.toml:1:\d+: expected TOML")

    def test_a_preference_file_of_100_mib(self):
        def grow():
            with open(self.file, "r+b") as file:
                file.truncate(100 << 20)
        self.assert_told_and_mended(grow, "expected at most 1048576 bytes, found 104857600")

    def test_a_directory_in_the_place_of_a_preference_file(self):
        def replace():
            # The exchange is one step, because the preference would count as removed while there is
            # no file.
            directory = Path(tempfile.mkdtemp(dir=self.service.directory))
            exchange(self.file, directory)
        self.assert_told_and_mended(replace, "expected a regular file")

    def test_a_notify_directory_that_is_deleted_and_made_again(self):
        client = self.client()
        client.create(101)
        for round_ in range(3):
            mark = self.mark()
            self.ctl("notify", NOTIFICATION)
            self.wait_for_change(mark)
            if round_ > 0:
                self.assertIn("exists again; watching it", self.log_since(mark))
            # The state of this change comes with or after everything that the post has caused.
            self.set_device_name(f"round {round_}")
            self.wait_for_state(mark, f"round {round_}")
            mark = self.mark()
            shutil.rmtree(self.notify)
            wait_for("the log line about the loss",
                     lambda: "was deleted; waiting until it exists again" in self.log_since(mark))
            self.assertEqual(client.valid(101)["reporterID"], 101)
            self.assertNotRegex(self.log_since(mark), r"feature \d+ changes")

    def test_waiting_for_settings_makes_no_wake_ups(self):
        self.set_device_name("Kitchen")
        self.wait_for_change(0)
        # Quiet when nothing has happened for a while.
        before = -1
        def is_quiet():
            nonlocal before
            last, before = before, self.service.voluntary_switches()
            return last == before
        wait_for("an idle service", is_quiet, pause=1.0)
        switches = self.service.voluntary_switches()

        time.sleep(3)  # idleness is what is measured

        self.assertEqual(self.service.voluntary_switches(), switches)


if __name__ == "__main__":
    unittest.main()
