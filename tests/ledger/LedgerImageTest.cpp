// SPDX-License-Identifier: Apache-2.0
// What a ledger leaves behind: whole after a kill at any moment, readable by other versions.
#include "ledger/LedgerImage.h"

#include <cstring>
#include <gmock/gmock.h>
#include <memory>

namespace ledger {
namespace {

using testing::ElementsAre;
using testing::Field;
using testing::IsEmpty;

class LedgerImageTest : public testing::Test {
protected:
    LedgerImageTest() { image().begin({.began = 1'800'000'000, .counts = {}, .store = {}, .culprits = {}}); }
    [[nodiscard]] LedgerImage& image() { return *image_; }
    void add(Counter counter, std::uint64_t count)
    {
        Tally tally;
        tally.add(counter, count);
        image().add(tally, std::nullopt);
    }
    [[nodiscard]] std::uint64_t read(Counter counter) { return accountIn(image()).value()[counter]; }

private:
    const std::unique_ptr<LedgerImage> image_ = std::make_unique<LedgerImage>();
};

TEST_F(LedgerImageTest, AnEmptyOneHoldsOnlyWhenItBegan)
{
    const auto account = accountIn(image());
    ASSERT_TRUE(account);
    EXPECT_EQ(account->began, 1'800'000'000);
    EXPECT_THAT(account->counts, testing::Each(0));
    EXPECT_THAT(account->culprits, testing::Each(IsEmpty()));
    EXPECT_TRUE(image().canGoOn());
}

TEST_F(LedgerImageTest, BytesOfZerosOrOfOtherThingsAreNotALedger)
{
    const auto zeros = std::make_unique<LedgerImage>();
    EXPECT_FALSE(accountIn(*zeros));
    EXPECT_FALSE(zeros->canGoOn());
    image().magic = {'S', 'Q', 'L', 'i', 't', 'e', ' ', 'f'};
    EXPECT_FALSE(accountIn(image()));
    EXPECT_FALSE(image().canGoOn());
}

TEST_F(LedgerImageTest, AddsToWhatItHolds)
{
    for (std::uint64_t count = 1; count <= 5; ++count)
        add(Counter::Recorded, count);
    add(Counter::Kept, 7);
    EXPECT_EQ(read(Counter::Recorded), 15U);
    EXPECT_EQ(read(Counter::Kept), 7U);
}

TEST_F(LedgerImageTest, KeepsTheStateOfTheStoreUntilAnotherComes)
{
    image().add({}, StoreState{.events = 3, .bytes = 4096, .oldest = 12.5});
    add(Counter::Recorded, 1);
    EXPECT_EQ(accountIn(image())->store.events, 3U);
    EXPECT_EQ(accountIn(image())->store.bytes, 4096U);
    EXPECT_EQ(accountIn(image())->store.oldest, 12.5);
    image().add({}, StoreState{.events = 4, .bytes = 8192, .oldest = 13});
    EXPECT_EQ(accountIn(image())->store.events, 4U);
}

// What a process leaves that is killed while it counts: the older slot is marked as being filled.
TEST_F(LedgerImageTest, ASlotThatIsBeingFilledDoesNotCount)
{
    add(Counter::Recorded, 1);
    add(Counter::Recorded, 1);
    LedgerImage::Slot& older =
        image().slots[0].sequence < image().slots[1].sequence ? image().slots[0] : image().slots[1];
    older.sequence = 0;
    older.counts.fill(999);
    EXPECT_EQ(read(Counter::Recorded), 2U);
    EXPECT_TRUE(image().canGoOn());
    add(Counter::Recorded, 1);
    EXPECT_EQ(read(Counter::Recorded), 3U);
}

// What a loss of power may leave: sectors of different ages.
TEST_F(LedgerImageTest, ASlotThatIsNotWholeDoesNotCount)
{
    add(Counter::Recorded, 1);
    add(Counter::Recorded, 1);
    LedgerImage::Slot& newer =
        image().slots[0].sequence > image().slots[1].sequence ? image().slots[0] : image().slots[1];
    newer.counts[40] ^= 1;
    EXPECT_EQ(read(Counter::Recorded), 1U);
    EXPECT_FALSE(image().canGoOn()) << "the next slot would be made of the broken one";
    image().slots[0].checksum ^= 1;
    image().slots[1].checksum ^= 1;
    EXPECT_FALSE(accountIn(image()));
}

TEST_F(LedgerImageTest, SumsTheSingleCountsAndThoseOfTheSlots)
{
    add(Counter::ConnectionsAccepted, 5);
    image().live[static_cast<std::size_t>(Counter::ConnectionsAccepted)] = 3;
    EXPECT_EQ(read(Counter::ConnectionsAccepted), 8U);
}

TEST_F(LedgerImageTest, CountsOfAnotherVersionAreFoundByTheirPaths)
{
    add(Counter::Deliveries, 4);
    add(Counter::Recorded, 3);
    // Another version has a counter that this one does not know where this one has "deliveries".
    const std::string_view known = "deliveries\nrecorded\n";
    const std::string_view other = "jubilation\nrecorded\n";
    ASSERT_EQ(std::string_view(image().paths.data(), known.size()), known);
    std::ranges::copy(other, image().paths.begin());
    EXPECT_FALSE(image().canGoOn());
    EXPECT_EQ(read(Counter::Deliveries), 0U);
    EXPECT_EQ(read(Counter::Recorded), 3U);
}

TEST_F(LedgerImageTest, BeginsWithAnAccount)
{
    Account account{.began = 5, .counts = {}, .store = {.events = 2, .bytes = 3, .oldest = 4}, .culprits = {}};
    account.counts[static_cast<std::size_t>(Counter::Kept)] = 12;
    account.culprits[0].push_back({{.user = 7, .process = "player", .application = std::string(200, 'a')}, 9});
    image().begin(account);
    const auto read = accountIn(image());
    ASSERT_TRUE(read);
    EXPECT_EQ(read->began, 5);
    EXPECT_EQ((*read)[Counter::Kept], 12U);
    EXPECT_EQ(read->store.events, 2U);
    ASSERT_EQ(read->culprits[0].size(), 1U);
    EXPECT_EQ(read->culprits[0][0].culprit.user, 7U);
    EXPECT_EQ(read->culprits[0][0].culprit.process, "player");
    EXPECT_EQ(read->culprits[0][0].culprit.application, std::string(128, 'a')) << "cut to its room";
    EXPECT_EQ(read->culprits[0][0].count, 9U);
}

TEST_F(LedgerImageTest, ReplacesTheCulprits)
{
    for (std::uint64_t count = 1; count <= 3; ++count) {
        LargestCulprits largest;
        largest[1].push_back({{.user = 1, .process = "a", .application = ""}, count});
        image().replaceCulprits(largest);
        add(Counter::LostToDiskFull, 1);
    }
    EXPECT_THAT(accountIn(image())->culprits[1], ElementsAre(Field(&CulpritCount::count, 3U)));
}

// A kill may come between the two.
TEST_F(LedgerImageTest, CulpritsCountTogetherWithWhatIsAddedNext)
{
    const auto replaceBy = [this](std::uint64_t count) {
        image().replaceCulprits({{{}, {{{.user = 7, .process = "player", .application = ""}, count}}, {}}});
    };
    const auto lost = [this] {
        const auto largest = accountIn(image()).value().culprits[1];
        return largest.empty() ? 0 : largest[0].count;
    };
    replaceBy(3);
    EXPECT_EQ(lost(), 0U);
    add(Counter::LostToDiskFull, 3);
    EXPECT_EQ(lost(), 3U);
    replaceBy(5);
    EXPECT_EQ(lost(), 3U);
    image().dropUncountedCulprits();
    add(Counter::Recorded, 1);
    EXPECT_EQ(lost(), 3U);
    replaceBy(7);
    add(Counter::LostToDiskFull, 4);
    EXPECT_EQ(lost(), 7U);
}

TEST_F(LedgerImageTest, ACounterFitsIntoItsRoom)
{
    EXPECT_LE(counterCount, 128U);
}

} // namespace
} // namespace ledger
