// Logs each problem of the channel tree once, even if several queries find it repeatedly. The service reads one tree
// with several queries, and most problems concern all of them. So every query keeps the problems that it found last,
// and only a problem that no query has kept is logged. A problem that disappeared in between is logged again.
#pragma once

#include "foundation/Mutex.h"
#include "ledger/Ledger.h"
#include "platform/linux/channels/ChannelTree.h"
#include "platform/linux/log/ProviderLog.h"

#include <memory>
#include <system_error>
#include <vector>

namespace platform {

// Any thread.
class ChannelComplaints {
public:
    // How many missing channels one reading names; the others are counted.
    static constexpr std::size_t mostNamed = 16;

    // The result of one reading.
    struct Findings {
        std::vector<ChannelProblem> problems = {};
        LeftOutChannels leftOut = {};
        std::error_code error = {}; // why the tree could not be read
    };
    // The last findings of one query. Its owner keeps it as long as the query may be repeated.
    using Memory = std::shared_ptr<Findings>;

    ChannelComplaints(std::filesystem::path root, const ChannelTree::Limits& limits, ledger::Ledger& ledger,
                      ProviderLog log)
        : root_(std::move(root)),
          limits_(limits),
          ledger_(ledger),
          log_(log)
    {
    }

    // Adds a query, which has no findings yet.
    [[nodiscard]] Memory addQuery();
    // Logs and counts the new findings, and keeps all.
    void report(Findings found, const Memory& memory);
    // Logs that the tree could not be read, and keeps its earlier findings until it can be read.
    void reportUnreadable(std::error_code error, const Memory& memory);
    // Forgets the findings of queries without owners.
    void forgetDroppedQueries();

private:
    template <typename Condition> [[nodiscard]] bool anyRemembers(Condition condition) const KESTO_REQUIRES(lock_);
    void logProblems(const std::vector<ChannelProblem>& problems) const KESTO_REQUIRES(lock_);
    void logLeftOut(LeftOutChannels leftOut) const KESTO_REQUIRES(lock_);

    const std::filesystem::path root_;
    const ChannelTree::Limits limits_;
    ledger::Ledger& ledger_;
    const ProviderLog log_;
    foundation::Mutex lock_;
    std::vector<Memory> memories_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
