// SPDX-License-Identifier: Apache-2.0
// Puts the events of all processors into one order, that of time.
//
// Each processor's pages come in the order of time, but a page may come before an older page of another processor. So
// events wait until no older event can come any more; the caller knows this time, and gives it to `eventsUpTo`. An
// event that comes too late is lost, because it would be in the wrong order.
#pragma once

#include "platform/linux/trace/CollectedEvent.h"
#include "platform/linux/trace/RingBufferPage.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace platform {

// One thread at a time.
class TraceMerger {
public:
    // At most this many events wait; further ones are lost.
    static constexpr std::size_t mostWaiting = 1'000'000;

    // `recordType` is the kernel's number for the records that the marker makes.
    TraceMerger(RingBufferPageFormat format, std::uint16_t recordType) noexcept
        : format_(format),
          recordType_(recordType)
    {
    }

    // Takes the service's own events out of a page, which may hold any bytes.
    void take(std::uint32_t cpu, std::span<const std::byte> page);

    // The events up to and including that time that were not returned before: in the order of time, events of the same
    // time in the order of the processors. Valid until the next call.
    [[nodiscard]] std::span<const CollectedEvent> eventsUpTo(std::uint64_t time);

    // How many events were lost since the last call: in the kernel, in broken pages (one each), because too many
    // waited, and because they came too late.
    [[nodiscard]] std::uint64_t takeLosses() noexcept;

private:
    [[nodiscard]] bool isOwnEvent(std::span<const std::byte> record) const noexcept;
    void mergeNeighbours();
    void add(std::vector<CollectedEvent>& stream, std::uint32_t cpu, const RingBufferRecord& record);

    const RingBufferPageFormat format_;
    const std::uint16_t recordType_;
    std::vector<std::vector<CollectedEvent>> streams_; // one for each processor, in the order of time
    std::vector<CollectedEvent> merged_;
    std::vector<CollectedEvent> merging_; // the result of a merge
    std::vector<std::size_t> runs_; // the begins of the ordered parts of `merged_`, and its end
    std::size_t waiting_ = 0;
    std::uint64_t doneUpTo_ = 0;
    std::uint64_t losses_ = 0;
};

} // namespace platform
