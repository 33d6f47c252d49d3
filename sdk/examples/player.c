// A tiny player that reports what it plays: one session, from its creation to its end.
//
//     cc player.c $(pkg-config --cflags --libs kesto) -o player && ./player
//
// It does not play: where a real player would start its output, it only sends "Playback", "Start", and so on.
#include <kesto/kesto.h>

#include <stdio.h>
#include <stdlib.h>
#include <threads.h>
#include <time.h>

enum { REPORTER = 4711 }; // a real player takes a random number, which is unique in the whole system

// Called on the client's thread.
static void stateChanged(void* user, const kesto_state_change* change)
{
    (void)user;
    if (change->state == KESTO_STATE_DISCONNECTED)
        fprintf(stderr, "player: %s (%s)\n", kesto_error_text(change->reason), change->socket_path);
}

// Called on the client's thread for each answer to the call that got it as callback.
static void sessionEnded(void* user, const kesto_answer* answer)
{
    (void)user;
    if (answer->error_domain != NULL)
        fprintf(stderr, "player: %s error %lld\n", answer->error_domain, (long long)answer->error_code);
    else
        puts("the session's run has ended");
}

// A real player does this in its audio thread: no lock, no allocation, no system call.
static void report(kesto_client* client, kesto_message* message, bool running, kesto_event_type type)
{
    const kesto_reporter reporter = REPORTER;
    kesto_message_clear(message);
    kesto_message_add_bool(message, "session_output_running", running);
    kesto_message_add_double(message, "PomoSessionVolume", 0.8);
    kesto_message_begin_dictionary(message, "session_selected_format");
    kesto_message_add_int64(message, "mChannelsPerFrame", 2);
    kesto_message_end(message);
    kesto_client_send(client, message, KESTO_CATEGORY_PLAYBACK, type, &reporter, 1, NULL, NULL, NULL);
}

int main(void)
{
    const kesto_options options = {.size = sizeof options, .state_changed = stateChanged};
    kesto_client* client = NULL;
    kesto_message* message = kesto_message_create();
    const kesto_status opened = kesto_client_open(&options, &client);
    if (opened != KESTO_OK || message == NULL) {
        fprintf(stderr, "player: %s\n", kesto_error_text(opened));
        kesto_message_free(message);
        return EXIT_FAILURE;
    }

    kesto_message_add_string(message, "HostApplicationDisplayID", "org.example.player");
    kesto_client_create_session(client, REPORTER, NULL, NULL, NULL);
    kesto_client_set_service_type(client, KESTO_SERVICE_LONG_FORM_AUDIO, REPORTER, NULL, NULL, NULL);
    kesto_client_set_configuration(client, message, REPORTER, NULL, NULL, NULL);
    kesto_client_start_session(client, REPORTER, sessionEnded, NULL, NULL);

    report(client, message, true, KESTO_EVENT_START);
    thrd_sleep(&(struct timespec){.tv_nsec = 100 * 1000 * 1000}, NULL); // the music
    report(client, message, false, KESTO_EVENT_STOP);

    kesto_client_stop_session(client, REPORTER, NULL, NULL, NULL);
    kesto_client_destroy_session(client, REPORTER, NULL, NULL, NULL);
    const kesto_status closed = kesto_client_close(client, 5000);

    kesto_statistics statistics;
    kesto_client_statistics(client, &statistics, sizeof statistics);
    printf("%llu messages answered, %llu lost\n", (unsigned long long)statistics.answered,
           (unsigned long long)statistics.lost);

    kesto_client_free(client);
    kesto_message_free(message);
    return closed == KESTO_OK ? EXIT_SUCCESS : EXIT_FAILURE;
}
