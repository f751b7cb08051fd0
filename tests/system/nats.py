"""Real NATS servers of our own on loopback, and the programs that use and read the link."""

import base64
import binascii
import itertools
import json
import os
import shutil
import signal
import socket
import subprocess
import tempfile
import threading
import time
from pathlib import Path

from harness import BIN, DEADLINE, WITH_US, Startable, stop_process, wait_for

DRIVER = BIN / "halvox_link_driver"
READER = BIN / "halvox_stream_reader"
LONG_DEADLINE = 2 * DEADLINE  # for an operation that takes seconds on an idle machine


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


class Server(Startable):
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

    def pause(self):
        """From now on the server answers nothing, until it is killed or resumed."""
        self.process.send_signal(signal.SIGSTOP)

    def resume(self):
        self.process.send_signal(signal.SIGCONT)

    def kill(self):
        self.process.kill()
        self.process.wait(DEADLINE)

    def lose_files(self):
        """Deletes the streams; the server must not be running."""
        shutil.rmtree(self.directory / "store")

    def stop(self):
        if self.process is not None:
            stop_process(self.process)


class NatsKey:
    """A key pair of Ed25519 in the text forms that NATS uses. Needs openssl."""

    KINDS = {"operator": 14 << 3, "account": 0, "user": 20 << 3}
    SEED = 18 << 3

    def __init__(self, kind, directory):
        self._kind = self.KINDS[kind]
        self._path = Path(directory) / f"{kind}-{next(_numbers)}.der"
        self._openssl("genpkey", "-algorithm", "ed25519", "-outform", "DER", "-out", self._path)
        public = self._openssl("pkey", "-inform", "DER", "-in", self._path, "-pubout", "-outform", "DER")
        # Both forms end with the 32 bytes of the key.
        self.public = self._text(bytes([self._kind]) + public[-32:])
        self.seed = self._text(bytes([self.SEED | self._kind >> 5, (self._kind & 31) << 3])
                               + self._path.read_bytes()[-32:])

    def token(self, subject, name, claims):
        """A signed JWT in which this key states the claims about another key, given by its public
        text."""
        now = int(time.time())
        said = {"jti": name, "iat": now, "iss": self.public, "name": name, "sub": subject,
                "nats": {"version": 2, **claims}}
        text = ".".join(self._base64(json.dumps(part).encode())
                        for part in ({"typ": "JWT", "alg": "ed25519-nkey"}, said))
        message = self._path.with_suffix(".text")
        message.write_text(text)
        signature = self._openssl("pkeyutl", "-sign", "-keyform", "DER", "-inkey", self._path, "-rawin",
                                  "-in", message)
        return f"{text}.{self._base64(signature)}"

    @staticmethod
    def _openssl(*arguments):
        return subprocess.run(["openssl", *arguments], check=True, capture_output=True).stdout

    @staticmethod
    def _text(content):
        checked = content + binascii.crc_hqx(content, 0).to_bytes(2, "little")
        return base64.b32encode(checked).decode().rstrip("=")

    @staticmethod
    def _base64(content):
        return base64.urlsafe_b64encode(content).decode().rstrip("=")


_numbers = itertools.count()


class Operator:
    """What a server trusts: an account that may use JetStream, and the users that it admits."""

    UNLIMITED = dict.fromkeys(("subs", "data", "payload"), -1)
    ACCOUNT = {**UNLIMITED, **dict.fromkeys(("imports", "exports", "conn", "leaf", "mem_storage", "disk_storage",
                                             "streams", "consumer"), -1), "wildcards": True}

    def __init__(self, directory):
        self._directory = Path(directory)
        operator, system = NatsKey("operator", directory), NatsKey("account", directory)
        self._account = NatsKey("account", directory)
        accounts = {
            system.public: operator.token(system.public, "system",
                                          {"type": "account", "limits": {**self.ACCOUNT, "mem_storage": 0,
                                                                         "disk_storage": 0}}),
            self._account.public: operator.token(self._account.public, "audio",
                                                 {"type": "account", "limits": self.ACCOUNT})}
        preload = ", ".join(f'{public}: "{token}"' for public, token in accounts.items())
        self_signed = operator.token(operator.public, "operator", {"type": "operator"})
        self.config = (f'operator: "{self_signed}"\nsystem_account: {system.public}\n'
                       f"resolver: MEMORY\nresolver_preload: {{ {preload} }}")

    def credentials(self, name):
        """A credentials file of a new user."""
        user = NatsKey("user", self._directory)
        token = self._account.token(user.public, name, {"type": "user", "pub": {}, "sub": {}, **self.UNLIMITED})
        path = self._directory / f"{name}.creds"
        path.write_text(f"-----BEGIN NATS USER JWT-----\n{token}\n------END NATS USER JWT------\n\n"
                        f"-----BEGIN USER NKEY SEED-----\n{user.seed}\n------END USER NKEY SEED------\n")
        return path


def cluster():
    """Three servers, not started yet, that form a cluster."""
    ports = free_ports(6)
    routes = ", ".join(f'"nats://127.0.0.1:{port}"' for port in ports[3:])
    return [Server(f'cluster {{ name: halvox, listen: "127.0.0.1:{ports[3 + index]}", routes: [{routes}] }}',
                   port=ports[index], name=f"server{index}") for index in range(3)]


# The first bytes of a server that wants the TLS handshake next.
TLS_GREETING = (b'INFO {"server_id":"silent","version":"2.9.10","proto":1,"headers":true,'
                b'"max_payload":1048576,"tls_required":true}\r\n')


class SilentServer:
    """Accepts connections, sends a greeting if there is one, and nothing more."""

    def __init__(self, greeting=b"", port=0):
        self._socket = socket.create_server(("127.0.0.1", port), backlog=4096)
        self.url = f"nats://127.0.0.1:{self._socket.getsockname()[1]}"
        self.accepted = []
        self._greeting = greeting
        self._thread = threading.Thread(target=self._run, daemon=True)

    def _run(self):
        while True:
            try:
                connection = self._socket.accept()[0]
            except OSError:
                return
            connection.sendall(self._greeting)
            self.accepted.append(connection)

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
        """The numbers of messages that were accepted and refused, and the last error."""
        _, taken, refused, *error = self.ask(f"send {session} {count} {start}").split(" ", 3)
        return int(taken), int(refused), "".join(error)

    def flush(self, session):
        """The seconds that it took."""
        return int(self.ask(f"flush {session}").split()[1]) / 1000

    def threads(self):
        return int(self.ask("threads").split()[1])

    def acknowledged(self):
        """The number of messages that have been confirmed so far, of all sessions."""
        return int(self.ask("acknowledged").split()[1])

    def wait_until_acknowledged(self, count):
        """Waits until that many messages of all sessions have been confirmed, so that no flush is a
        race."""
        wait_for(f"{count} acknowledgements", lambda: self.acknowledged() >= count, LONG_DEADLINE, pause=0.1)

    def end(self):
        """Ends it in an orderly way. Afterwards `counters` and `log` are set."""
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
        """The flushes of that subject in the log, as (acknowledged, not acknowledged)."""
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
    """The content of the stream, read by a plain subscriber."""
    result = subprocess.run(WITH_US + [str(READER), url, stream], capture_output=True, text=True,
                            timeout=120)
    if result.returncode != 0:
        raise AssertionError(result.stderr)
    return [json.loads(line) for line in result.stdout.splitlines()]


def try_read_stream(url):
    """The same, or nothing while the stream does not exist or has no leader."""
    try:
        return read_stream(url)
    except AssertionError:
        return []


def numbers_of(records, subject):
    """The numbers of the messages on that subject, in the order of the stream."""
    return [record["message"]["payload"]["number"] for record in records if record["subject"] == subject]
