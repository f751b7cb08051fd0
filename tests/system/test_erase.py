"""halvoxctl erase: afterwards the erased texts are in none of the service's files."""

import json
import os
import threading
import time
import unittest
from pathlib import Path

from harness import DEADLINE, Follower, connect_to_store, start_service, variants, wait_for

STORAGE = "com.tarno.halvox.Storage"
INTERNAL = "[device]\nInternalBuild = true\n"
SECRET = os.urandom(24).hex()
PUBLIC = os.urandom(24).hex()


def count(service, condition="1"):
    with connect_to_store(service.database) as store:
        return store.execute("SELECT count(*) FROM link_messages WHERE " + condition).fetchone()[0]


def files_with(service, text):
    """The files of the service that have this text anywhere in their bytes."""
    files = (path for path in Path(service.database.parent).rglob("*") if path.is_file())
    return [path.name for path in files if text.encode() in path.read_bytes()]


def summaries(service):
    return sorted(path.name for path in service.database.parent.rglob("*-halvox-*.json"))


class EraseTest(unittest.TestCase):
    def started(self, messages=40, config=INTERNAL):
        """A service with two applications that have sent messages in turn, and a capture."""
        service, self.client = start_service(self, config)
        self.client.begin(7, 7, "org.example.secret")
        self.client.begin(8, 7, "org.example.other")
        for number in range(messages):
            self.client.send({"number": number, "text": SECRET}, reporters=[7])
            self.client.send({"number": number, "text": PUBLIC}, reporters=[8])
            if number == 0:
                # The first messages are not compressed.
                wait_for("the first messages", lambda: count(service) == 2)
                self.assertTrue(files_with(service, SECRET))
        wait_for("all messages", lambda: count(service) == 2 * messages)
        captures = service.database.parent / "snapshots"
        captures.mkdir(exist_ok=True)
        (captures / "20260301T120000Z-haptics-Session_Generic.tar.zst").write_text(SECRET)
        return service

    def assert_erased(self, service, others=40):
        self.assertEqual(files_with(service, SECRET), [])
        self.assertEqual(count(service, f"payload ->> 'text' = '{SECRET}'"), 0)
        self.assertEqual(count(service, f"payload ->> 'text' = '{PUBLIC}'"), others)
        with connect_to_store(service.database) as store:
            self.assertEqual(store.execute("PRAGMA integrity_check").fetchone(), ("ok",))
        service.ctl("verify")

    def test_an_application_is_erased_from_a_running_service(self):
        service = self.started()
        self.client.stop(7)
        wait_for("the summary", lambda: len(summaries(service)) == 1)
        wait_for("its event", lambda: count(service, "category = 65535 OR category = 4294967295") > 0)
        self.assertTrue(any("secret" in name for name in summaries(service)))

        shown = json.loads(service.ctl("erase", "--app", "org.example.secret", "--json").stdout)

        self.assertGreaterEqual(shown["records"], 3 * 40)
        self.assertGreaterEqual(shown["files"], 2)
        self.assert_erased(service)
        self.assertEqual(files_with(service, "org.example.secret"), [])
        self.assertEqual(summaries(service), [])
        self.client.send({"number": 40, "text": PUBLIC}, reporters=[8])
        wait_for("a message after it", lambda: count(service, "payload ->> 'number' = 40"))

    def test_under_load_no_other_message_is_lost_or_seen_twice(self):
        service = self.started(messages=400, config="")
        follower = Follower(service, "events")
        self.addCleanup(follower.close)

        def follows():
            self.client.send({"begin": time.monotonic()}, reporters=[8])
            return follower.so_far()

        wait_for("the follower", follows)
        done = []
        erasure = threading.Thread(
            target=lambda: done.append(service.ctl("erase", "--app", "org.example.secret")))
        erasure.start()
        for number in range(5000, 5200):
            self.client.send({"number": number, "text": PUBLIC}, reporters=[8])
        erasure.join()

        self.assertEqual(len(done), 1, "the erasure failed")
        wait_for("the messages", lambda: count(service, "payload ->> 'number' >= 5000") == 200)
        self.assert_erased(service, 600)
        self.assertIn("an erasure of one application begins", service.log())
        self.assertIn("the erasure has ended", service.log())

        def new():
            payloads = [record["payload"] for record in follower.so_far()]
            return [payload["number"] for payload in payloads if payload.get("number", 0) >= 5000]

        wait_for("the events", lambda: len(new()) >= 400)
        # A message makes two events.
        self.assertEqual(new(), [number for number in range(5000, 5200) for _ in range(2)])

    def test_without_a_service_halvoxctl_does_it(self):
        service = self.started()
        service.stop()

        service.ctl("erase", "--app", "org.example.secret")

        self.assertEqual(files_with(service, SECRET), [])
        service.start()
        self.assert_erased(service)

    def test_a_session_is_erased(self):
        service = self.started()

        service.ctl("erase", "--session", "7")

        self.assert_erased(service)

    def test_a_time_is_erased(self):
        service = self.started()
        with connect_to_store(service.database) as store:
            last, = store.execute("SELECT max(time) FROM link_messages").fetchone()
        wait_for("a later time", lambda: time.time() > last + 0.002)
        cut = time.time()
        self.client.send({"number": 100, "text": PUBLIC}, reporters=[8])
        wait_for("a message after it", lambda: count(service, "payload ->> 'number' = 100"))

        service.ctl("erase", "--before", f"@{cut:.6f}")

        self.assert_erased(service, 1)

    def test_it_waits_for_a_reader_of_the_log(self):
        service = self.started()
        with connect_to_store(service.database) as reader:
            reader.execute("BEGIN")
            reader.execute("SELECT count(*) FROM message_blocks").fetchone()
            self.client.call("BeginErase", "a{sv}", variants({"app": "org.example.secret"}), interface=STORAGE)

            def state():
                return self.client.call("GetErase", interface=STORAGE)

            wait_for("the reader to be noticed", lambda: state()["log held"])
            self.assertTrue(state()["running"])
            reader.execute("COMMIT")
            wait_for("the end", lambda: not state()["running"], DEADLINE)
        self.assert_erased(service)

    def test_what_is_asked_wrongly_is_refused(self):
        service, client = start_service(self)
        for arguments in ([], ["--app", ""], ["--app", "org.*"], ["--session", "0"], ["--session", "x"],
                          ["--before", "2999-01-01"], ["--app", "a", "--session", "7"]):
            with self.subTest(arguments=arguments):
                service.ctl("erase", *arguments, status=2)
        for options in ({}, {"app": ""}, {"session": 0}, {"app": "a", "session": 7}, {"other": 1}):
            with self.subTest(options=options):
                with self.assertRaisesRegex(Exception, "expected one of the options"):
                    client.call("BeginErase", "a{sv}", variants(options), interface=STORAGE)


if __name__ == "__main__":
    unittest.main()
