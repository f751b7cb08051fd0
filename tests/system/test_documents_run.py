"""What the documents tell readers to run works: each code block and each command, against the real
service."""

import json
import os
import re
import shutil
import subprocess
import tempfile
import time
import unittest
import xml.etree.ElementTree as ElementTree
from pathlib import Path

import documents
from documents import ROOT
from harness import BIN, CTL, DEADLINE, STORE_EXTENSION, Service, wait_for
from installation import Installation, run
from player import PLAYBACK, STATE, begin_stream

VOLUME, ERROR, ISSUE, JOULEBOOK, STOP, START = 14, 11, 7, 8, 2, 1
# Blocks that name one of these programs are skipped where it is missing.
PROGRAMS = ("busctl", "gdbus-codegen", "jq", "pkg-config", "sqlite3")
# Words in code that builds programs with the library.
BUILDING = ("pkg-config", "find_package", "cmake")
PULSES = """# TYPE pulses counter
pulses_total{{driver="ExampleActuator",group="Haptics",subgroup="Stats"}} {}
# EOF
"""


class World:
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
        wait_for("the driver report", lambda: any("IOReporting" in name for name, _ in self.service.events()))
        wait_for("both clients' ends", lambda: any("clientuptime" in name
                                                   for name, _ in self.service.all_events()))

    def run(self, *command, code=None):
        """Runs a command in the home directory. Returns what it prints on standard output."""
        done = subprocess.run(command, capture_output=True, text=True, check=False, timeout=DEADLINE,
                              input=code, cwd=self.home, env=self.environment)
        if done.returncode != 0:
            raise AssertionError(f"exit status {done.returncode}: {done.stderr}{done.stdout}")
        return done.stdout


class DocumentsTest(Installation):
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

    def in_scratch(self, code):
        """The code with the places of an installed system replaced by those of the test."""
        for place, here in (("/run/halvox/reporting.sock", self.world.service.socket),
                            ("/usr/lib/x86_64-linux-gnu/halvox/halvox-sqlite.so", STORE_EXTENSION)):
            code = code.replace(place, str(here))
        return code

    def check_output(self, asked, expected, printed):
        """Compares what was printed. A question about the store is asked again: the service may need
        half a second to store what it has answered."""
        if asked is None:
            self.assertTrue(documents.matches(expected.code, printed), f"printed:\n{printed}")
        else:
            wait_for(f"the expected answer, not\n{printed}", lambda: documents.matches(
                expected.code, self.run_sh(self.in_scratch(asked), expected)))

    def check_document(self, path):
        printed = asked = missing = None
        for block in documents.blocks(path):
            with self.subTest(block.place):
                self.assertNotEqual(block.language, "", "the block does not say its language")
                # What a skipped block would have done may be in the output of any later one.
                if missing and block.mark == "output":
                    self.skipTest(missing)
                if block.mark == "output":
                    self.assertIsNotNone(printed, "no block before it was run")
                    self.check_output(asked, block, printed)
                if not block.is_run:
                    continue
                missing = self.missing_for(block.code) or missing
                if self.missing_for(block.code):
                    self.skipTest(missing)
                asked = block.code if documents.is_question(block) else None
                printed = self.run_block(block)

    def run_block(self, block):
        code = self.in_scratch(block.code)
        if block.mark == "file":
            (self.world.home / block.value).write_text(code)
        return getattr(self, f"run_{block.language}")(code, block)

    def missing_for(self, code):
        """Why this machine or build cannot run the code, or None."""
        for program in PROGRAMS:
            if program in code and shutil.which(program) is None:
                return f"{program} is not installed"
        if "halvoxctl report" in code and subprocess.run(
                [CTL, "report", "--help"], capture_output=True, check=False).returncode != 0:
            return "this build has no reports"
        if os.environ.get("HALVOX_SANITIZE") and any(word in code for word in BUILDING):
            return "a sanitized library needs a sanitized program"
        return None

    def run_sh(self, code, block):
        if block.mark == "file":
            return self.world.run("bash", "-n", block.value)
        return self.world.run("bash", "-euo", "pipefail", "-c", code)

    def run_python(self, code, block):
        if block.mark == "file":
            compile(code, block.value, "exec")
            return None
        return self.world.run("/usr/bin/python3", "-", code=code)

    def run_c(self, code, block):
        """A file that later commands compile."""
        self.assertEqual(block.mark, "file", "programs are files")

    run_cpp = run_c

    def run_sql(self, code, _):
        """The query finds something in the records of the world."""
        found = [json.loads(line) for line in self.world.run(CTL, "sql", "--json", code).splitlines()]
        self.assertNotEqual(found, [], "the query finds nothing")
        return self.world.run(CTL, "sql", code)

    def run_json(self, code, _):
        json.loads(code)

    def run_xml(self, code, _):
        ElementTree.fromstring(code)

    def run_toml(self, code, _):
        """A configuration that the programs accept."""
        file = self.world.home / "block.toml"
        file.write_text(code)
        done = subprocess.run([CTL, "list"], capture_output=True, text=True, check=False, timeout=DEADLINE,
                              env={**self.world.environment, "HALVOX_CONFIG": str(file)})
        self.assertNotEqual(done.returncode, 78, done.stderr)

    def run_cmake(self, code, _):
        """Lines of a project that has the program `player`."""
        project = self.world.home / "project"
        project.mkdir()
        shutil.copy(self.world.home / "player.c", project)
        (project / "CMakeLists.txt").write_text(
            f"cmake_minimum_required(VERSION 3.16)\nproject(player C)\nadd_executable(player player.c)\n"
            f"{code}\ntarget_link_libraries(player PRIVATE m)\n")
        run("cmake", "-S", project, "-B", project / "build", f"-DCMAKE_PREFIX_PATH={self.prefix}")
        run("cmake", "--build", project / "build")

    def run_text(self, code, block):
        """No code."""


def add_tests():
    for path in documents.documents():
        def test(self, path=path):
            self.check_document(path)
        name = str(path.relative_to(ROOT)).removesuffix(".md")
        if documents.blocks(path):
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
