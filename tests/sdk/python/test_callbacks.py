# SPDX-License-Identifier: Apache-2.0
"""How long the library keeps what it may call, and what it calls it with."""

import gc
import os
import sys
import threading
import time
import unittest
import weakref
from collections.abc import Callable
from typing import Any

import kesto
from fake_service import PATIENCE, ServedTest
from kesto import _callbacks


class Callback:
    """A callback that can be watched: an object of which nothing but the library knows."""

    def __init__(self) -> None:
        self.called = threading.Event()

    def __call__(self, _: object) -> None:
        self.called.set()


class Callbacks(ServedTest):
    def tearDown(self) -> None:
        self.doCleanups()
        deadline = time.monotonic() + PATIENCE
        while _callbacks._functions and time.monotonic() < deadline:
            os.sched_yield()  # a client that is freed in a callback of its own ends after it
        self.assertEqual(_callbacks._functions, {})

    def test_a_callback_lives_until_its_answer_and_no_longer(self) -> None:
        service = self.serve(holds=True)
        client = self.client()
        callback = Callback()
        gone, called = weakref.ref(callback), callback.called
        client.create_session(42, callback)
        del callback
        gc.collect()
        service.wait_for_calls(1)
        self.assertIsNotNone(gone())
        service.answer(b"\x83\x01\xf6\xf5")
        self.assertTrue(called.wait(PATIENCE))
        client.flush(PATIENCE)
        client.close()
        self.assertIsNone(gone())

    def test_the_callback_of_a_call_that_is_not_taken_is_released_at_once(self) -> None:
        client = self.client()
        client.__exit__(None, None, None)
        callback = Callback()
        gone, called = weakref.ref(callback), callback.called
        self.assertStatus(kesto.Status.CLOSED, client.create_session, 42, callback)
        del callback
        self.assertIsNone(gone())
        self.assertFalse(called.is_set())

    def test_an_unanswered_call_is_answered_when_the_client_closes(self) -> None:
        service = self.serve(holds=True)
        client = self.client()
        answers: list[kesto.Answer] = []
        client.create_session(42, answers.append)
        service.wait_for_calls(1)
        self.assertStatus(kesto.Status.TIMED_OUT, client.close, 0.01)
        self.assertEqual([(answer.ok, answer.status) for answer in answers], [(False, kesto.Status.CLOSED)])

    def test_the_state_callback_lives_until_its_client_is_closed(self) -> None:
        self.serve()
        callback = Callback()
        gone, called = weakref.ref(callback), callback.called
        client = self.client(state_changed=callback)
        del callback
        self.assertTrue(called.wait(PATIENCE))
        self.assertIsNotNone(gone())
        client.close()
        self.assertIsNone(gone())

    def test_the_state_callback_of_a_client_that_cannot_be_made_is_released(self) -> None:
        self.assertStatus(kesto.Status.INVALID_ARGUMENT, kesto.Client, service_name="a/b", state_changed=Callback())

    def test_callbacks_run_on_one_thread_of_the_client_and_may_call_it_again(self) -> None:
        service = self.serve()
        client = self.client()
        threads: list[int] = []
        refused: list[kesto.Status] = []
        done = threading.Event()

        def second(_: kesto.Answer) -> None:
            threads.append(threading.get_ident())
            waits: list[Callable[[float], None]] = [client.flush, client.close]
            for wait in waits:
                try:
                    wait(1)
                except kesto.Error as error:
                    refused.append(error.status)
            done.set()

        def first(_: kesto.Answer) -> None:
            threads.append(threading.get_ident())
            client.destroy_session(42, second)

        client.create_session(42, first)
        self.assertTrue(done.wait(PATIENCE))
        self.assertEqual(service.wait_for_calls(2), [[1, 42], [8, 42]])
        self.assertEqual(threads[0], threads[1])
        self.assertNotEqual(threads[0], threading.get_ident())
        self.assertEqual(refused, [kesto.Status.WRONG_THREAD, kesto.Status.WRONG_THREAD])
        self.assertEqual(client.state, kesto.State.CONNECTED)

    def test_an_exception_in_a_callback_is_shown_and_the_client_goes_on(self) -> None:
        self.serve()
        client = self.client()
        shown: list[Any] = []
        hook, sys.unraisablehook = sys.unraisablehook, lambda seen: shown.append(str(seen.exc_value))
        try:
            client.create_session(42, lambda answer: 1 // 0)
            client.flush(PATIENCE)
        finally:
            sys.unraisablehook = hook
        self.assertEqual(shown, ["integer division or modulo by zero"])
        answers: list[kesto.Answer] = []
        client.create_session(42, answers.append)
        client.flush(PATIENCE)
        self.assertTrue(answers[0].success)

    def test_a_client_may_go_with_its_last_reference_in_a_callback_of_its_own(self) -> None:
        self.serve()
        gone = threading.Event()
        clients = [kesto.Client(socket_path=self.path)]
        weakref.finalize(clients[0], gone.set)

        def let_it_go(_: kesto.Answer) -> None:
            clients.clear()

        with self.assertWarns(ResourceWarning):
            clients[0].create_session(42, let_it_go)
            self.assertTrue(gone.wait(PATIENCE))

    def test_a_client_in_a_cycle_is_collected_with_its_callbacks(self) -> None:
        self.serve()

        class Player:
            def __init__(self, path: str) -> None:
                self.client = kesto.Client(socket_path=path, state_changed=lambda change: None)
                self.itself = self

        player = Player(self.path)
        gone = weakref.ref(player.client._handle)
        del player
        with self.assertWarns(ResourceWarning):
            gc.collect()
        self.assertIsNone(gone())

    def test_many_threads_call_and_all_are_answered(self) -> None:
        self.serve()
        client = self.client(queue_bytes=1 << 20)
        answers: list[kesto.Answer] = []

        def report() -> None:
            for reporter in range(1, 101):
                client.set_service_type(kesto.ServiceType.TEST, reporter, answers.append)
            client.flush(PATIENCE)

        threads = [threading.Thread(target=report) for _ in range(8)]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        self.assertEqual(len(answers), 800)
        self.assertEqual(len({answer.call for answer in answers}), 800)

    def test_a_forked_child_has_no_client_and_leaves_its_parent_its_own(self) -> None:
        service = self.serve()
        client = self.client()
        playback = kesto.Playback(client, "player", kesto.ServiceType.TEST)
        client.create_session(1)
        child = os.fork()
        if child == 0:  # no assertion reaches the test from here
            statuses = []
            calls: list[Callable[[], None]] = [
                lambda: client.create_session(2), lambda: client.flush(1), playback.start]
            for call in calls:
                try:
                    call()
                except kesto.Error as error:
                    statuses.append(error.status)
            client.close()
            playback.close()
            is_closed = client.state == kesto.State.CLOSED
            os._exit(0 if statuses == [kesto.Status.CLOSED] * 3 and is_closed else 1)
        self.assertEqual(os.waitpid(child, 0)[1], 0)
        client.create_session(3)
        self.assertEqual(service.wait_for_calls(2), [[1, 1], [1, 3]])


if __name__ == "__main__":
    unittest.main()
