"""The headers of the client library are documented completely: Doxygen makes their pages without a warning."""

import re
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]


@unittest.skipIf(shutil.which("doxygen") is None, "doxygen is not installed")
class ApiPages(unittest.TestCase):
    def setUp(self):
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        self.addCleanup(shutil.rmtree, self.directory, True)

    def make_pages(self, *settings):
        """Runs Doxygen with our settings, those given here last. Returns its status and what it printed."""
        settings = ("@INCLUDE_PATH = docs", "@INCLUDE = Doxyfile", f"OUTPUT_DIRECTORY = {self.directory}", *settings)
        made = subprocess.run(["doxygen", "-"], input="\n".join(settings), cwd=ROOT, text=True, check=False,
                              stdout=subprocess.PIPE, stderr=subprocess.STDOUT)
        return made.returncode, made.stdout

    def text_of(self, page):
        return re.sub(r"<[^>]+>", "", (self.directory / "html" / page).read_text(encoding="utf-8"))

    def test_the_public_headers_give_no_warning(self):
        self.assertEqual(self.make_pages(), (0, ""))

        header = (ROOT / "client/halvox.h").read_text(encoding="utf-8")
        declared = re.findall(r"^HALVOX_API [^;]*?\b(halvox_\w+)\(", header, re.MULTILINE)
        self.assertGreater(len(declared), 40)
        text = self.text_of("halvox_8h.html")
        self.assertEqual([name for name in declared if f"{name}()" not in text], [])

    def test_functions_that_share_a_comment_all_show_it(self):
        self.make_pages()

        shared = self.text_of("halvox_8h.html").count("Look up the number of a name, ignoring case, and store it.")
        self.assertGreaterEqual(shared, 3)

    def test_a_function_without_a_comment_is_an_error(self):
        header = self.directory / "bare.h"
        header.write_text("/** @file\n * A header. */\nint bare(int number);\n")

        status, printed = self.make_pages(f"INPUT = {header}")

        self.assertNotEqual(status, 0)
        self.assertIn("bare(int number)", printed)


if __name__ == "__main__":
    unittest.main()
