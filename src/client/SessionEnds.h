// SPDX-License-Identifier: Apache-2.0
// The ends of long sessions: on a thread of their own, so that only the client that stops one waits for it.
//
// The session itself stops at once, for everyone. Its messages stay behind until the end is over: as long as they take
// memory, their client pays for it. One end follows the other, so the memory that an end takes by itself is needed only
// once, however many sessions stop. The users take turns, so that one end of each other user goes first at most. A
// trace that stops may wait for the kernel and for a million events; so traces have another thread.
#pragma once

#include "platform/WorkQueue.h"
#include "session/KestoReportingSession.h"

#include <cstdint>
#include <deque>
#include <functional>
#include <map>
#include <memory>
#include <string_view>

namespace client {

// If the system refuses a thread, its work is done on the server queue. Owned by a shared pointer. Server queue.
class SessionEnds : public std::enable_shared_from_this<SessionEnds> {
public:
    using Then = std::move_only_function<void(platform::Turn& turn)>;

    // Stops the session, if it is started, and then calls `then`: at once if that is quick, and otherwise in a later
    // item of the lane of that user, which pauses until then. For an item of the lane, submitted by `submitLong`, as
    // its last step.
    void stop(platform::Turn& turn, std::shared_ptr<KestoReportingSession> session, std::uint32_t user,
              const std::shared_ptr<platform::Lane>& lane, Then then);

private:
    // One session on its way.
    struct End {
        std::shared_ptr<KestoReportingSession> session;
        std::unique_ptr<session::RunEnd> run;
        std::shared_ptr<platform::Lane> lane;
        Then then;
        platform::Lane::Resume resume;
    };
    using SharedEnd = std::shared_ptr<End>;
    // A queue with a thread, made when it is needed first: most services never need one.
    struct Thread {
        std::string_view name;
        std::string_view work; // for the log
        std::shared_ptr<platform::WorkQueue> queue = nullptr;
        bool isRefused = false; // the log says so once
    };

    void endShort(platform::Turn& turn, const SharedEnd& end);
    void beginNext();
    void begin(const SharedEnd& end);
    void sendVolumeEvents(platform::Turn& turn, const SharedEnd& end);
    void summarise(const SharedEnd& end);
    void stopTrace(platform::Turn& turn, const SharedEnd& end);
    static void finish(platform::Turn& turn, End& end);
    static void resume(End& end, platform::TurnItem item);
    void on(Thread& thread, platform::WorkItem work);
    void makeQueue(Thread& thread);

    Thread ends_{.name = "com.quarn.kesto.reporting.ends", .work = "long sessions"};
    Thread traces_{.name = "com.quarn.kesto.reporting.traces", .work = "traces"};
    SharedEnd current_;
    std::map<std::uint32_t, std::deque<SharedEnd>> waiting_; // by user
    std::uint32_t lastUser_ = 0; // whose turn it was
};

} // namespace client
