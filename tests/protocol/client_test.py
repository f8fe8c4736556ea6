"""A client in Python against the real daemon: every operation but those of turns at files, and every kind of refusal."""

import os
import struct
import time
import unittest

from client_house import (ADMINISTRATION, BAD_PARAMETER, BAD_STRING, BAD_TOKEN, COORDINATION, DAEMON, DOCUMENT, DOCUMENT_OF, EDITOR, ERRORS,
                          EXTEND, EXTEND_BOOKMARK, FINISHED_WRITING, GRANTS, LACKS_ENTITLEMENT, NOBODYS, NOT_FOUND, NOT_FOUND_URL,
                          NOT_PERMITTED, NOT_SIBLINGS, PATIENCE, PICKER, PLACEHOLDER, PROVIDER, PROVIDERS, PROVIDER_FAILED, REDEEM, REPLACE,
                          REVOKE, SANDBOX, SANDBOX_ERRORS, SIBLING, START, STATUS, STOP, STRANGER, STRING_OF, UNLOCK, WAKE_UP, ClientTest,
                          original)
from docuvend_connection import (INVALID_ARGUMENTS, MALFORMED_FRAME, REFUSED, RPC_ERRORS, UNKNOWN_OPERATION, UNSUPPORTED_VERSION,
                                 Connection, Ended, connect, open_socket)
from docuvend_values import URL, Error
from docuvend_wire import End, FrameReader, Hello, encode


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
