"""The page about events: it describes every key that the sources have a constant for."""

import re
import subprocess
import sys
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
sys.path.insert(0, str(ROOT / "tests"))

from event_reference import ANY, TYPES, EventReference  # noqa: E402

# Where the service and the reporter name the keys and the events that they make, and how many there
# are at least. A smaller number shows that a source has another form than the pattern.
PLACES = [
    (("service", "session", "backends", "driver"), r'\bKey \w+\("([^"]+)"\)', 20),
    (("service/HVReportingServiceDelegateFeatures.cpp",), r'\.set\("([^"]+)"', 2),
    (("service",), r'kFeatureDomainKey, "([^"]+)"', 1),
    (("service/HVReportingServiceDelegate.cpp",), r'\{"(\w+)", ', 2),
    (("platform/linux/diagnostics/SignatureKeys.h",), r'= "(\w+)"', 6),
    (("reporters/pipewire/ReportingVocabulary.h",), r'\bk\w+Key = "([^"]+)"', 20),
    (("backends", "service"), r'\bk\w+Event = "([^"]+)"', 3),
]


def is_tested(path):
    return not re.search(r"(Test|Fixture)\.(h|cpp)$", path.name) and "testdata" not in path.parts


def sources(names):
    listed = subprocess.run(["git", "ls-files", "--cached", "--others", "--exclude-standard", *names],
                            cwd=ROOT, check=True, capture_output=True, text=True).stdout.splitlines()
    return [ROOT / name for name in listed if name.endswith((".h", ".cpp")) and is_tested(Path(name))]


def constants(names, pattern):
    """The texts that the pattern finds in these sources, with the names of the files."""
    return {text: path.relative_to(ROOT) for path in sources(names)
            for text in re.findall(pattern, path.read_text(encoding="utf-8"))}


class EventReferenceTest(unittest.TestCase):
    def setUp(self):
        self.reference = EventReference()

    def test_every_constant_is_described(self):
        described = self.reference.names() | set(self.reference.events)
        for names, pattern, least in PLACES:
            found = constants(names, pattern)
            self.assertGreaterEqual(len(found), least, pattern)
            for text, path in found.items():
                self.assertIn(text, described, f"{path}: docs/reference/events.md does not describe it")

    def test_every_described_key_is_in_the_sources(self):
        texts = "\n".join(path.read_text(encoding="utf-8") for path in sources(
            ["service", "session", "backends", "driver", "platform", "reporters"]))
        for name in self.reference.names():
            parts = [part for part in re.split(r"<[^>]*>", name) if part.strip("_")]
            for part in parts:
                self.assertIn(part.strip("_"), texts, f"nothing makes {name}")

    def test_every_key_has_a_type(self):
        tables = [self.reference.added, *self.reference.events.values()]
        self.assertGreater(sum(map(len, tables)), 60)
        for table in tables:
            for key in table:
                self.assertTrue(key.types, key.name)
                self.assertLessEqual(key.types, TYPES)

    def test_the_page_is_read_as_it_is_meant(self):
        reference = EventReference(
            "## Keys that the service adds\n| `stamp` | number | s | 1 | when |\n"
            "### `A.B`, `C.D`\n| `k` | text or integer | | 7 | always: x |\n| `any` | as sent | | | |\n"
            "| `<d>_<s>_Simple_<c>` | integer | | | |\n")
        for event in ("A.B", "C.D"):
            self.assertEqual(reference.types_of(event, "k"), {"text", "integer"})
        self.assertEqual(reference.types_of("A.B", "stamp"), {"number"})
        self.assertEqual(reference.types_of("A.B", "any"), ANY)
        self.assertEqual(reference.types_of("A.B", "x_Simple_y"), {"integer"})
        self.assertIsNone(reference.types_of("A.B", "x_State_y"))
        self.assertIsNone(reference.types_of("E.F", "k"))
        self.assertEqual([key.is_always for key in reference.events["A.B"]], [True, False, False])


if __name__ == "__main__":
    unittest.main()
