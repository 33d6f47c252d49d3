// SPDX-License-Identifier: Apache-2.0
// The table of all counts: its paths are read by programs, so they stay the same for good.
#include "ledger/Counter.h"

#include <gmock/gmock.h>
#include <set>
#include <string>

namespace ledger {
namespace {

TEST(CounterTable, HasAPathOfItsOwnForEachCounter)
{
    std::set<std::string_view> paths;
    for (const CounterRow& row : counterRows())
        EXPECT_TRUE(paths.insert(row.path).second) << row.path;
    EXPECT_EQ(paths.size(), counterCount);
}

TEST(CounterTable, FindsACounterByItsPath)
{
    for (const CounterRow& row : counterRows())
        EXPECT_EQ(counterOf(row.path), row.counter) << row.path;
    EXPECT_EQ(counterOf("refused"), std::nullopt);
    EXPECT_EQ(counterOf(""), std::nullopt);
}

TEST(CounterTable, SaysWhyAndWhatToDoWhereverSomethingIsLeftOut)
{
    for (const CounterRow& row : counterRows()) {
        EXPECT_EQ(row.reason.empty(), row.meaning == Meaning::Work) << row.path;
        EXPECT_EQ(row.remedy.empty(), row.meaning == Meaning::Work) << row.path;
    }
}

TEST(CounterTable, ChargesOnlyMessagesAndEvents)
{
    EXPECT_EQ(chargeOf(Counter::RefusedForMemory), Charge::Refused);
    EXPECT_EQ(chargeOf(Counter::LostToDiskFull), Charge::Lost);
    EXPECT_EQ(chargeOf(Counter::LostToEnd), Charge::Lost);
    EXPECT_EQ(chargeOf(Counter::CallsLostToEnd), std::nullopt);
    EXPECT_EQ(chargeOf(Counter::RemovedForShare), Charge::Removed);
    EXPECT_EQ(chargeOf(Counter::Recorded), std::nullopt);
    EXPECT_EQ(chargeOf(Counter::SessionsRefused), std::nullopt);
    EXPECT_EQ(chargeOf(Counter::LogLinesLost), std::nullopt);
}

} // namespace
} // namespace ledger
