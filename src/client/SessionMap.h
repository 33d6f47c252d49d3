// A client's sessions by reporter ID, in the order in which the client first used the IDs.
//
// A session that replaces another takes its place in the order. Looking up, adding and removing cost the same for any
// number of sessions and for any IDs that clients choose.
#pragma once

#include "foundation/values/IntegerHash.h"
#include "session/KestoReportingSession.h"

#include <cstdint>
#include <list>
#include <memory>
#include <unordered_map>

namespace client {

// One thread at a time, which the owner ensures.
class SessionMap {
public:
    struct Entry {
        std::int64_t reporterID;
        std::shared_ptr<KestoReportingSession> session;
    };

    [[nodiscard]] std::shared_ptr<KestoReportingSession> find(std::int64_t reporterID) const
    {
        const auto found = byID_.find(reporterID);
        return found == byID_.end() ? nullptr : found->second->session;
    }

    void set(std::int64_t reporterID, std::shared_ptr<KestoReportingSession> session)
    {
        const auto [found, isNew] = byID_.try_emplace(reporterID, entries_.end());
        if (isNew)
            found->second = entries_.insert(entries_.end(), {reporterID, std::move(session)});
        else
            found->second->session = std::move(session);
    }

    void remove(std::int64_t reporterID)
    {
        if (const auto found = byID_.find(reporterID); found != byID_.end()) {
            entries_.erase(found->second);
            byID_.erase(found);
        }
    }

    void clear()
    {
        byID_.clear();
        entries_.clear();
    }

    [[nodiscard]] std::size_t size() const { return entries_.size(); }
    [[nodiscard]] auto begin() const { return entries_.begin(); }
    [[nodiscard]] auto end() const { return entries_.end(); }

private:
    std::list<Entry> entries_;
    std::unordered_map<std::int64_t, std::list<Entry>::iterator, foundation::IntegerHash> byID_;
};

} // namespace client
