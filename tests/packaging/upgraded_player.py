#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""A program that plays while the packages are upgraded beneath it: what it sees must be what docs/upgrading.md says.

It says "playing" when it plays, goes on until its input ends, and then compares what it saw and what the service stored
with that page. It is told only the database:

    upgraded_player.py /var/lib/kesto/analytics.sqlite3
"""

import dataclasses
import sqlite3
import sys
import threading
import time

import kesto

PLAYER = "org.example.upgraded-player"
OTHER = "org.example.without-reconnect"
WAIT = 30  # seconds for what takes a moment


def expect(holds: bool, what: str) -> None:
    """Ends the program if something is not as documented."""
    if not holds:
        sys.exit(f"upgraded_player: it does not hold that {what}")


def play(client: kesto.Client, application: str) -> kesto.Playback:
    """Starts a playback, and waits until the service has stored its start."""
    playback = kesto.Playback(client, application, kesto.ServiceType.LONG_FORM_AUDIO)
    playback.start(kesto.Format("S16LE", 44100, 2), "speaker")
    client.flush(WAIT)
    return playback


@dataclasses.dataclass
class Newcomers:
    """Programs that connect one after the other, ask one question, and go."""

    answered: int = 0
    lost: int = 0  # connected, and the service ended before it answered
    refused: int = 0  # could not connect
    is_complete: bool = False  # came until they were told to end

    def keep_coming(self, end: threading.Event) -> None:
        while not end.wait(0.02):
            answers: list[kesto.Answer] = []
            changes: list[kesto.StateChange] = []
            try:
                with kesto.Client(state_changed=changes.append) as client:
                    client.get_all_reporters(answers.append)
                    client.close(WAIT)
            except kesto.Error:
                pass  # the answers and the changes tell
            if any(change.reason == kesto.Status.CONNECT_FAILED for change in changes):
                self.refused += 1
            elif answers and answers[0].ok:
                self.answered += 1
            else:
                self.lost += 1
        self.is_complete = True


def main() -> None:
    reader = sqlite3.connect(f"file:{sys.argv[1]}?mode=ro", uri=True, isolation_level=None)
    changes: list[kesto.StateChange] = []
    newcomers = Newcomers()
    end = threading.Event()
    visits = threading.Thread(target=newcomers.keep_coming, args=[end], daemon=True)

    with kesto.Client(reconnect=True, state_changed=changes.append) as client, kesto.Client() as other:
        before_start = time.time()
        playback = play(client, PLAYER)
        after_start = time.time()
        other_playback = play(other, OTHER)
        stored = set(reader.execute("SELECT id, name, payload FROM events"))
        expect(any(PLAYER in payload for _, _, payload in stored), "what was answered is stored")
        visits.start()
        print("playing", flush=True)

        sys.stdin.read()  # the upgrade

        end.set()
        visits.join(WAIT)
        expect(not visits.is_alive() and newcomers.is_complete, "the newcomers came until the end")
        client.flush(WAIT)
        expect([change.state for change in changes]
               == [kesto.State.CONNECTED, kesto.State.DISCONNECTED, kesto.State.CONNECTING, kesto.State.CONNECTED],
               f"a client with reconnect is disconnected once and connects again, without: {changes}")
        expect(client.statistics().lost == 0, f"its messages are not lost: {client.statistics()}")
        expect(other.state == kesto.State.DISCONNECTED, "a client without reconnect stays disconnected")
        try:
            other_playback.volume(0.5)
        except kesto.Error as error:
            expect(error.status == kesto.Status.NOT_CONNECTED, f"its calls are refused as such, not with {error}")
        expect(other.statistics().dropped_not_connected > 0, "its refused calls are counted")
        expect(newcomers.answered > 0 and newcomers.lost <= 1 and newcomers.refused == 0,
               f"who connects meanwhile waits, and is served: {newcomers}")
        before_stop = time.time()
        playback.stop()
        after_stop = time.time()

    expect(stored <= set(reader.execute("SELECT id, name, payload FROM events")),
           "an open reader goes on, and what was stored stays")
    stretches = list(reader.execute(
        "SELECT s.seconds, s.ending, e.application FROM stretches s JOIN sessions e ON e.id = s.session ORDER BY s.id"))
    played = [(seconds, ending) for seconds, ending, application in stretches if application == PLAYER]
    expect([ending for _, ending in played] == ["service-ended", "stopped"],
           f"a playback goes on with a second session: {stretches}")
    total = sum(seconds for seconds, _ in played)
    expect(before_stop - after_start <= total <= after_stop - before_start,
           f"no time is lost or counts twice: {total} s of {before_stop - after_start} s")
    expect([ending for _, ending, application in stretches if application == OTHER] == ["service-ended"],
           f"a session without reconnect ends with the service: {stretches}")
    print(f"the playback of {total:.1f} s lost nothing, and {newcomers.answered} newcomers were served meanwhile")


main()
