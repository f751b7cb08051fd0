#!/usr/bin/env python3
"""Runs clang-tidy on many sources faster than one run for each source does.

clang-tidy spends nearly all of its time on the standard headers: it parses them and matches every
declaration in them, again for each source. Here it reads several sources as one: a unit, the
concatenation of sources that have the same compiler options. The text is concatenated, not included,
because some checks look only at the main file.

- A unit without a finding proves that its sources have none. After a finding, or an error that only
  the concatenation has, the sources of the unit are read one by one, and only these findings count.
- source_units.py decides which sources share a unit. What it misses, such as two classes of one name
  in headers of libraries, makes a unit that does not compile, which only costs time.
- A use in one source hides an unused using-declaration in another. A source is therefore read a second
  time by itself, with only that check, if a name of its using-declarations occurs elsewhere in its unit
  and the source does not plainly use it.

    clang_tidy.py BUILD_DIRECTORY < names of sources, one a line

Prints the findings. Exits with 1 if there are any.
"""

import json
import os
import re
import shlex
import subprocess
import sys
from concurrent.futures import ThreadPoolExecutor
from pathlib import Path

from source_units import Source, plan, words_and_marks

USING_CHECK = "misc-unused-using-decls"

USING_DECLARATION = re.compile(r"\busing\s+(?:typename\s+)?((?:::)?\w+(?:::\w+)+\s*(?:,[^;]*)?);")
# A name after one of these is used, not declared and not that of a member. The list is short on purpose: a
# use that it misses only makes clang-tidy read the source again.
BEFORE_USE = {"(", ",", "<", "{", "}", ";", "=", "return", "const"}


def options_of(command):
    """The compiler and its options in a compile command, without the file and the output."""
    words = shlex.split(command["command"]) if "command" in command else list(command["arguments"])
    options = []
    skip = False
    for word in words:
        if skip:
            skip = False
        elif word == "-o":
            skip = True
        elif word != "-c" and not (word.endswith(".cpp") and os.path.isabs(word)):
            options.append(word)
    return tuple(options)


def read_sources(build, paths):
    commands = {}
    for command in json.loads((build / "compile_commands.json").read_text(encoding="utf-8")):
        path = os.path.join(command["directory"], command["file"])
        # Some sources are in several programs. One of their commands is enough, the same each time.
        commands.setdefault(os.path.realpath(path), options_of(command))
    sources = []
    for path in paths:
        options = commands.get(os.path.realpath(path))
        if options is None:
            raise SystemExit(f"clang_tidy: {path} has no compile command in {build}")
        sources.append(Source(path, options, Path(path).read_text(encoding="utf-8")))
    return sources


def plainly_used(text):
    """The names that a source uses without a qualification, as far as its text shows it."""
    tokens = words_and_marks(USING_DECLARATION.sub(";;", text))
    return {token for (before, _), (token, is_word) in zip(tokens, tokens[1:])
            if is_word and before in BEFORE_USE}


def may_be_hidden(source, unit):
    """Whether a using-declaration of this source may be unused and another source of the unit hide it."""
    names = {name for text in USING_DECLARATION.findall(source.text)
             for name in re.findall(r"(\w+)\s*(?:[;,]|$)", text)}
    if all(names.isdisjoint(other.words) for other in unit.sources if other is not source):
        return False
    return not names <= plainly_used(source.text)


def write_units(build, units):
    """Writes the units with their compile commands into a folder of the build directory."""
    folder = build / "clang-tidy"
    folder.mkdir(exist_ok=True)
    for old in folder.glob("unit*.cpp"):
        old.unlink()
    commands = []
    paths = []
    for number, unit in enumerate(units):
        path = folder / f"unit{number}.cpp"
        path.write_text(unit.text(), encoding="utf-8")
        paths.append(path)
        arguments = [*unit.options, "-c", str(path)]
        commands.append({"directory": str(build), "arguments": arguments, "file": str(path)})
    (folder / "compile_commands.json").write_text(json.dumps(commands), encoding="utf-8")
    return folder, paths


def tidy(database, path, *arguments):
    """Runs clang-tidy on a file. Returns what it reports, or None if it finds nothing."""
    run = subprocess.run(
        ["clang-tidy", "-p", str(database), "--quiet", *arguments, str(path)],
        stdout=subprocess.PIPE, stderr=subprocess.PIPE, text=True, check=False,
    )
    # clang-tidy also succeeds when it skips a file that has no compile command.
    if run.returncode == 0 and "Compile command not found" not in run.stderr:
        return None
    return run.stdout if run.stdout.strip() else run.stdout + run.stderr


def main():
    if len(sys.argv) != 2:
        print(__doc__, file=sys.stderr)
        return 2
    build = Path(sys.argv[1]).resolve()
    paths = sys.stdin.read().split()
    if not paths:
        raise SystemExit("clang_tidy: expected the names of sources on the standard input, found none")
    units = plan(read_sources(build, paths))
    folder, paths = write_units(build, units)

    with ThreadPoolExecutor(len(os.sched_getaffinity(0))) as pool:
        first = []
        second = []
        for unit, path in zip(units, paths):
            if len(unit.sources) > 1:
                first.append((unit, pool.submit(tidy, folder, path)))
            else:
                second.append(pool.submit(tidy, build, unit.sources[0].path))
        for unit in units:
            for source in unit.sources:
                if may_be_hidden(source, unit):
                    second.append(pool.submit(tidy, build, source.path, f"--checks=-*,{USING_CHECK}"))
        for unit, result in first:
            if result.result() is not None:
                names = " ".join(source.path for source in unit.sources)
                print(f"clang_tidy: reading one by one: {names}", file=sys.stderr)
                second += [pool.submit(tidy, build, source.path) for source in unit.sources]
        findings = {text: None for text in (result.result() for result in second) if text}
    for text in findings:
        print(text)
    return 1 if findings else 0


if __name__ == "__main__":
    sys.exit(main())
