# SPDX-License-Identifier: Apache-2.0
"""Playbacks and recordings: a program says what it plays, and the library makes the session and its messages, so that
the service knows how long it played, at which volume, on which device.

From `start` to `stop` is one session; a pause does not end it. Calls take effect in their order, and each takes its own
time, also if its message is sent later.
"""

import ctypes
import types
from typing import ClassVar, NamedTuple, TypeVar

from . import _library
from ._handles import Handle
from ._library import c_text, check, in_range, library
from .client import Client

_AnyStream = TypeVar("_AnyStream", bound="_Stream")


class Format(NamedTuple):
    """A stream's format, reported as text such as "S16LE/44100/2"."""

    encoding: str  # of the samples, such as "S16LE", or of the coded sound; cut at 255 bytes
    rate: int = 0  # samples of a channel in a second; 0: left out
    channels: int = 0  # 0: left out


class _Stream:
    """What a playback and a recording have in common. One that is not started reports nothing.

    Every method may be called from any thread, and returns without waiting. Each raises `Error` if the call was not
    taken: NOT_CONNECTED, unless the client has `reconnect`; QUEUE_FULL (`Client.statistics` counts it); CLOSED after
    `close` of this object or of its client; INVALID_ARGUMENT.
    """

    _KIND: ClassVar[str]

    def __init__(self, client: Client, application: str, service_type: int) -> None:
        """Makes it, not started.

        client: stays in use as long as this object.
        application: the program that plays or records, such as "org.example.player"; cut at 255 bytes.
        service_type: a `ServiceType`, such as LONG_FORM_AUDIO.

        Error with INVALID_ARGUMENT (an empty application), CLOSED or OUT_OF_MEMORY.
        """
        self._handle: Handle | None = None
        self._client = client
        pointer = ctypes.c_void_p()
        self._check(self._function("create")(
            client._handle, c_text(application, "an application"), in_range(service_type, 0, 0xFFFF, "a service type"),
            ctypes.byref(pointer)), "create")
        assert pointer.value is not None
        self._handle = Handle(pointer.value, self._function("free"))

    def __enter__(self: _AnyStream) -> _AnyStream:
        return self

    def __exit__(self, kind: type[BaseException] | None, error: BaseException | None,
                 trace: types.TracebackType | None) -> None:
        self.close()

    def start(self, format: Format | None = None, device: str | None = None) -> None:
        """Begins a session and its first run. None stands for the format or device of the last call that gave one, or
        an unknown one. A start without a stop in between ends the earlier session first.

        device: as in `route`.
        """
        self._call("start", None if format is None else _format_in_c(format), c_text(device, "a device"))

    def volume(self, volume: float) -> None:
        """The volume that the listener has set, from 0 to 1; more counts as 1. Until the first call it is 1, and it
        stays from one start to the next. Negative or NaN: INVALID_ARGUMENT. Not for fades."""
        self._call("volume", float(volume))

    def mute(self, muted: bool) -> None:
        """While muted, the volume counts as 0."""
        self._call("mute", bool(muted))

    def route(self, device: str | None) -> None:
        """The device, or several joined with ","; cut at 1024 bytes. None or "": none."""
        self._call("route", c_text(device, "a device"))

    def format(self, format: Format) -> None:
        """The format has changed."""
        self._call("format", _format_in_c(format))

    def pause(self) -> None:
        """Ends the run, not the session: what follows does not count as played."""
        self._call("pause")

    def resume(self) -> None:
        """Begins the next run. Without a pause it has no effect."""
        self._call("resume")

    def stop(self) -> None:
        """Ends the session. Without a start it has no effect."""
        self._call("stop")

    def close(self) -> None:
        """Stops it if it is started; other calls then raise Error with CLOSED. A second close does nothing. It does not
        wait: `Client.close` and `Client.flush` do."""
        self._handle = None  # frees it, which stops it, as soon as no other thread is in a call

    def _call(self, operation: str, *arguments: object) -> None:
        self._check(self._function(operation)(self._handle, *arguments), operation)

    def _check(self, status: int, operation: str) -> None:
        check(status, f"{operation} of a {self._KIND}")

    @classmethod
    def _function(cls, operation: str) -> "ctypes._FuncPointer":
        function: "ctypes._FuncPointer" = getattr(library(), f"kesto_{cls._KIND}_{operation}")
        return function

    def _fault(self, operation: str, cycles: int, seconds: float) -> None:
        self._call(operation, in_range(cycles, 0, 2**64 - 1, "a number of cycles"), float(seconds))


class Playback(_Stream):
    """What a program plays.

        with kesto.Playback(client, "org.example.player", kesto.ServiceType.LONG_FORM_AUDIO) as playback:
            playback.start(kesto.Format("S16LE", 44100, 2), "speaker")
            ...
            playback.stop()

    At the end of the block it is closed, which stops it if it still plays.
    """

    _KIND = "playback"

    def underrun(self, cycles: int, seconds: float) -> None:
        """The sound had gaps: so many cycles were missed, within so many seconds. Has an effect between start and stop.
        Negative or NaN seconds: INVALID_ARGUMENT."""
        self._fault("underrun", cycles, seconds)


class Recording(_Stream):
    """What a program records: the same for a stream from a device."""

    _KIND = "recording"

    def overrun(self, cycles: int, seconds: float) -> None:
        """So many cycles of recorded sound were lost, within so many seconds. Has an effect between start and stop.
        Negative or NaN seconds: INVALID_ARGUMENT."""
        self._fault("overrun", cycles, seconds)


def _format_in_c(format: Format) -> "ctypes._Pointer[_library.Format] | object":
    return ctypes.byref(_library.Format(
        c_text(format.encoding, "an encoding"), in_range(format.rate, 0, 2**32 - 1, "a rate"),
        in_range(format.channels, 0, 2**32 - 1, "a number of channels")))
