"""Reads the code blocks and commands out of the documents.

A block says its language: ```sh, ```python, ```c, ```sql and so on; `text` is not code. On the line above
a block may be a comment, which readers do not see:

    <!-- file: NAME -->      the block is the content of that file, for blocks after it
    <!-- output -->          the block is what the block before it prints; `...` stands for any text
    <!-- not run: REASON --> why the block cannot be run by a test
"""

import re
import subprocess
from dataclasses import dataclass
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
FENCE = re.compile(r"^(?:<!-- (?P<mark>.*?) -->\n)?^```(?P<language>\S*)\n(?P<code>.*?)^```$",
                   re.MULTILINE | re.DOTALL)
COMMAND = re.compile(r"`halvoxctl((?: [a-z][a-z-]*)+)((?: [^`\n]*)?)`")
MARK = re.compile(r"output|(file|not run): (\S.*)")


@dataclass
class Block:
    place: str  # document:line
    language: str
    code: str
    mark: str = ""  # "file", "output", "not run" or nothing
    value: str = ""  # the name or the reason

    @property
    def is_run(self):
        return self.mark not in ("not run", "output")


def is_question(block):
    """Whether the block only asks what is stored, and may therefore be run again."""
    return block.language == "sh" and re.match(r"halvoxctl (events|sql|streams)\b", block.code) is not None


def documents():
    listed = subprocess.run(["git", "ls-files", "--cached", "--others", "--exclude-standard", "*.md"],
                            cwd=ROOT, check=True, capture_output=True, text=True)
    return [ROOT / name for name in listed.stdout.splitlines()
            if (ROOT / name).exists() and not name.startswith("docs/decisions/")]


def blocks(path):
    """The blocks of a document, in order. Raises ValueError for a mark that is none of the three."""
    text = path.read_text(encoding="utf-8")
    name = path.relative_to(ROOT) if ROOT in path.parents else path.name
    found = []
    for match in FENCE.finditer(text):
        place = f"{name}:{text.count(chr(10), 0, match.start()) + 1}"
        mark = match["mark"] or ""
        if mark and not MARK.fullmatch(mark):
            raise ValueError(f"{place}: unknown mark {mark!r}")
        kind, _, value = mark.partition(": ")
        found.append(Block(place, match["language"], match["code"], kind, value))
    if text.count("\n```") + text.startswith("```") != 2 * len(found):
        raise ValueError(f"{name}: a block that has no end, or is indented")
    return found


def commands(path):
    """The `halvoxctl` commands in the prose of a document: (words of the command, options)."""
    prose = FENCE.sub("", path.read_text(encoding="utf-8")).replace("\n", " ")
    return [(words.split(), re.findall(r"--[a-z-]+", rest)) for words, rest in COMMAND.findall(prose)]


def matches(expected, printed):
    """Whether the output is the expected one, in which `...` stands for any text."""
    pattern = ".*".join(re.escape(part) for part in expected.strip("\n").split("..."))
    return re.fullmatch(pattern, printed.strip("\n"), re.DOTALL) is not None
