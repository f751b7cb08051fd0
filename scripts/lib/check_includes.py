#!/usr/bin/env python3
"""Proves from the include lines that folders include only what scripts/lib/arrows.txt allows.

The table says which folder may include headers of which others, and which folders may include the
headers of a library. Folders of the inner ring may include nothing of the operating system or of a
library at all. Prints one line for each breach, with file and line, and a closing line. Exits with 1
if there was a breach.

    check_includes.py [TABLE]     checks the git working tree in the current directory
"""

import re
import subprocess
import sys
from dataclasses import dataclass, field
from pathlib import Path

TABLE = Path(__file__).parent / "arrows.txt"

# Folders whose code is plain C++ on the standard library.
INNER_RING = {"platform", "backends", "driver", "session", "tracing", "service"}
TEST_FOLDERS = {"platform/fake", "platform/linux/testing"}
TEST_LIBRARIES = ("gtest/", "gmock/")

STANDARD = set(
    """algorithm any array atomic barrier bit bitset cassert cctype cerrno cfenv cfloat charconv chrono
    cinttypes climits clocale cmath codecvt compare complex concepts condition_variable coroutine
    csetjmp csignal cstdarg cstddef cstdint cstdio cstdlib cstring ctime cuchar cwchar cwctype deque
    exception execution filesystem format forward_list fstream functional future initializer_list
    iomanip ios iosfwd iostream istream iterator latch limits list locale map memory memory_resource
    mutex new numbers numeric optional ostream queue random ranges ratio regex scoped_allocator
    semaphore set shared_mutex source_location span sstream stack stdexcept stop_token streambuf
    string string_view strstream syncstream system_error thread tuple type_traits typeindex typeinfo
    unordered_map unordered_set utility valarray variant vector version""".split()
)

INCLUDE = re.compile(r'^\s*#\s*include\s*([<"])([^">]+)[">]')
CONDITIONAL = re.compile(r"^\s*#\s*(if|ifdef|ifndef|elif|else)\b")
TEST_FILE = re.compile(r"(Test|_test|Fixture)\.\w+$|/(testing|testdata)/")


class TableError(Exception):
    """A line of the table that cannot be understood."""


@dataclass
class Row:
    """What one folder or file may include besides itself: each folder with the line that allows it."""

    everything: dict[str, int] = field(default_factory=dict)
    sources: dict[str, int] = field(default_factory=dict)
    tests: dict[str, int] = field(default_factory=dict)


class Table:
    def __init__(self, text: str):
        self.rows: dict[str, Row] = {}
        self.libraries: dict[str, dict[str, int]] = {}
        self._used: set[tuple[int, str]] = set()
        row = None
        for number, line in enumerate(text.splitlines(), start=1):
            content = line.split("#", 1)[0].rstrip()
            if not content:
                continue
            name, colon, others = content.strip().partition(":")
            if not colon:
                raise TableError(f"line {number}: expected 'NAME: FOLDERS', found '{content}'")
            if content.startswith("<"):
                self.libraries[name.strip("<>")] = {other: number for other in others.split()}
                continue
            allowed = {other: number for other in others.split()}
            if not content[0].isspace():
                if name in self.rows:
                    raise TableError(f"line {number}: {name} has a row already")
                row = self.rows[name] = Row(allowed)
            elif row is not None and name in ("sources", "tests"):
                setattr(row, name, allowed)
            else:
                raise TableError(f"line {number}: expected 'sources:' or 'tests:' below a row")
        for name, row in self.rows.items():
            for others in (row.everything, row.sources, row.tests):
                for other, number in others.items():
                    if other not in self.rows:
                        raise TableError(f"line {number}: {other} has no row of its own")

    def folder_of(self, path: str) -> str | None:
        """The folder of a file: the longest one with a row. None if there is none."""
        parts = path.split("/")[:-1]
        if parts[:1] == ["platform"] and len(parts) > 1 and parts[1] not in ("linux", "fake"):
            return None
        while parts:
            if "/".join(parts) in self.rows:
                # The row platform/linux is for its own files only: each adapter has a row too.
                if parts == ["platform", "linux"] and path.count("/") > 2:
                    return None
                return "/".join(parts)
            parts.pop()
        return None

    def cycle(self) -> list[str]:
        """The folders of a cycle of arrows that hold for headers; empty without a cycle."""
        done: set[str] = set()

        def visit(name: str, path: list[str]) -> list[str]:
            if name in path:
                return path[path.index(name):] + [name]
            if name in done:
                return []
            for other in self.rows[name].everything:
                if found := visit(other, path + [name]):
                    return found
            done.add(name)
            return []

        return next((found for name in self.rows if (found := visit(name, []))), [])

    def allows(self, path: str, other: str) -> bool:
        """True if a file may include headers of the folder `other`. Notes that the arrow is used."""
        folder = self.folder_of(path)
        row = self.rows[folder]
        of_file = self.rows.get(path, Row())
        # Only the first arrow that allows it counts as used. An arrow for tests that repeats an
        # arrow of the folder is therefore reported as unused.
        kinds = [row.everything, of_file.everything]
        if path.endswith((".cpp", ".c")):
            kinds.append(row.sources)
        if is_test(path):
            kinds.append(row.tests)
        for kind in kinds:
            if other in kind:
                self._used.add((kind[other], other))
                return True
        return other == folder or (is_test(path) and other in TEST_FOLDERS)

    def breaches(self, path: str, text: str):
        """Yields the number and the description of each line that breaks a rule."""
        folder = self.folder_of(path)
        if folder is None:
            yield 1, f"its folder has no row in {TABLE.name}"
            return
        for number, line in enumerate(text.splitlines(), start=1):
            if folder in INNER_RING and path not in self.rows and CONDITIONAL.match(line):
                yield number, "conditional compilation belongs to the adapters"
            match = INCLUDE.match(line)
            if not match:
                continue
            quote, name = match.groups()
            what = self._library(path, name) if quote == "<" else self._header(path, name)
            if what:
                yield number, what

    def _library(self, path: str, name: str) -> str | None:
        if name in STANDARD or (is_test(path) and name.startswith(TEST_LIBRARIES)):
            return None
        folder = self.folder_of(path)
        if folder in INNER_RING and path not in self.rows:
            return f"<{name}> is not a header of the standard library"
        for prefix, folders in self.libraries.items():
            if not name.startswith(prefix):
                continue
            users = [one for one in folders if path.startswith(f"{one}/")]
            self._used.update((folders[one], one) for one in users)
            if not users and not is_test(path):
                return f"<{name}> may be included only by {', '.join(sorted(folders))}"
        return None

    def _header(self, path: str, name: str) -> str | None:
        other = self.folder_of(name)
        if other is None:
            return f'"{name}" is in a folder that has no row in {TABLE.name}'
        if is_test(name) and not is_test(path):
            return f'"{name}" is for tests only'
        if not self.allows(path, other):
            return f'{self.folder_of(path)} may not include {other} ("{name}")'
        return None

    def unused(self):
        """Yields the line and the description of each arrow that no file has needed so far."""
        for name, row in self.rows.items():
            for others in (row.everything, row.sources, row.tests):
                for other, number in others.items():
                    if (number, other) not in self._used:
                        yield number, f"no include line uses the arrow from {name} to {other}; remove it"
        for name, folders in self.libraries.items():
            for folder, number in folders.items():
                if (number, folder) not in self._used:
                    yield number, f"{folder} does not include <{name}>; remove it from the row"


def is_test(path: str) -> bool:
    """True for tests, benchmarks, and files that only these use."""
    return bool(TEST_FILE.search(path)) or path.startswith(("platform/fake/", "bench/", "tests/"))


def main(arguments: list[str]) -> int:
    table_file = Path(arguments[0]) if arguments else TABLE
    try:
        table = Table(table_file.read_text(encoding="utf-8"))
    except TableError as error:
        print(f"{table_file.name}: {error}")
        return 1
    listed = subprocess.run(
        ["git", "ls-files", "--cached", "--others", "--exclude-standard", "*.h", "*.cpp", "*.c"],
        check=True, capture_output=True, text=True,
    ).stdout.split()
    files = [path for path in listed if Path(path).is_file()]
    count = 0
    for path in files:
        text = Path(path).read_text(encoding="utf-8", errors="replace")
        for number, what in table.breaches(path, text):
            print(f"{path}:{number}: {what}")
            count += 1
    for number, what in table.unused():
        print(f"{table_file.name}:{number}: {what}")
        count += 1
    if cycle := table.cycle():
        print(f"{table_file.name}: the arrows form a cycle: {' -> '.join(cycle)}")
        count += 1
    print(f"includes: {len(files)} files read, {count} breaches")
    return 1 if count or not files else 0


if __name__ == "__main__":
    sys.exit(main(sys.argv[1:]))
