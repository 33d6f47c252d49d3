#!/usr/bin/env python3
# SPDX-License-Identifier: Apache-2.0
"""Plays with aplay, and reports what it plays: format, device, gaps, start and stop.

    python3 aplay.py music.wav
    python3 aplay.py -D plughw:1 --rate 48000 noise.raw

All arguments go to aplay. With -v aplay prints the format of the sound and the sound card when it begins to play, and
each underrun; this program reads that, and passes it on. It ends with the status of aplay.
"""

import os
import re
import signal
import subprocess
import sys
from collections.abc import Iterable

import kesto

SETUP = re.compile(r"  (format|channels|rate) +: (\w+)$")
CARD = re.compile(r"Hardware PCM card \d+ '(.+)' device \d+")
UNDERRUN = re.compile(r"underrun!!! \(at least ([\d.]+) ms long\)")


def report(lines: Iterable[str], playback: kesto.Playback) -> None:
    """Reports what aplay says, until it says no more."""
    setup: dict[str, str] = {}  # of the file that it plays; lines of further conversions follow, and do not count
    for line in lines:
        if line.startswith("Playing "):
            setup = {}
        elif match := SETUP.match(line):
            if match[1] not in setup:
                setup[match[1]] = match[2]
                if match[1] == "rate":  # the last of the three
                    encoding = setup["format"].replace("_", "")
                    playback.start(kesto.Format(encoding, int(setup["rate"]), int(setup["channels"])))
        elif match := CARD.search(line):
            playback.route(match[1])  # before the start, or immediately after it
        elif match := UNDERRUN.search(line):
            playback.underrun(1, float(match[1]) / 1000)
        sys.stderr.write(line)
    playback.stop()


def main() -> int:
    for number in (signal.SIGINT, signal.SIGTERM):
        signal.signal(number, lambda number, frame: sys.exit(128 + number))
    with (kesto.Client(reconnect=True) as client,  # plays on if the service is away
          kesto.Playback(client, "aplay", kesto.ServiceType.LONG_FORM_AUDIO) as playback,
          subprocess.Popen(["aplay", "-v", *sys.argv[1:]], stderr=subprocess.PIPE, text=True, errors="replace",
                           env={**os.environ, "LC_ALL": "C"}) as player):
        assert player.stderr is not None
        try:
            report(player.stderr, playback)
        except SystemExit:
            player.terminate()
            raise
        status = player.wait()
    return status if status >= 0 else 128 - status


if __name__ == "__main__":
    sys.exit(main())
