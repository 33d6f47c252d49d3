// SPDX-License-Identifier: Apache-2.0
// `kesto top` beside a real service: its lines for programs, and its screen on a real terminal, with keys, signals and
// every way out.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "platform/linux/connection/FrameReader.h"
#include "platform/linux/files/FileDescriptor.h"
#include "sdk/FakeService.h"
#include "support/MessageKinds.h"
#include "tools/kesto/Tool.h"

#include <algorithm>
#include <cmath>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <rapidjson/document.h>
#include <string>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>
#include <utility>
#include <vector>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using end_to_end::WireClient;
using foundation::Array;
using foundation::Dictionary;
using sdk_test::FakeService;
using sdk_test::Peer;
using support::errorCategory;
using support::playback;
using support::typeIssueDetector;
using support::typeStart;
using support::typeState;
using support::typeStop;
using support::volume;
using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Not;

constexpr std::string_view shownScreen = "\x1B[?1049h"; // the alternate screen
constexpr std::string_view hiddenScreen = "\x1B[?25h\x1B[?1049l"; // the cursor, and the screen of before

Dictionary statusOf(std::string_view version)
{
    return {{"running", true},     {"version", version},         {"internalBuild", false},
            {"now", Dictionary()}, {"sinceStart", Dictionary()}, {"storing", false}};
}

FakeService::Handler answerWith(std::string_view version)
{
    return [version](Peer& peer, const Array& call) { peer.answer(sdk_test::callNumber(call), {statusOf(version)}); };
}

// The answer as it goes over the wire.
std::string framed(std::string_view version)
{
    std::string item;
    foundation::appendCbor(Array{1, foundation::Value(), statusOf(version)}, item);
    std::string frame;
    platform::appendFrame(item, frame);
    return frame;
}

class TopCommand : public testing::Test {
protected:
    TopCommand()
    {
        tool.setVariable("KESTO_SOCKET=" + kestod.socketPath().native());
        tool.setVariable("TERM=xterm");
        tool.setVariable("LC_ALL=C.UTF-8");
        tool.setVariable("NO_COLOR");
    }

    // The service makes its store with the first event, the end of the connection that sees that it listens.
    void startWithAStore()
    {
        kestod.startAndAwait();
        EXPECT_FALSE(kestod.waitForEvents("*uptime").empty());
    }
    // A session of that application, which plays until the client goes.
    static void play(WireClient& client, const char* application, double since, int session = 1)
    {
        client.ask(end_to_end::Create, session);
        client.ask(end_to_end::SetConfiguration, Dictionary{{"HostApplicationDisplayID", application}}, session);
        client.call(end_to_end::Start, session);
        send(client, playback, typeStart,
             {{"session_output_running", true},
              {"session_selected_format", "S16LE/44100/2"},
              {"active_devices", "speaker"},
              {"PomoSessionVolume", 1},
              {"kestoreporting_timestamp", since}},
             session);
    }
    static void send(WireClient& client, int category, int type, const Dictionary& message, int session = 1)
    {
        client.ask(end_to_end::SendMessage, message, category, type, Array{session});
    }
    [[nodiscard]] rapidjson::Document json(const Tool::Arguments& arguments = {"top", "--json"}) const
    {
        rapidjson::Document document;
        document.Parse(tool.print(arguments).c_str());
        EXPECT_TRUE(document.IsObject());
        return document;
    }
    [[nodiscard]] rapidjson::Document status() const
    {
        rapidjson::Document document;
        document.Parse(tool.print({"status", "--json"}).c_str());
        return document;
    }
    [[nodiscard]] std::uint64_t statusCalls() const { return status()["calls"]["status"].GetUint64(); }
    // The screen, after its first look.
    [[nodiscard]] std::unique_ptr<TerminalProcess> startScreen(const Tool::Arguments& options = {}) const
    {
        Tool::Arguments arguments{"top"};
        arguments.insert(arguments.end(), options.begin(), options.end());
        auto screen = tool.startOnTerminal(arguments);
        EXPECT_TRUE(screen->waitFor(shownScreen)) << screen->output();
        EXPECT_TRUE(screen->waitFor("kestod")) << screen->output();
        EXPECT_FALSE(screen->hasUsualModes());
        return screen;
    }
    // While it shows that text, nobody is asked.
    void expectNoQuestions(TerminalProcess& screen, std::string_view shown) const
    {
        EXPECT_TRUE(screen.waitFor(shown));
        const std::uint64_t before = statusCalls();
        std::uint64_t calls = before;
        for (unsigned short columns = 60; columns < 70; ++columns) {
            screen.resize(columns, 24);
            EXPECT_TRUE(screen.waitFor(shown));
            calls = statusCalls();
        }
        EXPECT_LE(calls - before, 11U) << "the tool itself, and what was asked before";
    }
    // Returns when it asks no more, because nobody reads what it draws.
    void waitUntilTheTerminalIsFull() const
    {
        std::uint64_t calls = statusCalls();
        int unchanged = 0;
        EXPECT_TRUE(end_to_end::waitUntil([&] {
            const std::uint64_t before = std::exchange(calls, statusCalls());
            unchanged = calls == before + 1 ? unchanged + 1 : 0; // its own
            return unchanged == 3;
        }));
    }
    static void expectRestored(const TerminalProcess& screen)
    {
        EXPECT_TRUE(screen.output().ends_with(hiddenScreen)) << screen.output();
        EXPECT_TRUE(screen.hasUsualModes());
    }

    end_to_end::Kestod kestod;
    Tool tool{kestod.directory()};
};

// --- For programs

TEST_F(TopCommand, WithoutATerminalIsOneLookWithoutEscapes)
{
    startWithAStore();
    EXPECT_THAT(tool.print({"top"}),
                MatchesRegex("[-0-9]+ [0-9:]+\n"
                             "kestod [0-9.]+, running since [-0-9]+ [0-9:]+\n"
                             "clients   [12] connections?, with 0 sessions\n"
                             "traffic   [0-9.]+ messages and [0-9.]+ events a second\n"
                             "backlog   0 calls and [0-9] events?\n"
                             "memory    [0-9.]+ [kM]?B of at most [0-9.]+ MB\n"
                             "store     [0-9] events? in [0-9.]+ [kM]?B.*\n"
                             "lost      nothing\n"
                             "\n"
                             "nothing plays or records\n"));
}

TEST_F(TopCommand, InABatchPrintsOneLookAfterTheOtherOverOneConnection)
{
    startWithAStore();
    const std::string looks = tool.print({"top", "--iterations", "3", "--delay", "0.01"});
    EXPECT_THAT(looks, MatchesRegex("2.*\n\n2.*\n\n2.*records\n"));
    EXPECT_THAT(looks, Not(HasSubstr("\x1B")));
    const std::string objects = tool.print({"top", "--json", "--iterations", "2", "--delay", "0.01"});
    EXPECT_EQ(std::ranges::count(objects, '\n'), 2);
    const rapidjson::Document now = status();
    EXPECT_EQ(now["connections"]["accepted"].GetUint64(), 4U) << "one to see that it listens, and one for each run";
    EXPECT_EQ(now["calls"]["status"].GetUint64(), 6U);
}

TEST_F(TopCommand, KnowsWhatPlaysSinceWhenAndWithHowManyFaults)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "org.example.player", 1'577'934'200.5);
    send(client, volume, typeState, {{"PomoSessionVolume", 0.5}, {"kestoreporting_timestamp", 1'577'934'205.5}});
    send(client, errorCategory, typeIssueDetector, {{"late_cycles", 3}});
    send(client, errorCategory, typeIssueDetector, {{"late_cycles", 4}});
    play(client, "org.example.other", 1'577'934'207, 2);
    send(client, playback, typeStop, {{"session_output_running", false}, {"kestoreporting_timestamp", 1'577'934'208}},
         2);
    const auto look = json();
    ASSERT_EQ(look["streams"].Size(), 1U);
    const auto& stream = look["streams"][0];
    EXPECT_STREQ(stream["application"].GetString(), "org.example.player");
    EXPECT_FALSE(stream["recording"].GetBool());
    EXPECT_EQ(stream["since"].GetDouble(), 1'577'934'200.5) << "the volume's change is no pause";
    EXPECT_STREQ(stream["device"].GetString(), "speaker");
    EXPECT_STREQ(stream["format"].GetString(), "S16LE/44100/2");
    EXPECT_EQ(stream["volume"].GetDouble(), 0.5);
    EXPECT_EQ(stream["faults"].GetUint64(), 2U);
    EXPECT_THAT(tool.print({"top"}),
                HasSubstr("\nPLAYS                  SINCE      VOLUME  FAULTS  FORMAT         DEVICE\n"
                          "org.example.player     2020-01-02   50 %       2  S16LE/44100/2  speaker\n"));
}

TEST_F(TopCommand, SeesWhatChangesBetweenTwoLooks)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 1'795'264'500);
    auto looking = tool.start({"top", "--json", "--batch", "--delay", "0.01"});
    EXPECT_THAT(looking->waitForOutput("\"volume\":1,\"faults\":0"), HasSubstr("\"since\":1795264500,"));
    send(client, volume, typeState, {{"PomoSessionVolume", 0.5}, {"kestoreporting_timestamp", 1'795'264'505}});
    send(client, errorCategory, typeIssueDetector, {{"late_cycles", 3}});
    const std::string changed = looking->waitForOutput("\"volume\":0.5,\"faults\":1");
    EXPECT_THAT(changed.substr(changed.rfind("\"since\"")), HasSubstr("\"since\":1795264500,"));
    send(client, playback, typeStop, {{"session_output_running", false}, {"kestoreporting_timestamp", 1'795'264'509}});
    EXPECT_THAT(looking->waitForOutput("\"streams\":[]"), HasSubstr("\"streams\":[]"));
    send(client, playback, typeStart, {{"session_output_running", true}, {"kestoreporting_timestamp", 1'795'264'520}});
    EXPECT_THAT(looking->waitForOutput("\"since\":1795264520,"), HasSubstr("\"since\":1795264520,"))
        << "after a pause it plays since the end of that";
}

TEST_F(TopCommand, ReadsAStoreThatWasReplaced)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "first", 1'795'264'500);
    auto looking = tool.start({"top", "--json", "--batch", "--delay", "0.01"});
    EXPECT_THAT(looking->waitForOutput("\"first\""), HasSubstr("\"first\""));
    client.close();
    kestod.kill();
    fs::remove_all(kestod.directory() / "state");
    fs::create_directory(kestod.directory() / "state");
    kestod.startAndAwait();
    WireClient next(kestod.socketPath());
    play(next, "second", 1'795'264'600);
    send(next, errorCategory, typeIssueDetector, {{"late_cycles", 3}});
    EXPECT_THAT(looking->waitForOutput("\"volume\":1,\"faults\":1"), HasSubstr("\"second\""));
}

TEST_F(TopCommand, WithoutTheServiceSaysSoAndEndsWith3)
{
    const Finished finished = tool.run({"top"});
    EXPECT_EQ(finished.status, 3);
    EXPECT_THAT(finished.output, HasSubstr("\nthe service does not run, and left no status: "));
    EXPECT_EQ(finished.errors, "");
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 1'795'264'500);
    kestod.kill();
    const Finished killed = tool.run({"top"});
    EXPECT_EQ(killed.status, 3);
    EXPECT_THAT(killed.output, MatchesRegex("[-0-9]+ [0-9:]+\nkestod does not run\n")) << "and nothing plays";
}

TEST_F(TopCommand, AfterALossEndsWith1)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 1'795'264'500);
    send(client, volume, typeState, {{"PomoSessionVolume", std::nan("")}}); // JSON cannot express it
    const Finished finished = tool.run({"top"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.output, HasSubstr("\nlost      2 since the start; kesto status says why\n"));
}

TEST_F(TopCommand, WhoMayNotReadTheStoreSeesTheRest)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can become another user";
    kestod.startAndAwait();
    for (const char* folder : {"", "run"})
        fs::permissions(kestod.directory() / folder, fs::perms(0755));
    fs::permissions(kestod.directory() / "state", fs::perms(0700));
    fs::permissions(kestod.socketPath(), fs::perms(0666));
    tool.giveUpRights();
    const std::string look = tool.print({"top"});
    EXPECT_THAT(look, HasSubstr("\nlost      nothing\n\ncannot read the event store "));
    EXPECT_THAT(look, HasSubstr("permission denied"));
    EXPECT_TRUE(json()["streams"].IsNull());
}

TEST_F(TopCommand, OfAServiceThatStoresNothingDoesNotSayThatNothingPlays)
{
    support::writeFile(kestod.directory() / "configuration" / "analytics.toml", "enabled = false\n");
    kestod.startAndAwait();
    EXPECT_TRUE(json()["streams"].IsNull());
    EXPECT_THAT(tool.print({"top"}), testing::EndsWith("\nno event is stored: analytics.toml says enabled = false\n"));
}

TEST_F(TopCommand, SaysThatPlayingTimesAreNotStored)
{
    support::writeFile(kestod.directory() / "configuration" / "analytics.toml", "stretches = false\n");
    kestod.startAndAwait();
    EXPECT_TRUE(json()["streams"].IsNull());
    EXPECT_THAT(tool.print({"top"}),
                testing::EndsWith("\nno playing times are stored: analytics.toml says stretches = false\n"));
}

TEST_F(TopCommand, DoesNotKnowWhatPlaysWithoutTheService)
{
    EXPECT_THAT(tool.run({"top", "--json"}).output, HasSubstr("\"streams\":null"));
}

TEST_F(TopCommand, DoesNotWriteItsLooksIntoTheServicesSocket)
{
    FakeService service(kestod.socketPath(), answerWith("9.8.7"));
    const Finished finished = tool.runShell("$kesto top --iterations 2 --delay 0.01 >&-");
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr("could not be written"));
    EXPECT_EQ(service.waitForCalls(1).size(), 1U);
}

TEST_F(TopCommand, OfADumbTerminalIsOneLookWithoutEscapes)
{
    startWithAStore();
    tool.setVariable("TERM=dumb");
    const auto terminal = tool.startOnTerminal({"top"});
    EXPECT_EQ(terminal->wait(), 0);
    EXPECT_THAT(terminal->output(), HasSubstr("nothing plays or records"));
    EXPECT_THAT(terminal->output(), Not(HasSubstr("\x1B")));
}

// --- On a terminal

TEST_F(TopCommand, EndsWithAKeyAndRestoresTheTerminal)
{
    kestod.startAndAwait();
    const auto screen = startScreen();
    screen->type("q");
    EXPECT_EQ(screen->wait(), 0);
    expectRestored(*screen);
}

TEST_F(TopCommand, EndsAfterSoManyLooks)
{
    startWithAStore();
    const auto screen = tool.startOnTerminal({"top", "--iterations", "2", "--delay", "0.01"});
    EXPECT_EQ(screen->wait(), 0);
    const std::size_t end = screen->output().rfind(hiddenScreen);
    ASSERT_NE(end, std::string::npos);
    EXPECT_THAT(screen->output().substr(end + hiddenScreen.size()),
                testing::AllOf(HasSubstr("\r\nkestod "), testing::EndsWith("\r\nnothing plays or records\r\n")))
        << "the last look stays";
    EXPECT_TRUE(screen->hasUsualModes());
    EXPECT_EQ(statusCalls(), 3U);
}

TEST_F(TopCommand, KeysChangeWhatIsShown)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "zebra", 1'795'264'500, 1);
    play(client, "ant", 1'795'264'600, 2);
    const auto screen = startScreen({"--delay", "4000"});
    EXPECT_TRUE(screen->waitFor("zebra"));
    EXPECT_TRUE(screen->waitFor("ant"));
    screen->type("a");
    EXPECT_TRUE(screen->waitFor("\x1B[H"));
    EXPECT_TRUE(screen->waitFor("ant"));
    EXPECT_TRUE(screen->waitFor("zebra"));
    screen->type("+");
    EXPECT_TRUE(screen->waitFor("every 8000 s"));
    screen->type("--");
    EXPECT_TRUE(screen->waitFor("every 2000 s"));
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("Space  pauses"));
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("PLAYS"));
    EXPECT_EQ(statusCalls(), 2U) << "keys do not ask";
}

TEST_F(TopCommand, AsksNobodyInAPause)
{
    kestod.startAndAwait();
    const auto screen = startScreen({"--delay", "0.01"});
    screen->type(" ");
    expectNoQuestions(*screen, "paused");
    screen->type(" ");
    EXPECT_TRUE(screen->waitFor("every 0.01 s"));
    std::uint64_t calls = statusCalls();
    EXPECT_TRUE(end_to_end::waitUntil([&] {
        EXPECT_TRUE(screen->waitFor("kestod")); // somebody must read
        const std::uint64_t last = std::exchange(calls, statusCalls());
        return calls > last + 1;
    }));
}

TEST_F(TopCommand, AsksNobodyUnderTheListOfKeys)
{
    kestod.startAndAwait();
    const auto screen = startScreen({"--delay", "0.01"});
    screen->type("h");
    expectNoQuestions(*screen, "Space  pauses");
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("every 0.01 s"));
}

TEST_F(TopCommand, IsDrawnAgainForAnotherSize)
{
    kestod.startAndAwait();
    const auto screen = startScreen({"--delay", "4000"});
    screen->resize(20, 4);
    EXPECT_TRUE(screen->waitFor("and 7 lines more")) << screen->output();
    EXPECT_THAT(screen->output(), HasSubstr("clients   1 connect…\x1B[K\r\r\nand 7 lines more\x1B[K\x1B[J"));
}

class TopSignal : public TopCommand, public testing::WithParamInterface<int> { };

INSTANTIATE_TEST_SUITE_P(OfEveryKind, TopSignal,
                         testing::Values(SIGINT, SIGTERM, SIGHUP, SIGQUIT, SIGUSR1, SIGUSR2, SIGALRM, SIGVTALRM,
                                         SIGPROF, SIGXCPU, SIGPWR, SIGIO),
                         [](const auto& input) { return std::string("SIG") + ::sigabbrev_np(input.param); });

TEST_P(TopSignal, RestoresTheTerminalAndEndsTheProgram)
{
    kestod.startAndAwait();
    const auto screen = startScreen();
    screen->signal(GetParam());
    EXPECT_EQ(screen->wait(), 128 + GetParam());
    expectRestored(*screen);
}

TEST_F(TopCommand, ATerminalThatIsClosedEndsIt)
{
    kestod.startAndAwait();
    const auto screen = startScreen();
    screen->hangUp();
    EXPECT_EQ(screen->wait(), 128 + SIGHUP);
}

TEST_F(TopCommand, ATerminalThatIsClosedEndsItAlsoIfTheSignalIsIgnored)
{
    kestod.startAndAwait();
    const auto screen = tool.startShellOnTerminal("trap '' HUP; exec $kesto top");
    EXPECT_TRUE(screen->waitFor("kestod"));
    screen->hangUp();
    EXPECT_EQ(screen->wait(), 1);
}

TEST_F(TopCommand, ATerminalThatNobodyReadsDoesNotKeepItFromEnding)
{
    kestod.startAndAwait();
    const auto screen = startScreen({"--delay", "0.01"});
    waitUntilTheTerminalIsFull();
    screen->signal(SIGTERM);
    siginfo_t ended{};
    EXPECT_TRUE(end_to_end::waitUntil([&] {
        return ::waitid(P_PID, static_cast<id_t>(screen->identifier()), &ended, WEXITED | WNOHANG | WNOWAIT) == 0
            && ended.si_pid != 0;
    }));
    EXPECT_EQ(screen->wait(), 128 + SIGTERM);
    EXPECT_TRUE(screen->hasUsualModes());
}

TEST_F(TopCommand, ASecondSignalDoesNotKeepItFromRestoringTheTerminal)
{
    kestod.startAndAwait();
    const auto screen = startScreen({"--delay", "0.01"});
    waitUntilTheTerminalIsFull();
    screen->signal(SIGTERM);
    screen->signal(SIGINT);
    EXPECT_THAT(screen->wait(), testing::AnyOf(128 + SIGTERM, 128 + SIGINT));
    expectRestored(*screen);
}

TEST_F(TopCommand, WhileItIsStoppedTheTerminalIsTheShells)
{
    kestod.startAndAwait();
    const auto shell =
        tool.startShellOnTerminal("set -m; $kesto top --delay 4000; stty -a; echo STOPPED; fg >/dev/null;"
                                  " echo ended with $?; stty -a; echo DONE");
    EXPECT_TRUE(shell->waitFor("kestod")) << shell->output();
    shell->type("\x1A"); // Ctrl-Z
    EXPECT_TRUE(shell->waitFor(hiddenScreen)) << shell->output();
    EXPECT_TRUE(shell->waitFor(" icanon")) << shell->output();
    EXPECT_TRUE(shell->waitFor(" echo ")) << shell->output();
    EXPECT_TRUE(shell->waitFor("STOPPED")) << shell->output();
    EXPECT_TRUE(shell->waitFor(shownScreen)) << shell->output();
    EXPECT_TRUE(shell->waitFor("kestod")) << shell->output();
    shell->type("q");
    EXPECT_TRUE(shell->waitFor("ended with 0")) << shell->output();
    EXPECT_TRUE(shell->waitFor(" icanon")) << shell->output();
    EXPECT_TRUE(shell->waitFor("DONE")) << shell->output();
}

TEST_F(TopCommand, InTheBackgroundItWaitsForTheTerminalAndCanBeEnded)
{
    kestod.startAndAwait();
    const auto shell = tool.startShellOnTerminal(
        "set -m; $kesto top --delay 0.01 & until read -r _ _ state _ "
        "</proc/$!/stat && [[ $state == T ]]; do sleep 0.01; done; echo WAITS;"
        " kill $!; kill -CONT $!; while kill -0 $! 2>/dev/null; do sleep 0.01; done; wait $!; echo ended with $?");
    EXPECT_TRUE(shell->waitFor("WAITS")) << shell->output();
    EXPECT_TRUE(shell->waitFor("ended with 143")) << shell->output();
    EXPECT_THAT(shell->output(), Not(HasSubstr(shownScreen)));
    EXPECT_EQ(statusCalls(), 1U);
}

TEST_F(TopCommand, TheEndOfStandardInputOnlyEndsTheKeys)
{
    kestod.startAndAwait();
    const auto screen = tool.startShellOnTerminal("exec $kesto top --delay 4000 </dev/null");
    EXPECT_TRUE(screen->waitFor("kestod"));
    const auto reads = [&screen] {
        std::ifstream file("/proc/" + std::to_string(screen->identifier()) + "/io");
        std::string key;
        for (std::uint64_t number = 0; file >> key >> number;)
            if (key == "syscr:")
                return number;
        return std::uint64_t{0};
    };
    const std::uint64_t before = reads();
    for (unsigned short columns = 60; columns < 70; ++columns) {
        screen->resize(columns, 24);
        EXPECT_TRUE(screen->waitFor("kestod"));
    }
    EXPECT_GT(before, 0U);
    EXPECT_LE(reads() - before, 20U) << "two for each signal";
    EXPECT_EQ(statusCalls(), 2U);
    screen->signal(SIGTERM);
    EXPECT_EQ(screen->wait(), 128 + SIGTERM);
}

TEST_F(TopCommand, GoesOnWhenTheServiceEndsAndStartsAgain)
{
    kestod.startAndAwait();
    const auto screen = startScreen({"--delay", "0.01"});
    EXPECT_TRUE(screen->waitFor("running since"));
    kestod.kill();
    EXPECT_TRUE(screen->waitFor("kestod does not run"));
    kestod.startAndAwait();
    EXPECT_TRUE(screen->waitFor("running since"));
    screen->type("q");
    EXPECT_EQ(screen->wait(), 0);
}

TEST_F(TopCommand, KeysWorkWhileTheServiceDoesNotAnswer)
{
    kestod.startAndAwait();
    const auto screen = startScreen({"--delay", "0.01"});
    kestod.signal(SIGSTOP);
    EXPECT_TRUE(screen->waitFor("no answer for 1 s"));
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("Space  pauses"));
    screen->type("h");
    kestod.signal(SIGCONT);
    EXPECT_TRUE(screen->waitFor("every 0.01 s; h"));
    EXPECT_TRUE(screen->waitFor("running since"));
    screen->type("q");
    EXPECT_EQ(screen->wait(), 0);
    EXPECT_EQ(kestod.waitForEvents("*uptime", 2).size(), 2U) << "it kept its connection";
}

// --- A service that hangs or misbehaves

TEST_F(TopCommand, KeysWorkWhileAPartOfTheAnswerIsMissing)
{
    const std::string whole = framed("9.8.7");
    FakeService service(kestod.socketPath(),
                        [&](Peer& peer, const Array&) { peer.sendBytes(std::string_view(whole).substr(0, 9)); });
    const auto screen = tool.startOnTerminal({"top", "--delay", "4000"});
    EXPECT_EQ(service.waitForCalls(1).size(), 1U);
    service.forEachPeer([](Peer&) { }); // the part is sent
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("Space  pauses"));
    service.forEachPeer([&](Peer& peer) { peer.sendBytes(std::string_view(whole).substr(9)); });
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("kestod 9.8.7"));
    EXPECT_EQ(service.connections(), 1U);
}

TEST_F(TopCommand, KeysWorkWhileTheServiceThatFollowsOneThatEndedDoesNotAnswer)
{
    FakeService service(kestod.socketPath(), [calls = 0](Peer& peer, const Array& call) mutable {
        if (++calls == 1)
            answerWith("9.8.7")(peer, call);
        else if (calls == 2)
            peer.close();
    });
    const auto screen = tool.startOnTerminal({"top", "--delay", "0.01"});
    EXPECT_EQ(service.waitForCalls(3).size(), 3U);
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("Space  pauses"));
    service.forEachPeer([](Peer& peer) { peer.sendBytes(framed("9.8.8")); });
    screen->type("h");
    EXPECT_TRUE(screen->waitFor("kestod 9.8.8"));
    EXPECT_EQ(service.connections(), 2U);
}

TEST_F(TopCommand, SaysThatTooManyWaitForTheService)
{
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    kestod.socketPath().native().copy(address.sun_path, sizeof address.sun_path - 1);
    const auto* const generic = reinterpret_cast<const sockaddr*>(&address);
    const platform::FileDescriptor busy(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    ASSERT_EQ(::bind(busy.get(), generic, sizeof address), 0);
    ASSERT_EQ(::listen(busy.get(), 0), 0);
    std::vector<platform::FileDescriptor> waiting;
    do
        waiting.emplace_back(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    while (::connect(waiting.back().get(), generic, sizeof address) == 0);
    const auto screen = tool.startOnTerminal({"top", "--delay", "4000"});
    screen->resize(200, 24);
    EXPECT_TRUE(screen->waitFor("does not answer: too many others wait for it"));
    screen->type("q");
    EXPECT_EQ(screen->wait(), 3);
}

TEST_F(TopCommand, OfAServiceThatSendsSomethingElseSaysSoAndRestoresTheTerminal)
{
    const FakeService service(kestod.socketPath(), [](Peer& peer, const Array& call) {
        peer.answer(sdk_test::callNumber(call), {Dictionary()});
    });
    const auto screen = tool.startOnTerminal({"top", "--delay", "4000"});
    screen->resize(200, 24);
    EXPECT_TRUE(screen->waitFor("it sent something else than a status"));
    screen->type("q");
    EXPECT_EQ(screen->wait(), 3);
    expectRestored(*screen);
}

TEST_F(TopCommand, HonoursTheWishForNoColours)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "player", 1'795'264'500);
    const std::string title = "PLAYS                  SINCE";
    EXPECT_TRUE(startScreen()->waitFor("\x1B[1m" + title));
    tool.setVariable("NO_COLOR=1");
    const auto screen = startScreen();
    EXPECT_TRUE(screen->waitFor("\r\n" + title));
    EXPECT_THAT(screen->output(), Not(testing::ContainsRegex("\x1B\\[[0-9]+m")));
}

TEST_F(TopCommand, WritesAsciiInALocaleWithoutUTF8)
{
    kestod.startAndAwait();
    WireClient client(kestod.socketPath());
    play(client, "Küchenradio", 1'795'264'500);
    EXPECT_TRUE(startScreen()->waitFor("Küchenradio"));
    tool.setVariable("LC_ALL=C");
    const auto screen = startScreen();
    EXPECT_TRUE(screen->waitFor("K?chenradio"));
    EXPECT_TRUE(
        std::ranges::all_of(screen->output(), [](char byte) { return static_cast<unsigned char>(byte) < 0x80; }));
    EXPECT_THAT(tool.print({"top"}), HasSubstr("\nK?chenradio "));
}

} // namespace
} // namespace kesto_tool
