// SPDX-License-Identifier: Apache-2.0
// Reads a page of the kernel's trace. The kernel returns the events of one processor in pages, in its own binary form:
// a time, the number of bytes that follow, and records, each with the time since the record before.
//
// The reader takes plain bytes, so that pages can be recorded, made by hand, and fuzzed: for any bytes it stays inside
// the page and ends.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>

namespace platform {

// The layout of a page, which depends on the size of the kernel's `long` (events/header_page).
struct RingBufferPageFormat {
    static constexpr std::size_t commitOffset = 8;

    std::size_t commitSize = 8; // of a `long`
    std::size_t dataOffset = 16;
};

// The number at that place, in the processor's own form; all its bytes must be there.
template <typename Field> Field fieldAt(std::span<const std::byte> bytes, std::size_t offset) noexcept
{
    Field field{};
    std::memcpy(&field, bytes.data() + offset, sizeof field);
    return field;
}

struct RingBufferRecord {
    std::uint64_t timestamp = 0; // of the trace's clock
    std::span<const std::byte> bytes; // from the record's type on; valid as long as the page
};

// Reads one page, which must stay valid meanwhile. One thread.
class RingBufferPageReader {
public:
    RingBufferPageReader(std::span<const std::byte> page, const RingBufferPageFormat& format);

    // The next record, or nothing at the page's end or where the page is broken.
    [[nodiscard]] std::optional<RingBufferRecord> next();

    // The number of events that were lost before this page because the buffer was full; 1 if the kernel does not report
    // the number.
    [[nodiscard]] std::uint64_t missedEvents() const noexcept { return missedEvents_; }
    // Whether the page is broken; the records before the error were read. Call it after the last record.
    [[nodiscard]] bool isBroken() const noexcept { return isBroken_; }

private:
    // Values of the five lowest bits of a record's head. Other values are the length in words.
    enum Kind : std::uint32_t { LongRecord = 0, Padding = 29, TimeExtend = 30, TimeStamp = 31 };
    static constexpr std::size_t wordSize = 4;
    static constexpr unsigned kindBits = 5;
    static constexpr unsigned deltaBits = 27;

    [[nodiscard]] std::uint32_t word(std::size_t index) const noexcept
    {
        return fieldAt<std::uint32_t>(rest_, index * wordSize);
    }
    [[nodiscard]] bool holds(std::size_t words) noexcept
    {
        isBroken_ |= rest_.size() < words * wordSize;
        return !isBroken_;
    }
    [[nodiscard]] std::optional<RingBufferRecord> takeRecord(std::size_t headSize, std::size_t size) noexcept;
    [[nodiscard]] std::optional<RingBufferRecord> takeLongRecord() noexcept;
    void skipPadding(std::uint32_t delta) noexcept;
    void setTime(std::uint32_t low) noexcept;

    std::span<const std::byte> rest_;
    std::uint64_t time_ = 0;
    std::uint64_t missedEvents_ = 0;
    bool isBroken_ = false;
};

// Inline, because nearly all the time is spent here.
inline std::optional<RingBufferRecord> RingBufferPageReader::next()
{
    while (!rest_.empty() && holds(1)) {
        const std::uint32_t kind = word(0) & ((1U << kindBits) - 1);
        const std::uint32_t delta = word(0) >> kindBits;
        switch (kind) {
        case Padding: skipPadding(delta); break;
        case TimeExtend:
            if (!holds(2))
                return std::nullopt;
            time_ += delta + (std::uint64_t{word(1)} << deltaBits);
            rest_ = rest_.subspan(2 * wordSize);
            break;
        case TimeStamp: setTime(delta); break;
        case LongRecord: time_ += delta; return takeLongRecord();
        default: time_ += delta; return takeRecord(wordSize, kind * wordSize);
        }
    }
    return std::nullopt;
}

inline std::optional<RingBufferRecord> RingBufferPageReader::takeRecord(std::size_t headSize, std::size_t size) noexcept
{
    if (size > rest_.size() - headSize) {
        isBroken_ = true;
        return std::nullopt;
    }
    const RingBufferRecord record{time_, rest_.subspan(headSize, size)};
    const std::size_t whole = headSize + (size + wordSize - 1) / wordSize * wordSize;
    rest_ = whole < rest_.size() ? rest_.subspan(whole) : std::span<const std::byte>();
    return record;
}

} // namespace platform
