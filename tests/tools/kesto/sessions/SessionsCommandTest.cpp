// SPDX-License-Identifier: Apache-2.0
// `kesto sessions` on the store of a real service.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"
#include "tools/kesto/Tool.h"

#include <chrono>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <utility>

namespace kesto_tool {
namespace {

using end_to_end::WireClient;
using foundation::Array;
using foundation::Dictionary;
using support::playback;
using support::typeStart;
using testing::AllOf;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Not;

class SessionsCommand : public testing::Test {
protected:
    SessionsCommand() { tool.setVariable("LC_ALL=C.UTF-8"); }

    // A session that plays for ten seconds, so many seconds ago, louder in the second half. Its number is its place.
    static void play(WireClient& client, const char* application, double ago, bool stops = true)
    {
        static constexpr int number = 1;
        const double began =
            std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count() - ago;
        client.ask(end_to_end::Create, number);
        client.ask(end_to_end::SetServiceType, 7, number);
        client.ask(end_to_end::SetConfiguration, Dictionary{{"HostApplicationDisplayID", application}}, number);
        client.call(end_to_end::Start, number);
        send(client, playback, typeStart,
             {{"session_output_running", true},
              {"session_selected_format", "S16LE/44100/2"},
              {"active_devices", "speaker"},
              {"PomoSessionVolume", 0.25},
              {"kestoreporting_timestamp", began}});
        send(client, support::volume, support::typeState,
             {{"PomoSessionVolume", 0.75}, {"kestoreporting_timestamp", began + 5}});
        if (stops)
            send(client, playback, support::typeStop,
                 {{"session_output_running", false}, {"kestoreporting_timestamp", began + 10}});
    }
    static void send(WireClient& client, int category, int type, const Dictionary& message)
    {
        client.ask(end_to_end::SendMessage, message, category, type, Array{1});
    }
    // The values of a column.
    [[nodiscard]] std::vector<std::string> column(std::size_t number, Tool::Arguments options = {}) const
    {
        options.insert(options.begin(), {"sessions", "--csv"});
        std::istringstream lines(tool.print(options));
        std::vector<std::string> values;
        for (std::string line; std::getline(lines, line);) {
            std::istringstream fields(line);
            std::string field;
            for (std::size_t place = 0; place <= number; ++place)
                std::getline(fields, field, ',');
            values.push_back(std::exchange(field, {}));
        }
        return values;
    }

    end_to_end::Kestod kestod;
    Tool tool{kestod.directory()};
};

TEST_F(SessionsCommand, ListsThemWithTheirEnds)
{
    kestod.startAndAwait();
    WireClient stopping(kestod.socketPath());
    play(stopping, "stopping", 100);
    WireClient vanishing(kestod.socketPath());
    play(vanishing, "vanishing", 90, false);
    vanishing.close();
    EXPECT_TRUE(end_to_end::waitUntil(
        [&] { return !kestod.query("SELECT id FROM stretches WHERE ending = 'vanished'").empty(); }));
    WireClient running(kestod.socketPath());
    play(running, "running", 80, false);
    send(running, 11, 7, {{"late_cycles", 3}});
    EXPECT_THAT(column(0), ElementsAre("session", "3", "2", "1"));
    EXPECT_THAT(column(7), ElementsAre("end", "running", "vanished", "stopped"));
    EXPECT_THAT(column(2, {"--running"}), ElementsAre("application", "running"));
    EXPECT_THAT(column(2, {"--faults"}), ElementsAre("application", "running"));
    EXPECT_THAT(column(6, {"--sort", "faults", "--count", "2"}), ElementsAre("faults", "1", "0"));
    EXPECT_THAT(tool.print({"sessions", "--csv"}), HasSubstr(",stopping,10.0,")) << "by its own stamps";
    EXPECT_THAT(tool.print({"sessions"}),
                MatchesRegex("SESSION BEGAN .*\n"
                             "      3 2.* running .*0:0.* 1 speaker .*running\n"
                             "      2 .* vanished\n"
                             "      1 .* stopping +0:00:10   50 %      0 speaker +stopped\n"));
    EXPECT_THAT(tool.print({"sessions", "1"}),
                AllOf(HasSubstr("session 1, stopping, longformaudio\nby       kesto_tool_test, process "),
                      HasSubstr("\nplaying  ████████"), HasSubstr("\nvolume   ▂▂▂▂▂▂▂")));
    kestod.signal(SIGTERM);
    EXPECT_EQ(kestod.exitStatus(), 0);
    EXPECT_THAT(column(7), ElementsAre("end", "service ended", "vanished", "stopped"));
}

TEST_F(SessionsCommand, AfterAKillEndWithTheServicesLastWord)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 100, false);
    send(client, support::errorCategory, support::typeIssueDetector,
         {{"late_cycles", 3}}); // the last word comes later than the last change
    kestod.kill();
    EXPECT_THAT(column(7), ElementsAre("end", "service ended"));
}

TEST_F(SessionsCommand, ShowsOneForPrograms)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 100);
    EXPECT_THAT(tool.print({"sessions", "1", "--csv"}),
                MatchesRegex("began,seconds,device,format,volume,end\n"
                             "2[-0-9T:.]+Z,5.0,speaker,S16LE/44100/2,0.25,\n"
                             "2[-0-9T:.]+Z,5.0,speaker,S16LE/44100/2,0.75,\n"));
    EXPECT_THAT(tool.print({"sessions", "1", "--json"}),
                MatchesRegex("\\{\"session\":1,.*\"stretches\":\\[\\{.*\\}\\],\"fault_list\":\\[\\]\\}\n"));
}

TEST_F(SessionsCommand, SaysThatThereAreNone)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 8 * 86'400);
    EXPECT_EQ(tool.print({"sessions"}), "No session that matches played since 7d.\n");
    EXPECT_EQ(tool.print({"sessions", "--recording"}), "No session that matches recorded since 7d.\n");
    EXPECT_EQ(tool.print({"sessions", "--json"}), "");
    EXPECT_THAT(column(2, {"--since", "9d"}), ElementsAre("application", "player"));
}

TEST_F(SessionsCommand, OfANumberThatIsNoneIsAnError)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 100);
    const Finished finished = tool.run({"sessions", "7"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.output, "");
    EXPECT_THAT(finished.errors,
                MatchesRegex("kesto: session 7 played and recorded nothing, or is not in .*: kesto sessions --since 90d"
                             " lists .*\n"));
    EXPECT_THAT(tool.run({"sessions", "1", "--recording"}).errors,
                HasSubstr("kesto: session 1 recorded nothing, or is not in "));
}

TEST_F(SessionsCommand, RefusesWhatMakesNoSense)
{
    for (const Tool::Arguments& arguments :
         std::vector<Tool::Arguments>{{"--count", "0"}, {"--count", "-3"}, {"--count", "many"}}) {
        Tool::Arguments command{"sessions"};
        command.insert(command.end(), arguments.begin(), arguments.end());
        const Finished finished = tool.run(command);
        EXPECT_EQ(finished.status, 2);
        EXPECT_THAT(finished.errors, HasSubstr("\"" + arguments[1] + "\" is not a number from 1 on"));
    }
    EXPECT_THAT(tool.run({"sessions", "--since", "soon"}).errors, HasSubstr("\"soon\" is not a time"));
    EXPECT_THAT(tool.run({"sessions", "--sort", "size"}).errors, HasSubstr("size not in"));
    EXPECT_EQ(tool.run({"sessions"}).status, 1) << "there is no store";
}

TEST_F(SessionsCommand, WritesAsciiInALocaleWithoutUTF8)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "Küche", 100);
    EXPECT_THAT(tool.print({"sessions"}), HasSubstr(" Küche "));
    tool.setVariable("LC_ALL=C");
    EXPECT_THAT(tool.print({"sessions"}), HasSubstr(" K?che "));
    EXPECT_THAT(tool.print({"sessions", "1"}), AllOf(HasSubstr("\nplaying  ######"), HasSubstr("\nvolume   222222")));
}

} // namespace
} // namespace kesto_tool
