"""scripts/coverage reads what gcov knows of a program, and measures the inner ring only."""

import importlib.machinery
import importlib.util
import subprocess
import tempfile
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]


def load():
    loader = importlib.machinery.SourceFileLoader("coverage_script", str(ROOT / "scripts/coverage"))
    module = importlib.util.module_from_spec(importlib.util.spec_from_loader(loader.name, loader))
    loader.exec_module(module)
    return module


class Coverage(unittest.TestCase):
    def setUp(self):
        self.script = load()

    def test_the_programs_of_each_folder_are_found(self):
        programs = self.script.test_programs()
        for folder in ("service", "session", "backends", "driver", "tracing", "platform"):
            self.assertIn(f"halvox_{folder}_test", programs)

    def test_only_code_of_the_inner_ring_counts(self):
        for path in ("session/MessageHistory.cpp", "platform/value.h"):
            self.assertTrue(self.script.is_measured(Path(path)), path)
        for path in ("session/MessageHistoryTest.cpp", "platform/value_test.cpp",
                     "service/ServiceFixture.h", "service/main.cpp", "platform/fake/Journal.cpp",
                     "platform/linux/log/LogQueue.cpp", "client/WireValue.cpp"):
            self.assertFalse(self.script.is_measured(Path(path)), path)

    def test_lines_are_counted_as_run_or_not(self):
        with tempfile.TemporaryDirectory() as name:
            top = Path(name).resolve()
            self.script.ROOT = top
            self.script.BUILD = top / "build"
            (top / "session").mkdir()
            (top / "build/session").mkdir(parents=True)
            (top / "session/Sign.cpp").write_text(
                "int main(int count, char**) {\n  if (count > 1) {\n    return 2;\n  }\n"
                "  return 0;\n}\n")
            subprocess.run(["g++", "-O0", "--coverage", "../../session/Sign.cpp", "-o", "sign"],
                           cwd=top / "build/session", check=True)
            subprocess.run(["./sign"], cwd=top / "build/session", check=True)

            counts = self.script.read_counts(1)

            self.assertEqual(list(counts), [Path("session/Sign.cpp")])
            lines = counts[Path("session/Sign.cpp")]
            self.assertEqual({line for line, count in lines.items() if count == 0}, {3})
            self.assertIn("3 of      4 lines   75.00 %",
                          self.script.figure("Sign.cpp", list(lines.values()))[0])


if __name__ == "__main__":
    unittest.main()
