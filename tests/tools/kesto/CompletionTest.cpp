// SPDX-License-Identifier: Apache-2.0
// The completions that bash offers.
#include "tools/kesto/Tool.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sstream>

namespace kesto_tool {
namespace {

using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::UnorderedElementsAre;

class Completion : public testing::Test {
protected:
    // The last of these words is being written.
    [[nodiscard]] std::vector<std::string> completions(const std::string& words) const
    {
        const Finished finished = tool.runShell("cd " + directory.path().native()
                                                + " && PATH=${kesto%/*}:$PATH bash -c '"
                                                  "source " KESTO_COMPLETION "; COMP_WORDS=(kesto "
                                                + words + R"(); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); _kesto
                                                  ((${#COMPREPLY[@]} == 0)) || printf "%s\n" "${COMPREPLY[@]}"')");
        EXPECT_EQ(finished.status, 0) << finished.errors;
        EXPECT_EQ(finished.errors, "");
        std::istringstream lines(finished.output);
        std::vector<std::string> all;
        for (std::string line; std::getline(lines, line);)
            all.push_back(line);
        return all;
    }

    const support::TemporaryDirectory directory;
    const Tool tool{directory.path()};
};

TEST_F(Completion, NamesVerbsAndTheirOptions)
{
    EXPECT_THAT(completions("e"), ElementsAre("events"));
    EXPECT_THAT(completions("\"\""), Contains("summary"));
    EXPECT_THAT(completions("events --co"), ElementsAre("--count"));
    EXPECT_THAT(completions("client --w"), ElementsAre("--wait"));
    EXPECT_THAT(completions("events --count \"\""), IsEmpty());
    EXPECT_THAT(completions("events --since 1"), UnorderedElementsAre("10m", "1h"));
    EXPECT_THAT(completions("top --sort d"), ElementsAre("device"));
    EXPECT_THAT(completions("sessions --sort p"), ElementsAre("played"));
    EXPECT_THAT(completions("top --delay \"\""), IsEmpty());
    EXPECT_THAT(completions("notify com"), ElementsAre("com.quarn.halden.ringerstate"));
    EXPECT_THAT(completions("report --by d"), UnorderedElementsAre("day", "device"));
    EXPECT_THAT(completions("unknown \"\""), IsEmpty());
}

TEST_F(Completion, NamesEveryOptionThatTheToolHas)
{
    for (const std::string verb :
         {"bugs", "channels", "client", "events", "report", "sessions", "status", "summary", "notify", "top", "trace",
          "trace record", "prefs get", "prefs set", "prefs unset", "prefs list"}) {
        std::istringstream help(tool.runShell("$kesto " + verb + " --help").output);
        const auto offered = completions(verb + " --");
        for (std::string word; help >> word;)
            if (word.starts_with("--")) {
                EXPECT_THAT(offered, Contains(word)) << verb;
            }
    }
}

TEST_F(Completion, NamesFiles)
{
    support::writeFile(directory.path() / "summary.json", "");
    EXPECT_THAT(completions("summary sum"), ElementsAre("summary.json"));
    EXPECT_THAT(completions("trace sum"), ElementsAre("summary.json"));
    EXPECT_THAT(completions("trace rec"), ElementsAre("record"));
    EXPECT_THAT(completions("trace record --params sum"), ElementsAre("summary.json"));
    EXPECT_THAT(completions("events --database s"), UnorderedElementsAre("summary.json", "state"));
    EXPECT_THAT(completions("notify --directory s"), ElementsAre("state"));
}

TEST_F(Completion, NamesDomainsAndKeys)
{
    EXPECT_THAT(completions("prefs \"\""), UnorderedElementsAre("get", "set", "unset", "list", "--help"));
    EXPECT_EQ(tool.print({"prefs", "set", "com.quarn.kesto", "device_name", "a = b"}), "");
    EXPECT_THAT(completions("prefs get com"), ElementsAre("com.quarn.kesto"));
    EXPECT_THAT(completions("prefs unset com.quarn.kesto d"), ElementsAre("device_name"));
    EXPECT_THAT(completions("prefs set com.quarn.kesto device_name t"), ElementsAre("true"));
    EXPECT_THAT(completions("prefs list com.quarn.kesto d"), IsEmpty());
}

} // namespace
} // namespace kesto_tool
