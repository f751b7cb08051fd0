"""What a command used, measured by a process that is small itself.

The kernel counts the memory of the process that starts a command as memory of the command, until its
program begins to run: `true` started by a Python program of 60 MiB has a peak of 60 MiB. A Python
without modules has 7 MiB."""

import json
import subprocess
import sys

_RUN = """
import os, sys
from time import monotonic
begin = monotonic()
child = os.fork()
if child == 0:
    os.execvp(sys.argv[1], sys.argv[1:])
_, status, usage = os.wait4(child, 0)
used = [monotonic() - begin, usage.ru_utime + usage.ru_stime, usage.ru_maxrss / 1024]
os.write(2, f"\\n[{os.waitstatus_to_exitcode(status)}, {used[0]}, {used[1]}, {used[2]}]".encode())
"""


def run(command, environment=None):
    """Runs a command that writes to its standard output, which is ignored. Returns its status, the
    seconds by the clock and of the processor, and the most MiB that were resident."""
    result = subprocess.run([sys.executable, "-I", "-S", "-c", _RUN, *map(str, command)],
                            env=environment, stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
                            stderr=subprocess.PIPE, text=True, check=True)
    errors, measured = result.stderr.rsplit("\n", 1)
    sys.stderr.write(errors)
    return json.loads(measured)
