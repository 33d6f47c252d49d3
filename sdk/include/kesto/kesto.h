// SPDX-License-Identifier: Apache-2.0
// libkesto for C: reports a program's use of audio to the Kesto reporting service (kestod).
//
// A client is one connection. Everything on it is asynchronous: a call puts work into the client's queue and
// returns, the client's own thread sends it, and a callback gets the answer. `kesto_client_send` goes one step
// further: it is made for real-time audio threads, takes well under a microsecond, takes no lock, allocates
// nothing, and makes no system call (see there for the one exception).
//
//     kesto_client *client;
//     if (kesto_client_open(NULL, &client) != KESTO_OK)
//         return;
//     kesto_client_create_session(client, 42, NULL, NULL, NULL);
//     kesto_client_start_session(client, 42, NULL, NULL, NULL);
//     ...
//     kesto_client_close(client, 1000);
//     kesto_client_free(client);
//
// What a program plays or records is reported with less: see playback.h.
//
// Threads: every function that takes a client may be called from any thread at any time until
// `kesto_client_free`; a message is used by one thread at a time. All callbacks of a client run on its own
// thread, one after the other and without any lock, so that they may call the client again; while one runs, the
// client sends nothing. The client's thread blocks all signals, and no function of the library raises one.
//
// Fork: a client belongs to the process that opened it. In a child, the only function that may be called with it
// is `kesto_client_free`, which then leaves the parent's connection alone and calls no callback. Descriptors are
// closed by exec.
//
// The library has no global state: clients are independent. No C++ exception leaves the library.
#ifndef KESTO_KESTO_H
#define KESTO_KESTO_H

#include <stdbool.h>
#include <stddef.h>
#include <stdint.h>

#if defined(__GNUC__)
#define KESTO_API __attribute__((visibility("default")))
#else
#define KESTO_API
#endif

#ifdef __cplusplus
extern "C" {
#endif

// ---- Status ----

// Later versions may add numbers to every enumeration. C accepts any number; C++ does if the type of the numbers is
// named.
#ifdef __cplusplus
#define KESTO_ANY_INT : int
#else
#define KESTO_ANY_INT
#endif

// The result of a call of the library. The numbers never change; new ones may be added.
typedef enum kesto_status KESTO_ANY_INT {
    KESTO_OK = 0,
    KESTO_INVALID_ARGUMENT = 1, // an argument that is not allowed, such as a null message
    KESTO_OUT_OF_MEMORY = 2,
    KESTO_SYSTEM_ERROR = 3, // the system had no descriptor, no thread or no file: `errno` says why
    KESTO_QUEUE_FULL = 4, // the client's queue has no room; the call was not taken
    KESTO_NOT_CONNECTED = 5, // no connection exists or is being made; the call was not taken
    KESTO_CLOSED = 6, // the client has been closed
    KESTO_TIMED_OUT = 7,
    KESTO_WRONG_THREAD = 8, // a function that waits was called from a callback of the same client
    KESTO_INVALID_UTF8 = 9, // a key or a text is not UTF-8
    KESTO_TOO_LARGE = 10, // too large for a message, or for the client's queue
    KESTO_TOO_DEEP = 11, // more than KESTO_DEEPEST_NESTING nested containers
    KESTO_MISNESTED = 12, // a value without a key, a key without a value, an end too many or too few
    KESTO_CONNECTION_LOST = 13, // the connection ended, or could not be made, before the call was answered
    KESTO_CONNECT_FAILED = 14, // no service listens at the socket, or it cannot be reached
    KESTO_PROTOCOL_VIOLATION = 15, // the peer broke the protocol
    KESTO_SESSION_ENDED = 16 // the session was destroyed or replaced: the service will not answer its start
} kesto_status;

// The text of the status, such as "the queue is full". Never null; a constant.
KESTO_API const char* kesto_error_text(kesto_status status);

// The version of the library that is running, such as "0.1.0". A constant.
KESTO_API const char* kesto_version(void);

// ---- Vocabulary ----

// Identifies a session. The program chooses it; it should be unique in the whole system, so choose a random number. 0
// stands for no session.
typedef int64_t kesto_reporter;

// The kind of service that a session stands for: one of the constants below.
typedef uint16_t kesto_service_type;
enum {
    KESTO_SERVICE_GENERIC = 0,
    KESTO_SERVICE_MERLA = 1,
    KESTO_SERVICE_TELEPHONY = 2,
    KESTO_SERVICE_HAPTICS = 3,
    KESTO_SERVICE_ALARMS = 4,
    KESTO_SERVICE_STANDALONE = 5,
    KESTO_SERVICE_SOUND_AUTO_CONFIG = 6,
    KESTO_SERVICE_LONG_FORM_AUDIO = 7,
    KESTO_SERVICE_NON_LONG_FORM_AUDIO = 8,
    KESTO_SERVICE_AUDIO_DEVICE_USAGE = 9,
    KESTO_SERVICE_ALERTS = 10,
    KESTO_SERVICE_TEST = 11,
    KESTO_SERVICE_API_USAGE = 12,
    KESTO_SERVICE_SYSTEM_SOUNDS = 13,
    KESTO_SERVICE_UNKNOWN = 65535 // also the answer for an unknown session
};

// The subject of a message: one of the constants below, with or without a group (KESTO_GROUP_DSP |
// KESTO_CATEGORY_PLAYBACK).
typedef uint32_t kesto_category;
enum {
    KESTO_CATEGORY_GENERIC = 1,
    KESTO_CATEGORY_RECORD = 2,
    KESTO_CATEGORY_INPUT = 3,
    KESTO_CATEGORY_PLAYBACK = 4,
    KESTO_CATEGORY_OUTPUT = 5,
    KESTO_CATEGORY_PLAYBACK_AND_RECORD = 6,
    KESTO_CATEGORY_IO = 7,
    KESTO_CATEGORY_SETUP = 8,
    KESTO_CATEGORY_CLIENT_REQUEST = 9,
    KESTO_CATEGORY_ROUTE_CHANGE = 10,
    KESTO_CATEGORY_ERROR = 11,
    KESTO_CATEGORY_CAVLET = 12,
    KESTO_CATEGORY_PERFORMANCE = 13,
    KESTO_CATEGORY_VOLUME = 14,
    KESTO_CATEGORY_HEARING_HEALTH = 15
};
#define KESTO_GROUP_MIDI UINT32_C(0x04000000)
#define KESTO_GROUP_SESSION UINT32_C(0x08000000)
#define KESTO_GROUP_DSP UINT32_C(0x10000000)
#define KESTO_GROUP_HAL UINT32_C(0x20000000)
#define KESTO_GROUP_ROUTING UINT32_C(0x40000000)
#define KESTO_GROUP_TOOLBOX UINT32_C(0x80000000)

// What happened: one of the constants below.
typedef uint16_t kesto_event_type;
enum {
    KESTO_EVENT_START = 1,
    KESTO_EVENT_STOP = 2,
    KESTO_EVENT_ACTIVATE = 3,
    KESTO_EVENT_DEACTIVATE = 4,
    KESTO_EVENT_SETUP = 5,
    KESTO_EVENT_ERROR = 6,
    KESTO_EVENT_ISSUE_DETECTOR = 7,
    KESTO_EVENT_GIMBO = 8,
    KESTO_EVENT_AUDIO_UNIT_USAGE = 9,
    KESTO_EVENT_MIDI_DRIVER = 10,
    KESTO_EVENT_SUMMARY = 11,
    KESTO_EVENT_HEADPHONE_AUDIO_EXPOSURE = 12,
    KESTO_EVENT_AUDIO_EXPOSURE = 13,
    KESTO_EVENT_LISTENING_ENHANCEMENT = 14,
    KESTO_EVENT_TIVRA = 15,
    KESTO_EVENT_SIMPLE = 16,
    KESTO_EVENT_HISTOGRAM = 17,
    KESTO_EVENT_STATE = 18,
    KESTO_EVENT_UNKNOWN = 65535
};

// ---- Messages ----

// A dictionary of keys and values, encoded while it is built. It serves as a message or as a session's configuration.
// If a program keeps and clears a message instead of making a new one, the message does not allocate after it has held
// its largest content once.
typedef struct kesto_message kesto_message;

// How deep arrays and dictionaries may nest, not counting the message itself.
#define KESTO_DEEPEST_NESTING 30
// The greatest encoded size of a message's keys and values, in bytes.
#define KESTO_LARGEST_MESSAGE (1024 * 1024 - 1024)

// An empty message, or null if memory is exhausted.
KESTO_API kesto_message* kesto_message_create(void);
// Null is allowed.
KESTO_API void kesto_message_free(kesto_message* message);
// Makes room for so many encoded bytes, so that the message does not allocate up to that size (an entry takes about 10
// bytes and its key and value).
KESTO_API kesto_status kesto_message_reserve(kesto_message* message, size_t bytes);
// Empties the message and forgets its failure. The memory is kept.
KESTO_API void kesto_message_clear(kesto_message* message);

// Each of the following functions adds one entry, in constant time; they allocate only when the room is used up.
//
// Keys and texts are UTF-8 and are copied. Of a repeated key the later value counts. `key` ends with a zero; it is null
// inside an array and right after `kesto_message_key`.
//
// The first failure stays: every later addition returns it and does nothing, `kesto_message_status` returns it, and the
// message cannot be sent until it is cleared. So a program may check once, at the end, or not at all: sending returns
// the failure, too.
KESTO_API kesto_status kesto_message_add_null(kesto_message* message, const char* key);
KESTO_API kesto_status kesto_message_add_bool(kesto_message* message, const char* key, bool value);
KESTO_API kesto_status kesto_message_add_int64(kesto_message* message, const char* key, int64_t value);
KESTO_API kesto_status kesto_message_add_uint64(kesto_message* message, const char* key, uint64_t value);
// NaN and infinity can be sent, but an event that holds one cannot be stored.
KESTO_API kesto_status kesto_message_add_float(kesto_message* message, const char* key, float value);
KESTO_API kesto_status kesto_message_add_double(kesto_message* message, const char* key, double value);
// Text that ends with a zero, and text of a given length in bytes.
KESTO_API kesto_status kesto_message_add_string(kesto_message* message, const char* key, const char* text);
KESTO_API kesto_status kesto_message_add_text(kesto_message* message, const char* key, const char* text, size_t length);

// Begin an array or a dictionary: the next additions go into it, until the matching end.
KESTO_API kesto_status kesto_message_begin_array(kesto_message* message, const char* key);
KESTO_API kesto_status kesto_message_begin_dictionary(kesto_message* message, const char* key);
KESTO_API kesto_status kesto_message_end(kesto_message* message);

// Sets the key, with a given length in bytes, of the next value.
KESTO_API kesto_status kesto_message_key(kesto_message* message, const char* key, size_t length);

// The first failure, or KESTO_MISNESTED while an array or a dictionary has not ended, or KESTO_OK.
KESTO_API kesto_status kesto_message_status(const kesto_message* message);
// The encoded size so far, in bytes.
KESTO_API size_t kesto_message_size(const kesto_message* message);

// ---- Answers ----

// The operation of a call; the numbers are those of the wire.
typedef enum kesto_operation KESTO_ANY_INT {
    KESTO_OPERATION_CREATE_SESSION = 1,
    KESTO_OPERATION_SET_SERVICE_TYPE = 2,
    KESTO_OPERATION_GET_SERVICE_TYPE = 3,
    KESTO_OPERATION_SET_CONFIGURATION = 4,
    KESTO_OPERATION_START_SESSION = 5,
    KESTO_OPERATION_SEND = 6,
    KESTO_OPERATION_STOP_SESSION = 7,
    KESTO_OPERATION_DESTROY_SESSION = 8,
    KESTO_OPERATION_VALIDATE = 9,
    KESTO_OPERATION_GET_ALL_REPORTERS = 10,
    KESTO_OPERATION_KILL_SERVICE = 11
} kesto_operation;

// The domain of errors that the library itself reports; their codes are `kesto_status`.
#define KESTO_ERROR_DOMAIN "com.quarn.kesto.client"
// The domain and code of the one error that the service reports: reporting is disabled on this device.
#define KESTO_SERVICE_ERROR_DOMAIN "com.quarn.audio.reporting"
#define KESTO_SERVICE_ERROR_DISABLED 1

// One answer to one call. Valid during the callback only. Later versions may add fields at the end.
typedef struct kesto_answer {
    uint64_t call; // the number of the call, from 1, in the order in which calls leave the queue
    kesto_operation operation;
    kesto_reporter reporter; // the call's reporter; 0 for calls without one, and for `send`
    const char* error_domain; // null on success; only then the result below is valid
    int64_t error_code;
    bool success; // for operations that answer with a truth value
    kesto_service_type service_type; // for get-service-type and validate; KESTO_SERVICE_UNKNOWN: unknown session
    kesto_reporter valid_reporter; // for validate; 0: unknown session
    const kesto_reporter* reporters; // for get-all-reporters
    size_t reporter_count;
} kesto_answer;

// Called on the client's thread for every answer of a call. Most calls are answered once; get-service-type for reporter
// 0 is answered twice, and start-session twice while a trace runs. If the answer to a taken call cannot come any more,
// the library answers it, once, with an error of KESTO_ERROR_DOMAIN: KESTO_CONNECTION_LOST, KESTO_CLOSED or
// KESTO_SESSION_ENDED.
typedef void (*kesto_answer_callback)(void* user, const kesto_answer* answer);
// Called exactly once for each callback, after its last call: on the client's thread or, if the call is not taken, on
// the caller's thread before the call returns.
typedef void (*kesto_release_callback)(void* user);

// ---- Clients ----

typedef struct kesto_client kesto_client;

typedef enum kesto_state KESTO_ANY_INT {
    KESTO_STATE_CONNECTING = 0, // calls are taken and wait for the connection
    KESTO_STATE_CONNECTED = 1,
    KESTO_STATE_DISCONNECTED = 2, // calls are refused until the next attempt, if any
    KESTO_STATE_CLOSED = 3 // for good, by `kesto_client_close` or `kesto_client_free`
} kesto_state;

// Valid during the callback only. Later versions may add fields at the end.
typedef struct kesto_state_change {
    kesto_state state;
    // Why it is disconnected: KESTO_CONNECT_FAILED, KESTO_CONNECTION_LOST, KESTO_PROTOCOL_VIOLATION or
    // KESTO_OUT_OF_MEMORY; else KESTO_OK.
    kesto_status reason;
    int system_error; // `errno` of that reason if the system gave one, else 0
    uint32_t retry_after_ms; // when disconnected: the time until the next attempt; UINT32_MAX: none will follow
    const char* socket_path; // of the connection, or of the last attempt
} kesto_state_change;

// Called on the client's thread for every change of state. The beginning, KESTO_STATE_CONNECTING, is not reported.
typedef void (*kesto_state_callback)(void* user, const kesto_state_change* change);

// Options of a client. Set `size` to sizeof(kesto_options) and everything else to zero for the defaults:
//     kesto_options options = {.size = sizeof options, .reconnect = true};
typedef struct kesto_options {
    size_t size;
    // The service's socket. Null: $KESTO_SOCKET; without it $XDG_RUNTIME_DIR/kesto/<service name>, and if no service
    // listens there /run/kesto/<service name>. The variables count only where the program runs with its user's own
    // privileges.
    const char* socket_path;
    // A file name. Null: "com.quarn.kesto.reporting".
    const char* service_name;
    // The size of the queue between callers and the client's thread, in bytes, rounded up to a power of two from 4 KiB
    // to 64 MiB. 0: 256 KiB, enough for some 800 messages of ten entries, the times among them. The last eighth is kept
    // for calls other than send, and a message may take a quarter.
    size_t queue_bytes;
    // How many calls the thread sends before it waits for answers; so a slow service lets the queue fill, not the
    // memory. 0: 4096.
    uint32_t unanswered_limit;
    // False: while a session is started, send makes no system call; the thread polls the queue, every 5 ms while
    // messages come, and up to every 100 ms while none do. True: send wakes the thread whenever it sleeps, which costs
    // a system call, and the thread does not poll. True suits programs that report for hours from threads that may make
    // system calls.
    bool wake_on_send;
    // Whether to connect again when a connection ends or cannot be made.
    bool reconnect;
    // The pause before the first new attempt, doubled with each attempt up to the longest; after a successful
    // connection the first pause counts again. 0: 100 ms and 10 s.
    uint32_t first_retry_ms;
    uint32_t longest_retry_ms;
    // May be null. `state_user` is released after the last call, or immediately if the client cannot be opened.
    kesto_state_callback state_changed;
    void* state_user;
    kesto_release_callback state_release;
    // Whether the client asks the service for the descriptors to emit trace events: see trace.h.
    bool trace;
    // False: `kesto_client_send` adds the time to each message that does not have it.
    bool without_stamps;
} kesto_options;

// Makes a client and starts its thread, which begins to connect. Calls are possible immediately and wait for the
// connection. Does not block. `*client` is set before the first callback, which may use it. Null options: the defaults.
// On failure `*client` is null: KESTO_INVALID_ARGUMENT (a service name with a slash, a path longer than a socket's
// address), KESTO_OUT_OF_MEMORY or KESTO_SYSTEM_ERROR (with `errno`).
KESTO_API kesto_status kesto_client_open(const kesto_options* options, kesto_client** client);

// Refuses further calls, stops the playbacks and recordings that are started (playback.h), waits up to `timeout_ms`
// until the taken calls are sent and answered (except starts of sessions), and ends the connection; the service then
// stops the client's sessions. Unanswered calls get KESTO_CLOSED. When it returns, all callbacks have been called and
// released; only a call that another thread makes at the same moment may be left to `kesto_client_free`. A second close
// does nothing. KESTO_TIMED_OUT, KESTO_CONNECTION_LOST or KESTO_NOT_CONNECTED if calls may be unanswered; with 0 it
// does not wait. The client is closed in any case, except in a callback: KESTO_WRONG_THREAD.
KESTO_API kesto_status kesto_client_close(kesto_client* client, uint32_t timeout_ms);

// Closes the client without waiting, if it is not closed yet, and frees it. What was taken is still sent as far as the
// socket takes it at once. No other thread may use it any more. It may be called in a callback of the client: the rest
// is then done after the callback has returned. Null is allowed.
KESTO_API void kesto_client_free(kesto_client* client);

// Waits until all earlier calls of this thread are sent and answered (except starts of sessions, which are answered
// when the sessions end), for at most `timeout_ms`. KESTO_TIMED_OUT; KESTO_CONNECTION_LOST if answers are lost;
// KESTO_NOT_CONNECTED; KESTO_CLOSED; KESTO_WRONG_THREAD.
KESTO_API kesto_status kesto_client_flush(kesto_client* client, uint32_t timeout_ms);

// A null client counts as closed, here and in every other function.
KESTO_API kesto_state kesto_client_state(const kesto_client* client);

// ---- Operations ----
//
// In the order of the wire. Each returns without waiting: KESTO_OK if the call was taken, else the reason. Calls of one
// thread reach the service in their order. The callback may be null. `user` and `release` belong to the callback: see
// `kesto_release_callback`; a null release is allowed.
//
// When a connection ends, all taken and unanswered calls are lost and answered with KESTO_CONNECTION_LOST, and the
// service stops and removes the client's sessions; the library does not send calls again. A client that reconnects
// creates its sessions when its state callback reports KESTO_STATE_CONNECTED: calls in that callback go ahead of all
// waiting calls, so that a message sent while the connection was being made finds its session.

// Makes a session. Answered with success.
KESTO_API kesto_status kesto_client_create_session(kesto_client* client, kesto_reporter reporter,
                                                   kesto_answer_callback callback, void* user,
                                                   kesto_release_callback release);
// Answered with success, even if this client does not have the session; the same holds for the calls below that are
// answered with success.
KESTO_API kesto_status kesto_client_set_service_type(kesto_client* client, kesto_service_type type,
                                                     kesto_reporter reporter, kesto_answer_callback callback,
                                                     void* user, kesto_release_callback release);
// Answered with the service type of any client's session, KESTO_SERVICE_UNKNOWN if it does not exist; for reporter 0
// twice.
KESTO_API kesto_status kesto_client_get_service_type(kesto_client* client, kesto_reporter reporter,
                                                     kesto_answer_callback callback, void* user,
                                                     kesto_release_callback release);
// Merges the entries into the session's configuration. "HostApplicationDisplayID" names the application for which the
// session plays. The caller may reuse the message as soon as this returns. Answered with success.
KESTO_API kesto_status kesto_client_set_configuration(kesto_client* client, const kesto_message* configuration,
                                                      kesto_reporter reporter, kesto_answer_callback callback,
                                                      void* user, kesto_release_callback release);
// Begins a run. Answered with success when the run ends, or immediately if the session does not exist or has started
// already.
KESTO_API kesto_status kesto_client_start_session(kesto_client* client, kesto_reporter reporter,
                                                  kesto_answer_callback callback, void* user,
                                                  kesto_release_callback release);

// Sends a message to the sessions of these reporters, of any client; a null list means all started sessions, an empty
// one none. The caller may reuse the message as soon as this returns. Answered without a result.
//
// The time of the call goes with the message, since the service computes play times from it:
// "kestoreporting_timestamp", a double, the seconds since 1970, and "systemuptime_sec", an integer, the seconds since
// the device started, time asleep included. A key that the message has itself, not counting nested dictionaries, is
// left as it is. `kesto_message_size` does not count them; on the wire they take at most 70 bytes. `without_stamps`
// changes that.
//
// The service does not record a message that repeats the last one of its category and type, and the time does not make
// it another: so give a second Start something new, such as the number of the run.
//
// For real-time threads: no lock, no allocation, no wait. It also makes no system call while a session of this client
// is started. The session counts as started from the return of start until stop, destroy or another create is called or
// the connection is lost. When no session is started and the client's thread sleeps, the first send wakes it with one
// write to an event descriptor; further sends make no system call until all are answered and the thread sleeps again.
// `wake_on_send` changes that.
//
// A message that is not taken is counted by reason: KESTO_QUEUE_FULL, KESTO_NOT_CONNECTED (and KESTO_CLOSED), or
// KESTO_TOO_LARGE and any other failure of the message.
KESTO_API kesto_status kesto_client_send(kesto_client* client, const kesto_message* message, kesto_category category,
                                         kesto_event_type type, const kesto_reporter* reporters, size_t reporter_count,
                                         kesto_answer_callback callback, void* user, kesto_release_callback release);

// Ends a run: the service derives its results from it. Answered with success, after the answer of the start.
KESTO_API kesto_status kesto_client_stop_session(kesto_client* client, kesto_reporter reporter,
                                                 kesto_answer_callback callback, void* user,
                                                 kesto_release_callback release);
// Ends a run, if any, and the session. A start that was not stopped is then answered with KESTO_SESSION_ENDED. Answered
// with success.
KESTO_API kesto_status kesto_client_destroy_session(kesto_client* client, kesto_reporter reporter,
                                                    kesto_answer_callback callback, void* user,
                                                    kesto_release_callback release);
// Answered with the reporter and its service type, for a session of any client; with 0 and KESTO_SERVICE_UNKNOWN if it
// does not exist.
KESTO_API kesto_status kesto_client_validate(kesto_client* client, kesto_reporter reporter,
                                             kesto_answer_callback callback, void* user,
                                             kesto_release_callback release);
// Answered with the reporters of all sessions of all clients.
KESTO_API kesto_status kesto_client_get_all_reporters(kesto_client* client, kesto_answer_callback callback, void* user,
                                                      kesto_release_callback release);
// Ends the service process. The service never answers: KESTO_CONNECTION_LOST shows success.
KESTO_API kesto_status kesto_client_kill_service(kesto_client* client, kesto_answer_callback callback, void* user,
                                                 kesto_release_callback release);

// ---- Counts ----

// Counts of the messages passed to `kesto_client_send`, or made for playbacks and recordings (playback.h), since the
// client was opened. At any time queued = answered + lost + messages on their way.
typedef struct kesto_statistics {
    uint64_t queued; // taken
    uint64_t sent; // passed completely to the connection
    uint64_t answered; // answered by the service
    uint64_t refused; // included in these: answered with an error
    uint64_t lost; // taken, but the connection ended or the client was closed before the answer
    // Not taken, of messages and of calls of playbacks and recordings:
    uint64_t dropped_queue_full;
    uint64_t dropped_not_connected; // or closed
    uint64_t dropped_unusable; // too large, with a failure of its own, or with an invalid argument
    // Of the whole client:
    uint64_t connections; // that were made
    uint64_t unexpected_answers; // to calls that expect none
} kesto_statistics;

// Fills `statistics`; the caller gives its size as sizeof(kesto_statistics). Each count is current; together they are
// exact only while no message is on its way. Never waits: any thread, real-time threads too.
KESTO_API void kesto_client_statistics(const kesto_client* client, kesto_statistics* statistics, size_t size);

#ifdef __cplusplus
}
#endif

#endif
