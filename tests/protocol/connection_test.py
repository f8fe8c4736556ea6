"""The two sides of a connection, without a daemon."""

import socket
import threading
import unittest

from docuvend_connection import (INVALID_ARGUMENTS, INVALID_REPLY, MALFORMED_FRAME, MAXIMUM_PENDING_CALLS, TOO_MANY_CALLS, UNKNOWN_OPERATION,
                                 UNSUPPORTED_VERSION, Connection, Ended, Operation)
from docuvend_values import URL, Error
from docuvend_wire import End, Failure, FrameReader, Hello, Ping, Pong, Reply, Request, encode

PATIENCE = 60


class RawSide:
    """The other side of a connection, frame by frame."""

    def __init__(self, connected):
        self._socket = connected
        self._socket.settimeout(PATIENCE)
        self._frames = FrameReader()

    def send(self, *frames):
        self._socket.sendall(b"".join(encode(frame)[0] for frame in frames))

    def next(self):
        """The next frame, None at the end."""
        while (frame := self._frames.next()) is None:
            data = self._socket.recv(1 << 16)
            if not data:
                return None
            self._frames.add(data)
        return frame

    def close(self):
        self._socket.close()


class Sides(unittest.TestCase):
    def setUp(self):
        here, there = socket.socketpair()
        here.setblocking(False)  # as an extension gets it
        self.begun, self.release = threading.Event(), threading.Event()
        self.addCleanup(self.release.set)
        self.connection = Connection(here, operations={
            "slow:": Operation(self.wait, [], lane="slow"),
            "quick:": Operation(lambda: ["quick"], []),
            "open:": Operation(lambda url: [url], [URL]),
            "unsendable:": Operation(lambda: ["\0"], []),
        })
        self.addCleanup(self.connection.close)
        self.other = RawSide(there)
        self.addCleanup(self.other.close)
        self.assertEqual(self.other.next(), Hello())

    def wait(self):
        self.begun.set()
        self.release.wait(PATIENCE)
        return ["slow"]

    def assert_ended(self, code, *frames):
        self.other.send(*frames)
        end = self.other.next()
        self.assertIsInstance(end, End)
        self.assertEqual(end.error.code, code)
        self.assertIsNone(self.other.next())

    def test_signs_of_life_and_quick_answers_come_while_an_operation_runs(self):
        self.other.send(Hello(), Request(1, True, "slow:", []))
        self.assertTrue(self.begun.wait(PATIENCE))
        self.other.send(Ping(), Request(2, True, "quick:", []))
        self.assertEqual({type(frame): frame for frame in (self.other.next(), self.other.next())}, {Pong: Pong(), Reply: Reply(2, ["quick"])})
        self.release.set()
        self.assertEqual(self.other.next(), Reply(1, ["slow"]))

    def test_requests_that_are_refused(self):
        self.other.send(Hello())
        for number, (operation, arguments, code) in enumerate((
                ("fast:", [], UNKNOWN_OPERATION), ("open:", [], INVALID_ARGUMENTS), ("open:", ["file:///a"], INVALID_ARGUMENTS),
                ("unsendable:", [], INVALID_REPLY)), start=1):
            self.other.send(Request(number, True, operation, arguments))
            failure = self.other.next()
            self.assertIsInstance(failure, Failure)
            self.assertEqual((failure.number, failure.error.code), (number, code))
        self.other.send(Request(9, True, "open:", [None]), Request(10, True, "open:", [URL("file:///a")]))
        self.assertEqual([self.other.next(), self.other.next()], [Reply(9, [None]), Reply(10, [URL("file:///a")])])

    def test_a_request_that_wants_no_reply_gets_none(self):
        self.other.send(Hello(), Request(1, False, "quick:", []), Request(2, True, "quick:", []))
        self.assertEqual(self.other.next(), Reply(2, ["quick"]))

    def test_a_frame_before_the_hello(self):
        self.assert_ended(MALFORMED_FRAME, Ping())

    def test_a_second_hello(self):
        self.assert_ended(MALFORMED_FRAME, Hello(), Hello())

    def test_another_version(self):
        self.assert_ended(UNSUPPORTED_VERSION, Hello(3))

    def test_a_number_that_does_not_rise(self):
        self.assert_ended(MALFORMED_FRAME, Hello(), Request(7, False, "quick:", []), Request(7, False, "quick:", []))

    def test_an_answer_to_nothing(self):
        self.assert_ended(MALFORMED_FRAME, Hello(), Reply(1, []))

    def test_a_pong_without_a_ping(self):
        self.assert_ended(MALFORMED_FRAME, Hello(), Pong())

    def test_answers_in_any_order_and_second_ones(self):
        self.other.send(Hello())
        first, second, third = (self.connection.start("any:") for _ in range(3))
        self.other.send(Reply(2, [2]), Reply(2, [0]), Reply(1, [1]), Failure(3, Error("D", 4)))
        self.assertEqual([first.result(PATIENCE), second.result(PATIENCE)], [[1], [2]])
        with self.assertRaises(Error) as raised:
            third.result(PATIENCE)
        self.assertEqual(raised.exception.code, 4)

    def test_too_many_calls_wait(self):
        for _ in range(MAXIMUM_PENDING_CALLS):
            self.connection.start("any:")
            self.other.next()
        with self.assertRaises(Error) as raised:
            self.connection.start("any:")
        self.assertEqual(raised.exception.code, TOO_MANY_CALLS)

    def test_the_end_ends_what_waits(self):
        call = self.connection.start("any:")
        self.other.send(Hello(), End(Error("D", 9)))
        for waiting in (lambda: call.result(PATIENCE), lambda: self.connection.call("any:")):
            with self.assertRaises(Ended) as raised:
                waiting()
            self.assertEqual(raised.exception.error.code, 9)
        self.assertEqual(self.connection.wait_for_end().code, 9)


if __name__ == "__main__":
    unittest.main()
