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
    if (terms_.forgetWhen == ForgetWhen::Queued && awaitsConfirmation()) // the terms were others before
        keep(state_.noteAllStored(state_.identity()));
    const bool isPseudonymDue =
        state_.renew(terms_.pseudonymDays, terms_.hashKeyDays, clock_().now) == Renewal::Waiting;
    identity_ = state_.identity();
    source_ = sourceFor_(identity_);
    auto batch = nextToSend();
    if (!batch)
        return {};
    if (auto reason = whyNotNow(*batch))
        return *std::move(reason);
    const Answer connected = connect();
    if (!connected.isStored())
        return {outcomeOf(connected.kind), connected.sentence};
    RoundResult result = sendConnected(*std::move(batch), isPseudonymDue);
    if (result.outcome != Outcome::Interrupted)
        awaitConfirmation();
    transport_.disconnect();
    const bool isWell = result.outcome == Outcome::Sent || result.outcome == Outcome::Waiting;
    if (isWell && !complaint_.empty())
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

RoundResult Round::sendConnected(Batch batch, bool isPseudonymDue)
{
    if (goesBack(batch)) { // also under a pseudonym that is due, so that the fleet sees each row under one
        keep(state_.sendAgain(identity_));
        patience_.rest();
        return sendAll(nextToSend());
    }
    if (isPseudonymDue)
        return awaitRenewal();
    return sendAll(std::move(batch));
}

// Whether the stream seems to have lost what it had: the fleet answers, and has not confirmed it for long. What was
// sent from another store stays: its rows are gone, or have other keys here.
bool Round::goesBack(const Batch& next)
{
    return terms_.forgetWhen == ForgetWhen::Stored && complaint_.empty() && next.first.epoch == state_.queued().epoch
        && isPatienceOver();
}

bool Round::isPatienceOver()
{
    return awaitsConfirmation() && patience_.isOver(state_.stored(), clock_().now);
}

// Gives up what is not confirmed for a day and cannot be sent again: else the device would keep the pseudonym for ever.
RoundResult Round::awaitRenewal()
{
    if (isPatienceOver()) {
        keep(state_.noteAllStored(identity_));
        patience_.rest();
        return {Outcome::Waiting, "nothing was confirmed for a day; the next round has a new pseudonym"};
    }
    if (!awaitsConfirmation())
        return {Outcome::Waiting, "everything is confirmed; the next round has a new pseudonym"};
    patience_.wait(state_.stored(), clock_().now);
    return {Outcome::Waiting, "waiting for the fleet to confirm what was sent under the old pseudonym"};
}

// A connection that is lost in the middle is made anew once for each batch. All that stands against an attempt is
// looked at before each: under a pseudonym that was made anew meanwhile, nothing more may leave.
RoundResult Round::sendAll(std::optional<Batch> waiting)
{
    std::int64_t batches = 0;
    bool isSecondAttempt = false;
    while (waiting) {
        keep(state_.identity().pseudonym == identity_.pseudonym);
        if (isForgotten_)
            break;
        if (auto reason = whyNotNow(*waiting)) {
            reason->batches = batches;
            return *std::move(reason);
        }
        const Answer answer = transport_.put(waiting->messageID, waiting->bytes);
        if (answer.isStored()) {
            noteQueued(*waiting);
            ++batches;
            isSecondAttempt = false;
            waiting = nextToSend();
            continue;
        }
        state_.noteRetry(static_cast<std::int64_t>(waiting->bytes.size()), clock_().day);
        if (answer.kind != Answer::Kind::Away || isSecondAttempt)
            return {outcomeOf(answer.kind), answer.sentence, batches};
        if (const Answer connected = connect(); !connected.isStored()) {
            const Answer& reason = connected.kind == Answer::Kind::Away ? answer : connected;
            return {outcomeOf(reason.kind), reason.sentence, batches};
        }
        isSecondAttempt = true;
    }
    if (isForgotten_)
        return {Outcome::Waiting, "the pseudonym was made anew; the next round has it", batches};
    return {Outcome::Sent, "stored", batches};
}

// Another server of a cluster goes on at once.
Answer Round::connect()
{
    Answer connected = transport_.connect();
    if (connected.isStored())
        askForConfirmation();
    return connected;
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
