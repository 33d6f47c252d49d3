// SPDX-License-Identifier: Apache-2.0
// libkesto for C, publishing: counters, histograms and states of a driver, for the Kesto reporting service (kestod),
// which reports at the end of each session how they changed.
//
// A channel is a value in this process and a file that shows it to other programs. Changing a channel changes the
// value: a few nanoseconds, without a lock, an allocation or a wait, from any thread. A thread of the publisher writes
// the files of changed channels, at most twice a second and each in one step: a reader sees the old file or the new
// one.
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
// The service leaves out the files of a killed process; the next publisher with a channel of the same driver removes
// them.
//
// The service subscribes to groups once, when it starts, and only to groups that have a channel then: create channels
// early, before a client connects. docs/channels.md lists the groups.
//
// Threads and forks: as in kesto.h. Every function may be called from any thread, until the channel is destroyed or the
// publisher freed. In a forked child only `kesto_publisher_free` may be called, and leaves the parent's files alone. A
// child that runs on without executing another program makes a killed parent's files count as alive.
#ifndef KESTO_CHANNELS_H
#define KESTO_CHANNELS_H

#include "kesto.h"

#ifdef __cplusplus
extern "C" {
#endif

// ---- Publishers ----

// Owns channels and the thread that writes their files.
typedef struct kesto_publisher kesto_publisher;

// Options of a publisher. Set `size` to sizeof(kesto_publisher_options) and everything else to zero for the defaults.
typedef struct kesto_publisher_options {
    size_t size;
    // The channel tree. Null: $KESTO_CHANNEL_ROOT; without it $XDG_RUNTIME_DIR/kesto/channels, if its directory "kesto"
    // exists, as it does with a user's own service; else /run/kesto/channels. The variables count only where the
    // program runs with its user's own privileges.
    const char* root;
    // The least time between two files of one channel. The thread makes it longer if writing would take more than a
    // twentieth of its time. 0: 500 ms.
    uint32_t write_interval_ms;
    // The time in a state grows without a call, so its file is written again after this time. The thread wakes without
    // a call for this reason only. 0: 1 s. UINT32_MAX: never; the file is then exact when a state is entered and after
    // `kesto_publisher_flush`.
    uint32_t refresh_interval_ms;
} kesto_publisher_options;

// Makes a publisher without channels; it writes only after a channel is created. Null options: the defaults. On failure
// `*publisher` is null: KESTO_INVALID_ARGUMENT, KESTO_OUT_OF_MEMORY, or KESTO_SYSTEM_ERROR (with `errno`) if the system
// refuses a descriptor or thread.
KESTO_API kesto_status kesto_publisher_open(const kesto_publisher_options* options, kesto_publisher** publisher);

// Writes the file of every changed channel, and of every state with its time up to now, before it returns. Call it
// before a session is started or stopped. KESTO_SYSTEM_ERROR (with `errno`) if a file cannot be written.
KESTO_API kesto_status kesto_publisher_flush(kesto_publisher* publisher);

// Destroys all its channels, removes their files, and frees the publisher. The service cannot report them afterwards,
// so stop sessions first. Null is allowed.
KESTO_API void kesto_publisher_free(kesto_publisher* publisher);

// The path of its channel tree, for messages to people. Valid until the publisher is freed; null for a null publisher.
KESTO_API const char* kesto_publisher_root(const kesto_publisher* publisher);

// Counts of written and failed files since the publisher was opened. A failed write is tried again.
typedef struct kesto_publisher_statistics {
    uint64_t files_written;
    uint64_t files_failed;
} kesto_publisher_statistics;

// `size` is sizeof(kesto_publisher_statistics), so that later versions may add fields at the end.
KESTO_API void kesto_publisher_get_statistics(const kesto_publisher* publisher, kesto_publisher_statistics* statistics,
                                              size_t size);

// ---- Channels ----

typedef struct kesto_channel kesto_channel;

// The greatest number of channels of a publisher, buckets of a histogram, and states of a state channel.
#define KESTO_MOST_CHANNELS 4096
#define KESTO_MOST_BUCKETS 512
#define KESTO_MOST_STATES 128
// The greatest length of a state's name and of a unit, in bytes.
#define KESTO_LONGEST_STATE_NAME 64

// The name of a channel. A null `group` or `subgroup` means that it has none.
//
// Names are UTF-8 of 1 to 255 bytes, and become names of folders and files: "/", control characters and a dot at the
// beginning become "_", and a group cannot have the name "-". The part of the driver's name from a "<" on distinguishes
// drivers of one kind and is left out of reports: "mixer<7>". Two channels of the same name, also in different
// programs, write the same file.
typedef struct kesto_channel_name {
    const char* driver;
    const char* group;
    const char* subgroup;
    const char* channel;
} kesto_channel_name;

// The functions that create a channel make its folders and its first file before they return. On failure `*channel` is
// null: KESTO_INVALID_ARGUMENT, KESTO_INVALID_UTF8, KESTO_TOO_LARGE (a name that is too long, or too many channels,
// buckets or states), KESTO_OUT_OF_MEMORY, or KESTO_SYSTEM_ERROR (with `errno`) if the file cannot be written: EPERM
// means that a folder of this name belongs to another user.

// A number, 0 at first. The service reports by how much it has grown; if it decreases, it counts as a new channel.
KESTO_API kesto_status kesto_channel_create_simple(kesto_publisher* publisher, const kesto_channel_name* name,
                                                   kesto_channel** channel);

// How often values fell into each of `bound_count` - 1 buckets: the first reaches from bounds[0] up to, but not
// including, bounds[1], and so on. The bounds, two at least, ascend. Values outside count in the outermost buckets.
// `unit` may be null.
KESTO_API kesto_status kesto_channel_create_histogram(kesto_publisher* publisher, const kesto_channel_name* name,
                                                      const char* unit, const int64_t* bounds, size_t bound_count,
                                                      kesto_channel** channel);

// The present one of `state_count` states, the number of times that each was entered and the milliseconds spent in it.
// The channel begins in states[first]. State names must differ.
KESTO_API kesto_status kesto_channel_create_state(kesto_publisher* publisher, const kesto_channel_name* name,
                                                  const char* const* states, size_t state_count, size_t first,
                                                  kesto_channel** channel);

// Removes the channel's file, and its folders if they are empty then. Null is allowed.
KESTO_API void kesto_channel_destroy(kesto_channel* channel);

// The following functions change a channel.
//
// For real-time threads: no lock, no allocation, no wait. The first change after a pause wakes the publisher's thread
// with one write to an event descriptor; further changes make no system call until the thread sleeps again.
// KESTO_INVALID_ARGUMENT if the channel is null or of another kind.

// Of simple channels.
KESTO_API kesto_status kesto_channel_add(kesto_channel* channel, int64_t amount);
KESTO_API kesto_status kesto_channel_set(kesto_channel* channel, int64_t value);
// Of histograms.
KESTO_API kesto_status kesto_channel_record(kesto_channel* channel, int64_t value);
// Of state channels: `state` is the index in `states`; entering the present state has no effect.
KESTO_API kesto_status kesto_channel_enter(kesto_channel* channel, size_t state);

#ifdef __cplusplus
}
#endif

#endif
