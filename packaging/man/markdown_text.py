"""Rewrites Markdown of the documents for a man page."""

import re

LINK = re.compile(r"(?<!!)\[((?:[^\[\]]|\[[^\]]*\])*)\]\(([^)\s]+)\)")
HEADING = re.compile(r"^(#+) +(.*?)\s*$")
FENCE = re.compile(r"^```")
COMMENT = re.compile(r"^<!-- (.*?) -->\n", re.MULTILINE)
ROW = re.compile(r"^\s*\|")
# The widest table that fits on a terminal with 80 columns, beside the margin and with its lines.
WIDTH = 70


def outside_code(text, change):
    """Applies `change` to the parts of the text between blocks of code."""
    parts = re.split(r"(^```.*?^```$)", text, flags=re.MULTILINE | re.DOTALL)
    return "".join(part if part.startswith("```") else change(part) for part in parts)


def without_links(text, on_link):
    """The text with its links replaced by their texts. Calls on_link with the target of each."""
    def replaced(match):
        on_link(match[2])
        return match[1]
    return outside_code(text, lambda part: LINK.sub(replaced, part))


def headings(text):
    """Yields (number of the line, level, heading)."""
    in_code = False
    for number, line in enumerate(text.splitlines()):
        in_code ^= FENCE.match(line) is not None
        match = HEADING.match(line)
        if match and not in_code:
            yield number, len(match[1]), match[2]


def without_title(text):
    """The document without its title; its sections become those of the page."""
    lines = text.splitlines()
    for number, level, heading in headings(text):
        if level == 1:
            lines[number] = ""
        else:
            shown = heading.upper() if level == 2 else heading
            lines[number] = "#" * (level - 1) + " " + shown
    return "\n".join(lines).strip("\n") + "\n"


def section(text, wanted):
    """What stands below this heading, until the next one of its level. Raises KeyError without it."""
    found = list(headings(text))
    for place, (number, level, heading) in enumerate(found):
        if heading.replace("`", "") == wanted:
            ends = [other for other, deeper, _ in found[place + 1:] if deeper <= level]
            lines = text.splitlines()[number + 1:ends[0] if ends else None]
            return "\n".join(lines).strip("\n") + "\n"
    raise KeyError(f"there is no heading {wanted!r}")


def cells_of(row):
    """The cells of a row. A bar in code or after a backslash does not separate."""
    cells = re.split(r"(?<!\\)\|(?=(?:[^`]*`[^`]*`)*[^`]*$)", row.strip().strip("|"))
    return [cell.strip() for cell in cells]


def entry(header, cells):
    """One row of a wide table, as an entry of a list: the first cell, then the last, then the others."""
    parts = [cells[-1]] if cells[-1] else []
    for name, cell in zip(header[1:-1], cells[1:-1]):
        if cell:
            parts.append(f"{name[:1].upper()}{name[1:]}: {cell}" if name else cell)
    text = " ".join(part if part.endswith((".", ":", ";")) else part + "." for part in parts)
    term = cells[0] if "`" in cells[0] or "*" in cells[0] else f"**{cells[0]}**"
    return f"\n{term}\n: {text[:1].upper()}{text[1:]}\n"


def table(lines):
    rows = [cells_of(line) for line in lines]
    header, body = rows[0], rows[2:]
    width = sum(max(len(row[column]) for row in [header, *body]) + 3 for column in range(len(header)))
    if width <= WIDTH and any(header):
        return "\n".join(lines)
    return "".join(entry(header, row) for row in body)


def rewritten_tables(text):
    result, rows = [], []
    for line in [*text.split("\n"), None]:
        if line is not None and ROW.match(line):
            rows.append(line)
            continue
        if rows:
            result.append(table(rows))
            rows = []
        if line is not None:
            result.append(line)
    return "\n".join(result)


def for_man(text):
    """The Markdown that lowdown gets: without comments and wide tables."""
    text = COMMENT.sub(lambda match: "It prints:\n\n" if match[1] == "output" else "", text)
    return outside_code(text, rewritten_tables)
