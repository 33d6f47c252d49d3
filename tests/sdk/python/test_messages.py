# SPDX-License-Identifier: Apache-2.0
"""Every kind of value, as the service gets it."""

import collections
import unittest
from collections.abc import Sequence

import kesto
from fake_service import ServedTest


class Messages(ServedTest):
    def setUp(self) -> None:
        super().setUp()
        self.service = self.serve()
        self.sender = self.client(stamp=False)

    def received(self, message: kesto.Message) -> object:
        self.sender.send(message, kesto.Category.GENERIC, kesto.EventType.SIMPLE, 42)
        return self.service.wait_for_calls(1)[-1][1]

    def test_values_arrive_as_what_they_are(self) -> None:
        message: kesto.Message = {"none": None, "yes": True, "no": False, "int": -7, "float": 0.5, "whole float": 2.0,
                                  "text": "Grüße", "": "the empty key", "list": [1, "two", [None]],
                                  "dict": {"inner": {"deep": 3}}, "zero": "a\0b"}
        self.assertEqual(repr(self.received(message)), repr(message))

    def test_integers_have_up_to_64_bits(self) -> None:
        message = {"least": -2**63, "signed": 2**63 - 1, "unsigned": 2**64 - 1}
        self.assertEqual(self.received(message), message)

    def test_enumerations_are_numbers(self) -> None:
        self.assertEqual(self.received({"type": kesto.ServiceType.ALARMS}), {"type": 4})

    def test_any_sequence_is_a_list_and_any_mapping_a_dictionary(self) -> None:
        message: kesto.Message = collections.OrderedDict[str, kesto.Value](
            tuple=(1, 2), range=range(2), counts=collections.Counter("aa"))
        self.assertEqual(self.received(message), {"tuple": [1, 2], "range": [0, 1], "counts": {"a": 2}})

    def test_the_time_is_added_unless_the_message_has_it(self) -> None:
        with self.client() as stamping:
            stamping.send({"systemuptime_sec": 5}, kesto.Category.GENERIC, kesto.EventType.SIMPLE, 42)
            stamped = self.service.wait_for_calls(1)[0][1]
        self.assertEqual(stamped["systemuptime_sec"], 5)
        self.assertIsInstance(stamped["kestoreporting_timestamp"], float)

    def test_the_kind_and_the_receivers_go_with_the_message(self) -> None:
        category = kesto.Group.DSP | kesto.Category.PLAYBACK
        kinds: tuple[int | Sequence[int] | None, ...] = (42, [], [1, -2**63], (7,), None)
        for receivers in kinds:
            self.sender.send({}, category, kesto.EventType.START, receivers)
        self.assertEqual(self.service.wait_for_calls(5),
                         [[6, {}, 0x10000004, 1, [42]], [6, {}, 0x10000004, 1, []], [6, {}, 0x10000004, 1, [1, -2**63]],
                          [6, {}, 0x10000004, 1, [7]], [6, {}, 0x10000004, 1, None]])

    def test_what_a_message_cannot_hold_is_named_with_its_place(self) -> None:
        for message, error, text in (
                ({"a": [1, {"b": {2}}]}, TypeError, "the message['a'][1]['b'] is {2}: a value is None, a bool, an int, "
                                                    "a float, a str, a list or a dict"),
                ({"a": b"bytes"}, TypeError, "the message['a'] is b'bytes': a value is"),
                ({"a": {3: 4}}, TypeError, "the message['a'] has the key 3: keys are text"),
                ([1], TypeError, "a message is a dictionary, not [1]"),
                ({"a": 2**64}, OverflowError, "the message['a'] is 18446744073709551616: an integer has 64 bits"),
                ({"a": -2**63 - 1}, OverflowError, "an integer has 64 bits at most")):
            with self.subTest(text), self.assertRaises(error) as raised:
                self.sender.send(message, 1, 1, 42)  # type: ignore[arg-type]
            self.assertIn(text, str(raised.exception))
        self.assertEqual(self.sender.statistics().queued, 0)

    def test_half_a_surrogate_pair_is_not_utf8(self) -> None:
        for message in ({"text": "\ud800"}, {"\ud800": 1}):
            error = self.assertStatus(kesto.Status.INVALID_UTF8, self.sender.send, message, 1, 1, 42)
            self.assertIn("text is not valid UTF-8", str(error))

    def test_nesting_has_a_limit(self) -> None:
        deepest: kesto.Value = 0
        for _ in range(30):
            deepest = [deepest]
        self.assertEqual(self.received({"deep": deepest}), {"deep": deepest})
        self.assertStatus(kesto.Status.TOO_DEEP, self.sender.send, {"deep": [deepest]}, 1, 1, 42)
        endless: list[kesto.Value] = []
        endless.append(endless)
        self.assertStatus(kesto.Status.TOO_DEEP, self.sender.send, {"endless": endless}, 1, 1, 42)

    def test_a_message_fits_into_a_quarter_of_the_queue(self) -> None:
        self.assertStatus(kesto.Status.TOO_LARGE, self.sender.send, {"text": "x" * 65536}, 1, 1, 42)
        self.assertEqual(self.sender.statistics().dropped_unusable, 1)


if __name__ == "__main__":
    unittest.main()
