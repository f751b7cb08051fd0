"""Reads the page about events and keys, docs/reference/events.md."""

import re
from pathlib import Path

PAGE = Path(__file__).resolve().parents[1] / "docs/reference/events.md"
TYPES = {"integer", "number", "boolean", "text", "array", "dictionary"}
ANY = frozenset(TYPES)
ADDED = "Keys that the service adds"
READ = "Keys that the service reads"
_HEADING = re.compile(r"^(#+) (.+)$")
_CODE = re.compile(r"`([^`]+)`")


class DescribedKey:
    """A row of a table. A part in <> stands for any text."""

    def __init__(self, name, cells):
        self.name = name
        self._pattern = re.compile(
            "".join(".*" if part.startswith("<") else re.escape(part)
                    for part in re.split(r"(<[^>]*>_?)", name)), re.DOTALL)
        self.is_pattern = "<" in name
        types = cells[1] if len(cells) > 1 else ""
        self.types = ANY if types.startswith("as ") else frozenset(re.findall(r"\w+", types)) & TYPES
        self.is_always = len(cells) > 4 and cells[4].startswith("always")

    def matches(self, key):
        return self._pattern.fullmatch(key) is not None


class EventReference:
    """`events` has the described keys by the name of the event, `added` those in all messages."""

    def __init__(self, text=None):
        self.events, self.added, self.read = {}, [], []
        tables = []
        for line in (PAGE.read_text(encoding="utf-8") if text is None else text).splitlines():
            heading = _HEADING.match(line)
            if heading:
                tables = self._tables(*heading.groups())
            elif line.startswith("| `"):
                cells = re.split(r"\s*\|\s*", line.strip("| "))
                for name in _CODE.findall(cells[0]):
                    for table in tables:
                        table.append(DescribedKey(name, cells))

    def _tables(self, level, title):
        if level == "###":
            return [self.events.setdefault(name, []) for name in _CODE.findall(title)]
        return {ADDED: [self.added], READ: [self.read]}.get(title, [])

    def names(self):
        """All keys that are described anywhere."""
        tables = [self.added, self.read, *self.events.values()]
        return {key.name for table in tables for key in table}

    def types_of(self, event, key):
        """The types that are described for a key of an event; None if the key is not."""
        described = [one for one in self.events.get(event, []) if one.matches(key)]
        # An exact name says more than a pattern.
        described.sort(key=lambda one: one.is_pattern)
        described += [one for one in self.added if one.matches(key)]
        return described[0].types if described else None
