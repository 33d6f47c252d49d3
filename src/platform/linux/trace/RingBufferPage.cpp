// SPDX-License-Identifier: Apache-2.0
// Every length is checked against the rest of the page. The first wrong one ends the page, because the following
// records cannot be found.
#include "platform/linux/trace/RingBufferPage.h"

namespace platform {
namespace {

// The number of bytes that were committed has flags in its upper bits.
constexpr std::uint32_t committedBytes = 0xFFFFF;
constexpr std::uint32_t missedAreCounted = 1U << 30;
constexpr std::uint32_t areMissed = 1U << 31;

// A number of 4 or 8 bytes.
std::uint64_t numberAt(std::span<const std::byte> bytes, std::size_t offset, std::size_t size)
{
    return size == sizeof(std::uint64_t) ? fieldAt<std::uint64_t>(bytes, offset)
                                         : fieldAt<std::uint32_t>(bytes, offset);
}

} // namespace

RingBufferPageReader::RingBufferPageReader(std::span<const std::byte> page, const RingBufferPageFormat& format)
{
    if (page.size() < format.dataOffset) {
        isBroken_ = true;
        return;
    }
    time_ = fieldAt<std::uint64_t>(page, 0);
    const std::uint64_t commit = numberAt(page, RingBufferPageFormat::commitOffset, format.commitSize);
    const std::span<const std::byte> data = page.subspan(format.dataOffset);
    const std::size_t size = commit & committedBytes;
    if (size > data.size()) {
        isBroken_ = true;
        return;
    }
    rest_ = data.first(size);
    if ((commit & areMissed) == 0)
        return;
    const bool isCounted = (commit & missedAreCounted) != 0 && data.size() - size >= format.commitSize;
    missedEvents_ = isCounted ? numberAt(data, size, format.commitSize) : 1;
}

// A record of more than 28 words has its length in a word of its own; the length includes that word.
std::optional<RingBufferRecord> RingBufferPageReader::takeLongRecord() noexcept
{
    if (!holds(2))
        return std::nullopt;
    const std::uint32_t length = word(1);
    if (length < wordSize) {
        isBroken_ = true;
        return std::nullopt;
    }
    return takeRecord(2 * wordSize, length - wordSize);
}

// Without a time, only padding follows; with a time, it replaces an event that was taken back.
void RingBufferPageReader::skipPadding(std::uint32_t delta) noexcept
{
    if (delta == 0) {
        rest_ = {};
        return;
    }
    time_ += delta;
    if (!holds(2))
        return;
    const std::size_t length = word(1);
    isBroken_ = length > rest_.size() - wordSize;
    if (!isBroken_)
        rest_ = rest_.subspan(wordSize + length);
}

// The lower 59 bits of the time: the upper ones stay.
void RingBufferPageReader::setTime(std::uint32_t low) noexcept
{
    constexpr std::uint64_t given = (std::uint64_t{1} << (deltaBits + 32)) - 1;
    if (!holds(2))
        return;
    time_ = (time_ & ~given) | low | std::uint64_t{word(1)} << deltaBits;
    rest_ = rest_.subspan(2 * wordSize);
}

} // namespace platform
