"""Messages that a started session sends through the link are in the local store, in order, each
once."""

import contextlib
import json
import os
import shutil
import subprocess
import tempfile
import time
import unittest

import harness
from harness import Service, wait_for

MESSAGES = 500
SINGLE_MESSAGES = 3000
# So much that a summary file takes a while, and that its event is made by the link's queue.
LONG_MESSAGES = 2500
WIDE = {f"key {number}": "x" * 10 for number in range(60)}
SUMMARY = 0xFFFF  # the type of the event
REPORTING = "Logs/Wreckbin/DiagnosticLogs/Audio/Reporting"


def link_messages(service, *arguments):
    """The output of halvoxctl link for the service's store."""
    shown = subprocess.run(
        [os.path.join(os.environ["HALVOX_BIN"], "halvoxctl"), "link", "--json",
         "--database", str(service.database), *arguments],
        stdout=subprocess.PIPE, text=True, check=True, timeout=harness.DEADLINE)
    return [json.loads(line) for line in shown.stdout.splitlines()]


def is_writing_summary(service):
    """Whether the service has a summary file open."""
    directory = f"/proc/{service.process.pid}/fd"
    for name in os.listdir(directory):
        with contextlib.suppress(FileNotFoundError):
            if REPORTING in (path := os.readlink(os.path.join(directory, name))) and "#" in path:
                return True
    return False


def numbers_of(messages):
    """Of the messages that the client sent. The session adds one of its own at the stop."""
    return [message["payload"]["number"] for message in messages
            if message["type"] == harness.START]


class LinkLocal(unittest.TestCase):
    def run_session(self, service):
        client = service.client()
        self.addCleanup(client.close)
        client.create(7)
        client.set_type(7, 7)
        started = client.start_later(7)
        for number in range(MESSAGES):
            client.send({"number": number}, reporters=[7])
        client.stop(7)
        started.wait()

    def test_messages_of_a_session_are_stored_in_order_none_missing_none_twice(self):
        with Service() as service:
            self.run_session(service)
            wait_for("the last message",
                     lambda: MESSAGES - 1 in numbers_of(link_messages(service)))
            messages = link_messages(service, "--session", "7")

        self.assertEqual(numbers_of(messages), list(range(MESSAGES)))
        self.assertEqual({message["client_name"] for message in messages}, {"com.tarno.halvox"})
        self.assertEqual(len({message["service_name"] for message in messages}), 1)
        self.assertTrue(messages[0]["service_name"].endswith("_session"))
        times = [message["time"] for message in messages]
        self.assertEqual(times, sorted(times))

    def test_thousands_of_messages_before_the_start_go_out_singly_without_a_thread_each(self):
        with Service() as service:
            client = service.client()
            self.addCleanup(client.close)
            client.create(7)
            # The first one creates the threads that all of them share.
            client.send({"number": -1}, event_type=harness.STOP, reporters=[7])
            wait_for("the first message", lambda: link_messages(service, "--session=-1"))
            threads = service.threads()
            begun = time.time()
            for number in range(SINGLE_MESSAGES):
                client.send({"number": number}, reporters=[7])
            self.assertLessEqual(service.threads(), threads)
            messages = wait_for("all single messages", pause=0.1, condition=lambda: len(
                found := link_messages(service, "--session=-1")[1:]) == SINGLE_MESSAGES and found)

        self.assertEqual(sorted(numbers_of(messages)), list(range(SINGLE_MESSAGES)))
        self.assertGreaterEqual(min(message["time"] for message in messages) - begun, 1)

    def test_end_of_the_service_loses_nothing(self):
        directory = tempfile.mkdtemp(prefix="halvox-test-")
        self.addCleanup(shutil.rmtree, directory, True)
        with Service(directory=directory) as service:
            self.run_session(service)
        self.assertEqual(numbers_of(link_messages(service)), list(range(MESSAGES)))

    def test_end_during_a_summary_file_finishes_the_stop_and_what_waits_for_it(self):
        directory = tempfile.mkdtemp(prefix="halvox-test-")
        self.addCleanup(shutil.rmtree, directory, True)
        with Service("[device]\nInternalBuild = true\n", directory=directory) as service:
            client = service.client()
            self.addCleanup(client.close)
            client.create(7)
            client.set_type(7, 7)
            client.start_later(7)
            for number in range(LONG_MESSAGES):
                client.send({"number": number, **WIDE}, reporters=[7])
            client.call_later("stopReportingSessionForID", "x", 7)
            client.connection.flush_sync(None)
            wait_for("the summary file", lambda: is_writing_summary(service), pause=0.001)

        (name,) = (service.directory / "state" / "root").glob(f"**/{REPORTING}/*.json")
        self.assertEqual(len(json.loads(name.read_text())), LONG_MESSAGES)
        messages = link_messages(service)
        self.assertEqual(numbers_of(messages), list(range(LONG_MESSAGES)))
        self.assertEqual(messages[-1]["type"], SUMMARY)
        self.assertNotIn("jobs discarded at the stop", service.log())

    def test_without_a_backend_nothing_is_stored_and_clients_notice_nothing(self):
        with Service('[link]\nbackend = "none"\n') as service:
            self.run_session(service)
            service.wait_for_events(2 * MESSAGES)
            self.assertEqual(link_messages(service), [])


if __name__ == "__main__":
    unittest.main()
