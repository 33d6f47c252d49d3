// SPDX-License-Identifier: Apache-2.0
// The playbacks and recordings of a client, from their creation until the client's thread has let them go.
//
// Their state belongs to the client's thread: callers only put records into the queue. A lock guards the list itself,
// which changes when a caller creates or frees a stream. Records in the queue may still name a freed stream, so it goes
// only when the queue has been read up to the place where it was freed.
#pragma once

#include "foundation/Mutex.h"
#include "streams/Stream.h"

#include <cstddef>
#include <cstdint>
#include <list>
#include <optional>
#include <string_view>

namespace libkesto {

class Streams {
public:
    // While a service hangs, freed streams stay: so many may be there.
    static constexpr std::size_t most = 1024;

    // The stream stays until it is freed. May throw std::bad_alloc, also where there are too many. Any thread.
    [[nodiscard]] Stream& create(Direction direction, std::string_view application, kesto_service_type type);
    // The owner of the stream has freed it, and had put no record of it behind `position` in the queue. Any thread.
    void free(const Stream& stream, std::uint64_t position, Moment when) noexcept;

    // The following functions are for the client's thread. Without a service (null) they do not throw.

    // Follows a record of the queue.
    void follow(std::string_view record, CallTaker* service);
    // The queue has been read up to this position: the streams that were freed before it go. One that is still started,
    // because the queue had no room for its stop, is stopped.
    void letGo(std::uint64_t position, CallTaker* service);
    // Makes the sessions of all started streams on a new connection.
    void renewSessions(CallTaker& service);
    [[nodiscard]] bool isAnyStarted() const noexcept;
    // No further record will be followed: a freed stream goes immediately.
    void close() noexcept;

private:
    struct Freed {
        std::uint64_t position;
        Moment when;
    };
    struct Entry {
        Entry(Direction direction, std::string_view application, kesto_service_type type)
            : stream(direction, application, type)
        {
        }
        Stream stream;
        std::optional<Freed> freed;
    };

    mutable foundation::Mutex mutex_;
    std::list<Entry> entries_ KESTO_GUARDED_BY(mutex_);
    bool isClosed_ KESTO_GUARDED_BY(mutex_) = false;
};

} // namespace libkesto
