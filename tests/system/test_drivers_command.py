"""Counters that drivers write to text files are shown by `halvoxctl drivers` and sent at a
session's end."""

import contextlib
import json
import os
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

from harness import CTL, DEADLINE, Service, stop_process, wait_for

PAGE = Path(__file__).resolve().parents[2] / "docs/driver-statistics.md"
GENERIC = 1


def configuration(directory):
    return f'[drivers]\nalsa = false\npipewire = false\ntextfiles = "{directory}"\n'


def write(directory, text):
    """Writes as a daemon should: the file appears complete or not at all."""
    new = directory / "haptics.prom.new"
    new.write_text(text)
    new.rename(directory / "haptics.prom")


def pulses(count):
    return ("# TYPE pulses counter\n"
            f'pulses_total{{driver="Actuator<0x1>",group="Haptics",subgroup="Stats"}} {count}\n')


class DriversCommandTest(unittest.TestCase):
    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-drivers-"))
        self.addCleanup(shutil.rmtree, self.directory, ignore_errors=True)
        config = self.directory / "halvox.toml"
        config.write_text(configuration(self.directory))
        self.environment = {**os.environ, "HALVOX_CONFIG": str(config)}

    def show(self, *arguments):
        result = subprocess.run([CTL, "--json", "drivers", *arguments], capture_output=True, text=True,
                                timeout=DEADLINE, env=self.environment)
        self.assertEqual((result.returncode, result.stderr), (0, ""))
        return [json.loads(line) for line in result.stdout.splitlines()]

    def watch(self, *arguments):
        command = subprocess.Popen([CTL, "--json", "drivers", "--watch", *arguments],
                                   stdout=subprocess.PIPE, text=True, env=self.environment)
        self.addCleanup(stop_process, command)
        self.addCleanup(command.stdout.close)
        return command

    def test_the_example_for_other_daemons_gives_the_channels_that_it_should(self):
        write(self.directory, PAGE.read_text().split("<<'EOF'\n")[1].split("EOF\n")[0] + "EOF\n")

        channels = self.show("--group", "Haptics")

        self.assertEqual({(channel["driver"], channel["group"], channel["subgroup"])
                          for channel in channels}, {("ExampleActuator", "Haptics", "Stats")})
        self.assertEqual({channel["channel"]: channel["format"] for channel in channels},
                         {"Pulses": "simple", "latency": "histogram", "motor": "state"})
        by_name = {channel["channel"]: channel for channel in channels}
        self.assertEqual(by_name["Pulses"]["value"], 42)
        self.assertEqual([bucket["hits"] for bucket in by_name["latency"]["buckets"]], [30, 11, 1])
        self.assertEqual([state["residency"] for state in by_name["motor"]["states"]], [1260, 98740])

    def test_only_the_channels_of_the_group_are_shown(self):
        write(self.directory, pulses(7) + '# TYPE level gauge\nlevel{group="Rx"} 1\n')

        self.assertEqual([channel["group"] for channel in self.show("--group", "Rx")], ["Rx"])
        self.assertEqual(len(self.show()), 2)

    def test_watching_shows_the_change_per_second_until_the_output_is_closed(self):
        write(self.directory, pulses(1000))
        command = self.watch("0.05")
        # The first line shows that watching has begun. Changes after it are shown.
        self.assertEqual(json.loads(command.stdout.readline())["value"], 0)
        write(self.directory, pulses(1600))

        # The number of lines may vary, but each change is in one of them. Therefore their sum is
        # exact.
        changes = []
        wait_for("600 pulses to be shown", lambda: changes.append(
            (line := json.loads(command.stdout.readline()))["value"] * line["seconds"])
            or sum(changes) > 599, pause=0)
        changes += [json.loads(command.stdout.readline())["value"] for _ in range(3)]

        self.assertAlmostEqual(sum(changes), 600, delta=0.01)
        self.assertEqual(sum(change > 0 for change in changes), 1)
        command.stdout.close()
        self.assertEqual(command.wait(DEADLINE), 0)

    def test_a_wrong_file_is_named_with_its_line_and_the_others_are_shown(self):
        write(self.directory, pulses(7))
        (self.directory / "wrong.prom").write_text("# TYPE a counter\na_total -1\n")

        result = subprocess.run([CTL, "drivers"], capture_output=True, text=True, timeout=DEADLINE,
                                env=self.environment)

        self.assertEqual(result.stdout, "Actuator<0x1>  Haptics  Stats  pulses  7\n")
        self.assertIn(f"{self.directory / 'wrong.prom'}:2: ", result.stderr)
        self.assertEqual(len(result.stderr.splitlines()), 1)


class TextfileReportTest(unittest.TestCase):
    def test_a_session_reports_what_a_daemon_counted_while_it_ran(self):
        with contextlib.ExitStack() as stack:
            directory = Path(tempfile.mkdtemp(prefix="halvox-drivers-"))
            stack.callback(shutil.rmtree, directory, ignore_errors=True)
            write(directory, pulses(1000))
            service = stack.enter_context(Service(configuration(directory)))
            client = service.client()
            stack.callback(client.close)
            client.create(1)
            client.set_type(GENERIC, 1)
            client.start_later(1)
            self.assertTrue(client.valid(1))

            write(directory, pulses(1042))
            client.stop(1)

            payload = wait_for("the report", lambda: dict(service.events()).get(
                "com.tarno.halvox.IOReporting.Simple"))
            self.assertEqual(payload["Actuator_Haptics_Stats_Simple_pulses"], 42)


if __name__ == "__main__":
    unittest.main()
