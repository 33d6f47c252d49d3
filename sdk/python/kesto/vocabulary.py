# SPDX-License-Identifier: Apache-2.0
"""The names and numbers of the interface: what calls return, what sessions and messages are about, and the error that a
refused call raises.

Later versions of the library and the service may know more numbers. A number without a name is kept: `Status(999)` is
a member with the name "NUMBER_999".
"""

import enum
from typing import TypeVar

_Number = TypeVar("_Number", bound="_NumberEnum")


class _NumberEnum(enum.IntEnum):
    @classmethod
    def _missing_(cls: type[_Number], value: object) -> _Number | None:
        if not isinstance(value, int):
            return None
        member = int.__new__(cls, value)
        member._name_ = f"NUMBER_{value}"
        member._value_ = value
        return member


class Status(_NumberEnum):
    """The result of a call of the library, as in `Error.status`."""

    OK = 0
    INVALID_ARGUMENT = 1  # an argument that is not allowed, such as a negative volume
    OUT_OF_MEMORY = 2
    SYSTEM_ERROR = 3  # the system had no descriptor, no thread or no file: `Error.system_error` says why
    QUEUE_FULL = 4  # the client's queue has no room; the call was not taken
    NOT_CONNECTED = 5  # no connection exists or is being made; the call was not taken
    CLOSED = 6  # the client or the playback has been closed
    TIMED_OUT = 7
    WRONG_THREAD = 8  # a function that waits was called from a callback of the same client
    INVALID_UTF8 = 9  # a key or a text has half a surrogate pair, which UTF-8 cannot express
    TOO_LARGE = 10  # too large for a message, or for the client's queue
    TOO_DEEP = 11  # more than 30 nested containers
    MISNESTED = 12  # of messages that are built step by step, as in C
    CONNECTION_LOST = 13  # the connection ended, or could not be made, before the call was answered
    CONNECT_FAILED = 14  # no service listens at the socket, or it cannot be reached
    PROTOCOL_VIOLATION = 15  # the peer broke the protocol
    SESSION_ENDED = 16  # the session was destroyed or replaced: the service will not answer its start


class State(_NumberEnum):
    """The state of a client's connection."""

    CONNECTING = 0  # calls are taken and wait for the connection
    CONNECTED = 1
    DISCONNECTED = 2  # calls are refused until the next attempt, if any
    CLOSED = 3  # for good


class ServiceType(_NumberEnum):
    """The kind of service that a session stands for."""

    GENERIC = 0
    MERLA = 1
    TELEPHONY = 2
    HAPTICS = 3
    ALARMS = 4
    STANDALONE = 5
    SOUND_AUTO_CONFIG = 6
    LONG_FORM_AUDIO = 7
    NON_LONG_FORM_AUDIO = 8
    AUDIO_DEVICE_USAGE = 9
    ALERTS = 10
    TEST = 11
    API_USAGE = 12
    SYSTEM_SOUNDS = 13
    UNKNOWN = 65535  # also the answer for an unknown session


class Category(_NumberEnum):
    """The subject of a message. `Group.DSP | Category.PLAYBACK` is a category within a group."""

    GENERIC = 1
    RECORD = 2
    INPUT = 3
    PLAYBACK = 4
    OUTPUT = 5
    PLAYBACK_AND_RECORD = 6
    IO = 7
    SETUP = 8
    CLIENT_REQUEST = 9
    ROUTE_CHANGE = 10
    ERROR = 11
    CAVLET = 12
    PERFORMANCE = 13
    VOLUME = 14
    HEARING_HEALTH = 15


class Group(_NumberEnum):
    """The group of a category."""

    MIDI = 0x04000000
    SESSION = 0x08000000
    DSP = 0x10000000
    HAL = 0x20000000
    ROUTING = 0x40000000
    TOOLBOX = 0x80000000


class EventType(_NumberEnum):
    """What happened."""

    START = 1
    STOP = 2
    ACTIVATE = 3
    DEACTIVATE = 4
    SETUP = 5
    ERROR = 6
    ISSUE_DETECTOR = 7
    GIMBO = 8
    AUDIO_UNIT_USAGE = 9
    MIDI_DRIVER = 10
    SUMMARY = 11
    HEADPHONE_AUDIO_EXPOSURE = 12
    AUDIO_EXPOSURE = 13
    LISTENING_ENHANCEMENT = 14
    TIVRA = 15
    SIMPLE = 16
    HISTOGRAM = 17
    STATE = 18
    UNKNOWN = 65535


class Operation(_NumberEnum):
    """The operation of a call."""

    CREATE_SESSION = 1
    SET_SERVICE_TYPE = 2
    GET_SERVICE_TYPE = 3
    SET_CONFIGURATION = 4
    START_SESSION = 5
    SEND = 6
    STOP_SESSION = 7
    DESTROY_SESSION = 8
    VALIDATE = 9
    GET_ALL_REPORTERS = 10
    KILL_SERVICE = 11


class Error(Exception):
    """A call was not taken, or did not end in time. Its text is for people, such as "the queue is full".

    `status` is the reason. `system_error` is the system's error number (`errno`) if the status is SYSTEM_ERROR, else 0.
    """

    def __init__(self, status: Status, text: str, system_error: int = 0) -> None:
        super().__init__(status, text, system_error)
        self.status = status
        self.text = text
        self.system_error = system_error

    def __str__(self) -> str:
        return self.text


class LibraryError(Error):
    """libkesto itself cannot be used: it is missing, cannot be loaded, or is too old. The text says what to do."""

    def __init__(self, text: str) -> None:
        super().__init__(Status.SYSTEM_ERROR, text)
        self.args = (text,)
