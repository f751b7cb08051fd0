"""halvoxctl top: its screen at a terminal, its batches, and what they cost the service."""

import contextlib
import fcntl
import json
import os
import pty
import shutil
import signal
import struct
import subprocess
import termios
import unittest
from pathlib import Path

import audio
from harness import BIN, CTL, DEADLINE, OBJECT, WITH_US, Service, stop_process, wait_for

try:
    import pyte
except ImportError:
    pyte = None

SESSION_PLAYBACK = 0x08000004
ROUTE_CHANGE, VOLUME = 10, 14
START, STOP, ISSUE, STATE = 1, 2, 7, 18
CONFIG = "[drivers]\nalsa = false\npipewire = false\n"
DEVICE = """\
# TYPE quantum gauge
quantum{driver="demo-speakers",group="Clock"} 256
# TYPE rate gauge
rate{driver="demo-speakers",group="Clock"} 48000
# TYPE xruns counter
xruns_total{driver="demo-speakers",group="Speaker"} %d
# EOF
"""


class Terminal:
    """A terminal with halvoxctl top on it. What it shows is in lines()."""

    def __init__(self, service, *arguments, columns=80, lines=24, environment=None,
                 program=CTL):
        self._ours, theirs = pty.openpty()
        self.screen = pyte.Screen(columns, lines)
        self._stream = pyte.ByteStream(self.screen)
        self.bytes = b""
        self._set_size(columns, lines)
        inherited = {name: value for name, value in os.environ.items() if name != "NO_COLOR"}
        self.process = subprocess.Popen(
            [*WITH_US, str(program), "top", "--interval", "100ms", *arguments],
            stdin=theirs, stdout=theirs, stderr=subprocess.PIPE,
            env={**inherited, "TERM": "linux", "LC_ALL": "C.UTF-8",
                 "HALVOX_CONFIG": str(service.config), **(environment or {})})
        os.close(theirs)
        os.set_blocking(self._ours, False)

    def _set_size(self, columns, lines):
        fcntl.ioctl(self._ours, termios.TIOCSWINSZ, struct.pack("HHHH", lines, columns, 0, 0))

    def resize(self, columns, lines):
        self._set_size(columns, lines)
        self.screen.resize(lines, columns)
        self.process.send_signal(signal.SIGWINCH)

    def press(self, keys):
        os.write(self._ours, keys.encode())

    def lines(self):
        with contextlib.suppress(BlockingIOError, OSError):  # nothing yet, or the other side has ended
            while piece := os.read(self._ours, 65536):
                self.bytes += piece
                self._stream.feed(piece)
        return self.screen.display

    def wait_for(self, what, matches):
        """Waits until matches(text of the screen) is true. Returns the lines of the screen."""
        def shown():
            lines = self.lines()
            return list(lines) if matches("\n".join(lines)) else None
        try:
            return wait_for(what, shown)
        except AssertionError:
            raise AssertionError(f"timed out waiting for {what}; the screen is\n"
                                 + "\n".join(self.lines())) from None

    def wait_for_text(self, text):
        return self.wait_for(repr(text), lambda shown: text in shown)

    def end(self):
        """Waits for the end of the program, and returns its exit status."""
        return wait_for("the end of halvoxctl top",
                        lambda: (self.lines(), self.process.poll())[1] is not None
                        and (self.process.returncode,))[0]

    def close(self):
        if self.process.poll() is None:
            stop_process(self.process)
        self.process.stderr.close()
        os.close(self._ours)


class WithService(unittest.TestCase):
    def setUp(self):
        self.service = Service(CONFIG)
        self.service.__enter__()
        self.addCleanup(self.service.__exit__)
        self.client = self.service.client()
        self.addCleanup(self.client.close)

    def begin(self, session, application="player", volume=0.5):
        self.client.create(session)
        self.client.set_type(7, session)
        self.client.configure({"HostApplicationDisplayID": application}, session)
        self.client.start_later(session)
        self.client.send({"run": 1}, SESSION_PLAYBACK, START, [session])
        self.client.send({"active_devices": "Demo speakers", "device_node_names": ["demo-speakers"]},
                         ROUTE_CHANGE, STATE, [session])
        self.client.send({"RQSessionVolume": volume, "RQSessionVolumePlayingState": 1}, VOLUME, STATE,
                         [session])

    def xrun(self, session, milliseconds):
        self.client.send({"issue_type": "xrun", "xrun_milliseconds": milliseconds, "missed_cycles": 1,
                          "device_node_name": "demo-speakers"}, SESSION_PLAYBACK, ISSUE, [session])

    def write_device(self, xruns):
        drivers = self.service.directory / "state/drivers"
        drivers.mkdir(exist_ok=True)
        (drivers / "new").write_text(DEVICE % xruns)
        (drivers / "new").rename(drivers / "demo.prom")

    def run_top(self, *arguments, status=0, environment=None):
        result = subprocess.run(
            [CTL, "top", *map(str, arguments)], capture_output=True, text=True, check=False,
            timeout=DEADLINE, stdin=subprocess.DEVNULL,
            env={**os.environ, "HALVOX_CONFIG": str(self.service.config), **(environment or {})})
        self.assertEqual(result.returncode, status, result.stderr)
        return result

    def batches(self, *arguments):
        return [json.loads(line) for line in self.run_top("--json", *arguments).stdout.splitlines()]


@unittest.skipIf(pyte is None, "python3-pyte is not installed")
@unittest.skipUnless((BIN / "halvoxctl-screen.so").exists(), "halvoxctl-screen.so is not in this build")
class ScreenTest(WithService):
    def terminal(self, *arguments, **more):
        terminal = Terminal(self.service, *arguments, **more)
        self.addCleanup(terminal.close)
        return terminal

    def test_streams_devices_and_the_service_are_shown_as_they_change(self):
        terminal = self.terminal()
        terminal.wait_for_text("clients 1")
        self.write_device(0)
        self.begin(7)
        terminal.wait_for_text("player")
        lines = terminal.wait_for_text("running")
        stream = next(line for line in lines if line.startswith("player"))
        for word in ("longformaudio", "playback", "Demo speakers", "0.50"):
            self.assertIn(word, stream)
        self.assertIn("sessions 1", "\n".join(lines))
        lines = terminal.wait_for_text("48000")
        device = next(line for line in lines if "48000" in line)
        self.assertEqual(device.split()[:4], ["Demo", "speakers", "256", "48000"])

        self.xrun(7, 20)
        terminal.wait_for_text("1 (20 ms)")
        self.write_device(3)
        terminal.wait_for("the xruns of the device", lambda text: any(
            line.startswith("Demo speakers") and line.split()[5] == "3" for line in text.split("\n")))
        self.client.send({"run": 1}, SESSION_PLAYBACK, STOP, [7])
        terminal.wait_for_text("paused")
        self.client.stop(7)
        self.client.destroy(7)
        terminal.wait_for("the end of the stream", lambda text: "player" not in text)
        terminal.wait_for_text("sessions 0")

        terminal.press("q")
        self.assertEqual(terminal.end(), 0)

    def test_keys_sort_pause_and_explain(self):
        terminal = self.terminal()
        self.begin(7, "aardvark", 0.25)
        self.begin(8, "zebra", 0.75)
        self.xrun(8, 20)

        def order(text):
            return [line.split()[0] for line in text.split("\n")
                    if line.startswith(("aardvark", "zebra"))]
        terminal.wait_for("the worst first", lambda text: order(text) == ["zebra", "aardvark"])
        terminal.press("a")
        terminal.wait_for("the names in order", lambda text: order(text) == ["aardvark", "zebra"])
        terminal.press("r")
        terminal.wait_for("the names in reverse", lambda text: order(text) == ["zebra", "aardvark"]
                          and "sort: app, reversed" in text)
        terminal.press("v")
        terminal.wait_for("the loudest first", lambda text: order(text) == ["zebra", "aardvark"])

        terminal.press("p")
        lines = terminal.wait_for_text("PAUSED")
        self.client.create(9)
        terminal.press("?")
        terminal.wait_for_text("reverse the order")
        terminal.press("x")  # only leaves the help
        self.assertEqual(terminal.wait_for_text("sort: volume")[0], lines[0])
        terminal.press(" ")
        terminal.wait_for_text("sessions 3")
        terminal.press("q")
        self.assertEqual(terminal.end(), 0)

    def test_the_screen_follows_the_size_of_the_terminal(self):
        self.begin(7)
        terminal = self.terminal()
        terminal.wait_for_text("longformaudio")
        for columns, lines in ((40, 12), (200, 60), (20, 4), (80, 24)):
            terminal.resize(columns, lines)
            shown = terminal.wait_for(f"{columns}x{lines}", lambda text: text.split("\n")[-1].startswith("q quit"))
            self.assertEqual(len(shown), lines)
        terminal.wait_for_text("longformaudio")
        terminal.press("q")
        self.assertEqual(terminal.end(), 0)

    def test_names_of_clients_cannot_break_the_screen(self):
        names = ["\x1b[2J\x1b[H\x07evil\r\n", "\u202egnp.exe", "漢字" * 40, "e\u0301" * 3000, "x" * 10_000,
                 "\U0001f3b5" * 100, "\u0085\u009b31m\u2028next"]
        for number, name in enumerate(names):
            self.begin(number + 1, name)
        terminal = self.terminal(columns=60, lines=24)
        lines = terminal.wait_for("all streams", lambda text: text.count("running") == len(names))

        headings = [number for number, line in enumerate(lines) if line.startswith("APP ")]
        self.assertEqual(len(headings), 1)
        rows = lines[headings[0] + 1:headings[0] + 1 + len(names)]
        self.assertTrue(all("running" in row for row in rows), rows)
        self.assertTrue(lines[-1].startswith("q quit"), lines[-1])
        self.assertTrue(any(row.startswith("\\u001b[2J") for row in rows), rows)
        for character in ("\u202e", "\u009b", "\u2028", "\x07"):
            self.assertNotIn(character.encode(), terminal.bytes)

    def test_colours_are_used_unless_the_user_wants_none(self):
        self.begin(7)
        self.xrun(7, 20)
        for environment, isColoured in (({}, True), ({"NO_COLOR": "1"}, False), ({"TERM": "vt100"}, False)):
            terminal = self.terminal(environment=environment)
            terminal.wait_for_text("1 (20 ms)")
            self.assertEqual(b"\x1b[31m" in terminal.bytes or b";31m" in terminal.bytes, isColoured,
                             environment)
            terminal.press("q")
            self.assertEqual(terminal.end(), 0)

    def test_a_terminal_without_utf_8_gets_ascii(self):
        self.begin(7, "naïve")
        terminal = self.terminal(environment={"LC_ALL": "C"})
        terminal.wait_for_text("na?ve")
        self.assertEqual([byte for byte in terminal.bytes if byte >= 0x80], [])

    def test_a_terminal_that_cannot_place_the_cursor_gets_batches(self):
        for kind in ("dumb", "no-such-terminal"):
            terminal = self.terminal("--count", "1", environment={"TERM": kind})
            self.assertEqual(terminal.end(), 0)
            self.assertIn(b"printing batches", terminal.process.stderr.read())
            self.assertIn(b"clients", terminal.bytes)
            self.assertNotIn(b"\x1b", terminal.bytes)

    def test_without_the_module_of_the_screen_there_are_batches(self):
        program = self.service.directory / "halvoxctl"
        shutil.copy(CTL, program)
        terminal = self.terminal("--count", "1", program=program)
        self.assertEqual(terminal.end(), 0)
        self.assertRegex(terminal.process.stderr.read().decode(),
                         "the screen needs halvoxctl-screen.so: .*; printing batches")
        self.assertIn(b"clients", terminal.bytes)

    def test_a_restart_of_the_service_is_shown(self):
        terminal = self.terminal()
        self.begin(7)
        terminal.wait_for_text("player")
        self.service.stop()
        terminal.wait_for("the loss of the service",
                          lambda text: "clients" not in text and "player" not in text)
        self.service.start()
        client = self.service.client()
        self.addCleanup(client.close)
        terminal.wait_for_text("clients 1")
        self.client = client
        self.begin(8, "another")
        terminal.wait_for_text("another")


class BatchTest(WithService):
    def test_an_output_that_is_no_terminal_gets_batches(self):
        self.begin(7)
        wait_for("the stream", lambda: "player" in self.run_top("--interval", "100ms", "--count", 1).stdout)

        text = self.run_top("--interval", "0.1s", "--count", 2).stdout

        self.assertEqual(text.count("APP"), 2)
        self.assertNotIn("\x1b", text)
        self.assertIn("clients 1", text)

    def test_json_has_one_object_for_each_batch(self):
        self.begin(7)
        batch = wait_for("the stream", lambda: (
            found := self.batches("--interval", "100ms", "--count", 2)) and found[1]["streams"]
            and found)[1]

        stream = batch["streams"][0]
        self.assertEqual((stream["session_id"], stream["application"], stream["state"],
                          stream["volume"]), (7, "player", "running", 0.5))
        service = batch["service"]
        self.assertEqual((service["connected"], service["clients"], service["sessions"]), (True, 1, 1))
        self.assertIsNotNone(service["messages_per_second"])
        self.assertGreater(service["store_bytes"], 0)
        self.assertAlmostEqual(batch["seconds"], 0.1, delta=5)

    def test_what_the_service_suppresses_is_shown_with_its_reason(self):
        self.begin(7)
        for _ in range(3):
            self.client.send({"same": 1}, SESSION_PLAYBACK, STATE, [7])

        losses = wait_for("the suppressed messages", lambda: self.batches("--interval", "100ms", "--count", 1)[0]["losses"])

        self.assertIn({"piece": "session", "reason": "suppressed: redundant", "total": 2,
                       "per_second": 0}, losses)

    def test_a_count_of_batches_that_nobody_reads_ends(self):
        process = subprocess.Popen(
            [*WITH_US, str(CTL), "top", "--interval", "100ms"], stdin=subprocess.DEVNULL,
            stdout=subprocess.PIPE, env={**os.environ, "HALVOX_CONFIG": str(self.service.config)})
        self.assertTrue(process.stdout.readline())
        process.stdout.close()
        self.assertIn(process.wait(DEADLINE), (0, -signal.SIGPIPE))

    def test_wrong_arguments_are_explained(self):
        for arguments in (("--interval", "tea"), ("--interval", "1ms"), ("--sort", "colour")):
            self.assertIn("expected", self.run_top(*arguments, status=2).stderr)

    def test_without_a_service_and_a_store_there_is_nothing_to_show(self):
        self.service.stop()
        (self.service.directory / "state/halvox.db").unlink()
        self.assertIn("halvox.db", self.run_top("--count", 1, status=69).stderr)

    def test_a_store_without_its_service_is_shown(self):
        self.begin(7)
        self.service.stop()
        batch, = self.batches("--interval", "100ms", "--count", 1)
        self.assertFalse(batch["service"]["connected"])
        self.assertEqual(batch["streams"], [])

    def test_the_counters_are_those_that_the_service_logs(self):
        counters = self.client.call("GetCounters", interface="com.tarno.halvox.Statistics", path=OBJECT)
        self.service.process.send_signal(signal.SIGUSR1)
        wait_for("the counters", lambda: "counted store check" in self.service.log()
                 or "counted start replies, held back" in self.service.log())
        self.assertEqual(counters["connection, connections accepted"], 1)
        for name in counters:
            self.assertIn(f"counted {name}: ", self.service.log())


@unittest.skipIf(audio.missing(), audio.missing())
class RealAudioTest(unittest.TestCase):
    def test_a_real_device_is_shown_with_its_clock_and_its_load(self):
        with contextlib.ExitStack() as stack:
            service = stack.enter_context(Service())
            server = stack.enter_context(audio.Audio())
            stack.enter_context(audio.Reporter(server, service))
            stack.callback(stop_process, server.play(120))
            top = subprocess.Popen(
                [*WITH_US, str(CTL), "top", "--json", "--interval", "500ms"], stdin=subprocess.DEVNULL,
                stdout=subprocess.PIPE, text=True,
                env={**server.environment, "HALVOX_CONFIG": str(service.config)})
            stack.callback(top.stdout.close)
            stack.callback(stop_process, top)

            def shown():
                batch = json.loads(top.stdout.readline())
                device = next((device for device in batch["devices"] if device["streams"]), {})
                # The profiler reports once a second.
                return device.get("busy") and device["quantum"] and device, batch["streams"]
            device, streams = wait_for("the device with its stream", lambda: (
                found := shown()) and found[0] and found[1] and found)

        self.assertEqual(device["description"], "Demo speakers")
        self.assertEqual(device["rate"], 48000)
        self.assertTrue(16 <= device["quantum"] <= 8192, device)
        self.assertTrue(0 < device["busy"] < 1, device)
        self.assertEqual((streams[0]["application"], streams[0]["state"]), ("pw-play", "running"))


class CostTest(WithService):
    """What top costs. The figures are printed; a slow machine fails no test."""

    def cpu_seconds(self, process):
        fields = Path(f"/proc/{process.pid}/stat").read_text().rpartition(")")[2].split()
        return (int(fields[11]) + int(fields[12])) / os.sysconf("SC_CLK_TCK")

    def test_a_turn_costs_little_and_nobody_who_looks_costs_nothing(self):
        for session in range(1, 21):
            self.begin(session, f"application-{session}")
        self.batches("--interval", "100ms", "--count", 1)
        service = self.cpu_seconds(self.service.process)
        turns = 200

        before = os.times()
        batches = self.batches("--interval", "100ms", "--count", turns)
        after = os.times()

        self.assertEqual(len(batches), turns)
        ours = after.children_user + after.children_system - before.children_user - before.children_system
        service = self.cpu_seconds(self.service.process) - service
        print(f"\n{turns} turns with 20 streams: the service used {1000 * service / turns:.2f} ms a turn, "
              f"halvoxctl {1000 * ours / turns:.2f} ms; at the usual 2 s that is "
              f"{100 * service / turns / 2:.3f} % and {100 * ours / turns / 2:.3f} % of a core")
        # It ends what the messages have begun, and then sleeps.
        readings = []

        def is_asleep():
            readings.append(self.service.voluntary_switches())
            return readings[-2:-1] == readings[-1:]
        wait_for("a service that makes no wake-ups", is_asleep, pause=1)


if __name__ == "__main__":
    unittest.main()
