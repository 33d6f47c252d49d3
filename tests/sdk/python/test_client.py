# SPDX-License-Identifier: Apache-2.0
"""The client: its calls and their answers, its states, and its end."""

import ctypes
import errno
import os
import subprocess
import sys
import threading
import unittest
import unittest.mock
import warnings
from typing import Any

import kesto
from fake_service import PATIENCE, ServedTest
from kesto._library import Options, library


class Client(ServedTest):
    def test_every_operation_reaches_the_service_and_is_answered(self) -> None:
        service = self.serve()
        client = self.client(stamp=False)
        answers: list[kesto.Answer] = []
        client.create_session(42, answers.append)
        client.set_service_type(kesto.ServiceType.LONG_FORM_AUDIO, 42, answers.append)
        client.get_service_type(42, answers.append)
        client.set_configuration({"HostApplicationDisplayID": "player"}, 42, answers.append)
        client.start_session(42, answers.append)
        client.send({"a": 1}, kesto.Category.PLAYBACK, kesto.EventType.START, 42, answers.append)
        client.stop_session(42, answers.append)
        client.destroy_session(42, answers.append)
        client.validate(42, answers.append)
        client.get_all_reporters(answers.append)
        client.flush(PATIENCE)
        self.assertEqual(service.wait_for_calls(10),
                         [[1, 42], [2, 7, 42], [3, 42], [4, {"HostApplicationDisplayID": "player"}, 42], [5, 42],
                          [6, {"a": 1}, 4, 1, [42]], [7, 42], [8, 42], [9, 42], [10]])
        self.assertEqual([(answer.operation.name, answer.call, answer.reporter) for answer in answers],
                         [("CREATE_SESSION", 1, 42), ("SET_SERVICE_TYPE", 2, 42), ("GET_SERVICE_TYPE", 3, 42),
                          ("SET_CONFIGURATION", 4, 42), ("SEND", 6, 0), ("START_SESSION", 5, 42),
                          ("STOP_SESSION", 7, 42), ("DESTROY_SESSION", 8, 42), ("VALIDATE", 9, 42),
                          ("GET_ALL_REPORTERS", 10, 0)])
        self.assertTrue(all(answer.ok and answer.status == kesto.Status.OK for answer in answers))
        self.assertTrue(answers[0].success)
        self.assertEqual(answers[2].service_type, kesto.ServiceType.LONG_FORM_AUDIO)
        self.assertEqual((answers[8].valid_reporter, answers[8].service_type),
                         (42, kesto.ServiceType.LONG_FORM_AUDIO))
        self.assertEqual(answers[9].reporters, (42, -1))

    def test_an_error_of_the_service_is_an_answer(self) -> None:
        service = self.serve(holds=True)
        client = self.client()
        answers: list[kesto.Answer] = []
        client.send({}, kesto.Category.PLAYBACK, kesto.EventType.START, 42, answers.append)
        service.wait_for_calls(1)
        service.answer(b"\x82\x01\x82\x63a.b\x07")
        client.flush(PATIENCE)
        self.assertEqual([(answer.ok, answer.error_domain, answer.error_code, answer.status) for answer in answers],
                         [(False, "a.b", 7, kesto.Status.OK)])
        self.assertEqual(client.statistics().refused, 1)

    def test_the_end_of_a_block_waits_until_the_service_has_it_all(self) -> None:
        service = self.serve()
        with kesto.Client(socket_path=self.path) as client:
            client.create_session(42)
            client.send({}, kesto.Category.GENERIC, kesto.EventType.SIMPLE, 42)
        self.assertEqual(client.state, kesto.State.CLOSED)
        self.assertEqual(client.statistics(), kesto.Statistics(
            queued=1, sent=1, answered=1, refused=0, lost=0, dropped_queue_full=0, dropped_not_connected=0,
            dropped_unusable=0, connections=1, unexpected_answers=0))
        self.assertEqual(len(service.wait_for_calls(2)), 2)
        client.close()
        self.assertStatus(kesto.Status.CLOSED, client.create_session, 42)
        self.assertStatus(kesto.Status.CLOSED, client.flush, 1)

    def test_a_block_ends_well_although_no_service_is_there(self) -> None:
        with kesto.Client(socket_path=self.path):
            pass

    def test_an_exception_leaves_a_block(self) -> None:
        self.serve()
        with self.assertRaises(KeyError), kesto.Client(socket_path=self.path) as client:
            raise KeyError
        self.assertEqual(client.state, kesto.State.CLOSED)

    def test_a_client_that_is_forgotten_warns(self) -> None:
        with self.assertWarnsRegex(ResourceWarning, "Client object at .* was not closed"):
            kesto.Client(socket_path=self.path)
        with warnings.catch_warnings():
            warnings.simplefilter("error")
            kesto.Client(socket_path=self.path).__exit__(None, None, None)

    def test_states_are_reported_with_their_reasons(self) -> None:
        changes: list[kesto.StateChange] = []
        changed = threading.Condition()

        def remember(change: kesto.StateChange) -> None:
            with changed:
                changes.append(change)
                changed.notify_all()

        def wait_for(state: kesto.State) -> None:
            with changed:
                self.assertTrue(changed.wait_for(lambda: changes and changes[-1].state == state, PATIENCE), changes)

        client = self.client(reconnect=True, first_retry=0.005, longest_retry=0.005, state_changed=remember)
        wait_for(kesto.State.DISCONNECTED)
        self.assertEqual(changes[0], kesto.StateChange(
            kesto.State.DISCONNECTED, kesto.Status.CONNECT_FAILED, errno.ENOENT, 0.005, self.path))
        service = self.serve()
        wait_for(kesto.State.CONNECTED)
        self.assertEqual(changes[-1], kesto.StateChange(kesto.State.CONNECTED, kesto.Status.OK, 0, None, self.path))
        client.create_session(1)
        service.wait_for_calls(1)
        service.disconnect()
        with changed:
            self.assertTrue(changed.wait_for(
                lambda: any(change.reason == kesto.Status.CONNECTION_LOST for change in changes), PATIENCE))
        wait_for(kesto.State.CONNECTED)
        client.close()
        self.assertEqual(changes[-1].state, kesto.State.CLOSED)

    def test_a_client_without_a_service_and_without_reconnecting_refuses_calls(self) -> None:
        gone = threading.Event()
        changes: list[kesto.StateChange] = []

        def remember(change: kesto.StateChange) -> None:
            changes.append(change)
            gone.set()

        client = self.client(state_changed=remember)
        self.assertTrue(gone.wait(PATIENCE))
        self.assertIsNone(changes[0].retry_after)
        error = self.assertStatus(kesto.Status.NOT_CONNECTED, client.create_session, 42)
        self.assertEqual(str(error), "create_session: the client is not connected to the service")

    def test_a_full_queue_refuses_messages(self) -> None:
        self.serve(holds=True)
        client = self.client(queue_bytes=4096, unanswered_limit=1)

        def fill() -> None:
            while True:
                client.send({"text": "x" * 100}, kesto.Category.GENERIC, kesto.EventType.SIMPLE, 42)

        self.assertEqual(str(self.assertStatus(kesto.Status.QUEUE_FULL, fill)), "send: the queue is full")
        self.assertEqual(client.statistics().dropped_queue_full, 1)

    def test_options_reach_the_library(self) -> None:
        given: list[dict[str, object]] = []

        def refuse(options: Any, client: object) -> int:
            given.append({name: getattr(options._obj, name) for name, *_ in options._obj._fields_
                          if not name.startswith("state_")})
            return kesto.Status.INVALID_ARGUMENT

        with unittest.mock.patch.object(library(), "kesto_client_open", refuse):
            self.assertStatus(kesto.Status.INVALID_ARGUMENT, kesto.Client)
            self.assertStatus(
                kesto.Status.INVALID_ARGUMENT, kesto.Client, socket_path="/a", service_name="b", queue_bytes=8192,
                unanswered_limit=3, wake_on_send=True, reconnect=True, first_retry=0.25, longest_retry=1e9, stamp=False)
        size = ctypes.sizeof(Options)
        self.assertEqual(given, [
            {"size": size, "socket_path": None, "service_name": None, "queue_bytes": 0, "unanswered_limit": 0,
             "wake_on_send": False, "reconnect": False, "first_retry_ms": 0, "longest_retry_ms": 0, "trace": False,
             "without_stamps": False},
            {"size": size, "socket_path": b"/a", "service_name": b"b", "queue_bytes": 8192, "unanswered_limit": 3,
             "wake_on_send": True, "reconnect": True, "first_retry_ms": 250, "longest_retry_ms": 0xFFFFFFFF,
             "trace": False, "without_stamps": True}])

    def test_numbers_that_c_would_cut_are_refused(self) -> None:
        client = self.client()
        for call in (lambda: client.create_session(2**63), lambda: client.send({}, -1, 1, 42),
                     lambda: client.send({}, 2**32, 1, 42), lambda: client.send({}, 1, 2**16, 42),
                     lambda: client.send({}, 1, 1, [2**63]), lambda: client.set_service_type(-1, 42),
                     lambda: client.flush(-1), lambda: client.close(float("nan")),
                     lambda: kesto.Client(queue_bytes=-1), lambda: kesto.Client(first_retry=-0.1)):
            self.assertRaises(ValueError, call)
        self.assertRaises(TypeError, client.create_session, 4.2)

    def test_text_with_a_zero_is_refused_where_c_would_cut_it(self) -> None:
        self.assertRaisesRegex(ValueError, r"service_name holds a zero character: 'a\\x00b'", kesto.Client,
                               service_name="a\0b")

    def test_a_wrong_name_is_an_error_with_its_status(self) -> None:
        error = self.assertStatus(kesto.Status.INVALID_ARGUMENT, kesto.Client, service_name="a/b")
        self.assertEqual((str(error), error.system_error), ("a client: an argument is invalid", 0))

    def test_numbers_of_later_versions_are_kept(self) -> None:
        self.assertEqual((kesto.Status(999).name, kesto.Status(999) + 0), ("NUMBER_999", 999))
        self.assertRaises(ValueError, kesto.Status, "ok")


class Interpreter(ServedTest):
    def run_program(self, program: str) -> str:
        finished = subprocess.run([sys.executable, "-c", program], env={**os.environ, "KESTO_SOCKET": self.path},
                                  capture_output=True, text=True, timeout=PATIENCE)
        self.assertEqual(finished.stderr, "")
        self.assertEqual(finished.returncode, 0)
        return finished.stdout

    def test_it_closes_the_clients_that_are_open_at_its_end(self) -> None:
        self.serve(holds=True)
        printed = self.run_program("import kesto\n"
                                   "client = kesto.Client(state_changed=lambda change: None)\n"
                                   "client.create_session(42, lambda answer: print(answer.status.name))\n")
        self.assertEqual(printed, "CLOSED\n")

    def test_an_error_of_the_system_has_its_number_and_text(self) -> None:
        printed = self.run_program("import kesto, os, resource\n"
                                   "kesto.version()\n"
                                   "free = os.dup(0)\n"
                                   "os.close(free)\n"
                                   "resource.setrlimit(resource.RLIMIT_NOFILE, (free, free))\n"
                                   "try:\n"
                                   "    kesto.Client()\n"
                                   "except kesto.Error as error:\n"
                                   "    print(error.status.name, error.system_error, error)\n")
        self.assertEqual(printed, "SYSTEM_ERROR 24 a client: the system refused a descriptor, a thread or a file (Too "
                                  "many open files)\n")

    def test_it_ends_well_while_daemon_threads_report(self) -> None:
        self.serve()
        self.run_program("import kesto, threading\n"
                         "client = kesto.Client(reconnect=True)\n"
                         "playback = kesto.Playback(client, 'player', kesto.ServiceType.TEST)\n"
                         "begun = threading.Event()\n"
                         "def play():\n"
                         "    while True:\n"
                         "        begun.set()\n"
                         "        try:\n"
                         "            playback.start()\n"
                         "            playback.stop()\n"
                         "        except kesto.Error:\n"
                         "            pass\n"
                         "threading.Thread(target=play, daemon=True).start()\n"
                         "begun.wait()\n")


if __name__ == "__main__":
    unittest.main()
