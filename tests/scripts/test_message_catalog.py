"""The journal's catalog explains exactly the log lines that get an identifier, and these lines exist."""

import re
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
KNOWN = ROOT / "platform/linux/log/MessageIds.cpp"
CATALOG = ROOT / "packaging/journal/halvox.catalog"
ROW = re.compile(r'\{"(\w+)", "([^"]+)",\s*"([^"]+)"\}')


def rows():
    return ROW.findall(KNOWN.read_text())


def entries():
    """The identifier, the fields and the text of each entry."""
    found = re.findall(r"^-- (\S+)\n(.*?)\n\n(.*?)(?=^-- |\Z)", CATALOG.read_text(), re.MULTILINE | re.DOTALL)
    return [(name, dict(line.split(": ", 1) for line in fields.splitlines()), text.strip())
            for name, fields, text in found]


class MessageCatalog(unittest.TestCase):
    def test_every_identifier_is_explained_once(self):
        explained = [name for name, _, _ in entries()]

        self.assertEqual(len(explained), len(set(explained)))
        self.assertEqual(set(explained), {name for _, _, name in rows()})
        self.assertEqual(len(explained), 20)

    def test_identifiers_are_those_of_the_journal(self):
        for _, _, name in rows():
            self.assertRegex(name, "^[0-9a-f]{32}$")

    def test_every_entry_has_a_subject_and_a_text(self):
        for name, fields, text in entries():
            with self.subTest(name):
                self.assertEqual(fields["Defined-By"], "Halvox")
                self.assertTrue(fields["Subject"])
                self.assertTrue(text)

    def test_the_page_lists_every_entry(self):
        page = (ROOT / "docs/reference/log-messages.md").read_text()
        self.assertEqual(re.findall(r"^\| `(\w{32})` \| (.*) \|$", page, re.MULTILINE),
                         [(name, fields["Subject"]) for name, fields, _ in entries()])

    def test_the_lines_are_in_the_sources_of_their_units(self):
        for unit, part, _ in rows():
            with self.subTest(unit=unit, part=part):
                self.assertTrue(any(
                    f'"{unit}"' in text and re.search(rf'"[^"\n]*{re.escape(part)}', text)
                    for text in self.sources()))

    def sources(self):
        """Each source of the platform with its header. The compiler joins neighbouring literals."""
        for source in (ROOT / "platform/linux").rglob("*.cpp"):
            if source.name != KNOWN.name and not source.stem.endswith(("Test", "Fixture")):
                header = source.with_suffix(".h")
                text = source.read_text() + (header.read_text() if header.exists() else "")
                yield re.sub(r'"\s*\n\s*"', "", text)


if __name__ == "__main__":
    unittest.main()
