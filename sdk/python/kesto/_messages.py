# SPDX-License-Identifier: Apache-2.0
"""Messages: a dictionary of Python becomes a message of the library.

A float of Python is a double. The library's 32-bit floats have no type here: they are for programs that have such
numbers, and Python has none.
"""

import contextlib
from collections.abc import Iterator, Mapping, Sequence
from ctypes import CDLL
from typing import Union

from ._library import check, library, utf8
from .vocabulary import Status

# What a message can hold. Integers are from -2**63 to 2**64 - 1. NaN and infinity can be sent, but an event that holds
# one cannot be stored.
Value = Union[None, bool, int, float, str, Sequence["Value"], Mapping[str, "Value"]]
Message = Mapping[str, Value]

_BYTES = (bytes, bytearray, memoryview)  # sequences for Python, but not lists of numbers for a reader of messages


@contextlib.contextmanager
def encoded(message: Message) -> Iterator[int]:
    """The library's message with these entries, freed at the end of the block.

    TypeError for what a message cannot hold, OverflowError for an integer that is too large, Error for text that is not
    UTF-8, or for a message that is too large or too deep.
    """
    lib = library()
    pointer = lib.kesto_message_create()
    check(Status.OK if pointer else Status.OUT_OF_MEMORY, "a message")
    try:
        if not isinstance(message, Mapping):
            raise TypeError(f"a message is a dictionary, not {message!r}")
        _add_entries(lib, pointer, message, "the message")
        yield pointer
    finally:
        lib.kesto_message_free(pointer)


def _add_entries(lib: CDLL, pointer: int, entries: Message, place: str) -> None:
    for key, value in entries.items():
        if not isinstance(key, str):
            raise TypeError(f"{place} has the key {key!r}: keys are text")
        name = utf8(key)
        check(lib.kesto_message_key(pointer, name, len(name)), f"{place}[{key!r}]")
        _add(lib, pointer, value, f"{place}[{key!r}]")


def _add(lib: CDLL, pointer: int, value: Value, place: str) -> None:
    """Adds a value behind its key, or to the innermost array."""
    if value is None:
        status = lib.kesto_message_add_null(pointer, None)
    elif isinstance(value, bool):  # before int, of which it is one
        status = lib.kesto_message_add_bool(pointer, None, value)
    elif isinstance(value, int):
        if not -2**63 <= value < 2**64:
            raise OverflowError(f"{place} is {value}: an integer has 64 bits at most")
        add = lib.kesto_message_add_int64 if value < 2**63 else lib.kesto_message_add_uint64
        status = add(pointer, None, value)
    elif isinstance(value, float):
        status = lib.kesto_message_add_double(pointer, None, value)
    elif isinstance(value, str):
        text = utf8(value)
        status = lib.kesto_message_add_text(pointer, None, text, len(text))
    elif isinstance(value, Mapping):
        check(lib.kesto_message_begin_dictionary(pointer, None), place)
        _add_entries(lib, pointer, value, place)
        status = lib.kesto_message_end(pointer)
    elif isinstance(value, Sequence) and not isinstance(value, _BYTES):
        check(lib.kesto_message_begin_array(pointer, None), place)
        for index, element in enumerate(value):
            _add(lib, pointer, element, f"{place}[{index}]")
        status = lib.kesto_message_end(pointer)
    else:
        raise TypeError(f"{place} is {value!r}: a value is None, a bool, an int, a float, a str, a list or a dict")
    check(status, place)
