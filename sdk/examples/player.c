// SPDX-License-Identifier: Apache-2.0
// A tiny player that reports what it plays: how long, at which volume, on which device.
//
//     cc player.c $(pkg-config --cflags --libs kesto) -o player && ./player
//
// It does not play: where a real player would play, it sleeps.
#include <kesto/playback.h>

#include <stdio.h>
#include <stdlib.h>
#include <threads.h>
#include <time.h>

static void play(int seconds)
{
    thrd_sleep(&(struct timespec){.tv_sec = seconds}, NULL);
}

int main(void)
{
    kesto_client* client = NULL;
    kesto_status status = kesto_client_open(NULL, &client); // connects in the background
    kesto_playback* playback = NULL;
    if (status == KESTO_OK)
        status = kesto_playback_create(client, "org.example.player", KESTO_SERVICE_LONG_FORM_AUDIO, &playback);
    if (status != KESTO_OK) {
        fprintf(stderr, "player: %s\n", kesto_error_text(status));
        kesto_client_free(client);
        return EXIT_FAILURE;
    }

    // A real player makes these calls in any of its threads, also in its audio thread.
    const kesto_format format = {.encoding = "S16LE", .rate = 44100, .channels = 2};
    kesto_playback_start(playback, &format, "speaker");
    play(2);
    kesto_playback_volume(playback, 0.5);
    play(4);
    kesto_playback_pause(playback);
    play(1); // nothing: a pause
    kesto_playback_resume(playback);
    play(1);
    kesto_playback_route(playback, "headset");
    play(5);
    kesto_playback_stop(playback);

    kesto_playback_free(playback);
    status = kesto_client_close(client, 5000); // waits until the service has it all
    kesto_client_free(client);
    if (status != KESTO_OK)
        fprintf(stderr, "player: not all was reported: %s\n", kesto_error_text(status));
    return status == KESTO_OK ? EXIT_SUCCESS : EXIT_FAILURE;
}
