#!/usr/bin/env python3
"""Runs clang-tidy on many sources faster than one run for each source does.

clang-tidy spends nearly all of its time on the standard headers: it parses them and matches every
declaration in them, again for each source. Here it reads several sources as one: a unit, the
concatenation of sources that have the same compiler options. The text is concatenated, not included,
because some checks look only at the main file.

- A unit without a finding proves that its sources have none. After a finding, or an error that only
  the concatenation has, the sources of the unit are read one by one, and what that reports counts.
- Sources share a unit only if no name that one of them keeps to itself (in an anonymous namespace, a
  static function, an alias) occurs in another, and if their headers define no type twice. Sources
  that define macros stay alone. This looks at the text only. What it misses, such as two classes of
  one name in headers of libraries, makes a unit that does not compile, which only costs time.
- A use in one source hides an unused using-declaration in another. Sources with using-declarations
  are therefore read a second time by themselves, with only that check.

    clang_tidy.py BUILD_DIRECTORY < names of sources, one a line

Prints the findings. Exits with 1 if there are any.
"""

import functools
import json
import os
import re
import shlex
import subprocess
import sys
from concurrent.futures import ThreadPoolExecutor
from dataclasses import dataclass, field
from pathlib import Path

# Larger units save little: the standard headers are then a small part of the time. With few units
# a processor stays idle at the end.
UNIT_BYTES = 60_000

USING_CHECK = "misc-unused-using-decls"

TOKEN = re.compile(
    r'//[^\n]*|/\*.*?\*/|R"(?P<mark>[^(\s]*)\(.*?\)(?P=mark)"|"(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])*\''
    r"|\d[\w.']*|(?P<word>[A-Za-z_]\w*)|::|->|[^\s\w]",
    re.DOTALL,
)
DIRECTIVE = re.compile(r"^[ \t]*#[ \t]*(\w+)(?:\\\n|[^\n])*", re.MULTILINE)
USING_DECLARATION = re.compile(r"\busing\s+(?:typename\s+)?(?:::)?\w+(?:::\w+)+\s*[;,]")
INCLUDE = re.compile(r'^\s*#\s*include\s*"([^"]+)"', re.MULTILINE)
DECLARES = {"class", "struct", "union", "enum", "using", "concept", "namespace"}
NO_NAMES = DECLARES | set(
    """alignas auto bool char const constexpr decltype double explicit final float int long noexcept
    operator private protected public requires short signed sizeof static static_assert template
    unsigned void volatile wchar_t""".split()
)
# A name before one of these may be the name that is declared.
AFTER_NAME = set("(={;[:")


def words_and_marks(text):
    """The tokens of a source without comments, directives and literals: (token, is a word)."""
    tokens = []
    for match in TOKEN.finditer(DIRECTIVE.sub("", text)):
        token = match.group()
        if token.startswith(("//", "/*")):
            continue
        if match.group("word"):
            tokens.append((token, True))
        elif token[0].isdigit() or token[0] in "\"'" or token.startswith('R"'):
            tokens.append(("0", False))
        else:
            tokens.append((token, False))
    return tokens


def own_names(tokens):
    """The names that a source may keep to itself. Rather too many than too few."""
    names = set()
    # For each open brace, whether it is of an anonymous namespace.
    anonymous = []
    parentheses = 0
    static = False
    for i, (token, is_word, depth) in enumerate(with_depth(tokens)):
        before = tokens[i - 1][0] if i else ";"
        if token == "{":
            anonymous.append(before == "namespace")
        elif token == "}" and anonymous:
            anonymous.pop()
        parentheses += (token == "(") - (token == ")")
        if parentheses or depth:
            continue
        if token in ("static", ";", "}"):
            static = token == "static"
        if not is_word:
            continue
        following = tokens[i + 1][0] if i + 1 < len(tokens) else ";"
        if before in ("using", "namespace"):
            if following == "=":
                names.add(token)
        elif (static or any(anonymous)) and before not in ("::", "."):
            if before in DECLARES or following in AFTER_NAME:
                names.add(token)
    return names - NO_NAMES


@functools.cache
def header(path):
    """What a header of ours declares and includes: its types and aliases, the paths of headers."""
    try:
        text = Path(path).read_text(encoding="utf-8")
    except OSError:  # of a library, or generated
        return frozenset(), ()
    return frozenset(types(words_and_marks(text))), tuple(INCLUDE.findall(text))


def types(tokens):
    """The types and aliases that are defined here outside of other types and functions."""
    names = set()
    for i, (token, is_word, depth) in enumerate(with_depth(tokens)):
        before = tokens[i - 1][0] if i else ";"
        following = tokens[i + 1][0] if i + 1 < len(tokens) else ";"
        if is_word and depth == 0 and before in DECLARES - {"namespace"}:
            if following in ("{", ":", "=", "final"):
                names.add(token)
    return names


def with_depth(tokens):
    """The tokens, each with the number of open braces that are not of a namespace."""
    depth = 0
    namespaces = 0
    opening = False
    for token, is_word in tokens:
        if token == "{":
            if opening:
                namespaces += 1
            else:
                depth += 1
            opening = False
        elif token == "}":
            if depth:
                depth -= 1
            else:
                namespaces -= 1
        elif token == "namespace":
            opening = True
        elif token in ("=", ";"):
            opening = False
        yield token, is_word, depth


def types_of_headers(text):
    """The types of all headers of ours that a source includes: each with the header's path."""
    found = {}
    seen = set()
    paths = INCLUDE.findall(text)
    while paths:
        path = paths.pop()
        if path not in seen:
            seen.add(path)
            names, included = header(path)
            found.update(dict.fromkeys(names, path))
            paths.extend(included)
    return found


@dataclass
class Source:
    path: str
    options: tuple
    text: str
    alone: bool = False
    names: set = field(default_factory=set)
    words: set = field(default_factory=set)
    types: dict = field(default_factory=dict)

    def __post_init__(self):
        self.alone = any(m.group(1) in ("define", "undef", "pragma") for m in DIRECTIVE.finditer(self.text))
        tokens = words_and_marks(self.text)
        self.names = own_names(tokens)
        self.words = {token for token, is_word in tokens if is_word}
        self.types = types_of_headers(self.text)

    def has_using_declaration(self):
        return USING_DECLARATION.search(self.text) is not None


@dataclass
class Unit:
    options: tuple
    sources: list = field(default_factory=list)
    size: int = 0
    names: set = field(default_factory=set)
    words: set = field(default_factory=set)
    types: dict = field(default_factory=dict)

    def takes(self, source):
        if not self.sources:
            return True
        return (
            not source.alone
            and not self.sources[0].alone
            and self.size + len(source.text) <= UNIT_BYTES
            and self.names.isdisjoint(source.words)
            and self.words.isdisjoint(source.names)
            and self.names.isdisjoint(source.types)
            and source.names.isdisjoint(self.types)
            and all(self.types.get(name, path) == path for name, path in source.types.items())
        )

    def add(self, source):
        self.sources.append(source)
        self.size += len(source.text)
        self.names |= source.names
        self.words |= source.words
        self.types.update(source.types)

    def text(self):
        return "\n".join(source.text for source in self.sources)


def plan(sources):
    """The units of these sources, the largest first."""
    units = []
    for source in sorted(sources, key=lambda s: s.path):
        # Neighbours include the same headers: the last unit that takes the source is the best.
        unit = next((u for u in reversed(units) if u.options == source.options and u.takes(source)), None)
        if unit is None:
            unit = Unit(source.options)
            units.append(unit)
        unit.add(source)
    return sorted(units, key=lambda u: -u.size)


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
    # It succeeds, too, when it skips a file that has no compile command.
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
                if len(unit.sources) > 1 and source.has_using_declaration():
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
