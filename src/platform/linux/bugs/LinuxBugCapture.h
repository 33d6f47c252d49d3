// SPDX-License-Identifier: Apache-2.0
// The room of bugs: snapshots of the evidence of a bug. It reads /proc and writes below the directory of captures.
//
// The bug-capture service: a folder for each snapshot, below the state directory, for later inspection.
//
// A snapshot holds the service's last log lines and its sessions, the kernel's information about the process that
// showed the bug, and the state of the sound system. Snapshots are taken in the background, one at a time: a caller
// does not wait.
//
// A client's message causes a snapshot. So a client could cause any number, and each would displace an older one that a
// developer needs. Therefore only a few are taken in a period, and the next snapshot after it holds the number of
// refusals.
#pragma once

#include "foundation/Mutex.h"
#include "ledger/Ledger.h"
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

    // The providers that it uses; all must outlive it.
    struct Sources {
        const RecentLogLines& log;
        const Clock& clock;
        WorkQueues& workQueues;
        ledger::Ledger& ledger;
        std::filesystem::path proc = "/proc"; // processes and the sound system
    };

    // Writes below the state directory. Its constructor removes the unfinished snapshots of a killed service.
    LinuxBugCapture(const std::filesystem::path& stateDirectory, Sources sources, ProviderLog log,
                    const Limits& limits);
    LinuxBugCapture(const std::filesystem::path& stateDirectory, Sources sources, ProviderLog log)
        : LinuxBugCapture(stateDirectory, std::move(sources), log, Limits())
    {
    }

    [[nodiscard]] std::unique_ptr<BugCaptureReporter> makeReporter() override;
    void setStateDescription(const StateDescription& describe) override { describeState_ = describe; }

private:
    class Reporter;
    struct Request {
        foundation::Dictionary signature;
        double duration;
        foundation::Value event;
        foundation::Value payload;
        BugCaptureReporter::Reply reply;
        std::int32_t sender = 0; // the process that sent the message; 0 if unknown
        foundation::Value state = {}; // of the requesting program
    };

    void submit(Request request);
    [[nodiscard]] bool admit();

    // On the background queue.
    void takeNext();
    [[nodiscard]] foundation::Dictionary capture(const Request& request);
    [[nodiscard]] std::expected<std::string, std::string> write(const Request& request);
    [[nodiscard]] foundation::Dictionary responseOf(std::string_view name) const;
    [[nodiscard]] std::vector<BugCaptureFolder::File> stateAt(double time, const Request& request) const;

    const Sources sources_;
    const ProviderLog log_;
    const Limits limits_;
    BugCaptureFolder folder_; // used on the background queue, one item at a time
    StateDescription describeState_;

    mutable foundation::Mutex lock_;
    std::deque<Request> waiting_ KESTO_GUARDED_BY(lock_);
    bool isTaking_ KESTO_GUARDED_BY(lock_) = false;
    std::deque<double> admitted_ KESTO_GUARDED_BY(lock_); // the uptimes of the last accepted requests
};

} // namespace platform
