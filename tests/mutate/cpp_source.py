"""C++ source as tokens: so much of the language as it takes to change a piece of it on purpose."""

import re

_TOKEN = re.compile(
    r"""
      (?P<space>\s+)
    | (?P<comment>//[^\n]*|/\*.*?\*/)
    | (?P<directive>\#(?:[^\n\\]|\\.)*)
    | (?P<string>(?:u8|[uUL])?(?:R"(?P<fence>[^()\s\\]{0,16})\(.*?\)(?P=fence)"|"(?:[^"\\\n]|\\.)*"))
    | (?P<character>(?:u8|[uUL])?'(?:[^'\\\n]|\\.)+')
    | (?P<number>\.?\d(?:'?[\w.]|(?<=[eEpP])[+-])*)
    | (?P<word>[A-Za-z_]\w*)
    | (?P<sign><=>|<<=|->\*|\.\.\.|::|->|&&|\|\||==|!=|<=|>=|\+\+|--|\+=|-=|\*=|/=|%=|&=|\|=|\^=|<<|.)
    """,
    re.VERBOSE | re.DOTALL,
)

_OPENING = {"(": ")", "[": "]", "{": "}"}
_BEFORE_A_BODY = {")", "else", "do", "const", "noexcept", "override", "mutable", "try"}
_NOT_A_FUNCTION = {"class", "struct", "enum", "union", "namespace"}


class Token:
    __slots__ = ("kind", "text", "start", "end")

    def __init__(self, kind, text, start):
        self.kind, self.text, self.start, self.end = kind, text, start, start + len(text)

    def __repr__(self):
        return f"{self.kind}:{self.text}"


class Source:
    """`tokens` are without spaces and comments; `match` leads from a bracket's index to that of its partner."""

    def __init__(self, text):
        self.text = text
        self.tokens = [Token(found.lastgroup if found.lastgroup != "fence" else "string", found[0], found.start())
                       for found in _TOKEN.finditer(text)]
        self.tokens = [token for token in self.tokens if token.kind not in ("space", "comment")]
        self.match = {}
        self.parent = []  # for each token the index of the bracket around it, or None
        self._match_brackets()
        self.bodies = {index for index, token in enumerate(self.tokens) if token.text == "{" and self._is_body(index)}

    def _match_brackets(self):
        open_brackets = []
        for index, token in enumerate(self.tokens):
            if token.kind == "sign" and token.text in _OPENING.values():
                if not open_brackets or _OPENING[self.tokens[open_brackets[-1]].text] != token.text:
                    raise ValueError(f"a bracket without its partner at {self.line_of(token.start)}")
                self.match[index] = open_brackets[-1]
                self.match[open_brackets.pop()] = index
            self.parent.append(open_brackets[-1] if open_brackets else None)
            if token.kind == "sign" and token.text in _OPENING:
                open_brackets.append(index)
        if open_brackets:
            raise ValueError(f"a bracket without its partner at {self.line_of(self.tokens[open_brackets[-1]].start)}")

    # Whether statements stand in these braces. Those of a class, a namespace, an enumeration and of a value hold none.
    def _is_body(self, index):
        if index == 0:
            return False
        before = self.tokens[index - 1].text
        if before == "}" and self.tokens[self.match[index - 1] - 1].kind == "word" and \
                self.tokens[self.match[index - 1] - 2].text in (":", ","):
            return True  # of a constructor, after its members
        if before in ("{", "}", ";", ":"):
            return self.parent[index] is not None and self.tokens[self.parent[index]].text == "{" and self._is_body(self.parent[index])
        for token in reversed(self.tokens[max(0, index - 40):index]):
            if token.text in (";", "{", "}"):
                break
            if token.text == "->":  # a lambda's or a function's type
                return True
            if token.text in _NOT_A_FUNCTION:
                return False
        return before in _BEFORE_A_BODY or before == "]"

    def line_of(self, position):
        return self.text.count("\n", 0, position) + 1

    def slice(self, first, last):
        """The text from the token `first` to the token `last`, both included."""
        return self.text[self.tokens[first].start:self.tokens[last].end]

    def is_spaced(self, index):
        """A sign between two operands, as the formatter sets it; template brackets and references have no space on one side."""
        token = self.tokens[index]
        return self.text[token.start - 1:token.start].isspace() and self.text[token.end:token.end + 1].isspace()

    def next_at_level(self, index, signs, end):
        """The first token after `index` and before `end` that is one of the signs and in no further bracket; None if there is none."""
        index += 1
        while index < end:
            text = self.tokens[index].text
            if text in signs and self.tokens[index].kind == "sign":
                return index
            index = self.match[index] + 1 if text in _OPENING and self.tokens[index].kind == "sign" else index + 1
        return None

    def elements(self, opening):
        """Pairs of first and last token of what commas divide in a bracket."""
        end, first, pairs = self.match[opening], opening + 1, []
        while first < end:
            comma = self.next_at_level(first - 1, (",",), end)
            last = (comma if comma is not None else end) - 1
            if last < first:
                return []
            pairs.append((first, last))
            if comma is None:
                break
            first = comma + 1
        return pairs
