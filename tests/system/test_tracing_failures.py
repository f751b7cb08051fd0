"""What happens to traces without a tracer, and to results that cannot be written.

LTTng is not needed and not used: the service finds only the programs of the test.
"""

import unittest

import isolation
from harness import DEADLINE, wait_for
from tracing import (REPORTER, TracedService, start_session, traced_session,
                     wait_for_results)


def setUpModule():
    isolation.enter()


class NoTracerTest(unittest.TestCase):
    def assert_measures_nothing(self, service):
        self.assertEqual(wait_for_results(service)["values"], {})
        self.assertIn("Could not start ktrace session, error: 1", service.log())
        self.assertIsNone(service.daemon())
        self.assertEqual(service.scratch(), [])

    def test_kernel_trace_fails_to_start_and_measures_nothing(self):
        with TracedService() as service:
            service.stop()
            service.use_only()
            service.start()
            with traced_session(service, records=False):
                pass

            self.assert_measures_nothing(service)
            if service.has_tracer():
                self.assertIn("cannot start a kernel trace: cannot start lttng-sessiond: "
                              "No such file or directory", service.log())
                self.assertEqual(service.counted("traces that failed"), 1)

    def test_daemon_that_ends_at_once_is_reported(self):
        with TracedService() as service:
            if not service.has_tracer():
                self.skipTest("LTTng is not in this build")
            service.stop()
            service.use_only(lttng_sessiond="exit 3")
            service.start()
            with traced_session(service, records=False):
                pass

            self.assert_measures_nothing(service)
            self.assertIn("cannot start a kernel trace: lttng-sessiond ended at once",
                          service.log())

    def test_performance_trace_reports_a_failed_start_and_does_not_hold_the_service(self):
        with TracedService() as service:
            service.stop()
            service.use_only()
            service.start()
            client = start_session(service, trace_type=None, records=False)
            wait_for("the failed start", lambda: "kqTraceDidStart " in service.log())
            self.assertIn("started performance trace.", service.log())
            self.assertNotIn("Performance Trace Started", service.log())

            # This stop waits for a completion that never comes. The service ends nevertheless.
            stop = client.call_later("stopReportingSessionForID", "x", REPORTER)
            wait_for("the stop to be carried out",
                     lambda: f"ending session {REPORTER}" in service.log())
            service.stop()

            client.close()
            self.assertFalse(stop.done and stop.error is None)
            self.assertNotIn("Performance Trace Completed", service.log())
            self.assertEqual(service.scratch(), [])


class TypeChangedTest(unittest.TestCase):
    """The trace type changes between a start and its stop. The stop uses the new one."""

    def test_runner_that_has_finished_is_not_stopped_again(self):
        with TracedService() as service:
            service.stop()
            service.use_only()
            service.start()
            client = start_session(service, records=False)
            client.stop(REPORTER)
            client.configure({"HVReportingTraceType": "artrace"}, REPORTER)
            client.start_later(REPORTER)
            client.valid(REPORTER)
            client.configure({"HVReportingTraceType": "ktrace"}, REPORTER)

            self.assertTrue(client.stop(REPORTER))

            self.assertIsNone(service.process.poll())
            self.assertEqual(service.log().count("Tearing down trace"), 1)
            self.assertEqual(service.log().count("In write perf data"), 1)
            client.close()


class ResultsTest(unittest.TestCase):
    def test_directory_that_cannot_be_made_ends_the_service_with_status_1(self):
        with TracedService() as service:
            service.write_params([], trace_type="OSSignpost")  # needs no tracer
            root = service.directory / "state/root"
            root.mkdir(parents=True, exist_ok=True)
            (root / "private").write_text("in the way")
            client = start_session(service, records=False)
            client.call_later("stopReportingSessionForID", "x", REPORTER)

            status = service.process.wait(DEADLINE)

            client.close()
            self.assertEqual(status, 1)
            self.assertIn("can't create logging directory at ", service.log())
            self.assertIn("Failed to open scoresheet writer", service.log())

    def test_trace_of_signposts_writes_a_file_without_values(self):
        with TracedService() as service:
            service.write_params([], trace_type="OSSignpost")
            with traced_session(service, records=False):
                pass

            self.assertEqual(wait_for_results(service)["values"], {})


if __name__ == "__main__":
    unittest.main()
