"""The small changes that can be made to a source."""

import re
from dataclasses import dataclass

from .source import Source

_COMPARISONS = {"==": ["!="], "!=": ["=="], "<": ["<=", ">"], ">": [">=", "<"], "<=": ["<", ">="],
                ">=": [">", "<="]}
_LOGICAL = {"&&": "||", "||": "&&"}
_ARITHMETIC = {"+": "-", "-": "+", "*": "/", "/": "*", "%": "*", "|": "&", "+=": "-=", "-=": "+=",
               "*=": "/=", "|=": "&=", "&=": "|=", "^": "|", "^=": "|=", "<<": ">>", "++": "--",
               "--": "++"}
_WORDS = {"true": "false", "false": "true", "and": "or", "or": "and"}
_LEVELS = ["debug", "info", "notice", "error"]
_LEVEL_NAMES = {"kDebug": "kInfo", "kInfo": "kDefault", "kDefault": "kInfo", "kError": "kInfo"}
_NUMBER = re.compile(r"(0[xX])?([0-9a-fA-F']+)([uUlLzZ]*)$")
_FRACTION = re.compile(r"([0-9']*\.[0-9']*)([fF]?)$")


@dataclass(frozen=True)
class Mutant:
    """One change of one file: the text [start, end) becomes `replacement`."""

    file: str  # from the root of the tree
    line: int
    kind: str
    start: int
    end: int
    original: str
    replacement: str

    @property
    def folder(self):
        return self.file.partition("/")[0]

    @property
    def edit(self):
        def shown(text):
            text = " ".join(text.split())
            return text if len(text) <= 60 else text[:57] + "..."
        return f"{shown(self.original) or 'nothing'} -> {shown(self.replacement) or 'nothing'}"

    def __str__(self):
        return f"{self.file}:{self.line}: {self.kind}: {self.edit}"

    def apply(self, text):
        return text[:self.start] + self.replacement + text[self.end:]


def mutants_of(file, text):
    """All mutants of a file, as one list for each place where something can be changed."""
    source = Source(text)
    places = [*_of_tokens(source), *_of_conditions(source), *_of_statements(source)]

    def mutant(kind, start, end, replacement):
        line = text.count("\n", 0, start) + 1
        return Mutant(file, line, kind, start, end, text[start:end], replacement)

    made = [[mutant(kind, start, end, replacement) for replacement in replacements]
            for kind, start, end, replacements in places]
    return sorted(made, key=lambda place: (place[0].start, place[0].end, place[0].kind))


def _of_tokens(source):
    tokens = source.tokens
    for index, token in enumerate(tokens):
        before = tokens[index - 1].text if index else ""
        after = tokens[index + 1].text if index + 1 < len(tokens) else ""
        kind, replacements = _changes(source.text, token, before, after)
        if replacements:
            yield kind, token.start, token.end, replacements


def _changes(text, token, before, after):
    if token.kind == "number":
        return "number", _numbers(token.text)
    if token.kind == "string" and before != "extern":
        return "text", _texts(token.text)
    if token.kind == "char":
        return "text", ["'~'" if token.text != "'~'" else "'!'"]
    if token.kind == "word":
        return _words(token, before, after)
    if token.kind == "mark" and before != "operator":
        return _marks(text, token)
    return "", []


def _words(token, before, after):
    if token.text in _LEVELS and before == "." and after == "(":
        return "log level", [level for level in _LEVELS if level != token.text]
    if token.text in _LEVEL_NAMES and before == "::":
        return "log level", [_LEVEL_NAMES[token.text]]
    if token.text in _WORDS:
        return "boolean", [_WORDS[token.text]]
    return "", []


def _marks(text, token):
    if token.text in {"++", "--"}:
        return "arithmetic", [_ARITHMETIC[token.text]]
    # A mark between blanks is a binary operator, not part of a type.
    spaced = text[token.start - 1] in " \n" and text[token.end:token.end + 1] in (" ", "\n")
    if token.text == "!":
        return "negation", [""]
    if not spaced:
        return "", []
    if token.text in _COMPARISONS:
        return "comparison", _COMPARISONS[token.text]
    if token.text in _LOGICAL:
        return "logical", [_LOGICAL[token.text]]
    if token.text in _ARITHMETIC:
        return "arithmetic", [_ARITHMETIC[token.text]]
    return "", []


def _numbers(text):
    if fraction := _FRACTION.match(text):
        value = float(fraction[1].replace("'", ""))
        return [f"{changed!r}{fraction[2]}" for changed in (value + 1, value / 2 if value else -1.0)]
    whole = _NUMBER.match(text)
    if whole is None:
        return []
    prefix, digits, suffix = whole[1] or "", whole[2].replace("'", ""), whole[3]
    try:
        value = int(digits, 16 if prefix else 10)
    except ValueError:
        return []
    changed = [value + 1]
    if value > 0:
        changed.append(value - 1)
    if value > 2:
        changed.append(value // 2)
    return [(f"{prefix}{number:X}" if prefix else str(number)) + suffix for number in changed]


def _texts(text):
    quote = text.index('"')
    inner = text[quote + 1:-1]
    if not inner:
        return [text[:quote] + '"mutant"']
    return [text[:quote] + f'"{changed}"' for changed in (inner + "~", "~" + inner, "")]


def _of_conditions(source):
    tokens = source.tokens
    for index, token in enumerate(tokens):
        if token.text not in {"if", "while"} or token.kind != "word":
            continue
        opening = index + 1
        if opening not in source.partners or tokens[opening].text != "(":
            continue
        closing = source.partners[opening]
        inside = tokens[opening + 1:closing]
        # A declaration cannot be put into brackets.
        if any(one.text in {"=", ";"} for one in inside) or not inside:
            continue
        start, end = inside[0].start, inside[-1].end
        yield "condition", start, end, [f"!({source.text[start:end]})"]


def _of_statements(source):
    movable = {"expression", "compound"}
    for block in source.blocks():
        for statement in block:
            start, end = source.span(statement)
            if statement.kind in movable:
                yield "dropped statement", start, end, [""]
        for first, second in zip(block, block[1:]):
            if first.kind not in movable or second.kind not in movable:
                continue
            start, middle = source.span(first)
            begin, end = source.span(second)
            swapped = source.text[begin:end] + source.text[middle:begin] + source.text[start:middle]
            yield "swapped statements", start, end, [swapped]
