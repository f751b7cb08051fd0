"""Tidies the man(7) that lowdown 1.0 writes, for mandoc and for readers of the source."""

import re

# lowdown moves the text of an entry, and the next item of a list, up to what is above it.
ENTRY = re.compile(r'^\.LP\n(.+)\n\.if n \\\n\.sp -1v\n\.if t \\\n\.sp -0\.25v\n\.IP "" 5n\n', re.MULTILINE)
ITEM = re.compile(r"^\.if n \\\n\.sp -1\n\.if t \\\n\.sp -0\.25v\n", re.MULTILINE)
HEADING = re.compile(r"^\.(S[HS])\n(.*)$", re.MULTILINE)
# A paragraph that something else begins anyway.
EMPTY = re.compile(r"^\.(?:PP|LP)\n(?=\.(?:S[HS]|PP|LP|TP|IP)\b)", re.MULTILINE)
AFTER_HEADING = re.compile(r"^(\.S[HS] .*\n)\.(?:PP|LP)\n", re.MULTILINE)
# A cell of one line needs no block of text, and tbl then makes the column as wide as the longest cell.
CELL = re.compile(r"T\{\n([^\n|]*)\nT\}")
LITERAL = re.compile(r"\\fB.*?\\fR")
BLOCK = re.compile(r"^\.EX\n.*?^\.EE$", re.MULTILINE | re.DOTALL)


def with_minus_signs(match):
    """A hyphen in what is typed is a minus sign."""
    return re.sub(r"(?<!\\)-", r"\\-", match[0])


def indented(match):
    """A block of code, with minus signs, to the right of the text."""
    return ".RS 4\n" + with_minus_signs(match) + "\n.RE"


def tidied(page):
    page = ENTRY.sub(r".TP\n\1\n", page)
    page = ITEM.sub("", page)
    page = HEADING.sub(r".\1 \2", page)
    page = EMPTY.sub("", page)
    page = AFTER_HEADING.sub(r"\1", page)
    page = CELL.sub(r"\1", page).replace("tab(|) expand allbox;", "tab(|) box;")
    # The terminal has no other font for code.
    page = page.replace(r"\fC", r"\fB")
    page = LITERAL.sub(with_minus_signs, page)
    page = BLOCK.sub(indented, page)
    page = re.sub(r"^(\.SH NAME\n\S+) - ", r"\1 \\- ", page, flags=re.MULTILINE)
    # The first line asks man for tbl.
    return re.sub(r"\A.*\n", "'\\\\\" t\n" if "\n.TS\n" in page else "", page)
