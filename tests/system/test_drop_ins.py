"""The drop-ins that open the unit for the link and for PipeWire: enough with real servers, and needed."""

import json
import os
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

import audio
import harness
import nats
import sandbox
from harness import BIN, SERVICE, Service, setpriv_to, start_session, wait_for

EXAMPLES = sandbox.UNIT.parent / "examples"
REPORTER = 7
SINK = "demo-speakers"


def obstacle():
    """Why these tests cannot run on this machine; empty if they can."""
    if sandbox.missing():
        return sandbox.missing()
    if os.environ.get("HALVOX_SANITIZE"):
        return "a sanitizer needs what the unit refuses"
    if os.getuid() != 0:
        return "only root can hide files and the network"
    if subprocess.run(["unshare", "--mount", "--net", "true"], stderr=subprocess.DEVNULL, check=False).returncode != 0:
        return "this machine does not permit new namespaces"
    if subprocess.run([*setpriv_to(sandbox.NOBODY), "test", "-x", str(SERVICE)], check=False).returncode != 0:
        return "another user cannot run the build"
    return ""


@unittest.skipIf(obstacle(), obstacle())
class DropInTest(unittest.TestCase):
    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        self.addCleanup(shutil.rmtree, self.directory, True)
        self.directory.chmod(0o755)

    def service(self, drop_ins, config="", binds=(), environment=None):
        """The service as the unit with these drop-ins runs it."""
        home = Path(tempfile.mkdtemp(prefix="service-", dir=self.directory))
        os.chown(home, sandbox.NOBODY, sandbox.NOBODY)
        service = Service(config, directory=home, environment=environment, command=sandbox.command_in_sandbox(
            [str(SERVICE)], [EXAMPLES / name for name in drop_ins], home, binds))
        service.start()
        self.addCleanup(service.stop)
        return service


class UnitTest(DropInTest):
    """What the sandbox of these tests applies. Without it they would prove nothing."""

    def attempt(self, program, drop_ins=()):
        command = sandbox.command_in_sandbox(["/usr/bin/python3", "-c", program],
                                             [EXAMPLES / name for name in drop_ins], self.directory)
        return subprocess.run(command, capture_output=True, text=True, check=False).stderr

    def test_the_unit_has_no_network_and_no_other_sockets(self):
        self.assertIn("Address family not supported", self.attempt("import socket; socket.socket()"))
        self.assertEqual(self.attempt("import socket; socket.socket(socket.AF_UNIX)"), "")

    def test_the_link_s_drop_in_admits_internet_sockets_alone(self):
        connect = "import socket; socket.create_server(('127.0.0.1', 0))"
        self.assertEqual(self.attempt(connect, ["link-nats.conf"]), "")
        self.assertIn("Address family not supported",
                      self.attempt("import socket; socket.socket(socket.AF_PACKET)", ["link-nats.conf"]))

    def test_the_unit_writes_nowhere_else_and_has_no_rights(self):
        self.assertIn("Read-only file system", self.attempt("open('/var/tmp/x', 'w')"))
        self.assertIn("Operation not permitted", self.attempt("import os; os.chroot('/')"))
        rights = "assert 'CapBnd:\\t0000000000000000' in open('/proc/self/status').read()"
        self.assertEqual(self.attempt(rights), "")


class LinkTest(DropInTest):
    @classmethod
    def setUpClass(cls):
        harness.require("nats-server")
        if not nats.READER.exists() or not (BIN / "halvox-link-nats.so").exists():
            raise unittest.SkipTest("the link to NATS is not in this build")

    def run_session(self, server, drop_ins):
        service = self.service(drop_ins, f'[link]\nbackend = "nats"\nservers = {json.dumps([server.url])}\n')
        client = start_session(self, service, REPORTER)
        client.send({"number": 1}, reporters=[REPORTER])
        return service, client

    def test_messages_reach_a_server_with_the_drop_in(self):
        with nats.Server() as server:
            _, client = self.run_session(server, ["link-nats.conf"])
            client.stop(REPORTER)

            wait_for("the message", lambda: [record for record in nats.try_read_stream(server.url)
                                             if record["message"]["payload"].get("number") == 1])

    def test_the_server_is_out_of_reach_without_it(self):
        with nats.Server() as server:
            service, client = self.run_session(server, [])
            client.stop(REPORTER)

            wait_for("the end of the attempt", lambda: "cannot connect to a NATS server" in service.log())
            self.assertEqual(service.stop(), 0)


class PipeWireTest(DropInTest):
    def setUp(self):
        super().setUp()
        if audio.missing():
            self.skipTest(audio.missing())
        self.audio = self.enterContext(audio.Audio())
        self.runtime = Path(self.audio.environment["XDG_RUNTIME_DIR"])
        # What the administrator does, with an access control list: the service's user may connect.
        for path in (self.audio.directory, self.runtime):
            path.chmod(0o755)
        for path in self.runtime.glob("pipewire-*"):
            path.chmod(0o666)

    def counters_of_the_sink(self, drop_ins):
        """What a session reports about the sink while something plays."""
        variable, = sandbox.settings([EXAMPLES / "pipewire.conf"], "Environment")
        name, directory = variable.split("=")
        self.assertTrue(directory.startswith("/run/user/"), variable)
        service = self.service(drop_ins, binds=[(self.runtime, directory)], environment={name: directory})
        client = start_session(self, service, REPORTER)
        client.configure({"test": "drop-ins"}, REPORTER)
        player = self.audio.play(1)
        self.assertEqual(player.wait(harness.DEADLINE), 0)
        client.stop(REPORTER)
        client.close()
        self.assertEqual(service.stop(), 0)
        return [key for name, payload in service.events() if ".IOReporting." in name
                for key in payload if key.startswith(SINK)], service

    def test_the_sink_is_counted_with_the_drop_in(self):
        found, service = self.counters_of_the_sink(["pipewire.conf"])

        self.assertTrue(found, service.log())

    def test_a_socket_below_run_user_is_hidden_without_it(self):
        found, _ = self.counters_of_the_sink([])

        self.assertEqual(found, [])


if __name__ == "__main__":
    unittest.main()
