# SPDX-License-Identifier: Apache-2.0
"""libkesto for Python: reports a program's use of audio to the Kesto reporting service (kestod).

    with kesto.Client(reconnect=True) as client, kesto.Playback(
            client, "org.example.player", kesto.ServiceType.LONG_FORM_AUDIO) as playback:
        playback.start(kesto.Format("S16LE", 44100, 2), "speaker")
        ...  # plays
        playback.volume(0.5)
        ...
        playback.stop()

A thin layer over libkesto, made with the standard library's ctypes: what libkesto promises about lost connections,
the order of calls and what is counted holds here, too. Names and arguments are those of C++ in Python's spelling; a
call that C++ answers with a status raises `Error` here unless it was taken. Times are in seconds.

Importing loads nothing. The first client loads `libkesto.so.0`, or the library that $KESTO_LIBRARY names, and raises
`LibraryError` if it cannot.
"""

from ._library import error_text, version
from ._messages import Message, Value
from .answers import Answer, AnswerCallback, StateCallback, StateChange, Statistics
from .client import Client
from .streams import Format, Playback, Recording
from .vocabulary import Category, Error, EventType, Group, LibraryError, Operation, ServiceType, State, Status

__all__ = [
    "Answer", "AnswerCallback", "Category", "Client", "Error", "EventType", "Format", "Group", "LibraryError",
    "Message", "Operation", "Playback", "Recording", "ServiceType", "State", "StateCallback", "StateChange",
    "Statistics", "Status", "Value", "error_text", "version",
]
