// SPDX-License-Identifier: Apache-2.0
// Folds each burst of messages a fraction of a second apart, as switches cause them, into one payload.
//
// The caller decides what is read of a message and how two are merged: the volume analysis needs only a few entries of
// each of a million messages.
#pragma once

#include "session/MessageStore.h"

#include <algorithm>
#include <cstddef>
#include <optional>
#include <utility>
#include <vector>

namespace session {

// Finds where one burst ends and the next begins. A pause counts from the previous payload, not from the first of the
// burst. A payload without a time counts as one at time 0; the payload after it never begins a burst.
class MessageBursts {
public:
    explicit MessageBursts(double maximumPausetime) : maximumPausetime_(maximumPausetime) { }

    // Whether the next payload, with that time in seconds, begins a burst.
    bool beginsWith(std::optional<double> time)
    {
        const bool isPaused = lastTime_ && time.value_or(0) - *lastTime_ > maximumPausetime_;
        const bool begins = isFirst_ || isPaused;
        isFirst_ = false;
        lastTime_ = time;
        return begins;
    }

private:
    double maximumPausetime_;
    bool isFirst_ = true;
    std::optional<double> lastTime_;
};

// The payloads of the messages, in order, with a look ahead. Payloads that the look ahead reads are kept until `next`
// returns them; so every message is read at most twice, and once where bursts are close to each other.
template <typename Payloads> class PayloadSequence {
public:
    using Payload = decltype(std::declval<Payloads&>().read(std::declval<const MessageStore::Cursor&>()));

    PayloadSequence(const MessageStore& messages, Payloads& payloads) : cursor_(messages), payloads_(payloads) { }

    // The next payload, or nothing at the end.
    std::optional<Payload> next()
    {
        if (taken_ != kept_.size())
            return std::move(kept_[taken_++]);
        kept_.clear();
        taken_ = 0;
        return cursor_.next() ? std::optional(payloads_.read(cursor_)) : std::nullopt;
    }

    // Calls `visit` with the following payloads until it returns false.
    template <typename Visit> void lookAhead(Visit visit)
    {
        bool goesOn = std::all_of(kept_.begin() + static_cast<std::ptrdiff_t>(taken_), kept_.end(), visit);
        for (auto ahead = cursor_; goesOn && ahead.next();) {
            Payload payload = payloads_.read(ahead);
            goesOn = visit(payload);
            if (kept_.size() == mostKept)
                continue;
            kept_.push_back(std::move(payload));
            cursor_ = ahead;
        }
    }

private:
    static constexpr std::size_t mostKept = 256;

    MessageStore::Cursor cursor_; // at the last message that was taken or kept
    Payloads& payloads_;
    std::vector<Payload> kept_; // read ahead
    std::size_t taken_ = 0; // of those in `kept_`
};

// Calls `visit` with the payloads of the messages, in order; a burst is one payload, at the place of its first message.
//
// `payloads` has the functions `read(cursor)`, `isCombinable(payload)`, `timeOf(payload)` and `merge(into, payload)`.
template <typename Payloads, typename Visit>
void combineRapidMessages(const MessageStore& messages, double maximumPausetime, Payloads& payloads, Visit visit)
{
    MessageBursts bursts(maximumPausetime);
    PayloadSequence sequence(messages, payloads);
    while (auto payload = sequence.next()) {
        if (payloads.isCombinable(*payload)) {
            if (!bursts.beginsWith(payloads.timeOf(*payload)))
                continue; // already merged
            auto burstsAhead = bursts;
            sequence.lookAhead([&](const auto& member) {
                if (!payloads.isCombinable(member))
                    return true;
                if (burstsAhead.beginsWith(payloads.timeOf(member)))
                    return false;
                payloads.merge(*payload, member);
                return true;
            });
        }
        visit(*payload);
    }
}

} // namespace session
