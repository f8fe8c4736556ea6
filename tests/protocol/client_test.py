"""A client in Python against the real daemon: all that it knows of the protocol stands in docs/protocol.md.

The house that starts it tells it in the environment of a provider with one document: TEST_PROVIDER is its identifier, TEST_DOCUMENT the
document's path, TEST_ORIGINAL the file in the provider's cloud that has its bytes. Beside it the bundles com.orvane.editor, which holds
"com.orvane.docuvend.acl-read", com.orvane.picker, which holds "com.orvane.docuvend.acl-write", and com.orvane.stranger are installed.
"""

import concurrent.futures
import functools
import multiprocessing
import os
import struct
import time
import unittest
import uuid

from docuvend_connection import (INVALID_ARGUMENTS, MALFORMED_FRAME, REFUSED, RPC_ERRORS, UNKNOWN_OPERATION, UNSUPPORTED_VERSION, Connection,
                                 Ended, connect, open_socket)
from docuvend_wire import URL, Descriptor, End, Error, FrameReader, Hello, encode

PATIENCE = 60

DAEMON = "com.orvane.Docuvend"
SANDBOX = "com.orvane.Sandbox"
COORDINATION = "com.orvane.FileCoordination"
ADMINISTRATION = "com.orvane.Administration"

EDITOR = "com.orvane.editor"
PICKER = "com.orvane.picker"
STRANGER = "com.orvane.stranger"

ERRORS = "DVErrorDomain"
LACKS_ENTITLEMENT, NOT_PERMITTED, BAD_STRING, BAD_PARAMETER, NOT_FOUND, NOT_FOUND_URL, PROVIDER_FAILED, NOT_REACHED, NO_TOKEN = range(1, 10)
SANDBOX_ERRORS = "QXSandboxErrorDomain"
BAD_TOKEN, NOT_SIBLINGS = 1, 6
COORDINATION_ERRORS = "QXFileCoordinationErrorDomain"
MISSING_URL, MAY_NOT, NO_PROVIDER, INVALID_ACCESS, WOULD_DEADLOCK, ENDED_ACCESS, TOO_MANY_ACCESSES, NO_DIRECTORY = range(1, 9)

PROVIDER = os.environ["TEST_PROVIDER"]
DOCUMENT = URL.of_path(os.environ["TEST_DOCUMENT"])
SIBLING = URL.of_path(os.path.join(os.path.dirname(DOCUMENT.path), "." + os.path.basename(DOCUMENT.path)))
NOBODYS = URL.of_path(os.path.join(os.environ["HOME"], "nobody's file.txt"))

WAKE_UP = "wakeUpCompletion:"
EXTEND = "extendSandboxForFileURL:fromProviderID:toConsumerID:completionHandler:"
PLACEHOLDER = "providePlaceholderForItemAtURL:fromProviderID:forConsumerID:completionHandler:"
START = "startProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:"
STOP = "stopProvidingItemAtURL:fromProviderID:forConsumerID:completionHandler:"
PROVIDERS = "providersCompletionHandler:"
EXTEND_BOOKMARK = "extendBookmarkForFileURL:toConsumerID:completionHandler:"
STRING_OF = "bookmarkableStringFromDocumentURL:completion:"
DOCUMENT_OF = "documentURLFromBookmarkableString:completion:"
REDEEM = "redeemToken:forWriting:completionHandler:"
REPLACE = "replaceItemWithToken:bySiblingWithToken:completionHandler:"
STATUS = "statusCompletionHandler:"
GRANTS = "grantsOfProviderID:toConsumerID:startingAt:completionHandler:"
REVOKE = "revokeItemID:fromProviderID:toConsumerID:completionHandler:"
UNLOCK = "announceFirstUnlockCompletionHandler:"
READ = "coordinateReadingItemAtURL:token:accessID:party:completionHandler:"
WRITE = "coordinateWritingItemAtURL:token:accessID:party:completionHandler:"
END_ACCESS = "endAccess:completionHandler:"
PROGRESS = "progressOfAccess:completionHandler:"
HOLDERS = "holdersOfItemAtURL:token:completionHandler:"
FINISHED_WRITING = "writerDidFinishWritingForURL:completionHandler:"


def original():
    with open(os.environ["TEST_ORIGINAL"], "rb") as file:
        return file.read()


def ask(bundle, operation, arguments, service):
    with connect(service, bundle) as connection:
        return connection.call(operation, *arguments)


@functools.cache
def actor(bundle):
    """A process that acts for the bundle: one process acts for one bundle at a time."""
    return concurrent.futures.ProcessPoolExecutor(max_workers=1, mp_context=multiprocessing.get_context("spawn"))


class ClientTest(unittest.TestCase):
    def ask(self, bundle, operation, *arguments, service=DAEMON):
        """One call on a connection of its own, by the process that acts for that bundle."""
        if bundle is None:
            return ask(None, operation, arguments, service)
        return actor(bundle).submit(ask, bundle, operation, arguments, service).result(PATIENCE)

    def assert_error(self, error, domain, code, **texts):
        self.assertIsInstance(error, Error)
        self.assertEqual((error.domain, error.code), (domain, code), str(error))
        for key, text in texts.items():
            self.assertEqual(error.texts.get(key), text, str(error))

    def assert_tokens(self, token, sibling, sibling_token):
        self.assertIsInstance(token, bytes)
        self.assertEqual(sibling, SIBLING)
        self.assertIsInstance(sibling_token, bytes)
        self.assertNotEqual(token, sibling_token)

    def grant(self, consumer=EDITOR):
        """Has the picker grant the document; its token, and its hidden sibling's."""
        error, token, sibling, sibling_token = self.ask(PICKER, EXTEND, DOCUMENT, PROVIDER, consumer)
        self.assertIsNone(error)
        self.assert_tokens(token, sibling, sibling_token)
        return token, sibling_token

    def bytes_of(self, token):
        error, file = self.ask(None, REDEEM, token, False, service=SANDBOX)
        self.assertIsNone(error)
        self.assertIsInstance(file, Descriptor)
        with file.open("rb") as opened:
            return opened.read()


class AllNineOperations(ClientTest):
    def test_in_the_order_of_a_document_s_life(self):
        with connect(DAEMON, EDITOR) as editor:
            self.assertEqual(editor.call(WAKE_UP), [])
            editor.ping()

            error, providers = editor.call(PROVIDERS)
            self.assertIsNone(error)
            storage = URL.of_path(os.path.dirname(DOCUMENT.path), is_directory=True)
            self.assertEqual(providers[PROVIDER], {"documentStorageURL": storage, "providerIdentifier": PROVIDER})
            self.assertIs(type(providers[PROVIDER]["documentStorageURL"]), URL)

            string, error = editor.call(STRING_OF, DOCUMENT)
            self.assertIsNone(error)
            self.assertTrue(string.startswith(f"docuvend:{PROVIDER}/"), string)
            self.assertEqual(editor.call(STRING_OF, NOBODYS), [None, None])

            # Not granted yet.
            *nothing, error = editor.call(DOCUMENT_OF, string)
            self.assertEqual(nothing, [None] * 4)
            self.assert_error(error, ERRORS, NOT_PERMITTED)
            self.assert_error(*editor.call(START, DOCUMENT, PROVIDER, EDITOR), ERRORS, NOT_PERMITTED)

            self.grant()
            url, token, sibling, sibling_token, error = editor.call(DOCUMENT_OF, string)
            self.assertIsNone(error)
            self.assertEqual(url, DOCUMENT)
            self.assert_tokens(token, sibling, sibling_token)

            os.unlink(DOCUMENT.path)
            self.assertEqual(editor.call(PLACEHOLDER, DOCUMENT, PROVIDER, EDITOR), [None])
            self.assertEqual(os.stat(DOCUMENT.path).st_blocks, 0)
            self.assertEqual(os.stat(DOCUMENT.path).st_size, len(original()))

            self.assertEqual(editor.call(START, DOCUMENT, PROVIDER, EDITOR), [None])
            self.assertEqual(self.bytes_of(token), original())

            # Success is an error, too: one with nothing beneath it.
            error, = editor.call(STOP, DOCUMENT, PROVIDER, EDITOR)
            self.assert_error(error, ERRORS, PROVIDER_FAILED)
            self.assertIsNone(error.underlying)
            self.assertEqual(os.stat(DOCUMENT.path).st_blocks, 0)

            passed_on, error = editor.call(EXTEND_BOOKMARK, DOCUMENT, STRANGER)
            self.assertIsNone(error)
            self.assertEqual(passed_on, string)
        url, *_, error = self.ask(STRANGER, DOCUMENT_OF, string)
        self.assertIsNone(error)
        self.assertEqual(url, DOCUMENT)


class Saving(ClientTest):
    def test_the_sibling_takes_the_document_s_place(self):
        token, sibling_token = self.grant()
        self.assertEqual(self.ask(EDITOR, START, DOCUMENT, PROVIDER, EDITOR), [None])
        with connect(SANDBOX) as sandbox:
            error, file = sandbox.call(REDEEM, sibling_token, True)
            self.assertIsNone(error)
            with file.open("r+b") as opened:
                opened.truncate(0)
                opened.write(b"written in Python\n")
            error, = sandbox.call(REPLACE, sibling_token, token)
            self.assert_error(error, SANDBOX_ERRORS, NOT_SIBLINGS)
            self.assertEqual(sandbox.call(REPLACE, token, sibling_token), [None])
        self.assertEqual(self.bytes_of(token), b"written in Python\n")
        self.assertFalse(os.path.exists(SIBLING.path))

        self.assertEqual(self.ask(None, FINISHED_WRITING, DOCUMENT, service=COORDINATION), [None])
        # The answer says that the provider was told. What it is asked next, it is asked after that.
        self.ask(EDITOR, STOP, DOCUMENT, PROVIDER, EDITOR)
        self.assertEqual(original(), b"written in Python\n")


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
        """The provider has saved that. What it is asked after it was told comes after it."""
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


class Administration(ClientTest):
    def grants(self, connection, provider, consumer):
        error, grants, following = connection.call(GRANTS, provider, consumer, None)
        self.assertIsNone(error)
        self.assertIsNone(following)
        return grants

    def test_status_grants_revocation_and_unlock(self):
        token, _ = self.grant()
        with connect(ADMINISTRATION) as administrator:
            error, status = administrator.call(STATUS)
            self.assertIsNone(error)
            self.assertIsInstance(status["version"], str)
            self.assertIn(PROVIDER, status["providers"])

            grant, = self.grants(administrator, PROVIDER, EDITOR)
            self.assertEqual((grant["providerIdentifier"], grant["consumerIdentifier"]), (PROVIDER, EDITOR))
            item = grant["itemIdentifier"]
            self.assertEqual(self.grants(administrator, None, STRANGER), [])

            error, grants, following = administrator.call(GRANTS, None, None, 7)
            self.assertEqual((grants, following), (None, None))
            self.assert_error(error, ERRORS, BAD_PARAMETER, parameter="startingAt")
            error, = administrator.call(REVOKE, item, None, EDITOR)
            self.assert_error(error, ERRORS, BAD_PARAMETER, parameter="providerID")
            self.assertEqual(administrator.call(REVOKE, item, PROVIDER, EDITOR), [None])
            error, = administrator.call(REVOKE, item, PROVIDER, EDITOR)
            self.assert_error(error, ERRORS, NOT_FOUND, identifier=item)
            self.assertEqual(administrator.call(UNLOCK), [None])
        error, file = self.ask(None, REDEEM, token, False, service=SANDBOX)
        self.assertIsNone(file)
        self.assert_error(error, SANDBOX_ERRORS, BAD_TOKEN)


class ProviderThatIsGone(ClientTest):
    def test_its_strings_get_no_reply(self):
        self.grant()
        with connect(DAEMON, EDITOR) as editor:
            string, _ = editor.call(STRING_OF, DOCUMENT)
            bundles = os.path.join(os.environ["HOME"], ".local/share/docuvend/bundles")
            os.rename(os.path.join(bundles, PROVIDER), os.path.join(bundles, "." + PROVIDER))
            deadline = time.monotonic() + PATIENCE
            while PROVIDER in editor.call(PROVIDERS)[1]:
                self.assertLess(time.monotonic(), deadline)
                time.sleep(0.002)
            resolving = editor.start(DOCUMENT_OF, string)
            # What comes after it on the connection runs after it.
            self.assertEqual(editor.call(WAKE_UP), [])
            with self.assertRaises(TimeoutError):
                resolving.result(0)
        with self.assertRaises(Ended):
            resolving.result(PATIENCE)


class RefusalsOfOperations(ClientTest):
    def test_a_missing_entitlement(self):
        for bundle in (None, EDITOR):
            error, *nothing = self.ask(bundle, EXTEND, DOCUMENT, PROVIDER, EDITOR)
            self.assert_error(error, ERRORS, LACKS_ENTITLEMENT)
            self.assertEqual(nothing, [None] * 3)
        for operation in (PLACEHOLDER, START, STOP):
            error, = self.ask(None, operation, DOCUMENT, PROVIDER, EDITOR)
            self.assert_error(error, ERRORS, LACKS_ENTITLEMENT)
        error, providers = self.ask(None, PROVIDERS)
        self.assert_error(error, ERRORS, LACKS_ENTITLEMENT)
        self.assertIsNone(providers)

    def test_what_is_no_bookmarkable_string(self):
        for text in ("Docuvend:p/i", "docuvend:p", "docuvend:p/", "docuvend:/i", "docuvend:p//i", ""):
            *nothing, error = self.ask(EDITOR, DOCUMENT_OF, text)
            self.assert_error(error, ERRORS, BAD_STRING)
            self.assertEqual(nothing, [None] * 4)
        *_, error = self.ask(None, DOCUMENT_OF, "docuvend:p//i")
        self.assert_error(error, ERRORS, NOT_PERMITTED)

    def test_a_missing_parameter(self):
        arguments = [DOCUMENT, PROVIDER, EDITOR]
        for position, name in enumerate(("URL", "providerID", "consumerID")):
            given = arguments[:position] + [None] + arguments[position + 1:]
            for operation in (EXTEND, PLACEHOLDER):
                error, *_ = self.ask(PICKER, operation, *given)
                self.assert_error(error, ERRORS, BAD_PARAMETER, parameter=name)
            for operation in (START, STOP):
                error, = self.ask(PICKER, operation, *given)
                self.assert_error(error, ERRORS, NOT_FOUND)
                self.assert_error(error.underlying, ERRORS, BAD_PARAMETER, parameter=name)

    def test_a_provider_that_is_not_there(self):
        error, *_ = self.ask(PICKER, EXTEND, DOCUMENT, "com.example.nowhere", EDITOR)
        self.assert_error(error, ERRORS, NOT_FOUND, identifier="com.example.nowhere")
        error, = self.ask(PICKER, PLACEHOLDER, DOCUMENT, "com.example.nowhere", EDITOR)
        self.assert_error(error, ERRORS, NOT_FOUND, identifier="com.example.nowhere")
        error, = self.ask(PICKER, START, DOCUMENT, "com.example.nowhere", EDITOR)
        self.assert_error(error.underlying, ERRORS, BAD_PARAMETER, parameter="providerID", value="com.example.nowhere")
        error, = self.ask(PICKER, STOP, DOCUMENT, "com.example.nowhere", EDITOR)
        self.assert_error(error.underlying, ERRORS, BAD_PARAMETER, parameter="providerID", value=None)
        error, = self.ask(PICKER, START, NOBODYS, PROVIDER, EDITOR)
        self.assert_error(error.underlying, ERRORS, NOT_FOUND, identifier=PROVIDER)

    def test_an_item_that_the_provider_does_not_know(self):
        missing = URL.of_path(os.path.join(os.path.dirname(DOCUMENT.path), "missing.txt"))
        error, *_ = self.ask(PICKER, EXTEND, missing, PROVIDER, EDITOR)
        self.assert_error(error, ERRORS, PROVIDER_FAILED)
        self.assert_error(error.underlying, ERRORS, PROVIDER_FAILED)
        providers_own = error.underlying.underlying
        self.assertNotEqual(providers_own.domain, ERRORS)
        self.assertIsNone(providers_own.underlying)
        string, error = self.ask(None, STRING_OF, missing)
        self.assertIsNone(string)
        self.assert_error(error, ERRORS, PROVIDER_FAILED)
        self.assertEqual(error.underlying, providers_own)

    def test_passing_on_what_one_may_not(self):
        for bundle, url, consumer in ((None, DOCUMENT, STRANGER), (EDITOR, DOCUMENT, None), (EDITOR, URL("file:///etc/passwd"), STRANGER)):
            string, error = self.ask(bundle, EXTEND_BOOKMARK, url, consumer)
            self.assertIsNone(string)
            self.assert_error(error, ERRORS, NOT_PERMITTED)
        with open(NOBODYS.path, "wb"):
            pass
        string, error = self.ask(EDITOR, EXTEND_BOOKMARK, NOBODYS, STRANGER)
        self.assert_error(error, ERRORS, NOT_FOUND_URL)
        self.assertEqual(error.url, NOBODYS)

    def test_a_token_that_is_none(self):
        error, file = self.ask(None, REDEEM, b"docuvend-token", None, service=SANDBOX)
        self.assertIsNone(file)
        self.assert_error(error, SANDBOX_ERRORS, BAD_TOKEN)
        self.assert_error(*self.ask(None, REPLACE, None, None, service=SANDBOX), SANDBOX_ERRORS, BAD_TOKEN)


class RefusalsOfTheProtocol(ClientTest):
    def assert_failure(self, code, *call):
        with connect(DAEMON) as connection:
            with self.assertRaises(Error) as raised:
                connection.call(*call)
            self.assert_error(raised.exception, RPC_ERRORS, code)
            # The connection goes on.
            self.assertEqual(connection.call(WAKE_UP), [])

    def assert_end(self, code, data):
        """The daemon ends a connection on which these bytes come."""
        with open_socket(DAEMON) as connected:
            connected.settimeout(60)
            connected.sendall(data)
            frames = FrameReader()
            while received := connected.recv(1 << 16):
                frames.add(received)
        self.assertEqual(frames.next(), Hello())
        end = frames.next()
        self.assertIsInstance(end, End)
        self.assert_error(end.error, RPC_ERRORS, code)
        self.assertFalse(frames.is_inside_frame)

    def test_an_unknown_operation(self):
        self.assert_failure(UNKNOWN_OPERATION, "wakeUp:")

    def test_wrong_arguments(self):
        self.assert_failure(INVALID_ARGUMENTS, WAKE_UP, 1)
        self.assert_failure(INVALID_ARGUMENTS, STRING_OF, "file:///a/string/is/no/URL")
        self.assert_failure(INVALID_ARGUMENTS, STRING_OF)

    def test_bytes_that_are_no_frame(self):
        hello, _ = encode(Hello())
        for data in (
                b"GET / HTTP/1.1\r\n\r\n",
                struct.pack("<IBB", 1, 6, 0),  # a length without room for the type and the number of descriptors
                struct.pack("<IBB", 2, 6, 0),  # a ping before the hello
                hello + hello,
                hello + struct.pack("<IBB", 2, 8, 0),
                hello + struct.pack("<IBB", 2, 7, 0),  # a pong without a ping
                hello + struct.pack("<IBB", 2, 6, 1),  # a descriptor that does not come
                hello + struct.pack("<IBBB", 3, 6, 0, 0),  # a byte too many
                hello + struct.pack("<IBBQBII", 19, 2, 0, 1, 2, 0, 0),  # a flag that is 2
                hello + struct.pack("<IBBQBII", 19, 2, 0, 0, 1, 0, 0),  # request 0
                hello + struct.pack("<IBBQI", 14, 3, 0, 1, 0),  # an answer to nothing
        ):
            with self.subTest(data=data.hex(" ")):
                self.assert_end(MALFORMED_FRAME, data)

    def test_another_version(self):
        self.assert_end(UNSUPPORTED_VERSION, encode(Hello(version=1))[0])

    def test_a_bundle_that_is_not_installed(self):
        self.assert_end(REFUSED, encode(Hello(bundle="com.example.nowhere"))[0])

    def test_the_end_reaches_the_calls_that_wait(self):
        connection = Connection(open_socket(DAEMON), "com.example.nowhere")
        with self.assertRaises(Ended) as raised:
            connection.call(WAKE_UP)
        self.assert_error(raised.exception.error, RPC_ERRORS, REFUSED)
        self.assert_error(connection.wait_for_end(), RPC_ERRORS, REFUSED)


if __name__ == "__main__":
    unittest.main()
