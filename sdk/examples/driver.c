// SPDX-License-Identifier: Apache-2.0
// A tiny driver helper that publishes a mixer's statistics: how many cycles were late, how long cycles take, and
// whether it runs. The service reports at the end of each session how these changed.
//
//     cc driver.c $(pkg-config --cflags --libs kesto) -o driver && ./driver
//
// It does not mix: where a real mixer would have a callback from its device, it only counts.
#include <kesto/channels.h>

#include <stdio.h>
#include <stdlib.h>

enum { IDLE, RUNNING };

typedef struct Mixer {
    kesto_channel* late;
    kesto_channel* duration;
    kesto_channel* state;
} Mixer;

static kesto_status createChannels(Mixer* mixer, kesto_publisher* publisher)
{
    static const int64_t bounds[] = {0, 100, 1000, 10000};
    static const char* const states[] = {"Idle", "Running"};
    const kesto_channel_name late = {.driver = "mixer", .group = "Tx", .channel = "late cycles"};
    const kesto_channel_name duration = {.driver = "mixer", .group = "Tx", .channel = "cycle time"};
    const kesto_channel_name state = {.driver = "mixer", .group = "Speaker", .channel = "state"};
    kesto_status status = kesto_channel_create_simple(publisher, &late, &mixer->late);
    if (status == KESTO_OK)
        status = kesto_channel_create_histogram(publisher, &duration, "us", bounds, 4, &mixer->duration);
    if (status == KESTO_OK)
        status = kesto_channel_create_state(publisher, &state, states, 2, IDLE, &mixer->state);
    return status;
}

// A real helper does this in its real-time thread: no lock, no allocation, no wait.
static void finishCycle(Mixer* mixer, int64_t microseconds)
{
    kesto_channel_record(mixer->duration, microseconds);
    if (microseconds > 1000)
        kesto_channel_add(mixer->late, 1);
}

int main(void)
{
    kesto_publisher* publisher = NULL;
    Mixer mixer = {0};
    kesto_status status = kesto_publisher_open(NULL, &publisher);
    if (status == KESTO_OK)
        status = createChannels(&mixer, publisher);
    if (status != KESTO_OK) {
        fprintf(stderr, "driver: %s\n", kesto_error_text(status));
        kesto_publisher_free(publisher);
        return EXIT_FAILURE;
    }

    kesto_channel_enter(mixer.state, RUNNING);
    for (int64_t cycle = 0; cycle < 100; ++cycle)
        finishCycle(&mixer, cycle * 20);
    status = kesto_publisher_flush(publisher); // a real helper leaves this to the publisher's thread

    puts(status == KESTO_OK ? "published; press return to take it away" : kesto_error_text(status));
    fflush(stdout);
    getchar();
    kesto_publisher_free(publisher);
    return status == KESTO_OK ? EXIT_SUCCESS : EXIT_FAILURE;
}
