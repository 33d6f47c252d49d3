// SPDX-License-Identifier: Apache-2.0
// The steps of a batch. The ingest checks its owner, stores its rows, puts aside what is wrong and tells its device.
// Only then it acknowledges the batch to the stream.
#include "kesto-ingest/Ingest.h"

#include "kesto-ingest/stream/DeadLetters.h"
#include "kesto-ingest/stream/Subjects.h"

#include <fmt/format.h>

#include <algorithm>
#include <iterator>
#include <utility>

namespace kesto_ingest {

namespace {

constexpr std::string_view knownEdition = "1";
constexpr std::size_t mostFetched = 8; // batches, of which each may become large
constexpr std::chrono::milliseconds longestWait{1000};
constexpr std::chrono::milliseconds shortestWait{1};
constexpr std::chrono::minutes rememberGivenBack{1}; // then another copy has it
constexpr std::size_t mostGivenBack = 10'000;
constexpr std::chrono::seconds holdOnEvery{10}; // of the 60 that the stream waits

Counter storedRows(Table table)
{
    constexpr std::array<Counter, tableCount> counters = {Counter::RowsStoredBatches, Counter::RowsStoredEvents,
                                                          Counter::RowsStoredStretches, Counter::RowsStoredSessions};
    return counters[static_cast<std::size_t>(table)];
}

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
    if (nextAttempt_ && now < *nextAttempt_) // nothing more is taken meanwhile: other copies may have more luck
        surroundings_.rest(std::min(longestWait, std::chrono::ceil<std::chrono::milliseconds>(*nextAttempt_ - now)));
    else if (held_.empty() || (!nextAttempt_ && !isDue()))
        takeWhatComes();
    else if (auto stored = store(); stored)
        succeed();
    else
        fail(stored.error());
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
    if (!held_.empty())
        wait = std::clamp(std::chrono::ceil<std::chrono::milliseconds>(oldest_ + limits_.joining - surroundings_.now()),
                          shortestWait, longestWait);
    // The first comes at once; the stream gives several together, and may wait for the last of them.
    auto deliveries = stream_.fetch(held_.empty() ? 1 : mostFetched, wait);
    metrics_.isStreamUp = deliveries.has_value();
    if (!deliveries) {
        metrics_.add(Counter::StreamFailures);
        return fail(deliveries.error());
    }
    if (nextAttempt_)
        succeed();
    if (held_.empty())
        oldest_ = heldOn_ = surroundings_.now();
    std::ranges::move(*deliveries, std::back_inserter(fetched_));
}

void Ingest::finish()
{
    for (const Delivery& delivery : fetched_)
        stream_.giveBack(delivery);
    fetched_.clear();
    const auto stored = store();
    if (stored)
        return;
    surroundings_.log(fmt::format("what was not stored goes back to the stream: {}", stored.error()));
    for (const Held& held : held_)
        stream_.giveBack(held.delivery);
}

void Ingest::holdOn()
{
    const auto now = surroundings_.now();
    if ((held_.empty() && fetched_.empty()) || now - heldOn_ < holdOnEvery)
        return;
    heldOn_ = now;
    for (const Delivery& delivery : fetched_)
        stream_.workGoesOn(delivery);
    for (const Held& held : held_)
        stream_.workGoesOn(held.delivery);
}

bool Ingest::isDue() const
{
    return !held_.empty() && (isFull() || surroundings_.now() - oldest_ >= limits_.joining);
}

bool Ingest::isFull() const
{
    return rows_ >= limits_.rows || bytes_ >= limits_.bytes;
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
    bytes_ += delivery.payload.size();
    held_.push_back({.delivery = std::move(delivery), .refusal = std::move(reason)});
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
        bytes_ += sizeof(BadRow) + row.reason.size() + row.line.size();
    const std::size_t source = held_.size();
    bytes_ += delivery.payload.size();
    const Confirmation confirmation = {credential, batch->device, batch->epoch, batch->last, delivery.isRepeated};
    held_.push_back(
        {.delivery = std::move(delivery), .badRows = std::move(batch->badRows), .confirmation = confirmation});
    for (const Row& row : batch->rows)
        addRow(row, source);
    metrics_.waitingRows = rows_;
}

void Ingest::addRow(const Row& row, std::size_t source)
{
    auto place = std::ranges::find_if(blocks_, [&row, this](const TableBlock& each) {
        return each.table == row.table && each.block.takes(row.week) && each.block.size() < limits_.rows;
    });
    if (place == blocks_.end())
        place = blocks_.insert(place, {.table = row.table, .block = {}});
    place->block.add(row.json, row.week, source);
    ++rows_;
    bytes_ += row.json.size();
}

// A block that is stored is not stored again if something later fails.
std::expected<void, std::string> Ingest::storeBlocks()
{
    while (!blocks_.empty()) {
        const TableBlock& next = blocks_.back();
        const auto refused = insertBlock(database_, name(next.table), next.block);
        metrics_.isDatabaseUp = refused.has_value();
        if (!refused) {
            metrics_.add(Counter::InsertFailures);
            return std::unexpected(refused.error());
        }
        for (const RefusedRow& row : *refused)
            held_[next.block.source(row.row)].badRows.push_back(
                {row.reason, std::string(next.block.rows(row.row, row.row + 1))});
        if (refused->size() < next.block.size())
            metrics_.lastStored =
                std::chrono::duration_cast<std::chrono::seconds>(std::chrono::system_clock::now().time_since_epoch())
                    .count();
        metrics_.add(Counter::Inserts);
        metrics_.add(Counter::RowsRefusedDatabase, refused->size());
        metrics_.add(storedRows(next.table), next.block.size() - refused->size());
        rows_ -= next.block.size();
        metrics_.waitingRows = rows_;
        blocks_.pop_back();
    }
    return {};
}

std::expected<void, std::string> Ingest::putAside(Held& held)
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

std::expected<void, std::string> Ingest::tellDevices()
{
    std::vector<Confirmation> confirmations;
    confirmations.reserve(held_.size());
    for (const Held& held : held_)
        if (held.refusal.empty())
            confirmations.push_back(held.confirmation);
    auto told = confirmations_.tell(confirmations);
    if (told)
        metrics_.add(Counter::BatchesStored, confirmations.size());
    return told;
}

std::expected<void, std::string> Ingest::store()
{
    if (auto stored = storeBlocks(); !stored)
        return stored;
    const auto answered = answer();
    if (!answered) {
        metrics_.add(Counter::StreamFailures);
        metrics_.isStreamUp = false;
    }
    return answered;
}

std::expected<void, std::string> Ingest::answer()
{
    for (Held& held : held_) {
        if (auto put = putAside(held); !put)
            return put;
        holdOn();
    }
    if (auto told = tellDevices(); !told)
        return told;
    for (const Held& held : held_)
        stream_.acknowledge(held.delivery);
    held_.clear();
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
    if (pause_ != std::chrono::milliseconds{0})
        surroundings_.log("it goes on");
    pause_ = std::chrono::milliseconds{0};
    nextAttempt_.reset();
    rows_ = bytes_ = 0;
    metrics_.waitingRows = 0;
}

} // namespace kesto_ingest
