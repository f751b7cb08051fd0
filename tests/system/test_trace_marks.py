"""The marks that requests and sessions leave in a system trace, recorded by a real LTTng."""

import contextlib
import os
import re
import subprocess
import unittest

import isolation
from harness import DEADLINE, Service, WITH_US, require, wait_for

CREATE, START, STOP, DESTROY, SEND = 0x21044814, 0x21044818, 0x2104481C, 0x21044820, 0x21044824
CREATED, STARTED, STOPPED, DESTROYED = 0x21044828, 0x2104482C, 0x21044830, 0x21044834
SENT = 0x21044838
EVENT = re.compile(r"halvox:kdebug:.*\{ code = (0x[0-9A-F]+), arg1 = (\d+), arg2 = (\d+), "
                   r"arg3 = (\d+), arg4 = (\d+) \}")


def setUpModule():
    require("lttng-sessiond", "lttng", "babeltrace2")
    isolation.enter()


class MarkedService(Service):
    """A service whose trace points are recorded by a tracer's daemon of its own."""

    def __init__(self, config=""):
        super().__init__(config + "[diagnostics]\ntrace_points = true\n", command=[str(isolation.program("halvox-reportingd"))])
        home = self.directory / "home"
        home.mkdir()
        self.trace = None
        self.tracer = {**os.environ, "HOME": str(home), "LTTNG_HOME": str(home)}
        self._environment.update({"HOME": str(home), "LTTNG_HOME": str(home)})

    def lttng(self, *arguments):
        return subprocess.run(["lttng", "--no-sessiond", "-n", *map(str, arguments)], env=self.tracer,
                              capture_output=True, text=True, timeout=DEADLINE, check=False)

    def must(self, *arguments):
        done = self.lttng(*arguments)
        if done.returncode != 0:
            raise AssertionError(done.stdout + done.stderr)

    def start_recording(self):
        """True when the tracer records. False if this build has no trace points."""
        line = wait_for("the line about trace points",
                        lambda: re.search("trace points: (.*)", self.log()))
        if line[1] != "LTTng":
            return False
        wait_for("the trace points", lambda: "halvox:kdebug" in self.lttng("list", "-u").stdout)
        for attempt in range(10):
            # Now and then the tracer's daemon declares an event before its stream, and nothing can
            # read such a trace. The fault shows as soon as the trace has been started.
            self.trace = self.directory / f"trace{attempt}"
            self.must("create", "marks", "-o", self.trace)
            self.must("enable-event", "-u", "halvox:kdebug")
            self.must("start")
            self.must("stop")
            shown = self.show_trace()
            if shown.returncode == 0:
                self.must("start")
                return True
            self.must("destroy")
        raise AssertionError(shown.stderr)

    def marks(self):
        """The codes of all marks in order. Each mark has four arguments of 0."""
        self.must("stop")
        self.must("destroy")
        done = self.show_trace()
        if done.returncode != 0:
            raise AssertionError(done.stderr)
        shown = done.stdout
        events = [EVENT.search(line) for line in shown.splitlines()]
        if not all(events) or any(event.groups()[1:] != ("0",) * 4 for event in events):
            raise AssertionError(shown)
        return [int(event[1], 16) for event in events]

    def show_trace(self):
        return subprocess.run(["babeltrace2", str(self.trace)], env=self.tracer, capture_output=True,
                              text=True, timeout=DEADLINE, check=False)


@contextlib.contextmanager
def recorded_service(config=""):
    service = MarkedService(config)
    daemon = subprocess.Popen([*WITH_US, "lttng-sessiond", "--no-kernel"], env=service.tracer,
                              stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL,
                              stderr=subprocess.DEVNULL)
    try:
        wait_for("the tracer's daemon", lambda: service.lttng("list").returncode == 0)
        with service:
            if not service.start_recording():
                raise unittest.SkipTest("this build has no trace points")
            yield service
    finally:
        daemon.terminate()
        daemon.wait(DEADLINE)


def wait_for_the_end_of(service, reporter):
    wait_for("the end of the session",
             lambda: f"deallocing this session {reporter}" in service.log())


class TraceMarksTest(unittest.TestCase):
    LOG = '[log]\nlevel = "debug"\n'

    def test_each_request_and_each_step_of_a_session_leaves_its_mark(self):
        with recorded_service(self.LOG) as service:
            client = service.client()
            client.create(7)
            client.start_later(7)
            client.send({"a": 1}, reporters=[7])
            client.stop(7)
            client.destroy(7)
            wait_for_the_end_of(service, 7)
            client.close()

            self.assertEqual(service.marks(), [
                CREATE, CREATED,
                START, STARTED,
                SEND, SENT,
                STOP, STOPPED, SENT,  # of the summary event
                DESTROY, DESTROYED])

    def test_requests_for_no_session_leave_the_marks_of_requests_alone(self):
        with recorded_service(self.LOG) as service:
            client = service.client()
            for reporter in (0, 99):
                client.call("startReportingSessionForID", "x", reporter)
                client.send({"a": 1}, reporters=[reporter])
                client.stop(reporter)
                client.destroy(reporter)
            # These have no marks.
            client.set_type(3, 99)
            client.configure({"a": 1}, 99)
            client.service_type(99)
            client.valid(99)
            client.reporters()
            client.close()

            self.assertEqual(service.marks(), [START, SEND, STOP, DESTROY] * 2)

    def test_a_client_that_leaves_has_its_sessions_stopped(self):
        with recorded_service(self.LOG) as service:
            client = service.client()
            client.create(7)
            client.start_later(7)
            client.valid(7)
            client.close()
            wait_for_the_end_of(service, 7)

            self.assertEqual(service.marks(),
                             [CREATE, CREATED, START, STARTED, STOPPED, DESTROYED])

    def test_a_single_message_leaves_its_mark_when_it_is_sent(self):
        with recorded_service(self.LOG) as service:
            client = service.client()
            client.create(7)
            client.send({"a": 1}, reporters=[7])
            wait_for("the single message", lambda: "sending single message\n" in service.log())
            client.close()
            wait_for_the_end_of(service, 7)

            self.assertEqual(service.marks(), [CREATE, CREATED, SEND, SENT, SENT, DESTROYED])


if __name__ == "__main__":
    unittest.main()
