"""The start of a traced session delays no other client, whatever the tracer's daemon does."""

import contextlib
import select
import socket
import time
import unittest

from harness import DEADLINE, wait_for
from tracing import REPORTER, TEST, TracedService, require_tracer

# Seconds that a start may add to the worst answer. A service that waits for its tracer adds at least
# seven times as much.
BOUND = 0.050
TRIES = 5  # a busy machine may spoil all but one
REQUESTS = 100  # the least number of requests in a measurement
STARTS_WITHIN = 5.0  # seconds, after which the measurement ends in any case


def setUpModule():
    require_tracer()


@contextlib.contextmanager
def silent_daemon(service):
    """Takes the place of the daemon: accepts connections and never answers.

    Yields a function that returns after the service has connected.
    """
    directory = service.home / ".lttng"
    directory.mkdir()
    with contextlib.ExitStack() as stack:
        listener = stack.enter_context(socket.socket(socket.AF_UNIX, socket.SOCK_STREAM))
        listener.bind(str(directory / "client-lttng-sessiond"))
        listener.listen(16)

        def asked():
            """True when a connection with a request in it stays open."""
            while select.select([listener], [], [], 0)[0]:
                connection = stack.enter_context(listener.accept()[0])
                connection.settimeout(DEADLINE)
                if connection.recv(1):
                    return True
            return False

        yield asked


class StartTest(unittest.TestCase):
    def worst_answer(self, client, goes_on):
        """The longest of at least REQUESTS waits for an answer, in seconds."""
        worst = 0.0
        requests = 0
        while requests < REQUESTS or goes_on():
            begin = time.monotonic()
            client.reporters()
            worst = max(worst, time.monotonic() - begin)
            requests += 1
        return worst

    def wait_added_by_a_start(self, service, trace_type, has_started):
        """By how many seconds the longest wait of another client, until has_started(), exceeds twice
        its longest wait before the start. A busy machine makes both longer."""
        client = service.client()
        other = service.client()
        before = self.worst_answer(other, lambda: False)
        client.create(REPORTER)
        client.set_type(TEST, REPORTER)
        client.configure({"HVReportingMeridelPlistFilePath": str(service.params),
                          "HVReportingTraceType": trace_type}, REPORTER)
        client.start_later(REPORTER)
        end = time.monotonic() + STARTS_WITHIN
        worst = self.worst_answer(other, lambda: not has_started() and time.monotonic() < end)
        client.close()
        other.close()
        return worst - 2 * before

    def assert_others_are_answered(self, trace_type, measure):
        """measure(service) measures one start. The best of some tries must be within the bound."""
        added = []
        while len(added) < TRIES and min(added, default=1) > BOUND:
            with TracedService() as service:
                added.append(measure(service))
        self.assertLess(min(added), BOUND, f"{trace_type}: {added}")

    def test_healthy_daemon(self):
        for trace_type in ("ktrace", "artrace"):
            with self.subTest(trace_type):
                self.assert_others_are_answered(
                    trace_type, lambda service: self.wait_added_by_a_start(
                        service, trace_type, service.recordings))

    def test_missing_daemon(self):
        failures = {"ktrace": "Could not start ktrace session", "artrace": "kqTraceDidStart "}
        for trace_type, failure in failures.items():
            def measure(service):
                service.stop()
                service.use_only()
                service.start()
                return self.wait_added_by_a_start(
                    service, trace_type, lambda: failure in service.log())

            with self.subTest(trace_type):
                self.assert_others_are_answered(trace_type, measure)

    def test_daemon_that_accepts_and_never_answers(self):
        for trace_type in ("ktrace", "artrace"):
            def measure(service):
                with silent_daemon(service) as asked:
                    return self.wait_added_by_a_start(service, trace_type, asked)

            with self.subTest(trace_type):
                self.assert_others_are_answered(trace_type, measure)

    def test_daemon_that_never_accepts(self):
        for trace_type in ("ktrace", "artrace"):
            def measure(service):
                service.stop()
                service.use_only(lttng_sessiond="exec /bin/sleep 1000")
                service.start()
                return self.wait_added_by_a_start(service, trace_type, service.daemon)

            with self.subTest(trace_type):
                self.assert_others_are_answered(trace_type, measure)


class OrderTest(unittest.TestCase):
    def test_stop_is_carried_out_after_a_start_that_takes_its_time(self):
        with TracedService() as service:
            with silent_daemon(service) as asked:
                client = service.client()
                client.create(REPORTER)
                client.set_type(TEST, REPORTER)
                client.configure({"HVReportingMeridelPlistFilePath": str(service.params),
                                  "HVReportingTraceType": "ktrace"}, REPORTER)
                client.start_later(REPORTER)
                wait_for("the service's question", asked)
                stop = client.call_later("stopReportingSessionForID", "x", REPORTER)
                wait_for("the stop", lambda: f"ending session {REPORTER}" in service.log())
                self.assertNotIn("Tearing down trace", service.log())
            # The daemon has ended, and the start fails.
            stop.wait()
            client.close()

            log = service.log()
            self.assertLess(log.index("Starting tracing: T"),
                            log.index("Could not start ktrace session"))
            self.assertLess(log.index("Could not start ktrace session"),
                            log.index("Tearing down trace :  T"))


if __name__ == "__main__":
    unittest.main()
