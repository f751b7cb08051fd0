"""Settings follow while the service runs: preferences in files, notifications by files."""

import os
import re
import shutil
import subprocess
import time
import unittest

from harness import CTL, Service, iterate_until, wait_for

DOMAIN = "com.tarno.halvox"
NOTIFICATION = "com.tarno.halvox.reporting"
# How soon a change has to be everywhere.
SOON = 1.0


class Settings(unittest.TestCase):
    def setUp(self):
        self.service = Service('[log]\nlevel = "debug"\n')
        self.service.__enter__()
        self.addCleanup(self.service.__exit__)
        state = self.service.directory / "state"
        self.file = state / "preferences" / "mobile" / f"{DOMAIN}.toml"
        self.notify = state / "notify"

    def ctl(self, *arguments, status=0):
        result = subprocess.run([str(CTL), *arguments], capture_output=True, text=True, check=False,
                                env={**os.environ, "HALVOX_CONFIG": str(self.service.config)})
        self.assertEqual(result.returncode, status, result.stderr)
        return result.stdout

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

    def wait_for_change(self, mark, count=1, deadline=SOON):
        """The log from the mark on, once that many changes have been handled."""
        def handled():
            log = self.log_since(mark)
            return log if len(re.findall(r"defaults (\(null\)|\{)", log)) >= count else None
        return wait_for("a handled change", handled, deadline)

    def assert_reached(self, log, sessions):
        for session in sessions:
            self.assertEqual(log.count(f"sending message for session owned by {session}\n"), 1, log)

    def wait_for_message(self, mark, session):
        wait_for(f"a message of session {session}", lambda: re.search(
            rf"sending message for session owned by {session}$", self.log_since(mark), re.M), SOON)

    def test_a_changed_preference_reaches_every_session_of_every_client(self):
        first, second = self.client(), self.client()
        for client, session in ((first, 101), (first, 102), (second, 103)):
            client.create(session)
        first.start_later(101)
        iterate_until("a started session",
                      lambda: "1 active reporting session(s)" in self.service.log())
        mark = self.mark()
        start = time.monotonic()

        self.set_device_name("Kitchen")

        log = self.wait_for_change(mark)
        for session in (101, 102, 103):
            self.wait_for_message(mark, session)
        self.assertLess(time.monotonic() - start, SOON)
        self.assertRegex(log, r"defaults \{.*device_name.*Kitchen.*\}")
        self.assert_reached(self.log_since(mark), (101, 102, 103))

    def test_a_started_session_hears_the_preference_that_is_set(self):
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
        self.set_device_name("one")
        self.wait_for_change(0)
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
            mark = self.mark()
            save()
            log = self.wait_for_change(mark)
            self.assertIn(name, log)
            # A post of our own comes behind whatever else the save might have led to.
            self.ctl("notify", NOTIFICATION)
            log = self.wait_for_change(mark, 2)
            self.assertEqual(len(re.findall(r"feature \d+ changes", self.log_since(mark))), 2)

    def assert_told_and_mended(self, spoil, reason):
        """A spoilt file is told once, changes nothing, and works again when it is mended."""
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
        self.assertIn("after", self.wait_for_change(mark))
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
            self.file.unlink()
            self.file.mkdir()
        self.assert_told_and_mended(replace, "expected a regular file")

    def test_a_notify_directory_that_is_deleted_and_made_again(self):
        client = self.client()
        client.create(101)
        for round_ in range(3):
            mark = self.mark()
            self.ctl("notify", NOTIFICATION)
            self.wait_for_change(mark)
            if round_ > 0:
                self.assertIn("the notify directory is there again: ", self.log_since(mark))
            mark = self.mark()
            shutil.rmtree(self.notify)
            wait_for("the loss to be told",
                     lambda: "the notify directory is gone, waiting for it: " in self.log_since(mark))
            self.assertEqual(client.valid(101)["reporterID"], 101)
            self.assertNotRegex(self.log_since(mark), r"feature \d+ changes")

    def test_waiting_for_settings_makes_no_wake_ups(self):
        self.set_device_name("Kitchen")
        self.wait_for_change(0)
        # Quiet once nothing has happened for a while.
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
