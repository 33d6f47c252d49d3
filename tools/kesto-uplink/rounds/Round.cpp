// SPDX-License-Identifier: Apache-2.0
// A batch is sent before its place is noted, and noted before the next is read: the order of these steps is what makes
// a kill harmless.
#include "kesto-uplink/rounds/Round.h"

#include <fmt/format.h>

#include <utility>

namespace kesto_uplink {

namespace {

Outcome outcomeOf(Answer::Kind kind)
{
    switch (kind) {
    case Answer::Kind::Stored: return Outcome::Sent;
    case Answer::Kind::Full: return Outcome::Full;
    case Answer::Kind::Refused: return Outcome::Refused;
    case Answer::Kind::Interrupted: return Outcome::Interrupted;
    case Answer::Kind::Away: break;
    }
    return Outcome::Away;
}

} // namespace

Round::Round(const Terms& terms, State& state, Patience& patience, Transport& transport,
             std::function<std::unique_ptr<Source>(const Identity&)> sourceFor, std::function<Today()> clock,
             std::function<bool()> isMetered)
    : terms_(terms),
      state_(state),
      patience_(patience),
      transport_(transport),
      sourceFor_(std::move(sourceFor)),
      clock_(std::move(clock)),
      isMetered_(std::move(isMetered))
{
}

RoundResult Round::run()
{
    isForgotten_ = false;
    complaint_.clear();
    const bool isPseudonymDue =
        state_.renew(terms_.pseudonymDays, terms_.hashKeyDays, clock_().now) == Renewal::Waiting;
    identity_ = state_.identity();
    source_ = sourceFor_(identity_);
    auto batch = nextToSend();
    if (!batch)
        return {};
    if (auto reason = whyNotNow(*batch))
        return *std::move(reason);
    const Answer connected = transport_.connect();
    if (!connected.isStored())
        return {outcomeOf(connected.kind), connected.sentence};
    askForConfirmation();
    RoundResult result = sendConnected(std::move(batch), isPseudonymDue);
    if (result.outcome != Outcome::Interrupted)
        awaitConfirmation();
    transport_.disconnect();
    if (result.outcome == Outcome::Sent && !complaint_.empty())
        result.sentence += "; no confirmation: " + complaint_;
    return result;
}

// Passes what need not be sent.
std::optional<Batch> Round::nextToSend()
{
    while (!isForgotten_) {
        auto batch = source_->next(state_.queued(), state_.openSessions());
        if (!batch || batch->rows > 0)
            return batch;
        noteQueued(*batch);
    }
    return std::nullopt;
}

std::optional<RoundResult> Round::whyNotNow(const Batch& batch)
{
    if (isMetered_())
        return RoundResult{Outcome::Metered, "waiting for a network that is not metered"};
    const auto sent = static_cast<std::uint64_t>(state_.bytesSentOn(clock_().day));
    if (sent + batch.bytes.size() > terms_.maximumBytesADay)
        return RoundResult{Outcome::DayUsedUp,
                           fmt::format("maximum_bytes_a_day: {} of {} bytes are sent; the rest goes tomorrow", sent,
                                       terms_.maximumBytesADay)};
    return std::nullopt;
}

RoundResult Round::sendConnected(std::optional<Batch> batch, bool isPseudonymDue)
{
    if (goesBack()) { // also under a pseudonym that is due, so that the fleet sees each row under one
        keep(state_.sendAgain(identity_));
        patience_.rest();
        batch = nextToSend();
    } else if (isPseudonymDue && awaitsConfirmation())
        return {Outcome::Waiting, "waiting for the fleet to confirm what was sent under the old pseudonym"};
    else if (isPseudonymDue)
        return {Outcome::Waiting, "everything is confirmed; the next round has a new pseudonym"};
    return sendAll(std::move(batch));
}

// Whether the stream seems to have lost what it had: the fleet answers, and has not confirmed it for long.
bool Round::goesBack()
{
    return terms_.forgetWhen == ForgetWhen::Stored && complaint_.empty() && awaitsConfirmation()
        && patience_.isOver(state_.stored(), clock_().now);
}

RoundResult Round::sendAll(std::optional<Batch> waiting)
{
    std::int64_t batches = 0;
    while (waiting && !isForgotten_) {
        if (auto reason = whyNotNow(*waiting)) {
            reason->batches = batches;
            return *std::move(reason);
        }
        const Answer answer = putPersistently(*waiting);
        if (!answer.isStored())
            return {outcomeOf(answer.kind), answer.sentence, batches};
        noteQueued(*waiting);
        ++batches;
        waiting = nextToSend();
    }
    if (isForgotten_)
        return {Outcome::Waiting, "the pseudonym was made anew; the next round has it", batches};
    return {Outcome::Sent, "stored", batches};
}

// A connection that is lost in the middle is made anew once: another server of a cluster goes on at once.
Answer Round::putPersistently(const Batch& batch)
{
    Answer answer = transport_.put(batch.messageID, batch.bytes);
    if (answer.kind != Answer::Kind::Away)
        return answer;
    state_.noteRetry(static_cast<std::int64_t>(batch.bytes.size()), clock_().day);
    const Answer connected = transport_.connect();
    if (!connected.isStored())
        return connected.kind == Answer::Kind::Away ? answer : connected;
    askForConfirmation();
    return transport_.put(batch.messageID, batch.bytes);
}

void Round::noteQueued(const Batch& batch)
{
    keep(state_.noteQueued(identity_, batch.progress(), clock_().day));
    if (terms_.forgetWhen == ForgetWhen::Queued)
        keep(state_.noteAllStored(identity_));
}

void Round::keep(bool isStillThePseudonym)
{
    isForgotten_ = isForgotten_ || !isStillThePseudonym;
}

bool Round::awaitsConfirmation()
{
    return state_.stored() != state_.queued();
}

void Round::note(const Confirmation& confirmation)
{
    keep(state_.noteStored(identity_, {confirmation.epoch, confirmation.id}));
    if (!awaitsConfirmation())
        patience_.rest();
}

void Round::askForConfirmation()
{
    if (terms_.forgetWhen == ForgetWhen::Queued)
        return;
    complaint_.clear();
    const auto last = transport_.lastConfirmation(identity_.pseudonym);
    if (!last)
        complaint_ = last.error().sentence;
    else if (*last)
        note(**last);
}

void Round::awaitConfirmation()
{
    if (terms_.forgetWhen == ForgetWhen::Queued || !complaint_.empty())
        return;
    const auto end = std::chrono::steady_clock::now() + terms_.waitForConfirmation;
    while (!isForgotten_ && awaitsConfirmation()) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - std::chrono::steady_clock::now());
        const auto next = left.count() > 0 ? transport_.awaitConfirmation(left) : Transport::Confirmed();
        if (!next || !*next)
            break;
        note(**next);
    }
    if (!isForgotten_ && awaitsConfirmation())
        patience_.wait(state_.stored(), clock_().now);
}

} // namespace kesto_uplink
