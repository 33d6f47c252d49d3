// SPDX-License-Identifier: Apache-2.0
// A client's sessions by reporter ID, in the order in which the client first used the IDs.
//
// A session that replaces another takes its place in the order. Looking up, adding and removing cost the same for any
// number of sessions and for any IDs that clients choose. Places stay valid while sessions come and go, so a walk over
// many sessions may pause; and the sessions lie one behind the other in memory, so a walk is quick. Those that are
// started have a list of their own: often they are few of many, and every start and stop asks for their number.
#pragma once

#include "foundation/values/IntegerHash.h"
#include "session/KestoReportingSession.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <unordered_map>
#include <utility>
#include <vector>

namespace client {

// One thread at a time, which the owner ensures.
class SessionMap {
public:
    struct Entry {
        std::int64_t reporterID;
        std::shared_ptr<KestoReportingSession> session;
    };
    // Count up from 1 in the order of the entries. A walk begins behind 0.
    using Place = std::uint64_t;

    SessionMap() = default;
    ~SessionMap() { clear(); }
    SessionMap(const SessionMap&) = delete;
    SessionMap& operator=(const SessionMap&) = delete;

    [[nodiscard]] std::shared_ptr<KestoReportingSession> find(std::int64_t reporterID) const
    {
        const auto found = byID_.find(reporterID);
        return found == byID_.end() ? nullptr : found->second.session;
    }

    void set(std::int64_t reporterID, std::shared_ptr<KestoReportingSession> session)
    {
        auto& [place, known] = byID_[reporterID];
        if (known == nullptr) {
            place = ++lastPlace_;
            entries_.push_back({place, {reporterID, session}});
        } else {
            letGoOf(place, *known);
            entryAt(place).session = session;
        }
        known = std::move(session);
        noteStarted(place, *known, known->started());
        known->observeStarted([this, at = place, &noted = *known](bool started) { noteStarted(at, noted, started); });
    }

    void remove(std::int64_t reporterID)
    {
        const auto found = byID_.find(reporterID);
        if (found == byID_.end())
            return;
        const auto [place, session] = std::move(found->second);
        byID_.erase(found);
        letGoOf(place, *session);
        entryAt(place).session.reset();
        if (entries_.size() > 2 * byID_.size())
            std::erase_if(entries_, [](const Placed& placed) { return placed.entry.session == nullptr; });
    }

    void clear()
    {
        for (const auto& [reporterID, known] : byID_)
            letGoOf(known.place, *known.session);
        byID_.clear();
        entries_.clear();
    }

    [[nodiscard]] std::size_t size() const { return byID_.size(); }

    // Calls `visit(entry)` with so many entries behind the place. Returns the place of the last, or nothing if there
    // are no more.
    template <typename Visit> std::optional<Place> visitBehind(Place place, std::size_t most, const Visit& visit) const
    {
        auto next = firstBehind(place);
        for (std::size_t count = 0; count < most && next != entries_.end(); ++next)
            if (next->entry.session != nullptr) {
                visit(next->entry);
                place = next->place;
                ++count;
            }
        return next == entries_.end() ? std::nullopt : std::optional(place);
    }
    // The next session behind the place, or null; moves the place there.
    [[nodiscard]] std::shared_ptr<KestoReportingSession> sessionBehind(Place& place) const
    {
        std::shared_ptr<KestoReportingSession> session;
        place = visitBehind(place, 1, [&](const Entry& entry) { session = entry.session; }).value_or(lastPlace_);
        return session;
    }
    // The same of those that are started.
    [[nodiscard]] std::shared_ptr<KestoReportingSession> startedBehind(Place& place) const
    {
        const auto next = started_.upper_bound(place);
        if (next == started_.end())
            return nullptr;
        place = next->first;
        return next->second->shared_from_this();
    }
    [[nodiscard]] std::size_t startedCount() const { return started_.size(); }

private:
    struct Placed {
        Place place;
        Entry entry; // without a session, if it has been removed
    };
    struct Known {
        Place place = 0;
        std::shared_ptr<KestoReportingSession> session = nullptr;
    };

    [[nodiscard]] std::vector<Placed>::const_iterator firstBehind(Place place) const
    {
        return std::ranges::upper_bound(entries_, place, {}, &Placed::place);
    }
    [[nodiscard]] Entry& entryAt(Place place)
    {
        return std::ranges::lower_bound(entries_, place, {}, &Placed::place)->entry;
    }

    void noteStarted(Place place, KestoReportingSession& session, bool started)
    {
        if (started)
            started_.emplace(place, &session);
        else
            started_.erase(place);
    }

    void letGoOf(Place place, KestoReportingSession& session)
    {
        session.observeStarted(nullptr);
        noteStarted(place, session, false);
    }

    Place lastPlace_ = 0;
    std::vector<Placed> entries_; // by place
    std::map<Place, KestoReportingSession*> started_;
    std::unordered_map<std::int64_t, Known, foundation::IntegerHash> byID_;
};

} // namespace client
