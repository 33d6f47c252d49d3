// SPDX-License-Identifier: Apache-2.0
// libkesto for C, playbacks and recordings: a program says what it plays, and the library makes the session and its
// messages, so that the service (kestod) knows how long it played, at which volume, on which device.
//
//     kesto_client *client;
//     if (kesto_client_open(NULL, &client) != KESTO_OK)
//         return;
//     kesto_playback *playback;
//     if (kesto_playback_create(client, "org.example.player", KESTO_SERVICE_LONG_FORM_AUDIO, &playback) != KESTO_OK)
//         return;
//     const kesto_format format = {.encoding = "S16LE", .rate = 44100, .channels = 2};
//     kesto_playback_start(playback, &format, "speaker");
//     kesto_playback_volume(playback, 0.5);
//     kesto_playback_pause(playback);
//     kesto_playback_resume(playback);
//     kesto_playback_stop(playback);
//     kesto_playback_free(playback);
//     kesto_client_close(client, 1000);
//     kesto_client_free(client);
//
// From start to stop is one session, with a random reporter ID of its own; a pause does not end it. A playback may be
// started again, and a program may have many playbacks on one client.
//
// Threads and real time: every function but create and free may be called from any thread, also from a real-time audio
// thread. It takes the time, puts a small record into the client's queue and returns: no lock, no allocation, no wait.
// Like `kesto_client_send` it makes no system call while a session of the client is started; outside of that, a call
// may wake the client's thread with one write to an event descriptor. The client's thread follows the state of each
// playback and makes the messages. Calls take effect in the order in which they enter the queue.
//
// Lost connections: with `reconnect`, calls are taken while the client is disconnected. When it is connected again, the
// library makes a new session for each started playback, and reports one that plays with its whole state and the time
// since which that state has not changed. Without `reconnect` the calls return KESTO_NOT_CONNECTED.
//
// Each function but create and free returns KESTO_OK if the call was taken; KESTO_QUEUE_FULL if the queue has no room
// for it (the last eighth of the queue is kept for start, pause, resume and stop); KESTO_NOT_CONNECTED; KESTO_CLOSED if
// the client is closed or freed or the playback is null; KESTO_INVALID_ARGUMENT. Calls that are not taken are counted
// by `kesto_client_statistics` like messages that are not taken, and the messages that the library makes like messages
// that were sent. `kesto_client_flush` and `kesto_client_close` wait for the calls and for these messages.
#ifndef KESTO_PLAYBACK_H
#define KESTO_PLAYBACK_H

#include "kesto.h"

#ifdef __cplusplus
extern "C" {
#endif

// A stream's format. Reported as text, such as "S16LE/44100/2", and the channels also as a number.
typedef struct kesto_format {
    const char* encoding; // of the samples, such as "S16LE", or of the coded sound; cut at 255 bytes
    uint32_t rate; // samples of a channel in a second; 0: left out
    uint32_t channels; // 0: left out
} kesto_format;

// Longer texts are cut between two characters. Bytes that are not UTF-8 are reported as "?".
#define KESTO_LONGEST_APPLICATION 255
#define KESTO_LONGEST_ENCODING 255
#define KESTO_LONGEST_DEVICE 1024

// ---- Playing ----

typedef struct kesto_playback kesto_playback;

// Makes a playback. `application` names the program for which it plays, such as "org.example.player"; cut at 255 bytes.
// Nothing is reported before the start. KESTO_INVALID_ARGUMENT if the application is null or empty; KESTO_CLOSED if the
// client is null; KESTO_OUT_OF_MEMORY, also beyond 1024 streams of a client, which counts those that were freed and
// whose calls a hanging service has not taken yet. On failure `*playback` is null. Not for real-time threads.
KESTO_API kesto_status kesto_playback_create(kesto_client* client, const char* application,
                                             kesto_service_type service_type, kesto_playback** playback);

// Begins a session and its first run. A null format or device is the one of the last call that gave one, or unknown. A
// start without a stop in between ends the earlier session first.
KESTO_API kesto_status kesto_playback_start(kesto_playback* playback, const kesto_format* format, const char* device);

// The volume that the listener has set, from 0 to 1; more counts as 1. The reported volume is rounded to four decimals.
// Until the first call it is 1, the volume of a player that leaves the sound as it is. A volume stays from one start to
// the next. NaN or a negative number: KESTO_INVALID_ARGUMENT. Not for fades: each
// volume is a message.
KESTO_API kesto_status kesto_playback_volume(kesto_playback* playback, double volume);
// While muted, the volume counts as 0. Unmuting restores it.
KESTO_API kesto_status kesto_playback_mute(kesto_playback* playback, bool muted);
// The device, or several joined with ","; cut at 1024 bytes. Null or empty: "none".
KESTO_API kesto_status kesto_playback_route(kesto_playback* playback, const char* device);
// Null, or a format without an encoding: KESTO_INVALID_ARGUMENT.
KESTO_API kesto_status kesto_playback_format(kesto_playback* playback, const kesto_format* format);

// Ends the run, not the session: what follows is not played time.
KESTO_API kesto_status kesto_playback_pause(kesto_playback* playback);
// Begins the next run. Without a pause it has no effect.
KESTO_API kesto_status kesto_playback_resume(kesto_playback* playback);

// The sound had gaps: so many cycles were missed, within so many seconds (NaN or a negative number:
// KESTO_INVALID_ARGUMENT). Has an effect between start and stop.
KESTO_API kesto_status kesto_playback_underrun(kesto_playback* playback, uint64_t cycles, double seconds);

// Ends the session. Without a start it has no effect.
KESTO_API kesto_status kesto_playback_stop(kesto_playback* playback);

// Stops the playback if it is started, and frees it. No other thread may use it any more. The client may have been
// freed before, or be freed later. Null is allowed. Not for real-time threads. In a forked child it only leaves the
// parent's playback alone.
KESTO_API void kesto_playback_free(kesto_playback* playback);

// ---- Recording: the same for a stream from a device ----

typedef struct kesto_recording kesto_recording;

KESTO_API kesto_status kesto_recording_create(kesto_client* client, const char* application,
                                              kesto_service_type service_type, kesto_recording** recording);
KESTO_API kesto_status kesto_recording_start(kesto_recording* recording, const kesto_format* format,
                                             const char* device);
KESTO_API kesto_status kesto_recording_volume(kesto_recording* recording, double volume);
KESTO_API kesto_status kesto_recording_mute(kesto_recording* recording, bool muted);
KESTO_API kesto_status kesto_recording_route(kesto_recording* recording, const char* device);
KESTO_API kesto_status kesto_recording_format(kesto_recording* recording, const kesto_format* format);
KESTO_API kesto_status kesto_recording_pause(kesto_recording* recording);
KESTO_API kesto_status kesto_recording_resume(kesto_recording* recording);
// So many cycles of recorded sound were lost, within so many seconds.
KESTO_API kesto_status kesto_recording_overrun(kesto_recording* recording, uint64_t cycles, double seconds);
KESTO_API kesto_status kesto_recording_stop(kesto_recording* recording);
KESTO_API void kesto_recording_free(kesto_recording* recording);

#ifdef __cplusplus
}
#endif

#endif
