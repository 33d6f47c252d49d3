# SPDX-License-Identifier: Apache-2.0
"""libkesto as the C interface describes it: the structures, the functions with their types, and finding the library.

Nothing is loaded when the package is imported: the first call loads `libkesto.so.0`, or what $KESTO_LIBRARY names.
"""

import ctypes
import functools
import operator
import os
from collections.abc import Sequence
from ctypes import (CFUNCTYPE, POINTER, Structure, c_bool, c_char_p, c_double, c_int, c_int64, c_size_t, c_uint16,
                    c_uint32, c_uint64, c_void_p)
from typing import Any

from .vocabulary import Error, LibraryError, Status


class Format(Structure):
    """`kesto_format`"""

    _fields_ = [("encoding", c_char_p), ("rate", c_uint32), ("channels", c_uint32)]


class Answer(Structure):
    """`kesto_answer`"""

    _fields_ = [("call", c_uint64), ("operation", c_int), ("reporter", c_int64), ("error_domain", c_char_p),
                ("error_code", c_int64), ("success", c_bool), ("service_type", c_uint16),
                ("valid_reporter", c_int64), ("reporters", POINTER(c_int64)), ("reporter_count", c_size_t)]


class StateChange(Structure):
    """`kesto_state_change`"""

    _fields_ = [("state", c_int), ("reason", c_int), ("system_error", c_int), ("retry_after_ms", c_uint32),
                ("socket_path", c_char_p)]


# The callbacks run on the client's thread; ctypes takes the interpreter's lock for them.
AnswerCallback = CFUNCTYPE(None, c_void_p, POINTER(Answer))
StateCallback = CFUNCTYPE(None, c_void_p, POINTER(StateChange))
ReleaseCallback = CFUNCTYPE(None, c_void_p)


class Options(Structure):
    """`kesto_options`"""

    _fields_ = [("size", c_size_t), ("socket_path", c_char_p), ("service_name", c_char_p), ("queue_bytes", c_size_t),
                ("unanswered_limit", c_uint32), ("wake_on_send", c_bool), ("reconnect", c_bool),
                ("first_retry_ms", c_uint32), ("longest_retry_ms", c_uint32), ("state_changed", StateCallback),
                ("state_user", c_void_p), ("state_release", ReleaseCallback), ("trace", c_bool),
                ("without_stamps", c_bool)]


class Statistics(Structure):
    """`kesto_statistics`"""

    _fields_ = [("queued", c_uint64), ("sent", c_uint64), ("answered", c_uint64), ("refused", c_uint64),
                ("lost", c_uint64), ("dropped_queue_full", c_uint64), ("dropped_not_connected", c_uint64),
                ("dropped_unusable", c_uint64), ("connections", c_uint64), ("unexpected_answers", c_uint64)]


_Prototypes = dict[str, tuple[Any, ...]]

_STATUS = c_int
_CALLBACK = (c_void_p, c_void_p, c_void_p)  # an AnswerCallback or None, its user, a ReleaseCallback or None


def _functions_of_streams(kind: str, fault: str) -> _Prototypes:
    return {
        f"kesto_{kind}_create": (_STATUS, c_void_p, c_char_p, c_uint16, POINTER(c_void_p)),
        f"kesto_{kind}_start": (_STATUS, c_void_p, POINTER(Format), c_char_p),
        f"kesto_{kind}_volume": (_STATUS, c_void_p, c_double),
        f"kesto_{kind}_mute": (_STATUS, c_void_p, c_bool),
        f"kesto_{kind}_route": (_STATUS, c_void_p, c_char_p),
        f"kesto_{kind}_format": (_STATUS, c_void_p, POINTER(Format)),
        f"kesto_{kind}_pause": (_STATUS, c_void_p),
        f"kesto_{kind}_resume": (_STATUS, c_void_p),
        f"kesto_{kind}_{fault}": (_STATUS, c_void_p, c_uint64, c_double),
        f"kesto_{kind}_stop": (_STATUS, c_void_p),
        f"kesto_{kind}_free": (None, c_void_p),
    }


# The result and the arguments of each function.
PROTOTYPES: _Prototypes = {
    "kesto_error_text": (c_char_p, _STATUS),
    "kesto_version": (c_char_p,),
    "kesto_message_create": (c_void_p,),
    "kesto_message_free": (None, c_void_p),
    "kesto_message_add_null": (_STATUS, c_void_p, c_char_p),
    "kesto_message_add_bool": (_STATUS, c_void_p, c_char_p, c_bool),
    "kesto_message_add_int64": (_STATUS, c_void_p, c_char_p, c_int64),
    "kesto_message_add_uint64": (_STATUS, c_void_p, c_char_p, c_uint64),
    "kesto_message_add_double": (_STATUS, c_void_p, c_char_p, c_double),
    "kesto_message_add_text": (_STATUS, c_void_p, c_char_p, c_char_p, c_size_t),
    "kesto_message_begin_array": (_STATUS, c_void_p, c_char_p),
    "kesto_message_begin_dictionary": (_STATUS, c_void_p, c_char_p),
    "kesto_message_end": (_STATUS, c_void_p),
    "kesto_message_key": (_STATUS, c_void_p, c_char_p, c_size_t),
    "kesto_client_open": (_STATUS, POINTER(Options), POINTER(c_void_p)),
    "kesto_client_close": (_STATUS, c_void_p, c_uint32),
    "kesto_client_free": (None, c_void_p),
    "kesto_client_flush": (_STATUS, c_void_p, c_uint32),
    "kesto_client_state": (c_int, c_void_p),
    "kesto_client_create_session": (_STATUS, c_void_p, c_int64, *_CALLBACK),
    "kesto_client_set_service_type": (_STATUS, c_void_p, c_uint16, c_int64, *_CALLBACK),
    "kesto_client_get_service_type": (_STATUS, c_void_p, c_int64, *_CALLBACK),
    "kesto_client_set_configuration": (_STATUS, c_void_p, c_void_p, c_int64, *_CALLBACK),
    "kesto_client_start_session": (_STATUS, c_void_p, c_int64, *_CALLBACK),
    "kesto_client_send": (_STATUS, c_void_p, c_void_p, c_uint32, c_uint16, POINTER(c_int64), c_size_t, *_CALLBACK),
    "kesto_client_stop_session": (_STATUS, c_void_p, c_int64, *_CALLBACK),
    "kesto_client_destroy_session": (_STATUS, c_void_p, c_int64, *_CALLBACK),
    "kesto_client_validate": (_STATUS, c_void_p, c_int64, *_CALLBACK),
    "kesto_client_get_all_reporters": (_STATUS, c_void_p, *_CALLBACK),
    "kesto_client_kill_service": (_STATUS, c_void_p, *_CALLBACK),
    "kesto_client_statistics": (None, c_void_p, POINTER(Statistics), c_size_t),
    **_functions_of_streams("playback", "underrun"),
    **_functions_of_streams("recording", "overrun"),
}


@functools.cache
def library() -> ctypes.CDLL:
    """The loaded library, each function with its types. LibraryError if that fails; the next call tries again."""
    name = os.environ.get("KESTO_LIBRARY") or "libkesto.so.0"
    try:
        loaded = ctypes.CDLL(name, use_errno=True)
    except OSError as reason:
        raise LibraryError(f"libkesto cannot be loaded ({reason}): install it (./dev install, then ldconfig), or set "
                           f"KESTO_LIBRARY to the path of libkesto.so.0") from None
    for function_name, (result, *arguments) in PROTOTYPES.items():
        try:
            function = getattr(loaded, function_name)
        except AttributeError:
            raise LibraryError(f"{name} has no function {function_name}: install the libkesto that belongs to this "
                               "package") from None
        function.restype, function.argtypes = result, arguments
    return loaded


def check(number: int, what: str) -> None:
    """Raises the error that this status stands for, unless it is OK."""
    if number != Status.OK:
        system_error = ctypes.get_errno() if number == Status.SYSTEM_ERROR else 0
        raise Error(Status(number), f"{what}: {error_text(Status(number))}"
                    + (f" ({os.strerror(system_error)})" if system_error else ""), system_error)


def error_text(status: Status) -> str:
    """The text of the status, such as "the queue is full"."""
    text: bytes = library().kesto_error_text(status)
    return text.decode()


def version() -> str:
    """The version of the library that is running, such as "0.1.0"."""
    text: bytes = library().kesto_version()
    return text.decode()


def utf8(text: str) -> bytes:
    """The bytes of any text. Those of half a surrogate pair are not UTF-8: the library refuses or replaces them."""
    return text.encode("utf-8", "surrogatepass")


def c_text(text: str | None, what: str) -> bytes | None:
    """A text that ends with a zero in C. ValueError if it holds one."""
    if text is None:
        return None
    if "\0" in text:
        raise ValueError(f"{what} holds a zero character: {text!r}")
    return utf8(text)


def in_range(number: int, least: int, most: int, what: str) -> int:
    """The integer, which ctypes would cut to the width of its type. ValueError if that would change it."""
    number = operator.index(number)
    if not least <= number <= most:
        raise ValueError(f"{what} is a number from {least} to {most}, not {number}")
    return number


def milliseconds(seconds: float, what: str) -> int:
    """A time for C. ValueError if it is negative or NaN; a longer time than C can express is cut."""
    if not seconds >= 0:
        raise ValueError(f"{what} is a number of seconds from 0, not {seconds}")
    return int(min(seconds * 1000, 0xFFFFFFFF))


def reporters_in_c(reporters: Sequence[int]) -> Any:
    """An array of reporters. An empty one is not null, which would stand for all."""
    return (c_int64 * len(reporters))(*(reporter_in_c(reporter) for reporter in reporters))


def reporter_in_c(reporter: int) -> int:
    return in_range(reporter, -2**63, 2**63 - 1, "a reporter")
