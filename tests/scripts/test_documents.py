"""The documents: every relative link and every path in them leads somewhere."""

import re
import subprocess
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
LINK = re.compile(r"\[[^\]]*\]\(([^)\s]+)\)")
CODE = re.compile(r"`([^`\n]+)`")
HEADING = re.compile(r"^#+ +(.*?)\s*$", re.MULTILINE)
FENCE = re.compile(r"^```.*?^```$", re.MULTILINE | re.DOTALL)


def listed(*patterns):
    done = subprocess.run(["git", "ls-files", "--cached", "--others", "--exclude-standard", *patterns],
                          cwd=ROOT, check=True, capture_output=True, text=True)
    return [ROOT / name for name in done.stdout.splitlines() if (ROOT / name).exists()]


def prose(document):
    return FENCE.sub("", document.read_text(encoding="utf-8"))


def anchors(document):
    """The names that headings get when the document is shown."""
    names = set()
    for heading in HEADING.findall(prose(document)):
        text = re.sub(r"[^\w\- ]", "", heading.lower())
        names.add(text.replace(" ", "-"))
    return names


def broken_links(document, text):
    """Yields the links in `text` that lead nowhere from the place of `document`."""
    for link in LINK.findall(text):
        if re.match(r"[a-z]+:", link):
            continue
        path, _, anchor = link.partition("#")
        target = (document.parent / path).resolve() if path else document
        if not target.exists() or ROOT not in (target, *target.parents):
            yield link
        elif anchor and (target.suffix != ".md" or anchor not in anchors(target)):
            yield link


def missing_paths(text, folders):
    """Yields the texts in backquotes that begin like a path of this tree but name nothing in it."""
    for code in CODE.findall(text):
        path = code.split("#")[0].rstrip("/")
        first, slash, _ = code.partition("/")
        if slash and first in folders and re.fullmatch(r"[\w./-]+", path) and not (ROOT / path).exists():
            yield code


class Documents(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        cls.documents = listed("*.md")
        cls.folders = {path.relative_to(ROOT).parts[0] for path in listed() if path.parent != ROOT}

    def test_there_are_documents_with_links(self):
        self.assertIn(ROOT / "docs/ARCHITECTURE.md", self.documents)
        self.assertGreater(sum(len(LINK.findall(prose(one))) for one in self.documents), 20)

    def test_links_lead_to_files_and_headings(self):
        for document in self.documents:
            with self.subTest(document=str(document.relative_to(ROOT))):
                self.assertEqual(list(broken_links(document, prose(document))), [])

    def test_paths_in_backquotes_exist(self):
        for document in self.documents:
            with self.subTest(document=str(document.relative_to(ROOT))):
                self.assertEqual(list(missing_paths(prose(document), self.folders)), [])

    def test_pages_are_found_from_the_readme(self):
        readme = prose(ROOT / "README.md")
        for page in listed("docs/*.md"):
            name = page.relative_to(ROOT)
            if not str(name).startswith("docs/decisions/"):
                self.assertIn(f"({name})", readme)

    def test_broken_links_are_found(self):
        page = ROOT / "docs/ARCHITECTURE.md"
        text = "[a](nothing.md) [b](#no-such-heading) [c](../../outside.md) [d](configuration.md#keys)"
        self.assertEqual(list(broken_links(page, text)),
                         ["nothing.md", "#no-such-heading", "../../outside.md"])

    def test_missing_paths_are_found(self):
        text = "`service/main.cpp` `service/none.cpp` `session/` `tools/gone/`"
        self.assertEqual(list(missing_paths(text, self.folders)), ["service/none.cpp", "tools/gone/"])


if __name__ == "__main__":
    unittest.main()
