# SPDX-License-Identifier: Apache-2.0
"""The client: a connection to the service, with every operation."""

import ctypes
import types
import warnings
from collections.abc import Sequence

from . import _callbacks
from ._handles import ClientHandle
from ._library import (Options, Statistics as StatisticsInC, c_text, check, in_range, library, milliseconds,
                       reporter_in_c, reporters_in_c)
from ._messages import Message, encoded
from .answers import AnswerCallback, StateCallback, Statistics
from .vocabulary import Error, State


class Client:
    """One connection to the service (kestod).

    Making one starts to connect, without waiting, and starts a thread of its own. Everything is asynchronous: a call
    puts work into the client's queue and returns, the client's thread sends it, and a callback gets the answer.

        with kesto.Client(reconnect=True) as client:
            ...

    At the end of the block the client is closed: it waits until the service has it all, for a second at most. A client
    without `with` needs `close`. One that is only forgotten ends, too, but what is still in its queue may be lost.

    Any thread may call any method. Callbacks run on the client's thread, one after the other, and may call the client
    again, except `flush` and `close`. An exception in a callback is printed (`sys.unraisablehook`) and changes nothing.

    A client belongs to the process that made it: in a forked child (as `multiprocessing` may make) its calls raise
    `Error` with CLOSED.
    """

    def __init__(self, *, socket_path: str | None = None, service_name: str | None = None, queue_bytes: int = 0,
                 unanswered_limit: int = 0, wake_on_send: bool = False, reconnect: bool = False,
                 first_retry: float = 0, longest_retry: float = 0, state_changed: StateCallback | None = None,
                 stamp: bool = True) -> None:
        """Starts to connect. Error with INVALID_ARGUMENT, OUT_OF_MEMORY or SYSTEM_ERROR; LibraryError.

        socket_path: the service's socket. None: $KESTO_SOCKET, else the socket of the user's service, else of the
            system's.
        service_name: a file name. None: "com.quarn.kesto.reporting".
        queue_bytes: the size of the queue, from 4 KiB to 64 MiB. 0: 256 KiB, some 800 messages of ten entries.
        unanswered_limit: how many calls it sends before it waits for answers. 0: 4096.
        wake_on_send: False: while a session is started, its thread looks into the queue some ten times in a second.
            True: `send` wakes the thread, which otherwise sleeps.
        reconnect: whether to connect again when the connection ends or cannot be made. Playbacks and recordings then go
            on while the service is away.
        first_retry, longest_retry: seconds before the first new attempt, doubled with each attempt up to the longest.
            0: 0.1 and 10.
        state_changed: called with every change of the state, on the client's thread; it may come before this returns.
        stamp: whether `send` adds the time to each message that does not have it.
        """
        self._handle: ClientHandle | None = None  # None before it is open and after it is closed
        self._last_statistics: Statistics | None = None
        lib = library()
        options = Options(
            size=ctypes.sizeof(Options), socket_path=c_text(socket_path, "socket_path"),
            service_name=c_text(service_name, "service_name"),
            queue_bytes=in_range(queue_bytes, 0, 2**63 - 1, "queue_bytes"),
            unanswered_limit=in_range(unanswered_limit, 0, 2**32 - 1, "unanswered_limit"), wake_on_send=wake_on_send,
            reconnect=reconnect, first_retry_ms=milliseconds(first_retry, "first_retry"),
            longest_retry_ms=milliseconds(longest_retry, "longest_retry"), without_stamps=not stamp)
        if state_changed is not None:
            options.state_changed = _callbacks.call_state_changed
            options.state_user = _callbacks.keep(state_changed)
            options.state_release = _callbacks.release
        pointer = ctypes.c_void_p()
        check(lib.kesto_client_open(ctypes.byref(options), ctypes.byref(pointer)), "a client")
        assert pointer.value is not None
        self._handle = ClientHandle(pointer.value)

    def __enter__(self) -> "Client":
        return self

    def __exit__(self, kind: type[BaseException] | None, error: BaseException | None,
                 trace: types.TracebackType | None) -> None:
        """Closes the client. A service that is away is no reason to fail: `statistics` tells what was lost."""
        try:
            self.close()
        except Error:
            pass

    def __del__(self) -> None:
        if self._handle is not None:
            warnings.warn(f"{self!r} was not closed", ResourceWarning)

    def close(self, timeout: float = 1) -> None:
        """Refuses further calls, stops what still plays, waits until the taken calls are answered, for at most
        `timeout` seconds, and ends the connection. All callbacks have been called and forgotten when it returns. A
        second close does nothing.

        Error with TIMED_OUT, CONNECTION_LOST or NOT_CONNECTED if calls may be unanswered; the client is closed
        nevertheless. WRONG_THREAD in a callback of this client: then it is not.
        """
        status = library().kesto_client_close(self._handle, milliseconds(timeout, "a timeout"))
        if self.state == State.CLOSED:
            self._last_statistics = self.statistics()
            self._handle = None  # frees it as soon as no other thread is in a call
        check(status, "close")

    def flush(self, timeout: float) -> None:
        """Waits until all earlier calls of this thread are sent and answered, for at most `timeout` seconds. Starts of
        sessions do not count: they are answered when the sessions end.

        Error with TIMED_OUT, CONNECTION_LOST if answers are lost, NOT_CONNECTED, CLOSED or WRONG_THREAD.
        """
        check(library().kesto_client_flush(self._handle, milliseconds(timeout, "a timeout")), "flush")

    @property
    def state(self) -> State:
        """The state of the connection at this moment."""
        return State(library().kesto_client_state(self._handle))

    def statistics(self) -> Statistics:
        """What became of the messages so far; after `close`, until then."""
        if self._last_statistics is not None:
            return self._last_statistics
        counts = StatisticsInC()
        library().kesto_client_statistics(self._handle, ctypes.byref(counts), ctypes.sizeof(counts))
        return Statistics(**{name: getattr(counts, name) for name, *_ in counts._fields_})

    # The operations, in the order of the wire. Each returns without waiting, and raises Error if the call was not
    # taken: QUEUE_FULL, NOT_CONNECTED or CLOSED; the callback is then never called. Calls of one thread reach the
    # service in their order. A reporter identifies a session in the whole system: choose a random number of 63 bits. 0
    # stands for no session.

    def create_session(self, reporter: int, callback: AnswerCallback | None = None) -> None:
        """Makes a session. Answered with success."""
        self._call("create_session", callback, reporter_in_c(reporter))

    def set_service_type(self, service_type: int, reporter: int, callback: AnswerCallback | None = None) -> None:
        """Says what kind of service the session stands for: a `ServiceType`. Answered with success, even if this client
        does not have the session; the same holds for the calls below that are answered with success."""
        self._call("set_service_type", callback, in_range(service_type, 0, 0xFFFF, "a service type"),
                   reporter_in_c(reporter))

    def get_service_type(self, reporter: int, callback: AnswerCallback) -> None:
        """Answered with the service type of any client's session, UNKNOWN if it does not exist; for 0 twice."""
        self._call("get_service_type", callback, reporter_in_c(reporter))

    def set_configuration(self, configuration: Message, reporter: int, callback: AnswerCallback | None = None) -> None:
        """Merges the entries into the session's configuration. "HostApplicationDisplayID" names the application for
        which the session plays. Answered with success. Errors as for `send`."""
        with encoded(configuration) as pointer:
            self._call("set_configuration", callback, pointer, reporter_in_c(reporter))

    def start_session(self, reporter: int, callback: AnswerCallback | None = None) -> None:
        """Begins a run. Answered with success when the run ends, or immediately if the session does not exist or has
        started already."""
        self._call("start_session", callback, reporter_in_c(reporter))

    def send(self, message: Message, category: int, event_type: int, reporters: int | Sequence[int] | None,
             callback: AnswerCallback | None = None) -> None:
        """Sends a message to the sessions of these reporters, of any client; None means all started sessions. The
        message is read before this returns. Answered without a result.

        category: a `Category`, or one within a group: `Group.DSP | Category.PLAYBACK`.
        event_type: an `EventType`.

        The time of the call goes with the message, since the service computes play times from it:
        "kestoreporting_timestamp", the seconds since 1970, and "systemuptime_sec", the seconds since the device
        started, each unless the message has it. `Client(stamp=False)` changes that.

        The service does not record a message that repeats the last one of its category and type, and the time does not
        make it another: so give a second Start something new, such as the number of the run.

        TypeError or OverflowError for what a message cannot hold. Error with INVALID_UTF8, TOO_LARGE (more than a
        mebibyte, or a quarter of the queue) or TOO_DEEP (more than 30 nested containers), or as for every operation.
        """
        if reporters is None:
            receivers, count = None, 0
        else:
            chosen = [reporters] if isinstance(reporters, int) else reporters
            receivers, count = reporters_in_c(chosen), len(chosen)
        with encoded(message) as pointer:
            self._call("send", callback, pointer, in_range(category, 0, 0xFFFFFFFF, "a category"),
                       in_range(event_type, 0, 0xFFFF, "an event type"), receivers, count)

    def stop_session(self, reporter: int, callback: AnswerCallback | None = None) -> None:
        """Ends a run: the service derives its results from it. Answered with success, after the answer of the start."""
        self._call("stop_session", callback, reporter_in_c(reporter))

    def destroy_session(self, reporter: int, callback: AnswerCallback | None = None) -> None:
        """Ends a run, if any, and the session. A start that was not stopped is then answered with SESSION_ENDED.
        Answered with success."""
        self._call("destroy_session", callback, reporter_in_c(reporter))

    def validate(self, reporter: int, callback: AnswerCallback) -> None:
        """Answered with the reporter and its service type, for a session of any client; with 0 and UNKNOWN if it does
        not exist."""
        self._call("validate", callback, reporter_in_c(reporter))

    def get_all_reporters(self, callback: AnswerCallback) -> None:
        """Answered with the reporters of all sessions of all clients."""
        self._call("get_all_reporters", callback)

    def kill_service(self, callback: AnswerCallback | None = None) -> None:
        """Ends the service process. The service never answers: CONNECTION_LOST shows success."""
        self._call("kill_service", callback)

    def _call(self, operation: str, callback: AnswerCallback | None, *arguments: object) -> None:
        function = getattr(library(), f"kesto_client_{operation}")
        if callback is None:
            status = function(self._handle, *arguments, None, None, None)
        else:
            status = function(self._handle, *arguments, _callbacks.call_answer, _callbacks.keep(callback),
                              _callbacks.release)
        check(status, operation)
