"""scripts/mutate: which mutants it makes, and which of them it reports as killed."""

import random
import shutil
import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
sys.path.insert(0, str(ROOT / "scripts/lib"))

from mutation import build  # noqa: E402
from mutation.campaign import Campaign, Choice, shares, sources_in  # noqa: E402
from mutation.mutants import mutants_of  # noqa: E402

SOURCE = """\
#include "session/Planted.h"
#define LIMIT 7

// Not 1 < 2 && "text"; either.
namespace planted {

/* Nor x = 3; */
int noticed() { return 10; }

int unnoticed() { return 20; }

int noticedByOthers() { return 30; }

int counted(int rounds) {
  int sum = 0;
  while (sum < rounds) {
    ++sum;
  }
  return sum;
}

}  // namespace planted
"""
PLANTED = {
    "CMakeLists.txt": """\
cmake_minimum_required(VERSION 3.23)
project(planted CXX)
set(CMAKE_RUNTIME_OUTPUT_DIRECTORY ${CMAKE_BINARY_DIR}/bin)
function(halvox_test name)
  cmake_parse_arguments(ARG "" "" "SOURCES;DEPENDS" ${ARGN})
  add_executable(${name} ${ARG_SOURCES})
  target_link_libraries(${name} PRIVATE ${ARG_DEPENDS})
endfunction()
include_directories(${CMAKE_SOURCE_DIR})
add_subdirectory(session)
add_subdirectory(service)
""",
    "session/CMakeLists.txt": """\
add_library(halvox_session STATIC Planted.cpp)
halvox_test(halvox_session_test SOURCES PlantedTest.cpp DEPENDS halvox_session)
""",
    "session/Planted.h": """\
#pragma once
namespace planted {
int noticed();
int unnoticed();
int noticedByOthers();
int counted(int rounds);
inline int inTheHeader() { return 40; }
}
""",
    "session/Planted.cpp": SOURCE,
    "session/PlantedTest.cpp": """\
#include "session/Planted.h"
int main() {
  using namespace planted;
  return noticed() == 10 && unnoticed() != 0 && counted(3) == 3 && inTheHeader() == 40 ? 0 : 1;
}
""",
    "service/CMakeLists.txt":
        "halvox_test(halvox_service_test SOURCES OtherTest.cpp DEPENDS halvox_session)\n",
    "service/OtherTest.cpp": """\
#include "session/Planted.h"
int main() { return planted::noticedByOthers() == 30 ? 0 : 1; }
""",
}


def flat(places):
    return [mutant for place in places for mutant in place]


def edits(text):
    """The kind, the original and the replacement of each mutant of a function with that body."""
    return {(one.kind, one.original, one.replacement)
            for one in flat(mutants_of("a.cpp", f"void f() {{\n{text}\n}}\n"))}


class MutantsTest(unittest.TestCase):
    def test_comments_and_directives_are_left_alone(self):
        changed = {mutant.line for mutant in flat(mutants_of("session/Planted.cpp", SOURCE))}

        self.assertEqual(changed, {8, 10, 12, 15, 16, 17})

    def test_each_mutant_is_the_text_with_that_edit(self):
        for mutant in flat(mutants_of("session/Planted.cpp", SOURCE)):
            changed = mutant.apply(SOURCE)
            self.assertNotEqual(changed, SOURCE)
            self.assertEqual(SOURCE[mutant.start:mutant.end], mutant.original)
            self.assertEqual(changed.count("\n"),
                             SOURCE.count("\n") - mutant.original.count("\n")
                             + mutant.replacement.count("\n"))

    def test_numbers_comparisons_and_operators_change(self):
        found = edits("if (a < 2 && b) c = 0x1F + 0.5;")

        self.assertLessEqual({("number", "2", "3"), ("number", "2", "1"), ("number", "0x1F", "0x20"),
                              ("number", "0.5", "1.5"), ("comparison", "<", "<="),
                              ("logical", "&&", "||"), ("arithmetic", "+", "-"),
                              ("condition", "a < 2 && b", "!(a < 2 && b)")}, found)

    def test_texts_and_log_levels_change(self):
        found = edits('kLog.info("text", c == \'x\', LogLevel::kError, true);')

        self.assertLessEqual({("text", '"text"', '"text~"'), ("text", '"text"', '""'),
                              ("text", "'x'", "'~'"), ("log level", "info", "error"),
                              ("log level", "kError", "kInfo"), ("boolean", "true", "false")}, found)

    def test_what_belongs_to_types_is_not_an_operator(self):
        self.assertEqual(edits("std::vector<int> a; T&& b = c; const auto* d = e;"), set())
        self.assertEqual(flat(mutants_of("a.h", "bool operator==(const A&) const;")), [])

    def test_statements_are_dropped_and_swapped_but_no_declarations(self):
        found = edits("int a; b(); if (c) { d(); } else { e(); } return;")
        both = "if (c) { d(); } else { e(); }"

        self.assertEqual({one for one in found if one[0] != "condition"}, {
            ("dropped statement", "b();", ""), ("dropped statement", both, ""),
            ("dropped statement", "d();", ""), ("dropped statement", "e();", ""),
            ("swapped statements", f"b(); {both}", f"{both} b();")})

    def test_a_list_in_braces_is_not_a_block(self):
        self.assertEqual(edits("const Name names{a, b};"), set())


class ChoiceTest(unittest.TestCase):
    def test_files_get_mutants_in_proportion_to_their_places(self):
        class Of:
            def __init__(self, file, places):
                self.file, self.places = file, places

        self.assertEqual(shares([Of("a", 70), Of("b", 20), Of("c", 10)], 10), {"a": 7, "b": 2, "c": 1})
        self.assertEqual(sum(shares([Of("a", 1), Of("b", 1), Of("c", 1)], 2).values()), 2)

    def test_a_seed_always_gives_the_same_mutants_and_no_place_twice_at_first(self):
        places = mutants_of("session/Planted.cpp", SOURCE)

        def drawn(seed):
            choice = Choice("session/Planted.cpp", places, random.Random(seed))
            return [choice.next() for _ in range(len(places))]

        self.assertEqual(drawn(1), drawn(1))
        self.assertNotEqual(drawn(1), drawn(2))
        self.assertEqual(len({(one.kind, one.start, one.end) for one in drawn(1)}), len(places))

    def test_tests_are_no_sources(self):
        files = sources_in(ROOT, ["session"])

        self.assertIn("session/MessageHistory.cpp", files)
        self.assertIn("session/MessageHistory.h", files)
        self.assertEqual([file for file in files if "Test" in file], [])


@unittest.skipIf(any(shutil.which(tool) is None for tool in ("cmake", "ninja", "git", "ld.lld", "prlimit")),
                 "needs cmake, ninja, git, lld and prlimit")
class PlantedTest(unittest.TestCase):
    @classmethod
    def setUpClass(cls):
        directory = Path(tempfile.mkdtemp(prefix="halvox-planted-")).resolve()
        cls.addClassCleanup(shutil.rmtree, directory, ignore_errors=True)
        cls.root = directory / "root"
        for name, text in PLANTED.items():
            (cls.root / name).parent.mkdir(parents=True, exist_ok=True)
            (cls.root / name).write_text(text)
        subprocess.run(["git", "init", "-q", str(cls.root)], check=True)
        shortest = build.SHORTEST_LIMIT
        build.SHORTEST_LIMIT = 2.0
        cls.addClassCleanup(setattr, build, "SHORTEST_LIMIT", shortest)
        cls.tree = build.Tree(cls.root, directory / "scratch", ["session", "service"], 2)
        cls.tree.prepare()

    def outcome(self, file, line, original, replacement):
        places = mutants_of(file, self.tree.text(file))
        found = [one for one in flat(places) if (one.line, one.original, one.replacement)
                 == (line, original, replacement)]
        self.assertEqual(len(found), 1)
        campaign = Campaign(self.tree, 1, lambda text: None)
        campaign.run_all(found)
        return campaign.outcomes[0].state, campaign.outcomes[0].by

    def test_an_edit_that_a_test_notices_is_killed(self):
        self.assertEqual(self.outcome("session/Planted.cpp", 8, "10", "11"),
                         ("killed", "failed halvox_session_test"))

    def test_an_edit_that_no_test_notices_survives(self):
        self.assertEqual(self.outcome("session/Planted.cpp", 10, "20", "21"), ("survived", ""))

    def test_tests_of_other_folders_are_run_too(self):
        self.assertEqual(self.outcome("session/Planted.cpp", 12, "30", "31"),
                         ("killed", "failed halvox_service_test"))

    def test_an_edit_of_a_header_reaches_the_sources_that_include_it(self):
        self.assertEqual(self.outcome("session/Planted.h", 7, "40", "41"),
                         ("killed", "failed halvox_session_test"))

    def test_an_endless_loop_is_noticed(self):
        self.assertEqual(self.outcome("session/Planted.cpp", 17, "++sum;", ""),
                         ("killed", "timed out halvox_session_test"))

    def test_an_edit_that_does_not_compile_does_not_count(self):
        broken = mutants_of("session/Planted.cpp", SOURCE)[0][0]
        broken = type(broken)(broken.file, broken.line, "text", broken.start, broken.end,
                              broken.original, "no number")
        campaign = Campaign(self.tree, 1, lambda text: None)
        campaign.run_all([broken])
        self.assertEqual(campaign.outcomes[0].state, "not compiled")

    def test_the_tree_itself_stays_as_it_was(self):
        self.outcome("session/Planted.cpp", 8, "10", "11")

        self.assertEqual({name: (self.root / name).read_text() for name in PLANTED}, PLANTED)


if __name__ == "__main__":
    unittest.main()
