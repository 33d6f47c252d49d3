// SPDX-License-Identifier: Apache-2.0
// Names that strangers chose cannot be more than text, and figures say no more and no less than there is.
#include "kesto/report/page/PageText.h"
#include "kesto/report/ReportWords.h"

#include <chrono>
#include <gtest/gtest.h>
#include <string>

namespace kesto_tool {
namespace {

using std::chrono::year;

TEST(PageText, EscapesWhatHTMLWouldRead)
{
    EXPECT_EQ(htmlText("a<b>&\"c'", 100), "a&lt;b&gt;&amp;&quot;c&#39;");
}

TEST(PageText, KeepsLettersOfEveryScript)
{
    EXPECT_EQ(htmlText("Größe 音楽 مشغل 🎵", 100), "Größe 音楽 مشغل 🎵");
}

TEST(PageText, ShowsWhatCannotBeSeen)
{
    EXPECT_EQ(htmlText(std::string_view("a\0b\x1b[1m\x7f\n", 9), 100), "a\uFFFDb\uFFFD[1m\uFFFD\uFFFD");
    EXPECT_EQ(htmlText("\u0085\u00AD\u200B\u200F\u2028\u202E\u2066\uFEFF\U000E0041", 100),
              "\uFFFD\uFFFD\uFFFD\uFFFD\uFFFD\uFFFD\uFFFD\uFFFD\uFFFD");
}

TEST(PageText, ShowsBytesThatAreNoCharacters)
{
    EXPECT_EQ(htmlText("\xFFz", 100), "\uFFFDz");
    EXPECT_EQ(htmlText("\xC3", 100), "\uFFFD");
    EXPECT_EQ(htmlText("\xC3<", 100), "\uFFFD&lt;") << "a byte that begins a character swallows no other";
    EXPECT_EQ(htmlText("\xE0\x80\xBC", 100), "\uFFFD\uFFFD\uFFFD") << "not another way to write <";
    EXPECT_EQ(htmlText("\xED\xA0\x80", 100), "\uFFFD") << "half of a pair";
    EXPECT_EQ(htmlText("\xF4\x90\x80\x80", 100), "\uFFFD") << "behind the last character";
}

TEST(PageText, LeavesOutTheMiddle)
{
    EXPECT_EQ(htmlText("alsa_output.pci.analog", 22), "alsa_output.pci.analog");
    EXPECT_EQ(htmlText("alsa_output.pci.analog", 11), "alsa_…nalog");
    EXPECT_EQ(htmlText("äöüäöü&&", 5), "äö…&amp;&amp;") << "characters count, not bytes";
}

TEST(PageText, SaysThatANameWasNotTold)
{
    EXPECT_EQ(htmlName(""), "not told");
    EXPECT_EQ(htmlName("a"), "a");
}

TEST(PageText, LeavesSomethingOfEachDevice)
{
    EXPECT_EQ(htmlDevices("headset,speaker", 20), "headset,speaker");
    EXPECT_EQ(htmlDevices("first-long-headset,second-long-speaker", 20), "firs…dset,seco…aker");
    EXPECT_EQ(htmlDevices("one-very-long-device-name", 11), "one-v…-name");
    EXPECT_EQ(htmlDevices(std::string(20, ','), 10), ",,,,,…,,,,") << "too many for a part of each";
    EXPECT_EQ(htmlDevices(""), "not told");
}

TEST(PageText, WritesDurations)
{
    EXPECT_EQ(durationText(0), "0 s");
    EXPECT_EQ(durationText(0.2), "below 1 s");
    EXPECT_EQ(durationText(59.4), "59 s");
    EXPECT_EQ(durationText(59.6), "1 min");
    EXPECT_EQ(durationText(3569), "59 min");
    EXPECT_EQ(durationText(3570), "1 h 0 min");
    EXPECT_EQ(durationText(20240), "5 h 37 min");
    EXPECT_EQ(durationText(359940), "99 h 59 min");
    EXPECT_EQ(durationText(359990), "100 h");
}

TEST(PageText, WritesHours)
{
    EXPECT_EQ(hoursText(0), "0");
    EXPECT_EQ(hoursText(1), "&lt;0.01");
    EXPECT_EQ(hoursText(36), "0.01");
    EXPECT_EQ(hoursText(20052), "5.57");
}

TEST(PageText, NeverCallsNearlyAllAll)
{
    EXPECT_EQ(percentText(0, 5), "0 %");
    EXPECT_EQ(percentText(0, 0), "0 %");
    EXPECT_EQ(percentText(1, 100'000), "&lt;0.1 %");
    EXPECT_EQ(percentText(1, 200), "0.5 %");
    EXPECT_EQ(percentText(35, 100), "35 %");
    EXPECT_EQ(percentText(9999, 10'000), "99.9 %");
    EXPECT_EQ(percentText(5, 5), "100 %");
}

TEST(PageText, WritesRatesAndCounts)
{
    EXPECT_EQ(rateText(std::nullopt), "–");
    EXPECT_EQ(rateText(0), "0.00");
    EXPECT_EQ(rateText(0.001), "&lt;0.01");
    EXPECT_EQ(rateText(0.554), "0.55");
    EXPECT_EQ(countText(1, "session"), "1 session");
    EXPECT_EQ(countText(0, "session"), "0 sessions");
}

TEST(PageText, WritesDays)
{
    EXPECT_EQ(dayText(year(2026) / 11 / 8), "Sun 8 Nov");
    EXPECT_EQ(daysText(year(2026) / 11 / 8, year(2026) / 11 / 8), "8 November 2026");
    EXPECT_EQ(daysText(year(2026) / 11 / 8, year(2026) / 11 / 21), "8 to 21 November 2026");
    EXPECT_EQ(daysText(year(2026) / 10 / 25, year(2026) / 11 / 7), "25 October to 7 November 2026");
    EXPECT_EQ(daysText(year(2026) / 12 / 28, year(2027) / 1 / 3), "28 December 2026 to 3 January 2027");
    EXPECT_TRUE(isWeekend(year(2026) / 11 / 7));
    EXPECT_FALSE(isWeekend(year(2026) / 11 / 9));
}

TEST(PageText, WritesMomentsInUTC)
{
    EXPECT_EQ(pageMoment(1794096000.9, true, "{:%a %e %b, %H:%M:%S}"), "Sun  8 Nov, 00:00:00");
    EXPECT_EQ(pageMoment(1e300, true, "{:%H}"), "1e+300");
}

} // namespace
} // namespace kesto_tool
