"""Isolates tests that use LTTng: they run without privileges and cannot see root's tracer.

LTTng has one directory for each user. Root's is the machine's own, and every traced program also
registers with root's daemon. These tests therefore never run as root. Where the system permits it,
they do not see root's daemon either; whether it records or hangs makes no difference then.
"""

import atexit
import contextlib
import ctypes
import grp
import os
import shutil
import stat
import subprocess
import tempfile
import unittest
from pathlib import Path

BIN = Path(os.environ.get("HALVOX_BIN", Path(__file__).parents[2] / "build/dev/bin")).resolve()
# The programs of the build that these tests run, and the files that those need.
PROGRAMS = ("halvox-reportingd", "halvoxctl", "halvox-tracer-keeper", "halvox-kdebug-lttng.so",
            "halvox-tracing-lttng.so",
            "halvox_kdebug_probe", "halvox_trace_client")
NOBODY = 65534
ROOTS_DAEMON = Path("/run/lttng/client-lttng-sessiond")

_CLONE_NEWNS = 0x00020000
_CLONE_NEWUSER = 0x10000000
_MS_REC = 0x4000
_MS_PRIVATE = 1 << 18

_directory = BIN  # contains the programs that are run
_is_entered = False


def program(name):
    """The path of a program of the build that this user may run."""
    return _directory / name


def enter():
    """Gives up the rights of root and hides root's tracer, both for the rest of the process.

    Skips the module if its traces could end up in another user's daemon.
    """
    global _is_entered
    if _is_entered:
        return
    is_root = os.getuid() == 0
    if is_root:
        _share_programs()
    is_hidden = _hide_tracer()
    if is_root:
        try:
            os.setgroups([])
            os.setgid(NOBODY)
            os.setuid(NOBODY)
        except OSError as error:
            raise unittest.SkipTest(f"cannot give up being root: {error}")
    elif not is_hidden and _may_use_roots_daemon() and ROOTS_DAEMON.exists():
        raise unittest.SkipTest("this user is in the group tracing, a tracer of root runs, and it "
                                "cannot be hidden from the tests")
    _is_entered = True


def _is_open_to_others(directory):
    return all(path.stat().st_mode & stat.S_IXOTH for path in (directory, *directory.parents))


def _share_programs():
    """Puts temporary files where other users may read them, and copies programs if necessary."""
    global _directory
    candidates = [Path(tempfile.gettempdir()), Path("/tmp"), Path("/var/tmp")]
    base = next((path for path in candidates if path.is_dir() and _is_open_to_others(path)), None)
    if base is None:
        raise unittest.SkipTest(f"other users can enter none of {', '.join(map(str, candidates))}")
    scratch = Path(tempfile.mkdtemp(prefix="halvox-user-", dir=base))
    os.chown(scratch, NOBODY, NOBODY)
    tempfile.tempdir = str(scratch)
    atexit.register(shutil.rmtree, scratch, ignore_errors=True)
    if _is_open_to_others(BIN):
        return
    # The build may be below a home directory that others cannot enter, such as root's.
    _directory = scratch / "bin"
    _directory.mkdir()
    for name in PROGRAMS:
        if (BIN / name).exists():
            shutil.copy(BIN / name, _directory)
            _copy_libraries(BIN / name)
    for path in (_directory, *_directory.iterdir()):
        path.chmod(0o755)
        os.chown(path, NOBODY, NOBODY)
    os.environ["LD_LIBRARY_PATH"] = str(_directory)
    os.chdir(scratch)


def _copy_libraries(path):
    """Copies the libraries that the program finds in the build."""
    listed = subprocess.run(["ldd", str(path)], capture_output=True, text=True, check=True).stdout
    for line in listed.splitlines():
        _, arrow, found = line.partition(" => ")
        library = Path(found.split(" (")[0])
        if arrow and library.is_absolute() and not _is_open_to_others(library.parent):
            shutil.copy(library, _directory)


def _hide_tracer():
    """Hides the directory of root's daemon from this process and its children, if permitted."""
    uid, gid = os.getuid(), os.getgid()
    libc = ctypes.CDLL(None, use_errno=True)
    if libc.unshare(_CLONE_NEWNS | (_CLONE_NEWUSER if uid != 0 else 0)) != 0:
        return False
    if uid != 0:
        with contextlib.suppress(OSError):
            Path("/proc/self/setgroups").write_text("deny")
            Path("/proc/self/uid_map").write_text(f"{uid} {uid} 1")
            Path("/proc/self/gid_map").write_text(f"{gid} {gid} 1")
    if libc.mount(b"none", b"/", None, _MS_REC | _MS_PRIVATE, None) != 0:
        return False
    # Hide all of /run, because a daemon that starts later makes its directory there.
    return libc.mount(b"tmpfs", b"/run", b"tmpfs", 0, b"mode=755") == 0


def _may_use_roots_daemon():
    with contextlib.suppress(KeyError):
        return grp.getgrnam("tracing").gr_gid in os.getgroups()
    return False
