"""An installation is complete: other programs find the library, systemd and D-Bus find their files."""

import os
import re
import tempfile
import unittest
import xml.etree.ElementTree as ElementTree
from pathlib import Path

from gi.repository import GLib

import harness
from harness import BIN, INTERFACE, OBJECT, Client, Service
from installation import Installation, run

# Prints 1 if the service answered everything.
PROGRAM = """
#include <halvox.h>
#include <stdio.h>

int main(void) {
  halvox_client *client = halvox_client_new(NULL);
  halvox_dictionary *message = halvox_dictionary_new();
  halvox_client_create_session(client, 7);
  halvox_client_start(client, 7);
  halvox_dictionary_set_double(message, "volume", 0.5);
  halvox_client_send(client, 7, message, HALVOX_DOMAIN_SESSION | HALVOX_CATEGORY_PLAYBACK,
                     HALVOX_EVENT_START);
  halvox_result result = halvox_client_flush(client, 30000);
  printf("%d\\n", result == HALVOX_OK);
  halvox_dictionary_free(message);
  halvox_client_free(client);
  return 0;
}
"""
CMAKE_LISTS = """
cmake_minimum_required(VERSION 3.24)
project(player C)
find_package(HalvoxClient 0.1 REQUIRED)
add_executable(player player.c)
target_link_libraries(player PRIVATE Halvox::client Halvox::trace)
"""


class LibraryTest(Installation):
    def setUp(self):
        if os.environ.get("HALVOX_SANITIZE"):
            self.skipTest("a sanitized library needs a sanitized program")
        self.source = Path(tempfile.mkdtemp(dir=self.directory))
        (self.source / "player.c").write_text(PROGRAM)

    def check_reports(self, program):
        with Service() as service:
            answer = run(program, env={**self.environment(), "HALVOX_SOCKET": service.socket})

            self.assertEqual(answer, "1\n")
            payload = service.wait_for_payload(lambda found: "volume" in found)
            self.assertEqual(payload["volume"], 0.5)

    def test_a_program_outside_the_tree_builds_with_pkg_config_and_reports(self):
        flags = run("pkg-config", "--cflags", "--libs", "halvox-client", env=self.environment()).split()
        run("cc", "-Wall", "-Werror", "player.c", *flags, "-o", "player", cwd=self.source)

        self.check_reports(self.source / "player")

    def test_a_program_outside_the_tree_builds_with_find_package_and_reports(self):
        (self.source / "CMakeLists.txt").write_text(CMAKE_LISTS)
        run("cmake", "-B", "build", f"-DCMAKE_PREFIX_PATH={self.prefix}", cwd=self.source)
        run("cmake", "--build", "build", cwd=self.source)

        self.check_reports(self.source / "build/player")

    def test_the_libraries_say_their_version(self):
        for library in "halvox-client", "halvox-trace":
            version = run("pkg-config", "--modversion", library, env=self.environment()).strip()
            self.assertTrue((self.libraries / f"lib{library}.so.{version}").is_file(), version)


class SystemFilesTest(Installation):
    def test_units_and_bus_files_name_the_installed_programs(self):
        commands = {}
        for path in (*self.prefix.glob("lib/systemd/*/*.service"),
                     *self.prefix.glob("share/dbus-1/system-services/*.service")):
            for command in re.findall(r"^Exec(?:Start)?=(\S+)", path.read_text(), re.MULTILINE):
                commands[path.name] = command

        expected = {name for name in ("halvox-reportingd", "halvox-pipewire-reporter") if (BIN / name).exists()}
        self.assertEqual(set(commands.values()), {str(self.prefix / "bin" / name) for name in expected})
        for command in commands.values():
            self.assertTrue(os.access(command, os.X_OK), command)

    def test_each_file_is_where_its_reader_looks_for_it(self):
        for path in ("lib/systemd/system/halvox-reportingd.service", "lib/systemd/system/halvox-reportingd.socket",
                     "lib/systemd/user/halvox-reportingd.service", "lib/systemd/user/halvox-reportingd.socket",
                     "lib/sysusers.d/halvox.conf", "lib/tmpfiles.d/halvox.conf",
                     "share/dbus-1/system.d/com.tarno.halvox.reporting.conf",
                     "share/dbus-1/system-services/com.tarno.halvox.reporting.service",
                     f"share/dbus-1/interfaces/{INTERFACE}.xml",
                     "share/dbus-1/interfaces/com.tarno.halvox.Connection.xml",
                     "share/dbus-1/interfaces/com.tarno.halvox.Statistics.xml",
                     "share/dbus-1/interfaces/com.tarno.halvox.Storage.xml",
                     "share/bash-completion/completions/halvoxctl",
                     "share/zsh/vendor-completions/_halvoxctl", "share/fish/vendor_completions.d/halvoxctl.fish",
                     "share/man/man1/halvoxctl.1",
                     "share/doc/halvox/examples/systemd/link-nats.conf",
                     "share/doc/halvox/examples/systemd/pipewire.conf",
                     "include/halvox.h", "include/halvox_trace.h"):
            self.assertTrue((self.prefix / path).is_file(), path)

    def test_the_journal_explains_a_damaged_database(self):
        harness.require("journalctl")
        run("journalctl", f"--root={self.directory}", "--update-catalog")
        listed = run("journalctl", f"--root={self.directory}", "--list-catalog")
        ours = [line for line in listed.splitlines() if " Halvox: " in line]
        self.assertEqual(len(ours), 20, listed)

        damaged, = [line.split()[0] for line in ours if line.endswith("The database is damaged")]
        text = run("journalctl", f"--root={self.directory}", "--dump-catalog", damaged)
        self.assertIn("No file\nwas deleted.", text)

    def test_systemd_accepts_the_units(self):
        harness.require("systemd-analyze")
        units = sorted((self.prefix / "lib/systemd").glob("*/halvox-*"))
        self.assertGreaterEqual(len(units), 2)
        for unit in units:
            manager = f"--{unit.parent.name}"
            self.assertEqual(
                run("systemd-analyze", manager, "verify", "--man=no", "--recursive-errors=no", unit,
                    env={**os.environ, "XDG_RUNTIME_DIR": str(self.directory)}), "")


class InterfaceFileTest(Installation):
    """The interface files, which have names and comments, and the service's own answer agree."""

    INTERFACES = (INTERFACE, "com.tarno.halvox.Connection", "com.tarno.halvox.Statistics",
                  "com.tarno.halvox.Storage")

    def file(self, interface=INTERFACE):
        return self.prefix / f"share/dbus-1/interfaces/{interface}.xml"

    def members(self, document, interface=None):
        """The methods and signals of one interface or of all."""
        return [member for found in ElementTree.fromstring(document).iter("interface")
                if interface in (None, found.get("name"))
                for member in found if member.tag in ("method", "signal")]

    def types(self, document, interface):
        return [(member.tag, member.get("name"),
                 [(argument.get("type"), argument.get("direction")) for argument in member.iter("arg")])
                for member in self.members(document, interface)]

    def test_the_methods_and_signals_are_those_that_the_service_shows(self):
        with Service() as service:
            client = Client.to_socket(service.address)
            self.addCleanup(client.close)
            answer, = client.connection.call_sync(
                None, OBJECT, "org.freedesktop.DBus.Introspectable", "Introspect", None, GLib.VariantType("(s)"),
                0, int(harness.DEADLINE * 1000), None).unpack()

        for interface in self.INTERFACES:
            described = self.types(self.file(interface).read_text(), interface)
            self.assertGreater(len(described), 0, interface)
            self.assertEqual(described, self.types(answer, interface))

    def test_each_argument_has_a_name_and_a_description(self):
        for interface in self.INTERFACES:
            text = self.file(interface).read_text()
            for member in self.members(text):
                comment = re.search(rf"<!-- {member.get('name')}:(.*?)-->", text, re.DOTALL)
                self.assertIsNotNone(comment, member.get("name"))
                described = re.findall(r"@(\w+):", comment[1])
                self.assertEqual(described, [argument.get("name") for argument in member.iter("arg")])

    def test_a_generator_makes_code_and_pages_from_them(self):
        harness.require("gdbus-codegen")
        for interface in self.INTERFACES:
            run("gdbus-codegen", "--interface-prefix", "com.tarno.halvox.", "--generate-c-code", "generated",
                "--generate-docbook", "page", "--c-namespace", "Halvox", self.file(interface), cwd=self.directory)

            header = (self.directory / "generated.h").read_text()
            calls = {name.replace("_", "") for name in re.findall(r"_call_(\w+) \(", header)}
            page = (self.directory / f"page-{interface}.xml").read_text()
            for method in ElementTree.parse(self.file(interface)).iter("method"):
                self.assertIn(method.get("name").lower(), calls)
                # The comments become the text of the page. A generator takes one line for an argument, and
                # the second for the description of the method.
                description = re.search(rf"<title>The {method.get('name')}\(\) method<.*?<para>\s*(.)", page, re.DOTALL)
                self.assertTrue(description[1].isupper(), method.get("name"))
                for argument in method.iter("arg"):
                    self.assertRegex(page, rf"<parameter>{argument.get('name')}</parameter></literal>:</term>"
                                           r'\s*<listitem><para>\s*[A-Z"]')

    def test_a_generator_of_qt_knows_each_type(self):
        """qdbusxml2cpp refuses a type that is not basic, unless an annotation names its type of Qt."""
        types = {"a{sv}": "QVariantMap", "ax": "QList<qlonglong>", "aax": "QList<QList<qlonglong> >"}
        methods = [method for interface in self.INTERFACES
                   for method in ElementTree.parse(self.file(interface)).iter("method")]
        for method in methods:
            expected = {}
            for direction in "in", "out":
                arguments = [found for found in method.iter("arg") if found.get("direction") == direction]
                for number, argument in enumerate(arguments):
                    if len(argument.get("type")) > 1:
                        name = f"org.qtproject.QtDBus.QtTypeName.{direction.capitalize()}{number}"
                        expected[name] = types[argument.get("type")]
            found = {note.get("name"): note.get("value") for note in method.iter("annotation")}
            self.assertEqual(found, expected, method.get("name"))


if __name__ == "__main__":
    unittest.main()
