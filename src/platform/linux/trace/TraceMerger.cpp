// SPDX-License-Identifier: Apache-2.0
// Each processor's stream is in order, so merging neighbouring streams orders all of them; this costs almost nothing if
// one processor does all the work.
#include "platform/linux/trace/TraceMerger.h"

#include <algorithm>
#include <utility>

namespace platform {
namespace {

// A record: the kernel's type (2 bytes) and thread (4), then the bytes that were written to the marker.
constexpr std::size_t threadOffset = 4;
constexpr std::size_t eventOffset = 8;
constexpr std::size_t recordSize = eventOffset + sizeof(EmittedEvent);

bool isBefore(const CollectedEvent& left, const CollectedEvent& right)
{
    return left.timestamp < right.timestamp;
}

} // namespace

bool TraceMerger::isOwnEvent(std::span<const std::byte> record) const noexcept
{
    return record.size() == recordSize && fieldAt<std::uint16_t>(record, 0) == recordType_
        && fieldAt<std::uint32_t>(record, eventOffset) == EmittedEvent::ownTag;
}

void TraceMerger::take(std::uint32_t cpu, std::span<const std::byte> page)
{
    if (cpu >= streams_.size())
        streams_.resize(cpu + 1);
    RingBufferPageReader reader(page, format_);
    losses_ += reader.missedEvents();
    while (const auto record = reader.next())
        if (isOwnEvent(record->bytes))
            add(streams_[cpu], cpu, *record);
    losses_ += reader.isBroken() ? 1 : 0;
}

void TraceMerger::add(std::vector<CollectedEvent>& stream, std::uint32_t cpu, const RingBufferRecord& record)
{
    const bool isLate =
        record.timestamp <= doneUpTo_ || (!stream.empty() && record.timestamp < stream.back().timestamp);
    if (isLate || waiting_ == mostWaiting) {
        ++losses_;
        return;
    }
    ++waiting_;
    CollectedEvent& event = stream.emplace_back();
    event.timestamp = record.timestamp;
    event.threadID = fieldAt<std::uint32_t>(record.bytes, threadOffset);
    event.cpu = cpu;
    event.emitted = fieldAt<EmittedEvent>(record.bytes, eventOffset);
}

std::span<const CollectedEvent> TraceMerger::eventsUpTo(std::uint64_t time)
{
    doneUpTo_ = std::max(doneUpTo_, time);
    merged_.clear();
    runs_.assign(1, 0);
    for (auto& stream : streams_) {
        const auto end = std::ranges::upper_bound(stream, doneUpTo_, {}, &CollectedEvent::timestamp);
        if (end == stream.begin())
            continue;
        merged_.insert(merged_.end(), stream.begin(), end);
        stream.erase(stream.begin(), end);
        runs_.push_back(merged_.size());
    }
    waiting_ -= merged_.size();
    while (runs_.size() > 2)
        mergeNeighbours();
    return merged_;
}

// Halves the number of runs; a run without a neighbour stays as it is.
void TraceMerger::mergeNeighbours()
{
    merging_.resize(merged_.size());
    const auto at = [](auto& events, std::size_t index) { return events.begin() + static_cast<std::ptrdiff_t>(index); };
    std::size_t kept = 1;
    for (std::size_t run = 0; run + 1 < runs_.size(); run += 2) {
        const std::size_t begin = runs_[run];
        const std::size_t middle = runs_[run + 1];
        const std::size_t end = runs_[std::min(run + 2, runs_.size() - 1)];
        std::merge(at(merged_, begin), at(merged_, middle), at(merged_, middle), at(merged_, end), at(merging_, begin),
                   isBefore);
        runs_[kept++] = end;
    }
    runs_.resize(kept);
    merged_.swap(merging_);
}

std::uint64_t TraceMerger::takeLosses() noexcept
{
    return std::exchange(losses_, 0);
}

} // namespace platform
