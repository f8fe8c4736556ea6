"""The small changes that are made on purpose: each kind is a function that yields (first position, end, replacement) for a source."""

import hashlib
import re

from cpp_source import Source

_COMPARISONS = {"==": ("!=",), "!=": ("==",), "<": ("<=", ">="), "<=": ("<", ">"), ">": (">=", "<="), ">=": (">", "<")}
_ARITHMETIC = {"+": "-", "-": "+", "*": "/", "/": "*", "%": "*", "+=": "-=", "-=": "+=", "<<": ">>", "|": "&", "&": "|"}
_DIVIDING = {"&&", "||", "?"} | set(_COMPARISONS)
_LEVELS = {"[ERROR]": "[INFO]", "[INFO]": "[DEBUG]", "[DEBUG]": "[NOTICE]", "[NOTICE]": "[ERROR]"}
_CALLS_TO_A_QUEUE = {"async", "barrierAsync", "sync", "after", "addOperation"}
_KINDS_OF_QUEUE = {"serialQueue": "concurrentQueue", "concurrentQueue": "serialQueue"}
_NO_CALLS = {"if", "move"}
_LOCKS = {"lock_guard", "unique_lock", "scoped_lock", "shared_lock"}
_NO_STATEMENT_OF_ITS_OWN = {
    "return", "using", "typedef", "const", "constexpr", "auto", "static", "if", "for", "while", "switch", "do", "case", "default", "throw",
    "struct", "class", "enum", "template", "typename", "namespace", "public", "private", "protected", "friend", "else", "static_assert"}
_PARAMETER = re.compile(r"(const\s+)?[\w:]+(<.*>)?(\s+|\s*[&*]+\s*)(\w+)(\s*=.*)?", re.DOTALL)
_DECLARATION = re.compile(r"[\w:]+(<[^;]*?>)?(\s+|\s*[&*]+\s+|\s+[&*]+\s*)\w+\s*(=|;|\(|\{|\[|$)", re.DOTALL)
_DECLARED_CONDITION = re.compile(r"(?:const\s+)?auto\s*[&*]*\s*(\w+)\s*=", re.DOTALL)
_CONSTANT = re.compile(r"^(?:inline )?constexpr ([\w:<>*, ]+?[ *])(k[A-Z]\w*)(?:\s*=|\{)", re.MULTILINE)
_ENUMERATION = re.compile(r"enum class (\w+)[^{;]*\{([^}]*)\}")


class Names:
    """What may stand for something else: the enumerators of each enumeration, and the constants of each type in a file."""

    def __init__(self, texts):
        self.next_enumerator = {}  # (enumeration, enumerator): enumerator
        self.next_constant = {}  # constant: constant
        for text in texts:
            plain = re.sub(r"//[^\n]*", "", text)
            for enumeration, body in _ENUMERATION.findall(plain):
                names = [entry.split("=")[0].strip() for entry in body.split(",") if entry.strip()]
                for name, following in zip(names, names[1:] + names[:1]):
                    if name != following:
                        self.next_enumerator[enumeration, name] = following
            of_type = {}
            for kind, name in _CONSTANT.findall(plain):
                of_type.setdefault(kind.strip(), []).append(name)
            for names in of_type.values():
                for name, following in zip(names, names[1:] + names[:1]):
                    if name != following:
                        self.next_constant[name] = following


def _conditions(source):
    """(first, last) of the tokens of each condition."""
    for index, token in enumerate(source.tokens[:-1]):
        if token.text not in ("if", "while", "for") or source.tokens[index + 1].text != "(":
            continue
        first, end = index + 2, source.match[index + 1]
        semicolons = []
        found = source.next_at_level(index + 1, (";",), end)
        while found is not None:
            semicolons.append(found)
            found = source.next_at_level(found, (";",), end)
        if token.text == "for":
            if len(semicolons) != 2:
                continue
            first, end = semicolons[0] + 1, semicolons[1]
        elif semicolons:
            first = semicolons[-1] + 1
        if first < end:
            yield first, end - 1


def negated_conditions(source, _):
    for first, last in _conditions(source):
        text = source.slice(first, last)
        if text.startswith("!") and not any(token.text in _DIVIDING for token in source.tokens[first:last + 1]):
            continue  # the negation that is dropped
        declared = _DECLARED_CONDITION.match(text)
        replacement = f"{text}; !{declared[1]}" if declared else f"!({text})"
        yield source.tokens[first].start, source.tokens[last].end, replacement


def dropped_negations(source, _):
    for token in source.tokens:
        if token.kind == "sign" and token.text == "!":
            yield token.start, token.end, ""


def swapped_connectives(source, _):
    for index, token in enumerate(source.tokens):
        if token.text in ("&&", "||") and source.is_spaced(index):
            yield token.start, token.end, "||" if token.text == "&&" else "&&"


def changed_comparisons(source, _):
    for index, token in enumerate(source.tokens):
        if token.kind == "sign" and token.text in _COMPARISONS and source.is_spaced(index):
            for other in _COMPARISONS[token.text]:
                yield token.start, token.end, other


def changed_arithmetic(source, _):
    for index, token in enumerate(source.tokens):
        if token.kind != "sign":
            continue
        if token.text in _ARITHMETIC and source.is_spaced(index):
            yield token.start, token.end, _ARITHMETIC[token.text]
        elif token.text in ("++", "--"):
            yield token.start, token.end, "--" if token.text == "++" else "++"


def changed_numbers(source, _):
    for index, token in enumerate(source.tokens):
        found = re.fullmatch(r"(\d[\d']*)([uUlL]*)", token.text) if token.kind == "number" else None
        is_pure_virtual = index >= 2 and source.tokens[index - 1].text == "=" and source.tokens[index - 2].text in (")", "const")
        if found and not is_pure_virtual:
            yield token.start, token.end, str(int(found[1].replace("'", "")) + 1) + found[2]


def changed_constants(source, names):
    for index, token in enumerate(source.tokens):
        if token.kind != "word":
            continue
        if token.text in ("true", "false"):
            yield token.start, token.end, "false" if token.text == "true" else "true"
        elif token.text in names.next_constant:
            yield token.start, token.end, names.next_constant[token.text]
        elif index >= 2 and source.tokens[index - 1].text == "::":
            following = names.next_enumerator.get((source.tokens[index - 2].text, token.text))
            if following:
                yield token.start, token.end, following


def changed_texts(source, _):
    for token in source.tokens:
        if token.kind not in ("string", "character") or token.text.count('"') not in (0, 2):
            continue
        if token.kind == "character":
            yield token.start, token.end, "'y'" if token.text == "'x'" else "'x'"
            continue
        opening = token.text.index('"') + 1
        body = token.text[opening:-1]
        for level, other in _LEVELS.items():
            if body.startswith(level + " "):
                yield token.start + opening, token.start + opening + len(level), other
        # A letter in the second half, for the first half of a message may be its level; not one that a percent sign or a backslash needs.
        letters = [found.start() for found in re.finditer(r"(?<![%\\])[A-Za-z](?![^\[]*\])", body)]
        if letters:
            position = letters[len(letters) // 2]
            at = token.start + opening + position
            yield at, at + 1, "y" if body[position] == "x" else "x"
        else:
            yield token.end - 1, token.end - 1, "x"


def _statements(source):
    """(first, last) of the tokens of each statement that is neither a declaration nor a construct of statements; the last is its ;"""
    for index, token in enumerate(source.tokens):
        parent = source.parent[index]
        if parent not in source.bodies or index == 0:
            continue
        before = source.tokens[index - 1]
        starts = before.text in ("{", "}", ";", "else", ":") and before.kind in ("sign", "word")
        if before.text == ")":
            opening = source.match[index - 1]
            starts = source.tokens[opening - 1].text in ("if", "for", "while", "switch")
        if not starts:
            continue
        end = source.next_at_level(index - 1, (";",), source.match[parent])
        if end is not None and end > index:
            yield index, end


def removed_statements(source, _):
    for first, last in _statements(source):
        token, text = source.tokens[first], source.slice(first, last)
        if text in ("return;", "break;", "continue;"):
            yield token.start, source.tokens[last].end, ";"
        elif token.text in _NO_STATEMENT_OF_ITS_OWN or _DECLARATION.match(text):
            if _LOCKS & {other.text for other in source.tokens[first:last]}:
                yield token.start, source.tokens[last].end, ";"
        elif token.kind == "word" or token.text in ("*", "(", "++", "--"):
            yield token.start, source.tokens[last].end, ";"


def _can_stand_elsewhere(source, first, last):
    """Whether a statement does something and is whole: no branch of another one, and none with an else or a body."""
    token, parent = source.tokens[first], source.parent[first]
    if source.tokens[first - 1].text not in ("{", "}", ";") or source.tokens[last + 1].text == "else":
        return False
    if token.text == "if":
        return not any(body in source.bodies and source.parent[body] == parent for body in range(first, last))
    if token.text in _NO_STATEMENT_OF_ITS_OWN | {"break", "continue", "assert"} or _DECLARATION.match(source.slice(first, last)):
        return False
    return token.kind == "word" or token.text in ("*", "(", "++", "--")


def _calls_something(source, first, last):
    return any(source.tokens[index].kind == "word" and source.tokens[index].text not in _NO_CALLS and source.tokens[index + 1].text == "("
               for index in range(first, last))


def exchanged_statements(source, _):
    """Two neighbours that each call something; in what order values are stored is mostly nobody's affair."""
    statements = [statement for statement in _statements(source)
                  if _can_stand_elsewhere(source, *statement) and _calls_something(source, *statement)]
    following = {first: (first, last) for first, last in statements}
    for first, last in statements:
        if last + 1 in following:
            second, end = following[last + 1]
            between = source.text[source.tokens[last].end:source.tokens[second].start]
            yield source.tokens[first].start, source.tokens[end].end, source.slice(second, end) + between + source.slice(first, last)


def other_queues(source, _):
    for index, token in enumerate(source.tokens):
        is_called = token.text in _KINDS_OF_QUEUE and index > 0 and source.tokens[index - 1].text in (".", "->")
        # With a label; without one it is a queue that is there.
        if is_called and source.tokens[index + 1].text == "(" and source.elements(index + 1):
            yield token.start, token.end, _KINDS_OF_QUEUE[token.text]


def removed_queues(source, _):
    """A barrier becomes an ordinary task, and what is to run on a queue runs in its place."""
    for index, token in enumerate(source.tokens[:-1]):
        if token.text in ("barrierAsync", "barrierSync"):
            yield token.start, token.end, "async" if token.text == "barrierAsync" else "sync"
        if token.text == "qxSync" and source.tokens[index + 1].text == "(":
            elements = source.elements(index + 1)
            if len(elements) == 2:
                yield token.start, source.tokens[source.match[index + 1]].end, f"({source.slice(*elements[1])})()"
    for first, last in _statements(source):
        for index in range(first, last):
            called = source.tokens[index].text in _CALLS_TO_A_QUEUE and source.tokens[index - 1].text in (".", "->")
            if called and source.tokens[index + 1].text == "(" and source.match[index + 1] == last - 1:
                elements = source.elements(index + 1)
                if elements:
                    # Moved into a function of its own, a task lives as long as what it holds.
                    yield source.tokens[first].start, source.tokens[last].end, f"({source.slice(*elements[-1])})();"


def swapped_arguments(source, _):
    for index, token in enumerate(source.tokens):
        if token.kind != "sign" or token.text not in ("(", "{") or index == 0 or index in source.bodies:
            continue
        before = source.tokens[index - 1]
        if token.text == "(" and not (before.kind == "word" or before.text in (">", ")")):
            continue
        if before.text in ("if", "for", "while", "switch", "return"):
            continue
        if any(other.text == "enum" for other in source.tokens[max(0, index - 5):index]):
            continue
        if source.next_at_level(index, (";",), source.match[index]) is not None:
            continue
        elements = source.elements(index)
        texts = [source.slice(*element) for element in elements]
        if any(_PARAMETER.fullmatch(text) for text in texts):
            continue
        for i in range(len(elements) - 1):
            if before.text == "dvLog" and i == 0:
                continue  # the format
            (first, first_end), (second, second_end) = elements[i], elements[i + 1]
            if texts[i] != texts[i + 1]:
                between = source.text[source.tokens[first_end].end:source.tokens[second].start]
                yield source.tokens[first].start, source.tokens[second_end].end, texts[i + 1] + between + texts[i]


def _may_return_truth(source, index):
    """Whether the function around a token returns a bool, or a lambda whatever it returns; the opposite of anything else does not compile."""
    body = source.parent[index]
    while body is not None:
        before = body - 1
        while before > 0 and source.tokens[before].text in ("const", "noexcept", "override", "mutable"):
            before -= 1
        if body in source.bodies and source.tokens[before].text == ")":
            name = source.match[before] - 1
            if source.tokens[name].text == "]":
                return True
            if source.tokens[name].text not in ("if", "for", "while", "switch"):
                first = name
                while first > 0 and source.tokens[first - 1].text not in (";", "{", "}", ":"):
                    first -= 1
                return any(token.text in ("bool", "auto") for token in source.tokens[first:name])
        elif source.tokens[body].text == "{" and source.tokens[before].text == "]":
            return True
        body = source.parent[body]
    return True


def other_values(source, _):
    """A choice gives the other value, and a return gives the opposite or nothing."""
    for index, token in enumerate(source.tokens):
        if token.kind == "sign" and token.text == "?":
            end = source.match[source.parent[index]] if source.parent[index] is not None else len(source.tokens)
            colon = source.next_at_level(index, (":",), end)
            after = source.next_at_level(colon, (";", ",", ":"), end) if colon is not None else None
            last = (after if after is not None else end) - 1
            if colon is not None and colon < last + 1 and colon > index + 1:
                one, other = source.slice(index + 1, colon - 1), source.slice(colon + 1, last)
                yield source.tokens[index + 1].start, source.tokens[last].end, f"{other} : {one}"
        if token.text == "return" and source.tokens[index + 1].text != ";":
            parent = source.parent[index]
            end = source.next_at_level(index, (";",), source.match[parent]) if parent is not None else None
            if end is None:
                continue
            text = source.slice(index + 1, end - 1)
            start, stop = source.tokens[index + 1].start, source.tokens[end].start
            if text not in ("true", "false") and _may_return_truth(source, index):
                yield start, stop, f"!({text})"
            if text not in ("true", "false", "{}", "std::nullopt", "nullptr"):
                yield start, stop, "{}"


KINDS = {
    "condition": negated_conditions,
    "negation": dropped_negations,
    "connective": swapped_connectives,
    "comparison": changed_comparisons,
    "arithmetic": changed_arithmetic,
    "number": changed_numbers,
    "constant": changed_constants,
    "text": changed_texts,
    "statement": removed_statements,
    "order": exchanged_statements,
    "queue": removed_queues,
    "concurrency": other_queues,
    "arguments": swapped_arguments,
    "value": other_values,
}


def _untouched(source):
    """Where nothing is changed: what only the compiler reads."""
    for index, token in enumerate(source.tokens):
        if token.kind == "directive":
            yield token.start, token.end
        elif token.text in ("static_assert", "throw", "using", "namespace", "template"):
            parent = source.parent[index]
            end = source.match[parent] if parent is not None else len(source.tokens)
            if token.text == "template":
                # Its parameters; the brackets are signs like any other here.
                stop, depth = index + 1, 0
                while stop < end:
                    depth += {"<": 1, ">": -1}.get(source.tokens[stop].text, 0)
                    if depth == 0:
                        break
                    stop += 1
            else:
                stop = source.next_at_level(index, (";", "{"), end)
                stop = end - 1 if stop is None else stop
            yield token.start, source.tokens[min(stop, len(source.tokens) - 1)].end


def _digest(*parts):
    return hashlib.sha256("\0".join(parts).encode()).hexdigest()


def _joined(text):
    return " ".join(line.strip() for line in text.splitlines())


class Mutant:
    """One change of one file. `before` and `after` are the lines that it touches, each as one line."""

    def __init__(self, path, text, kind, start, end, replacement):
        self.path, self.kind = path, kind
        self.start, self.end, self.replacement = start, end, replacement
        first = text.rfind("\n", 0, start) + 1
        last = text.find("\n", end)
        last = len(text) if last < 0 else last
        self.line = text.count("\n", 0, start) + 1
        self.before = _joined(text[first:last])
        self.after = _joined(text[first:start] + replacement + text[end:last])

    def applied_to(self, text):
        return text[:self.start] + self.replacement + text[self.end:]

    @property
    def identity(self):
        """What the same change is called in another version of the file."""
        return self.path, self.kind, self.before, self.after

    def key(self, text):
        return _digest(self.path, str(self.start), str(self.end), self.kind, self.replacement, text)

    def __str__(self):
        return f"{self.path}:{self.line}: {self.kind}\n- {self.before}\n+ {self.after}"


def mutants_of(path, text, names):
    """All mutants of a file, each change once, in the order of the file."""
    source = Source(text)
    untouched = list(_untouched(source))
    seen = set()
    for kind, changes in KINDS.items():
        for start, end, replacement in changes(source, names):
            if any(start < stop and end > begin or begin <= start < stop for begin, stop in untouched):
                continue
            if text[start:end] == replacement or (start, end, replacement) in seen:
                continue
            seen.add((start, end, replacement))
            yield Mutant(path, text, kind, start, end, replacement)


def shuffled(mutants, seed=""):
    """In an order that depends on nothing but the seed and what is changed: the first so many are a random sample of all."""
    counted = {}
    keyed = []
    for mutant in mutants:
        number = counted[mutant.identity] = counted.get(mutant.identity, 0) + 1
        keyed.append((_digest(seed, *mutant.identity, str(number)), mutant))
    return [mutant for _, mutant in sorted(keyed, key=lambda pair: pair[0])]
