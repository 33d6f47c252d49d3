// SPDX-License-Identifier: Apache-2.0
// The sources and sessions that the service announced in this run, and the rows that they have in the database.
//
// A source or a session gets its row with its first event, so that clients that send nothing leave nothing. So each is
// remembered as long as it lives; a few stay remembered after their end, since an event may come late, and since a new
// database may be begun at any time.
//
// What they say is also whom the loss of an event is charged to.
#pragma once

#include "ledger/Tally.h"
#include "platform/Origin.h"
#include "platform/linux/store/stretches/Stretch.h"

#include <algorithm>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

namespace platform {

template <typename Begin> struct KnownOrigin {
    Begin begin;
    std::optional<double> ended;
    std::int64_t row = 0; // 0: it has none
};

// One thread at a time.
template <typename Begin> class KnownOriginsOf {
public:
    static constexpr std::size_t mostEndedRemembered = 1024;

    void begin(const Begin& begin)
    {
        auto& known = known_[begin.number];
        if (known.row != 0 && known.begin != begin)
            changed_.push_back(begin.number);
        known.begin = begin;
    }

    void end(const OriginEnd& end)
    {
        const auto known = known_.find(end.number);
        if (known == known_.end() || known->second.ended)
            return;
        known->second.ended = end.time;
        if (known->second.row != 0)
            changed_.push_back(end.number);
        ended_.push_back(end.number);
        if (ended_.size() > mostEndedRemembered) {
            forgotten_.push_back(ended_.front());
            ended_.pop_front();
        }
    }

    // Null if it is not known.
    [[nodiscard]] KnownOrigin<Begin>* find(std::uint64_t number)
    {
        const auto known = known_.find(number);
        return known == known_.end() ? nullptr : &known->second;
    }

    void setRow(std::uint64_t number, std::int64_t row)
    {
        known_[number].row = row;
        inserted_.push_back(number);
    }
    // Its row is to be written again.
    void change(std::uint64_t number) { changed_.push_back(number); }
    // The numbers of those whose rows are to be written again.
    [[nodiscard]] const std::vector<std::uint64_t>& changed() const noexcept { return changed_; }

    void committed()
    {
        inserted_.clear();
        changed_.clear();
        forget();
    }
    // Also called when no transaction could begin, so that a database that stays closed costs no memory.
    void rolledBack()
    {
        for (const std::uint64_t number : inserted_)
            known_[number].row = 0;
        inserted_.clear();
        forget();
        std::ranges::sort(changed_);
        const auto repeated = std::ranges::unique(changed_);
        changed_.erase(repeated.begin(), repeated.end());
        std::erase_if(changed_, [this](std::uint64_t number) { return !known_.contains(number); });
    }
    // The database is another one.
    void forgetRows()
    {
        for (auto& [number, known] : known_)
            known.row = 0;
        changed_.clear();
    }

private:
    void forget()
    {
        for (const std::uint64_t number : forgotten_)
            known_.erase(number);
        forgotten_.clear();
    }

    std::unordered_map<std::uint64_t, KnownOrigin<Begin>> known_;
    std::deque<std::uint64_t> ended_;
    std::vector<std::uint64_t> forgotten_; // when the transaction is over
    std::vector<std::uint64_t> inserted_; // in the running transaction
    std::vector<std::uint64_t> changed_;
};

struct KnownOrigins {
    KnownOriginsOf<SourceBegin> sources;
    KnownOriginsOf<SessionBegin> sessions;
    std::string bootIdentifier; // of this run of the machine
    std::string epoch; // of the database that has the rows
    std::int64_t nextEvent = 0; // in it, after the last transaction

    void begin(const OriginAnnouncements& announced);
    void end(const OriginAnnouncements& announced);
    void committed();
    void rolledBack();
    // Who is behind the origin; nothing if its source is not known.
    [[nodiscard]] std::optional<ledger::Culprit> culpritOf(const Origin& origin);
    // Nothing if the session is not known or has ended.
    [[nodiscard]] std::optional<SessionOwner> ownerOf(std::uint64_t session);
    // Counts the loss of events, and charges it to those who sent them as far as they are known.
    void countLoss(ledger::Counter reason, const EventsByOrigin& events, ledger::Tally& tally);
    // Whether rows are to be written although there is no event.
    [[nodiscard]] bool hasChanged() const noexcept;
};

} // namespace platform
