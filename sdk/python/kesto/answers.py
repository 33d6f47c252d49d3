# SPDX-License-Identifier: Apache-2.0
"""What a client tells: answers, changes of its state, and counts. Plain data, which the program may keep."""

import dataclasses
from collections.abc import Callable

from .vocabulary import Operation, ServiceType, State, Status

_ERROR_DOMAIN = "com.quarn.kesto.client"  # of the errors that the library itself reports


@dataclasses.dataclass(frozen=True, slots=True)
class Answer:
    """One answer to one call. The fields from `success` on are valid if the call succeeded (`ok`)."""

    call: int  # the number of the call, from 1, in the order in which calls leave the queue
    operation: Operation
    reporter: int  # the call's reporter; 0 for calls without one, and for `send`
    error_domain: str | None  # None on success
    error_code: int
    success: bool  # for operations that answer with a truth value
    service_type: ServiceType  # for get_service_type and validate; UNKNOWN: the session does not exist
    valid_reporter: int  # for validate; 0: the session does not exist
    reporters: tuple[int, ...]  # for get_all_reporters

    @property
    def ok(self) -> bool:
        """Whether the call succeeded."""
        return self.error_domain is None

    @property
    def status(self) -> Status:
        """The library's own error: CONNECTION_LOST, CLOSED or SESSION_ENDED. OK for answers of the service."""
        return Status(self.error_code) if self.error_domain == _ERROR_DOMAIN else Status.OK


AnswerCallback = Callable[[Answer], object]


@dataclasses.dataclass(frozen=True, slots=True)
class StateChange:
    """A change of a client's state."""

    state: State
    reason: Status  # why it is disconnected, such as CONNECT_FAILED or CONNECTION_LOST; else OK
    system_error: int  # `errno` of that reason if the system gave one, else 0
    retry_after: float | None  # when disconnected: seconds until the next attempt; None: none will follow
    socket_path: str  # of the connection, or of the last attempt


StateCallback = Callable[[StateChange], object]


@dataclasses.dataclass(frozen=True, slots=True)
class Statistics:
    """Counts of the messages that were passed to `Client.send`, or made for playbacks and recordings, so far.

    At any time queued = answered + lost + messages on their way.
    """

    queued: int  # taken
    sent: int  # passed completely to the connection
    answered: int  # answered by the service
    refused: int  # included in these: answered with an error
    lost: int  # taken, but the connection ended or the client was closed before the answer
    # Not taken, of messages and of calls of playbacks and recordings:
    dropped_queue_full: int
    dropped_not_connected: int  # or closed
    dropped_unusable: int  # too large, with a failure of its own, or with an invalid argument
    # Of the whole client:
    connections: int  # that were made
    unexpected_answers: int  # to calls that expect none
