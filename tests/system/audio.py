"""A private PipeWire with WirePlumber and a null sink, and the reporter that follows it."""

import contextlib
import itertools
import json
import math
import os
import shutil
import struct
import subprocess
import tempfile
import unittest
import wave
from pathlib import Path

from harness import BIN, Service, stop_process, voluntary_switches, wait_for

REPORTER = BIN / "halvox-pipewire-reporter"
AUDIO_CLIENT = BIN / "halvox_audio_client"
PRIVATE_PIPEWIRE = Path(__file__).resolve().parents[2] / "scripts/lib/private-pipewire.sh"


def missing():
    """Why real audio cannot be tested on this machine; empty if it can."""
    if not REPORTER.exists():
        return f"{REPORTER} is not built"
    check = subprocess.run([PRIVATE_PIPEWIRE, "check"], capture_output=True, text=True)
    return check.stdout.strip()


def plugin_directory():
    """Where PipeWire's own plugins are."""
    return subprocess.run(["pkg-config", "--variable=plugindir", "libspa-0.2"], check=True,
                          capture_output=True, text=True).stdout.strip()


class Audio:
    """The private PipeWire. Use as a context manager; children get `environment`.

    If it counts xruns, its sink has one for each cycle that was not finished in time, as a device
    without a reserve has. The usual sink has no hardware and counts none."""

    def __init__(self, counts_xruns=False):
        self._counts_xruns = counts_xruns

    def __enter__(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-audio-"))
        variables = {"HALVOX_AUDIO_SINK": "halvox.counting-sink",
                     "HALVOX_AUDIO_XRUN": str(self.directory / "xrun"),
                     "SPA_PLUGIN_DIR": f"{plugin_directory()}:{BIN}"} if self._counts_xruns else {}
        self._server = subprocess.Popen(
            [PRIVATE_PIPEWIRE, "serve", self.directory], env={**os.environ, **variables},
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        try:
            self._expect("ready")
            lines = (self.directory / "environment").read_text().splitlines()
            self.environment = {**os.environ, **dict(line.split("=", 1) for line in lines)}
            for name in ("PIPEWIRE_REMOTE", "PIPEWIRE_RUNTIME_DIR"):
                self.environment.pop(name, None)
        except BaseException:
            self.__exit__()
            raise
        return self

    def __exit__(self, *_):
        self._server.stdin.close()
        stop_process(self._server)
        self._server.stdout.close()
        shutil.rmtree(self.directory, ignore_errors=True)

    def cause_xrun(self):
        """Lets the sink, which must count xruns, have one although all nodes are in time."""
        file = self.directory / "xrun"
        file.touch()
        wait_for("the sink's xrun", lambda: not file.exists())

    def restart(self):
        self._server.stdin.write("restart\n")
        self._server.stdin.flush()
        self._expect("restarted")

    def _expect(self, word):
        line = self._server.stdout.readline().strip()
        if line != word:
            raise AssertionError(f"the private PipeWire said {line!r} instead of {word!r}")

    def tone(self, seconds, rate=48000, pitch=440):
        path = self.directory / f"tone-{seconds}.wav"
        if path.exists():
            return path
        # A whole number of periods, so that the tone can be repeated without a step.
        period = rate // math.gcd(rate, pitch)
        wave_form = struct.pack(f"<{period}h", *(int(16000 * math.sin(2 * math.pi * pitch * i / rate))
                                                 for i in range(period)))
        frames = int(seconds * rate)
        with wave.open(str(path), "wb") as file:
            file.setnchannels(1)
            file.setsampwidth(2)
            file.setframerate(rate)
            file.writeframes((wave_form * (frames // period + 1))[:2 * frames])
        return path

    def run(self, *command):
        # Runs in the scratch directory, because pw-profiler leaves plots in its working directory.
        return subprocess.Popen(command, env=self.environment, cwd=self.directory,
                                stdin=subprocess.DEVNULL, stdout=subprocess.DEVNULL)

    def play(self, seconds, volume=0.5, role="Music"):
        return self.run("pw-play", "--volume", str(volume), "--media-role", role, self.tone(seconds))


class Player:
    """A program that plays silence in cycles of that many frames, and can be made to stall."""

    def __init__(self, audio, name, frames, *sandbox):
        self.name = name
        self._process = subprocess.Popen(
            [AUDIO_CLIENT, "play", name, str(frames), *sandbox], env=audio.environment,
            stdin=subprocess.PIPE, stdout=subprocess.PIPE, text=True)
        line = self._process.stdout.readline().strip()
        if line != "running":
            self.stop()
            raise AssertionError(f"the player {name} said {line!r} instead of 'running'")

    def stall(self, seconds):
        """Sleeps that long in the next cycle."""
        self._process.stdin.write(f"stall {int(seconds * 1000)}\n")
        self._process.stdin.flush()

    def kill(self):
        self._process.kill()
        self._process.wait(30)

    def stop(self):
        """Does nothing if it has been stopped."""
        self._process.stdin.close()
        self._process.wait(30)
        self._process.stdout.close()


class Profile:
    """What PipeWire's profiler reports, read without the code that is tested."""

    # The status of a node that was called and has not finished.
    LATE = (1, 2)

    def __init__(self, audio):
        self._path = audio.directory / "profile.jsonl"
        with open(self._path, "wb") as file:
            self._process = subprocess.Popen([AUDIO_CLIENT, "profile"], env=audio.environment,
                                             stdin=subprocess.PIPE, stdout=file)

    def cycles(self):
        """The cycles so far, each once, oldest first: when, how many xruns until then, and the IDs
        of the nodes that were late."""
        cycles = {}
        for line in self._path.read_text().splitlines(keepends=True):
            if not line.endswith("\n"):
                break  # being written
            event = json.loads(line)
            late, _ = cycles.get(event["time"], (set(), 0))
            late |= {node for node, status in event["followers"] if status in self.LATE}
            cycles[event["time"]] = late, event["xruns"]
        return [(time, xruns, late) for time, (late, xruns) in sorted(cycles.items())]

    def stop(self):
        self._process.stdin.close()
        self._process.wait(30)


class Reporter:
    """The built reporter, connected to a private PipeWire and a service."""

    _numbers = itertools.count()

    def __init__(self, audio, service, *options):
        self.log_path = audio.directory / f"reporter-{next(Reporter._numbers)}.log"
        with open(self.log_path, "ab") as log:
            self.process = subprocess.Popen(
                [REPORTER, "--socket", service.socket, "--verbose", *options],
                env=audio.environment, stdin=subprocess.DEVNULL, stdout=log, stderr=log)
        wait_for("the reporter to follow PipeWire", lambda: "following PipeWire" in self.log())

    def __enter__(self):
        return self

    def __exit__(self, *_):
        stop_process(self.process)

    def log(self):
        return self.log_path.read_text(errors="replace")

    def voluntary_switches(self):
        return voluntary_switches(self.process)


class ReporterTestCase(unittest.TestCase):
    """A service, a private PipeWire and the reporter between them."""

    def setUp(self):
        stack = contextlib.ExitStack()
        self.addCleanup(stack.close)
        self.service = stack.enter_context(Service())
        self.audio = stack.enter_context(Audio())
        self.reporter = stack.enter_context(Reporter(self.audio, self.service))
        self.stack = stack

    def play(self, *arguments, **options):
        player = self.audio.play(*arguments, **options)
        self.stack.callback(stop_process, player)
        return player
