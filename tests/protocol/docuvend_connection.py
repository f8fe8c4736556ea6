"""A connection of Docuvend's, for either side of it. docs/protocol.md says what the sides owe each other.

A client:

    with connect("com.orvane.Docuvend", bundle="org.example.editor") as daemon:
        string, error = daemon.call("bookmarkableStringFromDocumentURL:completion:", URL.of_path("/home/u/Notes/a b.txt"))

A provider extension:

    connection = Connection(socket.socket(fileno=EXTENSION_DESCRIPTOR), operations={NAME: Operation(function, [URL]), ...})
    connection.wait_for_end()
"""

import concurrent.futures
import os
import socket
import struct
import threading
import typing

from docuvend_values import MAXIMUM_DESCRIPTORS, Error, Malformed, NotTransmissible
from docuvend_wire import VERSION, End, Failure, FrameReader, Hello, Ping, Pong, Reply, Request, encode

EXTENSION_DESCRIPTOR = 3

MAXIMUM_PENDING_CALLS = 1024

RPC_ERRORS = "QXRpcErrorDomain"
UNKNOWN_OPERATION, INVALID_ARGUMENTS, INVALID_REPLY, NOT_TRANSMISSIBLE, TOO_MANY_CALLS = range(1, 6)
MALFORMED_FRAME, UNSUPPORTED_VERSION, PEER_DOES_NOT_READ, REFUSED = range(6, 10)


class Ended(Exception):
    """The connection is over. `error` says why, if the other side said so."""

    def __init__(self, error=None):
        super().__init__(str(error) if error else "the connection ended")
        self.error = error


class Operation(typing.NamedTuple):
    """What a side offers: a function that takes the arguments (or None for absent ones) and returns the list of reply values.

    Operations of one lane run one after another, on a thread of the lane's own; the connection is read on another thread, so that signs of
    life are given meanwhile.
    """

    function: typing.Callable
    arguments: list  # their types
    lane: str = "work"


def open_socket(service):
    """A socket that is connected to one of the daemon's services."""
    name = f"public/{service}" if service != "com.orvane.Administration" else service
    directory, base = os.path.split(os.path.join(os.environ["XDG_RUNTIME_DIR"], "docuvend", name))
    # The whole path may be longer than a socket address holds.
    place = os.open(directory, os.O_PATH | os.O_DIRECTORY | os.O_CLOEXEC)
    try:
        connected = socket.socket(socket.AF_UNIX, socket.SOCK_STREAM)
        connected.connect(f"/proc/self/fd/{place}/{base}")
        return connected
    finally:
        os.close(place)


def connect(service, bundle=None):
    return Connection(open_socket(service), bundle)


def _fit(values, types):
    """Whether there are as many values as types, each absent or of its type. A bool is no integer, and a URL no string."""
    return len(values) == len(types) and all(value is None or type(value) is wanted for value, wanted in zip(values, types))


class Connection:
    """One connection. Its operations may be used from any thread; closing it ends every call that waits."""

    def __init__(self, connected, bundle=None, operations=None):
        self._socket = connected
        self._socket.setblocking(True)  # what an extension is given is not
        self._operations = operations or {}
        self._lanes = {
            lane: concurrent.futures.ThreadPoolExecutor(max_workers=1, thread_name_prefix=lane)
            for lane in {operation.lane for operation in self._operations.values()}
        }
        self._lock = threading.Lock()  # guards all below, and keeps frames whole
        self._last_number = 0
        self._waiting = {}  # by number: the future of a call's values
        self._pong = None  # the future of the sign of life that was asked for
        self._ended = None
        # Only on the reading thread.
        self._heard_hello = False
        self._last_heard = 0
        self._send(Hello(VERSION, bundle))
        self._thread = threading.Thread(target=self._read, name="docuvend reader", daemon=True)
        self._thread.start()

    def __enter__(self):
        return self

    def __exit__(self, *_):
        self.close()

    def call(self, operation, *arguments, deadline=60):
        """The reply's values. Raises the Error of a failure, Ended when the connection ends, and TimeoutError after the deadline."""
        return self.start(operation, *arguments).result(deadline)

    def start(self, operation, *arguments):
        """The future of what `call` returns."""
        future = concurrent.futures.Future()
        with self._lock:
            if self._ended:
                raise self._ended
            if len(self._waiting) >= MAXIMUM_PENDING_CALLS:
                raise Error(RPC_ERRORS, TOO_MANY_CALLS, {"description": "too many calls wait for their answers"})
            encoded = encode(Request(self._last_number + 1, True, operation, arguments))
            self._last_number += 1
            self._waiting[self._last_number] = future
            self._send_encoded(*encoded)
        return future

    def ping(self, deadline=60):
        """Returns when the other side has given a sign of life."""
        with self._lock:
            if self._ended:
                raise self._ended
            future = self._pong = concurrent.futures.Future()
            self._send_encoded(*encode(Ping()))
        future.result(deadline)

    def wait_for_end(self):
        """Returns when the connection is over, with the other side's reason, if there was one."""
        self._thread.join()
        return self._ended.error

    def close(self):
        try:
            self._socket.shutdown(socket.SHUT_RDWR)
        except OSError:
            pass  # it is over already
        self._thread.join()

    def _send(self, frame):
        with self._lock:
            self._send_encoded(*encode(frame))

    def _send_encoded(self, data, descriptors):
        try:
            sent = socket.send_fds(self._socket, [data], descriptors) if descriptors else 0
            self._socket.sendall(memoryview(data)[sent:])
        except OSError:
            pass  # the reading thread finds out why

    def _read(self):
        frames = FrameReader()
        ended = Ended()
        try:
            while not self._take(frames):
                while (frame := frames.next()) is not None:
                    self._run(frame)
        except Malformed as malformed:
            error = Error(RPC_ERRORS, MALFORMED_FRAME, {"description": str(malformed)})
            self._send(End(error))
            ended = Ended(error)
        except Ended as reason:
            ended = reason
        frames.close()
        self._finish(ended)

    def _take(self, frames):
        """Waits for bytes. True at the end of the connection."""
        space = socket.CMSG_SPACE(MAXIMUM_DESCRIPTORS * struct.calcsize("i"))
        try:
            data, control, flags, _ = self._socket.recvmsg(1 << 16, space, socket.MSG_CMSG_CLOEXEC)
        except OSError:
            return True
        descriptors = []
        for level, kind, numbers in control:
            if level == socket.SOL_SOCKET and kind == socket.SCM_RIGHTS:
                descriptors += struct.unpack(f"{len(numbers) // 4}i", numbers[:len(numbers) // 4 * 4])
        frames.add(data, descriptors)
        if flags & socket.MSG_CTRUNC:
            raise Malformed("too many descriptors")
        if not data and frames.is_inside_frame:
            raise Malformed("the connection ended inside a frame")
        return not data

    def _run(self, frame):
        """Runs one frame of the other side's. Only its first may be, and must be, a hello; an end may come at any time."""
        if isinstance(frame, End):
            raise Ended(frame.error)
        if isinstance(frame, Hello) == self._heard_hello:
            raise Malformed("a hello that is not the first frame, or another frame that is")
        if isinstance(frame, Hello):
            if frame.version != VERSION:
                error = Error(RPC_ERRORS, UNSUPPORTED_VERSION, {"description": f"version {frame.version} is not spoken here"})
                self._send(End(error))
                raise Ended(error)
            self._heard_hello = True
        elif isinstance(frame, Request):
            self._run_request(frame)
        elif isinstance(frame, (Reply, Failure)):
            self._run_answer(frame)
        elif isinstance(frame, Pong):
            with self._lock:
                future, self._pong = self._pong, None
            if not future:
                raise Malformed("a pong without a ping")
            future.set_result(None)
        else:
            self._send(Pong())

    def _run_answer(self, frame):
        with self._lock:
            if frame.number > self._last_number or frame.number == 0:
                raise Malformed("an answer to a request that was not made")
            future = self._waiting.pop(frame.number, None)
        if not future:
            return  # a second answer
        if isinstance(frame, Reply):
            future.set_result(frame.values)
        else:
            future.set_exception(frame.error)

    def _run_request(self, request):
        if request.number <= self._last_heard:
            raise Malformed("a request whose number does not rise")
        self._last_heard = request.number
        operation = self._operations.get(request.operation)
        if not operation:
            self._fail(request, UNKNOWN_OPERATION, f"unknown operation {request.operation}")
        elif not _fit(request.arguments, operation.arguments):
            self._fail(request, INVALID_ARGUMENTS, f"{request.operation}: other arguments are needed")
        else:
            self._lanes[operation.lane].submit(self._perform, operation, request)

    def _perform(self, operation, request):
        values = operation.function(*request.arguments)
        if not request.wants_reply:
            return
        try:
            self._send(Reply(request.number, values))
        except NotTransmissible as problem:
            self._fail(request, INVALID_REPLY, str(problem))

    def _fail(self, request, code, description):
        self._send(Failure(request.number, Error(RPC_ERRORS, code, {"description": description})))

    def _finish(self, ended):
        with self._lock:
            self._ended = ended
            waiting = list(self._waiting.values()) + ([self._pong] if self._pong else [])
            self._waiting.clear()
            self._pong = None
            self._socket.close()
        for future in waiting:
            future.set_exception(ended)
        for lane in self._lanes.values():
            lane.shutdown(wait=False, cancel_futures=True)
