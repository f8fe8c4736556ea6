"""The frames of Docuvend's wire protocol, version 2, as docs/protocol.md describes them."""

import os
import struct
import typing

from docuvend_values import Error, Malformed, NotTransmissible, Reader, Writer

VERSION = 2

MAXIMUM_FRAME_BYTES = 1048576

_LENGTH_BYTES = 4
_HEAD = struct.Struct("<IBB")  # length of what follows it, type, number of descriptors
_SMALLEST_LENGTH = _HEAD.size - _LENGTH_BYTES


class Hello(typing.NamedTuple):
    version: int = VERSION
    bundle: str | None = None

    def write(self, writer):
        writer.number("I", self.version)
        writer.flag(self.bundle is not None)
        if self.bundle is not None:
            writer.text(self.bundle)

    @classmethod
    def read(cls, reader):
        version = reader.number("I")
        if version != VERSION:  # only the number is known to be there
            reader.take_rest()
            return cls(version)
        return cls(version, reader.text() if reader.flag() else None)


class Request(typing.NamedTuple):
    number: int
    wants_reply: bool
    operation: str
    arguments: list

    def write(self, writer):
        writer.number("Q", self.number)
        writer.flag(self.wants_reply)
        writer.text(self.operation)
        writer.values(self.arguments)

    @classmethod
    def read(cls, reader):
        return cls(reader.number("Q"), reader.flag(), reader.text(), reader.values())


class Reply(typing.NamedTuple):
    number: int
    values: list

    def write(self, writer):
        writer.number("Q", self.number)
        writer.values(self.values)

    @classmethod
    def read(cls, reader):
        return cls(reader.number("Q"), reader.values())


class Failure(typing.NamedTuple):
    number: int
    error: Error

    def write(self, writer):
        writer.number("Q", self.number)
        writer.error(self.error)

    @classmethod
    def read(cls, reader):
        return cls(reader.number("Q"), reader.error())


class End(typing.NamedTuple):
    error: Error

    def write(self, writer):
        writer.error(self.error)

    @classmethod
    def read(cls, reader):
        return cls(reader.error())


class Ping(typing.NamedTuple):
    def write(self, writer):
        pass

    @classmethod
    def read(cls, _reader):
        return cls()


class Pong(Ping):
    pass


FRAMES = {1: Hello, 2: Request, 3: Reply, 4: Failure, 5: End, 6: Ping, 7: Pong}
_TYPES = {frame: number for number, frame in FRAMES.items()}


def encode(frame):
    """The bytes of a frame and the numbers of the descriptors that go with the first of them."""
    writer = Writer()
    frame.write(writer)
    length = _SMALLEST_LENGTH + len(writer.bytes)
    if length > MAXIMUM_FRAME_BYTES:
        raise NotTransmissible("a frame that is too long")
    return _HEAD.pack(length, _TYPES[type(frame)], len(writer.descriptors)) + writer.bytes, writer.descriptors


class FrameReader:
    """Makes frames of what a socket gives: bytes, and descriptors that wait in line for the frame that declares them."""

    def __init__(self):
        self._bytes = bytearray()
        self._descriptors = []

    def add(self, data, descriptors=()):
        self._bytes += data
        self._descriptors += descriptors

    @property
    def is_inside_frame(self):
        return bool(self._bytes)

    def next(self):
        """The next whole frame, or None when more must come first."""
        if len(self._bytes) < _LENGTH_BYTES:
            return None
        length = struct.unpack_from("<I", self._bytes)[0]
        if not _SMALLEST_LENGTH <= length <= MAXIMUM_FRAME_BYTES:
            raise Malformed(f"a frame of {length} bytes")
        if len(self._bytes) < _LENGTH_BYTES + length:
            return None
        _, kind, declared = _HEAD.unpack_from(self._bytes)
        reader = Reader(self._bytes[_HEAD.size:_LENGTH_BYTES + length], self._descriptors[:declared])
        if declared > len(self._descriptors):
            raise Malformed("a frame without the descriptors that it declares")
        if kind not in FRAMES:
            raise Malformed(f"a frame of unknown type {kind}")
        del self._bytes[:_LENGTH_BYTES + length], self._descriptors[:declared]
        frame = FRAMES[kind].read(reader)
        reader.finish()
        return frame

    def close(self):
        """Nothing more comes: what waits in line belongs to nobody."""
        for number in self._descriptors:
            os.close(number)
        self._descriptors.clear()
