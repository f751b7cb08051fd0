"""The tracer's daemon that a service started ends with the service, however the service ends."""

import os
import signal
import unittest

from harness import DEADLINE, wait_for
from tracing import (REPORTER, TracedService, children_of, is_running,
                     require_tracer, start_session, traced_session, wait_for_results)


def setUpModule():
    require_tracer()


class EndOfServiceTest(unittest.TestCase):
    def start_trace(self, service):
        """A traced session. Yields its client, and the daemon with all processes that it started."""
        client = start_session(service)
        daemon = service.daemon()
        self.assertTrue(is_running(daemon))
        return client, [daemon, *(pid for pid, _ in children_of(daemon))]

    def assert_gone(self, service, processes):
        for process in processes:
            wait_for("the end of the tracer's processes", lambda: not is_running(process))
        wait_for("the note of the daemon to be deleted", lambda: not service.note.exists())

    def test_daemon_ends_with_a_service_that_cannot_write_its_results(self):
        with TracedService() as service:
            root = service.directory / "state/root"
            root.mkdir(parents=True, exist_ok=True)
            (root / "private").write_text("in the way")
            client, processes = self.start_trace(service)
            client.call_later("stopReportingSessionForID", "x", REPORTER)

            self.assertEqual(service.process.wait(DEADLINE), 1)

            client.close()
            self.assert_gone(service, processes)

    def test_daemon_ends_with_a_service_that_a_client_ends(self):
        with TracedService() as service:
            client, processes = self.start_trace(service)
            client.call_later("killService")

            self.assertEqual(service.process.wait(DEADLINE), 2)

            client.close()
            self.assert_gone(service, processes)

    def test_daemon_ends_with_a_service_that_is_killed_or_crashes(self):
        for how in (signal.SIGKILL, signal.SIGSEGV):
            with self.subTest(how.name), TracedService() as service:
                client, processes = self.start_trace(service)

                service.stop(how)

                client.close()
                self.assert_gone(service, processes)

    def test_daemon_that_hangs_ends_with_a_service_that_is_killed(self):
        with TracedService() as service:
            client, processes = self.start_trace(service)
            os.kill(processes[0], signal.SIGSTOP)

            service.stop(signal.SIGKILL)

            client.close()
            self.assert_gone(service, processes)

    def test_daemon_that_others_use_loses_only_the_sessions_of_a_killed_service(self):
        with TracedService() as service:
            client, processes = self.start_trace(service)
            self.assertEqual(service.lttng("create", "other").returncode, 0)

            service.stop(signal.SIGKILL)

            client.close()
            wait_for("the service's sessions to be destroyed", lambda: ") halvox-" not in service.sessions())
            self.assertIn("other", service.sessions())
            self.assertTrue(is_running(processes[0]))

            # The next service takes the daemon over and keeps the same promise.
            self.assertEqual(service.lttng("destroy", "other").returncode, 0)
            service.start()
            self.assertEqual(service.daemon(), processes[0])
            service.stop(signal.SIGKILL)
            self.assert_gone(service, processes)

    def test_trace_of_the_next_service_does_not_meet_the_daemon_that_ends(self):
        with TracedService() as service:
            client, processes = self.start_trace(service)
            service.stop(signal.SIGKILL)
            client.close()

            service.start()
            with traced_session(service):
                service.run_client("intervals", 1)

            self.assertIn("Own0", wait_for_results(service)["values"])
            self.assertNotEqual(service.daemon(), processes[0])


if __name__ == "__main__":
    unittest.main()
