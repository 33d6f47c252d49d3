// A page of the kernel's trace, taken apart. The kernel hands the events of one processor out in pages, in the binary
// form in which it keeps them: a time, the number of bytes that follow, and records, each with the time that passed
// since the one before.
//
// Here they are plain bytes, so that pages can be recorded, made by hand, and fuzzed: whatever stands in one, reading
// it stays inside it and ends.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <optional>
#include <span>

namespace platform {

// Where things stand in a page, which depends on the size of the kernel's `long` (events/header_page).
struct TracePageFormat {
    static constexpr std::size_t commitOffset = 8;

    std::size_t commitSize = 8; // of a `long`
    std::size_t dataOffset = 16;
};

// What stands at that place, which the bytes must hold, in the processor's own form.
template <typename Field> Field fieldAt(std::span<const std::byte> bytes, std::size_t offset) noexcept
{
    Field field{};
    std::memcpy(&field, bytes.data() + offset, sizeof field);
    return field;
}

struct TraceRecord {
    std::uint64_t timestamp = 0; // of the trace's clock
    std::span<const std::byte> bytes; // from the record's type on; valid as long as the page
};

// Goes through one page. One thread; the page stays where it is meanwhile.
class TracePageReader {
public:
    TracePageReader(std::span<const std::byte> page, const TracePageFormat& format);

    // The next record, or nothing at the page's end or where the page makes no sense any more.
    [[nodiscard]] std::optional<TraceRecord> next();

    // Events that were lost before this page, for want of room; 1 when the kernel does not say how many.
    [[nodiscard]] std::uint64_t missedEvents() const noexcept { return missedEvents_; }
    // Whether something in it cannot be; what stood before that was read. After the last record.
    [[nodiscard]] bool isBroken() const noexcept { return isBroken_; }

private:
    // What the five lowest bits of a record's head say. Below, they are the length in words.
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
    [[nodiscard]] std::optional<TraceRecord> takeRecord(std::size_t headSize, std::size_t size) noexcept;
    [[nodiscard]] std::optional<TraceRecord> takeLongRecord() noexcept;
    void skipPadding(std::uint32_t delta) noexcept;
    void setTime(std::uint32_t low) noexcept;

    std::span<const std::byte> rest_;
    std::uint64_t time_ = 0;
    std::uint64_t missedEvents_ = 0;
    bool isBroken_ = false;
};

// Inline: it is what all the time is spent with.
inline std::optional<TraceRecord> TracePageReader::next()
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

inline std::optional<TraceRecord> TracePageReader::takeRecord(std::size_t headSize, std::size_t size) noexcept
{
    if (size > rest_.size() - headSize) {
        isBroken_ = true;
        return std::nullopt;
    }
    const TraceRecord record{time_, rest_.subspan(headSize, size)};
    const std::size_t whole = headSize + (size + wordSize - 1) / wordSize * wordSize;
    rest_ = whole < rest_.size() ? rest_.subspan(whole) : std::span<const std::byte>();
    return record;
}

} // namespace platform
