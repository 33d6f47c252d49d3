# SPDX-License-Identifier: Apache-2.0
"""The other end of the wire, in the test's own process: reads calls from a real socket, records them, and answers as
kestod does, as far as one client can tell. A service that `holds` answers nothing until it is asked to.

Its reader of CBOR knows what the library writes, and keeps the kinds of numbers apart: an integer is an int, a 64-bit
float a float, and a 32-bit float an error.
"""

import contextlib
import pathlib
import socket
import struct
import tempfile
import threading
import unittest
from typing import Any

import kesto

PATIENCE = 20.0  # seconds that a test waits before it fails


class FakeService:
    def __init__(self, path: str, holds: bool = False) -> None:
        self._holds = holds
        self._changed = threading.Condition()
        self._calls: list[list[Any]] = []
        self._peers: list[socket.socket] = []
        self._starts: dict[int, int] = {}  # reporter to call
        self._listener = socket.socket(socket.AF_UNIX)
        self._listener.bind(path)
        self._listener.listen()
        self._threads = [threading.Thread(target=self._accept)]
        self._threads[0].start()

    def stop(self) -> None:
        self._listener.shutdown(socket.SHUT_RDWR)
        self._threads[0].join()
        self._listener.close()
        self.disconnect()
        for thread in self._threads[1:]:
            thread.join()
        for peer in self._peers:
            peer.close()

    def disconnect(self) -> None:
        for peer in self._peers:
            try:
                peer.shutdown(socket.SHUT_RDWR)
            except OSError:
                pass  # the client has ended the connection

    def wait_for_calls(self, count: int) -> list[list[Any]]:
        """All calls so far, without their numbers, as soon as there are so many."""
        with self._changed:
            self._changed.wait_for(lambda: len(self._calls) >= count, PATIENCE)
            return [call[1:] for call in self._calls]

    def answer(self, frame: bytes) -> None:
        """Sends [call, error, values...] to the last client."""
        try:
            self._peers[-1].sendall(struct.pack("<I", len(frame)) + frame)
        except BrokenPipeError:
            pass  # the client has gone without waiting

    def _accept(self) -> None:
        while True:
            try:
                peer, _ = self._listener.accept()
            except OSError:
                return
            self._peers.append(peer)
            self._threads.append(threading.Thread(target=self._read, args=(peer,)))
            self._threads[-1].start()

    def _read(self, peer: socket.socket) -> None:
        with peer.makefile("rb") as stream, contextlib.suppress(ConnectionResetError):  # a client that does not wait
            while head := stream.read(4):
                call = Decoder(stream.read(struct.unpack("<I", head)[0])).item()
                if not self._holds:
                    self._answer_obediently(call)
                with self._changed:
                    self._calls.append(call)
                    self._changed.notify_all()

    def _answer_obediently(self, call: list[Any]) -> None:
        number, method, *arguments = call
        if method == 5:
            self._starts[arguments[0]] = number
            return
        if method == 7 and arguments[0] in self._starts:
            self.answer(b"\x83" + unsigned(self._starts.pop(arguments[0])) + b"\xf6\xf5")
        answers = {6: b"", 3: b"\x07", 10: b"\x82\x18\x2a\x20",  # [42, -1]
                   9: b"\xa2\x6areporterID\x18\x2a\x6bserviceType\x07"}
        values = answers.get(method, b"\xf5")
        self.answer((b"\x83" if values else b"\x82") + unsigned(number) + b"\xf6" + values)


def unsigned(number: int) -> bytes:
    return bytes([number]) if number < 24 else b"\x19" + struct.pack(">H", number)


class Decoder:
    """Reads one item of CBOR."""

    def __init__(self, data: bytes) -> None:
        self._data = data
        self._place = 0

    def item(self) -> Any:
        head = self._take(1)[0]
        kind, short = head >> 5, head & 31
        if kind == 7:
            if short == 27:
                return struct.unpack(">d", self._take(8))[0]
            return {20: False, 21: True, 22: None}[short]
        if short == 31:  # of unknown length
            return self._until_break(kind)
        count = short if short < 24 else int.from_bytes(self._take(1 << (short - 24)), "big")
        if kind == 0:
            return count
        if kind == 1:
            return -1 - count
        if kind == 3:
            return self._take(count).decode()
        if kind == 4:
            return [self.item() for _ in range(count)]
        assert kind == 5, kind
        return {self.item(): self.item() for _ in range(count)}

    def _until_break(self, kind: int) -> Any:
        items = []
        while self._data[self._place] != 0xFF:
            items.append((self.item(), self.item()) if kind == 5 else self.item())
        self._place += 1
        return dict(items) if kind == 5 else items

    def _take(self, count: int) -> bytes:
        self._place += count
        return self._data[self._place - count:self._place]


class ServedTest(unittest.TestCase):
    """A test with a fake service, and clients of it."""

    def setUp(self) -> None:
        directory = tempfile.TemporaryDirectory()
        self.addCleanup(directory.cleanup)
        self.path = str(pathlib.Path(directory.name) / "socket")

    def serve(self, holds: bool = False) -> FakeService:
        service = FakeService(self.path, holds)
        self.addCleanup(service.stop)
        return service

    def client(self, **options: Any) -> kesto.Client:
        client = kesto.Client(socket_path=self.path, **options)
        self.addCleanup(client.__exit__, None, None, None)
        return client

    def assertStatus(self, status: kesto.Status, function: Any, *arguments: Any, **named: Any) -> kesto.Error:
        with self.assertRaises(kesto.Error) as raised:
            function(*arguments, **named)
        self.assertEqual(raised.exception.status, status)
        return raised.exception
