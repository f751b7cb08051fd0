"""What the documents tell readers to run works: each code block and each command, against the real
service."""

import os
import re
import shutil
import subprocess
import tempfile
import time
import unittest
from pathlib import Path

import documents
from document_runner import DocumentRunner, Place
from documents import ROOT
from harness import BIN, CTL, DEADLINE, Service, wait_for
from installation import Installation
from player import PLAYBACK, STATE, begin_stream

VOLUME, ERROR, ISSUE, JOULEBOOK, STOP, START = 14, 11, 7, 8, 2, 1
PULSES = """# TYPE pulses counter
pulses_total{{driver="ExampleActuator",group="Haptics",subgroup="Stats"}} {}
# EOF
"""


class World(Place):
    """A service with the places of a user's own one, and records of some playing."""

    def __init__(self, test):
        self.home = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        test.addCleanup(shutil.rmtree, self.home, True)
        self.state = self.home / ".local/state/halvox"
        self.textfiles = self.state / "drivers"
        self.textfiles.mkdir(parents=True)
        self.count(1)
        self.service = Service(
            f'[storage]\ndirectory = "{self.state}"\n[drivers]\nalsa = false\npipewire = false\n'
            f'textfiles = "{self.textfiles}"\n')
        self.service.database = self.state / "halvox.db"
        self.service.__enter__()
        test.addCleanup(self.service.__exit__)
        self.environment = {
            **{key: value for key, value in os.environ.items() if not key.startswith("XDG_")},
            "HOME": str(self.home), "PATH": f"{BIN}:{os.environ['PATH']}",
            "HALVOX_CONFIG": str(self.service.config), "HALVOX_SOCKET": str(self.service.socket)}
        self.play(test)

    def count(self, pulses):
        new = self.textfiles / "world.prom.new"
        new.write_text(PULSES.format(pulses))
        new.rename(self.textfiles / "world.prom")

    def play(self, test):
        """A player whose volume changes and that glitches, a call that fails, and a mixer's issue."""
        client = self.service.client()
        test.addCleanup(client.close)
        player = begin_stream(client, 1, "com.example.player")
        call = begin_stream(client, 2, "com.example.call", "Headset", "headset")
        begun = time.monotonic()
        player({"RQSessionVolume": 0.5, "RQSessionVolumePlayingState": 1}, VOLUME, STATE)
        for milliseconds in (1.5, 40.0):
            player({"issue_type": "xrun", "xrun_milliseconds": milliseconds, "missed_cycles": 2,
                    "xrun_role": "victim", "late_process": "com.example.call"}, PLAYBACK, ISSUE)
        call({"error": "no route"}, ERROR, 6)
        call({"EngineOnTime": 4.5}, PLAYBACK, JOULEBOOK)
        self.count(43)
        # A volume is in the summary if it lasted more than half a second.
        wait_for("the volume to have lasted", lambda: time.monotonic() - begun > 0.7)
        player({"RQSessionVolume": 0.25, "RQSessionVolumePlayingState": 0}, VOLUME, STATE)
        for session, send in ((1, player), (2, call)):
            send({}, PLAYBACK, STOP)
            client.stop(session)
        client.close()
        self.service.wait_for_payload(lambda payload: "RQSessionVolumeBucketed" in payload)
        wait_for("both driver reports", lambda: sum(
            name == "com.tarno.halvox.IOReporting.Simple" for name, _ in self.service.events()) == 2)
        wait_for("the client's end", lambda: any(
            "clientuptime" in name for name, _ in self.service.all_events()))


class DocumentsTest(DocumentRunner, Installation):
    """A method for each document is added below."""

    def setUp(self):
        self.world = World(self)
        if not os.environ.get("HALVOX_SANITIZE"):
            self.world.environment.update(
                CMAKE_PREFIX_PATH=str(self.prefix), LD_LIBRARY_PATH=str(self.libraries),
                PKG_CONFIG_PATH=str(self.libraries / "pkgconfig"))
        for source in (self.prefix / "share/doc/halvox/examples").iterdir():
            copy = shutil.copytree if source.is_dir() else shutil.copy
            copy(source, self.world.home / source.name)

    def test_a_configuration_with_a_mistake_fails(self):
        with self.assertRaisesRegex(AssertionError, "sokcet"):
            self.run_toml('[listener]\nsokcet = "x"\n', None)


def add_tests():
    for path in documents.documents():
        def test(self, path=path):
            self.check_document(path)
        name = str(path.relative_to(ROOT)).removesuffix(".md")
        # test_documents_tracing runs the guide that needs a tracer.
        if documents.blocks(path) and name != "docs/guides/tracing":
            setattr(DocumentsTest, "test_" + "".join(c if c.isalnum() else "_" for c in name), test)


add_tests()


class CommandsTest(unittest.TestCase):
    def help(self, words):
        done = subprocess.run([CTL, *words, "--help"], capture_output=True, text=True, check=False,
                              timeout=DEADLINE)
        return done.stdout if done.returncode == 0 else None

    def test_each_command_in_the_prose_exists_with_its_options(self):
        checked = 0
        for path in documents.documents():
            for words, options in documents.commands(path):
                with self.subTest(document=path.name, command=" ".join(words)):
                    text = self.help(words) or self.help(words[:1])
                    if text is None and words[0] == "report":
                        self.skipTest("this build has no reports")
                    self.assertIsNotNone(text, "no such command")
                    for option in options:
                        self.assertIn(option, text)
                    checked += 1
        self.assertGreater(checked, 20)


class ReferenceTest(unittest.TestCase):
    def test_the_numbers_of_the_protocol_are_those_of_the_vocabulary(self):
        page = (ROOT / "docs/reference/protocol.md").read_text()
        shown = re.findall(r"\| (0x[0-9a-f]+|\d+) \| (\w+)(?= \|)", page)
        known = re.findall(r'\{"(\w+)", (0x\w+|\d+)\}', (ROOT / "client/Vocabulary.cpp").read_text())

        self.assertEqual(len(known), 55)
        self.assertEqual(sorted(shown), sorted((number, name) for name, number in known))


class ParserTest(unittest.TestCase):
    def blocks(self, text):
        with tempfile.TemporaryDirectory() as directory:
            path = Path(directory) / "page.md"
            path.write_text(text)
            return documents.blocks(path)

    def test_marks_belong_to_the_block_below(self):
        first, second, third = self.blocks(
            "<!-- file: a.c -->\n```c\nint x;\n```\n\n```sh\ntrue\n```\n"
            "<!-- not run: slow -->\n```sh\nx\n```\n")

        self.assertEqual((first.mark, first.value, first.code), ("file", "a.c", "int x;\n"))
        self.assertEqual((second.place, second.mark, second.is_run), ("page.md:6", "", True))
        self.assertEqual((third.value, third.is_run), ("slow", False))

    def test_a_block_is_left_out_only_with_a_reason(self):
        for text in ("<!-- not run: -->\n```sh\nx\n```\n", "<!-- skip -->\n```sh\nx\n```\n", "```sh\nx\n",
                     "- item\n  ```sh\n  x\n  ```\n\n```sh\n"):
            with self.subTest(text), self.assertRaises(ValueError):
                self.blocks(text)

    def test_dots_stand_for_any_text_in_an_output(self):
        self.assertTrue(documents.matches("a ... c\n", "a b\nb c\n"))
        self.assertFalse(documents.matches("a ... c\n", "a b\n"))
        self.assertFalse(documents.matches("a\n", "a\nb\n"))


if __name__ == "__main__":
    unittest.main()
