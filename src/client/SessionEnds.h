// The ends of long sessions: on a thread of their own, so that only the client that stops one waits for it.
//
// The session itself stops at once, for everyone. Its messages stay behind until the end is over: as long as they take
// memory, their client pays for it. One end follows the other, so the memory that an end takes by itself is needed only
// once, however many sessions stop.
#pragma once

#include "platform/WorkQueue.h"
#include "session/KestoReportingSession.h"

#include <deque>
#include <functional>
#include <memory>

namespace client {

// If the system refuses the thread, ends run on the server queue. Owned by a shared pointer. Server queue.
class SessionEnds : public std::enable_shared_from_this<SessionEnds> {
public:
    using Then = std::move_only_function<void(platform::Turn& turn)>;

    // Stops the session, if it is started, and then calls `then`: at once if that is quick, and otherwise in a later
    // item of the lane, which pauses until then. For an item of the lane, submitted by `submitLong`, as its last step.
    void stop(platform::Turn& turn, std::shared_ptr<KestoReportingSession> session,
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

    void writeFile(platform::Turn& turn, std::shared_ptr<KestoReportingSession> session,
                   const std::shared_ptr<platform::Lane>& lane, Then then);
    void begin(End& end);
    void sendVolumeEvents(platform::Turn& turn, End& end);
    void summarise(End& end);
    void finish(platform::Turn& turn);
    static void resume(End& end, platform::TurnItem item);
    void elsewhere(platform::WorkItem work);
    void makeQueue();

    std::shared_ptr<platform::WorkQueue> queue_; // null until a long session stops: most services see none
    bool isRefused_ = false; // the log says so once
    std::deque<End> ends_; // the first one is on its way, the others wait
};

} // namespace client
