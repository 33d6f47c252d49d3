// SPDX-License-Identifier: Apache-2.0
// The steps of a batch. The ingest checks its owner, stores its rows, puts aside what is wrong and tells its device.
// Only then it acknowledges the batch to the stream. Loads are stored one after another, so devices are told in order.
#include "kesto-ingest/Ingest.h"

#include "kesto-ingest/stream/DeadLetters.h"
#include "kesto-ingest/stream/Subjects.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <utility>

namespace kesto_ingest {

namespace {

using std::chrono::milliseconds;

constexpr std::string_view knownEdition = "1";
constexpr std::size_t mostFetched = 8; // batches, of which each may become large
constexpr milliseconds longestWait{1000};
constexpr milliseconds shortestWait{1};
constexpr milliseconds waitWhileStoring{50}; // for batches: what is stored shall be answered soon
constexpr std::chrono::minutes rememberGivenBack{1}; // then another copy has it
constexpr std::size_t mostGivenBack = 10'000;
constexpr std::chrono::seconds holdOnEvery{10}; // of the 60 that the stream waits

} // namespace

Ingest::Ingest(Stream& stream, Database& database, Metrics& metrics, IngestLimits limits, Surroundings surroundings)
    : stream_(stream),
      database_(database),
      metrics_(metrics),
      limits_(limits),
      surroundings_(std::move(surroundings)),
      owners_(stream),
      confirmations_(stream, [this] { holdOn(); })
{
}

void Ingest::turn()
{
    holdOn();
    const auto now = surroundings_.now();
    if (!isStoring() && nextAttempt_ && now < *nextAttempt_)
        return surroundings_.rest(std::min(longestWait, std::chrono::ceil<milliseconds>(*nextAttempt_ - now)));
    if (!isStoring() && (!storing_.batches.empty() || (isDue() && !nextAttempt_)))
        startStoring();
    // Nothing more is taken after a failure: other copies may have more luck.
    const bool takesMore = !isStoring() || !(isFull() || nextAttempt_);
    if (isStoring() && isStored(takesMore ? milliseconds{0} : longestWait))
        endStoring();
    else if (takesMore)
        takeWhatComes();
}

void Ingest::takeWhatComes()
{
    if (fetched_.empty())
        fetch();
    while (!fetched_.empty() && !isFull()) {
        Delivery delivery = std::move(fetched_.front());
        fetched_.pop_front();
        take(std::move(delivery));
        holdOn();
    }
}

void Ingest::fetch()
{
    auto wait = longestWait;
    if (isStoring())
        wait = waitWhileStoring;
    else if (!taking_.batches.empty())
        wait = std::clamp(std::chrono::ceil<milliseconds>(taking_.oldest + limits_.joining - surroundings_.now()),
                          shortestWait, wait);
    // The first comes at once; the stream gives several together, and may wait for the last of them.
    auto deliveries = stream_.fetch(taking_.batches.empty() ? 1 : mostFetched, wait);
    metrics_.isStreamUp = deliveries.has_value();
    if (!deliveries) {
        metrics_.add(Counter::StreamFailures);
        return fail(deliveries.error());
    }
    if (nextAttempt_)
        succeed();
    if (taking_.batches.empty() && storing_.batches.empty())
        heldOn_ = surroundings_.now();
    std::ranges::move(*deliveries, std::back_inserter(fetched_));
}

void Ingest::finish()
{
    for (const Delivery& delivery : fetched_)
        stream_.giveBack(delivery);
    fetched_.clear();
    while (!storing_.batches.empty() || !taking_.batches.empty()) {
        if (!isStoring())
            startStoring();
        while (!isStored(longestWait))
            holdOn();
        if (const Outcome stored = answerWhatIsStored(); !stored) {
            surroundings_.log(fmt::format("what was not stored goes back to the stream: {}", stored.error()));
            giveBackAll(storing_);
            return giveBackAll(taking_);
        }
    }
}

void Ingest::giveBackAll(const Load& load)
{
    for (const Held& held : load.batches)
        stream_.giveBack(held.delivery);
}

void Ingest::holdOn()
{
    const auto now = surroundings_.now();
    const bool hasNothing = taking_.batches.empty() && storing_.batches.empty() && fetched_.empty();
    if (hasNothing || now - heldOn_ < holdOnEvery)
        return;
    heldOn_ = now;
    for (const Delivery& delivery : fetched_)
        stream_.workGoesOn(delivery);
    for (const Load* const load : {&taking_, &storing_})
        for (const Held& held : load->batches)
            stream_.workGoesOn(held.delivery);
}

bool Ingest::isDue() const
{
    return !taking_.batches.empty() && (isFull() || surroundings_.now() - taking_.oldest >= limits_.joining);
}

bool Ingest::isFull() const
{
    // A busy database gets several inserts in one load: their small ones and their answers are joined, too.
    const std::size_t inserts = isStoring() ? limits_.insertsOfALoad : 1;
    return taking_.rows >= inserts * limits_.rows || taking_.bytes >= limits_.bytes;
}

// A device that is told of a batch forgets what is in the earlier ones, too.
bool Ingest::mustWaitForAnEarlierOne(const Delivery& delivery, const std::string& device)
{
    const auto earlier = givenBack_.find(device);
    if (earlier == givenBack_.end())
        return false;
    if (delivery.sequence > earlier->second.sequence && surroundings_.now() - earlier->second.time < rememberGivenBack)
        return true;
    givenBack_.erase(earlier);
    return false;
}

void Ingest::giveBack(const Delivery& delivery, const std::string& device)
{
    if (givenBack_.size() >= mostGivenBack)
        givenBack_.clear();
    givenBack_[device] = {delivery.sequence, surroundings_.now()};
    stream_.giveBack(delivery);
}

void Ingest::refuse(Delivery& delivery, Counter counter, std::string reason)
{
    metrics_.add(counter);
    surroundings_.log(fmt::format("the batch {} of {} is put aside: {}", delivery.sequence, delivery.subject, reason));
    taking_.bytes += delivery.payload.size();
    hold({.delivery = std::move(delivery), .refusal = std::move(reason)});
}

void Ingest::hold(Held held)
{
    if (taking_.batches.empty())
        taking_.oldest = surroundings_.now();
    taking_.batches.push_back(std::move(held));
}

void Ingest::take(Delivery delivery)
{
    metrics_.add(Counter::BatchesTaken);
    metrics_.add(Counter::BytesTaken, delivery.payload.size());
    if (delivery.isRepeated)
        metrics_.add(Counter::BatchesRepeated);
    const std::string credential = credentialOf(delivery.subject);
    if (credential.empty())
        return refuse(delivery, Counter::BatchesRefusedUnreadable,
                      "its subject does not end in the name of a credential");
    if (delivery.edition != knownEdition)
        return refuse(
            delivery, Counter::BatchesRefusedUnreadable,
            fmt::format("it is of edition \"{}\", and this program knows edition {}", delivery.edition, knownEdition));
    auto batch = readBatch(delivery.payload);
    if (!batch)
        return refuse(delivery, Counter::BatchesRefusedUnreadable, batch.error());
    if (mustWaitForAnEarlierOne(delivery, batch->device))
        return stream_.giveBack(delivery);
    const auto owner = owners_.claim(batch->device, credential);
    if (!owner) {
        metrics_.add(Counter::StreamFailures);
        surroundings_.log(owner.error());
        return giveBack(delivery, batch->device);
    }
    if (*owner != credential)
        return refuse(delivery, Counter::BatchesRefusedForged,
                      fmt::format("its pseudonym {} belongs to the credential {}", batch->device, *owner));
    metrics_.add(Counter::RowsRefusedSchema, batch->badRows.size());
    for (const BadRow& row : batch->badRows)
        taking_.bytes += sizeof(BadRow) + row.reason.size() + row.line.size();
    taking_.bytes += delivery.payload.size();
    for (const Row& row : batch->rows)
        taking_.add(row, batch->jsonOf(row), limits_.rows);
    metrics_.waitingRows += batch->rows.size();
    const Confirmation confirmation = {credential, batch->device, batch->epoch, batch->last, delivery.isRepeated};
    hold({.delivery = std::move(delivery), .badRows = std::move(batch->badRows), .confirmation = confirmation});
}

bool Ingest::isStored(milliseconds wait) const
{
    return stored_.wait_for(wait) != std::future_status::timeout;
}

// What could not be stored or answered comes first.
void Ingest::startStoring()
{
    if (storing_.batches.empty())
        storing_ = std::exchange(taking_, {});
    stored_ = surroundings_.start([this] { return storeBlocks(storing_, database_, metrics_); });
}

void Ingest::endStoring()
{
    if (const Outcome stored = answerWhatIsStored(); stored)
        succeed();
    else
        fail(stored.error());
}

Outcome Ingest::answerWhatIsStored()
{
    if (Outcome stored = stored_.get(); !stored)
        return stored;
    Outcome answered = answer();
    if (!answered) {
        metrics_.add(Counter::StreamFailures);
        metrics_.isStreamUp = false;
    }
    return answered;
}

Outcome Ingest::putAside(Held& held)
{
    if (held.isPutAside)
        return {};
    std::vector<DeadRow> dead;
    dead.reserve(held.badRows.size());
    for (const BadRow& row : held.badRows)
        dead.push_back({row.reason, row.line});
    const auto lost = held.refusal.empty() ? putRowsAside(stream_, held.delivery, dead, [this] { holdOn(); })
                                           : putBatchAside(stream_, held.delivery, held.refusal);
    if (!lost)
        return std::unexpected(lost.error());
    held.isPutAside = true;
    metrics_.add(Counter::LettersLost, *lost);
    if (*lost > 0)
        surroundings_.log(fmt::format("{} dead letters of the batch {} of {} are too large for the stream {}, and lost",
                                      *lost, held.delivery.sequence, held.delivery.subject, deadStream));
    return {};
}

Outcome Ingest::tellDevices()
{
    std::vector<Confirmation> confirmations;
    confirmations.reserve(storing_.batches.size());
    for (const Held& held : storing_.batches)
        if (held.refusal.empty())
            confirmations.push_back(held.confirmation);
    auto told = confirmations_.tell(confirmations);
    if (told)
        metrics_.add(Counter::BatchesStored, confirmations.size());
    return told;
}

Outcome Ingest::answer()
{
    for (Held& held : storing_.batches) {
        if (auto put = putAside(held); !put)
            return put;
        holdOn();
    }
    if (auto told = tellDevices(); !told)
        return told;
    for (const Held& held : storing_.batches)
        stream_.acknowledge(held.delivery);
    storing_ = {};
    return {};
}

void Ingest::fail(const std::string& reason)
{
    pause_ = std::clamp(pause_ * 2, limits_.shortestPause, limits_.longestPause);
    nextAttempt_ = surroundings_.now() + pause_;
    surroundings_.log(fmt::format("{}; the next attempt is in {} ms", reason, pause_.count()));
}

void Ingest::succeed()
{
    if (pause_ != milliseconds{0})
        surroundings_.log("it goes on");
    pause_ = milliseconds{0};
    nextAttempt_.reset();
}

} // namespace kesto_ingest
