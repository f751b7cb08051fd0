"""Traces of a real service with a real LTTng, in scratch directories.

This module gives up being root for the rest of the process; see isolation.py.
"""

import json
import os
import plistlib
import re
import signal
import statistics
import subprocess
import unittest
from pathlib import Path

from harness import DEADLINE, WITH_US, require, stop_process, wait_for
from isolation import program
from tracing import (POINTS, REPORTER, THREADS, TracedService, children_of, interval, is_running,
                     require_tracer, restart_session, start_session, traced_session,
                     waits_for_processor,
                     wait_for_results)

PAIRS = 50


def setUpModule():
    require("zstd", "taskset")
    require_tracer()


class KernelTraceTest(unittest.TestCase):
    def test_results_hold_what_the_program_measured(self):
        with TracedService() as service:
            with traced_session(service):
                measured = service.run_client("intervals", PAIRS)
            values = wait_for_results(service)["values"]

            for thread, own in enumerate(measured["own"]):
                found = values[f"Own{thread}"]
                self.assertEqual(len(found), PAIRS)
                excess = [value - known for value, known in zip(found, own)]
                self.assertGreaterEqual(min(excess), 0)
                self.assertLess(statistics.median(excess), 50_000)

            # All threads used these codes at the same time, and each begin was matched with the end
            # of its thread.
            everything = sorted(value for own in measured["own"] for value in own)
            shared = sorted(values["Shared"])
            self.assertEqual(len(shared), THREADS * PAIRS)
            excess = [value - known for value, known in zip(shared, everything)]
            self.assertGreaterEqual(min(excess), 0)
            self.assertLess(statistics.median(excess), 50_000)

    def test_matching_by_process_takes_events_of_any_thread(self):
        with TracedService() as service:
            with traced_session(service):
                measured = service.run_client("intervals", 1)
            values = wait_for_results(service)["values"]

            self.assertEqual(len(values["CrossByProcess"]), 1)
            self.assertGreaterEqual(values["CrossByProcess"][0], measured["cross"])
            self.assertNotIn("CrossByThread", values)

    def test_codes_outside_the_range_are_not_recorded(self):
        with TracedService() as service:
            with traced_session(service):
                service.run_client("intervals", 10)
            values = wait_for_results(service)["values"]

            # The first and the last code are recorded. The codes just outside this range are not
            # even read back.
            self.assertEqual(len(values["Edges"]), THREADS * 10)
            self.assertNotIn("Outside", values)
            # Two each of the shared codes, the own codes and the edges, and two across threads.
            expected = THREADS * 10 * 6 + 2
            self.assertEqual(service.counted("events delivered"), expected)
            self.assertEqual(service.counted("events read back"), expected)

    def test_nothing_is_left_of_a_trace(self):
        with TracedService() as service:
            with traced_session(service):
                self.assertIn("halvox-", service.sessions())
                daemon = service.daemon()
                service.run_client("intervals", 1)
            wait_for_results(service)

            wait_for("the scratch trace to be removed", lambda: not service.scratch())
            self.assertNotIn("halvox-", service.sessions())
            service.stop()

            self.assertFalse(is_running(daemon))
            self.assertFalse(service.note.exists())

    def test_events_that_find_no_room_are_counted_and_reported(self):
        events = 600_000  # the buffers of a processor have room for about a third of them
        processor = min(os.sched_getaffinity(0))
        with TracedService() as service:
            with traced_session(service):
                daemon = service.daemon()
                client = subprocess.Popen(
                    [*WITH_US, "taskset", "-c", str(processor), str(program("halvox_trace_client")), "burst", str(events)],
                    env=service.client_environment(), text=True,
                    stdin=subprocess.PIPE, stdout=subprocess.PIPE)
                try:
                    self.assertEqual(client.stdout.readline(), "ready\n")
                    # While the daemon's consumer is stopped, it does not empty the buffers.
                    consumers = [pid for pid, name in children_of(daemon)
                                 if name.startswith("lttng-consumer")]
                    self.assertEqual(len(consumers), 1)
                    os.kill(consumers[0], signal.SIGSTOP)
                    try:
                        client.stdin.write("\n")
                        client.stdin.flush()
                        self.assertEqual(client.wait(DEADLINE), 0)
                    finally:
                        os.kill(consumers[0], signal.SIGCONT)
                finally:
                    stop_process(client)
                    client.stdin.close()
                    client.stdout.close()
            values = wait_for_results(service)["values"]

            lost = service.counted("events lost by the tracer")
            delivered = service.counted("events delivered")
            self.assertGreater(lost, 0)
            self.assertEqual(lost + delivered, events)
            self.assertEqual(len(values["Shared"]), delivered // 2)
            self.assertIn(f"lost {lost} events and 0 packets of a kernel trace",
                          service.log())

    def test_service_that_was_killed_is_cleaned_up_after(self):
        with TracedService() as service:
            client = start_session(service)
            daemon = service.daemon()
            service.stop(signal.SIGKILL)
            client.close()
            wait_for("its daemon to end", lambda: not is_running(daemon))
            self.assertTrue(service.scratch())

            service.start()

            self.assertNotIn("halvox-", service.sessions())
            self.assertFalse(service.scratch())
            service.stop()
            self.assertFalse(is_running(daemon))

    def test_daemon_of_somebody_else_stays(self):
        with TracedService() as service:
            daemon = subprocess.Popen(
                [*WITH_US, "lttng-sessiond", "--no-kernel"],
                env={**os.environ, **service.environment}, stdin=subprocess.DEVNULL,
                stdout=subprocess.DEVNULL, stderr=subprocess.DEVNULL)
            try:
                wait_for("the daemon to answer", lambda: service.lttng("list").returncode == 0)
                client = start_session(service)
                service.stop(signal.SIGKILL)
                client.close()
                self.assertIn("halvox-", service.sessions())

                service.start()

                self.assertNotIn("halvox-", service.sessions())
                with traced_session(service):
                    service.run_client("intervals", 1)
                self.assertIn("Own0", wait_for_results(service)["values"])
                self.assertIsNone(service.daemon())
                service.stop()
                self.assertEqual(service.lttng("list").returncode, 0)
            finally:
                stop_process(daemon)

    def test_daemon_that_others_use_outlives_the_service_and_is_known_again(self):
        with TracedService() as service:
            with traced_session(service):
                daemon = service.daemon()
            wait_for_results(service)
            self.assertEqual(service.lttng("create", "other").returncode, 0)

            service.stop()

            self.assertTrue(is_running(daemon))
            self.assertIn("other", service.sessions())
            self.assertEqual(service.lttng("destroy", "other").returncode, 0)
            service.start()
            service.stop()
            self.assertFalse(is_running(daemon))

    def test_service_that_ends_while_it_reads_stops_reading_and_counts_every_event(self):
        events = 300_000
        with TracedService() as service:
            client = start_session(service)
            service.run_client("flood", events, 1_000_000_000)
            client.call_later("stopReportingSessionForID", "x", REPORTER)
            wait_for("the stop", lambda: "Tearing down trace" in service.log())
            daemon = service.daemon()
            service.stop()
            client.close()

            # The stop still waits for its results, but the tracer is left as it was found.
            self.assertFalse(is_running(daemon))
            self.assertEqual(service.scratch(), [])

            counts = dict(re.findall(r"counted kernel traces, (.*): (\d+)", service.log()))
            read = int(counts.get("events read back", 0))
            handled = sum(int(counts.get(name, 0)) for name in
                          ("events delivered", "events dropped: the service ends"))
            self.assertEqual(handled, read)
            # Otherwise the end of the service would take as long as reading its traces.
            self.assertLess(read + int(counts.get("events lost by the tracer", 0)), events)

    def test_without_the_feature_nothing_is_traced(self):
        with TracedService(switch="false") as service:
            with traced_session(service, records=False):
                pass

            self.assertIsNone(service.daemon())
            self.assertIsNone(service.results())

    def test_daemon_that_dies_ends_the_trace_and_the_next_one_starts_another(self):
        with TracedService() as service:
            with traced_session(service):
                daemon = service.daemon()
                os.kill(daemon, signal.SIGKILL)
                wait_for("its end", lambda: not is_running(daemon))
            self.assertEqual(wait_for_results(service)["values"], {})
            self.assertIn("cannot end a kernel trace: ", service.log())

            with traced_session(service):
                self.assertNotEqual(service.daemon(), daemon)
                service.run_client("intervals", 1)
            wait_for("the new results", lambda: "Own0" in service.results()["values"])
            # The first daemon has already ended.
            self.assertFalse(Path(f"/proc/{daemon}").exists())

    def test_million_events_are_read_back_without_loss(self):
        events = 1_000_000
        with TracedService() as service:
            with traced_session(service):
                took = service.run_client("flood", events, 200_000)["nanoseconds"] / 1e9
                begin = os.times().elapsed
                waited_before = waits_for_processor(service.process.pid)
            values = wait_for_results(service)["values"]
            elapsed = os.times().elapsed - begin
            # On a busy machine, the thread that waited longest waited much longer than the others.
            waits = waits_for_processor(service.process.pid)
            waited = max(waits[thread] - waited_before.get(thread, 0) for thread in waits)
            peak = next(int(line.split()[1]) for line in
                        Path(f"/proc/{service.process.pid}/status").read_text().splitlines()
                        if line.startswith("VmHWM:"))

            print(f"{events} events in {took:.1f} s, read back in {elapsed:.1f} s of which "
                  f"{waited:.1f} s without a processor, {peak / 1024:.0f} MiB at most", flush=True)
            self.assertEqual(len(values["Shared"]), events // 2, service.log()[-2000:])
            # A sanitized build is slower and keeps freed memory for a while.
            if not os.environ.get("HALVOX_SANITIZE"):
                self.assertLess(elapsed - waited, 10)
                self.assertLess(peak / 1024, 300)


    def test_second_run_holds_its_own_values_only(self):
        with TracedService() as service:
            with traced_session(service) as client:
                service.run_client("intervals", 3)
                client.stop(REPORTER)
                self.assertEqual(len(wait_for_results(service)["values"]["Shared"]), THREADS * 3)
                client.configure({"HVReportingMeridelPlistFilePath": ""}, REPORTER)
                restart_session(service, client)
                service.run_client("intervals", 2)
            values = service.results()["values"]

            self.assertEqual(service.log().count("TracefileName empty. Failed to setup tracing"), 1)
            self.assertEqual(len(values["Shared"]), THREADS * 2)
            self.assertEqual(len(values["Own0"]), 2)


class ForgottenTraceTest(unittest.TestCase):
    """Traces that no stop ends, because the session has another service type by then."""

    def assert_nothing_records_once_released(self, service, client):
        self.assertIn("halvox-", service.sessions())
        client.destroy(REPORTER)
        wait_for("the recording to end", lambda: "halvox-" not in service.sessions())
        wait_for("the scratch trace to be removed", lambda: not service.scratch())
        client.close()

    def test_performance_trace_of_a_session_that_became_a_runners(self):
        with TracedService() as service:
            client = start_session(service, trace_type=None)
            wait_for("its start", lambda: "Performance Trace Started" in service.log())
            client.configure({"HVReportingTraceType": "ktrace"}, REPORTER)
            client.stop(REPORTER)
            self.assert_nothing_records_once_released(service, client)

    def test_performance_trace_of_a_session_that_is_no_longer_a_test(self):
        with TracedService() as service:
            client = start_session(service, trace_type=None)
            wait_for("its start", lambda: "Performance Trace Started" in service.log())
            client.set_type(5, REPORTER)
            client.stop(REPORTER)
            self.assert_nothing_records_once_released(service, client)

    def test_kernel_trace_of_a_session_that_is_no_longer_a_test(self):
        with TracedService() as service:
            client = start_session(service)
            client.set_type(5, REPORTER)
            client.stop(REPORTER)
            self.assert_nothing_records_once_released(service, client)
            self.assertIsNone(service.results())


class ToolTest(unittest.TestCase):
    def run_tool(self, service, *arguments):
        environment = {**service._environment, "HALVOX_SOCKET": str(service.socket),
                       "LTTNG_UST_REGISTER_TIMEOUT": "10000"}
        return subprocess.run([str(program("halvoxctl")), "trace", *map(str, arguments)], env=environment,
                              capture_output=True, text=True, timeout=120, check=False)

    def record(self, service, *command):
        return self.run_tool(service, "record", "--json", "--params", service.params, "--", *command)

    def test_program_is_traced_shown_and_exported(self):
        with TracedService() as service:
            done = self.record(service, program("halvox_trace_client"), "intervals", 5)
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

    def test_program_that_fails_is_reported(self):
        with TracedService() as service:
            done = self.record(service, "false")

            self.assertEqual(done.returncode, 1)
            self.assertIn("false ended with status 1", done.stderr)

    def assert_only_failures(self, output):
        """With --json each failure is an object, and no result is printed."""
        objects = [json.loads(line) for line in output.splitlines()]
        self.assertGreater(len(objects), 0)
        self.assertEqual({(each["command"], each["result"]) for each in objects},
                         {("trace record", False)})

    def assert_refused(self, service, *reasons):
        """Mistakes in the parameters file are reported before the program runs."""
        mark = service.directory / "ran"
        done = self.record(service, "touch", mark)
        self.assertNotEqual(done.returncode, 0)
        self.assert_only_failures(done.stdout)
        for reason in (str(service.params), *reasons):
            self.assertIn(reason, done.stderr)
        self.assertFalse(mark.exists())

    def test_parameters_file_that_is_not_a_property_list_is_reported(self):
        with TracedService() as service:
            for text in ("", "hello", "<plist><dict><key>Children</key>"):
                with self.subTest(text):
                    service.params.write_text(text)
                    self.assert_refused(service, "Reading from plist file failed with error: ",
                                        "the property list ")

    def test_parameters_file_that_cannot_be_read_is_reported(self):
        with TracedService() as service:
            service.params.unlink()
            self.assert_refused(service, "No such file or directory")
            service.params.mkdir()
            self.assert_refused(service, "Is a directory")

    def test_parameters_file_without_an_interval_is_reported_with_its_faults(self):
        with TracedService() as service:
            service.params.write_bytes(plistlib.dumps({"Kinder": []}))
            self.assert_refused(service, "Failed to load Trace Parameter Array with error: "
                                         "expected an array, found (null)")
            service.write_params("none")
            self.assert_refused(service, "Failed to read the Trace Points from the plist file "
                                         "with error: expected an array, found a string")
            service.write_params([{**POINTS[0], "Type": "Intervall"}])
            self.assert_refused(service, "TracePointType field not recognized or is empty.")
            service.write_params([{**POINTS[0], "Type": "Impulse"}])
            self.assert_refused(service, "no interval")
            service.write_params(POINTS, trace_type="OSSignpost")
            self.assert_refused(service, "OSSignpost")

    def test_parameters_file_whose_codes_are_never_recorded_is_reported(self):
        with TracedService() as service:
            service.write_params([interval("IOStart", 0x1A2B0001, 0x1A2B0002)])

            self.assert_refused(service, "IOStart", "0x1a2b0001", "0x21040000")

    def test_parameters_file_that_is_partly_wrong_is_reported_beside_the_results(self):
        with TracedService() as service:
            service.write_params([POINTS[0], {**POINTS[1], "Type": "Intervall"}])
            done = self.record(service, program("halvox_trace_client"), "intervals", 1)

            self.assertEqual(done.returncode, 0, done.stderr)
            self.assertIn('"Shared"', done.stdout)
            self.assertIn("TracePointType field not recognized or is empty.", done.stderr)

    def test_program_that_emits_nothing_is_reported(self):
        with TracedService() as service:
            done = self.record(service, "true")

            self.assertNotEqual(done.returncode, 0)
            self.assert_only_failures(done.stdout)
            self.assertIn("nothing was measured", done.stderr)

    def test_service_that_does_not_trace_is_reported(self):
        with TracedService(switch="false") as service:
            done = self.record(service, "true")

            self.assertEqual(done.returncode, 1)
            self.assertIn("wrote no new results", done.stderr)


class PerformanceTraceTest(unittest.TestCase):
    def test_trace_becomes_an_archive_that_other_tools_read(self):
        with TracedService() as service:
            with traced_session(service, trace_type=None):
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

    def completion_of_failed_trace(self, spoil):
        """The log line of the only completion of a trace that is disturbed while it runs."""
        with TracedService() as service:
            client = start_session(service, trace_type=None)
            wait_for("its start", lambda: "Performance Trace Started" in service.log())
            spoil(service)
            client.stop(REPORTER)  # is answered: the wait has ended
            client.close()
            service.stop()
            (service.directory / "state/traces").chmod(0o755)
            completions = re.findall("kqTraceDidComplete .*", service.log())
            self.assertEqual(len(completions), 1)
            self.assertNotIn("Performance Trace Completed", service.log())
            self.assertIn("counted performance traces, traces that failed: 1", service.log())
            return completions[0]

    def test_trace_that_cannot_be_saved_completes_with_an_error(self):
        def forbid_archives(service):
            (service.directory / "state/traces").chmod(0o555)

        completion = self.completion_of_failed_trace(forbid_archives)
        self.assertIn("cannot save the trace: ", completion)

    def test_trace_whose_daemon_dies_completes_with_an_error(self):
        def kill_daemon(service):
            daemon = service.daemon()
            os.kill(daemon, signal.SIGKILL)
            wait_for("its end", lambda: not is_running(daemon))

        completion = self.completion_of_failed_trace(kill_daemon)
        self.assertIn("cannot stop the session: ", completion)


if __name__ == "__main__":
    unittest.main()
