# SPDX-License-Identifier: Apache-2.0
"""Callbacks: how a function of Python is called by the library, and how long it lives.

The library gets no pointer to an object of Python. It gets a number, which stands for the function in a table until the
library calls the release function: once for each callback, after its last call. So a callback lives exactly as long as
the library may call it, even if the program forgets it, and no longer.

The functions below run on the client's thread, or for a refused call on the caller's. An exception in a callback goes
to `sys.unraisablehook`, which prints it; the client goes on.
"""

import itertools
import os
from collections.abc import Callable
from typing import Any

from . import _library
from .answers import Answer, StateChange
from .vocabulary import Operation, ServiceType, State, Status

_NEVER = 0xFFFFFFFF  # of retry_after_ms

_numbers = itertools.count(1)
_functions: dict[int, Callable[[Any], object]] = {}


def keep(function: Callable[[Any], object]) -> int:
    """The number of a function, which the library must release."""
    number = next(_numbers)
    _functions[number] = function
    return number


def _release(number: int) -> None:
    del _functions[number]


def _call_answer(number: int, answer: Any) -> None:
    given = answer.contents
    _functions[number](Answer(
        call=given.call, operation=Operation(given.operation), reporter=given.reporter,
        error_domain=None if given.error_domain is None else given.error_domain.decode("utf-8", "replace"),
        error_code=given.error_code, success=given.success, service_type=ServiceType(given.service_type),
        valid_reporter=given.valid_reporter, reporters=tuple(given.reporters[:given.reporter_count])))


def _call_state_changed(number: int, change: Any) -> None:
    given = change.contents
    will_retry = given.state == State.DISCONNECTED and given.retry_after_ms != _NEVER
    _functions[number](StateChange(
        state=State(given.state), reason=Status(given.reason), system_error=given.system_error,
        retry_after=given.retry_after_ms / 1000 if will_retry else None, socket_path=os.fsdecode(given.socket_path)))


# The functions of C that lead here; they exist as long as the package.
release = _library.ReleaseCallback(_release)
call_answer = _library.AnswerCallback(_call_answer)
call_state_changed = _library.StateCallback(_call_state_changed)
