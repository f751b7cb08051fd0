"""Runs the built service in a scratch directory and talks to it with clients that are not ours.

Everything that is started here is stopped here, by process ID. Every wait is for a
named condition and has a deadline.
"""

import contextlib
import itertools
import json
import os
import select
import shutil
import signal
import socket
import sqlite3
import subprocess
import tempfile
import time
import unittest
from pathlib import Path

import gi

gi.require_version("Gio", "2.0")
from gi.repository import Gio, GLib  # noqa: E402

BIN = Path(os.environ.get("HALVOX_BIN", Path(__file__).parents[2] / "build/dev/bin")).resolve()
SERVICE = BIN / "halvox-reportingd"
CTL = BIN / "halvoxctl"
STORE_EXTENSION = BIN / "halvox-sqlite.so"
BUS_NAME = "com.tarno.halvox.reporting"
OBJECT = "/com/tarno/halvox/reporting"
UPTIME_EVENT = "com.tarno.halvox.hvreportingclientuptime"
INTERFACE = "com.tarno.halvox.HVReportingServiceProtocol"
# A program that a test starts ends with the test, even if a time-out kills the test.
WITH_US = ["setpriv", "--pdeathsig", "KILL", "--"]
# Seconds. On a slow machine a sanitized service needs most of a minute to read a million events back.
DEADLINE = 240.0 if os.environ.get("HALVOX_SANITIZE") else 30.0

NOBODY = 65534  # a user other than the one who runs the tests

PLAYBACK = 4
START, STOP = 1, 2


def wait_for(what, condition, deadline=DEADLINE, pause=0.01):
    """Waits until condition() is true and returns its value. Fails with the name of what was
    awaited."""
    end = time.monotonic() + deadline
    while True:
        value = condition()
        if value:
            return value
        if time.monotonic() > end:
            raise AssertionError(f"timed out after {deadline:.0f} s waiting for {what}")
        time.sleep(pause)


def stop_process(process, signal_number=signal.SIGTERM, deadline=DEADLINE):
    """Stops one of our own processes by its id and returns its exit status."""
    if process.poll() is None:
        process.send_signal(signal_number)
        try:
            process.wait(deadline)
        except subprocess.TimeoutExpired:
            process.kill()
            process.wait(deadline)
            raise AssertionError(f"{process.args[0]} did not end within {deadline:.0f} s")
    return process.returncode


@contextlib.contextmanager
def as_user(uid):
    """Runs the body as that user, whose only group is the one of the same number."""
    groups = os.getgroups()
    os.setgroups([])
    os.setegid(uid)
    os.seteuid(uid)
    try:
        yield
    finally:
        os.seteuid(0)
        os.setegid(0)
        os.setgroups(groups)


def setpriv_to(uid):
    """The beginning of a command line that runs the rest as that user. The program ends with this
    process."""
    return ["setpriv", "--pdeathsig", "KILL", f"--reuid={uid}", f"--regid={uid}", "--clear-groups", "--"]


class NotifySocket:
    """Where the service reports READY=1, as it does to systemd."""

    def __init__(self, directory):
        self.path = str(Path(directory) / "notify")
        with contextlib.suppress(FileNotFoundError):
            os.unlink(self.path)
        self._socket = socket.socket(socket.AF_UNIX, socket.SOCK_DGRAM)
        self._socket.bind(self.path)
        os.chmod(self.path, 0o666)  # a service of another user reports it too

    def wait_ready(self, process, log_path, deadline=DEADLINE):
        end = time.monotonic() + deadline
        while time.monotonic() < end:
            readable, _, _ = select.select([self._socket], [], [], 0.05)
            if readable and b"READY=1" in self._socket.recv(4096):
                return
            if process.poll() is not None:
                text = Path(log_path).read_text(errors="replace")
                raise AssertionError(f"service ended with {process.returncode}:\n{text}")
        raise AssertionError("service did not become ready:\n" + Path(log_path).read_text(errors="replace"))

    def close(self):
        self._socket.close()


def voluntary_switches(process):
    """How often the threads of a process have gone to sleep so far: each time is one wake-up."""
    total = 0
    for status in Path(f"/proc/{process.pid}/task").glob("*/status"):
        for line in status.read_text().splitlines():
            if line.startswith("voluntary_ctxt_switches:"):
                total += int(line.split()[1])
    return total


class Startable:
    """A context that starts a server, stops it, and then deletes its directory if that is its own."""

    _owns_directory = True

    def __enter__(self):
        return self.start()

    def __exit__(self, *_):
        try:
            self.stop()
        finally:
            if self._owns_directory:
                shutil.rmtree(self.directory, ignore_errors=True)


def connect_to_store(database, mode="ro"):
    """Opens a store as any program does: with SQLite and the extension that unpacks messages."""
    connection = sqlite3.connect(f"file:{database}?mode={mode}", uri=True)
    connection.enable_load_extension(True)
    connection.load_extension(str(STORE_EXTENSION))
    connection.enable_load_extension(False)
    return contextlib.closing(connection)


def service_command():
    """HALVOX_SANDBOX=1 runs every service under the system call filter of the shipped unit."""
    if not os.environ.get("HALVOX_SANDBOX"):
        return [str(SERVICE)]
    import sandbox  # needs a library that other tests do not need

    return sandbox.command_in_sandbox([str(SERVICE)])


class Service(Startable):
    """The built service with its own directories. Use as a context manager or call stop()."""

    def __init__(self, config="", bus="none", environment=None, directory=None, command=None,
                 listener=""):
        self.directory = Path(directory or tempfile.mkdtemp(prefix="halvox-test-"))
        self._owns_directory = directory is None
        self.socket = self.directory / "reporting.sock"
        self.database = self.directory / "state" / "halvox.db"
        self.config = self.directory / "halvox.toml"
        self.log_path = self.directory / "service.log"
        # Tests add tables of their own. The two that every test needs are written here.
        self.config.write_text(
            f'[listener]\nsocket = "{self.socket}"\nbus = "{bus}"\n{listener}'
            + ("" if "[storage]" in config else f'[storage]\ndirectory = "{self.directory / "state"}"\n')
            + config
        )
        self._environment = {
            # The terminal that the tests run in may have been started by a bus.
            **{key: value for key, value in os.environ.items() if not key.startswith("DBUS_STARTER_")},
            "HALVOX_CONFIG": str(self.config),
            "XDG_RUNTIME_DIR": str(self.directory),
            "XDG_STATE_HOME": str(self.directory / "xdg-state"),
            **(environment or {}),
        }
        self._command = command or service_command()
        self.process = None

    def start(self, wait=True):
        notify = NotifySocket(self.directory)
        try:
            with open(self.log_path, "ab") as log:
                self.process = subprocess.Popen(
                    WITH_US + self._command,
                    env={**self._environment, "NOTIFY_SOCKET": notify.path},
                    stdin=subprocess.DEVNULL, stdout=log, stderr=log,
                )
            if wait:
                notify.wait_ready(self.process, self.log_path)
        except BaseException:
            if self.process is not None and self.process.poll() is None:
                self.process.kill()
                self.process.wait()
            raise
        finally:
            notify.close()
        return self

    def stop(self, signal_number=signal.SIGTERM):
        status = stop_process(self.process, signal_number) if self.process else None
        return status

    @property
    def address(self):
        return f"unix:path={self.socket}"

    def ctl_environment(self, **more):
        """The variables with which halvoxctl finds this service and its store."""
        return {**os.environ, "HALVOX_CONFIG": str(self.config), **more}

    def ctl(self, *arguments, status=0, stdin="", text=True):
        """Runs halvoxctl with the configuration of this service. Returns the finished process, and
        fails with what it reports unless it ends with that status."""
        result = subprocess.run([CTL, *map(str, arguments)], capture_output=True, text=text, check=False,
                                timeout=DEADLINE, input=stdin if text else stdin.encode(),
                                env=self.ctl_environment())
        if result.returncode != status:
            raise AssertionError(f"halvoxctl ended with {result.returncode} instead of {status}: "
                                 f"{result.stderr}")
        return result

    def log(self):
        return self.log_path.read_text(errors="replace")

    def client(self):
        return Client.to_socket(self.address)

    def events(self):
        """The recorded messages in order, as (name, payload) pairs. None before the first commit."""
        return [event for event in self.all_events() if event[0] != UPTIME_EVENT]

    def all_events(self):
        """The same, with the events that the service records when a client disconnects."""
        if not self.database.exists():
            return []
        with connect_to_store(self.database) as database:
            rows = database.execute("SELECT name, payload FROM analytics_events").fetchall()
        return [(name, json.loads(payload)) for name, payload in rows]

    def link_messages(self, session):
        """The messages of a session on the link, as (category, type, payload)."""
        if not self.database.exists():
            return []
        with connect_to_store(self.database) as database:
            rows = database.execute("SELECT category, type, payload FROM link_messages"
                                    " WHERE session_id = ?", (session,)).fetchall()
        return [(category, event_type, json.loads(payload)) for category, event_type, payload in rows]

    def wait_for_events(self, count):
        return wait_for(f"{count} events", lambda: len(found := self.events()) >= count and found)

    def wait_for_payload(self, matches):
        """Waits for a recorded payload that matches, and returns the first."""
        return wait_for("a recorded payload",
                        lambda: next((payload for _, payload in self.events() if matches(payload)), None))

    def memory_kib(self):
        for line in Path(f"/proc/{self.process.pid}/status").read_text().splitlines():
            if line.startswith("VmRSS:"):
                return int(line.split()[1])
        raise AssertionError("the service has ended")

    def threads(self):
        return len(os.listdir(f"/proc/{self.process.pid}/task"))

    def voluntary_switches(self):
        return voluntary_switches(self.process)


def start_service(test, config=""):
    """Starts a service for one test. Returns it and a client of it."""
    service = Service(config)
    service.__enter__()
    test.addCleanup(service.__exit__)
    client = service.client()
    test.addCleanup(client.close)
    return service, client


def start_session(test, service, reporter):
    """Starts a session. Returns its client, which is closed after the test."""
    client = service.client()
    test.addCleanup(client.close)
    client.create(reporter)
    client.start_later(reporter)
    return client


class Follower:
    """A halvoxctl that follows the store and prints one JSON object a line."""

    def __init__(self, service, command):
        words = [command] if isinstance(command, str) else command
        self._process = subprocess.Popen(
            [*WITH_US, str(CTL), *words, "--follow", "--json"], stdin=subprocess.DEVNULL,
            stdout=subprocess.PIPE, env=service.ctl_environment())
        os.set_blocking(self._process.stdout.fileno(), False)
        self._bytes = b""

    def so_far(self):
        """All records that have been printed so far."""
        self._bytes += self._process.stdout.read() or b""
        return [json.loads(line) for line in self._bytes.decode().split("\n")[:-1]]

    def records(self, count):
        """Waits for that many records and returns all so far."""
        return wait_for(f"{count} records",
                        lambda: len(shown := self.so_far()) >= count and shown)

    def leave(self):
        """Stops reading. Returns the exit status with which the program then ends."""
        self._process.stdout.close()
        return self._process.wait(DEADLINE)

    def close(self):
        self._process.stdout.close()
        stop_process(self._process)


class Client:
    """A client in GLib's own D-Bus implementation, over our socket or over a bus."""

    def __init__(self, connection, destination):
        self.connection = connection
        self._destination = destination

    @classmethod
    def to_socket(cls, address):
        flags = (Gio.DBusConnectionFlags.AUTHENTICATION_CLIENT
                 | Gio.DBusConnectionFlags.MESSAGE_BUS_CONNECTION)
        connection = Gio.DBusConnection.new_for_address_sync(address, flags, None, None)
        connection.set_exit_on_close(False)
        return cls(connection, BUS_NAME)

    to_bus = to_socket

    def close(self):
        with contextlib.suppress(GLib.Error):
            self.connection.close_sync(None)

    def call(self, member, signature="", *arguments, path=OBJECT, interface=INTERFACE):
        """Sends one request. Returns its answer as Python values or raises GLib.Error."""
        reply = self.connection.call_sync(
            self._destination, path, interface, member,
            GLib.Variant(f"({signature})", arguments) if signature else None,
            None, Gio.DBusCallFlags.NO_AUTO_START, int(DEADLINE * 1000), None,
        )
        values = reply.unpack()
        return values[0] if len(values) == 1 else values or None

    def call_later(self, member, signature="", *arguments):
        """Sends one request. The caller reads its answer later."""
        pending = Pending()
        self.connection.call(
            self._destination, OBJECT, INTERFACE, member,
            GLib.Variant(f"({signature})", arguments) if signature else None,
            None, Gio.DBusCallFlags.NO_AUTO_START, GLib.MAXINT32, None, pending.finish,
        )
        return pending

    # The protocol.
    def create(self, reporter):
        return self.call("createReportingSession", "x", reporter)

    def set_type(self, service_type, reporter):
        return self.call("setServiceType", "qx", service_type, reporter)

    def service_type(self, reporter):
        return self.call("getServiceNameForReporterID", "x", reporter)

    def configure(self, configuration, reporter):
        return self.call("setConfiguration", "a{sv}x", variants(configuration), reporter)

    def begin(self, reporter, service_type, application):
        """Creates and starts a session of that type and application."""
        self.create(reporter)
        self.set_type(service_type, reporter)
        self.configure({"HostApplicationDisplayID": application}, reporter)
        self.start_later(reporter)

    def start_later(self, reporter):
        return self.call_later("startReportingSessionForID", "x", reporter)

    def send(self, message, category=PLAYBACK, event_type=START, reporters=None):
        return self.call("sendMessage", "a{sv}uqaax", variants(message), category, event_type,
                         [] if reporters is None else [reporters])

    def stop(self, reporter):
        return self.call("stopReportingSessionForID", "x", reporter)

    def destroy(self, reporter):
        return self.call("destroyReportingSession", "x", reporter)

    def valid(self, reporter):
        return self.call("reporterIDValid", "x", reporter)

    def reporters(self):
        return self.call("getAllReporters")


class Pending:
    """An answer that may not have arrived. `place` is its position among several answers."""

    _places = itertools.count()

    def __init__(self):
        self.value = None
        self.error = None
        self.done = False
        self.place = None

    def finish(self, connection, result):
        self.place = next(Pending._places)
        try:
            values = connection.call_finish(result).unpack()
            self.value = values[0] if len(values) == 1 else values or None
        except GLib.Error as error:
            self.error = error
        self.done = True

    def wait(self, deadline=DEADLINE):
        iterate_until("a pending answer", lambda: self.done, deadline)
        if self.error:
            raise self.error
        return self.value


def iterate_until(what, condition, deadline=DEADLINE):
    context = GLib.MainContext.default()
    end = time.monotonic() + deadline
    while not condition():
        if time.monotonic() > end:
            raise AssertionError(f"timed out after {deadline:.0f} s waiting for {what}")
        if not context.iteration(False):
            time.sleep(0.002)


def variants(values):
    return {key: to_variant(value) for key, value in values.items()}


def to_variant(value):
    if isinstance(value, GLib.Variant):
        return value
    if isinstance(value, bool):
        return GLib.Variant("b", value)
    if isinstance(value, int):
        return GLib.Variant("x", value)
    if isinstance(value, float):
        return GLib.Variant("d", value)
    if isinstance(value, str):
        return GLib.Variant("s", value)
    if isinstance(value, bytes):
        return GLib.Variant.new_from_bytes(GLib.VariantType("ay"), GLib.Bytes(value), True)
    if isinstance(value, dict):
        return GLib.Variant("a{sv}", variants(value))
    if isinstance(value, (list, tuple)):
        return GLib.Variant("av", [to_variant(item) for item in value])
    raise TypeError(f"no variant for {value!r}")


@contextlib.contextmanager
def private_bus(configuration=None, options=(), environment=None, open_to_all=False):
    """A message bus of our own. Yields its address.

    `configuration` is the text of its configuration file without the address and the rules; by
    default that of a session bus.
    """
    directory = tempfile.mkdtemp(prefix="halvox-bus-")
    source = ["--session", f"--address=unix:path={directory}/bus"]
    if configuration is not None or open_to_all:
        file = Path(directory) / "bus.conf"
        users = '<allow user="*"/>' if open_to_all else ""
        file.write_text(
            f"<busconfig><type>session</type><listen>unix:path={directory}/bus</listen>"
            f"<auth>EXTERNAL</auth>{configuration or ''}<policy context='default'>{users}"
            "<allow send_destination='*' eavesdrop='true'/><allow eavesdrop='true'/>"
            "<allow own='*'/></policy></busconfig>")
        source = [f"--config-file={file}"]
    if open_to_all:
        os.chmod(directory, 0o755)
    process = subprocess.Popen(
        [*WITH_US, "dbus-daemon", *source, "--nofork", "--print-address=1", *options],
        stdout=subprocess.PIPE, stderr=subprocess.DEVNULL, text=True,
        env={**os.environ, **(environment or {})},
    )
    try:
        address = process.stdout.readline().strip()
        if not address:
            raise AssertionError("dbus-daemon gave no address")
        yield address
    finally:
        stop_process(process)
        process.stdout.close()
        shutil.rmtree(directory, ignore_errors=True)


def require(*tools):
    """Skips the test if a program that it needs is not installed."""
    for tool in tools:
        if shutil.which(tool) is None:
            raise unittest.SkipTest(f"{tool} is not installed")
