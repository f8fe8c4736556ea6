"""What the tests of the client in Python share. All that they know of the protocol stands in docs/protocol.md.

The house that starts it tells it in the environment of a provider with one document: TEST_PROVIDER is its identifier, TEST_DOCUMENT the
document's path, TEST_ORIGINAL the file in the provider's cloud that has its bytes. Beside it, the bundles com.orvane.editor, which holds
"com.orvane.docuvend.acl-read", com.orvane.picker, which holds "com.orvane.docuvend.acl-write", and com.orvane.stranger are installed.
"""

import concurrent.futures
import functools
import multiprocessing
import os
import unittest

from docuvend_connection import connect
from docuvend_values import URL, Descriptor, Error

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
