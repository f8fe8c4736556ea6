"""The frames of docs/protocol.md, read from the page and written again. TEST_PAGE is the page."""

import os
import struct
import unittest
import uuid

from docuvend_values import MAXIMUM_ELEMENTS, MAXIMUM_NESTING, MAXIMUM_TEXT_BYTES, URL, Error, Malformed, NotTransmissible
from docuvend_wire import Failure, FrameReader, Hello, Ping, Pong, Reply, Request, encode


def exchange(heading):
    """The frames of a worked exchange on the page, as (title, bytes)."""
    with open(os.environ["TEST_PAGE"], encoding="utf-8") as file:
        section = file.read().split(f"\n## {heading}\n")[1].split("\n## ")[0]
    paragraphs = section.strip().split("\n\n")
    return [(title, bytes.fromhex(shown)) for title, shown in zip(paragraphs, paragraphs[1:]) if shown.startswith("    ")]


def decode(data):
    frames = FrameReader()
    frames.add(data)
    frame = frames.next()
    if frames.is_inside_frame:
        raise Malformed("not all was read")
    return frame


class WorkedExchanges(unittest.TestCase):
    def assert_exchange(self, heading, expected):
        shown = exchange(heading)
        self.assertEqual([(title, decode(data)) for title, data in shown], expected)
        self.assertEqual([(title, encode(frame)[0]) for title, frame in expected], shown)

    def test_of_a_client(self):
        unknown = Error("QXRpcErrorDomain", 1, {"description": "unknown operation wakeUp:"})
        self.assert_exchange("A worked exchange: a client", [
            ("Client: hello", Hello()),
            ("Daemon: hello", Hello()),
            ("Client: request 1", Request(1, True, "bookmarkableStringFromDocumentURL:completion:", [URL("file:///home/u/Notes/a%20b.txt")])),
            ("Daemon: reply 1", Reply(1, ["docuvend:com.example.Notes/7", None])),
            ("Client: request 2", Request(2, True, "wakeUp:", [])),
            ("Daemon: failure 2", Failure(2, unknown)),
        ])

    def test_of_a_provider_extension(self):
        url = URL.of_path("/home/u/.local/share/docuvend/groups/org.example.p.g/Docuvend Storage/a b.txt")
        self.assert_exchange("A worked exchange: a provider extension", [
            ("Daemon: hello", Hello()),
            ("Extension: hello", Hello()),
            ("Daemon: request 1", Request(1, True, "_performInitialSetupWithCompletion:", [])),
            ("Extension: reply 1", Reply(1, [None, None, None])),
            ("Daemon: request 2", Request(2, True, "_startProvidingItemAtURL:completion:", [url])),
            ("Daemon: request 3", Request(3, True, "_identifierForItemAtURL:completion:", [url])),
            ("Extension: reply 3", Reply(3, [None, "doc/7"])),
            ("Daemon: ping", Ping()),
            ("Extension: pong", Pong()),
            ("Extension: reply 2", Reply(2, [Error("ExampleErrorDomain", 2, {"description": "offline"})])),
        ])


class Values(unittest.TestCase):
    def test_every_kind_comes_back(self):
        beneath = Error("QXSystemErrorDomain", -2, {}, URL("file:///a/"))
        values = [None, True, False, -1, 1 << 62, 0.5, "grüße\t", b"\0\xff", URL.of_path("/ü b"), uuid.UUID(int=7),
                  [1, [2, "x"]], {"k": {"l": None}}, Error("D", 3, {"description": "d", "k": ""}, None, beneath)]
        values_back = decode(encode(Reply(9, values))[0]).values
        self.assertEqual(values_back, values)
        self.assertEqual([type(value) for value in values_back], [type(value) for value in values])

    def test_what_the_wire_cannot_carry_is_not_sent(self):
        nested = []
        for _ in range(MAXIMUM_NESTING):
            nested = [nested]
        for value in (1 << 63, "\0", "\ufffe", "\ud800", "x" * (MAXIMUM_TEXT_BYTES + 1), nested, [None] * MAXIMUM_ELEMENTS, b"x" * (1 << 20),
                      object()):
            with self.assertRaises(NotTransmissible):
                encode(Reply(1, [value]))

    def test_what_is_malformed_is_not_read(self):
        def reply(*values):
            contents = struct.pack("<QI", 1, len(values)) + b"".join(values)
            return struct.pack("<IBB", 2 + len(contents), 3, 0) + contents

        def text(data):
            return struct.pack("<I", len(data)) + data

        self.assertEqual(decode(reply(b"\4" + text(b"ok"))), Reply(1, ["ok"]))
        array = struct.pack("<BI", 8, 1)
        self.assertEqual(len(decode(reply(array * MAXIMUM_NESTING + b"\0")).values), 1)
        for value in (b"\1\2", b"\14", b"\4" + text(b"\xc0\x80"), b"\4" + text(b"\0"), b"\4" + text(b"\xed\xa0\x80"), b"\4" + text(b"x" * 65537),
                      b"\6" + text(b"file://host/a"), b"\6" + text(b"file:///a%00"), b"\6" + text(b"file:///a b"), b"\6" + text(b"file:///%ff"),
                      b"\6" + text(b"file:///a?b"), b"\5" + struct.pack("<I", 9), b"\13", array * (MAXIMUM_NESTING + 1) + b"\0",
                      struct.pack("<BI", 8, MAXIMUM_ELEMENTS) + b"\0" * MAXIMUM_ELEMENTS, b"\0\0",
                      struct.pack("<BI", 9, 2) + 2 * (text(b"k") + b"\0")):
            with self.subTest(value=value[:40]), self.assertRaises(Malformed):
                decode(reply(value))


if __name__ == "__main__":
    unittest.main()
