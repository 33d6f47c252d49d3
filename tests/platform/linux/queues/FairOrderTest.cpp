// SPDX-License-Identifier: Apache-2.0
// Lanes and users share the time equally, however much they submit and whenever they come.
#include "platform/linux/queues/FairOrder.h"

#include <gmock/gmock.h>
#include <string>

namespace platform {
namespace {

using namespace std::chrono_literals;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

constexpr Submitter alice{.user = 1000, .process = 1};
constexpr Submitter alicesOther{.user = 1000, .process = 2}; // another process of hers
constexpr Submitter bob{.user = 1001, .process = 3};

class FairOrderTest : public testing::Test {
protected:
    using Lane = std::shared_ptr<FairOrder::Lane>;

    // An item that leaves its name in `ran`.
    void add(const Lane& lane, const std::string& name, bool mayTakeLong = false)
    {
        order.add(lane, {[this, name](Turn&) { ran.push_back(name); }, mayTakeLong});
    }
    void addMany(const Lane& lane, const std::string& name, int count)
    {
        for (int item = 0; item < count; ++item)
            add(lane, name);
    }
    // Serves once: the names of the items that ran, each of which took that time.
    std::vector<std::string> serve(FairOrder::Duration each)
    {
        ran.clear();
        std::vector<FairOrder::Item> items;
        static_cast<void>(order.take(items, 1000));
        Turn turn;
        for (auto& item : items)
            item.run(turn);
        order.charge(each * static_cast<int>(items.size()));
        return ran;
    }
    // Serves that often. Only the name of the first item each time.
    std::vector<std::string> serveTimes(int times, FairOrder::Duration each)
    {
        std::vector<std::string> names;
        for (int time = 0; time < times; ++time)
            names.push_back(serve(each).front());
        return names;
    }

    FairOrder order;
    std::vector<std::string> ran;
};

TEST_F(FairOrderTest, KeepsTheOrderWithinALane)
{
    const Lane lane = order.makeLane(alice);
    for (const char* name : {"a", "b", "c"})
        add(lane, name);
    EXPECT_EQ(order.waiting(), 3U);
    EXPECT_THAT(serveTimes(3, 1ms), ElementsAre("a", "b", "c"));
    EXPECT_EQ(order.waiting(), 0U);
}

TEST_F(FairOrderTest, LanesTakeTurnsWhenTheirItemsTakeEquallyLong)
{
    const Lane one = order.makeLane(alice);
    const Lane other = order.makeLane(alice);
    addMany(one, "one", 3);
    addMany(other, "other", 3);
    EXPECT_THAT(serveTimes(6, 1ms), ElementsAre("one", "other", "one", "other", "one", "other"));
}

TEST_F(FairOrderTest, ALaneWhoseItemsTakeThreeTimesAsLongGetsAThirdOfTheTurns)
{
    const Lane slow = order.makeLane(alice);
    const Lane quick = order.makeLane(alice);
    addMany(slow, "slow", 10);
    addMany(quick, "quick", 10);
    std::vector<std::string> names;
    for (int time = 0; time < 8; ++time) {
        const bool isSlow = names.size() % 4 == 0;
        names.push_back(serve(isSlow ? 3ms : 1ms).front());
    }
    EXPECT_THAT(names, ElementsAre("slow", "quick", "quick", "quick", "slow", "quick", "quick", "quick"));
}

TEST_F(FairOrderTest, AUserWithManyLanesGetsNoMoreThanOneWithASingleLane)
{
    std::vector<Lane> many;
    for (int index = 0; index < 10; ++index)
        addMany(many.emplace_back(order.makeLane(alice)), "alice", 10);
    const Lane single = order.makeLane(bob);
    addMany(single, "bob", 10);
    EXPECT_THAT(serveTimes(6, 1ms), ElementsAre("alice", "bob", "alice", "bob", "alice", "bob"));
}

TEST_F(FairOrderTest, AProcessWithManyLanesGetsNoMoreThanOneWithASingleLane)
{
    std::vector<Lane> many;
    for (int index = 0; index < 10; ++index)
        addMany(many.emplace_back(order.makeLane(alice)), "many", 10);
    const Lane single = order.makeLane(alicesOther);
    addMany(single, "single", 10);
    EXPECT_THAT(serveTimes(6, 1ms), ElementsAre("many", "single", "many", "single", "many", "single"));
}

TEST_F(FairOrderTest, ProcessesOfOneUserGetTogetherNoMoreThanAnotherUser)
{
    const Lane one = order.makeLane(alice);
    const Lane other = order.makeLane(alicesOther);
    const Lane bobs = order.makeLane(bob);
    for (const auto& [lane, name] : {std::pair(one, "one"), std::pair(other, "other"), std::pair(bobs, "bob")})
        addMany(lane, name, 10);
    EXPECT_THAT(serveTimes(8, 1ms), ElementsAre("one", "bob", "other", "bob", "one", "bob", "other", "bob"));
}

// Each is new and has used nothing yet.
TEST_F(FairOrderTest, ALaneDoesNotWaitForTheManyThatAnotherProcessOpensOneAfterTheOther)
{
    const Lane single = order.makeLane(alicesOther);
    add(single, "single");
    serve(1ms);
    for (int index = 0; index < 1000; ++index)
        add(order.makeLane(alice), "new");
    addMany(single, "single", 2);
    EXPECT_THAT(serveTimes(4, 1ms), ElementsAre("new", "single", "new", "single"));
}

TEST_F(FairOrderTest, OneWhoComesLateWaitsOnlyForWhoIsBeingServed)
{
    const Lane early = order.makeLane(alice);
    addMany(early, "early", 100);
    serveTimes(50, 1ms);
    const Lane late = order.makeLane(alice);
    addMany(late, "late", 2);
    EXPECT_THAT(serveTimes(3, 1ms), ElementsAre("late", "early", "late"));
}

TEST_F(FairOrderTest, APauseEarnsNoTimeForLater)
{
    const Lane busy = order.makeLane(alice);
    const Lane pausing = order.makeLane(alice);
    add(pausing, "pausing");
    serve(1ms);
    addMany(busy, "busy", 100);
    serveTimes(50, 1ms);
    addMany(pausing, "pausing", 50);
    EXPECT_THAT(serveTimes(4, 1ms), ElementsAre("pausing", "busy", "pausing", "busy"));
}

TEST_F(FairOrderTest, WhatALaneUsedCountsAlsoWhenItWasEmptyForAMoment)
{
    const Lane greedy = order.makeLane(alice);
    const Lane modest = order.makeLane(alice);
    addMany(modest, "modest", 10);
    add(greedy, "greedy");
    EXPECT_THAT(serve(1ms), ElementsAre("modest"));
    EXPECT_THAT(serve(5ms), ElementsAre("greedy"));
    add(greedy, "greedy again");
    EXPECT_THAT(serveTimes(6, 1ms), ElementsAre("modest", "modest", "modest", "modest", "greedy again", "modest"));
}

TEST_F(FairOrderTest, QuickItemsOfALaneAreTakenTogetherAndSlowOnesOneByOne)
{
    const Lane lane = order.makeLane(alice);
    addMany(lane, "a", 100);
    std::vector<std::size_t> together;
    for (int time = 0; time < 6; ++time)
        together.push_back(serve(1us).size());
    EXPECT_THAT(together, ElementsAre(1, 2, 4, 8, 16, 16));
    together.clear();
    for (int time = 0; time < 6; ++time)
        together.push_back(serve(1ms).size());
    EXPECT_THAT(together, ElementsAre(16, 8, 4, 2, 1, 1));
}

TEST_F(FairOrderTest, AnItemThatMayTakeLongIsTakenAlone)
{
    const Lane lane = order.makeLane(alice);
    addMany(lane, "a", 7);
    serveTimes(3, 1us); // 8 would be taken together now
    for (const char* name : {"short", "short"})
        add(lane, name);
    add(lane, "long", true);
    add(lane, "short");
    EXPECT_THAT(serve(1us), ElementsAre("short", "short"));
    EXPECT_TRUE(order.front().mayTakeLong);
    EXPECT_THAT(serve(1us), ElementsAre("long"));
    EXPECT_FALSE(order.front().mayTakeLong);
    EXPECT_THAT(serve(1us), ElementsAre("short"));
}

TEST_F(FairOrderTest, TakesNoMoreThanIsAskedFor)
{
    const Lane lane = order.makeLane(alice);
    addMany(lane, "a", 30);
    serveTimes(4, 1us);
    std::vector<FairOrder::Item> items;
    static_cast<void>(order.take(items, 3));
    EXPECT_THAT(items, SizeIs(3));
    EXPECT_EQ(order.waiting(), 12U);
    order.charge(1us);
}

TEST_F(FairOrderTest, IsContestedWhenASecondLaneHasItems)
{
    EXPECT_FALSE(order.isContested());
    const Lane one = order.makeLane(alice);
    const Lane ofTheSameUser = order.makeLane(alice);
    const Lane ofAnotherUser = order.makeLane(bob);
    addMany(one, "a", 3);
    EXPECT_FALSE(order.isContested());
    add(ofTheSameUser, "b");
    EXPECT_TRUE(order.isContested());
    serve(1ms);
    serve(1ms);
    EXPECT_FALSE(order.isContested());
    add(ofAnotherUser, "c");
    EXPECT_TRUE(order.isContested());
}

TEST_F(FairOrderTest, ALaneIsFullWith512ItemsAndHasRoomAgainWith256)
{
    const Lane lane = order.makeLane(alice);
    int calls = 0;
    FairOrder::setRoomHandler(*lane, std::make_shared<const FairOrder::RoomHandler>([&] { ++calls; }));
    addMany(lane, "a", 511);
    EXPECT_FALSE(FairOrder::isFull(*lane, 0));
    add(lane, "a");
    EXPECT_TRUE(FairOrder::isFull(*lane, 0));
    std::vector<FairOrder::Item> items;
    std::shared_ptr<const FairOrder::RoomHandler> handler;
    while (handler == nullptr) {
        items.clear();
        handler = order.take(items, 1);
        order.charge(1ms);
    }
    EXPECT_EQ(order.waiting(), 256U);
    (*handler)();
    EXPECT_EQ(calls, 1);
    items.clear();
    EXPECT_EQ(order.take(items, 1), nullptr) << "it was not asked again";
    order.charge(1ms);
}

TEST_F(FairOrderTest, ALaneThatPausesWaitsForNothingUntilItGoesOn)
{
    const Lane lane = order.makeLane(alice);
    const Lane other = order.makeLane(alice);
    order.add(lane, {[&](Turn&) { order.pause(*lane); }, true});
    addMany(lane, "behind", 2);
    serve(1ms);
    EXPECT_EQ(order.waiting(), 0U);
    EXPECT_EQ(order.pausing(), 1U);
    EXPECT_EQ(order.heldBack(), 2U);
    add(lane, "behind");
    EXPECT_EQ(order.heldBack(), 3U);
    add(other, "other");
    EXPECT_FALSE(order.isContested());
    EXPECT_THAT(serve(1ms), ElementsAre("other"));
    order.resume(lane, {[this](Turn&) { ran.emplace_back("goes on"); }, true});
    EXPECT_EQ(order.waiting(), 4U);
    EXPECT_EQ(order.pausing() + order.heldBack(), 0U);
    EXPECT_THAT(serve(1ms), ElementsAre("goes on"));
    EXPECT_THAT(serve(1ms), ElementsAre("behind"));
}

TEST_F(FairOrderTest, ALaneThatGoesOnWhileItIsServedStaysInItsPlace)
{
    const Lane lane = order.makeLane(alice);
    order.add(lane,
              {[&](Turn&) {
                   order.pause(*lane);
                   order.resume(lane, {[this](Turn&) { ran.emplace_back("goes on"); }, true});
               },
               true});
    serve(1ms);
    EXPECT_THAT(serve(1ms), ElementsAre("goes on"));
    EXPECT_EQ(order.waiting(), 0U);
}

TEST_F(FairOrderTest, ALaneThatIsGoneStillHasItsItemsRun)
{
    add(order.makeLane(alice), "a");
    EXPECT_THAT(serve(1ms), ElementsAre("a"));
}

TEST_F(FairOrderTest, AUserThatCameBackIsServedLikeTheOthers)
{
    add(order.makeLane(alice), "first");
    serve(1s);
    const Lane bobs = order.makeLane(bob);
    addMany(bobs, "bob", 10);
    serveTimes(2, 1ms);
    const Lane back = order.makeLane(alice);
    addMany(back, "alice", 10);
    EXPECT_THAT(serveTimes(4, 1ms), ElementsAre("alice", "bob", "alice", "bob"));
}

TEST_F(FairOrderTest, ReleasesWhatItemsHoldWhenAllThatCameTogetherHaveRun)
{
    const Lane lane = order.makeLane(alice);
    std::vector<std::size_t> released;
    FairOrder::setReleaseHandler(*lane, [&](std::size_t bytes) { released.push_back(bytes); });
    addMany(lane, "first", 2);
    EXPECT_FALSE(FairOrder::isFull(*lane, 10));
    addMany(lane, "second", 1);
    EXPECT_FALSE(FairOrder::isFull(*lane, 20));
    EXPECT_THAT(serve(1ms), SizeIs(1));
    EXPECT_THAT(released, IsEmpty());
    EXPECT_THAT(serve(1ms), SizeIs(1));
    EXPECT_THAT(released, ElementsAre(10));
    EXPECT_THAT(serve(1ms), SizeIs(1));
    EXPECT_THAT(released, ElementsAre(10, 20));
}

TEST_F(FairOrderTest, CountsTheTimeOfALaneInItsWorkload)
{
    ledger::Workloads workloads;
    const auto workload = workloads.open(alice.user);
    const Lane lane = order.makeLane(alice);
    const Lane other = order.makeLane(bob);
    FairOrder::setWorkload(*lane, workload);
    addMany(lane, "a", 2);
    addMany(other, "b", 2);
    for (int time = 0; time < 4; ++time)
        serve(3ms);
    EXPECT_EQ(workload->work(), (ledger::Work{.calls = 0, .time = 6ms, .bytes = 0}));
}

TEST_F(FairOrderTest, SaysForWhoseShareOfTheLogALanesItemsWrite)
{
    const auto share = std::make_shared<LogShare>("client 7");
    const Lane lane = order.makeLane(alice);
    const Lane other = order.makeLane(bob);
    FairOrder::setLogShare(*lane, share);
    addMany(lane, "a", 1);
    addMany(other, "b", 1);
    std::vector<FairOrder::Item> items;
    std::ignore = order.take(items, 10);
    EXPECT_EQ(order.logShare(), share.get());
    order.charge(1ms);
    std::ignore = order.take(items, 10);
    EXPECT_EQ(order.logShare(), nullptr);
    order.charge(1ms);
}

TEST_F(FairOrderTest, ReleasesAtOnceWhatItemsHeldThatHaveRunAlready)
{
    const Lane lane = order.makeLane(alice);
    std::vector<std::size_t> released;
    FairOrder::setReleaseHandler(*lane, [&](std::size_t bytes) { released.push_back(bytes); });
    addMany(lane, "a", 1);
    serve(1ms);
    EXPECT_FALSE(FairOrder::isFull(*lane, 10));
    EXPECT_THAT(released, ElementsAre(10));
}

TEST_F(FairOrderTest, DoesNotReleaseWhatItemsHoldBehindAPause)
{
    const Lane lane = order.makeLane(alice);
    std::vector<std::size_t> released;
    FairOrder::setReleaseHandler(*lane, [&](std::size_t bytes) { released.push_back(bytes); });
    order.add(lane, {[&](Turn&) { order.pause(*lane); }, true});
    add(lane, "behind");
    EXPECT_FALSE(FairOrder::isFull(*lane, 10));
    EXPECT_THAT(serve(1ms), IsEmpty());
    order.resume(lane, {[](Turn&) { }, true});
    EXPECT_THAT(serve(1ms), IsEmpty());
    EXPECT_THAT(released, IsEmpty());
    EXPECT_THAT(serve(1ms), ElementsAre("behind"));
    EXPECT_THAT(released, ElementsAre(10));
}

TEST_F(FairOrderTest, DoesNotReleaseWhatAPausingItemHoldsBeforeItsEnd)
{
    const Lane lane = order.makeLane(alice);
    std::vector<std::size_t> released;
    FairOrder::setReleaseHandler(*lane, [&](std::size_t bytes) { released.push_back(bytes); });
    order.add(lane, {[&](Turn&) { order.pause(*lane); }, true});
    EXPECT_FALSE(FairOrder::isFull(*lane, 10));
    EXPECT_THAT(serve(1ms), IsEmpty());
    EXPECT_THAT(released, IsEmpty());
    order.resume(lane, {[](Turn&) { }, true});
    EXPECT_THAT(released, IsEmpty());
    EXPECT_THAT(serve(1ms), IsEmpty());
    EXPECT_THAT(released, ElementsAre(10));
}

} // namespace
} // namespace platform
