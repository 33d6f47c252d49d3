// Puts the events of all processors into one order, that of time.
//
// Each processor's pages come in the order of time, but one processor's may come before another's that are older. So
// events wait until nothing older can come any more, which whoever feeds the pages knows: that time moves on with every
// call of `eventsUpTo`. What comes in spite of it is lost rather than told in the wrong order.
#pragma once

#include "platform/linux/trace/TracePage.h"
#include "platform/linux/trace/TracedMarker.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

namespace platform {

// One thread at a time.
class TraceMerger {
public:
    // How many events wait at most; those beyond are lost.
    static constexpr std::size_t mostWaiting = 1'000'000;

    // `recordType` is the kernel's number for the records that the marker makes.
    TraceMerger(TracePageFormat format, std::uint16_t recordType) noexcept
        : format_(format),
          recordType_(recordType) { }

    // Takes the events of our own out of a page: any bytes.
    void take(std::uint32_t cpu, std::span<const std::byte> page);

    // The events up to that time, it included, that were not handed out before: in the order of time, those of one
    // time in the order of the processors. Valid until the next call.
    [[nodiscard]] std::span<const TracedMarker> eventsUpTo(std::uint64_t time);

    // How many events were lost since the last call: in the kernel, in pages that make no sense (one each), for want
    // of room here, and because they came too late.
    [[nodiscard]] std::uint64_t takeLosses() noexcept;

private:
    [[nodiscard]] bool isMarker(std::span<const std::byte> record) const noexcept;
    void mergeNeighbours();
    void add(std::vector<TracedMarker>& stream, std::uint32_t cpu, const TraceRecord& record);

    const TracePageFormat format_;
    const std::uint16_t recordType_;
    std::vector<std::vector<TracedMarker>> streams_; // one a processor, each in the order of time
    std::vector<TracedMarker> merged_;
    std::vector<TracedMarker> merging_; // what becomes of it
    std::vector<std::size_t> runs_; // where the parts of `merged_` begin that are in order, and its end
    std::size_t waiting_ = 0;
    std::uint64_t doneUpTo_ = 0;
    std::uint64_t losses_ = 0;
};

} // namespace platform
