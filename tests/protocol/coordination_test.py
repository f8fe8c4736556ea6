"""A client in Python takes turns at files, with other processes, at the real daemon."""

import os
import time
import unittest
import uuid

from client_house import (COORDINATION, COORDINATION_ERRORS, DOCUMENT, EDITOR, ENDED_ACCESS, END_ACCESS, FINISHED_WRITING, HOLDERS,
                          INVALID_ACCESS, MAY_NOT, MISSING_URL, NOBODYS, NO_DIRECTORY, NO_PROVIDER, PATIENCE, PROGRESS, PROVIDER, READ,
                          STOP, WOULD_DEADLOCK, WRITE, ClientTest, actor, original)
from docuvend_connection import connect
from docuvend_values import URL


def write_in_turn(url, line):
    """Adds a line to the file, alone with it. What the waiting for it said."""
    access = uuid.uuid4()
    with connect(COORDINATION) as coordination:
        error, = coordination.call(WRITE, url, None, access, None)
        if error is None:
            with open(url.path, "ab") as file:
                file.write(line)
            error, = coordination.call(END_ACCESS, access)
        return error


def await_holders(coordination, url, states):
    """Waits until the file has accesses in these states, and no other."""
    deadline = time.monotonic() + PATIENCE
    while (known := [holder["state"] for holder in coordination.call(HOLDERS, url, None)[1]]) != states:
        if time.monotonic() > deadline:
            raise TimeoutError(f"{known} is never {states}")
        time.sleep(0.002)


def write_crosswise(mine, others):
    """Has the one file, waits until somebody waits for it, and asks for the other. What that said."""
    access = uuid.uuid4()
    with connect(COORDINATION) as coordination:
        coordination.call(WRITE, mine, None, access, None)
        await_holders(coordination, mine, ["holding", "waiting"])
        error, = coordination.call(WRITE, others, None, uuid.uuid4(), None)
        coordination.call(END_ACCESS, access)
        return error


def end_the_wait(url):
    """Asks to write the file, and ends that while it waits. What the request was answered."""
    access = uuid.uuid4()
    with connect(COORDINATION) as coordination:
        request = coordination.start(WRITE, url, None, access, None)
        await_holders(coordination, url, ["holding", "waiting"])
        coordination.call(END_ACCESS, access)
        error, = request.result(PATIENCE)
        return error


class Coordination(ClientTest):
    def setUp(self):
        with open(NOBODYS.path, "ab"):
            pass

    def begin(self, coordination, operation, url, token=None):
        access = uuid.uuid4()
        self.assertEqual(coordination.call(operation, url, token, access, None), [None])
        return access

    def text(self):
        with open(DOCUMENT.path, "rb") as file:
            return file.read()

    def assert_saved(self, text):
        """The provider saves that, and then gives up the contents. It may still be at an earlier change when a write has ended."""
        deadline = time.monotonic() + PATIENCE
        while original() != text and time.monotonic() < deadline:
            time.sleep(0.002)
        self.assertEqual(original(), text)
        self.ask(EDITOR, STOP, DOCUMENT, PROVIDER, EDITOR)
        self.assertEqual(original(), text)

    def test_a_read_brings_the_contents(self):
        self.ask(EDITOR, STOP, DOCUMENT, PROVIDER, EDITOR)
        self.assertEqual(os.stat(DOCUMENT.path).st_blocks, 0)
        with connect(COORDINATION) as coordination:
            access = self.begin(coordination, READ, DOCUMENT)
            self.assertEqual(self.text(), original())
            self.assertEqual(coordination.call(PROGRESS, access), [None, None, None])
            error, holders = coordination.call(HOLDERS, DOCUMENT, None)
            self.assertIsNone(error)
            self.assertEqual(holders, [{"kind": "reading", "state": "holding", "own": True, "processIdentifier": os.getpid()}])
            self.assertEqual(coordination.call(END_ACCESS, access), [None])
            self.assertEqual(coordination.call(HOLDERS, DOCUMENT, None), [None, []])

    def test_a_writer_that_writes_nothing_changes_nothing(self):
        before = original()
        self.ask(EDITOR, STOP, DOCUMENT, PROVIDER, EDITOR)
        with connect(COORDINATION) as coordination:
            access = self.begin(coordination, WRITE, DOCUMENT)
            self.assertEqual(os.stat(DOCUMENT.path).st_blocks, 0)
            self.assertEqual(coordination.call(END_ACCESS, access), [None])
        self.assert_saved(before)

    def test_writers_take_turns(self):
        before = original()
        with connect(COORDINATION) as coordination:
            access = self.begin(coordination, READ, DOCUMENT)
            coordination.call(END_ACCESS, access)
            access = self.begin(coordination, WRITE, DOCUMENT)
            other = actor(EDITOR).submit(write_in_turn, DOCUMENT, b"second\n")
            await_holders(coordination, DOCUMENT, ["holding", "waiting"])
            with open(DOCUMENT.path, "ab") as file:
                file.write(b"first\n")
            self.assertEqual(coordination.call(END_ACCESS, access), [None])
            self.assertIsNone(other.result(PATIENCE))
        self.assert_saved(before + b"first\nsecond\n")

    def test_a_writer_that_leaves_is_told_of(self):
        with connect(COORDINATION) as coordination:
            self.begin(coordination, WRITE, DOCUMENT)
            with open(DOCUMENT.path, "wb") as file:
                file.write(b"left behind\n")
        # A writer of another process has its turn when that one's end has been told.
        self.assertIsNone(actor(EDITOR).submit(write_in_turn, DOCUMENT, b"and more\n").result(PATIENCE))
        self.assert_saved(b"left behind\nand more\n")

    def test_who_waits_crosswise_hears_of_it(self):
        with connect(COORDINATION) as coordination:
            mine = self.begin(coordination, WRITE, NOBODYS)
            other = actor(EDITOR).submit(write_crosswise, DOCUMENT, NOBODYS)
            await_holders(coordination, DOCUMENT, ["holding"])
            self.assertEqual(coordination.call(WRITE, DOCUMENT, None, uuid.uuid4(), None), [None])
            self.assert_error(other.result(PATIENCE), COORDINATION_ERRORS, WOULD_DEADLOCK)
            self.assertEqual(coordination.call(END_ACCESS, mine), [None])

    def test_a_wait_can_be_ended(self):
        with connect(COORDINATION) as coordination:
            self.begin(coordination, READ, NOBODYS)
            blocked = actor(EDITOR).submit(end_the_wait, NOBODYS)
            self.assert_error(blocked.result(PATIENCE), COORDINATION_ERRORS, ENDED_ACCESS)

    def test_refusals(self):
        nowhere = URL.of_path(os.path.join(os.environ["HOME"], "nowhere", "file"))
        with connect(COORDINATION) as coordination:
            taken = self.begin(coordination, READ, NOBODYS)
            for operation in (READ, WRITE):
                for url, access, code in ((None, uuid.uuid4(), MISSING_URL), (NOBODYS, None, INVALID_ACCESS), (NOBODYS, taken, INVALID_ACCESS),
                                          (URL("file:///etc/shadow"), uuid.uuid4(), MAY_NOT), (nowhere, uuid.uuid4(), NO_DIRECTORY)):
                    self.assert_error(*coordination.call(operation, url, None, access, None), COORDINATION_ERRORS, code)
            self.assert_error(*coordination.call(END_ACCESS, uuid.uuid4()), COORDINATION_ERRORS, INVALID_ACCESS)
            error, *nothing = coordination.call(PROGRESS, uuid.uuid4())
            self.assert_error(error, COORDINATION_ERRORS, INVALID_ACCESS)
            self.assertEqual(nothing, [None, None])
            error, holders = coordination.call(HOLDERS, URL("file:///etc/shadow"), None)
            self.assert_error(error, COORDINATION_ERRORS, MAY_NOT)
            self.assertIsNone(holders)
            for url, code in ((None, MISSING_URL), (URL("file:///etc/passwd"), MAY_NOT), (NOBODYS, NO_PROVIDER)):
                self.assert_error(*coordination.call(FINISHED_WRITING, url), COORDINATION_ERRORS, code)


if __name__ == "__main__":
    unittest.main()
