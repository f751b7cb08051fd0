"""scripts/lib/check_includes.py: which include lines it allows, and which breaches it finds."""

import subprocess
import sys
import tempfile
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
CHECK = ROOT / "scripts/lib/check_includes.py"
sys.path.insert(0, str(CHECK.parent))

from check_includes import TABLE, Table, TableError  # noqa: E402


def include(name):
    return f'#include "{name}"\n'


class TheTableOfThisTree(unittest.TestCase):
    """The real table, applied to include lines that no file has."""

    def setUp(self):
        self.table = Table(TABLE.read_text(encoding="utf-8"))

    def breaches(self, path, text):
        return [what for _, what in self.table.breaches(path, text)]

    def assertRefused(self, path, text, reason):
        found = self.breaches(path, text)
        self.assertEqual(len(found), 1, (path, text, found))
        self.assertIn(reason, found[0])

    def assertAllowed(self, path, text):
        self.assertEqual(self.breaches(path, text), [])

    def test_arrows_do_not_form_a_cycle(self):
        self.assertEqual(self.table.cycle(), [])

    def test_inner_ring_does_not_reach_the_adapters(self):
        for folder in ("session", "backends", "driver", "tracing", "service", "platform"):
            self.assertRefused(f"{folder}/X.cpp", include("platform/linux/base/Utf8.h"),
                               "may not include platform/linux/base")

    def test_only_main_is_the_composition_root(self):
        line = include("platform/linux/LinuxPlatform.h")
        self.assertAllowed("service/main.cpp", line)
        self.assertRefused("service/ServiceArguments.cpp", line, "service may not include")

    def test_base_includes_no_adapter(self):
        self.assertRefused("platform/linux/base/Utf8.h", include("platform/linux/log/LogQueue.h"),
                           "platform/linux/base may not include platform/linux/log")

    def test_adapters_include_nothing_of_the_programs_above_them(self):
        for name in ("service/SessionIndex.h", "session/SummaryEvent.h", "tools/JsonText.h",
                     "client/halvox.h", "reporters/pipewire/RouteGraph.h"):
            self.assertRefused("platform/linux/store/SqliteStore.cpp", include(name),
                               "platform/linux/store may not include")

    def test_tests_of_adapters_do_not_include_reporters(self):
        self.assertRefused("platform/linux/drivers/pipewire/XTest.cpp",
                           include("reporters/pipewire/MainLoop.h"), "may not include reporters")

    def test_service_and_its_adapters_do_not_read_the_store(self):
        line = include("platform/linux/store/reading/StoreReader.h")
        self.assertAllowed("tools/Records.cpp", line)
        for path in ("platform/linux/store/SqliteStore.cpp", "platform/linux/LinuxPlatform.cpp",
                     "platform/linux/link/local/LocalTlmReportingService.cpp", "service/main.cpp"):
            self.assertRefused(path, line, "may not include platform/linux/store/reading")

    def test_client_library_uses_no_adapter_but_base(self):
        self.assertAllowed("client/PeerBus.h", include("platform/linux/base/UniqueHandle.h"))
        self.assertRefused("client/PeerBus.h", include("platform/linux/store/Sqlite.h"),
                           "client may not include platform/linux/store")

    def test_tools_do_not_reach_the_service(self):
        self.assertRefused("tools/Events.cpp", include("session/MessageHistory.h"),
                           "tools may not include session")
        self.assertRefused("tools/Events.cpp", include("platform/linux/connection/FrameBuffer.h"),
                           "tools may not include platform/linux/connection")

    def test_test_code_stays_in_tests(self):
        for name in ("platform/fake/FakePlatform.h", "platform/linux/testing/WaitFor.h",
                     "platform/linux/log/testing/MemoryLogSink.h"):
            self.assertRefused("platform/linux/log/LogQueue.cpp", include(name), "for tests only")
            self.assertAllowed("platform/linux/log/LogQueueTest.cpp", include(name))

    def test_headers_are_held_to_more_than_sources(self):
        line = include("session/HVReportingSession.h")
        self.assertAllowed("backends/HVReportingTallyhubBridge.cpp", line)
        self.assertRefused("backends/HVReportingTallyhubBridge.h", line, "backends may not include")

    def test_inner_ring_uses_the_standard_library_alone(self):
        self.assertRefused("session/X.cpp", "#include <unistd.h>\n", "not a header of the standard")
        self.assertRefused("session/X.cpp", "#include <sqlite3.h>\n", "not a header of the standard")
        self.assertRefused("session/X.cpp", "#ifdef __linux__\n", "conditional compilation")
        self.assertRefused("session/X.cpp", "#include <gtest/gtest.h>\n", "not a header of the standard")
        self.assertAllowed("session/XTest.cpp", "#include <gtest/gtest.h>\n")

    def test_libraries_stay_in_their_adapters(self):
        self.assertAllowed("platform/linux/store/Sqlite.h", "#include <sqlite3.h>\n")
        self.assertRefused("tools/Records.cpp", "#include <sqlite3.h>\n", "only by bench, platform/linux/store")
        self.assertRefused("platform/linux/store/Sqlite.h", "#include <nats/nats.h>\n", "may be included only")

    def test_folder_without_a_row_is_a_breach(self):
        self.assertRefused("platform/linux/gadgets/Gadget.cpp", "", "has no row")
        self.assertRefused("platform/linux/LinuxPlatform.cpp",
                           include("platform/linux/gadgets/Gadget.h"), "has no row")
        self.assertRefused("platform/gadgets/Gadget.h", "", "has no row")


class TableMistakes(unittest.TestCase):
    def test_unused_arrow_is_named_with_its_line(self):
        table = Table("a:\nb: a\n  tests: c\nc:\n")
        self.assertEqual(list(table.breaches("b/X.cpp", include("a/A.h"))), [])

        self.assertEqual(list(table.unused()),
                         [(3, "no include line uses the arrow from b to c; remove it")])

    def test_unused_library_is_named_with_its_line(self):
        table = Table("a:\nb:\n<lib/>: a b\n")
        self.assertEqual(list(table.breaches("b/X.cpp", "#include <lib/x.h>\n")), [])

        self.assertEqual(list(table.unused()), [(3, "a does not include <lib/>; remove it from the row")])

    def test_cycle_is_found(self):
        self.assertEqual(Table("a: b\nb: c\nc: a\n").cycle(), ["a", "b", "c", "a"])

    def test_lines_that_cannot_be_understood_are_named(self):
        for text, reason in (("a\n", "line 1: expected"), ("a:\na:\n", "line 2: a has a row"),
                             ("a: z\n", "line 1: z has no row"), ("a:\n  some: a\n", "line 2: expected"),
                             ("  tests: a\n", "line 1: expected")):
            with self.assertRaisesRegex(TableError, reason):
                Table(text)


class TheProgram(unittest.TestCase):
    """The check on small git trees of its own."""

    def setUp(self):
        scratch = tempfile.TemporaryDirectory()
        self.addCleanup(scratch.cleanup)
        self.tree = Path(scratch.name)
        subprocess.run(["git", "init", "-q", str(self.tree)], check=True)
        self.table = self.tree / "table.txt"
        self.table.write_text("platform:\nsession: platform\n")
        self.write("session/X.cpp", "\n" + include("platform/value.h"))
        self.write("platform/value.h", "#include <string>\n")

    def write(self, name, text):
        file = self.tree / name
        file.parent.mkdir(exist_ok=True)
        file.write_text(text)

    def check(self):
        done = subprocess.run([sys.executable, str(CHECK), str(self.table)], cwd=self.tree,
                              capture_output=True, text=True, check=False)
        return done.returncode, done.stdout.splitlines()

    def test_tree_without_a_breach_passes(self):
        self.assertEqual(self.check(), (0, ["includes: 2 files read, 0 breaches"]))

    def test_breach_fails_with_file_and_line(self):
        self.write("platform/value.h", "#include <string>\n" + include("session/X.h"))

        status, lines = self.check()

        self.assertEqual(status, 1)
        self.assertEqual(lines[0], 'platform/value.h:2: platform may not include session ("session/X.h")')

    def test_unused_arrow_fails(self):
        self.write("session/X.cpp", "")

        status, lines = self.check()

        self.assertEqual(status, 1)
        self.assertIn("table.txt:2: no include line uses the arrow from session to platform", lines[0])

    def test_tree_without_sources_fails(self):
        for name in ("session/X.cpp", "platform/value.h"):
            (self.tree / name).unlink()
        self.table.write_text("platform:\n")

        self.assertEqual(self.check()[0], 1)


if __name__ == "__main__":
    unittest.main()
