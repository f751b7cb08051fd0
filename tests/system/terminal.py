"""halvoxctl at a terminal."""

import fcntl
import os
import pty
import select
import struct
import subprocess
import termios
import time

from harness import CTL, DEADLINE, WITH_US


def at_terminal(service, *arguments, columns=100, status=0, **environment):
    """What a terminal of that width gets, and standard error."""
    master, slave = pty.openpty()
    fcntl.ioctl(slave, termios.TIOCSWINSZ, struct.pack("HHHH", 24, columns, 0, 0))
    # Lines as the program wrote them.
    attributes = termios.tcgetattr(slave)
    attributes[1] &= ~termios.OPOST
    termios.tcsetattr(slave, termios.TCSANOW, attributes)
    variables = service.ctl_environment(TERM="xterm", **environment)
    for name in ("NO_COLOR", "HALVOX_PAGER", "PAGER", "LESS", "LESSCHARSET"):
        if name not in environment:
            variables.pop(name, None)
    process = subprocess.Popen(
        [*WITH_US, str(CTL), *arguments], stdin=slave, stdout=slave, stderr=subprocess.PIPE,
        env=variables, start_new_session=True,
        preexec_fn=lambda: fcntl.ioctl(0, termios.TIOCSCTTY, 0))
    os.close(slave)
    output = b""
    end = time.monotonic() + DEADLINE
    while True:
        readable, _, _ = select.select([master], [], [], max(0, end - time.monotonic()))
        if not readable:
            process.kill()
            raise AssertionError(f"the output did not end: {output!r}")
        try:
            data = os.read(master, 65536)
        except OSError:  # no process has the terminal open any more
            break
        if not data:
            break
        output += data
    os.close(master)
    errors = process.stderr.read().decode()
    process.stderr.close()
    if process.wait(DEADLINE) != status:
        raise AssertionError(f"halvoxctl ended with {process.returncode} instead of {status}: {errors}")
    return output.decode(), errors


def lines_at_terminal(service, *arguments, **more):
    """The lines that a terminal gets from a command that reports no error."""
    output, errors = at_terminal(service, *arguments, **more)
    if errors:
        raise AssertionError(errors)
    return output.splitlines()
