"""The installed man pages: one for each program, with all that the programs accept, without mistakes."""

import os
import re
import subprocess
import unittest

import harness
from documents import ROOT
from harness import DEADLINE
from installation import Installation, run

# Pages that belong to no program.
OTHERS = {"halvox.toml.5", "halvox-database.5", "halvox-protocol.7", "libhalvox-client.3", "libhalvox-trace.3"}
OPTION = re.compile(r"^\s*(-[^\s,]*(?:,\s*-\S+)*)", re.MULTILINE)
REFERENCE = re.compile(r"\b((?:lib)?halvox[\w.-]*)\((\d)\)")


def options_of(text):
    """The options in a help text: those at the beginnings of lines."""
    return {option.split("=")[0] for names in OPTION.findall(text)
            for option in re.split(r",\s*", names) if re.fullmatch(r"--?[a-z][a-z-]*", option.split("=")[0])}


class ManPagesTest(Installation):
    @classmethod
    def setUpClass(cls):
        for tool in "mandoc", "man", "lowdown":
            harness.require(tool)
        super().setUpClass()
        cls.pages = {path.name: path for path in cls.prefix.glob("share/man/man*/*")}
        cls.programs = sorted(path.name for path in (cls.prefix / "bin").iterdir())

    def shown(self, page):
        """The text of a page as a terminal of unlimited width shows it, without its layout."""
        text = run("mandoc", "-T", "utf8", "-O", "width=1000", self.pages[page])
        return re.sub(r".\x08", "", text).replace("\u2010", "-")

    def page_of(self, program):
        page, = [name for name in self.pages if name.rsplit(".", 1)[0] == program]
        return page

    def help(self, program, *command):
        return run(self.prefix / "bin" / program, *command, "--help", env=self.environment())

    def test_each_program_has_a_page(self):
        self.assertIn("halvoxctl", self.programs)
        self.assertEqual({self.page_of(program) for program in self.programs}, set(self.pages) - OTHERS)

    def test_the_configuration_the_database_the_protocol_and_the_library_have_a_page(self):
        self.assertLessEqual(OTHERS, set(self.pages))

    def test_each_option_in_the_help_of_a_program_is_in_its_page(self):
        for program in self.programs:
            options = options_of(self.help(program))
            self.assertIn("--help", options)
            text = self.shown(self.page_of(program))
            missing = [option for option in options if not re.search(rf"(?<![\w-]){option}(?![\w-])", text)]
            self.assertEqual(missing, [], program)

    def commands(self):
        """Yields (words of the command, its help) for each command of halvoxctl."""
        waiting = [()]
        while waiting:
            command = waiting.pop()
            text = self.help("halvoxctl", *command)
            yield command, text
            listed = text.partition("\n\nCommands:\n")[2] if command else text
            names = re.findall(r"^  ([a-z][a-z-]*)(?: {2,}|$)", listed, re.MULTILINE)
            waiting += [(*command, name) for name in names]

    def test_each_option_of_a_command_is_in_the_section_of_the_command(self):
        text = self.shown("halvoxctl.1")
        common = options_of(self.help("halvoxctl"))
        seen = 0
        for command, help_text in self.commands():
            if not command:
                continue
            seen += 1
            section = re.search(rf"^   {' '.join(command)}\n(.*?)(?=^   ?\S|\Z)", text,
                                re.MULTILINE | re.DOTALL)
            self.assertIsNotNone(section, command)
            missing = [option for option in options_of(help_text) - common
                       if not re.search(rf"(?<![\w-]){option}(?![\w-])", section[1])]
            self.assertEqual(missing, [], command)
        self.assertGreater(seen, 35)

    def test_the_page_of_the_configuration_has_each_key(self):
        document = (ROOT / "docs/configuration.md").read_text(encoding="utf-8")
        keys = [key for cell in re.findall(r"^\| (`[a-z_]+`[^|]*)\|", document, re.MULTILINE)
                for key in re.findall(r"`([A-Za-z_]+)`", cell)]
        entries = re.findall(r"^\.TP\n(.*)$", self.pages["halvox.toml.5"].read_text(encoding="utf-8"), re.MULTILINE)
        terms = {term for entry in entries for term in re.findall(r"\\fB(.*?)\\fR", entry)}

        self.assertGreater(len(keys), 30)
        self.assertEqual([key for key in keys if key not in terms], [])

    def test_the_page_of_each_library_has_each_function(self):
        for page, file, least in (("libhalvox-client.3", "halvox.h", 40), ("libhalvox-trace.3", "halvox_trace.h", 1)):
            header = (ROOT / "client" / file).read_text(encoding="utf-8")
            functions = re.findall(r"^(?:HALVOX_API|static inline|void) .*?\b(halvox_\w+)\(", header, re.MULTILINE)
            text = self.shown(page)

            self.assertGreater(len(functions), least)
            self.assertEqual([name for name in functions if not re.search(rf"[ *]{name}\((?!\))", text)], [], page)

    def test_the_page_of_an_inline_function_shows_how_to_call_it_and_not_its_body(self):
        text = self.shown("libhalvox-trace.3")

        self.assertRegex(text, r"\bvoid halvox_trace\(uint32_t code, [^{]*?uint64_t argument4\);")
        self.assertNotIn("__atomic_load_n", text)

    def test_each_installed_c_header_has_a_page(self):
        for header in (self.prefix / "include").glob("*.h"):
            pages = [name for name in self.pages if f"#include <{header.name}>" in self.shown(name)]
            self.assertNotEqual(pages, [], header.name)

    def test_the_page_of_the_protocol_has_each_request(self):
        interface = (ROOT / "packaging/dbus/com.tarno.halvox.HVReportingServiceProtocol.xml").read_text()
        requests = re.findall(r'<method name="(\w+)"', interface)
        text = self.shown("halvox-protocol.7")

        self.assertEqual([name for name in requests if name not in text], [])

    def test_pages_name_only_pages_that_exist(self):
        for name in self.pages:
            named = {f"{page}.{section}" for page, section in REFERENCE.findall(self.shown(name))}
            self.assertLessEqual(named, set(self.pages), name)

    def test_no_markup_is_left_in_a_page(self):
        for name in self.pages:
            text = self.shown(name)
            for mark in (r"^@\w+ .*@$", r"\]\([\w./#-]+\)", r"<!--", r"\*\*\w", r"^\s*\|.*\|.*\|$"):
                self.assertNotRegex(text, re.compile(mark, re.MULTILINE), name)

    def test_mandoc_finds_nothing_wrong(self):
        for name, path in self.pages.items():
            done = subprocess.run(["mandoc", "-T", "lint", "-W", "warning", path], capture_output=True,
                                  text=True, timeout=DEADLINE, check=False)
            self.assertEqual(done.stdout, "", name)

    def test_man_shows_each_page_without_a_warning(self):
        for name, path in self.pages.items():
            with self.subTest(page=name):
                done = subprocess.run(
                    ["man", "--warnings", "--local-file", "--encoding=utf8", path], capture_output=True,
                    text=True, timeout=DEADLINE, check=False,
                    env={**os.environ, "LC_ALL": "C.UTF-8", "MANROFFSEQ": "", "MANWIDTH": "80"})
                self.assertEqual((done.returncode, done.stderr), (0, ""))
                self.assertIn("NAME", done.stdout)

    def test_man_finds_each_page_by_its_name(self):
        for name in self.pages:
            page, section = name.rsplit(".", 1)
            found = run("man", "-M", self.prefix / "share/man", "-w", section, page)
            self.assertEqual(found.strip(), str(self.pages[name]))


if __name__ == "__main__":
    unittest.main()
