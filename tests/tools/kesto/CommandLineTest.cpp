// SPDX-License-Identifier: Apache-2.0
// The command line itself: help, version, its errors, and output that cannot be written.
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_tool {
namespace {

using testing::HasSubstr;
using testing::MatchesRegex;

class CommandLine : public testing::Test {
protected:
    const support::TemporaryDirectory directory;
    const Tool tool{directory.path()};
};

TEST_F(CommandLine, SaysItsVersion)
{
    EXPECT_THAT(tool.print({"--version"}), MatchesRegex("kesto [0-9]+\\.[0-9]+\\.[0-9]+\n"));
}

TEST_F(CommandLine, HelpNamesEveryVerb)
{
    const std::string help = tool.print({"--help"});
    for (const char* verb : {"client", "events", "notify", "prefs", "sessions", "status", "summary", "top", "trace"}) {
        EXPECT_THAT(help, HasSubstr(verb));
        EXPECT_THAT(tool.print({verb, "--help"}), HasSubstr("Usage: kesto"));
    }
    for (const char* verb : {"get", "set", "unset", "list"})
        EXPECT_THAT(tool.print({"prefs", verb, "--help"}), HasSubstr("DOMAIN"));
}

struct WrongArguments {
    std::string name;
    Tool::Arguments arguments;
    std::string reason;
};

void PrintTo(const WrongArguments& line, std::ostream* out)
{
    *out << line.name;
}

class WrongCommandLine : public CommandLine, public testing::WithParamInterface<WrongArguments> { };

TEST_P(WrongCommandLine, IsReportedAndEndsWithStatus2)
{
    const Finished finished = tool.run(GetParam().arguments);
    EXPECT_EQ(finished.status, 2);
    EXPECT_EQ(finished.output, "");
    EXPECT_THAT(finished.errors, HasSubstr(GetParam().reason));
}

INSTANTIATE_TEST_SUITE_P(
    OfEveryKind, WrongCommandLine,
    testing::Values(
        WrongArguments{"NoVerb", {}, "subcommand is required"}, WrongArguments{"AnUnknownVerb", {"play"}, "play"},
        WrongArguments{"AnUnknownOption", {"events", "--loud"}, "--loud"},
        WrongArguments{"AnOptionWithoutItsValue", {"events", "--name"}, "--name"},
        WrongArguments{"ATimeThatIsMalformed", {"events", "--since", "soon"}, "\"soon\" is not a time"},
        WrongArguments{"ANegativeCount", {"events", "--count", "-1"}, "--count"},
        WrongArguments{"ACountThatIsNotANumber", {"events", "--count", "few"}, "few"},
        WrongArguments{"StatusAsTwoFormats", {"status", "--json", "--prometheus"}, "--prometheus"},
        WrongArguments{"WatchedMetrics", {"status", "--watch", "--prometheus"}, "--prometheus"},
        WrongArguments{"AnIntervalWithoutWatching", {"status", "--interval", "1"}, "--watch"},
        WrongArguments{"ADelayThatIsNoNumber", {"top", "--delay", "nan"}, "\"nan\" is not a number from 0.01 to 86400"},
        WrongArguments{
            "ADelayThatIsTooLong", {"top", "--delay", "86401"}, "\"86401\" is not a number from 0.01 to 86400"},
        WrongArguments{"AnIntervalOfStatusThatIsNoNumber",
                       {"status", "--watch", "--interval", "nan"},
                       "\"nan\" is not a number from 0.01 to 86400"},
        WrongArguments{"AnIntervalOfChannelsThatIsNoNumber",
                       {"channels", "--watch", "--interval", "nan"},
                       "\"nan\" is not a number from 0.01 to 86400"},
        WrongArguments{"AnIntervalThatIsTooShort",
                       {"channels", "--watch", "--interval", "0"},
                       "\"0\" is not a number from 0.01 to 86400"},
        WrongArguments{"AnIntervalWithAUnit",
                       {"status", "--watch", "--interval", "2s"},
                       "\"2s\" is not a number from 0.01 to 86400"},
        WrongArguments{"OneSessionSince", {"sessions", "1", "--since", "soon"}, "excludes"},
        WrongArguments{"OneSessionThatRuns", {"sessions", "1", "--running"}, "excludes"},
        WrongArguments{"OneSessionWithFaults", {"sessions", "1", "--faults"}, "excludes"},
        WrongArguments{"OneSessionSorted", {"sessions", "1", "--sort", "played"}, "excludes"},
        WrongArguments{"OneSessionCounted", {"sessions", "1", "--count", "1"}, "excludes"},
        WrongArguments{"ASessionWithoutANumber", {"sessions", "first"}, "\"first\" is not a number from 1 on"},
        WrongArguments{"ASessionThatNoStoreHas",
                       {"sessions", "99999999999999999999"},
                       "\"99999999999999999999\" is not a number from 1 on"},
        WrongArguments{"ANegativeWait", {"client", "--wait", "-1"}, "--wait"},
        WrongArguments{"PrefsWithoutAVerb", {"prefs"}, "subcommand is required"},
        WrongArguments{"PrefsWithAnUnknownVerb", {"prefs", "toggle", "a", "b"}, "toggle"},
        WrongArguments{"GettingWithoutAKey", {"prefs", "get", "com.quarn.kesto"}, "KEY"},
        WrongArguments{"SettingWithoutAValue", {"prefs", "set", "com.quarn.kesto", "key"}, "VALUE"},
        WrongArguments{"SettingWithTwoValues", {"prefs", "set", "com.quarn.kesto", "key", "a", "b"}, "b"},
        WrongArguments{
            "ADomainThatLeadsElsewhere", {"prefs", "get", "../kesto", "key"}, "\"../kesto\" is not a domain"},
        WrongArguments{"ADomainThatIsHidden", {"prefs", "list", ".kesto"}, "\".kesto\" is not a domain"},
        WrongArguments{"NotifyingNothing", {"notify"}, "NAME"},
        WrongArguments{"ANotificationThatLeadsElsewhere", {"notify", "../name"}, "cannot be the name"},
        WrongArguments{"ANotificationThatIsHidden", {"notify", ".name"}, "cannot be the name"},
        WrongArguments{"ANotificationThatIsTooLong", {"notify", std::string(256, 'x')}, "cannot be the name"},
        WrongArguments{"AStateThatIsNotANumber", {"notify", "name", "on"}, "\"on\" is not a state"},
        WrongArguments{"AStateThatIsNegative", {"notify", "name", "-1"}, "\"-1\" is not a state"},
        WrongArguments{"AStateThatIsTooLarge", {"notify", "name", "18446744073709551616"}, "is not a state"},
        WrongArguments{"AStateThatIsHexadecimal", {"notify", "name", "0x1"}, "is not a state"},
        WrongArguments{"AStateThatIsEmpty", {"notify", "name", ""}, "is not a state"},
        WrongArguments{"NoSummary", {"summary"}, "FILE"}),
    [](const auto& line) { return line.param.name; });

TEST_F(CommandLine, OutputThatCannotBeWrittenIsAFailure)
{
    support::writeFile(directory.path() / "summary.json", R"([{"A_B_1": {"a": 1}}])");
    const Finished finished =
        tool.runShell("cd " + directory.path().native() + " && $kesto summary summary.json >/dev/full");
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr("could not be written"));
}

TEST_F(CommandLine, OutputThatIsClosedIsAFailure)
{
    support::writeFile(directory.path() / "summary.json", R"([{"A_B_1": {"a": 1}}])");
    const std::string command = "cd " + directory.path().native() + " && $kesto summary summary.json <&- >&-";
    const Finished finished = tool.runShell(command);
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr("could not be written"));
    EXPECT_EQ(tool.runShell(command + " 2>&-").status, 1);
}

} // namespace
} // namespace kesto_tool
