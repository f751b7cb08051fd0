"""Optional parts: a service that needs none of them maps none, and it logs which one is missing."""

import os
import re
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

import harness
from harness import BIN, SERVICE, Service, WITH_US, start_session, wait_for

EX_CONFIG = 78
REPORTER = 7
NATS, TRACING, PIPEWIRE = "halvox-link-nats.so", "halvox-tracing-lttng.so", "halvox-drivers-pipewire.so"
# No server listens there.
NATS_CONFIG = '[link]\nbackend = "nats"\nservers = ["nats://127.0.0.1:1"]\n'
TRACING_CONFIG = "[features.Acoustat]\nTracing = true\n"
KDEBUG = "halvox-kdebug-lttng.so"
HEAVY = ("libnats", "libssl", "libcrypto", "libbabeltrace2", "liblttng-ctl", "liblttng-ust.so", "libpipewire",
         NATS, TRACING, KDEBUG, PIPEWIRE)


def mapped(service):
    """The names of the files that the running service maps."""
    maps = Path(f"/proc/{service.process.pid}/maps").read_text()
    return {Path(line.split(maxsplit=5)[5]).name for line in maps.splitlines() if "/" in line}


def heavy(service):
    """Which of the optional libraries the running service maps."""
    names = mapped(service)
    return [library for library in HEAVY if any(name.startswith(library) for name in names)]


def wait_for_line(service, pattern):
    """The log has a thread of its own: a service may be ready before its lines are written."""
    wait_for(f"the line {pattern}", lambda: re.search(pattern, service.log()))


class ModulesTest(unittest.TestCase):
    def service(self, config="", **options):
        service = Service(config, **options)
        self.addCleanup(service.__exit__, None, None, None)
        return service

    def require(self, module):
        if not (BIN / module).exists():
            self.skipTest(f"{module} is not in this build")

    def test_a_service_in_default_configuration_maps_no_optional_library(self):
        service = self.service().start()

        self.assertEqual(heavy(service), [])
        wait_for_line(service, "traces: none, features.Acoustat.Tracing is not true")
        wait_for_line(service, "trace points: none, diagnostics.trace_points is not true")

    def test_trace_points_are_loaded_when_they_are_configured(self):
        self.require(KDEBUG)

        service = self.service("[diagnostics]\ntrace_points = true\n").start()

        self.assertEqual(heavy(service), ["liblttng-ust.so", KDEBUG])
        wait_for_line(service, "trace points: LTTng")

    def test_the_link_to_nats_is_loaded_when_it_is_configured(self):
        self.require(NATS)

        service = self.service(NATS_CONFIG).start()

        self.assertEqual(heavy(service), ["libnats", "libssl", "libcrypto", NATS])

    def test_the_tracer_is_loaded_when_tracing_is_enabled(self):
        self.require(TRACING)

        service = self.service(TRACING_CONFIG).start()

        # The service's own trace points are a part that can be missing.
        trace_points = ["liblttng-ust.so"], [KDEBUG]
        library, module = trace_points if (BIN / KDEBUG).exists() else ([], [])
        self.assertEqual(heavy(service), ["libbabeltrace2", "liblttng-ctl", *library, TRACING, *module])
        wait_for_line(service, "traces: LTTng")

    def test_the_tracer_is_loaded_when_an_earlier_service_left_a_recording(self):
        self.require(TRACING)
        service = self.service()
        scratch = service.directory / "state/traces/scratch"
        scratch.mkdir(parents=True)

        service.start()

        self.assertIn(TRACING, heavy(service))
        self.assertFalse(scratch.exists())

    def test_pipewire_is_loaded_when_the_first_session_starts(self):
        self.require(PIPEWIRE)
        service = self.service().start()
        self.assertEqual(heavy(service), [])

        start_session(self, service, REPORTER)

        wait_for("PipeWire's library", lambda: heavy(service) == ["libpipewire", PIPEWIRE])
        self.assertNotIn("did not answer within", service.log())

    def test_pipewire_is_loaded_at_the_start_when_there_is_a_server(self):
        self.require(PIPEWIRE)
        service = self.service()
        # No server answers there, but the service cannot know before it has tried.
        (service.directory / "pipewire-0").touch()

        service.start()

        self.assertEqual(heavy(service), ["libpipewire", PIPEWIRE])

    def test_pipewire_is_not_loaded_when_its_counters_are_switched_off(self):
        service = self.service("[drivers]\npipewire = false\n").start()

        client = start_session(self, service, REPORTER)
        client.send({"number": 1}, reporters=[REPORTER])
        service.wait_for_events(2)

        self.assertEqual(heavy(service), [])


class MissingModulesTest(unittest.TestCase):
    """The service without any module, as a package without the optional parts installs it."""

    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-modules-"))
        self.addCleanup(shutil.rmtree, self.directory, True)
        (self.directory / "bin").mkdir()
        self.program = self.directory / "bin" / SERVICE.name
        # A link would lead back to the modules.
        shutil.copy(SERVICE, self.program)

    def service(self, config=""):
        service = Service(config, command=[str(self.program)])
        self.addCleanup(service.__exit__, None, None, None)
        return service

    def assert_serves(self, service):
        client = service.client()
        self.addCleanup(client.close)
        client.create(REPORTER)
        client.send({"number": 1}, reporters=[REPORTER])
        service.wait_for_events(2)

    def test_the_service_starts_and_says_what_is_missing(self):
        service = self.service(TRACING_CONFIG).start()

        self.assert_serves(service)
        wait_for_line(service, "trace points: none, halvox-kdebug-lttng.so: .*No such file")
        wait_for_line(service, "traces: none, features.Acoustat.Tracing = true needs "
                               "halvox-tracing-lttng.so: .*No such file")
        wait_for_line(service, "drivers.pipewire = true needs halvox-drivers-pipewire.so: .*No such "
                               "file.*; PipeWire's counters are disabled until the next start")

    def test_the_link_to_nats_without_its_module_is_an_error(self):
        service = self.service(NATS_CONFIG)

        result = subprocess.run(WITH_US + [str(self.program)],
                                env={**os.environ, "HALVOX_CONFIG": str(service.config)},
                                capture_output=True, text=True, timeout=harness.DEADLINE, check=False)

        self.assertEqual(result.returncode, EX_CONFIG, result.stderr)
        self.assertIsNotNone(re.search(r'link.backend = "nats" needs halvox-link-nats.so: '
                                       r".*halvox-link-nats.so.*No such file", result.stderr),
                             result.stderr)
        self.assertFalse((service.directory / "state").exists())


if __name__ == "__main__":
    unittest.main()
