// SPDX-License-Identifier: Apache-2.0
// `kesto bugs`: the service's captures as a table, as JSON, and one with all details.
#include "end_to_end/Kestod.h"
#include "platform/linux/bugs/BugCaptureFolder.h"
#include "support/ParseJson.h"
#include "tools/kesto/Tool.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using platform::BugCaptureFolder;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class BugsCommand : public testing::Test {
protected:
    // A capture as the service writes it, at 08:00:00 on 2027-01-15.
    void capture(const std::string& process, const std::string& log = "a line\n", std::size_t mostWithBulk = 10)
    {
        BugCaptureFolder folder(state, BugCaptureFolder::Limits{.mostWithBulk = mostWithBulk});
        const std::string signature = R"({"domain": "Sonalis", "type": "haptics", "subType": "DSP_Playback",)"
                                      R"( "subtypeContext": "Gimbo", "detectedProcess": ")"
            + process + "\"}";
        ASSERT_FALSE(folder.add(
            *folder.nextName(1'800'000'000), {{"signature.json", signature}, {"response.json", R"({"success": true})"}},
            {{"log.txt", log},
             {"processes.json", R"({"found": 1, "processes": [{"pid": 7, "status": ["State:\tR", "Threads: 2"]}]})"},
             {"sound.json", R"({"card0/id": ["PCH"]})"}}));
    }
    void expectFailure(const Tool::Arguments& arguments, const std::string& reason) const
    {
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 1);
        EXPECT_EQ(finished.output, "");
        EXPECT_EQ(finished.errors, "kesto: " + reason + "\n");
    }

    const support::TemporaryDirectory directory;
    const fs::path state = directory.path() / "state";
    const fs::path captures = state / "bug-captures";
    Tool tool{directory.path()};
};

TEST_F(BugsCommand, SaysThatItFoundNone)
{
    EXPECT_EQ(tool.print({"bugs"}), "No bugs were captured in " + captures.native() + ".\n");
    EXPECT_EQ(tool.print({"bugs", "--json"}), "");
}

TEST_F(BugsCommand, ListsThemTheOldestFirst)
{
    capture("player");
    capture("a-much-longer-name");
    EXPECT_EQ(tool.print({"bugs"}),
              "NUMBER TIME                     STATE PROCESS          BUG\n"
              "     1 2027-01-15 08:00:00      1 KiB player           haptics DSP_Playback Gimbo\n"
              "     2 2027-01-15 08:00:00      1 KiB a-much-longer-n… haptics DSP_Playback Gimbo\n");
}

TEST_F(BugsCommand, ShowsWhoseStateHadToGo)
{
    capture("player", "", 1);
    capture("player", "", 1);
    EXPECT_THAT(tool.print({"bugs"}), HasSubstr("     1 2027-01-15 08:00:00          - player"));
    EXPECT_THAT(tool.print({"bugs", "1"}),
                AllOf(HasSubstr("detectedProcess: player\n"),
                      HasSubstr("The state of the device was removed to make room for newer captures.\n")));
}

TEST_F(BugsCommand, CutsTheTableToTheWidth)
{
    capture("player");
    tool.setVariable("COLUMNS=70");
    EXPECT_THAT(tool.print({"bugs"}), HasSubstr(" player           haptics DSP_Pl…\n"));
}

TEST_F(BugsCommand, ShowsOneWithAllThatIsKnown)
{
    capture("player", "first line\nsecond line\n");
    EXPECT_EQ(tool.print({"bugs", "1"}),
              "bug 1 of 2027-01-15 08:00:00\n" + (captures / "00000001-20270115T080000Z").native()
                  + "\n\n"
                    "signature:\n"
                    "  domain: Sonalis\n"
                    "  type: haptics\n"
                    "  subType: DSP_Playback\n"
                    "  subtypeContext: Gimbo\n"
                    "  detectedProcess: player\n"
                    "response:\n"
                    "  success: true\n"
                    "log:\n"
                    "  first line\n"
                    "  second line\n"
                    "processes:\n"
                    "  found: 1\n"
                    "  processes:\n"
                    "    pid: 7\n"
                    "    status:\n"
                    "      State: R\n"
                    "      Threads: 2\n"
                    "sound:\n"
                    "  card0/id:\n"
                    "    PCH\n");
}

TEST_F(BugsCommand, PrintsJsonForPrograms)
{
    capture("player");
    capture("recorder", "one\ntwo\n");
    const std::string lines = tool.print({"bugs", "--json"});
    EXPECT_EQ(std::ranges::count(lines, '\n'), 2);
    const auto first = support::parseJson(lines.substr(0, lines.find('\n')));
    ASSERT_TRUE(first);
    EXPECT_EQ(*first->dictionary()->find("number"), Value(1));
    EXPECT_EQ(*first->dictionary()->find("time"), Value(1'800'000'000));
    EXPECT_EQ(*first->dictionary()->find("response"), Value(Dictionary{{"success", true}}));
    EXPECT_EQ(*first->dictionary()->find("signature")->dictionary()->find("detectedProcess"), Value("player"));

    const auto second = support::parseJson(tool.print({"bugs", "2", "--json"}));
    ASSERT_TRUE(second);
    const Dictionary shown = *second->dictionary()->find("state")->dictionary();
    EXPECT_EQ(*shown.find("log"), Value(Array{"one", "two"}));
    EXPECT_EQ(*shown.find("sound"), Value(Dictionary{{"card0/id", Array{"PCH"}}}));
}

TEST_F(BugsCommand, NothingInACaptureSteersTheTerminal)
{
    capture("\\u001b[2J", "a \x1b[2J line\n");
    EXPECT_THAT(tool.print({"bugs"}), AllOf(HasSubstr("?[2J"), Not(HasSubstr("\x1b"))));
    EXPECT_THAT(tool.print({"bugs", "1"}), AllOf(HasSubstr("a ?[2J line"), Not(HasSubstr("\x1b"))));
}

TEST_F(BugsCommand, FollowsNoLinksAndStumblesOverNothingThatIsBroken)
{
    capture("player");
    support::writeFile(directory.path() / "secret", "secret");
    const fs::path first = captures / "00000001-20270115T080000Z";
    fs::create_symlink(directory.path() / "secret", first / "state/link.txt");
    fs::create_directory_symlink(first, captures / "00000002-20270115T080000Z");
    fs::create_directories(captures / ".new/state");
    fs::create_directory(captures / "notes of a person");
    support::writeFile(first / "state/sound.json", "{\"half");
    support::writeFile(first / "response.json", "");
    const std::string shown = tool.print({"bugs", "1"});
    EXPECT_THAT(shown, AllOf(Not(HasSubstr("secret")), HasSubstr("\nsound: (null)\n")));
    EXPECT_EQ(std::ranges::count(tool.print({"bugs"}), '\n'), 2);
}

TEST_F(BugsCommand, ReadsTheDirectoryThatIsNamed)
{
    capture("player");
    fs::rename(captures, directory.path() / "elsewhere");
    EXPECT_THAT(tool.print({"bugs", "--directory", directory.path() / "elsewhere"}), HasSubstr("player"));
}

TEST_F(BugsCommand, ShowsWhatARealServiceCaptured)
{
    end_to_end::Kestod kestod({{"device.toml", "InternalBuild = true"}}, {{"KESTO_LOG", "default,kerb=info"}});
    kestod.startAndAwait();
    Tool beside{kestod.directory()};
    const std::string report = R"(["send", {"Haptic_Active_Hardware_Time_Seconds": )";
    static_cast<void>(beside.print({"client", "--socket", kestod.socketPath()},
                                   "[\"create\", 42]\n[\"setServiceType\", \"haptics\", 42]\n" + report
                                       + "1}, \"DSP_Playback\", \"Gimbo\", [42]]\n" + report
                                       + "2}, \"DSP_Playback\", \"Gimbo\", [42]]\n"));
    ASSERT_TRUE(kestod.waitForLog("Response from ulmetReporter"));
    EXPECT_THAT(beside.print({"bugs"}), HasSubstr(" KiB kesto            haptics DSP_Playback Gimbo\n"));
    EXPECT_THAT(beside.print({"bugs", "1"}),
                AllOf(HasSubstr("  success: true\n"), HasSubstr("Incrementing Vorp counter. kesto\n"),
                      HasSubstr("    reporterID: 42\n"), HasSubstr("    service: haptics\n")));
}

TEST_F(BugsCommand, SaysWhatIsNotThere)
{
    capture("player");
    expectFailure({"bugs", "7"}, "bug 7 does not exist in " + captures.native());
    const std::string missing = directory.path() / "missing/bug-captures";
    expectFailure({"bugs", "--directory", missing}, "cannot read " + missing + ": No such file or directory");
    EXPECT_EQ(tool.run({"bugs", "seven"}).status, 2);
}

TEST_F(BugsCommand, SaysThatItMayNotRead)
{
    capture("player");
    fs::permissions(captures, fs::perms::none);
    tool.giveUpRights();
    expectFailure({"bugs"}, "cannot read " + captures.native() + ": Permission denied");
    fs::permissions(captures, fs::perms::owner_all);
}

} // namespace
} // namespace kesto_tool
