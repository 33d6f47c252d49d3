# SPDX-License-Identifier: Apache-2.0
"""Handles: who owns an object of the library, and when it is freed.

A handle is freed when the last reference to it goes. A call holds a reference while it is under way, so no thread can
free what another still uses, and closing may be left to any thread.

Two moments need more care. When the interpreter ends, its clients are closed before it goes, because their threads
call into it; they are not freed, since daemon threads may still use them. In a forked child, handles are the parent's:
the library allows only to free them, so calls there find none.
"""

import atexit
import os
import weakref
from collections.abc import Callable

from ._library import library


class Handle:
    """An object of the library. ctypes passes `_as_parameter_`, and keeps the handle as long as the call lasts."""

    def __init__(self, pointer: int, free: Callable[[int], None]) -> None:
        self._as_parameter_: int | None = pointer
        weakref.finalize(self, free, pointer).atexit = False
        _handles.add(self)

    def disown(self) -> None:
        self._as_parameter_ = None


class ClientHandle(Handle):
    """A client, which also ends with the interpreter."""

    def __init__(self, pointer: int) -> None:
        super().__init__(pointer, library().kesto_client_free)
        _clients.add(self)


_handles: "weakref.WeakSet[Handle]" = weakref.WeakSet()
_clients: "weakref.WeakSet[ClientHandle]" = weakref.WeakSet()


@atexit.register
def _close_clients() -> None:
    for client in list(_clients):
        library().kesto_client_close(client, 0)


def _disown_all() -> None:
    for handle in list(_handles):
        handle.disown()


os.register_at_fork(after_in_child=_disown_all)
