"""Runs a command with the system calls that a unit of systemd allows, as systemd would.

    python3 sandbox.py UNIT COMMAND [ARGUMENT...]

Only SystemCallFilter= and SystemCallErrorNumber= are applied, and no new privileges. systemd itself
names the calls of each group."""

import errno
import os
import subprocess
import sys
from pathlib import Path

try:
    import seccomp
except ImportError:
    seccomp = None

UNIT = Path(__file__).parents[2] / "packaging/systemd/halvox-reportingd.service.in"


def missing():
    """Why a sandbox cannot be made on this machine; empty if it can."""
    if seccomp is None:
        return "python3-seccomp is not installed (scripts/setup installs it)"
    return ""


def command_in_sandbox(command):
    return [sys.executable, str(Path(__file__).resolve()), str(UNIT), *command]


def settings(unit, key):
    lines = Path(unit).read_text(encoding="utf-8").splitlines()
    return [line.split("=", 1)[1] for line in lines if line.startswith(f"{key}=")]


def calls_of(name):
    """The calls of a group such as @system-service, those of its groups included."""
    if not name.startswith("@"):
        return {name}
    printed = subprocess.run(["systemd-analyze", "--no-pager", "syscall-filter", name], check=True,
                             capture_output=True, text=True).stdout
    words = [line.strip() for line in printed.splitlines() if line.startswith(" ")]
    return set().union(*(calls_of(word) for word in words if not word.startswith("#")))


def allowed_calls(unit):
    allowed = set()
    for value in settings(unit, "SystemCallFilter"):
        calls = set().union(*(calls_of(word) for word in value.removeprefix("~").split()))
        allowed = allowed - calls if value.startswith("~") else allowed | calls
    # systemd itself needs them to start the program, and always allows them.
    return allowed | calls_of("@default") | {"execve"}


def enter(unit):
    """Restricts this process and its children."""
    number = getattr(errno, settings(unit, "SystemCallErrorNumber")[0])
    rules = seccomp.SyscallFilter(seccomp.ERRNO(number))
    for name in sorted(allowed_calls(unit)):
        try:
            rules.add_rule(seccomp.ALLOW, name)
        except (RuntimeError, ValueError):
            pass  # a call that this architecture or library does not have
    rules.load()


if __name__ == "__main__":
    enter(sys.argv[1])
    os.execv(sys.argv[2], sys.argv[2:])
