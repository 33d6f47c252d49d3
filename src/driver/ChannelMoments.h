// SPDX-License-Identifier: Apache-2.0
// Reads the drivers' channels on a thread of its own, because the server queue must not wait for files, of which every
// user may publish many. A reading serves all who asked before it began: however many sessions start and stop, one
// reading runs at a time.
#pragma once

#include "foundation/Mutex.h"
#include "session/DriverSnapShot.h"

#include <functional>
#include <memory>
#include <vector>

namespace platform {
class WorkQueue;
}

namespace driver {

// Any thread.
class ChannelMoments {
public:
    using Read = std::function<session::DriverMoment()>;
    using Take = std::move_only_function<void(session::DriverMoment moment)>;

    // `read` runs on one thread at a time. If the system refuses a thread, callers read on their own.
    explicit ChannelMoments(Read read);

    // Gives `take` a moment that is read after this call. `take` runs on the reading thread.
    void next(Take take);

private:
    // What the queue's items share.
    struct Shared {
        Read read;
        foundation::Mutex lock;
        std::vector<Take> waiting KESTO_GUARDED_BY(lock);
    };
    static void serve(Shared& shared);

    const std::shared_ptr<Shared> shared_;
    std::shared_ptr<platform::WorkQueue> queue_; // null: the system had no thread for it
};

} // namespace driver
