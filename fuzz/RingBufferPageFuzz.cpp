// SPDX-License-Identifier: Apache-2.0
// Clients write the content of a page of the kernel's trace, except the heads of its records. For all bytes, its
// records lie inside it, one behind the other; and pages of several processors yield only the service's own events, in
// the order of time, up to the requested moment, and each once.
//
// The input is pages, cut where a byte of the first one says; each is a copy, so that reading beyond its end is
// noticed.
#include "platform/linux/trace/TraceMerger.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <vector>

namespace {

using Page = std::vector<std::byte>;

void require(bool holds)
{
    if (!holds)
        std::abort();
}

std::size_t requireRecordsInside(const Page& page, const platform::RingBufferPageFormat& format)
{
    platform::RingBufferPageReader reader(page, format);
    const std::byte* last = page.data();
    std::size_t count = 0;
    while (const auto record = reader.next()) {
        const std::byte* const begin = record->bytes.data();
        require(record->bytes.empty() || (begin >= last && begin + record->bytes.size() <= page.data() + page.size()));
        last = record->bytes.empty() ? last : begin + record->bytes.size();
        require(++count <= page.size() / 4);
    }
    return count;
}

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    constexpr std::uint16_t markerType = 19;
    const auto* const bytes = reinterpret_cast<const std::byte*>(data);
    const std::size_t pageSize = size < 8 ? 8 : 16 + 64 * std::size_t{data[7]};
    platform::TraceMerger merger({}, markerType);
    std::size_t records = 0;
    std::uint32_t cpu = 0;
    std::uint64_t last = 0;
    std::size_t events = 0;
    const auto takeUpTo = [&](std::uint64_t time) {
        for (const platform::CollectedEvent& event : merger.eventsUpTo(time)) {
            require(event.timestamp >= last && event.timestamp <= time);
            last = event.timestamp;
            ++events;
        }
        last = std::max(last, time);
    };
    // As it is, too: a page with such a byte is a page.
    const Page whole(bytes, bytes + size);
    records += requireRecordsInside(whole, {});
    requireRecordsInside(whole, {.commitSize = 4, .dataOffset = 12});
    merger.take(cpu, whole);
    for (std::size_t taken = 0; taken < size; taken += pageSize) {
        const Page page(bytes + taken, bytes + std::min(taken + pageSize, size));
        records += requireRecordsInside(page, {});
        merger.take(++cpu % 5, page);
        if (cpu % 4 == 0)
            takeUpTo(last + size);
    }
    takeUpTo(UINT64_MAX);
    require(events <= records);
    return 0;
}
