"""Runs a command with the restrictions of a unit of systemd, as far as that needs no systemd.

    python3 sandbox.py [--namespaces WRITABLE [--bind FROM=TO]...] [--drop-in FILE]... UNIT COMMAND...

Always applied: SystemCallFilter=, SystemCallErrorNumber= and no new privileges; systemd itself names the
calls of each group. With --namespaces, which only root can use, also RestrictAddressFamilies=,
MemoryDenyWriteExecute=, PrivateNetwork=, ProtectHome=, ProtectSystem=strict with the one writable
directory, another user and an empty CapabilityBoundingSet=. IPAddressDeny= needs a cgroup of systemd and is
not applied, and neither is what remains."""

import argparse
import ctypes
import errno
import functools
import mmap
import os
import socket
import subprocess
import sys
from pathlib import Path

try:
    import seccomp
except ImportError:
    seccomp = None

UNIT = Path(__file__).parents[2] / "packaging/systemd/halvox-reportingd.service.in"
NOBODY = 65534
HOMES = ("/home", "/root", "/run/user")  # what ProtectHome= is about
NOT_PROTECTED = ("/dev", "/proc", "/sys")  # by ProtectSystem=

CLONE_NEWNS, CLONE_NEWNET = 0x00020000, 0x40000000
MS_RDONLY, MS_BIND, MS_REC, MS_PRIVATE = 1, 1 << 12, 1 << 14, 1 << 18
MOUNT_SETATTR, AT_FDCWD, AT_RECURSIVE, MOUNT_ATTR_RDONLY = 442, -100, 0x8000, 1
PR_CAPBSET_DROP = 24


def missing():
    """Why a sandbox cannot be made on this machine; empty if it can."""
    if seccomp is None:
        return "python3-seccomp is not installed (scripts/setup installs it)"
    return ""


def command_in_sandbox(command, drop_ins=(), writable=None, binds=()):
    """The command line. With a writable directory, the command also gets namespaces and another user."""
    options = [f"--drop-in={path}" for path in drop_ins] + [f"--bind={source}={target}" for source, target in binds]
    if writable is not None:
        options.append(f"--namespaces={writable}")
    return [sys.executable, str(Path(__file__).resolve()), *options, str(UNIT), *command]


def settings(units, key):
    """The values of a list in a unit and its drop-ins. An empty value removes those before it."""
    values = []
    for unit in units:
        for line in Path(unit).read_text(encoding="utf-8").splitlines():
            if line.startswith(f"{key}="):
                value = line.split("=", 1)[1]
                values = [*values, value] if value else []
    return values


def setting(units, key, default=""):
    return (settings(units, key) or [default])[-1]


@functools.cache
def groups():
    """What each group of system calls consists of: calls and other groups."""
    printed = subprocess.run(["systemd-analyze", "--no-pager", "syscall-filter"], check=True,
                             capture_output=True, text=True).stdout
    found = {}
    for line in printed.splitlines():
        if line.startswith("@"):
            words = found.setdefault(line.strip(), [])
        elif line.startswith(" ") and not line.strip().startswith("#"):
            words.append(line.strip())
        elif not line.startswith(" "):
            words = []  # of what follows the groups, such as calls without a group
    return found


def calls_of(name):
    """The calls of a group such as @system-service, those of its groups included."""
    if not name.startswith("@"):
        return {name}
    return set().union(*(calls_of(word) for word in groups()[name]))


def allowed_calls(units):
    allowed = set()
    for value in settings(units, "SystemCallFilter"):
        calls = set().union(*(calls_of(word) for word in value.removeprefix("~").split()))
        allowed = allowed - calls if value.startswith("~") else allowed | calls
    # systemd itself needs them to start the program, and always allows them.
    return allowed | calls_of("@default") | {"execve"}


def filter_calls(units):
    number = getattr(errno, setting(units, "SystemCallErrorNumber"))
    rules = seccomp.SyscallFilter(seccomp.ERRNO(number))
    for name in sorted(allowed_calls(units)):
        try:
            rules.add_rule(seccomp.ALLOW, name)
        except (RuntimeError, ValueError):
            pass  # a call that this architecture or library does not have
    rules.load()


def filter_arguments(units):
    """The settings that refuse calls by their arguments."""
    rules = seccomp.SyscallFilter(seccomp.ALLOW)
    if families := settings(units, "RestrictAddressFamilies"):
        allowed = {getattr(socket, name) for name in " ".join(families).split()}
        for family in range(1, 46):  # all that Linux has
            if family not in allowed:
                rules.add_rule(seccomp.ERRNO(errno.EAFNOSUPPORT), "socket", seccomp.Arg(0, seccomp.EQ, family))
    if setting(units, "MemoryDenyWriteExecute") == "yes":
        both = mmap.PROT_WRITE | mmap.PROT_EXEC
        rules.add_rule(seccomp.ERRNO(errno.EPERM), "mmap", seccomp.Arg(2, seccomp.MASKED_EQ, both, both))
        rules.add_rule(seccomp.ERRNO(errno.EPERM), "mprotect",
                       seccomp.Arg(2, seccomp.MASKED_EQ, mmap.PROT_EXEC, mmap.PROT_EXEC))
    rules.load()


class Namespaces:
    """Hides and protects files, and the network. Needs root's rights."""

    def __init__(self):
        self._libc = ctypes.CDLL(None, use_errno=True)

    def _check(self, what, result):
        if result != 0:
            raise OSError(ctypes.get_errno(), f"{what}: {os.strerror(ctypes.get_errno())}")

    def _mount(self, source, target, kind, flags, data=None):
        arguments = (word.encode() if word is not None else None for word in (source, target, kind))
        self._check(f"mount {target}", self._libc.mount(*arguments, flags, data))

    def _set_read_only(self, path, is_read_only):
        attributes = (ctypes.c_uint64 * 4)(*((MOUNT_ATTR_RDONLY, 0) if is_read_only else (0, MOUNT_ATTR_RDONLY)), 0, 0)
        self._check(f"mount_setattr {path}",
                    self._libc.syscall(MOUNT_SETATTR, AT_FDCWD, path.encode(), AT_RECURSIVE, ctypes.byref(attributes),
                                       ctypes.sizeof(attributes)))

    def enter(self, units, writable, binds):
        is_private = setting(units, "PrivateNetwork") == "yes"
        self._check("unshare", self._libc.unshare(CLONE_NEWNS | (CLONE_NEWNET if is_private else 0)))
        self._mount("none", "/", None, MS_REC | MS_PRIVATE)
        if binds:
            # Directories such as /run/user/1000 are made in a /run of this namespace's own.
            self._mount("tmpfs", "/run", "tmpfs", 0)
        for source, target in binds:
            os.makedirs(target)
            self._mount(source, target, None, MS_BIND)
        if setting(units, "ProtectSystem") == "strict":
            self._protect(writable)
        if setting(units, "ProtectHome") == "yes":
            for home in HOMES:
                # A build in somebody's home directory must stay visible to its tests.
                if os.path.isdir(home) and not str(Path(__file__).resolve()).startswith(f"{home}/"):
                    self._mount("tmpfs", home, "tmpfs", MS_RDONLY, b"mode=000")
        self._check("prctl", self._drop_capabilities())
        os.setgroups([])
        os.setresgid(NOBODY, NOBODY, NOBODY)
        os.setresuid(NOBODY, NOBODY, NOBODY)

    def _protect(self, writable):
        kept = [writable, *NOT_PROTECTED]
        for path in kept:
            self._mount(path, path, None, MS_BIND | MS_REC)
        self._set_read_only("/", True)
        for path in kept:
            self._set_read_only(path, False)

    def _drop_capabilities(self):
        for number in range(64):
            if self._libc.prctl(PR_CAPBSET_DROP, number, 0, 0, 0) != 0:
                return 0 if ctypes.get_errno() == errno.EINVAL else 1  # behind the last capability
        return 0


def enter(unit):
    """Applies the filter of system calls to this process and its children."""
    filter_calls([unit])


def main():
    parser = argparse.ArgumentParser()
    parser.add_argument("--drop-in", action="append", default=[])
    parser.add_argument("--namespaces", metavar="WRITABLE")
    parser.add_argument("--bind", action="append", default=[], metavar="FROM=TO")
    parser.add_argument("unit")
    parser.add_argument("command", nargs=argparse.REMAINDER)
    arguments = parser.parse_args()

    units = [arguments.unit, *arguments.drop_in]
    if arguments.namespaces is not None:
        Namespaces().enter(units, arguments.namespaces, [bind.split("=", 1) for bind in arguments.bind])
        filter_arguments(units)
    filter_calls(units)
    os.execv(arguments.command[0], arguments.command)


if __name__ == "__main__":
    main()
