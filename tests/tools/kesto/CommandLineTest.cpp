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
    for (const char* verb : {"client", "events", "notify", "prefs", "summary", "trace"}) {
        EXPECT_THAT(help, HasSubstr(verb));
        EXPECT_THAT(tool.print({verb, "--help"}), HasSubstr("Usage: kesto"));
    }
    for (const char* verb : {"get", "set", "unset", "list"})
        EXPECT_THAT(tool.print({"prefs", verb, "--help"}), HasSubstr("DOMAIN"));
}

struct WrongLine {
    std::string name;
    Tool::Arguments arguments;
    std::string reason;
};

void PrintTo(const WrongLine& line, std::ostream* out)
{
    *out << line.name;
}

class WrongCommandLine : public CommandLine, public testing::WithParamInterface<WrongLine> { };

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
        WrongLine{"NoVerb", {}, "subcommand is required"}, WrongLine{"AnUnknownVerb", {"play"}, "play"},
        WrongLine{"AnUnknownOption", {"events", "--loud"}, "--loud"},
        WrongLine{"AnOptionWithoutItsValue", {"events", "--name"}, "--name"},
        WrongLine{"ATimeThatIsMalformed", {"events", "--since", "soon"}, "\"soon\" is not a time"},
        WrongLine{"ANegativeCount", {"events", "--count", "-1"}, "--count"},
        WrongLine{"ACountThatIsNotANumber", {"events", "--count", "few"}, "few"},
        WrongLine{"ANegativeWait", {"client", "--wait", "-1"}, "--wait"},
        WrongLine{"PrefsWithoutAVerb", {"prefs"}, "subcommand is required"},
        WrongLine{"PrefsWithAnUnknownVerb", {"prefs", "toggle", "a", "b"}, "toggle"},
        WrongLine{"GettingWithoutAKey", {"prefs", "get", "com.quarn.kesto"}, "KEY"},
        WrongLine{"SettingWithoutAValue", {"prefs", "set", "com.quarn.kesto", "key"}, "VALUE"},
        WrongLine{"SettingWithTwoValues", {"prefs", "set", "com.quarn.kesto", "key", "a", "b"}, "b"},
        WrongLine{"ADomainThatLeadsElsewhere", {"prefs", "get", "../kesto", "key"}, "\"../kesto\" is not a domain"},
        WrongLine{"ADomainThatIsHidden", {"prefs", "list", ".kesto"}, "\".kesto\" is not a domain"},
        WrongLine{"NotifyingNothing", {"notify"}, "NAME"},
        WrongLine{"ANotificationThatLeadsElsewhere", {"notify", "../name"}, "cannot be the name"},
        WrongLine{"ANotificationThatIsHidden", {"notify", ".name"}, "cannot be the name"},
        WrongLine{"ANotificationThatIsTooLong", {"notify", std::string(256, 'x')}, "cannot be the name"},
        WrongLine{"AStateThatIsNotANumber", {"notify", "name", "on"}, "\"on\" is not a state"},
        WrongLine{"AStateThatIsNegative", {"notify", "name", "-1"}, "\"-1\" is not a state"},
        WrongLine{"AStateThatIsTooLarge", {"notify", "name", "18446744073709551616"}, "is not a state"},
        WrongLine{"AStateThatIsHexadecimal", {"notify", "name", "0x1"}, "is not a state"},
        WrongLine{"AStateThatIsEmpty", {"notify", "name", ""}, "is not a state"},
        WrongLine{"NoSummary", {"summary"}, "FILE"}),
    [](const auto& line) { return line.param.name; });

TEST_F(CommandLine, OutputThatCannotBeWrittenIsAFailure)
{
    support::writeFile(directory.path() / "summary.json", R"([{"A_B_1": {"a": 1}}])");
    const Finished finished =
        tool.runShell("cd " + directory.path().native() + " && $kesto summary summary.json >/dev/full");
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr("could not be written"));
}

} // namespace
} // namespace kesto_tool
