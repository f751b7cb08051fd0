#!/usr/bin/python3
"""Lets GLib's D-Bus implementation read the frames that the given program prints.

Exit status 77 means that the GLib bindings (package python3-gi) are missing.
"""

import subprocess
import sys

SKIPPED = 77

try:
    from gi.repository import Gio, GLib
except ImportError as missing:
    print(f"skipped: {missing} (package python3-gi)")
    sys.exit(SKIPPED)


def check(line):
    """The problem with one line, or None."""
    frame, expected = line.split("\t")
    blob = bytes.fromhex(frame)
    if Gio.DBusMessage.bytes_needed(blob[:16]) != len(blob):
        return "the size in the header is wrong"
    try:
        message = Gio.DBusMessage.new_from_blob(blob, Gio.DBusCapabilityFlags.NONE)
    except GLib.Error as error:
        return error.message
    body = message.get_body()
    if expected == "-":
        return None if body is None else f"has a body: {body.print_(True)}"
    if body is None:
        return "has no body"
    wanted = GLib.Variant.parse(body.get_type(), expected, None, None)
    if not body.equal(wanted):
        return f"has {body.print_(True)}"
    return None


def main():
    printed = subprocess.run([sys.argv[1]], check=True, stdout=subprocess.PIPE, timeout=60)
    lines = printed.stdout.decode().splitlines()
    problems = [(line, problem) for line in lines if (problem := check(line))]
    for line, problem in problems:
        print(f"{line}: {problem}")
    print(f"{len(lines)} frames read, {len(problems)} wrong")
    return 1 if problems or not lines else 0


sys.exit(main())
