"""Runs the code blocks of a document."""

import json
import os
import shutil
import subprocess
import xml.etree.ElementTree as ElementTree

import documents
from harness import CTL, DEADLINE, STORE_EXTENSION, wait_for
from installation import run

# Blocks that name one of these programs are skipped where it is missing.
PROGRAMS = ("busctl", "gdbus-codegen", "jq", "pkg-config", "sqlite3")
# Words in code that builds programs with the library.
BUILDING = ("pkg-config", "find_package", "cmake")


class Place:
    """Where blocks run: the directory `home`, with `environment`, beside `service`."""

    def run(self, *command, code=None):
        """Runs a command in the home directory. Returns what it prints on standard output."""
        done = subprocess.run(command, capture_output=True, text=True, check=False, timeout=DEADLINE,
                              input=code, cwd=self.home, env=self.environment)
        if done.returncode != 0:
            raise AssertionError(f"exit status {done.returncode}: {done.stderr}{done.stdout}")
        return done.stdout


class DocumentRunner:
    """For a test case that has `world`, a Place, and `prefix`, an installation."""

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
        found = [json.loads(line) for line in self.world.run("halvoxctl", "sql", "--json", code).splitlines()]
        self.assertNotEqual(found, [], "the query finds nothing")
        return self.world.run("halvoxctl", "sql", code)

    def run_json(self, code, _):
        json.loads(code)

    def run_xml(self, code, _):
        ElementTree.fromstring(code)

    def run_toml(self, code, _):
        """A configuration that the programs accept. The status reads it although the socket is named."""
        file = self.world.home / "block.toml"
        file.write_text(code)
        done = subprocess.run([CTL, "status"], capture_output=True, text=True, check=False, timeout=DEADLINE,
                              env={**self.world.environment, "HALVOX_CONFIG": str(file)})
        self.assertEqual(done.returncode, 0, done.stderr)

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
