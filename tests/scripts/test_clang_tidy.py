"""scripts/lib/clang_tidy.py finds in many sources read as one what clang-tidy finds in each."""

import collections
import json
import re
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
SCRIPT = ROOT / "scripts/lib/clang_tidy.py"
sys.path.insert(0, str(SCRIPT.parent))

from clang_tidy import USING_CHECK, may_be_hidden, read_sources, tidy, write_units  # noqa: E402
from source_units import plan  # noqa: E402

CLEAN = "int %s(int value) { return value + 1; }\n"

# One finding for each check. `buffer.cpp` has an unused using-declaration of a name that
# `shapes.cpp` uses.
PLANTED = {
    "buffer.cpp": """
#include <memory>
#include <string>
#include <utility>
#include <vector>
using std::pair;
using std::vector;
unsigned long useAfterMove(std::string text) {
  const std::string taken = std::move(text);
  return taken.size() + text.size();
}
int* zero() { return 0; }
bool isEmpty(const vector<int>& list) { return list.size() == 0; }
unsigned long copies(const std::vector<std::string>& list) {
  unsigned long sum = 0;
  for (const std::string text : list) { sum += text.size(); }
  return sum;
}
int dereference(const std::unique_ptr<int>& number) { return *number.get(); }
""",
    "shapes.cpp": """
#include <utility>
#include "shape.h"
using std::pair;
struct Square : Shape {
  int area() const;
  int side = 2;
};
int Square::area() const { return side * side; }
Shape sliced(const Square& square) { return square; }
double half(int number) { return number / 2; }
bool same(int number) { return number == number; }
pair<int, int> two() { return {1, 2}; }
""",
    "loops.cpp": """
#include <cstring>
#include <string>
#include <utility>
void endless() {
  int i = 0;
  while (i < 10) { }
}
void semicolon(bool flag, int& number) {
  if (flag);
  number = 1;
}
int moved(const std::string text) { return static_cast<int>(std::string(std::move(text)).size()); }
bool isEqual(const char* a, const char* b) { return std::strcmp(a, b) == -1; }
std::string literal() { return std::string("text", 200); }
void append(std::string& text, char letter) { text = text + letter; text += 48; }
""",
}
SHAPE = """#pragma once
struct Shape {
  virtual int area() const { return 0; }
  int corners = 4;
};
"""


def checks_in(report):
    return collections.Counter(re.findall(r"\[([a-z][\w.-]+),-warnings-as-errors\]", report or ""))


@unittest.skipUnless(shutil.which("clang-tidy"), "clang-tidy is not installed")
class Findings(unittest.TestCase):
    def setUp(self):
        scratch = tempfile.TemporaryDirectory()
        self.addCleanup(scratch.cleanup)
        # The name is one of those whose headers are checked.
        self.tree = Path(scratch.name).resolve() / "platform"
        self.build = self.tree / "build"
        self.build.mkdir(parents=True)
        shutil.copy(ROOT / ".clang-tidy", self.tree)
        (self.tree / "shape.h").write_text(SHAPE, encoding="utf-8")

    def write(self, texts):
        commands = []
        for name, text in texts.items():
            (self.tree / name).write_text(text, encoding="utf-8")
            command = ["clang++", f"-I{self.tree}", "-std=c++20", "-o", "x.o", "-c", str(self.tree / name)]
            commands.append({"directory": str(self.build), "arguments": command, "file": str(self.tree / name)})
        (self.build / "compile_commands.json").write_text(json.dumps(commands), encoding="utf-8")
        return [str(self.tree / name) for name in texts]

    def run_script(self, paths):
        return subprocess.run([sys.executable, SCRIPT, self.build], input="\n".join(paths),
                              capture_output=True, text=True, timeout=250, check=False)

    def test_a_unit_has_the_findings_of_its_sources(self):
        paths = self.write(PLANTED)
        units = plan(read_sources(self.build, paths))
        self.assertEqual([len(unit.sources) for unit in units], [3])

        folder, [unit] = write_units(self.build, units)
        together = checks_in(tidy(folder, unit))
        alone = sum((checks_in(tidy(self.build, path)) for path in paths), collections.Counter())

        self.assertEqual(alone.pop(USING_CHECK), 1)  # what the unit hides
        self.assertGreaterEqual(len(alone), 10, alone)
        self.assertEqual(together, alone)

    def test_every_finding_is_reported_with_its_source(self):
        run = self.run_script(self.write(PLANTED))
        self.assertEqual(run.returncode, 1, run)
        for name in PLANTED:
            self.assertIn(f"/{name}:", run.stdout)
        self.assertRegex(run.stdout, r"/buffer\.cpp:.*'pair'.*misc-unused-using-decls")

    def test_an_unused_name_is_found_though_another_source_uses_it(self):
        using = "#include <utility>\nusing std::pair;\n"
        run = self.run_script(self.write({
            "a.cpp": using + CLEAN % "first",
            "b.cpp": using + "pair<int, int> second() { return {1, 2}; }\n",
        }))
        self.assertEqual(run.returncode, 1, run)
        self.assertRegex(run.stdout, r"/a\.cpp:2:.*misc-unused-using-decls")
        self.assertNotIn("b.cpp:", run.stdout)

    def test_an_unused_name_that_no_other_source_has_is_found_with_the_unit(self):
        paths = self.write({
            "a.cpp": "#include <utility>\nusing std::exchange, std::pair ;\n" + CLEAN % "first",
            "b.cpp": "#include <vector>\nusing std::vector;\nvector<int> second() { return {1, 2}; }\n",
        })
        [unit] = plan(read_sources(self.build, paths))
        self.assertEqual([may_be_hidden(source, unit) for source in unit.sources], [False, False])
        run = self.run_script(paths)
        self.assertRegex(run.stdout, r"/a\.cpp:2:.*'exchange'.*misc-unused-using-decls")
        self.assertRegex(run.stdout, r"/a\.cpp:2:.*'pair'.*misc-unused-using-decls")
        self.assertNotIn("b.cpp:", run.stdout)

    def test_each_name_of_a_using_declaration_may_be_hidden(self):
        paths = self.write({
            "a.cpp": "#include <utility>\nusing std::exchange, std::pair ;\n" + CLEAN % "first",
            "b.cpp": "#include <utility>\nstd::pair<int, int> second() { return {1, 2}; }\n",
        })
        [unit] = plan(read_sources(self.build, paths))
        self.assertEqual([may_be_hidden(source, unit) for source in unit.sources], [True, False])

    def test_only_a_plain_use_shows_that_a_name_is_not_hidden(self):
        other = "#include <utility>\nstd::pair<int, int> other() { return {1, 2}; }\n"
        using = "#include <utility>\nusing std::pair;\n"
        for text, hidden in (
            ("pair<int, int> one() { return {1, 2}; }\n", False),
            ("int one() { return static_cast<int>(sizeof(pair<int, int>)); }\n", False),
            ("std::pair<int, int> one() { return {1, 2}; }\n", True),
            ("struct Own { int pair; };\nint one(Own own) { return own.pair; }\n", True),
            ("int one(int* pair) { return *pair; }\n", True),
            ("// pair\nconst char* one() { return \"(pair)\"; }\n", True),
        ):
            with self.subTest(text):
                paths = self.write({"a.cpp": using + text, "b.cpp": other})
                [unit] = plan(read_sources(self.build, paths))
                self.assertEqual(may_be_hidden(unit.sources[0], unit), hidden)

    def test_sources_without_findings_pass(self):
        run = self.run_script(self.write({"a.cpp": CLEAN % "first", "b.cpp": CLEAN % "second"}))
        self.assertEqual((run.returncode, run.stdout, run.stderr), (0, "", ""))

    def test_sources_that_only_cannot_be_read_together_pass(self):
        run = self.run_script(self.write({
            "a.cpp": "inline namespace own { int both() { return 1; } }\n",
            "b.cpp": "int both() { return 2; }\nint second() { return both(); }\n",
        }))
        self.assertEqual((run.returncode, run.stdout), (0, ""), run)
        self.assertIn("one by one", run.stderr)

    def test_what_is_not_read_is_no_success(self):
        paths = self.write({"a.cpp": CLEAN % "first"})
        self.assertNotEqual(self.run_script([]).returncode, 0)
        self.assertIn("no compile command", self.run_script([*paths, "missing.cpp"]).stderr)
        other = self.tree / "other.cpp"
        other.write_text(CLEAN % "other", encoding="utf-8")
        (self.build / "empty").mkdir()
        (self.build / "empty/compile_commands.json").write_text("[]", encoding="utf-8")
        self.assertIn("not found", tidy(self.build / "empty", other))

    def test_a_source_that_does_not_compile_fails(self):
        run = self.run_script(self.write({"a.cpp": CLEAN % "first", "b.cpp": "int broken( {\n"}))
        self.assertEqual(run.returncode, 1, run)
        self.assertIn("b.cpp:1", run.stdout)


if __name__ == "__main__":
    unittest.main()
