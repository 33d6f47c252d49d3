// SPDX-License-Identifier: Apache-2.0
// Posting and reading counts.
#include "ledger/Ledger.h"

#include <gmock/gmock.h>
#include <thread>
#include <vector>

namespace ledger {
namespace {

using testing::IsEmpty;
using testing::SizeIs;

Culprit user(std::uint32_t number)
{
    return {.user = number, .process = "player", .application = ""};
}

constexpr std::size_t refused = static_cast<std::size_t>(Charge::Refused);

TEST(Ledger, SumsWhatIsPostedAndWhatIsCountedOneByOne)
{
    Ledger ledger;
    Tally tally;
    tally.add(Counter::Deliveries, 3);
    tally.add(Counter::Recorded, 2);
    tally.add(Counter::Inert, 1);
    ledger.post(tally);
    ledger.post(tally);
    ledger.count(Counter::Recorded);
    EXPECT_EQ(ledger.account()[Counter::Deliveries], 6U);
    EXPECT_EQ(ledger.account()[Counter::Recorded], 5U);
    EXPECT_EQ(ledger.account()[Counter::Inert], 2U);
    EXPECT_EQ(ledger.account()[Counter::Repeated], 0U);
}

TEST(Ledger, GoesOnFromWhatItsImageHolds)
{
    LedgerImage image;
    image.begin({});
    {
        Ledger first(image);
        first.count(Counter::Recorded, 2);
        first.count(Counter::RefusedForMemory, user(1000), 5);
    }
    Ledger second(image);
    second.count(Counter::Recorded);
    second.count(Counter::RefusedForMemory, user(1000), 1);
    second.count(Counter::RefusedForMemory, user(1001), 2);
    EXPECT_EQ(second.account()[Counter::Recorded], 3U);
    EXPECT_EQ(second.sinceStart()[Counter::Recorded], 1U);
    ASSERT_THAT(second.account().culprits[refused], SizeIs(2));
    EXPECT_EQ(second.account().culprits[refused][0].culprit, user(1000));
    EXPECT_EQ(second.account().culprits[refused][0].count, 6U);
    ASSERT_THAT(second.sinceStart().culprits[refused], SizeIs(2));
    EXPECT_EQ(second.sinceStart().culprits[refused][0].culprit, user(1001));
    EXPECT_EQ(second.sinceStart().culprits[refused][0].count, 2U);
    EXPECT_EQ(second.sinceStart().culprits[refused][1].count, 1U);
}

TEST(Ledger, NamesTheTenLargestCulprits)
{
    Ledger ledger;
    for (std::uint32_t number = 1; number <= 20; ++number)
        ledger.count(Counter::RefusedForSize, user(number), number);
    const auto culprits = ledger.account().culprits[refused];
    ASSERT_THAT(culprits, SizeIs(10));
    for (std::uint32_t place = 0; place < 10; ++place) {
        EXPECT_EQ(culprits[place].culprit, user(20 - place));
        EXPECT_EQ(culprits[place].count, 20U - place);
    }
    EXPECT_EQ(ledger.account().sum(Charge::Refused), 210U);
    EXPECT_THAT(ledger.account().culprits[static_cast<std::size_t>(Charge::Lost)], IsEmpty());
}

TEST(Ledger, ACulpritWithManyNamesDoesNotHideOneWithALargeCount)
{
    Ledger ledger;
    ledger.count(Counter::RefusedForSize, user(7), 500);
    for (std::uint32_t number = 0; number < 5000; ++number)
        ledger.count(Counter::RefusedForSize, {.user = 8, .process = "player", .application = std::to_string(number)});
    EXPECT_EQ(ledger.account().culprits[refused][0].culprit, user(7));
    EXPECT_EQ(ledger.account().sum(Charge::Refused), 5500U);
}

TEST(Ledger, LosesNothingThatManyThreadsCount)
{
    Ledger ledger;
    {
        std::vector<std::jthread> threads;
        for (int thread = 0; thread < 4; ++thread)
            threads.emplace_back([&] {
                for (int time = 0; time < 1000; ++time) {
                    Tally tally;
                    tally.add(Counter::Events, 2);
                    tally.add(Counter::Kept);
                    tally.add(Counter::Unwanted);
                    ledger.post(tally);
                    ledger.count(Counter::CallsSendMessage);
                    const Account account = ledger.account();
                    EXPECT_EQ(account[Counter::Events], account[Counter::Kept] + account[Counter::Unwanted]);
                }
            });
    }
    EXPECT_EQ(ledger.account()[Counter::Events], 8000U);
    EXPECT_EQ(ledger.account()[Counter::CallsSendMessage], 4000U);
}

TEST(Ledger, KnowsTheRatesOfTheLastMinute)
{
    Ledger ledger;
    Tally tally;
    tally.add(Counter::Deliveries, 3);
    tally.add(Counter::Events, 6);
    ledger.post(tally);
    EXPECT_EQ(ledger.lastMinute().deliveries, 3U);
    EXPECT_EQ(ledger.lastMinute().events, 6U);
}

TEST(Ledger, CallsTheHandlerAtTheNextChangeOnly)
{
    Ledger ledger;
    int calls = 0;
    ledger.callAtNextChange([&] { ++calls; });
    EXPECT_EQ(calls, 0);
    ledger.post({});
    EXPECT_EQ(calls, 0) << "nothing has changed";
    ledger.count(Counter::ConnectionsAccepted);
    ledger.count(Counter::ConnectionsAccepted);
    EXPECT_EQ(calls, 1);
    ledger.callAtNextChange([&] { ++calls; });
    Tally tally;
    tally.add(Counter::Recorded);
    ledger.post(tally);
    EXPECT_EQ(calls, 2);
}

} // namespace
} // namespace ledger
