#!/usr/bin/python3
"""Checks that protoc reads the issue metrics that this project writes, and the reverse.

The argument is the program built from IssueCodec.cpp. Exit status 77 means that protoc is missing.
"""

import shutil
import subprocess
import sys
import unittest
from pathlib import Path

SKIPPED = 77
HERE = Path(__file__).resolve().parent
CODEC = None

FULL = rb"""
timestamp: 18446744073709551615 duration: -5 issuetype: "g\000\377" node: "mixer" rtaidclient: ""
number: -1 wide: 7 blob: "\020\143"
Extra { duration: 99 Inner { node: "not this one" } narrow: 3 }
narrow: 8
"""


def protoc(mode, data, check=True):
    """Returns what protoc prints for the data; None when it refuses them."""
    arguments = [] if mode == "--decode_raw" else [f"-I{HERE}", "audio_issue.proto"]
    done = subprocess.run(["protoc", mode, *arguments], input=data, capture_output=True)
    if check and done.returncode != 0:
        raise AssertionError(done.stderr.decode())
    return done.stdout if done.returncode == 0 else None


def written(count):
    """Yields messages that IssueCodec wrote: the bytes, and the fields they were made from."""
    output = subprocess.run([CODEC, "write", str(count)], capture_output=True, check=True, text=True)
    for line in output.stdout.splitlines():
        encoded, *fields = line.split("\t")
        yield bytes.fromhex(encoded), fields


def read(messages):
    """Returns what IssueCodec reads from each message: "ok" or "error", then its fields."""
    lines = "".join(message.hex() + "\n" for message in messages)
    output = subprocess.run([CODEC, "read"], input=lines, capture_output=True, check=True, text=True)
    return [line.split("\t") for line in output.stdout.splitlines()]


def varint(number):
    encoded = b""
    while number >= 0x80:
        encoded += bytes([number & 0x7F | 0x80])
        number >>= 7
    return encoded + bytes([number])


def escaped(digits):
    """Returns the bytes in the escaped form of protoc's text format."""
    return "".join(f"\\{byte:03o}" for byte in bytes.fromhex(digits))


def text_of(fields):
    """Returns the fields of a message in protoc's text format."""
    timestamp, duration, *texts = fields
    lines = [] if timestamp == "-" else [f"timestamp: {timestamp}"]
    lines.append(f"duration: {duration}")
    for name, digits in zip(("issuetype", "node", "rtaidclient"), texts):
        lines.append(f'{name}: "{escaped(digits)}"')
    return "issue {\n" + "\n".join(lines) + "\n}\n"


class ProtocTest(unittest.TestCase):
    def test_protoc_encodes_the_fields_to_the_bytes_that_we_write(self):
        messages = list(written(2000))
        self.assertEqual(len(messages), 2000)
        ours = b"".join(b"\x0a" + varint(len(encoded)) + encoded for encoded, _ in messages)
        text = "".join(text_of(fields) for _, fields in messages)

        self.assertEqual(protoc("--encode=halvox.test.Issues", text.encode()), ours)
        # Decoding our bytes and encoding the result gives the same bytes.
        self.assertEqual(
            protoc("--encode=halvox.test.Issues", protoc("--decode=halvox.test.Issues", ours)), ours)

    def test_protoc_reads_what_we_write_field_by_field(self):
        # Use texts that are not valid messages: protoc would show those as messages.
        for encoded, shown in (
                ("10001a0022002a00", '2: 0\n3: ""\n4: ""\n5: ""\n'),
                ("08ac02100c1a06676c6974636822016f2a0167",
                 '1: 300\n2: 12\n3: "glitch"\n4: "o"\n5: "g"\n')):
            raw = bytes.fromhex(encoded)
            self.assertEqual(protoc("--decode_raw", raw).decode(), shown)
            self.assertEqual(read([raw])[0][0], "ok")

    def test_we_read_what_protoc_writes_between_fields_that_we_do_not_know(self):
        encoded = protoc("--encode=halvox.test.ExtendedIssue", FULL)
        self.assertIn(b"\xff" * 9 + b"\x01", encoded)  # a varint of ten bytes

        self.assertEqual(read([encoded]), [
            ["ok", str(2 ** 64 - 1), "-5", b"g\0\xff".hex(), b"mixer".hex(), ""]])

    def test_a_cut_at_any_byte_is_read_or_refused_as_protoc_does(self):
        encoded = protoc("--encode=halvox.test.ExtendedIssue", FULL)
        cuts = [encoded[:length] for length in range(len(encoded) + 1)]
        theirs = [protoc("--decode=halvox.test.ExtendedIssue", cut, check=False) is not None
                  for cut in cuts]

        self.assertEqual([result[0] == "ok" for result in read(cuts)], theirs)
        self.assertIn(True, theirs)
        self.assertIn(False, theirs)


if __name__ == "__main__":
    CODEC = sys.argv.pop(1)
    if shutil.which("protoc") is None:
        print("skipped: protoc is missing (package protobuf-compiler)")
        sys.exit(SKIPPED)
    unittest.main()
