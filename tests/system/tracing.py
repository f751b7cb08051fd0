"""Services that trace, each with a tracer's home of its own, for the tests of tracing."""

import contextlib
import json
import os
import plistlib
import re
import shutil
import signal
import subprocess
import unittest
from pathlib import Path

import isolation
from harness import DEADLINE, Service, WITH_US, require, wait_for
from isolation import program

TEST = 11
REPORTER = 7
THREADS = 4


def require_tracer():
    """Isolates the module. Skips it if the build or the machine cannot record."""
    require("lttng-sessiond", "lttng", "babeltrace2")
    isolation.enter()
    with TracedService() as service:
        if not service.has_tracer():
            raise unittest.SkipTest("LTTng is not in this build")


def interval(name, begin, end, matched_by="Thread"):
    return {"Name": name, "Type": "Interval", "KTraceCodeBegin": hex(begin),
            "KTraceCodeEnd": hex(end), "EventsMatchedBy": matched_by}


POINTS = [
    interval("Shared", 0x21040010, 0x21040014),
    interval("CrossByThread", 0x21040018, 0x2104001C),
    interval("CrossByProcess", 0x21040018, 0x2104001C, "Process"),
    # The first and the last recorded code, and the codes just outside this range, which are not
    # recorded.
    interval("Outside", 0x2103FFFF, 0x2104408B),
    interval("Edges", 0x21040000, 0x2104408A),
] + [interval(f"Own{n}", 0x21040020 + 8 * n, 0x21040024 + 8 * n) for n in range(THREADS)]


class TracedService(Service):
    """A service with a tracer's home of its own, in which no daemon runs at first."""

    def __init__(self, switch="true"):
        super().__init__(f'[features.Acoustat]\nTracing = {switch}\n[log]\nlevel = "debug"\n',
                         command=[str(program("halvox-reportingd"))])
        self.home = self.directory / "home"
        self.home.mkdir()
        self.environment = {"HOME": str(self.home), "LTTNG_HOME": str(self.home),
                            "LTTNG_UST_REGISTER_TIMEOUT": "0"}
        self._environment.update(self.environment)
        self.params = self.directory / "params.plist"
        self.note = self.directory / "state/traces/lttng-sessiond"
        self.write_params(POINTS)

    def write_params(self, points, trace_type="ktrace"):
        with open(self.params, "wb") as file:
            plistlib.dump({"Children": [{"Name": "T", "TraceType": trace_type, "Children": points}]},
                          file, fmt=plistlib.FMT_BINARY)

    def use_only(self, **programs):
        """Lets the service find only these programs, each given as a shell script."""
        directory = self.directory / "programs"
        directory.mkdir()
        setpriv = WITH_US[0]
        (directory / setpriv).symlink_to(shutil.which(setpriv))
        for name, script in programs.items():
            program = directory / name.replace("_", "-")
            program.write_text(f"#!/bin/sh\n{script}\n")
            program.chmod(0o755)
        self._environment["PATH"] = str(directory)

    def has_tracer(self):
        """Whether this build can record traces. The service logs that when it has started."""
        line = wait_for("the line about traces", lambda: re.search("traces: (.*)", self.log()))
        return line[1] == "LTTng"

    def counted(self, name, piece="kernel traces"):
        """The current value of a counter of the service."""
        before = len(self.log())
        self.process.send_signal(signal.SIGUSR1)
        found = wait_for(f"the count of {name}", lambda: re.search(
            rf"counted {piece}, {name}: (\d+)", self.log()[before:]))
        return int(found[1])

    def __exit__(self, *details):
        daemon = self.daemon()
        try:
            super().__exit__(*details)
        finally:
            if daemon is not None:
                with contextlib.suppress(ProcessLookupError):
                    os.kill(daemon, signal.SIGKILL)

    def daemon(self):
        """The process ID of the daemon that the service started; None if there is none."""
        with contextlib.suppress(FileNotFoundError, IndexError):
            return int(self.note.read_text().split()[0])
        return None

    def results(self):
        found = list(self.directory.rglob("tracing_results.ssj"))
        return json.loads(found[0].read_text()) if found else None

    def client_environment(self):
        # Programs wait this long for the tracer, so that nothing is emitted before it records.
        return {**os.environ, **self.environment, "LTTNG_UST_REGISTER_TIMEOUT": "10000"}

    def run_client(self, *arguments):
        done = subprocess.run([*WITH_US, str(program("halvox_trace_client")), *map(str, arguments)],
                              env=self.client_environment(),
                              capture_output=True, text=True, timeout=120, check=True)
        return json.loads(done.stdout)

    def lttng(self, *arguments):
        return subprocess.run([*WITH_US, "lttng", "--no-sessiond", "-n", *map(str, arguments)],
                              env={**os.environ, **self.environment}, capture_output=True,
                              text=True, timeout=DEADLINE, check=False)

    def sessions(self):
        """The sessions of the tracer's daemon; empty if no daemon runs."""
        return self.lttng("list").stdout

    def recordings(self):
        """The traces that record at the moment."""
        return list(self.directory.glob("state/traces/recording/*"))

    def scratch(self):
        return list(self.directory.glob("state/traces/scratch/*"))


def start_session(service, trace_type="ktrace", records=True):
    """A started session of the type test. Yields its client when events are recorded.

    With records=False it yields when the start has been carried out.
    """
    client = service.client()
    configuration = {"HVReportingMeridelPlistFilePath": str(service.params)}
    if trace_type is not None:
        configuration["HVReportingTraceType"] = trace_type
    client.create(REPORTER)
    client.set_type(TEST, REPORTER)
    client.configure(configuration, REPORTER)
    restart_session(service, client, records)
    return client


def restart_session(service, client, records=True):
    """The same for a session that exists."""
    before = service.recordings()
    client.start_later(REPORTER)
    client.valid(REPORTER)  # is answered after the start has been carried out
    if records:
        wait_for("the recording to begin", lambda: set(service.recordings()) - set(before))


@contextlib.contextmanager
def traced_session(service, trace_type="ktrace", records=True):
    """The same; stops the session at the end."""
    client = start_session(service, trace_type, records)
    yield client
    client.stop(REPORTER)
    client.valid(REPORTER)
    client.close()


def wait_for_results(service):
    return wait_for("the results file", service.results, 60)


def is_running(pid):
    """Whether the process exists and has not ended. An orphan that has ended may stay here as a
    zombie."""
    try:
        return ") Z " not in Path(f"/proc/{pid}/stat").read_text()
    except (FileNotFoundError, ProcessLookupError):  # the latter if it ends while it is read
        return False


def children_of(pid):
    """The processes that it started, as (process, name)."""
    for stat in Path("/proc").glob("[0-9]*/stat"):
        with contextlib.suppress(FileNotFoundError, ProcessLookupError):
            name, rest = stat.read_text().split("(", 1)[1].rsplit(")", 1)
            if int(rest.split()[1]) == pid:
                yield int(stat.parent.name), name


def waits_for_processor(pid):
    """For each thread of a process, the seconds in which it was ready to run but had to wait."""
    waits = {}
    for file in Path(f"/proc/{pid}/task").glob("*/schedstat"):
        with contextlib.suppress(FileNotFoundError, ProcessLookupError):
            waits[file.parent.name] = int(file.read_text().split()[1]) / 1e9
    return waits
