"""A session reports the counters that daemons write to text files, exact to the channel and the
number."""

import contextlib
import shutil
import tempfile
import unittest
from pathlib import Path

from harness import Service, wait_for

GENERIC = 1
TIMES = "latency_bucket{driver=\"Actuator\",group=\"Haptics\",subgroup=\"Stats\",unit=\"us\",le="


def simple(kind, name, value, driver="Actuator", unit=""):
    """A counter or a gauge as OpenMetrics text."""
    suffix = "_total" if kind == "counter" else ""
    return (f"# TYPE {name} {kind}\n" + (f"# UNIT {name} {unit}\n" if unit else "")
            + f'{name}{suffix}{{driver="{driver}",group="Haptics",subgroup="Stats"}} {value}\n')


def counter(name, value, **more):
    return simple("counter", name, value, **more)


def gauge(name, value, **more):
    return simple("gauge", name, value, **more)


def histogram(*hits):
    """Buckets up to 500, up to 1,000, and an open one."""
    total, text = 0, "# TYPE latency histogram\n"
    for bound, more in zip(("500", "1000", "+Inf"), hits):
        total += more
        text += f'{TIMES}"{bound}"}} {total}\n'
    return text


class TextfileStatisticsTest(unittest.TestCase):
    """Each report contains the witness, which grows in every session, and whatever else was
    counted."""

    def setUp(self):
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        self.stack = stack
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-drivers-"))
        stack.callback(shutil.rmtree, self.directory, ignore_errors=True)
        self.witnessed = 1000
        self.reports = 0
        self.write("witness", counter("witness", self.witnessed))

    def write(self, name, text):
        """Writes as a daemon should: the file appears complete or not at all."""
        new = self.directory / f"{name}.prom.new"
        new.write_text(text)
        new.rename(self.directory / f"{name}.prom")

    def delete(self, name):
        (self.directory / f"{name}.prom").unlink()

    def start_service(self):
        self.service = self.stack.enter_context(Service(
            f'[drivers]\nalsa = false\npipewire = false\ntextfiles = "{self.directory}"\n'))
        self.client = self.service.client()
        self.stack.callback(self.client.close)

    def start_session(self, reporter=1):
        self.client.create(reporter)
        self.client.set_type(GENERIC, reporter)
        self.client.start_later(reporter)
        # The next request is answered after the session has started.
        self.assertTrue(self.client.valid(reporter))

    def count_witness(self):
        self.witnessed += 1
        self.write("witness", counter("witness", self.witnessed))

    def end_session(self, reporter=1):
        """The simple channels that the session reports besides the witness, without their driver."""
        self.count_witness()
        self.client.stop(reporter)
        self.client.destroy(reporter)
        self.reports += 1
        report = wait_for("a report of the witness", lambda: len(
            found := self.payloads("Simple")) >= self.reports and found)[self.reports - 1]
        counted = {key.removeprefix("Actuator_Haptics_Stats_Simple_"): value
                   for key, value in report.items() if "_Simple_" in key}
        self.assertGreater(counted.pop("witness"), 0)
        return counted

    def payloads(self, kind):
        return [payload for name, payload in self.service.events()
                if name == f"com.tarno.halvox.IOReporting.{kind}"]

    def report_of_a_session_with_level(self, before, after):
        self.write("level", before)
        self.start_service()
        self.start_session()
        self.write("level", after)
        return self.end_session()

    def test_a_gauge_that_fell_is_not_reported(self):
        self.assertEqual(self.report_of_a_session_with_level(
            gauge("level", 100), gauge("level", 40)), {})

    def test_a_gauge_that_did_not_change_is_not_reported(self):
        self.assertEqual(self.report_of_a_session_with_level(
            gauge("level", 100), gauge("level", 100)), {})

    def test_a_gauge_that_rose_is_reported_with_its_difference(self):
        self.assertEqual(self.report_of_a_session_with_level(
            gauge("level", -40), gauge("level", 100)), {"level": 140})

    def test_a_counter_that_was_reset_is_reported_with_what_it_counted_since(self):
        self.assertEqual(self.report_of_a_session_with_level(
            counter("level", 100), counter("level", 40)), {"level": 40})

    def test_a_channel_whose_unit_changes_is_not_reported_in_that_session(self):
        self.assertEqual(self.report_of_a_session_with_level(
            counter("level_s", 100, unit="s"), counter("level_s", 140, unit="ms")), {})

    def test_a_gauge_that_becomes_a_counter_is_not_reported_in_that_session(self):
        self.assertEqual(self.report_of_a_session_with_level(
            gauge("level", 100), counter("level", 140)), {})

    def test_a_file_that_is_half_written_at_the_start_is_not_reported_in_that_session(self):
        self.write("level", counter("level", 100))
        self.start_service()
        self.write("level", "# TYPE level counter\nlevel_tot")
        self.start_session()
        self.write("level", counter("level", 140))
        self.assertEqual(self.end_session(), {})

        self.start_session()
        self.write("level", counter("level", 142))
        self.assertEqual(self.end_session(), {"level": 2})

    def test_a_file_that_is_added_is_not_reported_before_the_service_starts_again(self):
        self.start_service()
        self.start_session()
        self.write("level", counter("level", 100))
        self.assertEqual(self.end_session(), {})
        self.start_session()
        self.write("level", counter("level", 140))
        self.assertEqual(self.end_session(), {})

        self.client.close()
        self.service.stop()
        self.reports = 0
        self.start_service()
        self.start_session()
        self.write("level", counter("level", 142))
        self.assertEqual(self.end_session(), {"level": 2})

    def test_a_driver_that_is_added_to_a_file_is_not_reported_before_the_service_starts_again(self):
        self.write("level", counter("level", 100))
        self.start_service()
        second = counter("other", 100, driver="Second")
        self.write("level", counter("level", 100) + second)
        self.start_session()
        self.write("level", counter("level", 101) + second.replace(" 100\n", " 140\n"))

        self.assertEqual(self.end_session(), {"level": 1})

    def report_of_a_session_whose_file_is_written_again(self, value, while_deleted=lambda: None):
        """The file is deleted during the session, and then written with the value."""
        self.write("level", counter("level", 100))
        self.start_service()
        self.start_session()
        self.delete("level")
        while_deleted()
        self.write("level", counter("level", value))
        return self.end_session()

    def test_a_file_that_is_deleted_and_written_again_is_not_reported_in_that_session(self):
        for value in (40, 140):
            with self.subTest(value):
                # The start of the second session reads the drivers, but without the file.
                self.assertEqual(self.report_of_a_session_whose_file_is_written_again(
                    value, while_deleted=lambda: self.start_session(2)), {})

                self.start_session()
                self.write("level", counter("level", value + 2))
                self.assertEqual(self.end_session(), {"level": 2})
                self.reports = 0

    def test_a_file_that_is_deleted_and_written_again_unseen_is_not_reported_in_that_session(self):
        for value in (40, 140):
            with self.subTest(value):
                self.assertEqual(self.report_of_a_session_whose_file_is_written_again(value), {})
                self.reports = 0

    def test_sessions_of_milliseconds_each_report_what_was_counted_and_nothing_else(self):
        sessions = 40
        self.start_service()
        for session in range(sessions):
            self.start_session()
            self.count_witness()
            self.client.stop(1)
            # This growth is between two sessions and belongs to neither of them.
            self.witnessed += 100
            self.write("witness", counter("witness", self.witnessed))

        reports = wait_for("all reports", lambda: len(
            found := self.payloads("Simple")) >= sessions and found)
        self.assertEqual([report["Actuator_Haptics_Stats_Simple_witness"] for report in reports],
                         [1] * sessions)

    def report_of_a_histogram(self, before, after):
        self.write("latency", histogram(*before))
        self.start_service()
        self.start_session()
        self.write("latency", histogram(*after))
        self.end_session()
        # The histograms follow the simple channels, perhaps in a later commit of the store.
        reports = wait_for("a report of the histogram", lambda: self.payloads("Histogram"))
        return [payload["Actuator_Haptics_Stats_Histogram_latency"] for payload in reports]

    def test_the_extremes_of_a_histogram_are_those_of_the_buckets_that_grew(self):
        self.assertEqual(self.report_of_a_histogram((5, 7, 9), (5, 10, 9)), [
            "count=3,lower=0,upper=9223372036854775807,min=500,max=1000,unit=us::500-1000:3"])

    def test_the_greatest_value_above_all_bounds_is_the_highest_bound(self):
        self.assertEqual(self.report_of_a_histogram((5, 7, 9), (6, 7, 10)), [
            "count=3,lower=0,upper=9223372036854775807,min=0,max=1000,unit=us::"
            "0-500:1;1000-9223372036854775807:1"])

    def test_a_group_that_appears_is_not_reported_before_the_service_starts_again(self):
        rx = 'frames_total{driver="Actuator",group="Rx",subgroup="Stats"}'
        self.start_service()
        self.write("rx", f"# TYPE frames counter\n{rx} 100\n")
        self.start_session()
        self.write("rx", f"# TYPE frames counter\n{rx} 140\n")
        self.assertEqual(self.end_session(), {})


if __name__ == "__main__":
    unittest.main()
