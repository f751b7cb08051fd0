#!/usr/bin/env python3
"""Makes a man page from a source in Markdown:

    make_page.py --tree TREE SOURCE > PAGE

The name of the source says the page: halvoxctl.1.md is halvoxctl(1). lowdown translates the Markdown. Before
that, this program replaces these lines:

    @include DOCUMENT@           the document of this tree without its title
    @include DOCUMENT#HEADING@   what stands below this heading in it
    @header FILE@                the functions of a header and their comments
    @notes COMMAND@              packaging/man/commands/COMMAND.md, if it exists

A man page has no links and little width: texts of links stay, documents that a page names are listed at its
end, and the rows of wide tables become entries of a list.
"""

import argparse
import os
import re
import subprocess
import sys
from datetime import datetime, timezone
from pathlib import Path

sys.path.insert(0, str(Path(__file__).parent))
sys.dont_write_bytecode = True

import c_header  # noqa: E402
import man_macros  # noqa: E402
import markdown_text  # noqa: E402

SECTIONS = {"1": "User Commands", "3": "Library Functions", "5": "File Formats", "7": "Miscellanea",
            "8": "System Administration"}
# The documents that are a page themselves.
PAGES = {"docs/configuration.md": "halvox.toml(5)", "docs/reference/database.md": "halvox-database(5)",
         "docs/reference/protocol.md": "halvox-protocol(7)"}
DIRECTIVE = re.compile(r"^@(include|header|notes) (.+)@$", re.MULTILINE)
INSTALLED = "/usr/share/doc/halvox-doc"


class Page:
    """The source of one page. `named` collects the documents that it names."""

    def __init__(self, tree, source):
        self.tree = tree
        self.source = source
        self.name, self.section = source.name.removesuffix(".md").rsplit(".", 1)
        self.named = []

    def markdown(self):
        text = DIRECTIVE.sub(self.replacement, self.source.read_text(encoding="utf-8"))
        return markdown_text.for_man(text) + self.documents()

    def replacement(self, match):
        kind, argument = match.groups()
        if kind == "header":
            return c_header.markdown((self.tree / argument).read_text(encoding="utf-8"))
        if kind == "notes":
            notes = self.tree / "packaging/man/commands" / (argument.replace(" ", "-") + ".md")
            return notes.read_text(encoding="utf-8") if notes.exists() else ""
        document, _, heading = argument.partition("#")
        path = self.tree / document
        text = path.read_text(encoding="utf-8")
        text = markdown_text.section(text, heading) if heading else markdown_text.without_title(text)
        return markdown_text.without_links(text, lambda link: self.note_link(path, link))

    def note_link(self, document, link):
        target = link.split("#")[0]
        if not target or re.match(r"[a-z]+:", target):
            return
        name = str((document.parent / target).resolve().relative_to(self.tree))
        if name not in self.named and PAGES.get(name) != f"{self.name}({self.section})":
            self.named.append(name)

    def documents(self):
        """The list of the documents that have no page of their own."""
        names = [name for name in self.named if name not in PAGES and name.endswith((".md", ".xml"))]
        if not names:
            return ""
        return ("\n# FILES OF THE DOCUMENTATION\n\nThe package halvox-doc has these files in "
                f"`{INSTALLED}`:\n\n" + "".join(f"- `{name}`\n" for name in names))


def date():
    """The day of the build; a package says its own."""
    seconds = os.environ.get("SOURCE_DATE_EPOCH")
    day = datetime.now(timezone.utc) if seconds is None else datetime.fromtimestamp(int(seconds), timezone.utc)
    return day.strftime("%Y-%m-%d")


def make(tree, source):
    page = Page(tree.resolve(), source)
    metadata = {"title": page.name.upper(), "section": page.section, "source": "Halvox", "date": date(),
                "volume": SECTIONS[page.section]}
    done = subprocess.run(
        ["lowdown", "-s", "-tman", "--out-no-smarty", "--parse-no-super", "--parse-no-metadata",
         "--parse-no-intraemph",
         *(word for key, value in metadata.items() for word in ("-m", f"{key}={value}"))],
        input=page.markdown(), stdout=subprocess.PIPE, text=True, check=True)
    return man_macros.tidied(done.stdout)


if __name__ == "__main__":
    parser = argparse.ArgumentParser(description="Makes a man page from a source in Markdown.")
    parser.add_argument("--tree", type=Path, required=True)
    parser.add_argument("source", type=Path)
    arguments = parser.parse_args()
    sys.stdout.write(make(arguments.tree, arguments.source))
