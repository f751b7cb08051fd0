"""scripts/lib/source_units.py puts together only what compiles together."""

import contextlib
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
sys.path.insert(0, str(ROOT / "scripts/lib"))

from source_units import Source, plan  # noqa: E402


class Units(unittest.TestCase):
    def units(self, *texts):
        sources = [Source(f"{i}.cpp", ("clang++",), text) for i, text in enumerate(texts)]
        return [[source.path for source in unit.sources] for unit in plan(sources)]

    def test_sources_with_names_of_their_own_share_a_unit(self):
        self.assertEqual(self.units("namespace { int a() { return 1; } }", "namespace { int b() { return 1; } }"),
                         [["0.cpp", "1.cpp"]])

    def test_a_name_of_one_source_does_not_occur_in_another(self):
        own = ("namespace { int kOne = 1; }", "namespace x { namespace { void kOne(int); } }",
               "static int kOne() { return 1; }", "using kOne = int;", "namespace { struct kOne final {}; }",
               "namespace kOne = std::chrono;", "namespace { constexpr int kOne[] = {1, 2}; }",
               "namespace { enum class kOne : char { kA }; }")
        for text in own:
            self.assertEqual(len(self.units(text, "int f() { return kOne; }")), 2, text)
            self.assertEqual(len(self.units("int f() { return kOne; }", text)), 2, text)

    def test_names_in_comments_literals_and_functions_do_not_count(self):
        own = "namespace { int kOne = 1; }"
        for text in ("// kOne\nint f();", 'const char* f() { return "kOne"; }', "/* kOne */ int f();",
                     'auto f() { return R"(" kOne)"; }'):
            self.assertEqual(len(self.units(own, text)), 1, text)
        self.assertEqual(len(self.units("int f() { int kOne = 1; return kOne; }", "int kOne() { return 1; }")), 1)

    def test_sources_with_macros_stay_alone(self):
        for text in ("#define A 1\n", "#undef A\n", "#  pragma pack(1)\n"):
            self.assertEqual(len(self.units(text, "int f();\n")), 2, text)

    def test_sources_with_other_options_stay_apart(self):
        sources = [Source("a.cpp", ("clang++",), "int a();"), Source("b.cpp", ("clang++", "-DX"), "int b();")]
        self.assertEqual(len(plan(sources)), 2)

    def test_tests_of_one_fixture_share_a_unit(self):
        texts = ("namespace { TEST_F(Fixture, A) {} TEST(Suite, A) {} }", "namespace { TEST_F(Fixture, B) {} TEST(Suite, B) {} }")
        self.assertEqual(len(self.units(*texts)), 1)

    def test_fixtures_of_one_base_share_a_unit(self):
        texts = ("namespace { class A : public Fixture { void a(); }; TEST_F(A, One) {} }",
                 "namespace { struct B final : public Fixture {}; TEST_F(B, One) {} }", "class Fixture;")
        self.assertEqual(len(self.units(*texts)), 1)

    def test_a_name_of_one_source_is_no_variable_in_a_header_of_another(self):
        own = "namespace { constexpr int kOne = 1; }"
        for header in ("inline constexpr int kOne = 2;", "namespace x { inline constexpr int kOne{2}; }"):
            with self.header(header) as name:
                user = f'#include "{name}"\nint f() {{ return 1; }}\n'
                self.assertEqual(len(self.units(own, user)), 2, header)
                self.assertEqual(len(self.units(user, own)), 2, header)
                # Such a header must not keep other sources apart.
                self.assertEqual(len(self.units(user, user.replace("f()", "g()"))), 1, header)

    def test_headers_that_define_a_type_twice_stay_apart(self):
        with self.header("struct Both {};") as first, self.header("struct Both {};") as second:
            texts = (f'#include "{first}"\nint f();\n', f'#include "{second}"\nint g();\n')
            self.assertEqual(len(self.units(*texts)), 2)

    @contextlib.contextmanager
    def header(self, text):
        with tempfile.NamedTemporaryFile("w", suffix=".h", encoding="utf-8") as file:
            file.write(text)
            file.flush()
            yield file.name

    def test_the_program_prints_groups_of_two_sources_or_more(self):
        with tempfile.TemporaryDirectory() as folder:
            texts = {"a.cpp": "int a();", "b.cpp": "int b();", "c.cpp": "#define C\nint c();"}
            for name, text in texts.items():
                (Path(folder) / name).write_text(text, encoding="utf-8")
            lines = "".join(f"first\t{folder}/{name}\n" for name in texts) + f"second\t{folder}/a.cpp\n"
            run = subprocess.run([sys.executable, ROOT / "scripts/lib/source_units.py"], input=lines,
                                 capture_output=True, text=True, check=True)
            self.assertEqual(run.stdout, f'set_source_files_properties("{folder}/a.cpp" "{folder}/b.cpp" '
                             "TARGET_DIRECTORY first PROPERTIES UNITY_GROUP first_0)\n")


if __name__ == "__main__":
    unittest.main()
