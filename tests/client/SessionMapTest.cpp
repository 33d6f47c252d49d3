// The map of a client's sessions against a list that is searched from its beginning.
#include "client/SessionMap.h"
#include "support/TestPlatform.h"

#include <algorithm>
#include <gtest/gtest.h>
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
    for (const auto& [reporterID, session] : map)
        entries.emplace_back(reporterID, session);
    return entries;
}

class SessionMapTest : public testing::Test {
protected:
    support::TestPlatform platform;
    client::SessionMap map;
};

TEST_F(SessionMapTest, BeginsEmpty)
{
    EXPECT_EQ(map.size(), 0U);
    EXPECT_EQ(map.find(0), nullptr);
    EXPECT_EQ(map.begin(), map.end());
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
    for (const auto& entry : map)
        order.push_back(entry.reporterID);
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
    EXPECT_EQ(map.begin()->session, second);
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

TEST(SessionMap, IsAListSearchedFromItsBeginning)
{
    const support::TestPlatform platform;
    EXPECT_TRUE(rc::check([] {
        client::SessionMap map;
        Entries list;
        const auto find = [&](std::int64_t reporterID) {
            return std::ranges::find(list, reporterID, &Entries::value_type::first);
        };
        const auto operation = rc::gen::pair(rc::gen::weightedElement<char>({{6, 's'}, {3, 'r'}, {1, 'c'}}),
                                             rc::gen::inRange<std::int64_t>(-3, 6));
        for (const auto& [what, reporterID] :
             *rc::gen::container<std::vector<std::pair<char, std::int64_t>>>(operation)) {
            const auto place = find(reporterID);
            if (what == 's') {
                const auto session = makeSession(reporterID);
                map.set(reporterID, session);
                if (place == list.end())
                    list.emplace_back(reporterID, session);
                else
                    place->second = session;
            } else if (what == 'r') {
                map.remove(reporterID);
                if (place != list.end())
                    list.erase(place);
            } else {
                map.clear();
                list.clear();
            }
            RC_ASSERT(entries(map) == list);
            RC_ASSERT(map.size() == list.size());
            for (std::int64_t other = -3; other < 6; ++other)
                RC_ASSERT(map.find(other) == (find(other) == list.end() ? nullptr : find(other)->second));
        }
    }));
}

} // namespace
