"""Reads the functions of a C header with their comments, which are in Doxygen's form."""

import re
import textwrap

BANNER = re.compile(r"/\* -+ (.*?) -+ \*/")
# A comment, and what follows it until the next one.
PART = re.compile(r"/\*\*(?!<)(.*?)\*/(.*?)(?=/\*\*(?!<)|/\* -|\Z)|/\* -+ (.*?) -+ \*/", re.DOTALL)
CODE = re.compile(r"@code\S*\n(.*?)@endcode\n?", re.DOTALL)

# What stands before a function of the interface.
PREFIX = re.compile(r"HALVOX_API |static inline ")


def comment_text(comment):
    """The words of a comment, without the stars at the beginnings of its lines."""
    lines = [re.sub(r"^ ?\*? ?", "", line) for line in comment.strip("\n").split("\n")]
    return "\n".join(line.rstrip() for line in lines).strip() + "\n"


def escaped(text):
    """The text with the names in it kept from being markup."""
    return re.sub(r"([\\*_<>\[\]|~^])", r"\\\1", text)


def prose(text):
    """The paragraphs of a comment in Markdown. Its code and its lists keep their lines."""
    parts = CODE.split(text)
    for number, part in enumerate(parts):
        if number % 2:
            parts[number] = "```c\n" + textwrap.dedent(part).rstrip() + "\n```\n"
        else:
            lines = [line.strip() for line in escaped(part).split("\n")]
            parts[number] = "\n".join(lines)
    return "\n".join(parts).strip("\n") + "\n"


def declarations(code):
    """The C code between two comments, without what only compilers need."""
    code = re.sub(r"#ifdef __cplusplus\n.*?#endif\n", "", code, flags=re.DOTALL)
    # The bodies of inline functions are not for readers.
    code = re.sub(r"^(static inline .*?\)) \{\n.*?^\}$", r"\1;", code, flags=re.DOTALL | re.MULTILINE)
    kept, shift = [], 0
    for line in code.split("\n"):
        # A macro belongs to the interface if it is a number.
        if line.startswith("#") and not re.match(r"#define \w+ [\w(]*\d", line):
            continue
        # The further lines of a function are indented to its bracket, which moves with its first line.
        if prefix := PREFIX.match(line):
            line, shift = line[prefix.end():], prefix.end()
        elif shift:
            line = line[min(shift, len(line) - len(line.lstrip())):]
        shift = 0 if line.endswith(";") else shift
        kept.append(line.replace("/**<", "/*"))
    return "\n".join(kept).strip("\n")


def markdown(text):
    """A description from the comment on the file, then a section for each banner of the header."""
    result = []
    for match in PART.finditer(text):
        if match[3]:
            result.append(f"\n## {match[3].strip()}\n")
            continue
        comment = comment_text(match[1])
        code = declarations(match[2])
        is_introduction = re.match(r"@(?:file|name)\b", comment) is not None
        # A name is a line that introduces functions with comments of their own.
        comment = re.sub(r"\A@name (.*)", r"\1:\n", comment)
        comment = re.sub(r"@(?:file|\{|\})\s?", "", comment).strip()
        if code:
            result.append("\n```c\n" + code + "\n```\n")
        if comment and (code or is_introduction):
            result.append("\n" + prose(comment + "\n"))
    return "".join(result)
