"""Which users may connect to the service, and which may end it."""

import contextlib
import os
import shutil
import stat
import subprocess
import tempfile
import unittest
from pathlib import Path

from gi.repository import GLib

import harness
from harness import CTL, NOBODY, SERVICE, Client, Service, as_user, private_bus, setpriv_to

ACCESS_DENIED = "org.freedesktop.DBus.Error.AccessDenied"
EX_UNAVAILABLE, EX_NOPERM, EX_CONFIG = 69, 77, 78
SYSTEM_GROUP = 12  # any group that this process is not a member of


class AccessTest(unittest.TestCase):
    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        self.directory.chmod(0o755)
        self.addCleanup(shutil.rmtree, self.directory, True)

    def copy(self, program):
        """A copy of the program that every user can run."""
        return shutil.copy(program, self.directory)

    def service(self, user=None, **options):
        """A service in a directory that every user may enter."""
        home = Path(tempfile.mkdtemp(prefix="service-", dir=self.directory))
        home.chmod(0o755)
        if user is not None:
            os.chown(home, user, user)
            options["command"] = [*setpriv_to(user), self.copy(SERVICE)]
        service = Service(directory=home, **options)
        self.addCleanup(service.stop)
        return service

    def system_service(self, **options):
        """A service that is not in the directory of a login, so that every user may connect by
        default."""
        return self.service(environment={"XDG_RUNTIME_DIR": ""}, **options)

    def connect(self, service, user=None):
        with as_user(user) if user is not None else contextlib.nullcontext():
            client = service.client()
        self.addCleanup(client.close)
        return client

    def mode(self, path):
        return stat.S_IMODE(os.stat(path).st_mode)

    def assert_refused(self, client):
        with self.assertRaises(GLib.Error) as caught:
            client.call("killService")
        message = caught.exception.message
        self.assertIn(ACCESS_DENIED, message)
        self.assertIn("killService", message)
        self.assertIn(f"uid {NOBODY}", message)

    def assert_killed(self, service, client):
        client.call_later("killService")
        # The service may have ended, and closed the connection, before the flush.
        with contextlib.suppress(GLib.Error):
            client.connection.flush_sync(None)
        self.assertEqual(service.process.wait(harness.DEADLINE), 2)


@unittest.skipIf(os.getuid() != 0, "needs the right to become another user")
class EndingTheService(AccessTest):
    def test_another_user_may_not_end_it_but_may_do_everything_else(self):
        service = self.system_service().start()
        stranger = self.connect(service, NOBODY)

        self.assert_refused(stranger)

        self.assertIs(stranger.create(7), True)
        stranger.send({"a": 1}, reporters=[7])
        self.assertEqual(stranger.reporters(), [7])
        self.assertIsNone(service.process.poll())

    def test_the_command_says_why_and_the_service_continues(self):
        service = self.system_service().start()
        kill = [*setpriv_to(NOBODY), self.copy(CTL), "--socket", str(service.socket), "kill"]

        result = subprocess.run(kill, capture_output=True, text=True, timeout=harness.DEADLINE)

        self.assertEqual(result.returncode, 1, result.stderr)
        self.assertEqual(result.stdout, "")
        self.assertIn("only root and the service's own user", result.stderr)
        self.assertEqual(result.stderr.count("\n"), 1)
        self.assertIsNone(service.process.poll())

    def test_its_own_user_may_end_it(self):
        service = self.system_service(user=NOBODY).start()

        self.assert_killed(service, self.connect(service, NOBODY))

    def test_root_may_end_the_service_of_another_user(self):
        service = self.system_service(user=NOBODY).start()

        self.assert_killed(service, self.connect(service))

    def test_a_third_user_may_not_end_the_service_of_another_user(self):
        service = self.system_service(user=NOBODY - 1).start()

        self.assert_refused(self.connect(service, NOBODY))
        self.assertIsNone(service.process.poll())


@unittest.skipIf(os.getuid() != 0, "needs the right to become another user")
class DeletingRecords(AccessTest):
    def vacuum(self, client):
        client.call("BeginVacuum", "a{sv}", {}, interface="com.tarno.halvox.Storage")

    def test_another_user_may_neither_delete_nor_look(self):
        stranger = self.connect(self.system_service().start(), NOBODY)

        with self.assertRaisesRegex(GLib.Error, f"{ACCESS_DENIED}.*uid {NOBODY}"):
            self.vacuum(stranger)
        with self.assertRaisesRegex(GLib.Error, ACCESS_DENIED):
            stranger.call("GetVacuum", interface="com.tarno.halvox.Storage")
        with self.assertRaisesRegex(GLib.Error, ACCESS_DENIED):
            stranger.call("BeginErase", "a{sv}", {}, interface="com.tarno.halvox.Storage")
        with self.assertRaisesRegex(GLib.Error, ACCESS_DENIED):
            stranger.call("GetErase", interface="com.tarno.halvox.Storage")

    def test_the_command_says_why(self):
        service = self.system_service().start()
        vacuum = [*setpriv_to(NOBODY), self.copy(CTL), "--socket", str(service.socket), "vacuum", "--older", "1s"]

        result = subprocess.run(vacuum, capture_output=True, text=True, timeout=harness.DEADLINE)

        self.assertEqual(result.returncode, 1, result.stderr)
        self.assertIn("only root and the service's own user", result.stderr)

    def test_its_own_user_and_root_may(self):
        service = self.system_service(user=NOBODY).start()

        for user in (NOBODY, None):
            client = self.connect(service, user)
            self.vacuum(client)
            harness.wait_for("its end", lambda: not client.call(
                "GetVacuum", interface="com.tarno.halvox.Storage")["running"])


@unittest.skipIf(os.getuid() != 0, "needs the right to become another user")
class EndingTheServiceOverABus(AccessTest):
    @classmethod
    def setUpClass(cls):
        harness.require("dbus-daemon")

    def connect_to_bus(self, address, user=None):
        with as_user(user) if user is not None else contextlib.nullcontext():
            client = Client.to_bus(address)
        self.addCleanup(client.close)
        return client

    def test_the_sender_s_user_decides(self):
        with private_bus(open_to_all=True) as address:
            service = self.service(bus="session", environment={"DBUS_SESSION_BUS_ADDRESS": address})
            service.start()
            stranger = self.connect_to_bus(address, NOBODY)

            self.assert_refused(stranger)
            self.assertIs(stranger.create(7), True)
            self.assertIsNone(service.process.poll())

            self.assert_killed(service, self.connect_to_bus(address))


class WhoMayConnect(AccessTest):
    def test_everybody_to_a_service_of_the_system(self):
        service = self.system_service().start()

        self.assertEqual(self.mode(service.socket), 0o666)

    def test_the_user_alone_to_a_service_in_a_login_s_directory(self):
        service = self.service().start()  # the socket is in XDG_RUNTIME_DIR

        self.assertEqual(self.mode(service.socket), 0o600)

    def test_the_mode_is_as_configured(self):
        service = self.system_service(listener='mode = "0640"\n').start()

        self.assertEqual(self.mode(service.socket), 0o640)
        self.assertIs(self.connect(service).create(7), True)

    @unittest.skipIf(os.getuid() != 0, "needs the right to become another user")
    def test_another_user_is_kept_out_by_the_mode(self):
        service = self.system_service(listener='mode = "0600"\n').start()
        command = [*setpriv_to(NOBODY), self.copy(CTL), "--socket", str(service.socket), "list"]

        result = subprocess.run(command, capture_output=True, text=True, timeout=harness.DEADLINE)

        self.assertEqual(result.returncode, EX_UNAVAILABLE)
        self.assertIn("Permission denied", result.stderr)

    @unittest.skipIf(os.getuid() != 0, "needs the right to give files away")
    def test_the_members_of_the_configured_group_may_connect(self):
        group = group_name(NOBODY)
        service = self.system_service(listener=f'group = "{group}"\n').start()

        self.assertEqual(os.stat(service.socket).st_gid, NOBODY)
        self.assertEqual(self.mode(service.socket), 0o660, "a group is given to keep others out")
        self.assertIs(self.connect(service, NOBODY).create(7), True)

    def test_an_unknown_group_ends_the_start(self):
        self.assert_no_start(self.system_service(listener='group = "no such group"\n'),
                             EX_CONFIG, "listener.group", "no such group")

    @unittest.skipIf(os.getuid() != 0, "needs the right to become another user")
    def test_a_group_that_the_service_may_not_give_the_socket_to_ends_the_start(self):
        group = group_name(SYSTEM_GROUP)
        service = self.system_service(user=NOBODY, listener=f'group = "{group}"\n')

        self.assert_no_start(service, EX_NOPERM, str(service.socket), f'"{group}"',
                             "Operation not permitted")
        self.assertFalse(service.socket.exists())

    def test_a_wrong_mode_is_refused_with_its_place(self):
        for text in ('"rw"', '"0888"', "660", '"0066"', '"1777"', '""'):
            with self.subTest(text=text):
                service = self.system_service(listener=f"mode = {text}\n")

                self.assert_no_start(service, EX_CONFIG, "halvox.toml:4:8: listener.mode: expected")

    def assert_no_start(self, service, status, *texts):
        service.start(wait=False)
        self.assertEqual(service.process.wait(harness.DEADLINE), status, service.log())
        for text in texts:
            self.assertIn(text, service.log())


def group_name(number):
    import grp
    return grp.getgrgid(number).gr_name


if __name__ == "__main__":
    unittest.main()
