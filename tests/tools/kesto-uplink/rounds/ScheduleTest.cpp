// SPDX-License-Identifier: Apache-2.0
// When rounds come, what the log says of them, and to which day bytes count; without a clock.
#include "kesto-uplink/rounds/Schedule.h"
#include "kesto-uplink/rounds/Rounds.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <deque>
#include <string>
#include <vector>

namespace uplink_test {
namespace {

using namespace kesto_uplink;
using testing::ElementsAre;

constexpr double interval = 900;

TEST(Schedule, aRoundThatWentWellWaitsAnIntervalAndThenForNews)
{
    Schedule schedule(interval, [] { return 0.5; });
    for (const Outcome outcome : {Outcome::Sent, Outcome::Nothing, Outcome::Off}) {
        EXPECT_EQ(schedule.untilNextRound(outcome), 900);
        EXPECT_TRUE(Schedule::needsNews(outcome));
    }
    for (const Outcome outcome : {Outcome::Waiting, Outcome::Metered, Outcome::DayUsedUp, Outcome::Away, Outcome::Full,
                                  Outcome::Refused, Outcome::Failed})
        EXPECT_FALSE(Schedule::needsNews(outcome));
}

TEST(Schedule, theFirstRoundComesWithinAMinute)
{
    EXPECT_EQ(Schedule(interval, [] { return 0.5; }).untilFirstRound(), 30);
    EXPECT_EQ(Schedule(2, [] { return 0.5; }).untilFirstRound(), 1);
}

TEST(Schedule, waitsForServersDoubleAtRandomUpToHours)
{
    double random = 1;
    Schedule schedule(interval, [&random] { return random; });
    std::vector<double> waits;
    for (int round = 0; round < 7; ++round)
        waits.push_back(schedule.untilNextRound(Outcome::Away));
    EXPECT_THAT(waits, ElementsAre(1800, 2700, 4500, 8100, 15300, 15300, 15300));
    random = 0; // the jitter is the whole of what doubles
    EXPECT_EQ(schedule.untilNextRound(Outcome::Full), 900);
}

TEST(Schedule, aRoundThatWentWellEndsTheDoubling)
{
    Schedule schedule(interval, [] { return 1; });
    EXPECT_EQ(schedule.untilNextRound(Outcome::Away), 1800);
    EXPECT_EQ(schedule.untilNextRound(Outcome::Away), 2700);
    EXPECT_EQ(schedule.untilNextRound(Outcome::Sent), 900);
    EXPECT_EQ(schedule.untilNextRound(Outcome::Away), 1800);
}

TEST(Schedule, whatOnlyAPersonCanChangeIsTriedLessOften)
{
    Schedule schedule(interval, [] { return 1; });
    EXPECT_EQ(schedule.untilNextRound(Outcome::Refused), 900 + 3600);
    EXPECT_EQ(schedule.untilNextRound(Outcome::Refused), 900 + 7200);
    for (int round = 0; round < 100; ++round)
        static_cast<void>(schedule.untilNextRound(Outcome::Refused));
    EXPECT_EQ(schedule.untilNextRound(Outcome::Refused), 900 + 43200);
}

TEST(Schedule, aDayThatIsUsedUpIsLookedAtHourly)
{
    Schedule schedule(interval, [] { return 1; });
    EXPECT_EQ(schedule.untilNextRound(Outcome::DayUsedUp), 3600);
}

constexpr double day = 86'400;

TEST(DayCount, itIsTheDayOfTheClock)
{
    DayCount days;
    EXPECT_EQ(days.day(20'000 * day + 5, 0), 20'000);
    EXPECT_EQ(days.day(20'000 * day + day + 1, day), 20'001);
    EXPECT_EQ(days.day(20'007 * day, 7 * day), 20'007);
}

TEST(DayCount, aClockThatJumpsGivesOneMoreDay)
{
    DayCount days;
    EXPECT_EQ(days.day(20'000 * day, 0), 20'000);
    EXPECT_EQ(days.day(20'400 * day, 10), 20'001);
    EXPECT_EQ(days.day(19'000 * day, 20), 20'001);
    EXPECT_EQ(days.day(20'400 * day, 30), 20'001);
    EXPECT_EQ(days.day(20'400 * day, day + 30), 20'002);
}

TEST(Diary, itHasWhatChangesAndNotWhatLasts)
{
    Diary diary;
    EXPECT_EQ(diary.line({Outcome::Nothing, ""}), std::nullopt);
    EXPECT_EQ(diary.line({Outcome::Sent, "stored"}), "stored");
    EXPECT_EQ(diary.line({Outcome::Sent, "stored"}), std::nullopt);
    EXPECT_EQ(diary.line({Outcome::Away, "one is away"}), "one is away");
    EXPECT_EQ(diary.line({Outcome::Away, "another is away"}), std::nullopt);
    EXPECT_EQ(diary.line({Outcome::Nothing, ""}), std::nullopt);
    EXPECT_EQ(diary.line({Outcome::Refused, "wrong password"}), "wrong password");
    EXPECT_EQ(diary.line({Outcome::Refused, "wrong password"}), std::nullopt);
    EXPECT_EQ(diary.line({Outcome::Refused, "wrong host"}), "wrong host");
    EXPECT_EQ(diary.line({Outcome::Sent, "stored"}), "stored");
}

// Servers are asked in random order.
TEST(Diary, whatLastsIsToldOnceWhicheverServerSaysIt)
{
    Diary diary;
    EXPECT_EQ(diary.line({Outcome::Refused, "tls://a:4222 does not accept lounge with this password"}),
              "tls://a:4222 does not accept lounge with this password");
    EXPECT_EQ(diary.line({Outcome::Refused, "tls://b:4222 does not accept lounge with this password"}), std::nullopt);
    EXPECT_EQ(diary.line({Outcome::Refused, "the certificate of tls://a:4222 is not trusted"}),
              "the certificate of tls://a:4222 is not trusted");
    EXPECT_EQ(diary.line({Outcome::Refused, "the certificate of tls://b:4222 is not trusted"}), std::nullopt);
}

class FakeSleep : public Sleep {
public:
    explicit FakeSleep(int naps) : naps_(naps) { }
    bool sleep(double seconds) override
    {
        said.push_back("sleep " + std::to_string(static_cast<int>(seconds)));
        return naps_-- > 0;
    }
    bool untilNews() override
    {
        said.emplace_back("news");
        return true;
    }

    std::vector<std::string> said;

private:
    int naps_;
};

TEST(Rounds, anIdleDeviceSleepsUntilThereIsNews)
{
    std::deque<Outcome> outcomes{Outcome::Sent, Outcome::Nothing, Outcome::Away, Outcome::Sent};
    Schedule schedule(interval, [] { return 0; });
    FakeSleep sleep(4);
    std::vector<Outcome> reported;
    runRounds(
        [&] {
            sleep.said.emplace_back("round");
            const RoundResult result{outcomes.front(), "", 0};
            outcomes.pop_front();
            return result;
        },
        schedule, sleep, [&](const RoundResult& result) { reported.push_back(result.outcome); });
    EXPECT_THAT(sleep.said,
                ElementsAre("sleep 0", "round", "sleep 900", "news", "round", "sleep 900", "news", "round", "sleep 900",
                            "round", "sleep 900"));
    EXPECT_THAT(reported, ElementsAre(Outcome::Sent, Outcome::Nothing, Outcome::Away, Outcome::Sent));
}

TEST(Rounds, anInterruptionEndsThem)
{
    Schedule schedule(interval, [] { return 0; });
    FakeSleep sleep(100);
    runRounds([] { return RoundResult{Outcome::Interrupted, "", 0}; }, schedule, sleep,
              [](const RoundResult&) { ADD_FAILURE(); });
    EXPECT_THAT(sleep.said, ElementsAre("sleep 0"));
}

} // namespace
} // namespace uplink_test
