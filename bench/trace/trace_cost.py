"""Runs halvox_trace_cost without a tracer, then with one that records as the service does.

Starts a private tracer as an unprivileged user. HALVOX_BIN names the directory of the programs.
"""

import os
import shutil
import subprocess
import tempfile
import time
from pathlib import Path

NOBODY = 65534
FILTER = "(code >= 553910272 && code <= 553910410)"


def main():
    program = Path(os.environ["HALVOX_BIN"]).resolve() / "halvox_trace_cost"
    if os.getuid() == 0:
        os.setgroups([])
        os.setgid(NOBODY)
        os.setuid(NOBODY)
    home = tempfile.mkdtemp(prefix="halvox-trace-cost-")
    environment = {**os.environ, "HOME": home, "LTTNG_HOME": home}

    def run(label, bursts, events):
        done = subprocess.run([program, str(bursts), str(events)], env=environment,
                              capture_output=True, text=True, check=True)
        print(f"{label}:\n{done.stdout.rstrip()}", flush=True)

    def lttng(*arguments):
        subprocess.run(["lttng", "--no-sessiond", "-n", *arguments], env=environment, check=True,
                       stdout=subprocess.DEVNULL)

    try:
        run("no trace runs", 1000, 20_000)
        daemon = subprocess.Popen(["lttng-sessiond", "--no-kernel"], env=environment,
                                  stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
        try:
            while subprocess.run(["lttng", "--no-sessiond", "-n", "list"], env=environment,
                                 stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL).returncode:
                time.sleep(0.05)
            lttng("create", "cost", "-o", f"{home}/trace")
            lttng("enable-channel", "-u", "c", "--subbuf-size=1M", "--num-subbuf=16")
            lttng("add-context", "-u", "-c", "c", "-t", "vpid", "-t", "vtid", "-t", "procname")
            for event in ("halvox:kdebug", "halvox_bare:kdebug"):
                lttng("enable-event", "-u", "-c", "c", event, "--filter", FILTER)
            lttng("start")
            run("a trace runs", 400, 2_500)
            lttng("destroy")
        finally:
            daemon.terminate()
            daemon.wait()
    finally:
        shutil.rmtree(home, ignore_errors=True)


if __name__ == "__main__":
    main()
