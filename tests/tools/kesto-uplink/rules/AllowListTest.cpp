// SPDX-License-Identifier: Apache-2.0
// What each rule lets through.
#include "kesto-uplink/rules/AllowList.h"

#include "support/ParseJson.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace kesto_uplink {
namespace {

using foundation::Dictionary;
using foundation::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using Action = Rule::Action;

constexpr const char* hashKey = "key";
constexpr const char* fox = "The quick brown fox jumps over the lazy dog";

AllowList withRules(std::vector<Rule> rules)
{
    return {.events = {{.names = "com.quarn.kesto.*", .rules = std::move(rules), .line = 1}}};
}

Dictionary payload(const char* json)
{
    return *support::parseJson(json)->dictionary();
}

Dictionary left(std::vector<Rule> rules, const char* json)
{
    Filter filter(withRules(std::move(rules)), hashKey);
    return filter.event("com.quarn.kesto.Playback.Start", payload(json)).value();
}

TEST(AllowList, LetsThroughWhatARuleKeepsAndNothingElse)
{
    EXPECT_EQ(left({{.key = "a", .action = Action::Keep}, {.key = "d", .action = Action::Drop}},
                   R"({"a": [1, {"x": 0.6}], "b": 2, "d": 3})"),
              payload(R"({"a": [1, {"x": 0.6}]})"));
    EXPECT_EQ(left({}, R"({"a": 1})"), Dictionary());
}

TEST(AllowList, LetsNoEventThroughWhoseNameItDoesNotHave)
{
    Filter filter(withRules({{.key = "a", .action = Action::Keep}}), hashKey);
    EXPECT_EQ(filter.event("com.quarn.music.Playback.Start", payload(R"({"a": 1})")), std::nullopt);
    EXPECT_FALSE(filter.allowsEvent("com.quarn.music.Playback.Start"));
    EXPECT_TRUE(filter.allowsEvent("com.quarn.kesto.Playback.Start"));
    EXPECT_FALSE(Filter({}, hashKey).allowsEvent(""));
}

// HMAC-SHA-256 of that sentence with the key "key" begins with f7bc83f430538424.
TEST(AllowList, HashesTextsAndTheJsonOfOtherValues)
{
    const std::vector<Rule> rules = {{.key = "a", .action = Action::Hash}};
    EXPECT_EQ(left(rules, R"({"a": "The quick brown fox jumps over the lazy dog"})"),
              (Dictionary{{"a", "hash-f7bc83f430538424"}}));
    EXPECT_NE(left(rules, R"({"a": 1})"), left(rules, R"({"a": 2})"));
    EXPECT_EQ(left(rules, R"({"a": 1})"), left(rules, R"({"a": "1"})"));
    Filter other(withRules(rules), "another key");
    EXPECT_NE(other.event("com.quarn.kesto.x", Dictionary{{"a", fox}}), (Dictionary{{"a", "hash-f7bc83f430538424"}}));
}

TEST(AllowList, PutsNumbersIntoBuckets)
{
    const std::vector<Rule> rules = {{.key = "a", .action = Action::Bucket, .edges = {0.5, 10, 60}}};
    EXPECT_EQ(left(rules, R"({"a": 0.4})"), (Dictionary{{"a", "<0.5"}}));
    EXPECT_EQ(left(rules, R"({"a": 0.5})"), (Dictionary{{"a", "0.5-10"}}));
    EXPECT_EQ(left(rules, R"({"a": 9})"), (Dictionary{{"a", "0.5-10"}}));
    EXPECT_EQ(left(rules, R"({"a": 10})"), (Dictionary{{"a", "10-60"}}));
    EXPECT_EQ(left(rules, R"({"a": 60})"), (Dictionary{{"a", ">=60"}}));
    EXPECT_EQ(left(rules, R"({"a": 1e300})"), (Dictionary{{"a", ">=60"}}));
}

TEST(AllowList, KeepsBackWhatIsNoNumberWhereABucketIsAskedFor)
{
    const std::vector<Rule> rules = {{.key = "a", .action = Action::Bucket, .edges = {1}}};
    for (const char* json :
         {R"({"a": "5"})", R"({"a": true})", R"({"a": null})", R"({"a": [5]})", R"({"a": {"b": 5}})"})
        EXPECT_EQ(left(rules, json), Dictionary()) << json;
    Filter filter(withRules(rules), hashKey);
    EXPECT_EQ(filter.event("com.quarn.kesto.x", Dictionary{{"a", std::numeric_limits<double>::quiet_NaN()}}),
              Dictionary());
}

TEST(AllowList, AppliesTheRuleThatStandsLastInTheFile)
{
    const AllowList allowed = {.events = {{.names = "com.quarn.kesto.Error.*",
                                           .rules = {{.key = "a", .action = Action::Keep, .line = 2},
                                                     {.key = "b", .action = Action::Keep, .line = 9}},
                                           .line = 1},
                                          {.names = "com.quarn.kesto.*",
                                           .rules = {{.key = "a", .action = Action::Drop, .line = 5},
                                                     {.key = "b", .action = Action::Drop, .line = 6}},
                                           .line = 4}}};
    Filter filter(allowed, hashKey);
    const Dictionary both = payload(R"({"a": 1, "b": 2})");
    EXPECT_EQ(filter.event("com.quarn.kesto.Error.x", both), (Dictionary{{"b", 2}}));
    EXPECT_EQ(filter.event("com.quarn.kesto.Playback.x", both), Dictionary());
}

TEST(AllowList, TreatsColumnsAsNumbersAndTexts)
{
    const Filter filter(
        {.stretches = std::vector<Rule>{{.key = "device", .action = Action::Hash},
                                        {.key = "format", .action = Action::Keep},
                                        {.key = "volume", .action = Action::Bucket, .edges = {0.25, 0.5}},
                                        {.key = "channels", .action = Action::Drop}}},
        hashKey);
    EXPECT_TRUE(filter.allowsStretches());
    EXPECT_FALSE(filter.allowsSessions());
    EXPECT_EQ(filter.ofStretch("device", fox), Value("hash-f7bc83f430538424"));
    EXPECT_EQ(filter.ofStretch("format", "S16LE/48000/2"), Value("S16LE/48000/2"));
    EXPECT_EQ(filter.ofStretch("volume", 0.1), std::nullopt);
    EXPECT_EQ(filter.ofStretch("volume", 0.25), Value(0.25));
    EXPECT_EQ(filter.ofStretch("volume", 0.49), Value(0.25));
    EXPECT_EQ(filter.ofStretch("volume", 1.0), Value(0.5));
    EXPECT_EQ(filter.ofStretch("channels", 2), std::nullopt);
    EXPECT_EQ(filter.ofStretch("application", "org.example.player"), std::nullopt);
    EXPECT_EQ(filter.ofStretch("device", Value()), std::nullopt);
    EXPECT_EQ(filter.ofSession("application", "org.example.player"), std::nullopt);
}

TEST(AllowList, FindsLinesThatMetNothing)
{
    Filter filter({.events = {{.names = "com.quarn.kesto.Playback.*",
                               .rules = {{.key = "came", .action = Action::Keep, .line = 2},
                                         {.key = "never", .action = Action::Keep, .line = 3},
                                         {.key = "overruled", .action = Action::Keep, .line = 4}},
                               .line = 1},
                              {.names = "com.quarn.kesto.Playbakc.*",
                               .rules = {{.key = "a", .action = Action::Keep, .line = 7}},
                               .line = 6},
                              {.names = "com.quarn.kesto.*",
                               .rules = {{.key = "overruled", .action = Action::Drop, .line = 9}},
                               .line = 8}}},
                  hashKey);
    EXPECT_TRUE(filter.event("com.quarn.kesto.Playback.Start", payload(R"({"came": 1, "overruled": 1})")));
    const auto found = filter.unused();
    ASSERT_EQ(found.size(), 2U);
    EXPECT_EQ(found[0].line, 3U);
    EXPECT_EQ(found[0].what, R"(no event that matches "com.quarn.kesto.Playback.*" had the key "never")");
    EXPECT_EQ(found[1].line, 6U);
    EXPECT_EQ(found[1].what, R"(no event has a name that matches "com.quarn.kesto.Playbakc.*")");
}

} // namespace
} // namespace kesto_uplink
