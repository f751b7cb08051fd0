"""Traces of a real service by a real LTTng, in scratch directories of their own.

LTTng's directories are per user, and root's are the machine's own, so all of this module runs
unprivileged: it gives up being root for good.
"""

import contextlib
import json
import os
import plistlib
import signal
import statistics
import subprocess
import unittest
from pathlib import Path

from harness import BIN, CTL, DEADLINE, Service, WITH_US, require, wait_for

CLIENT = BIN / "halvox_trace_client"
NOBODY = 65534
TEST = 11
REPORTER = 7
PAIRS = 50
THREADS = 4


def setUpModule():
    require("lttng-sessiond", "lttng", "babeltrace2", "zstd")
    if os.getuid() == 0:
        os.setgroups([])
        os.setgid(NOBODY)
        os.setuid(NOBODY)


def interval(name, begin, end, matched_by="Thread"):
    return {"Name": name, "Type": "Interval", "KTraceCodeBegin": hex(begin),
            "KTraceCodeEnd": hex(end), "EventsMatchedBy": matched_by}


POINTS = [
    interval("Shared", 0x21040010, 0x21040014),
    interval("CrossByThread", 0x21040018, 0x2104001C),
    interval("CrossByProcess", 0x21040018, 0x2104001C, "Process"),
    interval("Outside", 0x2104408C, 0x21044090),
] + [interval(f"Own{n}", 0x21040020 + 8 * n, 0x21040024 + 8 * n) for n in range(THREADS)]


class TracedService(Service):
    """A service with a tracer's home of its own, in which nothing runs at first."""

    def __init__(self, switch="true"):
        super().__init__(f'[features.Acoustat]\nTracing = {switch}\n[log]\nlevel = "debug"\n')
        self.home = self.directory / "home"
        self.home.mkdir()
        self.environment = {"HOME": str(self.home), "LTTNG_HOME": str(self.home),
                            "LTTNG_UST_REGISTER_TIMEOUT": "0"}
        self._environment.update(self.environment)
        self.params = self.directory / "params.plist"
        self.note = self.directory / "state/traces/lttng-sessiond"
        self.write_params(POINTS)

    def write_params(self, points):
        with open(self.params, "wb") as file:
            plistlib.dump({"Children": [{"Name": "T", "TraceType": "ktrace", "Children": points}]},
                          file, fmt=plistlib.FMT_BINARY)

    def __exit__(self, *details):
        daemon = self.daemon()
        try:
            super().__exit__(*details)
        finally:
            if daemon is not None:
                with contextlib.suppress(ProcessLookupError):
                    os.kill(daemon, signal.SIGKILL)

    def daemon(self):
        """The process of the daemon that the service started, None when there is none."""
        with contextlib.suppress(FileNotFoundError, IndexError):
            return int(self.note.read_text().split()[0])
        return None

    def results(self):
        found = list(self.directory.rglob("tracing_results.ssj"))
        return json.loads(found[0].read_text()) if found else None

    def run_client(self, *arguments):
        environment = {**os.environ, **self.environment, "LTTNG_UST_REGISTER_TIMEOUT": "10000"}
        done = subprocess.run([*WITH_US, str(CLIENT), *map(str, arguments)], env=environment,
                              capture_output=True, text=True, timeout=120, check=True)
        return json.loads(done.stdout)

    def sessions(self):
        """What the tracer's daemon lists; empty when none runs."""
        environment = {**os.environ, **self.environment}
        return subprocess.run(["lttng", "--no-sessiond", "-n", "list"], env=environment,
                              capture_output=True, text=True, timeout=DEADLINE).stdout

    def scratch(self):
        return list(self.directory.glob("state/traces/scratch/*"))


def start_session(service, trace_type="ktrace"):
    """A session of the type test that runs; gives its client."""
    client = service.client()
    configuration = {"HVReportingMeridelPlistFilePath": str(service.params)}
    if trace_type is not None:
        configuration["HVReportingTraceType"] = trace_type
    client.create(REPORTER)
    client.set_type(TEST, REPORTER)
    client.configure(configuration, REPORTER)
    client.start_later(REPORTER)
    client.valid(REPORTER)  # is answered when the start has been carried out
    return client


@contextlib.contextmanager
def traced_session(service, trace_type="ktrace"):
    """The same, stopped at the end."""
    client = start_session(service, trace_type)
    yield
    client.stop(REPORTER)
    client.valid(REPORTER)
    client.close()


def wait_for_results(service):
    return wait_for("the results file", service.results, 60)


def is_running(pid):
    """Whether there is such a process that has not ended; nobody may wait for an orphan here."""
    try:
        return ") Z " not in Path(f"/proc/{pid}/stat").read_text()
    except FileNotFoundError:
        return False


class KernelTraceTest(unittest.TestCase):
    def test_results_hold_what_the_program_measured(self):
        with TracedService() as service:
            with traced_session(service):
                wait_for("the trace to run", service.scratch)
                measured = service.run_client("intervals", PAIRS)
            values = wait_for_results(service)["values"]

            for thread, own in enumerate(measured["own"]):
                found = values[f"Own{thread}"]
                self.assertEqual(len(found), PAIRS)
                excess = [value - known for value, known in zip(found, own)]
                self.assertGreaterEqual(min(excess), 0)
                self.assertLess(statistics.median(excess), 50_000)

            # All threads used these codes at once, and each was matched with itself.
            everything = sorted(value for own in measured["own"] for value in own)
            shared = sorted(values["Shared"])
            self.assertEqual(len(shared), THREADS * PAIRS)
            excess = [value - known for value, known in zip(shared, everything)]
            self.assertGreaterEqual(min(excess), 0)
            self.assertLess(statistics.median(excess), 50_000)

    def test_matching_by_process_takes_events_of_any_thread(self):
        with TracedService() as service:
            with traced_session(service):
                wait_for("the trace to run", service.scratch)
                measured = service.run_client("intervals", 1)
            values = wait_for_results(service)["values"]

            self.assertEqual(len(values["CrossByProcess"]), 1)
            self.assertGreaterEqual(values["CrossByProcess"][0], measured["cross"])
            self.assertNotIn("CrossByThread", values)
            self.assertNotIn("Outside", values)

    def test_codes_outside_the_range_are_not_recorded(self):
        with TracedService() as service:
            with traced_session(service):
                wait_for("the trace to run", service.scratch)
                service.run_client("intervals", 10)
            wait_for_results(service)

            service.process.send_signal(signal.SIGUSR1)
            # Four in each pair of the shared and of the own codes, two across threads.
            expected = f"kernel traces, events delivered: {THREADS * 10 * 4 + 2}"
            wait_for("the count of events", lambda: expected in service.log())

    def test_nothing_is_left_of_a_trace(self):
        with TracedService() as service:
            with traced_session(service):
                wait_for("the trace to run", service.scratch)
                self.assertIn("halvox-", service.sessions())
                daemon = service.daemon()
                service.run_client("intervals", 1)
            wait_for_results(service)

            wait_for("the scratch trace to go", lambda: not service.scratch())
            self.assertNotIn("halvox-", service.sessions())
            service.stop()

            self.assertFalse(is_running(daemon))
            self.assertFalse(service.note.exists())

    def test_service_that_was_killed_is_cleaned_up_after(self):
        with TracedService() as service:
            client = start_session(service)
            wait_for("the trace to run", service.scratch)
            daemon = service.daemon()
            service.stop(signal.SIGKILL)
            client.close()
            self.assertIn("halvox-", service.sessions())

            service.start()

            self.assertNotIn("halvox-", service.sessions())
            self.assertFalse(service.scratch())
            service.stop()
            self.assertFalse(is_running(daemon))

    def test_without_the_feature_nothing_is_traced(self):
        with TracedService(switch="false") as service:
            with traced_session(service):
                pass

            self.assertIsNone(service.daemon())
            self.assertIsNone(service.results())

    def test_million_events_are_read_back_without_loss(self):
        events = 1_000_000
        with TracedService() as service:
            with traced_session(service):
                wait_for("the trace to run", service.scratch)
                took = service.run_client("flood", events, 200_000)["nanoseconds"] / 1e9
                begin = os.times().elapsed
            values = wait_for_results(service)["values"]
            elapsed = os.times().elapsed - begin
            peak = next(int(line.split()[1]) for line in
                        Path(f"/proc/{service.process.pid}/status").read_text().splitlines()
                        if line.startswith("VmHWM:"))

            print(f"{events} events in {took:.1f} s, read back in {elapsed:.1f} s, "
                  f"{peak / 1024:.0f} MiB at most", flush=True)
            self.assertEqual(len(values["Shared"]), events // 2, service.log()[-2000:])
            self.assertLess(elapsed, 10)
            # Sanitizers keep freed memory for a while.
            if not os.environ.get("HALVOX_SANITIZE"):
                self.assertLess(peak / 1024, 300)


class ToolTest(unittest.TestCase):
    def run_tool(self, service, *arguments):
        environment = {**service._environment, "HALVOX_SOCKET": str(service.socket),
                       "LTTNG_UST_REGISTER_TIMEOUT": "10000"}
        return subprocess.run([str(CTL), "trace", *map(str, arguments)], env=environment,
                              capture_output=True, text=True, timeout=120, check=False)

    def record(self, service, *command):
        return self.run_tool(service, "record", "--json", "--params", service.params, "--", *command)

    def test_program_is_traced_shown_and_exported(self):
        with TracedService() as service:
            done = self.record(service, CLIENT, "intervals", 5)
            self.assertEqual(done.returncode, 0, done.stderr)
            # The program's own line comes first.
            measured, *lines = map(json.loads, done.stdout.splitlines())
            rows = {row["name"]: row for row in lines}
            self.assertEqual(rows["Shared"]["count"], THREADS * 5)
            self.assertGreaterEqual(rows["Own3"]["min_ns"], min(measured["own"][3]))

            file = next(service.directory.rglob("tracing_results.ssj"))
            table = self.run_tool(service, "show", file)
            self.assertEqual(table.returncode, 0, table.stderr)
            self.assertIn("MEDIAN", table.stdout)
            exported = service.directory / "trace.json"
            self.assertEqual(self.run_tool(service, "export", file, "--to", exported).returncode, 0)
            events = json.loads(exported.read_text())["traceEvents"]
            self.assertEqual(sum(event["name"] == "Shared" and event["ph"] == "X"
                                 for event in events), THREADS * 5)

    def test_program_that_fails_is_told(self):
        with TracedService() as service:
            done = self.record(service, "false")

            self.assertEqual(done.returncode, 1)
            self.assertIn("false ended with status 1", done.stderr)

    def test_service_that_does_not_trace_is_told(self):
        with TracedService(switch="false") as service:
            done = self.record(service, "true")

            self.assertEqual(done.returncode, 1)
            self.assertIn("left no new results", done.stderr)


class PerformanceTraceTest(unittest.TestCase):
    def test_trace_becomes_an_archive_that_other_tools_read(self):
        with TracedService() as service:
            with traced_session(service, trace_type=None):
                wait_for("the trace to run", service.scratch)
                wait_for("its start", lambda: "Performance Trace Started" in service.log())
                service.run_client("intervals", 2)
            completed = "Performance Trace Completed: "
            wait_for("its completion", lambda: completed in service.log())

            archives = list(service.directory.glob("state/traces/trace-*.tar.zst"))
            self.assertEqual(len(archives), 1)
            self.assertIn(f"{completed}{archives[0]}", service.log())
            unpacked = service.directory / "unpacked"
            unpacked.mkdir()
            subprocess.run(f"zstd -dc {archives[0]} | tar -x -C {unpacked}", shell=True, check=True)
            text = subprocess.run(["babeltrace2", str(unpacked)], capture_output=True, text=True,
                                  check=True, timeout=DEADLINE).stdout
            self.assertEqual(text.count("code = 0x21040010"), THREADS * 2)
            self.assertIn('procname = "halvox_trace_cl', text)
            self.assertFalse(service.scratch())


if __name__ == "__main__":
    unittest.main()
