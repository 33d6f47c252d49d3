// SPDX-License-Identifier: Apache-2.0
// A program that makes its session and its messages itself, with keys of its own beside those that the service uses.
// Programs that only play or record have less to do: see player.c.
//
//     cc session.c $(pkg-config --cflags --libs kesto) -o session && ./session
//
// It does not play: where a real program would play, it sleeps.
#include <kesto/kesto.h>

#include <stdio.h>
#include <stdlib.h>
#include <threads.h>
#include <time.h>

// Called on the client's thread for each answer to the call that got it as callback.
static void sessionEnded(void* user, const kesto_answer* answer)
{
    (void)user;
    if (answer->error_domain != NULL)
        fprintf(stderr, "session: %s error %lld\n", answer->error_domain, (long long)answer->error_code);
    else
        puts("the session's run has ended");
}

// A real program may do this in its audio thread: no lock, no allocation, no system call. The library adds the time.
static void report(kesto_client* client, kesto_message* message, kesto_reporter reporter, bool running, int run)
{
    kesto_message_clear(message);
    kesto_message_add_bool(message, "session_output_running", running);
    kesto_message_add_double(message, "PomoSessionVolume", 0.8);
    kesto_message_add_string(message, "session_selected_format", "S16LE/44100/2");
    kesto_message_add_int64(message, "mChannelsPerFrame", 2);
    kesto_message_add_string(message, "active_devices", "speaker,headset");
    kesto_message_add_int64(message, "session_run", run); // else a second Start repeats the first, and is dropped
    kesto_message_add_string(message, "equalizer", "loud"); // a key of its own
    kesto_client_send(client, message, KESTO_CATEGORY_PLAYBACK, running ? KESTO_EVENT_START : KESTO_EVENT_STOP,
                      &reporter, 1, NULL, NULL, NULL);
}

int main(void)
{
    kesto_client* client = NULL;
    kesto_message* message = kesto_message_create();
    const kesto_status opened = kesto_client_open(NULL, &client);
    if (opened != KESTO_OK || message == NULL) {
        fprintf(stderr, "session: %s\n", kesto_error_text(opened));
        kesto_message_free(message);
        return EXIT_FAILURE;
    }

    struct timespec now;
    timespec_get(&now, TIME_UTC);
    const kesto_reporter reporter = 1 + now.tv_nsec; // better random: it should be unique in the whole system
    kesto_message_add_string(message, "HostApplicationDisplayID", "org.example.session");
    kesto_client_create_session(client, reporter, NULL, NULL, NULL);
    kesto_client_set_service_type(client, KESTO_SERVICE_NON_LONG_FORM_AUDIO, reporter, NULL, NULL, NULL);
    kesto_client_set_configuration(client, message, reporter, NULL, NULL, NULL);
    kesto_client_start_session(client, reporter, sessionEnded, NULL, NULL);

    for (int run = 1; run <= 2; ++run) {
        report(client, message, reporter, true, run);
        thrd_sleep(&(struct timespec){.tv_sec = 2 * run}, NULL); // the music
        report(client, message, reporter, false, run);
        thrd_sleep(&(struct timespec){.tv_sec = 1}, NULL);
    }

    kesto_client_stop_session(client, reporter, NULL, NULL, NULL);
    kesto_client_destroy_session(client, reporter, NULL, NULL, NULL);
    const kesto_status closed = kesto_client_close(client, 5000);

    kesto_statistics statistics;
    kesto_client_statistics(client, &statistics, sizeof statistics);
    printf("%llu messages answered, %llu lost\n", (unsigned long long)statistics.answered,
           (unsigned long long)statistics.lost);

    kesto_client_free(client);
    kesto_message_free(message);
    return closed == KESTO_OK ? EXIT_SUCCESS : EXIT_FAILURE;
}
