// SPDX-License-Identifier: Apache-2.0
// Summary files as timelines.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using foundation::Array;
using foundation::Dictionary;
using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

class SummaryCommand : public testing::Test {
protected:
    std::string write(const std::string& text, const std::string& name = "summary.json") const
    {
        support::writeFile(directory.path() / name, text);
        return directory.path() / name;
    }
    void expectFailure(const std::string& text, const std::string& reason) const
    {
        const std::string path = write(text);
        const Finished finished = tool.run({"summary", path});
        EXPECT_EQ(finished.status, 1) << text;
        EXPECT_EQ(finished.errors, "kesto: " + path + " is not a summary of a session: " + reason + "\n");
    }

    const support::TemporaryDirectory directory;
    Tool tool{directory.path()};
};

constexpr std::string_view session = R"([
    {"Setup_Setup_1": {"device_name": "Radio", "audiotag": "SetupSetup", "kestoreporting_timestamp": 1767225600.5}},
    {"Playback_Start_1": {"session_output_running": true, "PomoSessionVolume": 1, "kestoreporting_timestamp": 1767225601}},
    {"Volume_State_1": {"PomoSessionVolume": 0.5, "kestoreporting_timestamp": 1767225603.105}},
    {"Volume_State_2": {"PomoSessionVolume": 0.25, "kestoreporting_timestamp": 1767225603.2, "systemuptime_sec": 9}},
    {"Playback_Stop_1": {"session_output_running": false, "kestoreporting_timestamp": 1767225607.105}},
    {"Error_IssueDetector_1": {"issue": "late_cycles"}},
    {"Playback_Start_2": {"session_output_running": true, "kestoreporting_timestamp": 1767229300}},
    {"Playback_Deactivate_1": {"session_duration": 3710, "kestoreporting_timestamp": 1767229310}},
    {"Volume_Summary_1": {"session_selected_format": "S16LE/44100/2", "active_devices": "sink", "PomoSessionVolume": 1,
                          "play_seconds": 2.105, "msgidx": 1, "msgcnt": 2}},
    {"Volume_Summary_2": {"play_seconds": 4}}
])";

TEST_F(SummaryCommand, IsATimelineOfWhatChanged)
{
    const std::string path = write(std::string(session));
    EXPECT_EQ(tool.print({"summary", path}), path + R"(
        TIME     MESSAGE                    WHAT CHANGED
    0:00.000     Setup Setup                device_name=Radio
    0:00.500  ▶  Playback Start             session_output_running=true PomoSessionVolume=1
    0:02.605  │  Volume State               PomoSessionVolume=0.5
    0:02.700  │  Volume State               PomoSessionVolume=0.5→0.25
    0:06.605  ■  Playback Stop              session_output_running=false
                 Error IssueDetector        issue=late_cycles
 1:01:39.500  ▶  Playback Start             -PomoSessionVolume
 1:01:49.500  ■  Playback Deactivate        session_duration=3710

10 messages in 1:01:49.500 from 2026-01-01 00:00:00
played       0:00.500 to 0:06.605     6.105 s
played    1:01:39.500 to 1:01:49.500  10.000 s
played                   in all       16.105 s
volume event 1 of 2: 2.105 s at volume 1, format S16LE/44100/2, device sink
volume event ? of ?: 4 s at volume ?, format ?, device ?
)");
}

TEST_F(SummaryCommand, IsCutToTheWidthOfTheTerminal)
{
    const std::string path = write(std::string(session));
    tool.setVariable("COLUMNS=60");
    const std::string shown = tool.print({"summary", path});
    EXPECT_THAT(shown, HasSubstr(" Playback Start             session_outp"));
    EXPECT_THAT(shown, Not(HasSubstr("session_output_running=true")));
    EXPECT_THAT(shown, HasSubstr("…\n"));
}

TEST_F(SummaryCommand, ShowsSeveralFilesAndGoesOnBehindAWrongOne)
{
    const std::string first = write(R"([{"A_B_1": {"a": 1}}])", "first");
    const std::string last = write(R"([{"A_B_1": {"b": 2}}])", "last");
    const Finished finished = tool.run({"summary", first, directory.path() / "missing", last});
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors,
              "kesto: cannot read " + (directory.path() / "missing").native() + ": No such file or directory\n");
    EXPECT_THAT(finished.output, StartsWith(first + "\n"));
    EXPECT_THAT(finished.output, HasSubstr(" a=1\n\n1 message\n"));
    EXPECT_THAT(finished.output, HasSubstr(last + "\n"));
    EXPECT_THAT(finished.output, EndsWith(" b=2\n\n1 message\n"));
}

TEST_F(SummaryCommand, ShowsValuesOfAnyKindAndKeepsControlCharactersFromTheTerminal)
{
    const std::string path = write(
        "[{\"A_B_1\": {\"q\": \"say \\\"ä\\\"\\n\\u001b[2J\", \"l\": [1, {\"x\": null}], \"n\": null, \"t\": true,"
        " \"kestoreporting_timestamp\": [1]}}, {\"A\\u001b_B_1\": {}}]");
    const std::string shown = tool.print({"summary", path});
    EXPECT_THAT(shown,
                HasSubstr(R"( q=say "ä"??[2J l=[1,{"x":null}] n=(null) t=true)"
                          "\n"));
    EXPECT_THAT(shown, HasSubstr(" A? B "));
    EXPECT_THAT(shown, Not(HasSubstr("\x1B")));
}

TEST_F(SummaryCommand, ShowsTimesThatFallOrMakeNoSense)
{
    const std::string path = write(R"([{"A_B_1": {"kestoreporting_timestamp": 10}},
        {"A_B_2": {"kestoreporting_timestamp": 8.5}}, {"A_B_3": {"kestoreporting_timestamp": 1e300}},
        {"A_B_4": {"kestoreporting_timestamp": 10.0001}}])");
    const std::string shown = tool.print({"summary", path});
    EXPECT_THAT(shown, HasSubstr("\n   -0:01.500 "));
    EXPECT_THAT(shown, HasSubstr("\n    1e+300 s "));
    EXPECT_THAT(shown, HasSubstr("(the same again)"));
}

TEST_F(SummaryCommand, ShowsASessionWithoutMessages)
{
    const std::string path = write("[]");
    EXPECT_THAT(tool.print({"summary", path}), EndsWith("\n\n0 messages\n"));
}

TEST_F(SummaryCommand, ReadsFromAPipe)
{
    const std::string path = write(R"([{"A_B_1": {"a": 1}}])");
    const Finished finished = tool.runShell("cat " + path + " | $kesto summary /dev/stdin");
    EXPECT_EQ(finished.status, 0);
    EXPECT_THAT(finished.output, HasSubstr(" a=1\n"));
}

TEST_F(SummaryCommand, SaysThatAFileIsNotASummary)
{
    expectFailure("", "it is empty, as when a value could not be written as JSON");
    expectFailure("{}", "it is not a list");
    expectFailure("5", "it is not a list");
    expectFailure("hello", "not JSON: Invalid value. (at byte 1)");
    for (const char* text : {"[1]", "[[]]", "[{}]", R"([{"A_B_1": 1}])", R"([{"A_B_1": {}, "A_B_2": {}}])",
                             R"([{"name": {}}])", R"([{"A_B_x": {}}])", R"([{"A_1": {}}])", "[null]"})
        expectFailure(text, "its element 1 is not a message under its identifier");
    expectFailure(std::string(1'000'000, '['), "it is nested too deep");
    expectFailure(std::string("[\0]", 3), "not JSON: Invalid value. (at byte 2)");
}

TEST_F(SummaryCommand, ShowsASummaryUpToWhereItIsBroken)
{
    const std::string path = write(R"([{"A_B_1": {"a": 1}}, {"A_B_2": )");
    const Finished finished = tool.run({"summary", path});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.output, HasSubstr(" a=1\n"));
    EXPECT_THAT(finished.output, Not(HasSubstr("message\n")));
    EXPECT_THAT(finished.errors, HasSubstr("not JSON"));
    write(R"([{"A_B_1": {}}, {"A_B_2": {}}, 3])");
    EXPECT_THAT(tool.run({"summary", path}).errors, HasSubstr("its element 3 is not a message"));
}

TEST_F(SummaryCommand, SaysThatItCannotReadAFile)
{
    const auto reason = [this](const std::string& path) { return tool.run({"summary", path}).errors; };
    EXPECT_EQ(reason(directory.path()), "kesto: cannot read " + directory.path().native() + ": Is a directory\n");
    const std::string path = write("[]");
    fs::permissions(path, fs::perms(0000));
    tool.giveUpRights();
    EXPECT_EQ(reason(path), "kesto: cannot read " + path + ": Permission denied\n");
}

TEST(SummaryRoad, TheFileOfARealSessionIsReadBack)
{
    end_to_end::Kestod kestod(end_to_end::Kestod::Files{{"device.toml", "InternalBuild = true\n"}});
    kestod.start();
    const Tool tool(kestod.directory());
    end_to_end::WireClient client(kestod.socketPath());
    client.ask(end_to_end::Create, 1);
    client.ask(end_to_end::SetConfiguration, Dictionary{{"HostApplicationDisplayID", "../a\nb"}}, 1);
    client.call(end_to_end::Start, 1);
    const auto send = [&client](const Dictionary& message, int type) {
        client.ask(end_to_end::SendMessage, message, 4, type, Array{1});
    };
    send({{"session_output_running", true}, {"PomoSessionVolume", 0.5}, {"kestoreporting_timestamp", 10.0}}, 1);
    send({{"session_output_running", false}, {"kestoreporting_timestamp", 20.6}}, 2);
    client.call(end_to_end::Stop, 1);
    client.nextReply();
    client.nextReply();
    const fs::path file = fs::directory_iterator(kestod.directory() / "logs/Audio/Reporting")->path();
    const std::string shown = tool.print({"summary", file});
    EXPECT_THAT(shown, HasSubstr("-kesto-.._a?b-generic.json\n"));
    EXPECT_THAT(shown, HasSubstr("    0:00.000  ▶  Playback Start             session_output_running=true"));
    EXPECT_THAT(shown, HasSubstr("    0:10.600  ■  Playback Stop              session_output_running=false\n"));
    EXPECT_THAT(shown, HasSubstr("\n3 messages in 0:10.600 from 1970-01-01 00:00:10\n"));
    EXPECT_THAT(shown, HasSubstr("played       0:00.000 to 0:10.600     10.600 s\n"));
    EXPECT_THAT(shown, HasSubstr("volume event 1 of 1: 10.6 s at volume 0.5, format unknown, device unknown\n"));
}

} // namespace
} // namespace kesto_tool
