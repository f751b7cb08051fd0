"""Runs commands on a machine where root has a tracer's daemon: one that hangs, or one that records.

    unshare --mount python3 -m roots_daemon hangs|records COMMAND... [-- COMMAND...]

Needs root and a mount namespace of its own, in which it hides /run. The last line of standard
output is JSON with the commands' exit statuses, the number of connections to the daemon that hangs
before and during the commands, and the sessions of the daemon that records afterwards.
"""

import json
import os
import re
import shutil
import socket
import subprocess
import sys
import threading
from pathlib import Path

from harness import BIN, DEADLINE, WITH_US, wait_for

RUN = Path("/run/lttng")


class HangingDaemon:
    """Accepts on the sockets of root's daemon, with the permissions of the real one, and never
    answers."""

    def __init__(self):
        self.connections = []
        for name, mode in (("client-lttng-sessiond", 0o660), ("lttng-ust-sock-8", 0o666)):
            listener = socket.socket(socket.AF_UNIX)
            listener.bind(str(RUN / name))
            (RUN / name).chmod(mode)
            listener.listen()
            threading.Thread(target=self._accept, args=(listener,), daemon=True).start()

    def _accept(self, listener):
        while True:
            self.connections.append(listener.accept()[0])


def lttng(*arguments):
    return subprocess.run([*WITH_US, "lttng", "--no-sessiond", "-n", *arguments],
                          capture_output=True, text=True, timeout=DEADLINE, check=False)


def start_recording():
    daemon = subprocess.Popen([*WITH_US, "lttng-sessiond", "--no-kernel"],
                              stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
    wait_for("root's daemon", lambda: lttng("list").returncode == 0)
    for command in (["create", "roots", "--output=/run/roots-trace"],
                    ["enable-event", "--userspace", "--all"], ["start"]):
        assert lttng(*command).returncode == 0, command
    return daemon


def commands(words):
    """The commands between the words "--"."""
    found = [[]]
    for word in words:
        if word == "--":
            found.append([])
        else:
            found[-1].append(word)
    return found


def run(words):
    return [subprocess.run([*WITH_US, *command], check=False).returncode
            for command in commands(words)]


def main():
    kind, *words = sys.argv[1:]
    subprocess.run(["mount", "-t", "tmpfs", "-o", "mode=755", "tmpfs", "/run"], check=True)
    RUN.mkdir(mode=0o755)
    result = {}
    if kind == "hangs":
        daemon = HangingDaemon()
        # A traced program that is not isolated connects to the daemon.
        subprocess.run([str(BIN / "halvox_trace_client"), "intervals", "1"], check=True,
                       stdout=subprocess.DEVNULL, timeout=DEADLINE,
                       env={**os.environ, "LTTNG_UST_REGISTER_TIMEOUT": "0"})
        result["met before"] = len(daemon.connections)
        result["statuses"] = run(words)
        result["met"] = len(daemon.connections) - result["met before"]
    else:
        daemon = start_recording()
        try:
            result["statuses"] = run(words)
            result["sessions"] = re.findall(r"^ +\d+\) (\S+)", lttng("list").stdout, re.MULTILINE)
        finally:
            daemon.terminate()
            daemon.wait(DEADLINE)
            shutil.rmtree("/run/roots-trace", ignore_errors=True)
    print("\n" + json.dumps(result), flush=True)


if __name__ == "__main__":
    main()
