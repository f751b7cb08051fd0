"""A built copy of the tree, and its test programs with one changed source.

The copy is built once. For a mutant, only the objects that contain it are compiled again, outside the
copy. Each test program is then linked with these in place of its own objects.
"""

import json
import math
import os
import re
import shlex
import shutil
import signal
import subprocess
import time
from pathlib import Path

# Limits for a test program of a mutant. A mutant that never ends counts as killed. A loop is found by
# its CPU time, which does not depend on other work of the machine. A program that waits for ever gets
# much more time, so that a busy machine does not look like a failing test.
SHORTEST_LIMIT = 20.0  # seconds of the processor's time
LIMIT_FACTOR = 10  # of the time that the program takes unchanged
WAIT_FACTOR = 10  # how many times the limit a program may take in all
SLOW_TEST = 0.4  # seconds; such tests run when all others have passed
MEMORY_LIMIT = 8 << 30  # bytes of address space
COMPILE_LIMIT = 300.0

# The allocator fills new and freed memory with this byte, so that tests fail if code reads it.
_TEST_ENVIRONMENT = {"MALLOC_PERTURB_": "165"}
_TEST = re.compile(r"^\s*halvox_test\(\s*(\w+)", re.MULTILINE)


class BuildError(Exception):
    """What cannot be built or run at all, with the end of the output."""


def run(command, directory, limit, environment=None):
    """The exit status and output of a command; None for the status when it took too long."""
    process = subprocess.Popen(command, cwd=directory, stdin=subprocess.DEVNULL,
                               stdout=subprocess.PIPE, stderr=subprocess.STDOUT, text=True,
                               errors="replace", start_new_session=True, env=environment)
    try:
        output, _ = process.communicate(timeout=limit)
        return process.returncode, output
    except subprocess.TimeoutExpired:
        return None, ""
    finally:
        if process.poll() is None:
            os.killpg(process.pid, signal.SIGKILL)  # the group that it leads: itself and its children
            process.communicate()


def ending(output):
    return "\n".join(output.splitlines()[-30:])


class Tree:
    """The copy of a source tree in a scratch directory, with the build of its tests."""

    def __init__(self, root, scratch, folders, jobs):
        self.source = scratch / "source"
        self.build = scratch / "build"
        self._mutants = scratch / "mutants"
        self._jobs = jobs
        self._copy(root)
        self.tests = {folder: self._tests_in(folder) for folder in folders}
        self._environment = {**os.environ, "CCACHE_BASEDIR": str(scratch), "CCACHE_NOHASHDIR": "1",
                             "CCACHE_SLOPPINESS": "pch_defines,time_macros"}
        self._configure()

    def _copy(self, root):
        """Everything that git knows or would add, as it is in the working tree. A file that has not
        changed since an earlier run keeps its time, so that it is not compiled again."""
        listed = subprocess.run(["git", "ls-files", "-z", "--cached", "--others", "--exclude-standard"],
                                cwd=root, capture_output=True, text=True, check=True).stdout
        names = {name for name in listed.split("\0") if name and (root / name).is_file()}
        for name in names:
            to = self.source / name
            if to.exists() and to.read_bytes() == (root / name).read_bytes():
                continue
            to.parent.mkdir(parents=True, exist_ok=True)
            shutil.copy(root / name, to)
        for old in [file for file in self.source.rglob("*") if file.is_file()]:
            if str(old.relative_to(self.source)) not in names:
                old.unlink()

    def _tests_in(self, folder):
        lists = self.source / folder / "CMakeLists.txt"
        return _TEST.findall(lists.read_text()) if lists.exists() else []

    def _must(self, what, command):
        status, output = run(command, self.source, None, self._environment)
        if status != 0:
            raise BuildError(f"{what} failed:\n{ending(output)}")
        return output

    def _configure(self):
        # Compiled for speed of compiling; warnings would only cost, since mutants may well have some.
        self._must("configuring", [
            "cmake", "-S", str(self.source), "-B", str(self.build), "-G", "Ninja",
            "-DCMAKE_BUILD_TYPE=Debug", "-DCMAKE_CXX_FLAGS_DEBUG=-O0",
            "-DCMAKE_CXX_FLAGS=-w -D_GLIBCXX_ASSERTIONS",
            "-DCMAKE_EXE_LINKER_FLAGS=-fuse-ld=lld", "-DCMAKE_EXPORT_COMPILE_COMMANDS=ON"])

    def prepare(self):
        """Builds the test programs, runs them, and learns what they are made of."""
        names = [name for tests in self.tests.values() for name in tests]
        self._must("building", ["cmake", "--build", str(self.build), "-j", str(self._jobs),
                                "--target", *names])
        commands = json.loads((self.build / "compile_commands.json").read_text())
        self._compile = {self._object_of(command): command for command in commands}
        self._includes = self._read_includes()
        self.programs = {name: self._program(name) for name in names}
        for program in self.programs.values():
            program.measure()

    @staticmethod
    def _object_of(command):
        words = shlex.split(command["command"])
        return words[words.index("-o") + 1]

    def _read_includes(self):
        """The objects that each file of the tree goes into, from the root of the tree."""
        objects = {}
        lines = self._must("reading what includes what", ["ninja", "-C", str(self.build), "-t", "deps"])
        of = None
        for line in lines.splitlines():
            if match := re.match(r"(\S.*): #deps \d+", line):
                of = match[1]
            elif of in self._compile and line.startswith(" "):
                path = Path(os.path.normpath(self.build / line.strip()))
                if path.is_relative_to(self.source):
                    objects.setdefault(str(path.relative_to(self.source)), []).append(of)
        return objects

    def _program(self, name):
        lines = self._must(f"asking how {name} is linked",
                           ["ninja", "-C", str(self.build), "-t", "commands", name]).splitlines()
        pieces = [piece for line in lines for piece in line.split(" && ")]
        link = next(piece for piece in reversed(pieces) if f" -o bin/{name} " in f"{piece} ")
        return Program(name, self.build, shlex.split(link))

    def programs_for(self, folder):
        """The programs that contain sources of a folder, its own first."""
        own = [self.programs[name] for name in self.tests[folder]]
        library = f"libhalvox_{folder}.a"
        others = [program for program in self.programs.values()
                  if program not in own and program.links(library)]
        return own + others

    def text(self, file):
        return (self.source / file).read_text()

    def scratch(self, number):
        return self._mutants / str(number)

    def objects_with(self, file, program):
        """The objects of a program that a file is compiled into."""
        return [one for one in self._includes.get(file, []) if program.contains(one)]

    def compile(self, one, file, directory):
        """Compiles an object again with the mutant of `file` below `directory`. Returns the new
        object, or None if the mutant does not compile."""
        command = self._compile[one]
        to = directory / one.replace("/", "_")
        words = shlex.split(command["command"])
        words[words.index("-o") + 1] = str(to)
        at = words.index(f"-I{self.source}")
        words.insert(at, f"-I{directory}")
        if os.path.normpath(command["file"]) == str(self.source / file):
            words[words.index("-c") + 1] = str(directory / file)
        if Path(words[0]).name == "ccache":
            words = words[1:]  # a mutant is compiled once
        status, _ = run(words, self.build, COMPILE_LIMIT)
        return to if status == 0 else None


class Program:
    """One test program of the copy."""

    def __init__(self, name, build, link):
        self.name = name
        self.path = build / "bin" / name
        self.limit = SHORTEST_LIMIT
        self._slow = []
        self._build = build
        self._link = link

    def links(self, library):
        return any(Path(word).name == library for word in self._link)

    def contains(self, one):
        """Whether an object is linked, by itself or within a library."""
        target = re.search(r"CMakeFiles/(\w+)\.dir/", one)[1]
        return one in self._link or self.links(f"lib{target}.a")

    def link(self, objects, to):
        """Links the program with these objects in place of its own. They come before the libraries,
        so that the linker does not take the libraries' objects for the same names. Returns True on
        success."""
        words = [str(objects.get(word, word)) for word in self._link]
        words[words.index("-o") + 1] = str(to)
        extra = [str(new) for one, new in objects.items() if one not in self._link]
        words[words.index("-o"):words.index("-o")] = extra
        status, _ = run(words, self._build, COMPILE_LIMIT)
        return status == 0

    def measure(self):
        """Runs the program unchanged, to learn how long it takes and which tests are slow."""
        begin = time.monotonic()
        status, output = self._run(self.path, "*", COMPILE_LIMIT)
        if status != 0:
            raise BuildError(f"{self.name} fails without a mutant:\n{ending(output)}")
        self.limit = max(SHORTEST_LIMIT, LIMIT_FACTOR * (time.monotonic() - begin))
        times = re.findall(r"\[       OK \] (\S+).* \((\d+) ms\)", output)
        self._slow = [test for test, milliseconds in times if int(milliseconds) > SLOW_TEST * 1000]

    @property
    def has_slow_tests(self):
        return bool(self._slow)

    def _run(self, path, tests, limit):
        seconds = math.ceil(limit)
        command = ["prlimit", f"--cpu={seconds}", f"--as={MEMORY_LIMIT}", "--core=0", "--",
                   str(path), "--gtest_fail_fast", f"--gtest_filter={tests}"]
        # Runs in the build directory, because tests may read paths relative to it.
        return run(command, self._build, WAIT_FACTOR * limit, {**os.environ, **_TEST_ENVIRONMENT})

    def fails(self, path, slow=False):
        """How the quick or the slow tests of a changed program fail: failed, crashed or timed out,
        and which; None when they pass."""
        slow_ones = ":".join(self._slow)
        tests = slow_ones if slow else f"-{slow_ones}" if slow_ones else "*"
        status, output = self._run(path, tests, self.limit)
        if status in (None, -signal.SIGXCPU, -signal.SIGKILL):
            return "timed out", ""
        if status == 0:
            return None, ""
        failed = re.findall(r"\[  FAILED  \] ([\w/]+\.[\w/]+)", output)
        return ("crashed" if status < 0 else "failed"), (failed[0] if failed else "")
