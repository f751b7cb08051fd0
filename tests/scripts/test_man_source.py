"""The rewriting of documents and of the C header for man pages."""

import re
import sys
import unittest
from pathlib import Path

ROOT = Path(__file__).resolve().parents[2]
sys.path.insert(0, str(ROOT / "packaging/man"))

import c_header  # noqa: E402
import make_page  # noqa: E402
import man_macros  # noqa: E402
import markdown_text  # noqa: E402

DOCUMENT = """\
# Title

First.

## A part

Of [the part](other.md#x).

```sh
# not a heading, [not a link](a.md)
```

### Below `it`

Deep.

## Another

Last.
"""
WIDE = "| key | default | meaning |\n|---|---|---|\n| `k` | `1` | " + "long " * 20 + "|\n"
HEADER = """\
/** @file
 * What the_library does.
 *
 * @code{.c}
 *   use(it);
 * @endcode
 */
#include <stdint.h>
#ifdef __cplusplus
extern "C" {
#endif

/* ---- Calls ---- */

/** @{ */
/** Take a
 * number. */
HALVOX_API int take(int number);
HALVOX_API int take_two(int one,
                        int two);
/** @} */

/** Takes it at once. */
static inline int take_now(int one,
                           int two) {
  if (one > two) {
    return one;
  }
  return two;
}

/** A pair. */
typedef struct pair {
  int one; /**< the first */
} pair;
#ifdef __cplusplus
}
#endif
"""


class SectionsTest(unittest.TestCase):
    def test_a_section_ends_at_the_next_heading_of_its_level(self):
        part = markdown_text.section(DOCUMENT, "A part")

        self.assertTrue(part.startswith("Of [the part]"))
        self.assertTrue(part.endswith("### Below `it`\n\nDeep.\n"))

    def test_a_heading_is_found_without_its_markup(self):
        self.assertEqual(markdown_text.section(DOCUMENT, "Below it"), "Deep.\n")

    def test_a_heading_that_is_missing_is_an_error(self):
        with self.assertRaises(KeyError):
            markdown_text.section(DOCUMENT, "not a heading, [not a link](a.md)")

    def test_the_sections_of_a_document_become_those_of_the_page(self):
        text = markdown_text.without_title(DOCUMENT)

        self.assertEqual([line for line in text.splitlines() if line.startswith("#")],
                         ["# A PART", "# not a heading, [not a link](a.md)", "## Below `it`", "# ANOTHER"])
        self.assertTrue(text.startswith("First."))


class LinksTest(unittest.TestCase):
    def test_the_text_of_a_link_stays(self):
        targets = []
        text = markdown_text.without_links(DOCUMENT, targets.append)

        self.assertIn("Of the part.", text)
        self.assertEqual(targets, ["other.md#x"])

    def test_code_keeps_what_looks_like_a_link(self):
        self.assertIn("[not a link](a.md)", markdown_text.without_links(DOCUMENT, lambda link: None))


class TablesTest(unittest.TestCase):
    def test_a_narrow_table_stays(self):
        text = "| a | b |\n|---|---|\n| 1 | 2 |\n"
        self.assertEqual(markdown_text.for_man(text), text)

    def test_the_rows_of_a_wide_table_become_entries(self):
        text = markdown_text.for_man(WIDE)

        self.assertRegex(text, r"\n`k`\n: Long long .*\. Default: `1`\.\n")
        self.assertNotIn("|", text)

    def test_an_entry_without_the_other_cells_has_only_its_meaning(self):
        text = markdown_text.for_man(WIDE.replace("`1`", ""))

        self.assertNotIn("Default", text)

    def test_a_bar_in_code_does_not_end_a_cell(self):
        self.assertEqual(markdown_text.cells_of("| `a|b` | c |"), ["`a|b`", "c"])

    def test_a_table_in_code_stays(self):
        text = "```text\n" + WIDE + "```\n"
        self.assertEqual(markdown_text.for_man(text), text)


class CommentsTest(unittest.TestCase):
    def test_a_mark_for_the_tests_is_not_shown(self):
        self.assertEqual(markdown_text.for_man("<!-- not run: slow -->\n```sh\ntrue\n```\n"), "```sh\ntrue\n```\n")

    def test_an_output_is_announced(self):
        self.assertTrue(markdown_text.for_man("<!-- output -->\n```text\nx\n```\n").startswith("It prints:\n\n```"))


class HeaderTest(unittest.TestCase):
    def setUp(self):
        self.text = c_header.markdown(HEADER)

    def test_the_comment_on_the_file_comes_first(self):
        self.assertTrue(self.text.strip().startswith("What the\\_library does."))
        self.assertIn("```c\nuse(it);\n```", self.text)

    def test_functions_that_share_a_comment_stand_together(self):
        self.assertIn("```c\nint take(int number);\nint take_two(int one,\n             int two);\n```\n\n"
                      "Take a\nnumber.", self.text)

    def test_an_inline_function_is_shown_without_its_body(self):
        self.assertIn("```c\nint take_now(int one,\n             int two);\n```\n\nTakes it at once.", self.text)

    def test_a_banner_is_a_heading(self):
        self.assertIn("\n## Calls\n", self.text)

    def test_a_type_keeps_the_comments_on_its_fields(self):
        self.assertIn("typedef struct pair {\n  int one; /* the first */\n} pair;", self.text)

    def test_what_only_compilers_need_is_left_out(self):
        for word in "HALVOX_API", "#ifdef", "extern", "@":
            self.assertNotIn(word, self.text)


# What lowdown 1.0 writes.
WRITTEN = r""".\" -*- mode: troff; coding: utf-8 -*-
.TH "X" "1" "" "Halvox" "User Commands"
.SH
NAME
.LP
x-y - do it
.LP
\fB--all\fR
.if n \
.sp -1v
.if t \
.sp -0.25v
.IP "" 5n
All of \fCa-b\fR.
.IP "\(bu" 2
one
.if n \
.sp -1
.if t \
.sp -0.25v
.IP "\(bu" 2
two
.LP
.EX
x -- y
.EE
"""


class MacrosTest(unittest.TestCase):
    def setUp(self):
        self.page = man_macros.tidied(WRITTEN)

    def test_the_heading_of_a_section_is_on_the_line_of_its_macro(self):
        self.assertIn(".SH NAME\nx-y \\- do it\n", self.page)

    def test_an_entry_has_its_macro(self):
        self.assertIn("\n.TP\n\\fB\\-\\-all\\fR\nAll of \\fBa\\-b\\fR.\n", self.page)

    def test_items_follow_each_other(self):
        self.assertIn('.IP "\\(bu" 2\none\n.IP "\\(bu" 2\ntwo\n', self.page)
        self.assertNotIn(".sp", self.page)

    def test_what_is_typed_has_minus_signs_and_stands_to_the_right(self):
        self.assertIn(".RS 4\n.EX\nx \\-\\- y\n.EE\n.RE\n", self.page)

    def test_a_page_with_a_table_asks_for_tbl(self):
        table = WRITTEN + ".TS\ntab(|) expand allbox;\nlb.\nT{\na\nT}\n.TE\n"

        self.assertTrue(self.page.startswith(".TH"))
        self.assertTrue(man_macros.tidied(table).startswith("'\\\" t\n.TH"))
        self.assertIn("tab(|) box;\nlb.\na\n.TE", man_macros.tidied(table))


class NotesTest(unittest.TestCase):
    def test_each_file_of_notes_is_about_a_command(self):
        names = set()
        for source in (ROOT / "tools/commands").glob("*.cpp"):
            names |= set(re.findall(r'\.name = "([a-z-]+)"', source.read_text(encoding="utf-8")))
        for path in (ROOT / "packaging/man/commands").iterdir():
            self.assertEqual(path.suffix, ".md")
            self.assertLessEqual(set(path.stem.split("-", 1)) - names, {""}, path.name)

    def test_a_page_lists_the_documents_that_have_no_page(self):
        page = make_page.Page(ROOT, ROOT / "packaging/man/halvox-protocol.7.md")
        text = page.markdown()

        self.assertIn("- `packaging/dbus/com.tarno.halvox.HVReportingServiceProtocol.xml`\n", text)
        self.assertNotIn("docs/configuration.md", text)


if __name__ == "__main__":
    unittest.main()
