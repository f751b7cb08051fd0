"""The text of a C++ source as tokens, and the statements of its blocks.

Not a compiler: it relies on the layout that clang-format gives to sources. If it misreads one, the
mutant does not compile, and such mutants do not count.
"""

import re
from dataclasses import dataclass, field

_TOKEN = re.compile(
    r"""
    (?P<comment>//[^\n]*|/\*.*?\*/)
  | (?P<raw>(?:u8|u|U|L)?R"(?P<delimiter>[^()\\\s]*)\(.*?\)(?P=delimiter)")
  | (?P<string>(?:u8|u|U|L)?"(?:\\.|[^"\\\n])*")
  | (?P<char>(?:u8|u|U|L)?'(?:\\.|[^'\\\n])+')
  | (?P<number>\.?\d(?:[eEpP][+-]|'[0-9a-zA-Z]|[0-9a-zA-Z_.])*)
  | (?P<word>[A-Za-z_]\w*)
  | (?P<mark><<=|>>=|<=>|\.\.\.|->\*|::|->|\+\+|--|<<|<=|>=|==|!=|&&|\|\||[-+*/%&|^]=|[^\s\w])
    """,
    re.VERBOSE | re.DOTALL,
)

_OPENING = {"(": ")", "[": "]", "{": "}"}
_CONDITIONAL = {"if", "for", "while", "switch"}
_JUMPS = {"return", "break", "continue", "throw", "goto", "co_return"}
_DECLARING = {"const", "constexpr", "static", "auto", "using", "struct", "class", "enum", "union",
              "typedef", "thread_local", "template", "friend", "static_assert", "public", "private",
              "protected", "unsigned", "signed", "mutable", "explicit", "virtual", "inline"}
# What comes before the brace of a block of statements, as opposed to that of a list or a class.
_BEFORE_BLOCK = {")", "else", "do", "try", "const", "noexcept", "override", "mutable"}


@dataclass(frozen=True)
class Token:
    kind: str  # string, char, number, word, mark, raw or directive
    text: str
    start: int
    line: int

    @property
    def end(self):
        return self.start + len(self.text)


@dataclass(frozen=True)
class Statement:
    """Tokens [first, last] of a source."""

    kind: str  # label, declaration, jump, compound or expression
    first: int
    last: int


@dataclass
class Source:
    """A text taken apart once."""

    text: str
    tokens: list = field(init=False)
    partners: dict = field(init=False)  # each bracket's position -> that of its partner

    def __post_init__(self):
        self.tokens = _tokens_of(self.text)
        self.partners = _partners_of(self.tokens)

    def blocks(self):
        """The statements of each block, as one list a block."""
        inside = []
        for index, token in enumerate(self.tokens):
            if token.text == "{" and index in self.partners and self._opens_block(index, inside):
                inside.append((index, self.partners[index]))
                yield self._statements(index + 1, self.partners[index])

    def span(self, statement):
        """Where a statement begins and ends in the text."""
        return self.tokens[statement.first].start, self.tokens[statement.last].end

    def _opens_block(self, index, blocks):
        if index == 0:
            return False
        before = self.tokens[index - 1]
        if before.text in _BEFORE_BLOCK:
            return True
        # Also a block that follows another statement or block, a label, or a constructor's member
        # initialisers.
        nested = any(first < index < last for first, last in blocks)
        return before.text == "}" or (nested and before.text in {";", "{", ":"})

    def _statements(self, position, end):
        statements = []
        while position < end:
            statement = self._statement(position, end)
            if statement is None:
                break  # not understood
            statements.append(statement)
            position = statement.last + 1
        return statements

    def _statement(self, position, end):
        text = self.tokens[position].text
        if text in {"case", "default"}:
            last = self._find({":"}, position, end)
            return last and Statement("label", position, last)
        if text in _CONDITIONAL or text in {"do", "try", "{"}:
            last = self._compound_end(position, end)
            return last and Statement("compound", position, last)
        last = self._find({";"}, position, end)
        if last is None:
            return None
        if text in _JUMPS:
            return Statement("jump", position, last)
        kind = "declaration" if self._declares(position, last) else "expression"
        return Statement(kind, position, last)

    def _find(self, wanted, position, end):
        """The first of these marks outside brackets."""
        while position < end:
            if self.tokens[position].text in wanted:
                return position
            position = self.partners.get(position, position) + 1
        return None

    def _compound_end(self, position, end):
        text = self.tokens[position].text
        if text == "{":
            return self.partners.get(position)
        if text in {"do", "try"}:
            last = self.partners.get(position + 1)
            if last is None:
                return None
            if text == "do":
                return self._find({";"}, last + 1, end)
            while last + 1 < end and self.tokens[last + 1].text == "catch":
                last = self.partners[self._find({"{"}, last + 1, end)]
            return last
        position += 1
        if self.tokens[position].text == "constexpr":
            position += 1
        body = self._statement(self.partners.get(position, end) + 1, end) if position < end else None
        if body is None:
            return None
        last = body.last
        if text == "if" and last + 1 < end and self.tokens[last + 1].text == "else":
            other = self._statement(last + 2, end)
            return other and other.last
        return last

    def _declares(self, position, last):
        tokens = self.tokens
        if tokens[position].text in _DECLARING:
            return True
        at = position
        if tokens[at].kind != "word":
            return False
        while at + 2 <= last and tokens[at + 1].text == "::" and tokens[at + 2].kind == "word":
            at += 2
        at += 1
        if tokens[at].text == "<":
            depth = 0
            while at < last:
                depth += {"<": 1, ">": -1}.get(tokens[at].text, 0)
                at += 1
                if depth == 0:
                    break
        while tokens[at].text in {"&", "&&", "*", "const"}:
            at += 1
        return tokens[at].kind == "word"


def _tokens_of(text):
    tokens = []
    position, line = 0, 1
    while position < len(text):
        directive = _directive_at(text, position)
        match = None if directive else _TOKEN.match(text, position)
        piece = directive or (match.group() if match else text[position])
        if directive:
            tokens.append(Token("directive", piece, position, line))
        elif match and match.lastgroup != "comment":
            tokens.append(Token(match.lastgroup, piece, position, line))
        position += len(piece)
        line += piece.count("\n")
    return tokens


def _directive_at(text, position):
    """A line for the preprocessor with the lines that continue it, None elsewhere."""
    if text[position] != "#" or text[:position].rpartition("\n")[2].strip():
        return None
    return re.compile(r"#(?:\\\n|[^\n])*").match(text, position).group()


def _partners_of(tokens):
    partners, open_ones = {}, []
    for index, token in enumerate(tokens):
        if token.kind != "mark":
            continue
        if token.text in _OPENING:
            open_ones.append(index)
        elif open_ones and token.text == _OPENING[tokens[open_ones[-1]].text]:
            partners[open_ones.pop()] = index
    return partners
