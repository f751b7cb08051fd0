"""Puts C++ sources together into units that compile as one file.

A compiler spends most of its time on the standard headers. Several sources in one unit share that
work. Sources share a unit only if no name that one of them keeps to itself (in an anonymous namespace,
a static function, an alias) occurs in another, and if their headers define no type twice. Sources that
define macros stay alone. This looks at the text only: what it misses makes a unit that does not compile.

As a program it plans the unity build. It reads lines "TARGET<tab>SOURCE" and prints a CMake script that
puts the sources of each target into groups.

    source_units.py < lines
"""

import functools
import re
import sys
from dataclasses import dataclass, field
from pathlib import Path

# Larger units save little: the standard headers are then a small part of the time. With fewer units
# a processor stays idle at the end.
UNIT_BYTES = 60_000

TOKEN = re.compile(
    r'//[^\n]*|/\*.*?\*/|R"(?P<mark>[^(\s]*)\(.*?\)(?P=mark)"|"(?:\\.|[^"\\\n])*"|\'(?:\\.|[^\'\\\n])*\''
    r"|\d[\w.']*|(?P<word>[A-Za-z_]\w*)|::|->|[^\s\w]",
    re.DOTALL,
)
DIRECTIVE = re.compile(r"^[ \t]*#[ \t]*(\w+)(?:\\\n|[^\n])*", re.MULTILINE)
INCLUDE = re.compile(r'^\s*#\s*include\s*"([^"]+)"', re.MULTILINE)
# Macros whose uses look like declarations of functions.
TESTS = {"TEST", "TEST_F", "TEST_P", "TYPED_TEST", "TYPED_TEST_P", "INSTANTIATE_TEST_SUITE_P"}
DECLARES = {"class", "struct", "union", "enum", "using", "concept", "namespace"}
NO_NAMES = DECLARES | set(
    """alignas auto bool char const constexpr decltype double explicit final float int long noexcept
    operator private protected public requires short signed sizeof static static_assert template
    unsigned void volatile wchar_t""".split()
)
# What stands before a name that is declared elsewhere, such as a base class.
NOT_BEFORE_NAME = {"::", ".", "public", "protected", "private"}
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
    """The names that a source may keep to itself. In doubt, a name is included."""
    names = set()
    # For each open brace, whether it opened an anonymous namespace.
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
        elif (static or any(anonymous)) and before not in NOT_BEFORE_NAME:
            if before in DECLARES or following in AFTER_NAME:
                names.add(token)
    return names - NO_NAMES - TESTS


@functools.cache
def header(path):
    """What a header of ours declares and includes: its types and aliases, its variables, the paths of headers."""
    try:
        text = Path(path).read_text(encoding="utf-8")
    except OSError:  # of a library, or generated
        return frozenset(), frozenset(), ()
    tokens = words_and_marks(text)
    return frozenset(types(tokens)), frozenset(variables(tokens)), tuple(INCLUDE.findall(text))


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


def variables(tokens):
    """The variables that are defined here outside of types and functions."""
    names = set()
    for i, (token, is_word, depth) in enumerate(with_depth(tokens)):
        before = tokens[i - 1][0] if i else ";"
        following = tokens[i + 1][0] if i + 1 < len(tokens) else ";"
        if is_word and depth == 0 and following in ("=", "{", "[") and before not in DECLARES | {"::"}:
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


def names_of_headers(text):
    """The types, each with its header's path, and the variables of all headers of ours that a source includes."""
    found = {}
    values = set()
    seen = set()
    paths = INCLUDE.findall(text)
    while paths:
        path = paths.pop()
        if path not in seen:
            seen.add(path)
            names, defined, included = header(path)
            found.update(dict.fromkeys(names, path))
            values |= defined
            paths.extend(included)
    return found, values


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
        self.types, variables_of_headers = names_of_headers(self.text)
        # A name of its own that a header of another source also defines would be ambiguous there.
        self.words |= variables_of_headers - self.names


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
        # The last unit that takes the source is the best one, because neighbours include the same
        # headers.
        unit = next((u for u in reversed(units) if u.options == source.options and u.takes(source)), None)
        if unit is None:
            unit = Unit(source.options)
            units.append(unit)
        unit.add(source)
    return sorted(units, key=lambda u: -u.size)


def main():
    targets = {}
    for line in sys.stdin.read().splitlines():
        target, path = line.split("\t")
        targets.setdefault(target, []).append(path)
    for target, paths in targets.items():
        sources = [Source(path, (), Path(path).read_text(encoding="utf-8")) for path in paths]
        for number, unit in enumerate(unit for unit in plan(sources) if len(unit.sources) > 1):
            names = " ".join(f'"{source.path}"' for source in unit.sources)
            print(f"set_source_files_properties({names} TARGET_DIRECTORY {target} "
                  f"PROPERTIES UNITY_GROUP {target}_{number})")
    return 0


if __name__ == "__main__":
    sys.exit(main())
