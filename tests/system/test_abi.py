"""The binary interface of the client libraries is the recorded one, and a change of it is found."""

import os
import platform
import re
import shutil
import subprocess
import tempfile
import unittest
from pathlib import Path

import harness
from harness import BIN

ROOT = Path(__file__).parents[2]
BUILD = BIN.parent
# What the trace library exports. Each test that must fail changes one line of it.
TRACE = """
#include <stdint.h>
static const int nobody = 0;
const int *const halvox_trace_state = &nobody;
void halvox_trace_emit(uint32_t code, uint64_t argument1, uint64_t argument2, uint64_t argument3,
                       uint64_t argument4) {
  (void)code; (void)argument1; (void)argument2; (void)argument3; (void)argument4;
}
"""


def abi(*arguments):
    return subprocess.run([str(ROOT / "scripts/abi"), *map(str, arguments)], stdout=subprocess.PIPE,
                          stderr=subprocess.STDOUT, text=True, timeout=harness.DEADLINE, check=False)


class AbiTest(unittest.TestCase):
    def setUp(self):
        harness.require("abidiff", "nm", "cc")
        if os.environ.get("HALVOX_SANITIZE"):
            self.skipTest("a sanitized library exports other symbols")
        if platform.machine() != "x86_64":
            self.skipTest("the recorded sizes are those of x86_64")
        self.directory = Path(tempfile.mkdtemp(prefix="halvox-test-"))
        self.addCleanup(shutil.rmtree, self.directory, True)

    def build_with(self, source):
        """A build folder with this source as the trace library, and the client library as built."""
        libraries = self.directory / "client"
        libraries.mkdir()
        (libraries / "libhalvox-client.so").symlink_to(BUILD / "client/libhalvox-client.so")
        (self.directory / "trace.c").write_text(source)
        subprocess.run(["cc", "-g", "-fPIC", "-shared", "-Wl,-soname,libhalvox-trace.so.0",
                        f"-Wl,--version-script={ROOT}/client/libhalvox-client.map",
                        "trace.c", "-o", "client/libhalvox-trace.so"], cwd=self.directory, check=True)
        return self.directory

    def assert_found(self, source, *texts):
        compared = abi(self.build_with(source))
        self.assertEqual(compared.returncode, 1, compared.stdout)
        for text in (*texts, "scripts/abi --renew"):
            self.assertIn(text, compared.stdout)

    def test_the_libraries_have_the_recorded_interface(self):
        compared = abi(BUILD)

        self.assertEqual((compared.returncode, compared.stdout), (0, ""))

    def test_the_same_interface_of_another_source_is_no_change(self):
        compared = abi(self.build_with(TRACE))

        self.assertEqual((compared.returncode, compared.stdout), (0, ""))

    def test_another_type_of_an_argument_is_found(self):
        self.assert_found(TRACE.replace("uint32_t code", "uint64_t code"), "halvox_trace_emit", "uint64_t")

    def test_another_result_is_found(self):
        source = TRACE.replace("void halvox_trace_emit", "int halvox_trace_emit").replace("argument4;\n", "argument4; return 0;\n")
        self.assert_found(source, "halvox_trace_emit", "return type changed")

    def test_a_function_more_is_found(self):
        self.assert_found(TRACE + "void halvox_trace_new(void) {}\n", "halvox_trace_new@HALVOX_0 is not in")

    def test_a_function_less_is_found(self):
        self.assert_found(TRACE.replace("halvox_trace_emit", "emit"),
                          "halvox_trace_emit@HALVOX_0 is in libhalvox-trace0.symbols")

    def test_renewing_records_a_change_that_is_meant(self):
        build = self.build_with(TRACE + "void halvox_trace_new(void) {}\n")
        records = self.directory / "records"
        for folder in "client/abi", "debian":
            shutil.copytree(ROOT / folder, records / folder)

        self.assertEqual(abi("--renew", "--recorded", records, build).returncode, 0)

        self.assertEqual(abi("--recorded", records, build).returncode, 0)
        symbols = (records / "debian/libhalvox-trace0.symbols").read_text()
        self.assertIn("\n* Build-Depends-Package: libhalvox-trace-dev\n", symbols)
        self.assertRegex(symbols, r"\n halvox_trace_emit@HALVOX_0 0\.1\.0\n halvox_trace_new@HALVOX_0 \S+\n")

    def test_each_function_of_the_headers_is_exported_with_a_version(self):
        for header, package in (("halvox.h", "libhalvox-client0"), ("halvox_trace.h", "libhalvox-trace0")):
            text = re.sub(r"/\*.*?\*/", "", (ROOT / "client" / header).read_text(), flags=re.DOTALL)
            declared = set(re.findall(r"\b(halvox_\w+)\([^;{]*\);", text))
            recorded = (ROOT / f"debian/{package}.symbols").read_text()
            self.assertTrue(declared)
            for name in declared - {"halvox_trace"}:  # this one is inline
                self.assertIn(f"\n {name}@HALVOX_0 ", recorded)


if __name__ == "__main__":
    unittest.main()
