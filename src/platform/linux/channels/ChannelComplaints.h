// SPDX-License-Identifier: Apache-2.0
// Logs each problem of the channel tree once, even if many readings find it, one after the other: it logs what the
// reading before did not find. A problem that disappeared in between is logged again.
#pragma once

#include "foundation/Mutex.h"
#include "ledger/Ledger.h"
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/log/ProviderLog.h"

#include <system_error>
#include <vector>

namespace platform {

// Any thread.
class ChannelComplaints {
public:
    // How many missing channels one reading names; the others are counted.
    static constexpr std::size_t mostNamed = 16;

    ChannelComplaints(std::filesystem::path root, const ChannelTree::Limits& limits, ledger::Ledger& ledger,
                      ProviderLog log)
        : root_(std::move(root)),
          limits_(limits),
          ledger_(ledger),
          log_(log)
    {
    }

    // Logs and counts what is new in the reading, and remembers all.
    void report(const ChannelReading& reading);
    // Logs that the tree could not be read, and remembers what it found before until the tree can be read.
    void reportUnreadable(std::error_code error);

private:
    void logProblems(const std::vector<ChannelProblem>& problems) const KESTO_REQUIRES(lock_);
    void logLeftOut(LeftOutChannels leftOut) const KESTO_REQUIRES(lock_);

    const std::filesystem::path root_;
    const ChannelTree::Limits limits_;
    ledger::Ledger& ledger_;
    const ProviderLog log_;
    foundation::Mutex lock_;
    // What the last reading found.
    std::vector<ChannelProblem> problems_ KESTO_GUARDED_BY(lock_);
    LeftOutChannels leftOut_ KESTO_GUARDED_BY(lock_);
    std::error_code error_ KESTO_GUARDED_BY(lock_); // why the tree could not be read
};

} // namespace platform
