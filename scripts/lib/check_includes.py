#!/usr/bin/env python3
"""Proves from the include lines that the arrows between the folders run one way.

The inner ring reaches nothing but the standard library, the headers directly in platform/ and
itself, and its folders reach each other only as ALLOWED says. Prints one line per breach with file
and line, and a closing line; exits with 1 when there was a breach.
"""

import re
import subprocess
import sys
from pathlib import Path

# What each folder of the inner ring may include, besides the standard library.
ALLOWED = {
    "platform": {"platform"},
    "backends": {"backends", "platform"},
    "driver": {"driver", "session", "backends", "platform"},
    "session": {"session", "backends", "tracing", "platform"},
    "tracing": {"tracing", "platform"},
    "service": {"service", "session", "backends", "driver", "tracing", "platform"},
}
# Sources (not headers) of these folders may include these further folders.
ALLOWED_IN_SOURCES = {"backends": {"session"}}
# The composition root knows the adapters; tests know the fakes.
COMPOSITION_ROOT = "service/main.cpp"
TEST_FOLDERS = {"platform/fake"}
TEST_LIBRARIES = {"gtest/gtest.h", "gmock/gmock.h"}

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


def folder_of(path: str) -> str:
    """The folder that the rules speak of: its first part, or platform/linux and the like."""
    parts = path.split("/")
    if parts[0] == "platform" and len(parts) > 2:
        return "/".join(parts[:2])
    return parts[0]


def allowed_folders(path: str) -> set[str]:
    folder = folder_of(path)
    allowed = set(ALLOWED[folder])
    if path.endswith(".cpp"):
        allowed |= ALLOWED_IN_SOURCES.get(folder, set())
    if is_test(path):
        allowed |= TEST_FOLDERS | {"session", "service"}
    return allowed


def is_test(path: str) -> bool:
    return bool(re.search(r"(Test|_test|Fixture)\.(cpp|h)$", path))


def breaches_of(path: str):
    allowed = allowed_folders(path)
    text = Path(path).read_text(encoding="utf-8", errors="replace")
    for number, line in enumerate(text.splitlines(), start=1):
        if CONDITIONAL.match(line):
            yield number, "conditional compilation belongs to the adapters"
        match = INCLUDE.match(line)
        if not match:
            continue
        quote, name = match.groups()
        if quote == "<":
            if name in STANDARD or (is_test(path) and name in TEST_LIBRARIES):
                continue
            yield number, f"<{name}> is not of the standard library"
        elif folder_of(name) not in allowed:
            yield number, f'"{name}" is out of reach for {folder_of(path)}/'


def main() -> int:
    listed = subprocess.run(
        ["git", "ls-files", "--cached", "--others", "--exclude-standard", "*.h", "*.cpp"],
        check=True, capture_output=True, text=True,
    ).stdout.split()
    inner = [path for path in listed if folder_of(path) in ALLOWED and path != COMPOSITION_ROOT]
    count = 0
    for path in inner:
        for number, what in breaches_of(path):
            print(f"{path}:{number}: {what}")
            count += 1
    print(f"includes: {len(inner)} files of the inner ring read, {count} breaches")
    return 1 if count or not inner else 0


if __name__ == "__main__":
    sys.exit(main())
