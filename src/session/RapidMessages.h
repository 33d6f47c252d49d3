// Bursts of messages a fraction of a second apart, as switches cause them, folded into one payload each.
//
// What of a message is read, and how two are merged, is left to the caller: the volume analysis needs a few entries of
// a million messages, and has no use for the others.
#pragma once

#include "session/MessageStore.h"

#include <algorithm>
#include <cstddef>
#include <optional>
#include <utility>
#include <vector>

namespace session {

// Tells where one burst ends and the next begins. A pause is measured from the payload before, not from the
// first of the burst; one without a time counts as 0, and leaves the next without anything to be measured from.
class MessageBursts {
public:
    explicit MessageBursts(double maximumPausetime) : maximumPausetime_(maximumPausetime) { }

    // Whether the next payload, of that time in seconds, begins a burst.
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

// The payloads of the messages in order, which may be looked at before their turn. The next of those are kept until it
// comes: every message is read twice at most, and once where bursts are close to each other.
template <typename Payloads> class PayloadSequence {
public:
    using Payload = decltype(std::declval<Payloads&>().read(std::declval<const MessageStore::Cursor&>()));

    PayloadSequence(const MessageStore& messages, Payloads& payloads) : cursor_(messages), payloads_(payloads) { }

    // The next payload; nothing when there is none.
    std::optional<Payload> next()
    {
        if (taken_ != kept_.size())
            return std::move(kept_[taken_++]);
        kept_.clear();
        taken_ = 0;
        return cursor_.next() ? std::optional(payloads_.read(cursor_)) : std::nullopt;
    }

    // Calls `visit` with the payloads that are still to come, until it returns false.
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

    MessageStore::Cursor cursor_; // at the last message that was taken or is kept
    Payloads& payloads_;
    std::vector<Payload> kept_; // behind those taken
    std::size_t taken_ = 0; // of the kept
};

// Calls `visit` with the payloads of the messages in order, those of a burst as one at the place of the first of them.
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
                continue; // is in the burst's payload already
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
