// SPDX-License-Identifier: Apache-2.0
// The figures of a report, from plain rows.
#include "kesto/report/Report.h"

#include "kesto/report/ReportTable.h"
#include "tools/kesto/report/ZoneForTest.h"

#include <cmath>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace kesto_tool {
namespace {

using testing::DoubleEq;
using testing::Each;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Optional;
using testing::SizeIs;

constexpr double infinity = std::numeric_limits<double>::infinity();
constexpr DayStart ofUTC{.afterMidnight = {}, .isUTC = true};

// In the order that a history has.
History historyOf(std::vector<PlayedStretch> stretches, std::vector<Fault> faults = {},
                  std::vector<HistorySession> sessions = {})
{
    return {.stretches = std::move(stretches),
            .sessions = std::move(sessions),
            .faults = std::move(faults),
            .now = 1'000'000};
}

HistorySession session(std::int64_t id, const std::string& application)
{
    HistorySession session;
    session.id = id;
    session.application = application;
    return session;
}

PlayedStretch stretch(std::int64_t session, double began, double seconds, std::optional<double> volume = 0.5,
                      const std::string& device = "speaker")
{
    return {.session = session,
            .began = began,
            .seconds = seconds,
            .device = device,
            .format = "S16LE/48000/2",
            .volume = volume};
}

Fault fault(std::int64_t session, double happened, std::int64_t lateCycles = 1,
            const std::string& kind = "IssueDetector")
{
    return {.session = session, .happened = happened, .kind = kind, .device = "speaker", .lateCycles = lateCycles};
}

Report reportOf(const History& history, TimeSpan span = {.from = 0, .until = 1'000'000}, DayStart dayStart = ofUTC)
{
    return makeReport(history, span, false, dayStart);
}

// "key seconds sessions faults"
std::vector<std::string> textOf(const std::vector<ReportLine>& lines)
{
    std::vector<std::string> texts;
    for (const ReportLine& line : lines)
        texts.push_back(
            fmt::format("{} {} {} {}", line.key, line.played.seconds, line.played.sessions, line.played.faults));
    return texts;
}

std::vector<std::string> daysOf(const Report& report)
{
    std::vector<std::string> texts;
    for (const ReportDay& day : report.days)
        texts.push_back(
            fmt::format("{} {} {} {}", dateText(day.date), day.played.seconds, day.played.sessions, day.played.faults));
    return texts;
}

TEST(ReportOfHistory, HasEveryDayOfAnEmptySpan)
{
    const Report report = reportOf({}, {.from = 0, .until = 200'000});
    EXPECT_EQ(report.all.seconds, 0);
    EXPECT_EQ(report.all.meanVolume(), std::nullopt);
    EXPECT_EQ(report.all.faultsAnHour(), std::nullopt);
    EXPECT_THAT(daysOf(report), ElementsAre("1970-01-01 0 0 0", "1970-01-02 0 0 0", "1970-01-03 0 0 0"));
    EXPECT_THAT(report.applications, IsEmpty());
}

// 10.000001 s at half the slider are 5.0000005 s, and count as 5.000001 s.
TEST(ReportOfHistory, RoundsUpHalfAMicrosecondOfVolume)
{
    EXPECT_EQ(reportOf(historyOf({stretch(1, 86'000, 10.000001)})).all.volumeSeconds, 5.000001);
    EXPECT_EQ(reportOf(historyOf({stretch(1, 86'000, 10.000003)})).all.volumeSeconds, 5.000002);
}

TEST(ReportOfHistory, DividesAStretchAmongTheDays)
{
    const Report report = reportOf(historyOf({stretch(1, 86'000, 87'200)}), {.from = 0, .until = 259'200});
    EXPECT_THAT(daysOf(report), ElementsAre("1970-01-01 400 1 0", "1970-01-02 86400 1 0", "1970-01-03 400 1 0"));
    EXPECT_EQ(report.all.seconds, 87'200);
    EXPECT_EQ(report.all.sessions, 1U);
    EXPECT_THAT(report.days[1].byApplication, ElementsAre(86'400));
}

TEST(ReportOfHistory, DividesAStretchAtTheReadersMidnight)
{
    const ZoneForTest inBerlin("Europe/Berlin");
    // From 23:00 of the day before the clocks are set back to 01:00 of the day after: 27 hours.
    const Report report =
        reportOf(historyOf({stretch(1, 1'792'875'600, 97'200)}), {.from = 1'792'792'800, .until = 1'793'055'600}, {});
    EXPECT_THAT(daysOf(report), ElementsAre("2026-10-24 3600 1 0", "2026-10-25 90000 1 0", "2026-10-26 3600 1 0"));
}

TEST(ReportOfHistory, CountsOnlyWhatLiesInTheSpan)
{
    const Report report = reportOf(historyOf({stretch(1, 50, 100), stretch(2, 190, 100), stretch(3, 500, 10)},
                                             {fault(1, 99), fault(1, 100), fault(2, 200)}),
                                   {.from = 100, .until = 200});
    EXPECT_EQ(report.all.seconds, 60);
    EXPECT_EQ(report.all.sessions, 2U);
    EXPECT_EQ(report.all.faults, 1U);
}

TEST(ReportOfHistory, WeighsVolumesByTimeAndLeavesOutMutedAndUnknown)
{
    const Report report = reportOf(historyOf({stretch(1, 0, 100, 0.2), stretch(1, 100, 300, 0.6),
                                              stretch(1, 400, 50, 0.0), stretch(2, 450, 25, std::nullopt)}));
    EXPECT_EQ(report.all.seconds, 475);
    EXPECT_EQ(report.all.mutedSeconds, 50);
    EXPECT_EQ(report.all.noVolumeSeconds, 25);
    EXPECT_THAT(report.all.meanVolume(), Optional(DoubleEq(0.5)));
    EXPECT_EQ(reportOf(historyOf({stretch(1, 0, 100, 0.0)})).all.meanVolume(), std::nullopt);
    EXPECT_EQ(reportOf(historyOf({stretch(1, 0, 100, std::nullopt)})).all.meanVolume(), std::nullopt);
}

TEST(ReportOfHistory, HasTheTimeAtEachStepOfTheSlider)
{
    const Report report =
        reportOf(historyOf({stretch(1, 0, 1, 0.0), stretch(1, 1, 2, 0.001), stretch(1, 3, 4, 0.0625),
                            stretch(1, 7, 8, 0.0626), stretch(1, 15, 16, 1.0), stretch(1, 31, 32, std::nullopt)}));
    EXPECT_EQ(report.secondsAtVolume[0], 6);
    EXPECT_EQ(report.secondsAtVolume[1], 8);
    EXPECT_EQ(report.secondsAtVolume[2], 0);
    EXPECT_EQ(report.secondsAtVolume[15], 16);
}

TEST(ReportOfHistory, SortsLinesByTimeAndThenByName)
{
    const Report report = reportOf(historyOf({stretch(1, 0, 10), stretch(2, 20, 10, 0.5, "headset"),
                                              stretch(2, 40, 5, 0.5, "headset,speaker"), stretch(3, 60, 15)},
                                             {}, {session(1, "org.b"), session(2, "org.a")}));
    EXPECT_THAT(textOf(report.applications), ElementsAre(" 15 1 0", "org.a 15 1 0", "org.b 10 1 0"));
    EXPECT_THAT(textOf(report.devices), ElementsAre("speaker 25 2 0", "headset 10 1 0", "headset,speaker 5 1 0"));
    EXPECT_THAT(textOf(report.formats), ElementsAre("S16LE/48000/2 40 3 0"));
}

TEST(ReportOfHistory, CountsASessionOnceInEachLineAndDay)
{
    const Report report = reportOf(historyOf({stretch(1, 0, 10), stretch(1, 10, 10, 0.5, "headset"), stretch(1, 20, 10),
                                              stretch(1, 90'000, 10), stretch(2, 90'020, 10)}));
    EXPECT_EQ(report.all.sessions, 2U);
    EXPECT_THAT(textOf(report.devices), ElementsAre("speaker 40 2 0", "headset 10 1 0"));
    EXPECT_THAT(daysOf(report)[0], "1970-01-01 30 1 0");
    EXPECT_THAT(daysOf(report)[1], "1970-01-02 20 2 0");
    ASSERT_THAT(report.days[0].byDevice, SizeIs(2));
    EXPECT_EQ(report.days[0].byDevice[0].seconds, 20);
    EXPECT_EQ(report.days[0].byDevice[1].seconds, 10);
    EXPECT_EQ(report.days[1].byDevice[0].sessions, 2U);
}

TEST(ReportOfHistory, CountsFaultsAnHourOfPlaying)
{
    const Report report = reportOf(historyOf({stretch(1, 0, 1800), stretch(2, 86'400, 5400)},
                                             {fault(1, 5), fault(2, 86'401, 2, "Generic"), fault(2, 86'402, 3)},
                                             {session(1, "org.one"), session(2, "org.two")}));
    EXPECT_THAT(report.all.faultsAnHour(), Optional(DoubleEq(1.5)));
    EXPECT_THAT(textOf(report.applications), ElementsAre("org.two 5400 1 2", "org.one 1800 1 1"));
    EXPECT_THAT(textOf(report.devices), ElementsAre("speaker 7200 2 3"));
    EXPECT_THAT(textOf(report.formats), ElementsAre("S16LE/48000/2 7200 2 3"));
    EXPECT_THAT(textOf(report.faultKinds), ElementsAre("IssueDetector 0 2 2", "Generic 0 1 1"));
    EXPECT_THAT(daysOf(report)[0], "1970-01-01 1800 1 1");
    EXPECT_THAT(daysOf(report)[1], "1970-01-02 5400 1 2");
    EXPECT_EQ(report.days[1].byDevice[0].faults, 2U);
    EXPECT_EQ(report.withFaults, 2U);
}

TEST(ReportOfHistory, KeepsFaultsOfSessionsWithoutPlayingTime)
{
    const Report report = reportOf(historyOf({}, {fault(7, 10), fault(0, 20)}));
    EXPECT_EQ(report.all.faults, 2U);
    EXPECT_EQ(report.all.faultsAnHour(), std::nullopt);
    EXPECT_THAT(textOf(report.applications), ElementsAre(" 0 0 2"));
    EXPECT_EQ(report.withFaults, 1U) << "nobody knows whose the other is";
    EXPECT_EQ(report.faultless, 0U);
    ASSERT_THAT(report.worst, SizeIs(1));
    EXPECT_EQ(report.worst[0].session.id, 7);
}

TEST(ReportOfHistory, SaysWhetherStreamsPlayedAtOnce)
{
    EXPECT_FALSE(reportOf(historyOf({stretch(1, 0, 10), stretch(2, 10, 10)})).isOverlapping);
    EXPECT_FALSE(reportOf(historyOf({stretch(1, 0.1, 0.2), stretch(1, 0.1 + 0.2 - 1e-9, 10)})).isOverlapping);
    const Report report = reportOf(historyOf({stretch(1, 0, 86'400), stretch(2, 400, 86'000)}));
    EXPECT_TRUE(report.isOverlapping);
    EXPECT_EQ(report.days[0].played.seconds, 172'400);
    EXPECT_TRUE(reportOf(historyOf({stretch(1, 0, 100), stretch(2, 10, 10), stretch(3, 50, 10)})).isOverlapping);
}

TEST(ReportOfHistory, CountsSessionsThatRunAndThatVanished)
{
    auto running = stretch(1, 100, 50);
    running.isRunning = true;
    auto begun = stretch(2, 1000, 0);
    begun.isRunning = true;
    auto vanished = stretch(3, 100, 20);
    vanished.hasVanished = true;
    auto vanishedLater = stretch(4, 900, 200);
    vanishedLater.hasVanished = true;
    const Report report = reportOf(historyOf({running, begun, vanished, vanishedLater}), {.from = 0, .until = 1000});
    EXPECT_EQ(report.running, 2U);
    EXPECT_EQ(report.vanished, 1U) << "the other did so after the end of the report";
    EXPECT_EQ(report.all.sessions, 4U);
    EXPECT_EQ(report.all.seconds, 170);
}

TEST(ReportOfHistory, NamesTheWorstSessions)
{
    std::vector<PlayedStretch> stretches;
    std::vector<Fault> faults;
    for (int id = 1; id <= 12; ++id) {
        stretches.push_back(stretch(id, id * 100, 10));
        faults.push_back(fault(id, id * 100, id));
    }
    stretches.push_back(stretch(13, 2000, 10, 0.5, "headset"));
    stretches.push_back(stretch(13, 2010, 20, 0.5, "speaker"));
    stretches.back().hasVanished = true;
    faults.push_back(fault(13, 2005, 6));
    faults.push_back(fault(13, 2015, 6));
    const Report report = reportOf(historyOf(stretches, faults, {session(13, "org.worst")}));
    ASSERT_THAT(report.worst, SizeIs(10));
    const WorstSession& worst = report.worst[0];
    EXPECT_EQ(worst.session.id, 13) << "as many cycles as the next, in more faults";
    EXPECT_EQ(worst.session.application, "org.worst");
    EXPECT_EQ(worst.lateCycles, 12);
    EXPECT_EQ(worst.devices, "speaker; headset");
    EXPECT_EQ(worst.played.seconds, 30);
    EXPECT_EQ(worst.played.faults, 2U);
    EXPECT_TRUE(worst.hasVanished);
    EXPECT_FALSE(worst.isRunning);
    EXPECT_THAT(worst.stretches, SizeIs(2));
    EXPECT_THAT(worst.faults, SizeIs(2));
    EXPECT_EQ(report.worst[1].session.id, 12);
    EXPECT_EQ(report.worst[9].session.id, 4);
    EXPECT_EQ(report.withFaults, 13U);
}

TEST(ReportOfHistory, CountsSessionsWithoutAFaultAmongThoseThatPlayed)
{
    const Report report = reportOf(
        historyOf({stretch(1, 0, 10), stretch(2, 0, 10), stretch(3, 0, 10)}, {fault(2, 5), fault(2, 6), fault(4, 7)}));
    EXPECT_EQ(report.withFaults, 2U);
    EXPECT_EQ(report.faultless, 2U);
}

TEST(ReportOfHistory, HasNoneVanishedAfterItsEnd)
{
    std::vector<PlayedStretch> stretches{stretch(1, 0, 100), stretch(2, 0, 20)};
    for (PlayedStretch& each : stretches)
        each.hasVanished = true;
    const Report report = reportOf(historyOf(stretches, {fault(1, 5), fault(2, 5)}), {.from = 0, .until = 50});
    EXPECT_EQ(report.vanished, 1U);
    ASSERT_THAT(report.worst, SizeIs(2));
    EXPECT_FALSE(report.worst[0].hasVanished);
    EXPECT_TRUE(report.worst[1].hasVanished);
}

TEST(ReportOfHistory, EndsWhatHasNoEnd)
{
    const Report report = reportOf(historyOf({stretch(1, 900, 50)}), {.from = -infinity, .until = infinity});
    EXPECT_EQ(report.span.from, 900);
    EXPECT_EQ(report.span.until, 1'000'000) << "now";
    EXPECT_EQ(report.all.seconds, 50);
    const Report empty = reportOf({}, {.from = -infinity, .until = infinity});
    EXPECT_THAT(empty.days, IsEmpty());
}

TEST(ReportOfHistory, TakesTimesThatNoClockShows)
{
    const double nan = std::nan("");
    const Report report = reportOf(
        historyOf({stretch(1, nan, 10), stretch(2, 10, nan), stretch(3, -infinity, infinity), stretch(4, 0, infinity),
                   stretch(5, -1e300, 1e300), stretch(6, 1e300, 1e300), stretch(7, -1e15, 2e15), stretch(8, 5, -10),
                   stretch(9, 10, 10, nan), stretch(10, 20, 10, infinity), stretch(11, 30, 10, -5.0)},
                  {fault(1, nan), fault(1, infinity), fault(1, -1e300), fault(1, 1e300)}),
        {.from = 0, .until = 864'000});
    EXPECT_EQ(report.all.seconds, 864'030) << "of the session 7, and those after it";
    EXPECT_EQ(report.all.noVolumeSeconds, 20);
    EXPECT_EQ(report.all.mutedSeconds, 10);
    EXPECT_EQ(report.all.faults, 0U);
    EXPECT_THAT(report.days, SizeIs(10));
    for (const TimeSpan span : {TimeSpan{nan, nan}, TimeSpan{nan, 100}, TimeSpan{100, nan}, TimeSpan{1e300, 2e300},
                                TimeSpan{200, 100}, TimeSpan{-1e300, -1e299}})
        EXPECT_THAT(reportOf(historyOf({stretch(1, 10, 10)}, {fault(1, 11)}), span).days, IsEmpty());
}

TEST(ReportOfHistory, BoundsTheColumnsOfADay)
{
    std::vector<PlayedStretch> stretches;
    std::vector<HistorySession> sessions;
    for (int id = 1; id <= 100; ++id) {
        stretches.push_back(stretch(id, id * 100, 101 - id, 0.5, fmt::format("device {}", id)));
        sessions.push_back(session(id, fmt::format("org.{}", id)));
    }
    const Report report = reportOf(historyOf(stretches, {}, sessions));
    EXPECT_THAT(report.applications, SizeIs(100));
    EXPECT_EQ(report.days[0].byApplication.size(), 8U);
    EXPECT_EQ(report.days[0].byApplication[7], 93);
    EXPECT_EQ(report.days[0].byDevice.size(), 8U);
    EXPECT_EQ(report.days[0].byDevice[7].seconds, 93);
}

TEST(ReportOfHistory, SaysWhatItIsAbout)
{
    const Report report = makeReport(historyOf({stretch(1, 0, 10)}), {.from = 0, .until = 5}, true, ofUTC);
    EXPECT_TRUE(report.isRecording);
    EXPECT_EQ(report.span.until, 5);
    EXPECT_EQ(report.all.seconds, 5);
}

} // namespace
} // namespace kesto_tool
