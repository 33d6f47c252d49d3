// SPDX-License-Identifier: Apache-2.0
// Reports of made-up weeks hold against the truth: every figure, in zones where clocks change, over several seeds.
#include "kesto/history/History.h"
#include "kesto/report/Report.h"
#include "support/EnvironmentVariable.h"
#include "support/TemporaryDirectory.h"
#include "support/weeks/WeeksFile.h"
#include "tools/kesto/report/weeks/Figures.h"

#include <algorithm>
#include <ctime>
#include <gtest/gtest.h>
#include <set>
#include <string>

namespace kesto_tool {
namespace {

constexpr std::size_t sessionsOfWeeks = 200;

class WeeksReport : public testing::TestWithParam<std::tuple<std::size_t, std::uint32_t>> {
protected:
    WeeksReport() : days_(zonesWithDays()[std::get<0>(GetParam())]), zone_("TZ", days_.zone)
    {
        ::tzset();
        weeks_ = weeks::makeWeeks(
            {.seed = std::get<1>(GetParam()), .sessions = sessionsOfWeeks, .midnights = days_.midnights});
        weeks::writeWeeks(weeks_, directory_ / "store.sqlite3");
    }

    [[nodiscard]] Report report(const TimeSpan& span, bool isRecording) const
    {
        return makeReport(readHistory(directory_ / "store.sqlite3", {.span = span, .isRecording = isRecording}), span,
                          isRecording, {});
    }
    [[nodiscard]] TimeSpan whole() const { return {days_.midnights.front(), days_.midnights.back()}; }
    void expectTruth(const TimeSpan& span, bool isRecording) const
    {
        EXPECT_EQ(differences(figuresOf(weeks_, days_, span, isRecording), figuresOf(report(span, isRecording))), "");
    }

    const ZoneDays& days_;
    support::EnvironmentVariable zone_;
    support::TemporaryDirectory directory_;
    weeks::Weeks weeks_;
};

TEST_P(WeeksReport, TellsWhatWasPlayed)
{
    expectTruth(whole(), false);
}

TEST_P(WeeksReport, TellsWhatWasRecorded)
{
    expectTruth(whole(), true);
}

TEST_P(WeeksReport, CountsWhatLiesInItsSpanOnly)
{
    expectTruth({days_.midnights[2] + 5000, days_.midnights[11] - 7777}, false);
    expectTruth({days_.midnights[13] + 38'000, days_.midnights[13] + 38'000 + 1800}, false);
}

TEST_P(WeeksReport, BeginsTablesWithWhatPlayedLongest)
{
    const Report made = report(whole(), false);
    for (const auto* lines : {&made.applications, &made.devices, &made.formats}) {
        EXPECT_GE(lines->size(), 2U);
        EXPECT_TRUE(
            std::ranges::is_sorted(*lines, std::greater(), [](const ReportLine& line) { return line.played.seconds; }));
    }
}

TEST_P(WeeksReport, ShowsTheCourseOfTheWorst)
{
    for (const WorstSession& worst : report(whole(), false).worst) {
        const auto isOfIt = [&](const auto& each) { return each.session == worst.session.id; };
        EXPECT_EQ(static_cast<std::ptrdiff_t>(worst.stretches.size()), std::ranges::count_if(weeks_.stretches, isOfIt));
        EXPECT_EQ(static_cast<std::ptrdiff_t>(worst.faults.size()), std::ranges::count_if(weeks_.faults, isOfIt));
        const weeks::Session& session = weeks_.sessions[static_cast<std::size_t>(worst.session.id - 1)];
        EXPECT_EQ(worst.session.application, session.application);
        EXPECT_EQ(worst.session.process, session.process);
        EXPECT_EQ(worst.session.processID, session.processID);
        EXPECT_EQ(worst.session.ended, session.ended);
    }
}

std::string nameOf(const testing::TestParamInfo<WeeksReport::ParamType>& info)
{
    std::string zone = zonesWithDays()[std::get<0>(info.param)].zone;
    std::ranges::replace_if(zone, [](char character) { return character == '/' || character == '_'; }, 'X');
    return zone + std::to_string(std::get<1>(info.param));
}

INSTANTIATE_TEST_SUITE_P(Zones, WeeksReport,
                         testing::Combine(testing::Range<std::size_t>(0, zonesWithDays().size()),
                                          testing::Values(1U, 2U, 20U)),
                         nameOf);

// --- The weeks themselves: without what they promise, nothing above would be tested.

TEST(MadeUpWeeks, AreTheSameForTheSameWish)
{
    const weeks::Wish wish{.seed = 3, .sessions = 50, .midnights = zonesWithDays()[0].midnights};
    const weeks::Weeks one = weeks::makeWeeks(wish);
    const weeks::Weeks other = weeks::makeWeeks(wish);
    ASSERT_EQ(one.stretches.size(), other.stretches.size());
    EXPECT_EQ(one.stretches.back().began, other.stretches.back().began);
    EXPECT_EQ(one.messages.size(), other.messages.size());
}

TEST(MadeUpWeeks, HaveWhatTheyPromise)
{
    const auto& midnights = zonesWithDays()[0].midnights;
    const weeks::Weeks made = weeks::makeWeeks({.sessions = 300, .midnights = midnights});
    std::set<std::string> devices;
    std::set<weeks::Ending> endings;
    bool isOverMidnight = false;
    bool isMuted = false;
    bool isUnheard = false;
    bool isRecorded = false;
    for (const weeks::Stretch& stretch : made.stretches) {
        devices.insert(stretch.devices);
        endings.insert(stretch.ending);
        isMuted |= stretch.volume == 0.0;
        isUnheard |= !stretch.volume;
        isRecorded |= stretch.isRecording;
        EXPECT_GT(stretch.seconds, 0);
        EXPECT_LE(stretch.began + stretch.seconds, made.now);
        for (const double midnight : midnights)
            isOverMidnight |= stretch.began < midnight && stretch.began + stretch.seconds > midnight;
    }
    EXPECT_EQ(devices.size(), 7U) << "four, two at once, a microphone, and those that are not told";
    EXPECT_EQ(endings.size(), 5U);
    EXPECT_TRUE(isOverMidnight && isMuted && isUnheard && isRecorded);
    EXPECT_GT(made.faults.size(), 20U);
    EXPECT_EQ(std::ranges::count_if(made.sessions, [](const weeks::Session& session) { return !session.ended; }), 2)
        << "one plays, and one was left behind by a service that was killed";
}

} // namespace
} // namespace kesto_tool
