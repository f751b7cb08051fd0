"""A client with none of our code uses the whole protocol, over each transport."""

import os
import shutil
import signal
import subprocess
import sys
import tempfile
import time
import unittest
from pathlib import Path

from gi.repository import GLib

import harness
from harness import Client, Service, iterate_until, wait_for

UNKNOWN_TYPE = 65535


class ProtocolTests:
    """The tests. The classes below choose the transport."""

    service: Service

    @classmethod
    def use(cls, service):
        """All tests of the class use this service, which ends after them."""
        cls.service = service
        cls.addClassCleanup(shutil.rmtree, service.directory, True)
        cls.addClassCleanup(service.stop)

    def client(self):
        client = self.connect()
        self.addCleanup(client.close)
        return client

    def test_session_goes_through_its_whole_life(self):
        client = self.client()

        self.assertIs(client.create(7), True)
        self.assertIs(client.set_type(3, 7), True)
        self.assertIs(client.configure({"HostApplicationDisplayID": "com.example.player"}, 7), True)
        start = client.start_later(7)
        self.assertIsNone(client.send({"volume": 0.5}, reporters=[7]))
        self.assertFalse(start.done, "a start is answered at the stop")
        self.assertIs(client.stop(7), True)
        self.assertIs(start.wait(), True)
        self.assertIs(client.destroy(7), True)

        self.assertNotIn(7, client.reporters())

    def test_start_reply_comes_before_the_reply_of_the_stop(self):
        client = self.client()
        client.create(8)
        start = client.start_later(8)
        stop = client.call_later("stopReportingSessionForID", "x", 8)

        iterate_until("both answers", lambda: start.done and stop.done)

        self.assertTrue(start.value and stop.value)
        self.assertLess(start.place, stop.place)

    def test_unknown_ids_and_zero_are_not_errors(self):
        client = self.client()
        for reporter in (0, 4711):
            with self.subTest(reporter=reporter):
                self.assertIs(client.set_type(2, reporter), True)
                self.assertEqual(client.service_type(reporter), UNKNOWN_TYPE)
                self.assertIs(client.configure({"a": 1}, reporter), True)
                self.assertIs(client.call("startReportingSessionForID", "x", reporter), True)
                self.assertIsNone(client.send({"a": 1}, reporters=[reporter]))
                self.assertIs(client.stop(reporter), True)
                self.assertIs(client.destroy(reporter), True)
                self.assertEqual(client.valid(reporter), {"reporterID": 0, "serviceType": UNKNOWN_TYPE})

    def test_two_clients_read_each_others_sessions_but_cannot_stop_them(self):
        owner, other = self.client(), self.client()
        owner.create(21)
        owner.set_type(2, 21)
        start = owner.start_later(21)
        owner.valid(21)

        self.assertEqual(other.service_type(21), 2)
        self.assertEqual(other.valid(21), {"reporterID": 21, "serviceType": 2})
        self.assertIn(21, other.reporters())
        self.assertIs(other.stop(21), True)
        self.assertIs(other.destroy(21), True)
        self.assertIs(other.set_type(9, 21), True)
        owner.valid(21)

        self.assertFalse(start.done, "another client's stop must not stop the session")
        self.assertEqual(owner.service_type(21), 2)
        owner.stop(21)
        self.assertIs(start.wait(), True)

    def test_messages_of_another_client_reach_a_session(self):
        owner, other = self.client(), self.client()
        owner.create(31)
        owner.set_type(3, 31)
        before = len(self.service.events())

        other.send({"from": "other"}, reporters=[31])

        events = self.service.wait_for_events(before + 2)[before:]
        self.assertEqual([name for name, _ in events],
                         ["com.tarno.halvox.Playback.Start", "com.tarno.haptics.Playback.Start"])
        self.assertEqual(events[0][1]["from"], "other")

    def test_killed_client_leaves_nothing_behind(self):
        child = subprocess.Popen(
            ["/usr/bin/python3", __file__, "--hold-session", self.child_address(), "91"],
            stdout=subprocess.PIPE, text=True, cwd=Path(__file__).parent,
            env={**os.environ, "PYTHONDONTWRITEBYTECODE": "1"})
        self.addCleanup(child.stdout.close)
        self.assertEqual(child.stdout.readline().strip(), "started")
        client = self.client()
        self.assertIn(91, client.reporters())

        child.send_signal(signal.SIGKILL)
        child.wait(harness.DEADLINE)

        wait_for("the session to be dropped", lambda: 91 not in client.reporters())

    def test_every_message_is_recorded_under_both_names_in_order_with_its_payload(self):
        client = self.client()
        client.create(41)
        client.set_type(3, 41)
        client.configure({"HostApplicationDisplayID": "com.example.game"}, 41)
        client.start_later(41)
        before = len(self.service.events())

        for number in range(50):
            client.send({"number": number, "text": "ä€𝄞", "nested": {"list": [1, 2.5, "x"]},
                         "blank key": b"\x00\xff", "HostApplicationDisplayID": "spoofed"},
                        reporters=[41])

        events = self.service.wait_for_events(before + 100)[before:]
        self.assertEqual([name for name, _ in events],
                         ["com.tarno.halvox.Playback.Start", "com.tarno.haptics.Playback.Start"] * 50)
        self.assertEqual([payload["number"] for _, payload in events],
                         [number for number in range(50) for _ in range(2)])
        payload = events[-1][1]
        self.assertEqual(payload["text"], "ä€𝄞")
        self.assertEqual(payload["nested"], {"list": [1, 2.5, "x"]})
        self.assertEqual(payload["blank key"], "AP8=")
        self.assertEqual(payload["HostApplicationDisplayID"], "com.example.game")
        self.assertAlmostEqual(payload["hvreporting_timestamp"], time.time(), delta=60)
        self.assertIsInstance(payload["systemuptime_sec"], int)
        self.assertIsInstance(payload["processuptime_ms"], int)

    def test_stamps_of_the_client_are_replaced(self):
        client = self.client()
        client.create(42)
        before = len(self.service.events())

        client.send({"hvreporting_timestamp": 1.0, "systemuptime_sec": -5, "processuptime_ms": "x"},
                    reporters=[42])

        payload = self.service.wait_for_events(before + 2)[before][1]
        self.assertGreater(payload["hvreporting_timestamp"], 1e9)
        self.assertGreater(payload["systemuptime_sec"], 0)
        self.assertGreaterEqual(payload["processuptime_ms"], 0)

    def test_message_without_sessions_is_recorded_as_standalone(self):
        client = self.client()
        before = len(self.service.events())

        client.send({"lonely": True})

        events = self.service.wait_for_events(before + 2)[before:]
        self.assertEqual([name for name, _ in events],
                         ["com.tarno.halvox.Playback.Start", "com.tarno.standalone.Playback.Start"])
        self.assertEqual(events[0][1]["HostApplicationDisplayID"], "Unknown")

    def test_kill_service_ends_the_process_with_status_2(self):
        with self.fresh() as (service, connect):
            client = connect()
            pending = client.call_later("killService")
            self.assertEqual(service_process(service).wait(harness.DEADLINE), 2)
            with self.assertRaises(GLib.Error):
                pending.wait()
            self.assertIn("DESTROYING SERVICE", service.log())


def service_process(service):
    return service.process


class OverTheSocket(ProtocolTests, unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.use(cls.make_service())

    @staticmethod
    def make_service():
        return Service().start()

    def connect(self):
        return Client.to_socket(self.service.address)

    def child_address(self):
        return self.service.address

    def fresh(self):
        return Fresh(self.make_service)


class OverAPrivateBus(ProtocolTests, unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        harness.require("dbus-daemon")
        cls.address = cls.enterClassContextCompat(harness.private_bus())
        cls.use(Service(bus="session", environment={"DBUS_SESSION_BUS_ADDRESS": cls.address}).start())

    @classmethod
    def enterClassContextCompat(cls, manager):
        value = manager.__enter__()
        cls.addClassCleanup(manager.__exit__, None, None, None)
        return value

    def connect(self):
        return Client.to_bus(self.address)

    def child_address(self):
        return self.address

    def fresh(self):
        return FreshOnBus()


class ThroughSocketActivation(OverTheSocket):
    @classmethod
    def setUpClass(cls):
        harness.require("systemd-socket-activate")
        super().setUpClass()

    @staticmethod
    def make_service():
        """The service started by systemd's activation tool at the first connection."""
        directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        service = Service(directory=directory, command=[
            "systemd-socket-activate", f"--listen={directory / 'reporting.sock'}",
            "--setenv=HALVOX_CONFIG", "--setenv=XDG_RUNTIME_DIR", "--setenv=XDG_STATE_HOME",
            str(harness.SERVICE)])
        service.start(wait=False)
        # The file exists before anyone listens on it. The tool prints a line when it does.
        wait_for("the activation socket", lambda: "Listening on" in service.log())
        return service


class Fresh:
    """A service that a single test may end."""

    def __init__(self, make):
        self._make = make

    def __enter__(self):
        self.service = self._make()
        return self.service, lambda: Client.to_socket(self.service.address)

    def __exit__(self, *_):
        self.service.stop()
        shutil.rmtree(self.service.directory, ignore_errors=True)


class FreshOnBus:
    def __enter__(self):
        self._bus = harness.private_bus()
        address = self._bus.__enter__()
        self.service = Service(bus="session", environment={"DBUS_SESSION_BUS_ADDRESS": address}).start()
        return self.service, lambda: Client.to_bus(address)

    def __exit__(self, *_):
        self.service.stop()
        shutil.rmtree(self.service.directory, ignore_errors=True)
        self._bus.__exit__(None, None, None)


def hold_session(address, reporter):
    """A client that starts a session and then waits to be killed."""
    client = Client.to_socket(address)
    client.create(reporter)
    client.start_later(reporter)
    client.valid(reporter)  # answered after the start, so the start has been carried out
    print("started", flush=True)
    signal.pause()


if __name__ == "__main__" and sys.argv[1:2] == ["--hold-session"]:
    hold_session(sys.argv[2], int(sys.argv[3]))
