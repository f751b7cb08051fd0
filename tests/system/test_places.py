"""Every program finds the service and its store by one rule: the named place, else the user's, else
the system's.

The system's places are fixed. The clients therefore run in a mount namespace in which /run and
/var/lib lead to the scratch directory. The services run outside of it.
"""

import json
import os
import shutil
import socket
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

from harness import BIN, CTL, DEADLINE, WITH_US, Service, stop_process, wait_for

IN_NAMESPACE = ["unshare", "-rm", "--", "sh", "-c",
                'mount --bind "$1" /run && mount --bind "$2" /var/lib && shift 2 && exec "$@"', "sh"]
SYSTEM_SOCKET = "/run/halvox/reporting.sock"
SYSTEM_STORE = "/var/lib/halvox/halvox.db"
# A program with the client library only, like an audio application. Ends when its input ends.
APPLICATION = """
import ctypes, sys
library = ctypes.CDLL(sys.argv[1])
library.halvox_client_new.restype = ctypes.c_void_p
client = ctypes.c_void_p(library.halvox_client_new(None))
library.halvox_client_create_session(client, ctypes.c_int64(77))
print(library.halvox_client_flush(client, 20000), flush=True)
path = ctypes.create_string_buffer(200)
library.halvox_default_socket_path(path, 200)
print(path.value.decode(), flush=True)
sys.stdin.read()
library.halvox_client_free(client)
"""


def can_make_namespaces():
    with tempfile.TemporaryDirectory() as directory:
        return subprocess.run([*IN_NAMESPACE, directory, directory, "true"], check=False,
                              capture_output=True).returncode == 0


class Places(unittest.TestCase):
    def setUp(self):
        if not can_make_namespaces():
            self.skipTest("mount namespaces are not permitted here")
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-places-"))
        self.addCleanup(shutil.rmtree, self.directory, ignore_errors=True)
        self.run_directory, self.var_lib, self.user, self.home = (
            self.directory / name for name in ("run", "var-lib", "user", "home"))
        for path in (self.run_directory / "halvox", self.var_lib, self.user / "halvox", self.home):
            path.mkdir(parents=True)
        self.user_socket = self.user / "halvox/reporting.sock"
        self.user_store = self.home / ".local/state/halvox/halvox.db"
        self.environment = {
            **{name: value for name, value in os.environ.items()
               if not name.startswith(("HALVOX_C", "HALVOX_S", "XDG_"))},
            "XDG_RUNTIME_DIR": str(self.user), "HOME": str(self.home)}

    def serve(self, socket_path, storage):
        """A service at these places until the end of the test."""
        directory = Path(tempfile.mkdtemp(prefix="halvox-service-", dir=self.directory))
        service = Service(directory=directory)
        service.config.write_text(f'[listener]\nsocket = "{socket_path}"\n'
                                  f'[storage]\ndirectory = "{storage}"\n')
        service.database = Path(storage) / "halvox.db"
        service.start()
        self.addCleanup(service.stop)
        return service

    def serve_system(self):
        return self.serve(self.run_directory / "halvox/reporting.sock", self.var_lib / "halvox")

    def serve_user(self):
        return self.serve(self.user_socket, self.user_store.parent)

    def inside(self, *command):
        return [*IN_NAMESPACE, str(self.run_directory), str(self.var_lib), *WITH_US,
                *map(str, command)]

    def ctl(self, *arguments, status=0, **environment):
        result = subprocess.run(self.inside(CTL, *arguments), capture_output=True, text=True,
                                check=False, timeout=DEADLINE,
                                env={**self.environment, **environment})
        self.assertEqual(result.returncode, status, result.stderr)
        return result

    def leave_stale_socket(self):
        with socket.socket(socket.AF_UNIX) as listener:
            listener.bind(str(self.user_socket))

    def create_and_list(self, number):
        """What a connection that has a session with this number can see."""
        script = self.directory / "script"
        script.write_text(f"create {number}\nlist\n")
        return self.ctl("run", str(script))

    def run_application(self):
        if os.environ.get("HALVOX_SANITIZE"):
            self.skipTest("a program without a sanitizer cannot load a library with one")
        process = subprocess.Popen(
            self.inside(sys.executable, "-c", APPLICATION, BIN.parent / "client/libhalvox-client.so"),
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True, env=self.environment)

        def end():
            process.stdin.close()
            process.wait(DEADLINE)
            process.stdout.close()
        self.addCleanup(end)
        return process

    def sessions(self, service):
        return self.ctl("list", "--socket", service.config.read_text().split('"')[1]).stdout

    def wait_for_session(self, service):
        wait_for("the application's session", lambda: self.sessions(service) == "77\n")


class ServicePlacesTest(Places):
    def test_a_service_of_the_system_is_found_from_a_login_session(self):
        self.serve_system()

        result = self.create_and_list(7)

        self.assertEqual((result.stdout, result.stderr), ("7\n", ""))

    def test_the_services_of_user_and_system_are_distinguished(self):
        system = self.serve_system()
        user = self.serve_user()
        self.ctl("send", "--all", "--category", "1", "--type", "1", '{"where": "user"}')

        user.wait_for_payload(lambda payload: payload.get("where") == "user")
        user.stop()
        self.ctl("send", "--all", "--category", "1", "--type", "1", '{"where": "system"}')

        system.wait_for_payload(lambda payload: payload.get("where") == "system")
        self.assertEqual({payload["where"] for _, payload in system.events()}, {"system"})

    def test_a_socket_without_a_service_is_skipped_and_named(self):
        self.serve_system()
        self.leave_stale_socket()

        result = self.create_and_list(7)

        self.assertEqual(result.stdout, "7\n")
        self.assertEqual(result.stderr, f"halvoxctl: no service listens on {self.user_socket}; "
                                        f"using {SYSTEM_SOCKET}\n")

    def test_without_a_service_all_places_are_named_in_their_order(self):
        self.leave_stale_socket()

        result = self.ctl("list", status=69)

        self.assertEqual(result.stderr,
                         f"halvoxctl list: no service found; tried {self.user_socket} "
                         f"(Connection refused), then {SYSTEM_SOCKET} (No such file or directory)\n")

    def test_what_was_named_is_the_only_place(self):
        self.serve_system()
        named = self.directory / "named.sock"
        config = self.directory / "named.toml"
        config.write_text(f'[listener]\nsocket = "{named}"\n')

        for arguments, environment in ((["--socket", named], {}), ([], {"HALVOX_SOCKET": str(named)}),
                                       ([], {"HALVOX_CONFIG": str(config)})):
            result = self.ctl("list", *arguments, status=69, **environment)
            self.assertIn(f"no service at {named}: No such file or directory", result.stderr)
            self.assertNotIn(SYSTEM_SOCKET, result.stderr)

    def test_the_socket_that_the_configuration_names_is_found(self):
        service = self.serve(self.directory / "named.sock", self.var_lib / "halvox")

        self.ctl("list", HALVOX_CONFIG=str(service.config))

    def test_a_wrong_configuration_stops_no_command_that_names_the_socket(self):
        self.serve_system()
        config = self.directory / "wrong.toml"
        config.write_text("[listener]\nsocket = 7\n")

        self.assertIn("listener.socket", self.ctl("list", status=78, HALVOX_CONFIG=str(config)).stderr)
        self.ctl("list", "--socket", SYSTEM_SOCKET, HALVOX_CONFIG=str(config))

    def test_programs_with_the_client_library_find_the_service_of_the_system(self):
        self.serve_system()

        application = self.run_application()

        self.assertEqual(application.stdout.readline(), "0\n")
        self.assertEqual(application.stdout.readline(), f"{SYSTEM_SOCKET}\n")

    def test_a_client_waits_for_its_own_service_before_it_uses_another(self):
        system = self.serve_system()
        user = self.serve_user()
        self.assertEqual(self.run_application().stdout.readline(), "0\n")
        self.wait_for_session(user)

        user.stop()
        user.start()
        self.wait_for_session(user)
        self.assertEqual(self.sessions(system), "")

        user.stop()
        self.wait_for_session(system)

    def test_the_reporter_finds_the_service_of_the_system_and_says_where(self):
        self.serve_system()
        self.assert_reporter_connects_to(SYSTEM_SOCKET)

    def test_the_reporter_follows_the_configuration(self):
        service = self.serve(self.directory / "named.sock", self.var_lib / "halvox")
        self.environment["HALVOX_CONFIG"] = str(service.config)

        self.assert_reporter_connects_to(self.directory / "named.sock")

    def assert_reporter_connects_to(self, path):
        reporter = BIN / "halvox-pipewire-reporter"
        if not reporter.exists():
            self.skipTest("the reporter is not built")
        log = self.directory / "reporter.log"
        with open(log, "wb") as output:
            process = subprocess.Popen(self.inside(reporter, "--remote", "no-such-server"),
                                       stdin=subprocess.DEVNULL, stderr=output, env=self.environment)
        self.addCleanup(stop_process, process)

        wait_for("the reporter to connect", lambda: "connected to the reporting service at "
                 f"{path}\n" in log.read_text())


class StorePlacesTest(Places):
    def store(self, service, text):
        self.ctl("send", "--all", "--category", "1", "--type", "1", json.dumps({"where": text}),
                 "--socket", service.config.read_text().split('"')[1])
        service.wait_for_payload(lambda payload: payload.get("where") == text)

    def shown(self, **environment):
        lines = self.ctl("events", "--json", "--name", "*Generic*", **environment).stdout.splitlines()
        return [json.loads(line)["payload"]["where"] for line in lines]

    def test_the_store_of_the_system_is_shown_unless_the_user_has_one(self):
        self.store(self.serve_system(), "system")
        self.assertEqual(self.shown(), ["system"] * len(self.shown()))
        self.assertNotEqual(self.shown(), [])

        self.store(self.serve_user(), "user")

        self.assertEqual(set(self.shown()), {"user"})

    def test_the_store_that_the_configuration_names_is_the_only_one(self):
        self.store(self.serve_system(), "system")
        config = self.directory / "named.toml"
        config.write_text(f'[storage]\ndirectory = "{self.directory / "elsewhere"}"\n')

        result = self.ctl("events", status=69, HALVOX_CONFIG=str(config))

        self.assertIn(str(self.directory / "elsewhere"), result.stderr)
        self.assertNotIn("/var/lib", result.stderr)

    def test_without_a_store_all_places_are_named_in_their_order(self):
        for command in ("events", "metrics", "power", "link", "snapshots"):
            for more in ([], ["--follow"]):
                result = self.ctl(command, *more, status=69)
                self.assertEqual(
                    result.stderr,
                    f"halvoxctl {command}: no store found; tried {self.user_store} "
                    f"(No such file or directory), then {SYSTEM_STORE} (No such file or directory)\n")

    def test_settings_go_where_the_store_is(self):
        self.serve_system()
        self.ctl("preferences", "set", "com.tarno.halvox", "device_name", "Kitchen")

        self.assertTrue((self.var_lib / "halvox/preferences/mobile/com.tarno.halvox.toml").exists())


if __name__ == "__main__":
    unittest.main()
