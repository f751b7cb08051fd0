"""A service that D-Bus starts is found on the bus that started it, as the packaged files demand."""

import contextlib
import os
import re
import shutil
import signal
import subprocess
import tempfile
import unittest
from pathlib import Path

from gi.repository import Gio, GLib

import harness
from harness import BUS_NAME, SERVICE, WITH_US, Client, Service, iterate_until, private_bus, wait_for

PACKAGING = Path(__file__).parents[2] / "packaging"
SERVICE_FILE = PACKAGING / "dbus" / f"{BUS_NAME}.service.in"
# The installation puts its own directory there.
SHIPPED_SERVICE = "@BINDIR@/halvox-reportingd"
BUS = "org.freedesktop.DBus"


def shipped_unit():
    """The unit that the D-Bus service file lets systemd start."""
    name = re.search(r"^SystemdService=(.+)$", SERVICE_FILE.read_text(), re.MULTILINE)[1]
    return name, (PACKAGING / "systemd" / f"{name}.in").read_text()


class Activation(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        harness.require("dbus-daemon")

    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        self.addCleanup(shutil.rmtree, self.directory, True)
        (self.directory / "run").mkdir(mode=0o700)

    def environment(self):
        """The environment of a login without any configuration. Both buses are the test's own."""
        return {"HOME": str(self.directory), "XDG_RUNTIME_DIR": str(self.directory / "run"),
                "XDG_CONFIG_HOME": str(self.directory / "config"), "HALVOX_CONFIG": "",
                "XDG_STATE_HOME": str(self.directory / "state")}

    @contextlib.contextmanager
    def bus(self, *options):
        """A bus that knows the service from the packaged file, with the path of the built program."""
        services = self.directory / "services"
        services.mkdir()
        text = SERVICE_FILE.read_text()
        self.assertIn(f"Exec={SHIPPED_SERVICE}\n", text)
        # The service cannot be made to end with its parent, because its parent is a process of the
        # bus that ends after the start. If the test is killed, the time-out ends the service.
        command = f"{shutil.which('timeout')} 120 {SERVICE}"
        (services / SERVICE_FILE.stem).write_text(text.replace(SHIPPED_SERVICE, command))
        configuration = (f"<servicedir>{services}</servicedir>"
                         f"<limit name='service_start_timeout'>{10000}</limit>")
        with private_bus(configuration, options, self.environment()) as address:
            yield address

    def connect(self, address):
        client = Client.to_bus(address)
        self.addCleanup(client.close)
        return client

    def call_bus(self, client, member, signature, *arguments):
        return client.connection.call_sync(
            BUS, "/org/freedesktop/DBus", BUS, member, GLib.Variant(f"({signature})", arguments), None,
            Gio.DBusCallFlags.NONE, int(harness.DEADLINE * 1000), None).unpack()

    def stop_owner(self, client):
        """Ends the service that the bus started; it is not a child of the test."""
        pid, = self.call_bus(client, "GetConnectionUnixProcessID", "s", BUS_NAME)
        os.kill(pid, signal.SIGTERM)
        wait_for("the end of the service", lambda: not Path(f"/proc/{pid}").exists())

    def test_a_call_by_name_starts_the_service_and_is_answered(self):
        with self.bus() as address:
            client = self.connect(address)

            answer = client.connection.call_sync(
                BUS_NAME, harness.OBJECT, harness.INTERFACE, "createReportingSession",
                GLib.Variant("(x)", (7,)), None, Gio.DBusCallFlags.NONE,
                int(harness.DEADLINE * 1000), None)

            self.assertEqual(answer.unpack(), (True,))
            self.assertTrue((self.directory / "run/halvox/reporting.sock").is_socket())
            self.stop_owner(client)

    def test_a_bus_that_leaves_starting_to_systemd_is_joined_too(self):
        """The test stands for systemd: it runs the unit's command in the unit's environment."""
        unit_name, unit = shipped_unit()
        with self.bus("--systemd-activation") as address:
            systemd = self.connect(address)
            asked = []
            systemd.connection.signal_subscribe(
                BUS, "org.freedesktop.systemd1.Activator", "ActivationRequest", None, None,
                Gio.DBusSignalFlags.NONE, lambda *signal_: asked.append(signal_[5].unpack()[0]))
            self.assertEqual(self.call_bus(systemd, "RequestName", "su", "org.freedesktop.systemd1", 4), (1,))
            client = self.connect(address)
            call = harness.Pending()
            client.connection.call(
                BUS_NAME, harness.OBJECT, harness.INTERFACE, "getAllReporters", None, None,
                Gio.DBusCallFlags.NONE, int(harness.DEADLINE * 1000), None, call.finish)
            iterate_until("the request to systemd", lambda: asked)
            self.assertEqual(asked, [unit_name])
            variables = dict(line.split("=", 1) for line in re.findall(r"^Environment=(.+)$", unit, re.MULTILINE))
            self.assertIn(f"ExecStart={SHIPPED_SERVICE}\n", unit)
            service = subprocess.Popen(
                [*WITH_US, str(SERVICE)], stderr=subprocess.DEVNULL,
                env={**os.environ, **self.environment(), **variables, "DBUS_SYSTEM_BUS_ADDRESS": address})
            self.addCleanup(harness.stop_process, service)

            self.assertEqual(call.wait(), [])

    def test_a_program_started_by_another_bus_serves_its_socket_all_the_same(self):
        """Like a service in a terminal that a bus started: the bus may have ended, or the name be taken."""
        environment = {"DBUS_STARTER_ADDRESS": f"unix:path={self.directory}/no-bus",
                       "DBUS_STARTER_BUS_TYPE": "session"}
        with Service(environment=environment) as service:
            client = service.client()
            self.assertIs(client.create(7), True)
            client.close()
            self.assertIn("cannot join the bus that started the service", service.log())

    def test_the_bus_of_the_configuration_is_joined_beside_the_one_that_started_it(self):
        with private_bus() as configured, private_bus() as starter:
            environment = {"DBUS_SESSION_BUS_ADDRESS": configured, "DBUS_STARTER_ADDRESS": starter,
                           "DBUS_STARTER_BUS_TYPE": "system"}
            with Service(bus="session", environment=environment):
                for address in (configured, starter):
                    self.assertIs(self.connect(address).create(7), True)

    def test_one_bus_is_joined_once(self):
        with private_bus() as address:
            environment = {"DBUS_SESSION_BUS_ADDRESS": address, "DBUS_STARTER_ADDRESS": address,
                           "DBUS_STARTER_BUS_TYPE": "session"}
            with Service(bus="session", environment=environment) as service:
                self.assertIs(self.connect(address).create(7), True)
                self.assertNotIn("cannot join", service.log())


if __name__ == "__main__":
    unittest.main()
