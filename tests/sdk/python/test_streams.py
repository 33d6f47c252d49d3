# SPDX-License-Identifier: Apache-2.0
"""Playbacks and recordings: their calls, as the messages that the service gets, and their end."""

import gc
import math
import unittest
import weakref

import kesto
from fake_service import PATIENCE, FakeService, ServedTest


class Streams(ServedTest):
    def messages(self, service: FakeService, count: int) -> list[str]:
        """The messages, without the times, such as "4.1 session_run=1" (category, type, entries)."""
        calls = service.wait_for_calls(count)
        return [f"{category}.{event_type} " + " ".join(
                    f"{key}={value}" for key, value in sorted(message.items())
                    if key not in ("kestoreporting_timestamp", "systemuptime_sec", "session_duration"))
                for message, category, event_type, _ in (call[1:] for call in calls if call[0] == 6)]

    def test_a_playback_makes_a_session_and_its_messages(self) -> None:
        service = self.serve()
        client = self.client()
        with kesto.Playback(client, "org.example.player", kesto.ServiceType.LONG_FORM_AUDIO) as playback:
            playback.volume(0.5)
            playback.start(kesto.Format("S16LE", 44100, 2), "speaker")
            playback.mute(True)
            playback.mute(False)
            playback.route("headset")
            playback.format(kesto.Format("F32LE", channels=1))
            playback.underrun(3, 0.25)
            playback.pause()
            playback.resume()
            playback.stop()
        client.flush(PATIENCE)
        calls = service.wait_for_calls(16)
        self.assertEqual([call[0] for call in calls], [1, 2, 4, 5] + [6] * 10 + [7, 8])
        self.assertEqual((calls[1][1], calls[2][1]), (7, {"HostApplicationDisplayID": "org.example.player"}))
        state = "PomoSessionVolume={} active_devices={} mChannelsPerFrame={}"
        self.assertEqual(self.messages(service, 16), [
            f"4.1 {state.format(0.5, 'speaker', 2)} session_output_running=True session_run=1 "
            "session_selected_format=S16LE/44100/2",
            "14.18 PomoSessionVolume=0.0",
            "14.18 PomoSessionVolume=0.5",
            "10.18 active_devices=headset",
            "8.18 mChannelsPerFrame=1 session_selected_format=F32LE/1",
            "11.7 active_devices=headset issue=underrun issue_duration=0.25 late_cycles=3",
            f"4.2 {state.format(0.5, 'headset', 1)} session_output_running=False session_run=1 "
            "session_selected_format=F32LE/1",
            f"4.1 {state.format(0.5, 'headset', 1)} session_output_running=True session_run=2 "
            "session_selected_format=F32LE/1",
            f"4.2 {state.format(0.5, 'headset', 1)} session_output_running=False session_run=2 "
            "session_selected_format=F32LE/1",
            "4.4 "])

    def test_a_recording_does_the_same_for_a_device(self) -> None:
        service = self.serve()
        client = self.client()
        with kesto.Recording(client, "org.example.recorder", kesto.ServiceType.TELEPHONY) as recording:
            recording.start()
            recording.route(None)
            recording.overrun(2, 1)
            recording.stop()
        client.flush(PATIENCE)
        self.assertEqual(self.messages(service, 11), [
            "2.1 PomoSessionVolume=1.0 session_input_running=True session_run=1",
            "10.18 active_devices=none",
            "11.7 active_devices=none issue=overrun issue_duration=1.0 late_cycles=2",
            "2.2 PomoSessionVolume=1.0 active_devices=none session_input_running=False session_run=1",
            "2.4 "])

    def test_closing_stops_what_plays(self) -> None:
        service = self.serve()
        client = self.client()
        with kesto.Playback(client, "player", kesto.ServiceType.TEST) as playback:
            playback.start()
        playback.close()
        for call in (playback.stop, playback.pause, playback.start):
            self.assertStatus(kesto.Status.CLOSED, call)
        client.flush(PATIENCE)
        self.assertEqual([call[0] for call in service.wait_for_calls(9)], [1, 2, 4, 5, 6, 6, 6, 7, 8])

    def test_a_forgotten_playback_stops(self) -> None:
        service = self.serve()
        client = self.client()
        kesto.Playback(client, "player", kesto.ServiceType.TEST).start()
        client.flush(PATIENCE)
        self.assertEqual([call[0] for call in service.wait_for_calls(9)], [1, 2, 4, 5, 6, 6, 6, 7, 8])

    def test_a_playback_keeps_its_client(self) -> None:
        self.serve()
        client = self.client
        playback = kesto.Playback(kesto.Client(socket_path=self.path), "player", kesto.ServiceType.TEST)
        gc.collect()
        playback.start()
        gone = weakref.ref(playback._client)
        playback._client.close()
        self.assertStatus(kesto.Status.CLOSED, playback.stop)
        del playback, client
        self.assertIsNone(gone())

    def test_what_is_not_allowed_is_an_error(self) -> None:
        self.serve()
        client = self.client()
        self.assertStatus(kesto.Status.INVALID_ARGUMENT, kesto.Playback, client, "", kesto.ServiceType.TEST)
        playback = kesto.Playback(client, "player", kesto.ServiceType.TEST)
        error = self.assertStatus(kesto.Status.INVALID_ARGUMENT, playback.volume, -1)
        self.assertEqual(str(error), "volume of a playback: an argument is invalid")
        self.assertStatus(kesto.Status.INVALID_ARGUMENT, playback.volume, math.nan)
        self.assertStatus(kesto.Status.INVALID_ARGUMENT, playback.underrun, 1, -1)
        self.assertRaises(ValueError, playback.underrun, -1, 1)
        self.assertRaises(ValueError, playback.start, device="a\0b")
        self.assertRaises(ValueError, playback.format, kesto.Format("S16LE", -1))
        self.assertRaises(ValueError, playback.volume, "loud")
        self.assertRaises(ValueError, kesto.Playback, client, "player", 65536)
        self.assertEqual(client.statistics().dropped_unusable, 3)

    def test_text_that_is_not_utf8_is_reported_with_a_question_mark(self) -> None:
        service = self.serve()
        client = self.client()
        playback = kesto.Playback(client, "player", kesto.ServiceType.TEST)
        playback.start(device="head\udcffset")
        client.flush(PATIENCE)
        self.assertRegex(self.messages(service, 5)[0], r"active_devices=head\?+set")

    def test_a_closed_client_has_no_playbacks(self) -> None:
        client = self.client()
        client.__exit__(None, None, None)
        self.assertStatus(kesto.Status.CLOSED, kesto.Playback, client, "player", kesto.ServiceType.TEST)


if __name__ == "__main__":
    unittest.main()
