// SPDX-License-Identifier: Apache-2.0
// The map of a client's sessions against a list that is searched from its beginning.
#include "client/SessionMap.h"
#include "support/ServiceHarness.h"

#include <algorithm>
#include <functional>
#include <gtest/gtest.h>
#include <memory>
#include <rapidcheck/gtest.h>
#include <unordered_set>
#include <utility>
#include <vector>

namespace {

using Session = std::shared_ptr<KestoReportingSession>;
using Entries = std::vector<std::pair<std::int64_t, Session>>;

Session makeSession(std::int64_t reporterID)
{
    return std::make_shared<KestoReportingSession>(reporterID, std::vector<std::int32_t>{7});
}

Entries entries(const client::SessionMap& map)
{
    Entries entries;
    client::SessionMap::Place place = 0;
    while (const auto session = map.sessionBehind(place))
        entries.emplace_back(session->reporterID(), session);
    return entries;
}

class SessionMapTest : public testing::Test {
protected:
    SessionMapTest() { utility::createServerQueue(); }

    support::TestPlatform platform;
    client::SessionMap map;
};

TEST_F(SessionMapTest, BeginsEmpty)
{
    EXPECT_EQ(map.size(), 0U);
    EXPECT_EQ(map.find(0), nullptr);
    EXPECT_EQ(entries(map), Entries());
}

// Otherwise a client that knows the number of buckets could choose IDs that all fall into one.
TEST(SessionMapHash, SpreadsIDsWhateverTheirDistance)
{
    constexpr std::size_t count = 10'000;
    for (const std::int64_t distance :
         {std::int64_t{1}, std::int64_t{13}, std::int64_t{10'273}, std::int64_t{1} << 32}) {
        std::unordered_set<std::int64_t, foundation::IntegerHash> reporterIDs;
        for (std::size_t index = 0; index < count; ++index)
            reporterIDs.insert(static_cast<std::int64_t>(index) * distance);
        std::unordered_set<std::int64_t, foundation::IntegerHash> multiples;
        for (std::size_t index = 0; index < count; ++index)
            multiples.insert(static_cast<std::int64_t>(index * reporterIDs.bucket_count()));
        for (const auto& set : {reporterIDs, multiples}) {
            std::size_t fullest = 0;
            for (std::size_t bucket = 0; bucket < set.bucket_count(); ++bucket)
                fullest = std::max(fullest, set.bucket_size(bucket));
            EXPECT_LT(fullest, 20U) << distance;
        }
    }
}

TEST_F(SessionMapTest, KeepsTheOrderInWhichIDsCame)
{
    for (const std::int64_t reporterID : {3, -1, 2, 0})
        map.set(reporterID, makeSession(reporterID));
    std::vector<std::int64_t> order;
    for (const auto& [reporterID, session] : entries(map))
        order.push_back(reporterID);
    EXPECT_EQ(order, (std::vector<std::int64_t>{3, -1, 2, 0}));
}

TEST_F(SessionMapTest, GivesAReplacedSessionsPlaceToTheNewOne)
{
    map.set(1, makeSession(1));
    map.set(2, makeSession(2));
    const auto second = makeSession(1);
    map.set(1, second);
    EXPECT_EQ(map.size(), 2U);
    EXPECT_EQ(map.find(1), second);
    EXPECT_EQ(entries(map).front().second, second);
}

TEST_F(SessionMapTest, LetsGoOfReplacedAndRemovedSessions)
{
    std::weak_ptr<KestoReportingSession> first;
    {
        const auto session = makeSession(1);
        first = session;
        map.set(1, session);
    }
    map.set(1, makeSession(1));
    EXPECT_TRUE(first.expired());

    const std::weak_ptr<KestoReportingSession> second = map.find(1);
    map.remove(1);
    EXPECT_TRUE(second.expired());
    EXPECT_EQ(map.find(1), nullptr);
}

// --- walks that pause

TEST_F(SessionMapTest, FindsThePlaceOfAWalkAgainWhateverCameAndWentMeanwhile)
{
    for (const std::int64_t reporterID : {5, 4, 3, 2})
        map.set(reporterID, makeSession(reporterID));
    std::vector<std::int64_t> visited;
    const auto visit = [&](const auto& entry) { visited.push_back(entry.reporterID); };
    const auto second = map.visitBehind(0, 2, visit);
    ASSERT_NE(second, std::nullopt);
    map.remove(4);
    map.remove(3);
    map.set(1, makeSession(1));
    EXPECT_EQ(map.visitBehind(*second, 2, visit), std::nullopt);
    EXPECT_EQ(visited, (std::vector<std::int64_t>{5, 4, 2, 1}));
}

TEST_F(SessionMapTest, KnowsThoseThatAreStartedInTheOrderOfTheMap)
{
    for (const std::int64_t reporterID : {4, 3, 2, 1})
        map.set(reporterID, makeSession(reporterID));
    const auto started = [&] {
        std::vector<std::int64_t> reporterIDs;
        client::SessionMap::Place place = 0;
        while (const auto session = map.startedBehind(place))
            reporterIDs.push_back(session->reporterID());
        EXPECT_EQ(map.startedCount(), reporterIDs.size());
        return reporterIDs;
    };
    const auto start = [&](std::int64_t reporterID) {
        support::onServerQueue(platform.workQueues, [&] { map.find(reporterID)->start(); });
    };
    const auto stop = [&](const Session& session) {
        support::onServerQueue(platform.workQueues, [&](platform::Turn& turn) { session->stop(turn); });
    };
    for (const std::int64_t reporterID : {1, 3, 4, 2})
        start(reporterID);
    EXPECT_EQ(started(), (std::vector<std::int64_t>{4, 3, 2, 1}));

    const auto replaced = map.find(4);
    map.set(4, makeSession(4));
    stop(map.find(2));
    EXPECT_EQ(started(), (std::vector<std::int64_t>{3, 1}));
    const auto removed = map.find(3);
    map.remove(3);
    start(4);
    stop(replaced);
    stop(removed);
    EXPECT_EQ(started(), (std::vector<std::int64_t>{4, 1})) << "the map does not follow sessions that it let go of";
    map.clear();
    EXPECT_EQ(started(), std::vector<std::int64_t>());
}

// What the map is: a list, searched from its beginning. Its places are those of the entries in the order in which they
// came.
struct SessionList {
    struct Entry {
        client::SessionMap::Place place;
        std::int64_t reporterID;
        Session session;
    };

    [[nodiscard]] Session find(std::int64_t reporterID) const
    {
        const auto found = std::ranges::find(entries, reporterID, &Entry::reporterID);
        return found == entries.end() ? nullptr : found->session;
    }
    void set(std::int64_t reporterID, Session session)
    {
        const auto found = std::ranges::find(entries, reporterID, &Entry::reporterID);
        if (found == entries.end())
            entries.push_back({++lastPlace, reporterID, std::move(session)});
        else
            found->session = std::move(session);
    }
    void remove(std::int64_t reporterID)
    {
        std::erase_if(entries, [=](const Entry& entry) { return entry.reporterID == reporterID; });
    }
    [[nodiscard]] Session behind(client::SessionMap::Place place, bool mustBeStarted) const
    {
        const auto found = std::ranges::find_if(entries, [=](const Entry& entry) {
            return entry.place > place && (!mustBeStarted || entry.session->started());
        });
        return found == entries.end() ? nullptr : found->session;
    }

    std::vector<Entry> entries;
    client::SessionMap::Place lastPlace = 0;
};

// A walk may pause behind any place. It goes on with the next entry that is in the map by then.
TEST(SessionMap, IsAListSearchedFromItsBeginning)
{
    support::TestPlatform platform;
    utility::createServerQueue();
    const auto inTurn = [&](const std::function<void(platform::Turn&)>& work) {
        support::onServerQueue(platform.workQueues, work);
    };
    EXPECT_TRUE(rc::check([&] {
        client::SessionMap map;
        SessionList list;
        const auto operation =
            rc::gen::pair(rc::gen::weightedElement<char>({{6, 's'}, {3, 'r'}, {1, 'c'}, {5, 'b'}, {3, 'e'}}),
                          rc::gen::inRange<std::int64_t>(-3, 6));
        for (const auto& [what, reporterID] :
             *rc::gen::container<std::vector<std::pair<char, std::int64_t>>>(operation)) {
            const auto known = list.find(reporterID);
            if (what == 's') {
                const auto session = makeSession(reporterID);
                map.set(reporterID, session);
                list.set(reporterID, session);
            } else if (what == 'r') {
                map.remove(reporterID);
                list.remove(reporterID);
            } else if (what == 'c') {
                map.clear();
                list.entries.clear();
            } else if (known != nullptr && what == 'b') {
                inTurn([&](platform::Turn&) { known->start(); });
            } else if (known != nullptr) {
                inTurn([&](platform::Turn& turn) { known->stop(turn); });
            }
            RC_ASSERT(map.size() == list.entries.size());
            for (std::int64_t other = -3; other < 6; ++other)
                RC_ASSERT(map.find(other) == list.find(other));
            for (client::SessionMap::Place paused = 0; paused <= list.lastPlace; ++paused) {
                auto place = paused;
                RC_ASSERT(map.sessionBehind(place) == list.behind(paused, false));
                place = paused;
                RC_ASSERT(map.startedBehind(place) == list.behind(paused, true));
            }
            RC_ASSERT(map.startedCount()
                      == static_cast<std::size_t>(std::ranges::count_if(
                          list.entries, [](const auto& entry) { return entry.session->started(); })));
        }
    }));
}

} // namespace
