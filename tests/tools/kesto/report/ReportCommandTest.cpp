// SPDX-License-Identifier: Apache-2.0
// `kesto report` as it is shipped, on a store in the service's schema and beside a real service.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"
#include "tools/kesto/Tool.h"
#include "tools/kesto/history/MadeStore.h"

#include <chrono>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_tool {
namespace {

using end_to_end::Kestod;
using end_to_end::WireClient;
using end_to_end::WireMethod;
using foundation::Array;
using foundation::Dictionary;
using testing::AllOf;
using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Not;
using testing::StartsWith;

constexpr double sunday = 1'794'096'000; // 2026-11-08 00:00 UTC

double secondsNow()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

class ReportCommand : public testing::Test {
protected:
    // Of the two days from that Sunday on.
    [[nodiscard]] std::string print(Tool::Arguments further = {}) const
    {
        further.insert(further.begin(), {"report", "--since", "2026-11-08", "--until", "2026-11-10"});
        return tool.print(further);
    }

    const support::TemporaryDirectory directory;
    Tool tool{directory.path()};
    MadeStore store{directory.path() / "state/analytics.sqlite3"};
};

TEST_F(ReportCommand, ShowsDaysAndApplications)
{
    store.addSession(1, "org.example.player", sunday);
    store.addSession(2, "org.example.game", sunday);
    store.add({.session = 1, .began = sunday + 82'800, .seconds = 7200, .volume = 0.25});
    store.add({.session = 2, .began = sunday + 100'000, .seconds = 1800, .volume = 1, .ending = "vanished"});
    store.addFault(1, sunday + 82'900, R"({"late_cycles":4})");
    tool.setVariable("COLUMNS=80");
    tool.setVariable("LC_ALL=C.UTF-8");
    EXPECT_EQ(print(),
              "2.5 h played in 2 sessions · 1 fault, 0.40 an hour · 1 vanished\n"
              "DAY           PLAYED\n"
              "Sun 8          1.0 h  ████████████████████\n"
              "Mon 9          1.5 h  ██████████████████████████████\n"
              "APPLICATION          PLAYED  SHARE  VOLUME  FAULTS  /HOUR\n"
              "org.example.player    2.0 h   80 %    25 %       1   0.50  █████████████████████\n"
              "org.example.game     30 min   20 %   100 %       0   0.00  █████▎\n");
    tool.setVariable("LC_ALL=C");
    EXPECT_THAT(print({"--by", "application"}), HasSubstr("0.50  #####################\n"));
}

TEST_F(ReportCommand, DividesDaysByTheReadersClock)
{
    store.add({.began = sunday + 82'800, .seconds = 7200});
    tool.setVariable("TZ=Asia/Tokyo"); // where it is 08:00 of Monday
    EXPECT_EQ(print({"--csv"}),
              "day,seconds,sessions,faults,mean_volume\n"
              "2026-11-08,0.0,0,0,\n"
              "2026-11-09,7200.0,1,0,0.5\n");
    EXPECT_EQ(print({"--csv", "--utc"}),
              "day,seconds,sessions,faults,mean_volume\n"
              "2026-11-08,3600.0,1,0,0.5\n"
              "2026-11-09,3600.0,1,0,0.5\n");
    EXPECT_EQ(print({"--csv", "--day-starts", "09:00"}),
              "day,seconds,sessions,faults,mean_volume\n"
              "2026-11-07,0.0,0,0,\n"
              "2026-11-08,3600.0,1,0,0.5\n"
              "2026-11-09,3600.0,1,0,0.5\n");
}

TEST_F(ReportCommand, PrintsEachTableAsCsv)
{
    store.addSession(1, "org.example.player", sunday);
    store.add({.session = 1, .began = sunday, .seconds = 90.5, .device = "dock,headset", .volume = 0});
    store.addFault(1, sunday + 1, "{}");
    EXPECT_EQ(print({"--csv", "--by", "application"}),
              "application,seconds,sessions,faults,mean_volume\norg.example.player,90.5,1,1,\n");
    EXPECT_EQ(print({"--csv", "--by", "device"}),
              "device,seconds,sessions,faults,mean_volume\n\"dock,headset\",90.5,1,1,\n");
    EXPECT_EQ(print({"--csv", "--by", "format"}),
              "format,seconds,sessions,faults,mean_volume\nS16LE/48000/2,90.5,1,1,\n");
    EXPECT_EQ(print({"--csv", "--by", "fault"}), "fault,faults,sessions\nIssueDetector,1,1\n");
    EXPECT_THAT(print({"--csv", "--by", "volume"}), StartsWith("volume,seconds\nmuted,90.5\n0.0625,0.0\n"));
}

TEST_F(ReportCommand, FiltersApplicationsAndDevicesAndDirections)
{
    store.addSession(1, "org.one", sunday);
    store.addSession(2, "org.two", sunday);
    store.add({.session = 1, .began = sunday, .seconds = 10, .device = "headset"});
    store.add({.session = 2, .began = sunday, .seconds = 20, .device = "speaker"});
    store.add({.session = 2, .began = sunday, .seconds = 40, .device = "microphone", .isRecording = true});
    EXPECT_THAT(print({"--json", "--application", "*.one"}), HasSubstr(R"("seconds":10,"muted)"));
    EXPECT_THAT(print({"--json", "--device", "speak*"}), HasSubstr(R"("seconds":20,"muted)"));
    EXPECT_THAT(print({"--json", "--recording"}),
                AllOf(HasSubstr(R"("seconds":40,"muted)"), HasSubstr(R"("recording":true)")));
    EXPECT_THAT(print({"--recording"}), StartsWith("40 s recorded in 1 session"));
}

TEST_F(ReportCommand, CoversThisDayAndTheSixBeforeIt)
{
    store.add({.began = secondsNow() - 60, .seconds = 30});
    store.add({.began = secondsNow() - 8 * 86'400, .seconds = 30});
    const std::string csv = tool.print({"report", "--csv"});
    EXPECT_EQ(std::ranges::count(csv, '\n'), 8);
    EXPECT_THAT(tool.print({"report"}), StartsWith("30 s played in 1 session"));
    EXPECT_THAT(tool.print({"report", "--since", "30d"}), StartsWith("1 min played in 1 session"));
}

TEST_F(ReportCommand, SaysWhatToDoWhereNothingWasPlayed)
{
    EXPECT_THAT(print(),
                AllOf(StartsWith("Nothing that matches was played between 2026-11-08 00:00 and 2026-11-10 00:00."),
                      HasSubstr("--since 30d")));
    EXPECT_EQ(print({"--csv", "--by", "device"}), "device,seconds,sessions,faults,mean_volume\n");
}

TEST_F(ReportCommand, RefusesWhatItCannotUnderstand)
{
    const auto expectUsage = [this](const Tool::Arguments& arguments, const std::string& reason) {
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 2) << reason;
        EXPECT_EQ(finished.output, "");
        EXPECT_THAT(finished.errors, HasSubstr(reason));
    };
    for (const char* const time : {"24:00", "4", "4:", "04:60", "04:00x", "-1:00", ""})
        expectUsage({"report", "--day-starts", time}, "is not a time of day: write HH:MM, such as 04:00");
    expectUsage({"report", "--since", ""}, "\"\" is not a time");
    expectUsage({"report", "--until", ""}, "\"\" is not a time");
    expectUsage({"report", "--until", "1950-01-01"}, "--until: the report would end before it begins");
    expectUsage({"report", "--since", "1950-01-01", "--until", "1960-01-01"}, "the report would end before it begins");
    expectUsage({"report", "--since", "soon"}, "\"soon\" is not a time");
    expectUsage({"report", "--until", "soon"}, "\"soon\" is not a time");
    expectUsage({"report", "--since", "1h", "--until", "2h"}, "the report would end before it begins");
    expectUsage({"report", "--since", "9999-01-01"}, "the report would end before it begins");
    expectUsage({"report", "--by", "moon"}, "moon");
    expectUsage({"report", "--csv", "--json"}, "excludes");
}

TEST_F(ReportCommand, HasNoDayToCome)
{
    const std::string csv = tool.print({"report", "--csv", "--until", "2100-01-01"});
    EXPECT_EQ(std::ranges::count(csv, '\n'), 8) << csv;
}

TEST_F(ReportCommand, WritesAsciiWhereTheLocaleDoes)
{
    store.addSession(1, "K\u00fcche", sunday);
    store.add({.session = 1, .began = sunday, .seconds = 7200});
    tool.setVariable("LC_ALL=C");
    EXPECT_THAT(print({"--by", "application"}), HasSubstr("\nK?che "));
}

TEST_F(ReportCommand, SurvivesSpansThatNoCalendarHas)
{
    store.add({.began = -1e300, .seconds = 1e300});
    store.add({.began = 1e300, .seconds = 1});
    store.add({.began = sunday, .seconds = 1e18});
    EXPECT_THAT(tool.print({"report", "--json", "--since", "1e300d", "--until", "2026-11-08T00:00:10"}),
                HasSubstr(R"("from":0,"until":1794096010)"));
    EXPECT_THAT(print(), StartsWith("48.0 h played in 1 session"));
}

TEST_F(ReportCommand, FailsWhereThereIsNoStore)
{
    const Finished finished = tool.run({"report", "--database", "/nonexistent/store"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, StartsWith("kesto: the event store /nonexistent/store does not exist"));
}

// --- Beside a real service

TEST(ReportOfAService, CountsWhatRunsUpToNowAndWhatWasKilledUpToItsLastWord)
{
    Kestod kestod;
    kestod.start();
    const support::TemporaryDirectory directory;
    Tool tool(directory.path());
    const auto print = [&](Tool::Arguments further) {
        further.insert(further.begin(), {"report", "--database"});
        further.insert(further.begin() + 2, kestod.directory() / "state/analytics.sqlite3");
        return tool.print(further);
    };
    tool.setVariable("LC_ALL=C");
    WireClient client(kestod.socketPath());
    constexpr int session = 1;
    client.ask(WireMethod::Create, session);
    client.ask(WireMethod::SetConfiguration, Dictionary{{"HostApplicationDisplayID", "tone-player"}}, session);
    client.call(WireMethod::Start, session);
    const auto send = [&](int category, int type, const Dictionary& message) {
        client.ask(WireMethod::SendMessage, message, category, type, Array{session});
    };
    send(support::playback, support::typeStart,
         {{"session_output_running", true}, {"active_devices", "null-sink"}, {"PomoSessionVolume", 0.5}});
    send(support::errorCategory, support::typeIssueDetector, {{"issue", "late_cycles"}, {"late_cycles", 3}});
    EXPECT_THAT(print({}),
                MatchesRegex("[0-9]+ s played in 1 session; 1 fault; 1 still running\n"
                             "DAY           PLAYED\n(.|\n)*"
                             "APPLICATION   PLAYED  SHARE  VOLUME  FAULTS  /HOUR\n"
                             "tone-player .* s  100 %    50 %       1         #+\n"));
    EXPECT_THAT(print({"--csv", "--by", "device"}), MatchesRegex("device,.*\nnull-sink,[0-9]+\\.[0-9]+,1,1,0.5\n"));
    kestod.kill();
    const std::string first = print({"--json"});
    EXPECT_THAT(first,
                AllOf(HasSubstr(R"("vanished":0,"sessions_with_faults":1,)"),
                      HasSubstr(R"("running":0,"overlapping":false)"), HasSubstr(R"("application":"tone-player")")));
    const auto secondsIn = [](const std::string& json) { return json.substr(json.rfind("\"seconds\"")); };
    EXPECT_EQ(secondsIn(print({"--json"})), secondsIn(first)) << "it does not grow any more";
}

} // namespace
} // namespace kesto_tool
