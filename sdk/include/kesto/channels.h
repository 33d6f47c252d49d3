// libkesto for C, publishing: counters, histograms and states of a driver, for the Kesto reporting service (kestod),
// which tells at the end of each session how they changed over it.
//
// A channel is a value in this process and a file that shows it to others. To change it is to change the value: a few
// nanoseconds, without a lock, an allocation or a wait, from any thread. A thread of the publisher writes the files of
// what has changed, twice a second at most, each at once: a reader sees the old file or the new one.
//
//     kesto_publisher *publisher;
//     if (kesto_publisher_open(NULL, &publisher) != KESTO_OK)
//         return;
//
//     kesto_channel *late;
//     const kesto_channel_name name = {.driver = "mixer", .group = "Tx", .channel = "late cycles"};
//     if (kesto_channel_create_simple(publisher, &name, &late) == KESTO_OK)
//         kesto_channel_add(late, 1);
//     ...
//     kesto_publisher_free(publisher);
//
// The files of a process that was killed are left out by the service, and cleared away by the next publisher that has a
// channel of the same driver.
//
// The service subscribes to groups once, when it starts, and only to those in which there is a channel then: create
// channels early, before a client connects. Which groups it knows is in docs/channels.md.
//
// Threads and forks: as in kesto.h. Every function may be called from any thread, until the channel is destroyed or the
// publisher freed. In a forked child only `kesto_publisher_free` may be called, and leaves the parent's files alone. A
// child that lives on without executing another program keeps the files of a parent that was killed alive.
#ifndef KESTO_CHANNELS_H
#define KESTO_CHANNELS_H

#include "kesto.h"

#ifdef __cplusplus
extern "C" {
#endif

// ---- Publishers ----

// Owns channels and the thread that writes their files.
typedef struct kesto_publisher kesto_publisher;

// How a publisher is to be. Set `size` to sizeof(kesto_publisher_options) and everything else to zero for the defaults.
typedef struct kesto_publisher_options {
    size_t size;
    // The channel tree. Null: $KESTO_CHANNEL_ROOT; without it $XDG_RUNTIME_DIR/kesto/channels, if there is such a
    // directory "kesto", as there is where the user has a service of their own; else /run/kesto/channels. The variables
    // count only where the program runs with its user's own privileges.
    const char* root;
    // The least time between two files of one channel. The thread itself makes it longer where there is so much to
    // write that it would take more than a twentieth of its time. 0: 500 ms.
    uint32_t write_interval_ms;
    // A state lasts without anybody touching its channel, so its file is written again after this time. The thread
    // wakes for nothing else. 0: 1 s. UINT32_MAX: never; the file is then true when a state is entered and after
    // `kesto_publisher_flush`.
    uint32_t refresh_interval_ms;
} kesto_publisher_options;

// Makes a publisher without channels; nothing is written before there is one. Null options: the defaults. On failure
// `*publisher` is null: KESTO_INVALID_ARGUMENT, KESTO_OUT_OF_MEMORY, or KESTO_SYSTEM_ERROR (with `errno`) when there is
// no descriptor or thread.
KESTO_API kesto_status kesto_publisher_open(const kesto_publisher_options* options, kesto_publisher** publisher);

// Writes the file of every channel that has changed, and of every state as long as it has lasted by now, before it
// returns: worth it before a session is started or stopped. KESTO_SYSTEM_ERROR (with `errno`) when a file cannot be
// written.
KESTO_API kesto_status kesto_publisher_flush(kesto_publisher* publisher);

// Destroys all its channels, whose files go, and frees the publisher. The service learns nothing more of them, so stop
// sessions first. Null is allowed.
KESTO_API void kesto_publisher_free(kesto_publisher* publisher);

// Where its channel tree is, for messages to people. Valid until the publisher is freed; null when the publisher is.
KESTO_API const char* kesto_publisher_root(const kesto_publisher* publisher);

// What became of the files since the publisher was opened. A file that could not be written is tried again.
typedef struct kesto_publisher_statistics {
    uint64_t files_written;
    uint64_t files_failed;
} kesto_publisher_statistics;

// `size` is sizeof(kesto_publisher_statistics), so that later versions may add fields at the end.
KESTO_API void kesto_publisher_get_statistics(const kesto_publisher* publisher, kesto_publisher_statistics* statistics,
                                              size_t size);

// ---- Channels ----

typedef struct kesto_channel kesto_channel;

// How many channels a publisher takes, buckets a histogram, and states a state channel.
#define KESTO_MOST_CHANNELS 4096
#define KESTO_MOST_BUCKETS 512
#define KESTO_MOST_STATES 128
// How many bytes the name of a state and a unit may have.
#define KESTO_LONGEST_STATE_NAME 64

// What a channel is called. `group` and `subgroup` may be null: then it has none.
//
// Names are UTF-8 of 1 to 255 bytes, and become names of folders and files: "/", control characters and a dot at the
// beginning become "_", and no group is called "-". What follows a "<" in the driver's name tells drivers of one kind
// apart and does not come into reports: "mixer<7>". Two channels of the same name, in whichever programs, write the
// same file.
typedef struct kesto_channel_name {
    const char* driver;
    const char* group;
    const char* subgroup;
    const char* channel;
} kesto_channel_name;

// The functions that create a channel make its folders and its first file before they return. On failure `*channel` is
// null: KESTO_INVALID_ARGUMENT, KESTO_INVALID_UTF8, KESTO_TOO_LARGE (a name that is too long, or more channels, buckets
// or states than there may be), KESTO_OUT_OF_MEMORY, or KESTO_SYSTEM_ERROR (with `errno`) when the file cannot be
// written: EPERM says that a folder of this name belongs to somebody else.

// A number, 0 at first. The service reports by how much it has grown; one that becomes less counts as begun anew.
KESTO_API kesto_status kesto_channel_create_simple(kesto_publisher* publisher, const kesto_channel_name* name,
                                                   kesto_channel** channel);

// How often values fell into each of `bound_count` - 1 buckets: the first reaches from bounds[0] up to, but not
// including, bounds[1], and so on. The bounds, two at least, ascend. What lies outside counts in the outermost buckets.
// `unit` may be null.
KESTO_API kesto_status kesto_channel_create_histogram(kesto_publisher* publisher, const kesto_channel_name* name,
                                                      const char* unit, const int64_t* bounds, size_t bound_count,
                                                      kesto_channel** channel);

// In which of `state_count` states something is, how often it entered each and how many milliseconds it spent there. It
// begins by entering states[first]. No two states have the same name.
KESTO_API kesto_status kesto_channel_create_state(kesto_publisher* publisher, const kesto_channel_name* name,
                                                  const char* const* states, size_t state_count, size_t first,
                                                  kesto_channel** channel);

// Removes the channel's file, and its folders if they are empty then. Null is allowed.
KESTO_API void kesto_channel_destroy(kesto_channel* channel);

// The functions that follow change a channel.
//
// For real-time threads: no lock, no allocation, no wait. The first change after a time in which nothing changed wakes
// the publisher's thread with one write to an event descriptor; those that follow make no system call until it rests
// again. KESTO_INVALID_ARGUMENT when the channel is null or of another kind.

// Of simple channels.
KESTO_API kesto_status kesto_channel_add(kesto_channel* channel, int64_t amount);
KESTO_API kesto_status kesto_channel_set(kesto_channel* channel, int64_t value);
// Of histograms.
KESTO_API kesto_status kesto_channel_record(kesto_channel* channel, int64_t value);
// Of state channels: `state` is its place among those given; to enter the state that it is in changes nothing.
KESTO_API kesto_status kesto_channel_enter(kesto_channel* channel, size_t state);

#ifdef __cplusplus
}
#endif

#endif
