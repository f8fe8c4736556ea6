"""The values of Docuvend's wire protocol, as docs/protocol.md describes them.

Values are None (absent), bool, int, float, str, bytes (data), URL, uuid.UUID, list, dict with str keys, Error and Descriptor. A message that
the wire cannot carry raises NotTransmissible where it is sent; bytes that are no frame raise Malformed where they are read.
"""

import collections
import dataclasses
import os
import re
import struct
import urllib.parse
import uuid

MAXIMUM_TEXT_BYTES = 65536
MAXIMUM_NESTING = 32
MAXIMUM_ELEMENTS = 16384
MAXIMUM_DESCRIPTORS = 16

_BAD_CHARACTER = re.compile("[\x00-\x08\x0b\x0c\x0e-\x1f\ufffe\uffff]")
_PLAIN_IN_URL = "-._~!$&'()*+,;=:@/"


class Malformed(Exception):
    """What the other side sent is no frame."""


class NotTransmissible(Exception):
    """The wire cannot carry what was to be sent."""


class URL(str):
    """An absolute file URL, as text."""

    _PATTERN = re.compile(r"file:(?://(?:localhost)?|(?!//))(/(?:[A-Za-z0-9" + re.escape(_PLAIN_IN_URL) + r"]|%[0-9A-Fa-f]{2})*)", re.ASCII)

    def __new__(cls, text):
        match = cls._PATTERN.fullmatch(text)
        if not match or b"\0" in urllib.parse.unquote_to_bytes(match[1]):
            raise ValueError(f"no file URL: {text}")
        urllib.parse.unquote_to_bytes(match[1]).decode()
        return super().__new__(cls, "file://" + match[1])

    @classmethod
    def of_path(cls, path, is_directory=False):
        text = urllib.parse.quote(path, safe=_PLAIN_IN_URL)
        return cls("file://" + text + ("/" if is_directory and not text.endswith("/") else ""))

    @property
    def path(self):
        return urllib.parse.unquote(self[len("file://"):]).rstrip("/") or "/"


@dataclasses.dataclass
class Error(Exception):
    domain: str
    code: int
    texts: dict = dataclasses.field(default_factory=dict)
    url: URL | None = None
    underlying: "Error | None" = None

    def __str__(self):
        beneath = f" ({self.underlying})" if self.underlying else ""
        return f"{self.domain} {self.code}: {self.texts.get('description', '')}{beneath}"


class Descriptor:
    """An open file that came with a message, or goes with one. Whoever has it closes it."""

    def __init__(self, number):
        self.number = number

    def open(self, mode):
        """A file object that owns the descriptor from now on."""
        return os.fdopen(self.number, mode)

    def close(self):
        os.close(self.number)


class Writer:
    """Makes the contents of one frame."""

    def __init__(self):
        self.bytes = bytearray()
        self.descriptors = []
        self._elements = 0
        self._depth = 0

    def number(self, layout, value):
        try:
            self.bytes += struct.pack("<" + layout, value)
        except struct.error as error:
            raise NotTransmissible(str(error)) from error

    def flag(self, value):
        self.number("B", 1 if value else 0)

    def text(self, text):
        if _BAD_CHARACTER.search(text):
            raise NotTransmissible("a character that XML cannot carry")
        try:
            encoded = text.encode()
        except UnicodeEncodeError as error:
            raise NotTransmissible(str(error)) from error
        if len(encoded) > MAXIMUM_TEXT_BYTES:
            raise NotTransmissible("a text that is too long")
        self.number("I", len(encoded))
        self.bytes += encoded

    def values(self, values):
        self.number("I", len(values))
        for value in values:
            self.value(value)

    def value(self, value):
        self._count()
        for kind, types, write in self._KINDS:
            if isinstance(value, types):
                self.number("B", kind)
                write(self, value)
                return
        raise NotTransmissible(f"a value of type {type(value).__name__}")

    def error(self, error):
        self._enter()
        self.text(error.domain)
        self.number("q", error.code)
        self.number("I", len(error.texts))
        for key, text in error.texts.items():
            self._count()
            self.text(key)
            self.text(text)
        self.flag(error.url is not None)
        if error.url is not None:
            self.text(error.url)
        self.flag(error.underlying is not None)
        if error.underlying is not None:
            self.error(error.underlying)
        self._depth -= 1

    def _count(self):
        self._elements += 1
        if self._elements > MAXIMUM_ELEMENTS:
            raise NotTransmissible("too many values")

    def _enter(self):
        if self._depth == MAXIMUM_NESTING:
            raise NotTransmissible("values nested too deeply")
        self._depth += 1

    def _data(self, value):
        self.number("I", len(value))
        self.bytes += value

    def _uuid(self, value):
        self.bytes += value.bytes

    def _array(self, value):
        self._enter()
        self.values(value)
        self._depth -= 1

    def _dictionary(self, value):
        self._enter()
        self.number("I", len(value))
        for key, element in value.items():
            self.text(key)
            self.value(element)
        self._depth -= 1

    def _descriptor(self, value):
        if self._depth > 0 or len(self.descriptors) == MAXIMUM_DESCRIPTORS:
            raise NotTransmissible("a descriptor inside another value, or too many")
        self.descriptors.append(value.number)

    # In this order: a bool is an int too, and a URL a str.
    _KINDS = [
        (0, type(None), lambda self, value: None),
        (1, bool, flag),
        (2, int, lambda self, value: self.number("q", value)),
        (3, float, lambda self, value: self.number("d", value)),
        (6, URL, text),
        (4, str, text),
        (5, bytes, _data),
        (7, uuid.UUID, _uuid),
        (8, (list, tuple), _array),
        (9, dict, _dictionary),
        (10, Error, error),
        (11, Descriptor, _descriptor),
    ]


class Reader:
    """Takes the contents of one frame apart."""

    def __init__(self, contents, descriptors):
        self._bytes = contents
        self._position = 0
        self._descriptors = collections.deque(descriptors)
        self._elements = 0
        self._depth = 0

    def take(self, count):
        if count > len(self._bytes) - self._position:
            raise Malformed("a frame that is too short")
        self._position += count
        return bytes(self._bytes[self._position - count:self._position])

    def take_rest(self):
        return self.take(len(self._bytes) - self._position)

    def number(self, layout):
        return struct.unpack("<" + layout, self.take(struct.calcsize("<" + layout)))[0]

    def flag(self):
        value = self.number("B")
        if value > 1:
            raise Malformed("a flag that is neither 0 nor 1")
        return value == 1

    def text(self):
        count = self.number("I")
        if count > MAXIMUM_TEXT_BYTES:
            raise Malformed("a text that is too long")
        try:
            text = self.take(count).decode()
        except UnicodeDecodeError as error:
            raise Malformed(str(error)) from error
        if _BAD_CHARACTER.search(text):
            raise Malformed("a character that XML cannot carry")
        return text

    def url(self):
        try:
            return URL(self.text())
        except ValueError as error:
            raise Malformed(str(error)) from error

    def values(self):
        return [self.value() for _ in range(self._counted())]

    def value(self):
        kind = self.number("B")
        if kind >= len(self._KINDS):
            raise Malformed(f"a value of unknown kind {kind}")
        return self._KINDS[kind](self)

    def error(self):
        self._enter()
        error = Error(self.text(), self.number("q"), self._pairs(Reader.text))
        if self.flag():
            error.url = self.url()
        if self.flag():
            error.underlying = self.error()
        self._depth -= 1
        return error

    def finish(self):
        if self._position < len(self._bytes):
            raise Malformed("bytes after the end of a frame's contents")
        if self._descriptors:
            raise Malformed("a descriptor that no value uses")

    def _counted(self):
        count = self.number("I")
        self._elements += count
        if self._elements > MAXIMUM_ELEMENTS:
            raise Malformed("too many values")
        return count

    def _enter(self):
        if self._depth == MAXIMUM_NESTING:
            raise Malformed("values nested too deeply")
        self._depth += 1

    def _pairs(self, read):
        pairs = {}
        for _ in range(self._counted()):
            key = self.text()
            if key in pairs:
                raise Malformed("one key twice")
            pairs[key] = read(self)
        return pairs

    def _array(self):
        self._enter()
        values = self.values()
        self._depth -= 1
        return values

    def _dictionary(self):
        self._enter()
        pairs = self._pairs(Reader.value)
        self._depth -= 1
        return pairs

    def _descriptor(self):
        if self._depth > 0 or not self._descriptors:
            raise Malformed("a descriptor inside another value, or one that did not come")
        return Descriptor(self._descriptors.popleft())

    # By kind.
    _KINDS = [
        lambda self: None,
        flag,
        lambda self: self.number("q"),
        lambda self: self.number("d"),
        text,
        lambda self: self.take(self.number("I")),
        url,
        lambda self: uuid.UUID(bytes=self.take(16)),
        _array,
        _dictionary,
        error,
        _descriptor,
    ]
