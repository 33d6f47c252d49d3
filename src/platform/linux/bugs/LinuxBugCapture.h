// The room of bugs: snapshots of what can be known when something goes wrong. It reads /proc and writes below the
// directory of captures.
//
// The bug-capture service: a folder a snapshot, below the state directory, for whoever looks into it later.
//
// A snapshot holds what the service said last and which sessions it had, what the kernel tells of the process in which
// the bug was seen, and the state of the sound system. It is taken in the background, one at a time: whoever asks, asks
// and goes on.
//
// What leads to a snapshot is a client's message. So a client can ask for as many as it likes, and every one would push
// out an older one that somebody needs: beyond a few in a while no more are taken, and the next that is taken tells how
// many were not.
#pragma once

#include "foundation/Mutex.h"
#include "platform/BugCapture.h"
#include "platform/Clock.h"
#include "platform/WorkQueue.h"
#include "platform/linux/bugs/BugCaptureFolder.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/log/RecentLogLines.h"

#include <cstdint>
#include <deque>
#include <expected>
#include <filesystem>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

// Any thread. It outlives its reporters, and the queue's work.
class LinuxBugCapture final : public BugCapture {
public:
    struct Limits {
        std::size_t mostAtOnce = 8; // snapshots in any `seconds`, whether they succeed or not
        double seconds = 600;
        BugCaptureFolder::Limits folder = {};
    };

    // Whom it asks; all of them outlive it.
    struct Sources {
        const RecentLogLines& log;
        const Clock& clock;
        WorkQueues& workQueues;
        std::filesystem::path proc = "/proc"; // where the kernel shows processes and the sound system
    };

    // Writes below the state directory. Snapshots that a killed service did not finish are removed at once.
    LinuxBugCapture(const std::filesystem::path& stateDirectory, Sources sources, ProviderLog log,
                    const Limits& limits);
    LinuxBugCapture(const std::filesystem::path& stateDirectory, Sources sources, ProviderLog log)
        : LinuxBugCapture(stateDirectory, std::move(sources), log, Limits())
    {
    }

    [[nodiscard]] std::unique_ptr<BugCaptureReporter> makeReporter() override;
    void setStateDescription(const StateDescription& describe) override { describeState_ = describe; }

    // That were asked for too soon after others, since the start.
    [[nodiscard]] std::uint64_t refusedSnapshots() const;

private:
    class Reporter;
    struct Request {
        foundation::Dictionary signature;
        double duration;
        foundation::Value event;
        foundation::Value payload;
        BugCaptureReporter::Reply reply;
        std::int32_t sender = 0; // whose message led to it; 0 when that is not known
        foundation::Value state = {}; // of whoever asks
    };

    void submit(Request request);
    [[nodiscard]] bool admit();

    // The background queue.
    void takeNext();
    [[nodiscard]] foundation::Dictionary capture(const Request& request);
    [[nodiscard]] std::expected<std::string, std::string> write(const Request& request);
    [[nodiscard]] foundation::Dictionary responseOf(std::string_view name) const;
    [[nodiscard]] std::vector<BugCaptureFolder::File> stateAt(double time, const Request& request) const;

    const Sources sources_;
    const ProviderLog log_;
    const Limits limits_;
    BugCaptureFolder folder_; // the background queue's, one item at a time
    StateDescription describeState_;

    mutable foundation::Mutex lock_;
    std::deque<Request> waiting_ KESTO_GUARDED_BY(lock_);
    bool isTaking_ KESTO_GUARDED_BY(lock_) = false;
    std::deque<double> admitted_ KESTO_GUARDED_BY(lock_); // when the last ones were, by the system's uptime
    std::uint64_t refused_ KESTO_GUARDED_BY(lock_) = 0;
};

} // namespace platform
