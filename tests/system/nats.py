"""Real NATS servers of our own on loopback, and the programs that drive and read the link."""

import json
import os
import shutil
import socket
import subprocess
import tempfile
import threading
from pathlib import Path

from harness import BIN, DEADLINE, WITH_US, stop_process, wait_for

DRIVER = BIN / "halvox_link_driver"
READER = BIN / "halvox_stream_reader"


def free_ports(count):
    """Ports of loopback that were free a moment ago."""
    sockets = [socket.socket() for _ in range(count)]
    try:
        for one in sockets:
            one.bind(("127.0.0.1", 0))
        return [one.getsockname()[1] for one in sockets]
    finally:
        for one in sockets:
            one.close()


def accepts(port):
    with socket.socket() as probe:
        probe.settimeout(1)
        return probe.connect_ex(("127.0.0.1", port)) == 0


class Server:
    """One nats-server with JetStream in a directory of its own. Use as a context manager."""

    def __init__(self, extra="", port=None, name="one", scheme="nats"):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-nats-"))
        self.port = port or free_ports(1)[0]
        self.url = f"{scheme}://127.0.0.1:{self.port}"
        self._config = self.directory / "server.conf"
        self._config.write_text(
            f'server_name: {name}\nlisten: "127.0.0.1:{self.port}"\n'
            f'jetstream {{ store_dir: "{self.directory}/store" }}\n{extra}\n')
        self.process = None

    def start(self):
        with open(self.directory / "log", "ab") as log:
            self.process = subprocess.Popen(
                WITH_US + ["nats-server", "-c", str(self._config)],
                stdin=subprocess.DEVNULL, stdout=log, stderr=log)
        wait_for("the server to accept", lambda: self._is_up())
        return self

    def _is_up(self):
        if self.process.poll() is not None:
            raise AssertionError("nats-server ended:\n" + self.log())
        return accepts(self.port)

    def log(self):
        return (self.directory / "log").read_text(errors="replace")

    def kill(self):
        self.process.kill()
        self.process.wait(DEADLINE)

    def stop(self):
        if self.process is not None:
            stop_process(self.process)

    def __enter__(self):
        return self.start()

    def __exit__(self, *_):
        try:
            self.stop()
        finally:
            shutil.rmtree(self.directory, ignore_errors=True)


def cluster():
    """Three servers, not started yet, that form a cluster."""
    ports = free_ports(6)
    routes = ", ".join(f'"nats://127.0.0.1:{port}"' for port in ports[3:])
    return [Server(f'cluster {{ name: halvox, listen: "127.0.0.1:{ports[3 + index]}", routes: [{routes}] }}',
                   port=ports[index], name=f"server{index}") for index in range(3)]


class SilentServer:
    """Accepts connections and says nothing."""

    def __init__(self):
        self._socket = socket.create_server(("127.0.0.1", 0), backlog=4096)
        self.url = f"nats://127.0.0.1:{self._socket.getsockname()[1]}"
        self.accepted = []
        self._thread = threading.Thread(target=self._run, daemon=True)

    def _run(self):
        while True:
            try:
                self.accepted.append(self._socket.accept()[0])
            except OSError:
                return

    def __enter__(self):
        self._thread.start()
        return self

    def __exit__(self, *_):
        self._socket.shutdown(socket.SHUT_RDWR)
        self._socket.close()
        self._thread.join(DEADLINE)
        for connection in self.accepted:
            connection.close()


class Driver:
    """The back-end of the link in a process of its own. Use as a context manager."""

    def __init__(self, *servers, extra=""):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-link-"))
        config = self.directory / "halvox.toml"
        config.write_text(
            f'[storage]\ndirectory = "{self.directory}"\n[link]\nbackend = "nats"\n'
            f"servers = {json.dumps(list(servers))}\n{extra}\n")
        self.process = subprocess.Popen(
            WITH_US + [str(DRIVER)], env={**os.environ, "HALVOX_CONFIG": str(config)},
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True, bufsize=1)
        self.counters = {}
        self.log = []

    def ask_later(self, command):
        self.process.stdin.write(command + "\n")
        self.process.stdin.flush()

    def answer(self):
        line = self.process.stdout.readline()
        if not line:
            raise AssertionError(f"the driver ended with {self.process.wait(DEADLINE)}")
        return line.rstrip("\n")

    def ask(self, command):
        self.ask_later(command)
        return self.answer()

    def start(self, session, batch=True, service="playback_session", count=1):
        return self.ask(f"start {session} {count} {int(batch)} {service}")

    def found(self, session):
        """Whether servers were found, after how many seconds, and their list."""
        kind, milliseconds, *rest = self.ask(f"found {session}").split(" ", 2)
        return kind == "servers", int(milliseconds) / 1000, "".join(rest)

    def send(self, session, count, start=0):
        """How many were taken and refused, and the last error."""
        _, taken, refused, *error = self.ask(f"send {session} {count} {start}").split(" ", 3)
        return int(taken), int(refused), "".join(error)

    def flush(self, session):
        """Seconds that it took."""
        return int(self.ask(f"flush {session}").split()[1]) / 1000

    def threads(self):
        return int(self.ask("threads").split()[1])

    def acknowledged(self):
        """Messages that were confirmed so far, of all sessions."""
        return int(self.ask("acknowledged").split()[1])

    def end(self):
        """Ends it in order; then `counters` and `log` are there."""
        self.ask_later("end")
        while (line := self.answer()) != "ended":
            kind, rest = line.split(" ", 1)
            if kind == "counted":
                value, name = rest.split(" ", 1)
                self.counters[name] = int(value)
            else:
                self.log.append(rest)
        status = self.process.wait(DEADLINE)
        if status != 0:
            raise AssertionError(f"the driver ended with {status}")
        return self.counters

    def flushed(self, subject):
        """What the log says of the flushes of that subject: (acknowledged, not acknowledged)."""
        beginning = f"flushed {subject}: "
        lines = [line[len(beginning):].split() for line in self.log if line.startswith(beginning)]
        return [(int(words[0]), int(words[2])) for words in lines]

    def __enter__(self):
        return self

    def __exit__(self, *_):
        if self.process.poll() is None:
            self.process.kill()
        self.process.wait(DEADLINE)
        self.process.stdin.close()
        self.process.stdout.close()
        shutil.rmtree(self.directory, ignore_errors=True)


def read_stream(url, stream="HALVOX"):
    """What the stream holds, by a plain subscriber."""
    result = subprocess.run(WITH_US + [str(READER), url, stream], capture_output=True, text=True,
                            timeout=120)
    if result.returncode != 0:
        raise AssertionError(result.stderr)
    return [json.loads(line) for line in result.stdout.splitlines()]


def numbers_of(records, subject):
    """The numbers of the messages on that subject, in the order of the stream."""
    return [record["message"]["payload"]["number"] for record in records if record["subject"] == subject]
