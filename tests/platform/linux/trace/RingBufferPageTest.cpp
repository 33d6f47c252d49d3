// SPDX-License-Identifier: Apache-2.0
// Reading pages of the kernel's trace: recorded ones, ones made by hand with everything that a page may hold, and
// malformed ones.
#include "platform/linux/trace/RingBufferPage.h"
#include "platform/linux/trace/ImitatedTracefs.h"

#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace platform {
namespace {

using support::asBytes;
using support::RingBufferPageBuilder;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Pair;

struct PageReading {
    std::vector<std::pair<std::uint64_t, std::string>> records;
    std::uint64_t missed = 0;
    bool isBroken = false;
};

// Reads a copy that ends with the page, so that reading beyond it is noticed.
PageReading read(const std::string& page, const RingBufferPageFormat& format = {})
{
    const std::vector<char> copy(page.begin(), page.end());
    PageReading reading;
    RingBufferPageReader reader(asBytes({copy.data(), copy.size()}), format);
    while (const auto record = reader.next())
        reading.records.emplace_back(
            record->timestamp, std::string(reinterpret_cast<const char*>(record->bytes.data()), record->bytes.size()));
    reading.missed = reader.missedEvents();
    reading.isBroken = reader.isBroken();
    return reading;
}

TEST(RingBufferPages, HoldRecordsWithTheTimesThatPassedBetweenThem)
{
    const auto reading = read(RingBufferPageBuilder(1000).record(1000, "once").record(1005, "upon a time ").page());
    EXPECT_THAT(reading.records, ElementsAre(Pair(1000U, "once"), Pair(1005U, "upon a time ")));
    EXPECT_FALSE(reading.isBroken);
    EXPECT_EQ(reading.missed, 0U);
}

TEST(RingBufferPages, MayBeEmpty)
{
    const auto reading = read(RingBufferPageBuilder(1000).page());
    EXPECT_THAT(reading.records, IsEmpty());
    EXPECT_FALSE(reading.isBroken);
}

TEST(RingBufferPages, HoldLongRecordsWithTheirOwnLength)
{
    const std::string longest(112, 'a');
    const std::string longer(116, 'b');
    const std::string odd(121, 'c');
    const auto reading =
        read(RingBufferPageBuilder(1).record(1, longest).record(2, longer).record(3, odd).record(4, "end.").page());
    EXPECT_THAT(reading.records, ElementsAre(Pair(1U, longest), Pair(2U, longer), Pair(3U, odd), Pair(4U, "end.")));
    EXPECT_FALSE(reading.isBroken);
}

TEST(RingBufferPages, MoveTheTimeOnByMoreThanARecordCan)
{
    const std::uint64_t later = 1000 + (std::uint64_t{1} << 27);
    const std::uint64_t muchLater = later + 3'000'000'000'000;
    const auto reading = read(RingBufferPageBuilder(1000).record(later, "late").record(muchLater, "more").page());
    EXPECT_THAT(reading.records, ElementsAre(Pair(later, "late"), Pair(muchLater, "more")));
}

TEST(RingBufferPages, SetTheTimeAndKeepItsHighestBits)
{
    const std::uint64_t high = std::uint64_t{0xA} << 60;
    const auto reading = read(RingBufferPageBuilder(high + 1000).stamp(7'000'000'000).bytes({}).page());
    EXPECT_FALSE(reading.isBroken);
    RingBufferPageBuilder builder(high + 1000);
    builder.stamp(7'000'000'000).record(7'000'000'005, "now.");
    EXPECT_THAT(read(builder.page()).records, ElementsAre(Pair(high + 7'000'000'005, "now.")));
    const std::uint64_t lowest = high + (std::uint64_t{1} << 59);
    EXPECT_THAT(read(RingBufferPageBuilder(lowest - 1).stamp(0).record(1, "now.").page()).records,
                ElementsAre(Pair(high + 1, "now.")))
        << "every bit below the highest is set";
}

TEST(RingBufferPages, SkipWhatWasTakenBackButNotItsTime)
{
    const auto reading = read(RingBufferPageBuilder(1).takenBack(50, 48).record(60, "kept").page());
    EXPECT_THAT(reading.records, ElementsAre(Pair(60U, "kept")));
    EXPECT_FALSE(reading.isBroken);
}

TEST(RingBufferPages, EndWithPadding)
{
    const auto reading = read(RingBufferPageBuilder(1).record(2, "last").endOfData().bytes("left over").page());
    EXPECT_THAT(reading.records, ElementsAre(Pair(2U, "last")));
    EXPECT_FALSE(reading.isBroken);
}

TEST(RingBufferPages, TellHowManyEventsWereMissedBeforeThem)
{
    EXPECT_EQ(read(RingBufferPageBuilder(1).record(2, "more").missed(1234).page()).missed, 1234U);
    EXPECT_EQ(read(RingBufferPageBuilder(1).record(2, "more").missed(std::nullopt).page()).missed, 1U)
        << "at least one, if the kernel does not say";
}

TEST(RingBufferPages, WithNoRoomForTheNumberOfMissedEventsMissOne)
{
    RingBufferPageBuilder builder(1);
    builder.record(1, std::string(3992, 'x')).record(2, std::string(72, 'y'));
    const std::string page = builder.missed(std::nullopt).page();
    std::string counted = page;
    counted[11] = static_cast<char>(0xC0); // says that the number is there
    EXPECT_EQ(read(counted).missed, 1U);
    EXPECT_EQ(read(counted).records.size(), 2U);
}

TEST(RingBufferPages, OfA32BitKernelHaveAShorterHead)
{
    const std::string wide = RingBufferPageBuilder(1000).record(1007, "four").page();
    const std::string narrow = wide.substr(0, 12) + wide.substr(16);
    const auto reading = read(narrow, {.commitSize = 4, .dataOffset = 12});
    EXPECT_THAT(reading.records, ElementsAre(Pair(1007U, "four")));
}

// ---- Malformed ones

TEST(RingBufferPages, AreBrokenWhenTheyAreShorterThanTheirHead)
{
    for (std::size_t size = 0; size < 16; ++size)
        EXPECT_TRUE(read(RingBufferPageBuilder(1).page().substr(0, size)).isBroken) << size;
}

TEST(RingBufferPages, AreBrokenWhenTheyClaimMoreThanThereIs)
{
    const auto reading = read(RingBufferPageBuilder(1).record(2, "some").page(4081));
    EXPECT_TRUE(reading.isBroken);
    EXPECT_THAT(reading.records, IsEmpty());
}

TEST(RingBufferPages, AreReadUpToWhereTheyBreak)
{
    const auto whole = RingBufferPageBuilder(1).record(2, "good");
    const auto endsWith = [&](std::string_view bytes) {
        auto builder = whole;
        const auto reading = read(builder.bytes(bytes).page());
        EXPECT_THAT(reading.records, ElementsAre(Pair(2U, "good")));
        return reading.isBroken;
    };
    using namespace std::string_view_literals;
    EXPECT_TRUE(endsWith("\x01"sv)) << "not even a head";
    EXPECT_TRUE(endsWith("\x02\0\0\0abcd"sv)) << "a record beyond the end";
    EXPECT_TRUE(endsWith("\x00\0\0\0"sv)) << "a long record without its length";
    EXPECT_TRUE(endsWith("\x00\0\0\0\x03\0\0\0"sv)) << "a length that does not hold itself";
    EXPECT_TRUE(endsWith("\x00\0\0\0\xFF\xFF\xFF\xFF"sv)) << "the longest length";
    EXPECT_TRUE(endsWith("\x1E\0\0\0"sv)) << "half a time";
    EXPECT_TRUE(endsWith("\x1F\0\0\0"sv)) << "half a time stamp";
    EXPECT_TRUE(endsWith("\x3D\0\0\0"sv)) << "padding without its length";
    EXPECT_TRUE(endsWith("\x3D\0\0\0\xFF\xFF\xFF\xFF"sv)) << "padding beyond the end";
}

TEST(RingBufferPages, OfAnyBytesAreReadToAnEnd)
{
    rc::check([](std::string bytes, bool isFramed) {
        if (isFramed)
            bytes = RingBufferPageBuilder(5).bytes(bytes.substr(0, 4000)).page();
        const auto reading = read(bytes);
        RC_ASSERT(reading.records.size() <= bytes.size() / 4);
    });
}

TEST(RingBufferPages, HoldAllRecordsThatWerePutIn)
{
    rc::check([](const std::vector<std::pair<std::uint32_t, std::uint8_t>>& steps, std::uint32_t start) {
        RingBufferPageBuilder builder(start);
        std::vector<std::pair<std::uint64_t, std::string>> put;
        std::uint64_t time = start;
        std::size_t room = 4000;
        for (const auto& [step, length] : steps) {
            const std::string bytes(length + 1U, static_cast<char>(length));
            if (room < bytes.size() + 32)
                break;
            room -= bytes.size() + 32;
            time += step;
            builder.record(time, bytes);
            put.emplace_back(time, bytes);
        }
        const auto reading = read(builder.page());
        RC_ASSERT(reading.records == put);
        RC_ASSERT(!reading.isBroken);
    });
}

// ---- Recorded ones

TEST(RingBufferPages, RecordedFromAKernelHoldWhatWasEmitted)
{
    std::size_t pages = 0;
    for (const auto& entry : std::filesystem::directory_iterator(KESTO_RECORDED_PAGES)) {
        SCOPED_TRACE(entry.path());
        const auto reading = read(support::readFile(entry.path()));
        EXPECT_FALSE(reading.isBroken);
        ASSERT_FALSE(reading.records.empty());
        for (std::size_t index = 1; index < reading.records.size(); ++index)
            EXPECT_GE(reading.records[index].first, reading.records[index - 1].first);
        const bool hasLosses = entry.path().filename().native().starts_with("losses");
        EXPECT_EQ(reading.missed > 0, hasLosses);
        ++pages;
    }
    EXPECT_GE(pages, 5U);
}

} // namespace
} // namespace platform
