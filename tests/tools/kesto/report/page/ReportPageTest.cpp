// SPDX-License-Identifier: Apache-2.0
// The page of a report: what stands in it, what cannot stand in it, and how large it becomes.
#include "kesto/report/page/ReportPage.h"
#include "kesto/report/page/PageStyle.h"
#include "tools/kesto/report/page/MadeReport.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <gcrypt.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <regex>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace kesto_tool {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

const PageHead pageHead{.host = "living-room",
                        .database = "/var/lib/kesto/analytics.sqlite3",
                        .made = 1795305600,
                        .timeZone = "Etc/UTC",
                        .isUTC = true};

std::string pageOf(const MadeReportWish& wish)
{
    return reportPage(madeReport(wish), pageHead);
}

std::size_t countOf(std::string_view part, std::string_view text)
{
    std::size_t count = 0;
    for (auto at = text.find(part); at != std::string_view::npos; at = text.find(part, at + 1))
        ++count;
    return count;
}

// The text of the page from one heading to the next.
std::string sectionOf(const std::string& page, const std::string& heading)
{
    const auto from = page.find("<h2>" + heading);
    EXPECT_NE(from, std::string::npos) << heading;
    return from == std::string::npos ? std::string() : page.substr(from, page.find("</section>", from) - from);
}

TEST(ReportPage, SaysWhatItIsAbout)
{
    const std::string page = pageOf({});
    EXPECT_THAT(page, HasSubstr("<title>Audio report, 8 to 21 November 2026, living-room</title>"));
    EXPECT_THAT(page, HasSubstr("<bdi>living-room</bdi> · 8 to 21 November 2026 · days as in <bdi>Etc/UTC</bdi>"));
    EXPECT_THAT(page, HasSubstr("from <bdi>/var/lib/kesto/analytics.sqlite3</bdi> on 22 November 2026, 00:00."));
}

TEST(ReportPage, BeginsWithTheMainFigures)
{
    Report report = madeReport();
    report.all.seconds = 131.5 * 3600;
    report.all.faults = 73;
    report.all.sessions = 589;
    report.faultless = 548;
    report.running = 1;
    const std::string page = reportPage(report, pageHead);
    EXPECT_THAT(page, HasSubstr("<dt>played, 9 h 24 min a day</dt><dd>132 h</dd>"));
    EXPECT_THAT(page, HasSubstr("<dt>sessions, 1 still plays</dt><dd>589</dd>"));
    EXPECT_THAT(page, HasSubstr("<dt>faults, 0.56 an hour of playing</dt><dd>73</dd>"));
    EXPECT_THAT(page, HasSubstr("<dt>of sessions without a fault</dt><dd>93 %</dd>"));
}

TEST(ReportPage, HasTheFiguresOfEachDayInATable)
{
    const std::string section = sectionOf(pageOf({}), "Time of playing a day");
    EXPECT_THAT(section, HasSubstr("<th scope=col>Day<th scope=col><bdi>application 1</bdi>"));
    // 1 + 1/2 + 1/3 + 1/4 + 1/5
    EXPECT_EQ(countOf("<td>1.00<td>0.50<td>0.33<td>0.25<td>0.20<td>2.28", section), 14U);
    EXPECT_THAT(section, HasSubstr("<tr><th scope=row>Sun 8 Nov<td>"));
    EXPECT_THAT(section, HasSubstr("<title>Sun 8 Nov: 2 h 17 min\napplication 5 12 min\napplication 4 15 min"));
}

TEST(ReportPage, PutsTheSmallestTogether)
{
    const std::string page = pageOf({.applications = 60, .devices = 40});
    const std::string days = sectionOf(page, "Time of playing a day");
    EXPECT_THAT(days, HasSubstr("<bdi>54 others</bdi>"));
    EXPECT_THAT(days, Not(HasSubstr("application 7")));
    // The sum of 1/7 to 1/60 is 2.2299.
    EXPECT_EQ(countOf("<td>0.17<td>2.23<td>4.68", days), 14U);
    const std::string devices = sectionOf(page, "Devices");
    EXPECT_THAT(devices, HasSubstr("<bdi>32 others</bdi>"));
    EXPECT_THAT(sectionOf(page, "Faults by device"), HasSubstr("<bdi>32 others</bdi>"));
    EXPECT_THAT(page, Not(HasSubstr("device 9")));
}

TEST(ReportPage, TellsSharesOfDevices)
{
    Report report = madeReport();
    report.all.seconds = 100 * 3600;
    report.devices[0].played = {.seconds = 35 * 3600, .sessions = 157};
    const std::string section = sectionOf(reportPage(report, pageHead), "Devices");
    EXPECT_THAT(section, HasSubstr("<bdi>device 1</bdi><span><b>35 %</b> 35 h 0 min, 157 sessions</span>"));
    EXPECT_THAT(section, HasSubstr("<path class=s1 d=\"M0 0h140v10h-140z\"/>")) << "35 % of 400";
}

TEST(ReportPage, TellsHowLongItWasHowLoud)
{
    Report report = madeReport();
    report.all.mutedSeconds = 1800;
    report.secondsAtVolume.fill(0);
    report.secondsAtVolume[0] = 36;
    report.secondsAtVolume[15] = 7200 + 36;
    const std::string section = sectionOf(reportPage(report, pageHead), "Volume");
    EXPECT_THAT(section, HasSubstr("<th scope=row>muted<td>0.50"));
    EXPECT_THAT(section, HasSubstr("<th scope=row>0 to 6.25 %<td>0.01"));
    EXPECT_THAT(section, HasSubstr("<th scope=row>93.75 to 100 %<td>2.01"));
    EXPECT_THAT(section, HasSubstr("<title>93.75 to 100 %: 2 h 1 min</title>"));
    EXPECT_THAT(section, HasSubstr(">mean 48 %<")) << "48,909 of 101,772 seconds";
}

TEST(ReportPage, SaysThatNoVolumeWasTold)
{
    Report report = madeReport();
    report.all.noVolumeSeconds = report.all.seconds;
    EXPECT_THAT(sectionOf(reportPage(report, pageHead), "Volume"), HasSubstr("No stream told its volume."));
}

TEST(ReportPage, ColoursFaultsByTheirNumberForEachHour)
{
    Report report = madeReport({.days = 6, .devices = 1});
    const auto set = [&](std::size_t day, double hours, std::size_t faults) {
        report.days[day].byDevice[0] = {.seconds = hours * 3600, .faults = faults};
    };
    set(0, 10, 4);
    set(1, 10, 5);
    set(2, 10, 10);
    set(3, 10, 20);
    set(4, 10, 0);
    set(5, 0, 0);
    const std::string section = sectionOf(reportPage(report, pageHead), "Faults by device");
    EXPECT_THAT(section,
                HasSubstr("<td class=h1 title=\"in 10 h 0 min\">4<td class=h2 title=\"in 10 h 0 min\">5"
                          "<td class=h3 title=\"in 10 h 0 min\">10<td class=h4 title=\"in 10 h 0 min\">20"
                          "<td title=\"in 10 h 0 min\">0<td class=no>–<td class=sum>39<td class=sum>0.78"));
    EXPECT_THAT(section, HasSubstr("Most: <bdi>device 1</bdi>, Wed 11 Nov, 20 in 10 h 0 min"));
    EXPECT_THAT(section, HasSubstr("Kinds: <bdi>IssueDetector</bdi> 4"));
}

TEST(ReportPage, DrawsTheCourseOfTheWorstSessions)
{
    Report report = madeReport({.worst = 1, .marks = 2});
    WorstSession& worst = report.worst[0]; // from 01:00 to 02:45: two stretches of 45 minutes
    worst.stretches[1].device = "device 2";
    worst.stretches[1].volume = 0;
    const std::string section = sectionOf(reportPage(report, pageHead), "Worst sessions");
    EXPECT_THAT(section,
                AllOf(HasSubstr("<th scope=row>500<td class=l>Sun  8 Nov, 01:00"), HasSubstr("<bdi>process</bdi> 4321"),
                      HasSubstr("<td>1 h 30 min<td>2<td>100<td>1.33"),
                      HasSubstr("<title>01:00:00 to 01:45:00, device 1, volume 42 %</title>"),
                      HasSubstr("<title>02:00:00 to 02:45:00, device 2, muted</title>"),
                      HasSubstr("<title>01:30:00: 7 missed cycles</title>"), HasSubstr("<td class=l>03:00")));
}

TEST(ReportPage, TellsHowTheWorstSessionsEnded)
{
    Report report = madeReport({.worst = 4});
    report.worst[0].isRunning = true;
    report.worst[1].hasVanished = true;
    report.worst[2].session.ended.reset();
    report.worst[3].session.ended = *report.worst[3].session.ended + 86400;
    const std::string section = sectionOf(reportPage(report, pageHead), "Worst sessions");
    for (const char* end :
         {"<td class=l>still plays", "<td class=l>vanished", "<td class=l>not told", "<td class=l>Mon  9 Nov, 03:00"})
        EXPECT_EQ(countOf(end, section), 1U) << end;
}

TEST(ReportPage, TellsTheYearOfASessionThatBeganInAnother)
{
    Report report = madeReport({.worst = 1});
    EXPECT_THAT(sectionOf(reportPage(report, pageHead), "Worst sessions"), HasSubstr("<td class=l>Sun  8 Nov, 01:00<"));
    report.worst[0].session.began -= 365 * 86400.0;
    EXPECT_THAT(sectionOf(reportPage(report, pageHead), "Worst sessions"),
                HasSubstr("<td class=l>Sat  8 Nov 2025, 01:00<"));
}

TEST(ReportPage, SaysThatNoSessionHadAFault)
{
    EXPECT_THAT(sectionOf(pageOf({.worst = 0}), "Worst sessions"), HasSubstr("No session had a fault."));
}

TEST(ReportPage, SpeaksOfRecording)
{
    Report report = madeReport();
    report.isRecording = true;
    report.running = 2;
    const std::string page = reportPage(report, pageHead);
    EXPECT_THAT(page,
                AllOf(HasSubstr("<h1>Report of recordings</h1>"), HasSubstr("<dt>recorded, "),
                      HasSubstr("2 still record"), HasSubstr("an hour of recording")));
    EXPECT_EQ(countOf("play", page.substr(page.find("<body>"))), 0U);
}

TEST(ReportPage, SaysWhatIsLeftOut)
{
    Report report = madeReport();
    report.vanished = 12;
    report.isOverlapping = true;
    report.all.noVolumeSeconds = 84 * 60;
    const std::string page = reportPage(report, pageHead);
    EXPECT_THAT(page, HasSubstr("<p>12 sessions vanished: "));
    EXPECT_THAT(page, HasSubstr("<p>1 h 24 min were played by streams that told no volume"));
    EXPECT_THAT(page, HasSubstr("<p>Some streams ran at the same time, and each counts"));
    report.vanished = 0;
    report.isOverlapping = false;
    report.all.noVolumeSeconds = 0;
    EXPECT_THAT(reportPage(report, pageHead),
                AllOf(Not(HasSubstr("vanished: ")), Not(HasSubstr("told no volume")), Not(HasSubstr("same time"))));
}

TEST(ReportPage, SaysThatNothingWasPlayed)
{
    Report report;
    EXPECT_THAT(reportPage(report, pageHead), HasSubstr("<h2>Nothing was played</h2>"));
    report.days.push_back({.date = std::chrono::year(2026) / 11 / 8,
                           .span = {0, 86400},
                           .played = {},
                           .byApplication = {},
                           .byDevice = {}});
    const std::string page = reportPage(report, pageHead);
    EXPECT_THAT(page,
                AllOf(HasSubstr("<h2>Nothing was played</h2>"), HasSubstr("8 November 2026"), HasSubstr("<dd>0 s</dd>"),
                      HasSubstr("<dt>of sessions without a fault</dt><dd>–</dd>")));
    EXPECT_THAT(page, AllOf(Not(HasSubstr("nan")), Not(HasSubstr("inf"))));
}

TEST(ReportPage, ShowsFaultsWhereNothingWasPlayed)
{
    Report report = madeReport({.days = 1, .devices = 1});
    report.all = {.faults = 2};
    report.days[0].played = {.faults = 2};
    report.days[0].byApplication.assign(5, 0.0);
    report.days[0].byDevice[0] = {.faults = 2};
    report.secondsAtVolume.fill(0);
    const std::string page = reportPage(report, pageHead);
    EXPECT_THAT(sectionOf(page, "Faults by device"), HasSubstr("<td class=h4>2<td class=sum>2<td class=sum>–"));
    EXPECT_THAT(page, AllOf(Not(HasSubstr("nan")), Not(HasSubstr("inf\""))));
}

// --- days

TEST(ReportPage, NamesDaysOfAnotherLength)
{
    Report report = madeReport({.first = std::chrono::year(2026) / 10 / 24, .days = 3});
    EXPECT_THAT(reportPage(report, pageHead), Not(HasSubstr("are in this report")));
    report.days[1].span.until += 3600; // clocks go back
    report.days[2].span = {report.days[1].span.until, report.days[1].span.until + 10 * 3600};
    EXPECT_THAT(reportPage(report, pageHead),
                HasSubstr("<p class=note>Sun 25 Oct had 25 h 0 min. Of Mon 26 Oct, 10 h 0 min are in this report."));
}

TEST(ReportPage, NamesNoLengthOfDaysThatArePutTogether)
{
    Report report = madeReport({.days = 365});
    report.days[100].span.until += 3600;
    EXPECT_EQ(countOf("<p class=note>", sectionOf(reportPage(report, pageHead), "Time of ")), 0U);
}

// The labels below the bars.
std::vector<std::string> labelsOf(const std::string& page)
{
    const std::string section = sectionOf(page, "Time of ");
    std::vector<std::string> labels;
    const std::regex label(R"re(<text class="ax[ we]*" x=[0-9.]+ y=256 text-anchor=middle>([^<]*)</text>)re");
    for (std::sregex_iterator found(section.begin(), section.end(), label), end; found != end; ++found)
        labels.push_back((*found)[1]);
    return labels;
}

TEST(ReportPage, LabelsAsManyDaysAsThereIsRoomFor)
{
    EXPECT_THAT(labelsOf(pageOf({.days = 1})), testing::ElementsAre("Sun 8"));
    EXPECT_THAT(labelsOf(pageOf({.days = 3})), testing::ElementsAre("Sun 8", "Mon 9", "Tue 10"));
    EXPECT_EQ(labelsOf(pageOf({.days = 20})).size(), 20U);
    const auto month = labelsOf(pageOf({.days = 31}));
    ASSERT_EQ(month.size(), 31U);
    EXPECT_EQ(month.front(), "8");
    const auto quarter = labelsOf(pageOf({.days = 90}));
    ASSERT_EQ(quarter.size(), 13U);
    EXPECT_EQ(quarter.front(), "9 Nov") << "only Mondays";
    EXPECT_EQ(quarter.back(), "1 Feb");
}

TEST(ReportPage, PutsManyDaysTogether)
{
    const std::string quarter = pageOf({.days = 90});
    EXPECT_THAT(quarter, HasSubstr("<h2>Time of playing a day</h2>"));
    EXPECT_THAT(sectionOf(quarter, "Faults by device"), HasSubstr("<th scope=col>2<br>Nov<th scope=col>9<br>Nov"));
    const std::string year = pageOf({.days = 365});
    EXPECT_THAT(year, HasSubstr("<h2>Time of playing a week</h2>"));
    EXPECT_THAT(year, HasSubstr("<th scope=row>week of Mon 2 Nov<td>1.00")) << "of which one day is in the report";
    EXPECT_THAT(year, HasSubstr("<th scope=row>week of Mon 9 Nov<td>7.00"));
    EXPECT_THAT(sectionOf(year, "Faults by device"), HasSubstr("<th scope=col>Nov<br>2026<th scope=col>Dec<br>2026"));
    EXPECT_THAT(pageOf({.days = 3700}), HasSubstr("<h2>Time of playing a year</h2>"));
    const std::string century =
        pageOf({.first = std::chrono::year(1970) / 1 / 1, .days = 40'000, .applications = 1, .devices = 1});
    EXPECT_THAT(century, HasSubstr("<h2>Time of playing a decade</h2>"));
    EXPECT_THAT(century, HasSubstr("<th scope=row>1980s<td>3653.00")) << "an hour a day, with three leap days";
    EXPECT_THAT(sectionOf(century, "Faults by device"), HasSubstr("<th scope=col>1970s<th scope=col>1980s"));
}

// --- what strangers told

TEST(ReportPage, ShowsTextOfStrangersAsTextOnly)
{
    const std::string hostile =
        "</title></style><script>alert(1)</script><img src=x onerror='y'>\" onload=z \u202E\x01";
    Report report = madeReport({.name = hostile});
    PageHead head = pageHead;
    head.host = head.database = head.timeZone = hostile;
    const std::string page = reportPage(report, head);
    EXPECT_EQ(countOf("<script", page), 0U);
    EXPECT_EQ(countOf("<img", page), 0U);
    EXPECT_EQ(countOf("\u202E", page), 0U);
    EXPECT_EQ(countOf("\x01", page), 0U);
    EXPECT_EQ(countOf("</style>", page), 1U);
    EXPECT_EQ(countOf("onerror='", page), 0U);
    EXPECT_EQ(countOf("\" onload", page), 0U);
    EXPECT_GT(countOf("&lt;script&gt;", page), 10U);
}

TEST(ReportPage, LoadsNothingAndRunsNothing)
{
    const std::string page = pageOf({});
    for (const char* part : {"<script", "<link", "<img", "<iframe", "href=", "src=", "url(", "@import",
                             " style=", "http:", "https:", "javascript:"})
        EXPECT_EQ(countOf(part, page), 0U) << part;
    EXPECT_THAT(page,
                HasSubstr("<meta http-equiv=Content-Security-Policy content=\"default-src 'none'; style-src "
                          "'sha256-"));
}

std::string base64(std::string_view bytes)
{
    constexpr std::string_view digits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
    std::string text;
    for (std::size_t at = 0; at < bytes.size(); at += 3) {
        unsigned group = 0;
        for (std::size_t index = at; index < at + 3; ++index)
            group = group << 8U | (index < bytes.size() ? static_cast<unsigned char>(bytes[index]) : 0U);
        for (std::size_t digit = 0; digit < 4; ++digit)
            text += at + digit > bytes.size() ? '=' : digits[group >> (18 - 6 * digit) & 63U];
    }
    return text;
}

TEST(ReportPage, AllowsItsOwnStyleOnly)
{
    std::array<char, 32> hash{};
    gcry_md_hash_buffer(GCRY_MD_SHA256, hash.data(), pageStyle().data(), pageStyle().size());
    EXPECT_EQ(base64({hash.data(), hash.size()}), pageStyleHash) << "write this hash into PageStyle.h";
    EXPECT_THAT(pageOf({}), HasSubstr("<style>" + std::string(pageStyle()) + "</style>"));
}

TEST(ReportPage, SpeaksToThoseWhoDoNotSeeIt)
{
    const std::string page = pageOf({});
    EXPECT_THAT(page, HasSubstr("<html lang=en>"));
    EXPECT_EQ(countOf("<svg", page), countOf(" role=img aria-label=\"", page) + countOf(" aria-hidden=true", page));
    EXPECT_EQ(countOf("<details", page), 5U) << "days, devices, applications, formats and volume have their tables";
}

// --- its size

// More of everything than the page names, in names of the character that takes most bytes.
MadeReportWish crowded(std::size_t days, std::size_t marks)
{
    return {.days = days,
            .applications = 60,
            .devices = 40,
            .formats = 60,
            .kinds = 60,
            .worst = 10,
            .marks = marks,
            .name = std::string(200, '"')};
}

TEST(ReportPage, StaysSmall)
{
    EXPECT_LT(pageOf({}).size(), 40'000U);
    EXPECT_LT(pageOf({.days = 31, .applications = 60, .devices = 40, .worst = 10}).size(), 80'000U);
    for (const std::size_t days : {1, 16, 35, 50, 100, 700})
        for (const std::size_t marks : {0, 16, 25, 50, 10'000})
            EXPECT_LE(pageOf(crowded(days, marks)).size(), mostBytesOfPage) << days << " days, " << marks << " marks";
}

TEST(ReportPage, StaysSmallOverManyYears)
{
    MadeReportWish wish = crowded(57 * 365, 10'000);
    wish.first = std::chrono::year(1970) / 1 / 1;
    wish.applications = 7; // one more than the page names
    wish.devices = 9;
    const auto sizeWithChangesOfClocks = [&wish] {
        Report report = madeReport(wish);
        for (std::size_t day = 90; day < report.days.size(); day += 182)
            report.days[day].span.until += day % 364 == 90 ? -3600 : 3600;
        return reportPage(report, pageHead).size();
    };
    EXPECT_LE(sizeWithChangesOfClocks(), mostBytesOfPage);
    wish.days = 84'006; // to the end of 2199
    EXPECT_LE(sizeWithChangesOfClocks(), mostBytesOfPage);
}

// --- colours

using Colours = std::map<std::string, std::string>;

// The light ones, and the dark ones on top of these.
std::pair<Colours, Colours> coloursOf(std::string_view style)
{
    const std::string text(style);
    const auto dark = text.find("@media screen and (prefers-color-scheme:dark)");
    const auto read = [&](std::size_t from, std::size_t until) {
        Colours colours;
        const std::string part = text.substr(from, until - from);
        const std::regex colour("--([a-z0-9]+):#([0-9a-f]+)[;}\n]");
        for (std::sregex_iterator found(part.begin(), part.end(), colour), end; found != end; ++found)
            colours[(*found)[1]] = (*found)[2];
        return colours;
    };
    return {read(0, dark), read(dark, text.find("*{box-sizing"))};
}

double luminance(const std::string& colour)
{
    const std::size_t digits = colour.size() / 3;
    constexpr std::array weights{0.2126, 0.7152, 0.0722};
    double sum = 0;
    for (std::size_t channel = 0; channel < 3; ++channel) {
        std::string hex = colour.substr(channel * digits, digits);
        hex = digits == 1 ? hex + hex : hex;
        const double value = std::stoi(hex, nullptr, 16) / 255.0;
        sum += weights.at(channel) * (value <= 0.04045 ? value / 12.92 : std::pow((value + 0.055) / 1.055, 2.4));
    }
    return sum;
}

double contrast(const Colours& colours, const char* one, const char* other)
{
    const auto [low, high] = std::minmax({luminance(colours.at(one)), luminance(colours.at(other))});
    return (high + 0.05) / (low + 0.05);
}

TEST(ReportPage, HasEnoughContrastOnLightAndDarkScreens)
{
    const auto [light, dark] = coloursOf(pageStyle());
    for (const Colours& colours : {light, dark}) {
        for (const char* mark : {"c0", "c1", "c2", "c3", "c4", "c5", "c6", "s1", "bad"})
            EXPECT_GE(contrast(colours, mark, "card"), 3) << mark;
        for (const char* ground : {"page", "card", "track", "h1", "h2"})
            EXPECT_GE(contrast(colours, "ink", ground), 4.5) << ground;
        EXPECT_GE(contrast(colours, "soft", "page"), 4.5);
        EXPECT_GE(contrast(colours, "soft", "card"), 4.5);
        EXPECT_GE(contrast(colours, "t3", "h3"), 4.5);
        EXPECT_GE(contrast(colours, "t4", "h4"), 4.5);
    }
}

} // namespace
} // namespace kesto_tool
