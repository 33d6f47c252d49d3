// Bursts of messages a fraction of a second apart, as switches cause them, folded into one payload each.
//
// What of a message is read, and how two are merged, is left to the caller: the volume analysis needs a few entries of
// a million messages, and has no use for the others.
#pragma once

#include "session/KestoReportingMessageStore.h"

#include <optional>

// Tells where one burst ends and the next begins. A pause is measured from the payload before, not from the
// first of the burst; one without a time counts as 0, and leaves the next without anything to be measured from.
class KestoReportingBursts {
public:
    explicit KestoReportingBursts(double maximumPausetime) : maximumPausetime_(maximumPausetime) { }

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

// Calls `visit` with the payloads of the messages in order, those of a burst as one at the place of the first of them.
//
// `payloads` has the payload's type `Payload`, and the functions `read(stored)`, `isCombinable(payload)`,
// `timeOf(payload)` and `merge(into, payload)`. Nothing is kept of the messages but the payload at hand: the rest of a
// burst is looked for ahead of its place, so that every message is read twice at most.
template <typename Payloads, typename Visit>
void KestoReportingCombineRapidMessages(const KestoReportingMessageStore& messages, double maximumPausetime,
                                        Payloads& payloads, Visit visit)
{
    KestoReportingBursts bursts(maximumPausetime);
    for (KestoReportingMessageStore::Cursor cursor(messages); cursor.next();) {
        auto payload = payloads.read(cursor.payload());
        if (payloads.isCombinable(payload)) {
            if (!bursts.beginsWith(payloads.timeOf(payload)))
                continue; // is in the burst's payload already
            auto ahead = bursts;
            for (auto rest = cursor; rest.next();) {
                const auto member = payloads.read(rest.payload());
                if (!payloads.isCombinable(member))
                    continue;
                if (ahead.beginsWith(payloads.timeOf(member)))
                    break;
                payloads.merge(payload, member);
            }
        }
        visit(payload);
    }
}
