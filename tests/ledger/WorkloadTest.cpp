// SPDX-License-Identifier: Apache-2.0
// Who makes the service work: sums by user and process, of those who are there and of those who went.
#include "ledger/Workload.h"

#include <gmock/gmock.h>
#include <ostream>

namespace ledger {

static void PrintTo(const Work& work, std::ostream* stream)
{
    *stream << work.calls << " calls, " << work.time.count() << " ns, " << work.bytes << " bytes";
}

static bool operator==(const WorkByWhom::Entry& left, const WorkByWhom::Entry& right)
{
    return left.user == right.user && left.process == right.process && left.work == right.work;
}

namespace {

using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;
using Entry = WorkByWhom::Entry;

class WorkloadTest : public testing::Test {
protected:
    std::shared_ptr<Workload> begin(std::uint32_t user, const std::string& name, const Work& work)
    {
        auto workload = workloads.open(user);
        workloads.setProcess(*workload, name);
        workload->received(work.calls, work.bytes);
        workload->took(work.time);
        return workload;
    }

    Workloads workloads;
};

TEST_F(WorkloadTest, IsNobodysAtFirst)
{
    EXPECT_THAT(workloads.byWhom().largest, IsEmpty());
    EXPECT_EQ(workloads.byWhom().others, Work());
}

TEST_F(WorkloadTest, SumsUpTheClientsOfAProcessByItsName)
{
    const auto one = begin(1000, "player", {.calls = 3, .time = 20us, .bytes = 700});
    const auto two = begin(1000, "player", {.calls = 1, .time = 5us, .bytes = 70});
    const auto ofAnotherUser = begin(1001, "player", {.calls = 9, .time = 24us, .bytes = 7});
    one->received(2, 30);
    one->took(1us);
    EXPECT_THAT(workloads.byWhom().largest,
                ElementsAre(Entry{1000, "player", {6, 26us, 800}}, Entry{1001, "player", {9, 24us, 7}}));
}

TEST_F(WorkloadTest, HasNoNameUntilTheProcessIsKnown)
{
    const auto workload = workloads.open(1000);
    workload->took(1us);
    EXPECT_THAT(workloads.byWhom().largest, ElementsAre(Entry{1000, "", {0, 1us, 0}}));
}

TEST_F(WorkloadTest, OfAProcessThatWentIsKeptAndGoesOnWithItsNextClient)
{
    begin(1000, "player", {.calls = 3, .time = 20us, .bytes = 700}).reset();
    EXPECT_THAT(workloads.byWhom().largest, ElementsAre(Entry{1000, "player", {3, 20us, 700}}));
    const auto next = begin(1000, "player", {.calls = 1, .time = 1us, .bytes = 1});
    EXPECT_THAT(workloads.byWhom().largest, ElementsAre(Entry{1000, "player", {4, 21us, 701}}));
}

TEST_F(WorkloadTest, NamesTheTenWithTheMostTimeAndSumsUpTheOthers)
{
    std::vector<std::shared_ptr<Workload>> all;
    for (int number = 1; number <= 12; ++number)
        all.push_back(begin(1000, "p" + std::to_string(number), {.calls = 1, .time = 1us * number, .bytes = 10}));
    const WorkByWhom byWhom = workloads.byWhom();
    ASSERT_THAT(byWhom.largest, SizeIs(10));
    EXPECT_EQ(byWhom.largest.front(), (Entry{1000, "p12", {1, 12us, 10}}));
    EXPECT_EQ(byWhom.largest.back(), (Entry{1000, "p3", {1, 3us, 10}}));
    EXPECT_EQ(byWhom.others, (Work{2, 3us, 20}));
}

TEST_F(WorkloadTest, OfTheSmallestOf129ThatWentLosesItsName)
{
    for (int number = 1; number <= 128; ++number)
        begin(1000, "p" + std::to_string(number), {.calls = 1, .time = 1us * number, .bytes = 1}).reset();
    begin(1000, "late", {.calls = 5, .time = 1ms, .bytes = 5}).reset();
    const auto again = begin(1000, "p1", {.calls = 1, .time = 10ms, .bytes = 1});
    const WorkByWhom byWhom = workloads.byWhom();
    EXPECT_EQ(byWhom.largest[0], (Entry{1000, "p1", {1, 10ms, 1}})) << "its first microsecond is among the others";
    EXPECT_EQ(byWhom.largest[1], (Entry{1000, "late", {5, 1ms, 5}}));
    EXPECT_EQ(byWhom.largest[2], (Entry{1000, "p128", {1, 128us, 1}}));
    EXPECT_EQ(byWhom.others, (Work{120, 7260us, 120})) << "1 to 120 us";
}

TEST_F(WorkloadTest, MayOutliveTheList)
{
    auto list = std::make_unique<Workloads>();
    const auto workload = list->open(1000);
    list.reset();
    workload->took(1us);
    EXPECT_EQ(workload->work(), (Work{0, 1us, 0}));
}

} // namespace
} // namespace ledger
