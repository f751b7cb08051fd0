"""Bad input gets a clear error or a closed connection, and no other client notices."""

import os
import shutil
import socket
import struct
import unittest

from gi.repository import Gio, GLib

import harness
from harness import BUS_NAME, INTERFACE, OBJECT, Client, Service, wait_for

INVALID_ARGS = "org.freedesktop.DBus.Error.InvalidArgs"
AUTHENTICATION = b"\0AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n"


class Hostile(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.service = Service(
            "[limits]\nclient_sessions = 50\nclient_history_megabytes = 4\n").start()
        cls.addClassCleanup(shutil.rmtree, cls.service.directory, True)
        cls.addClassCleanup(cls.service.stop)

    def setUp(self):
        self.bystander = self.client()
        self.bystander.create(1000)
        self.pending = self.bystander.start_later(1000)
        self.log_before = len(self.service.log())

    def tearDown(self):
        """Checks that the well-behaved client noticed nothing."""
        self.assertIs(self.bystander.send({"calm": 1}, reporters=[1000]), None)
        self.assertFalse(self.pending.done)
        self.assertIs(self.bystander.stop(1000), True)
        self.assertIs(self.pending.wait(), True)
        self.assertIsNone(self.service.process.poll())

    def client(self):
        client = Client.to_socket(self.service.address)
        self.addCleanup(client.close)
        return client

    def new_log(self):
        return self.service.log()[self.log_before:]

    def assert_error(self, name, *texts):
        return AssertError(self, name, texts)

    def raw(self, *, authenticated=True):
        raw = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        raw.settimeout(harness.DEADLINE)
        raw.connect(str(self.service.socket))
        self.addCleanup(raw.close)
        if authenticated:
            raw.sendall(AUTHENTICATION)
            answer = b""
            while not answer.count(b"\r\n") >= 2:
                answer += raw.recv(4096)
            self.assertIn(b"OK ", answer)
        return raw

    def assert_closed(self, raw):
        with raw:
            try:
                while raw.recv(65536):
                    pass
            except ConnectionResetError:
                pass

    # --- requests with a mistake that can be answered
    # -----------------------------------------------

    def test_unknown_member_interface_and_object(self):
        client = self.client()
        with self.assert_error("org.freedesktop.DBus.Error.UnknownMethod", "makeCoffee"):
            client.call("makeCoffee")
        with self.assert_error("org.freedesktop.DBus.Error.UnknownInterface", "com.example.Other"):
            client.call("getAllReporters", interface="com.example.Other")
        with self.assert_error("org.freedesktop.DBus.Error.UnknownObject", "/com/example/other"):
            client.call("getAllReporters", path="/com/example/other")

    def test_wrong_signature_names_both(self):
        with self.assert_error(INVALID_ARGS, "createReportingSession", "s", "x"):
            self.client().call("createReportingSession", "s", "seven")

    def test_wrong_types_inside_the_dictionary_name_key_and_signature(self):
        for value, signature in (
            (GLib.Variant("(sx)", ("a", 1)), "(sx)"),
            (GLib.Variant("a{xs}", {1: "a"}), "a{xs}"),
            (GLib.Variant("h", 0), "h"),
        ):
            with self.subTest(signature=signature):
                with self.assert_error(INVALID_ARGS, "culprit", signature):
                    self.client().send({"fine": signature, "culprit": value}, reporters=[1000])
                # What the refused message could have caused would be stored before this fence.
                self.bystander.send({"fence": signature}, reporters=[1000])
                self.service.wait_for_payload(lambda payload: payload.get("fence") == signature)
                taken = [payload for _, payload in self.service.events()
                         if payload.get("fine") == signature]
                self.assertEqual(taken, [])

    def test_more_reporters_than_the_limit_are_refused_with_its_name(self):
        with self.assert_error("org.freedesktop.DBus.Error.LimitsExceeded",
                               "message_reporter_ids = 10000", "10001"):
            self.client().send({"a": 1}, reporters=[7] * 10_001)

    def test_more_than_one_list_of_reporters(self):
        with self.assert_error(INVALID_ARGS, "sendMessage"):
            self.client().call("sendMessage", "a{sv}uqaax", {}, 4, 1, [[1], [2]])

    def test_numbers_that_json_cannot_hold_are_kept(self):
        self.client().send({"nan": float("nan"), "up": float("inf"), "down": float("-inf")},
                           reporters=[1000])
        payload = self.service.wait_for_payload(lambda payload: "nan" in payload)
        self.assertEqual((payload["nan"], payload["up"], payload["down"]),
                         ("NaN", "Infinity", "-Infinity"))

    def test_nesting_to_the_limit_is_taken_and_past_it_refused(self):
        def nested(levels):
            value = GLib.Variant("x", 1)
            for _ in range(levels):
                value = GLib.Variant("v", value)
            return value

        client = self.client()
        self.assertIsNone(client.send({"deep": nested(40)}, reporters=[1000]))
        raw = self.raw()
        raw.sendall(frame(body_with_nested_variants(200)))
        reply = receive_frame(raw)
        self.assertIn(INVALID_ARGS.encode(), reply)
        self.assertIn(b"deep", reply)

    def test_bounds_of_a_client_are_named_and_lifted_again(self):
        client = self.client()
        for reporter in range(1, 51):
            client.create(reporter)
        with self.assert_error("org.freedesktop.DBus.Error.LimitsExceeded", "client_sessions", "50"):
            client.create(51)
        client.destroy(50)
        self.assertIs(client.create(51), True)

    def test_no_history_is_so_long_that_a_message_is_refused(self):
        client = self.client()
        client.create(60)
        client.start_later(60)
        for number in range(200):
            client.send({"number": number, "bulk": "x" * 100_000}, reporters=[60])
        client.stop(60)
        summary = wait_for("the summary of the session", lambda: next(
            (payload for _, _, payload in self.service.link_messages(60)
             if "HV_Session_Summary_Event" in payload), None))
        self.assertEqual(summary["number"], ",".join(str(number) for number in range(200)))

    def test_memory_bound_is_named_and_lifted_by_destroying_what_holds_it(self):
        client = self.client()
        client.create(60)
        with self.assert_error("org.freedesktop.DBus.Error.LimitsExceeded",
                               "client_history_megabytes", "4"):
            for number in range(100):
                client.configure({f"key{number}": "x" * 100_000}, 60)
        client.destroy(60)
        self.assertIs(client.create(61), True)

    # --- bytes that are not D-Bus
    # ------------------------------------------------------------------

    def test_garbage_instead_of_a_handshake(self):
        raw = self.raw(authenticated=False)
        raw.sendall(b"GET / HTTP/1.1\r\nHost: halvox\r\n\r\n" * 20)
        self.assert_closed(raw)

    def test_endless_handshake_line(self):
        raw = self.raw(authenticated=False)
        with self.assertRaises(OSError):
            raw.sendall(b"\0AUTH " + b"A" * 1_000_000)
            self.assert_closed(raw)
            raise ConnectionResetError  # closing the connection quietly is also correct

    def test_garbage_instead_of_a_message(self):
        raw = self.raw()
        raw.sendall(os.urandom(64).replace(b"l", b"x") * 100)
        self.assert_closed(raw)
        wait_for("a line in the log", lambda: f"pid={os.getpid()}" in self.new_log() or
                 str(os.getpid()) in self.new_log())

    def test_invalid_utf8(self):
        raw = self.raw()
        raw.sendall(frame(dictionary_body(b"key", b"\xff\xfe\xfd")))
        self.assert_closed_or_refused(raw)

    def test_text_with_a_nul(self):
        raw = self.raw()
        raw.sendall(frame(dictionary_body(b"key", b"a\0b")))
        self.assert_closed_or_refused(raw)

    def test_lengths_that_point_outside(self):
        for length in (0xFFFFFFFF, 0x7FFFFFFF, 64 << 20, 17):
            with self.subTest(length=length):
                body = bytearray(dictionary_body(b"key", b"value"))
                body[0:4] = struct.pack("<I", length)
                raw = self.raw()
                raw.sendall(frame(bytes(body)))
                self.assert_closed_or_refused(raw)

    def test_message_of_64_mebibytes(self):
        client = self.client()
        memory = self.service.memory_kib()
        try:
            client.send({"bulk": b"x" * (64 << 20)}, reporters=[1000])
            self.fail("a message of 64 MiB was taken")
        except GLib.Error:
            pass
        self.assertLess(self.service.memory_kib(), memory + 128 * 1024)

    def test_announced_size_alone_takes_no_memory(self):
        memory = self.service.memory_kib()
        for _ in range(50):
            raw = self.raw()
            raw.sendall(frame_header(100 << 20))
        self.bystander.valid(1000)
        self.assertLess(self.service.memory_kib(), memory + 50 * 1024)

    def assert_closed_or_refused(self, raw):
        try:
            reply = receive_frame(raw)
        except (ConnectionResetError, EOFError):
            return
        self.assertIn(b"org.freedesktop.DBus.Error.", reply)

    def test_errors_are_logged_once_and_not_per_request(self):
        client = self.client()
        for _ in range(200):
            with self.assert_error("org.freedesktop.DBus.Error.UnknownMethod"):
                client.call("makeCoffee")
        self.assertEqual(self.new_log().count("makeCoffee"), 1)


class Stalling(unittest.TestCase):
    """Connections that stop half-way are closed in time, and that is logged."""

    def setUp(self):
        self.service = Service()
        # Shorter than the default, so that the test need not wait.
        text = self.service.config.read_text().replace(
            "[listener]\n", "[listener]\nhandshake_seconds = 1\nmessage_seconds = 1\n")
        self.service.config.write_text(text)
        self.service.start()
        self.addCleanup(shutil.rmtree, self.service.directory, True)
        self.addCleanup(self.service.stop)

    def stalled(self, data):
        raw = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        raw.settimeout(harness.DEADLINE)
        raw.connect(str(self.service.socket))
        self.addCleanup(raw.close)
        raw.sendall(data)
        return raw

    def test_each_kind_of_stall_ends_in_a_closed_connection_and_one_line(self):
        whole = frame(dictionary_body(b"key", b"value"))
        for name, data in (("nothing", b""), ("nul", b"\0"), ("half a line", b"\0AUTH EXT"),
                           ("no begin", b"\0AUTH EXTERNAL\r\nDATA\r\n"),
                           ("half a header", AUTHENTICATION + whole[:10]),
                           ("half a body", AUTHENTICATION + whole[:-3])):
            with self.subTest(name):
                before = len(self.service.log())
                raw = self.stalled(data)
                while raw.recv(4096):
                    pass
                # The last line about a client. The log is written later than the answers are sent.
                wait_for("the client's end in the log",
                         lambda: "dealloc" in self.service.log()[before:])
                closing = [line for line in self.service.log()[before:].splitlines()
                           if "closing client" in line and "waited 1000 ms" in line]
                self.assertEqual(len(closing), 1, self.service.log()[before:])

    def test_whole_messages_keep_a_slow_connection_open(self):
        client = Client.to_socket(self.service.address)
        self.addCleanup(client.close)
        stalled = self.stalled(b"\0AUTH")
        while stalled.recv(4096):
            pass
        # This connection is as old as the other, but it has sent everything that it must.
        self.assertEqual(client.reporters(), [])


@unittest.skipIf("undefined" in os.environ.get("HALVOX_SANITIZE", ""),
                 "UndefinedBehaviorSanitizer opens descriptors itself to check a type")
class Descriptors(unittest.TestCase):
    def test_service_without_free_descriptors_waits_and_serves_on(self):
        service = Service(command=["/bin/sh", "-c", f"ulimit -n 64; exec {harness.SERVICE}"])
        service.start()
        self.addCleanup(shutil.rmtree, service.directory, True)
        self.addCleanup(service.stop)
        first = Client.to_socket(service.address)
        self.addCleanup(first.close)

        held = []
        for _ in range(100):
            raw = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
            raw.connect(str(service.socket))
            held.append(raw)
        self.assertEqual(first.reporters(), [])
        used_before = cpu_ticks(service.process.pid)
        self.assertEqual(first.reporters(), [])
        self.assertLess(cpu_ticks(service.process.pid) - used_before, 20, "the service spins")
        for raw in held:
            raw.close()

        late = Client.to_socket(service.address)
        self.addCleanup(late.close)
        self.assertEqual(late.reporters(), [])


def cpu_ticks(pid):
    with open(f"/proc/{pid}/stat", encoding="ascii") as stat:
        fields = stat.read().rsplit(")", 1)[1].split()
    return int(fields[11]) + int(fields[12])


class AssertError:
    """Expects a D-Bus error of that name. Its message contains the texts."""

    def __init__(self, test, name, texts):
        self.test, self.name, self.texts = test, name, texts

    def __enter__(self):
        return self

    def __exit__(self, kind, error, _):
        if kind is None or not issubclass(kind, GLib.Error):
            self.test.assertIsNone(kind, error)
            self.test.fail(f"expected {self.name}")
        self.test.assertEqual(Gio.dbus_error_get_remote_error(error), self.name)
        for text in self.texts:
            self.test.assertIn(text, error.message)
        return True


# --- frames made by hand
# ---------------------------------------------------------------------------


def pad(data, alignment):
    return data + b"\0" * (-len(data) % alignment)


def header_field(code, signature, value):
    out = bytes([code]) + bytes([len(signature)]) + signature + b"\0"
    if signature == b"g":
        return out + bytes([len(value)]) + value + b"\0"
    return pad(out, 4) + struct.pack("<I", len(value)) + value + b"\0"


def frame_header(body_length, signature=b"a{sv}uqaax"):
    fields = b""
    for code, kind, value in ((1, b"o", OBJECT.encode()), (2, b"s", INTERFACE.encode()),
                              (3, b"s", b"sendMessage"), (6, b"s", BUS_NAME.encode()),
                              (8, b"g", signature)):
        fields = pad(fields, 8) + header_field(code, kind, value)
    return pad(b"l" + bytes([1, 0, 1]) + struct.pack("<III", body_length, 77, len(fields)) + fields, 8)


def frame(body):
    return frame_header(len(body)) + body


def message_body(entries):
    body = struct.pack("<I", len(entries)) + b"\0" * 4 + entries
    body = pad(body, 4) + struct.pack("<I", 4)       # category
    body = body + struct.pack("<H", 1)               # type
    return pad(body, 4) + struct.pack("<I", 0)       # no list of reporter IDs


def dictionary_body(key, text):
    entry = struct.pack("<I", len(key)) + key + b"\0" + b"\x01s\0"
    entry = pad(entry, 4) + struct.pack("<I", len(text)) + text + b"\0"
    return message_body(entry)


def body_with_nested_variants(levels):
    entry = struct.pack("<I", 4) + b"deep\0" + b"\x01v\0" * levels + b"\x01y\0" + b"\x07"
    return message_body(entry)


def receive_frame(raw):
    def exactly(count):
        data = b""
        while len(data) < count:
            more = raw.recv(count - len(data))
            if not more:
                raise EOFError
            data += more
        return data

    head = exactly(16)
    body_length, _, fields_length = struct.unpack("<III", head[4:16])
    return head + exactly(fields_length + (-fields_length % 8) + body_length)


if __name__ == "__main__":
    unittest.main()
