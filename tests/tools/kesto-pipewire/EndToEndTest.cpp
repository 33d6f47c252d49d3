// SPDX-License-Identifier: Apache-2.0
// The whole path: a sound that plays on a real PipeWire, the shipped program, a real service, and its stored events.

#include "support/Sanitizers.h"
#include "support/TemporaryDirectory.h"
#include "tools/kesto-pipewire/HeadlessPipeWire.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <sqlite3.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <thread>
#include <utility>

namespace kesto_pipewire {

namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using namespace std::chrono_literals;

constexpr auto patience = 20s; // events normally come within a fraction of a second

class EndToEndTest : public testing::Test {
protected:
    EndToEndTest()
    {
        for (const auto* folder : {"run", "state", "logs", "config"})
            std::filesystem::create_directory(directory / folder);
        std::ofstream(directory / "config/device.toml") << "InternalBuild = true\n";
    }
    void SetUp() override
    {
        if (!server.reasonToSkip().empty())
            GTEST_SKIP() << server.reasonToSkip();
        startService();
        startReporter();
    }

    void startService()
    {
        service = std::make_unique<Program>(std::vector<std::string>{KESTOD},
                                            Program::Environment{{"RUNTIME_DIRECTORY", directory / "run"},
                                                                 {"STATE_DIRECTORY", directory / "state"},
                                                                 {"LOGS_DIRECTORY", directory / "logs"},
                                                                 {"CONFIGURATION_DIRECTORY", directory / "config"},
                                                                 {"KESTO_SERVICE_NAME", "service"},
                                                                 {"KESTO_CHANNEL_ROOT", directory / "channels"},
                                                                 {"KESTO_LOG", "error"}});
    }
    void startReporter()
    {
        reporter =
            std::make_unique<Program>(std::vector<std::string>{"sh", "-c", "exec \"$0\" \"$@\" 2>&1", KESTO_PIPEWIRE,
                                                               "--socket", directory / "run/service", "--remote",
                                                               server.socket(), "--channels", directory / "channels"},
                                      Program::Environment{});
    }
    // Reads the reporter's output up to that text.
    [[nodiscard]] bool reporterSays(const std::string& what) const
    {
        auto line = reporter->readLine();
        while (!line.empty() && line != "kesto-pipewire: " + what)
            line = reporter->readLine();
        return !line.empty();
    }
    // The service subscribes to groups that have channels when it starts, and a first service would start too early.
    void startServiceThatFindsChannels()
    {
        ASSERT_TRUE(reporterSays("connected to the reporting service"));
        killService();
        startService();
    }
    void killService()
    {
        service->kill(SIGKILL);
        service.reset();
    }

    // The first column of every row that the query yields, oldest first. Nothing if the store does not exist yet.
    [[nodiscard]] std::vector<std::string> select(const std::string& columns, const std::string& condition) const
    {
        sqlite3* database = nullptr;
        std::vector<std::string> rows;
        const auto query = "SELECT " + columns + " FROM events WHERE " + condition + " ORDER BY id";
        if (sqlite3_open_v2((directory / "state/analytics.sqlite3").c_str(), &database, SQLITE_OPEN_READONLY, nullptr)
            == SQLITE_OK) {
            sqlite3_stmt* statement = nullptr;
            sqlite3_prepare_v2(database, query.c_str(), -1, &statement, nullptr);
            while (statement && sqlite3_step(statement) == SQLITE_ROW) {
                const auto* text = sqlite3_column_text(statement, 0);
                rows.emplace_back(text ? reinterpret_cast<const char*>(text) : "null");
            }
            sqlite3_finalize(statement);
        }
        sqlite3_close(database);
        return rows;
    }
    // The values of a key in every event of that name.
    [[nodiscard]] std::vector<std::string> values(const std::string& event, const std::string& key) const
    {
        return select("json_extract(payload, '$." + key + "')", "name = 'com.quarn." + event + "'");
    }
    // The names of all events, without their common beginning, and without those of clients and drivers, which come at
    // any time.
    // What the reporter said. On a busy machine a sound may not keep up; what the service derives comes later.
    [[nodiscard]] std::vector<std::string> events() const
    {
        return select("substr(name, 17)",
                      "name LIKE 'com.quarn.kesto.%' AND name NOT LIKE '%uptime' AND name NOT LIKE '%.Cavlet.%'"
                      " AND name NOT LIKE '%.Volume.Summary' AND name NOT LIKE '%.Error.%'");
    }
    // Waits for so many events of that name.
    [[nodiscard]] bool comes(const std::string& event, std::size_t count = 1) const
    {
        const auto end = std::chrono::steady_clock::now() + patience;
        while (values(event, "audiotag").size() < count) {
            if (std::chrono::steady_clock::now() > end)
                return false;
            std::this_thread::sleep_for(5ms);
        }
        return true;
    }
    // How often the threads of the reporter have gone to sleep, and so woken before.
    [[nodiscard]] std::uint64_t reporterSleeps() const
    {
        std::uint64_t sleeps = 0;
        const std::string name = "voluntary_ctxt_switches:";
        for (const auto& thread :
             std::filesystem::directory_iterator("/proc/" + std::to_string(reporter->pid()) + "/task")) {
            std::ifstream status(thread.path() / "status");
            for (std::string line; std::getline(status, line);)
                if (line.starts_with(name))
                    sleeps += std::stoull(line.substr(name.size()));
        }
        return sleeps;
    }
    // Lets the sound play: the test is about durations.
    static void letItPlay(std::chrono::milliseconds duration) { std::this_thread::sleep_for(duration); }

    const std::string driver = "pipewire-" + std::to_string(::geteuid());
    HeadlessPipeWire server;
    const support::TemporaryDirectory directory;
    std::unique_ptr<Program> service;
    std::unique_ptr<Program> reporter;
};

TEST_F(EndToEndTest, AToneThatIsPausedAndMadeSofterBecomesTheseEvents)
{
    {
        const auto player = server.playTone("Music");
        ASSERT_TRUE(comes("kesto.Playback.Start"));
        server.runToEnd({"pactl", "set-sink-input-volume", server.onlySinkInput(), "50%"});
        ASSERT_TRUE(comes("kesto.Volume.State"));
        player->write("pause\n");
        ASSERT_TRUE(comes("kesto.Playback.Stop"));
        player->write("play\n");
        ASSERT_TRUE(comes("kesto.Playback.Start", 2));
    }
    ASSERT_TRUE(comes("kesto.Playback.Deactivate"));

    EXPECT_THAT(events(),
                ElementsAre("Playback.Start", "Volume.State", "Playback.Stop", "Playback.Start", "Playback.Stop",
                            "Playback.Deactivate"));
    EXPECT_THAT(values("longformaudio.Playback.Start", "session_output_running"), ElementsAre("1", "1"));
    EXPECT_THAT(values("longformaudio.Playback.Start", "PomoSessionVolume"), ElementsAre("1", "0.5"));
    EXPECT_THAT(values("kesto.Playback.Start", "session_selected_format"),
                ElementsAre("S16LE/44100/2", "S16LE/44100/2"));
    EXPECT_THAT(values("kesto.Playback.Start", "mChannelsPerFrame"), ElementsAre("2", "2"));
    EXPECT_THAT(values("kesto.Playback.Start", "active_devices"), ElementsAre("null-sink", "null-sink"));
    EXPECT_THAT(values("kesto.Playback.Start", "HostApplicationDisplayID"), ElementsAre("tone-player", "tone-player"));
    EXPECT_THAT(values("kesto.Volume.State", "PomoSessionVolume"), ElementsAre("0.5"));
    EXPECT_THAT(values("kesto.Playback.Stop", "session_output_running"), ElementsAre("0", "0"));
}

TEST_F(EndToEndTest, ARecordingBecomesTheseEvents)
{
    {
        const auto recorder = server.record();
        ASSERT_TRUE(comes("generic.Record.Start"));
    }
    ASSERT_TRUE(comes("kesto.Record.Deactivate"));

    EXPECT_THAT(events(), ElementsAre("Record.Start", "Record.Stop", "Record.Deactivate"));
    EXPECT_THAT(values("kesto.Record.Start", "session_input_running"), ElementsAre("1"));
}

// Bounds of an event's time: after the command and before the event was stored.
struct Bracket {
    std::chrono::steady_clock::time_point earliest;
    std::chrono::steady_clock::time_point latest;
};

// Whether the text is a duration that may have passed between the two.
void expectDuration(const std::string& seconds, const Bracket& begin, const Bracket& end)
{
    using Seconds = std::chrono::duration<double>;
    EXPECT_GE(std::stod(seconds), Seconds(end.earliest - begin.latest).count());
    EXPECT_LE(std::stod(seconds), Seconds(end.latest - begin.earliest).count());
}

TEST_F(EndToEndTest, PlayingYieldsVolumeEventsOfTheRightLengths)
{
    const auto bracket = [](auto act) {
        const auto before = std::chrono::steady_clock::now();
        act();
        return Bracket{before, std::chrono::steady_clock::now()};
    };
    std::unique_ptr<Program> player;
    const auto start = bracket([&] {
        player = server.playTone("Music");
        ASSERT_TRUE(comes("kesto.Playback.Start"));
    });
    const auto input = server.onlySinkInput();
    letItPlay(1000ms);
    const auto change = bracket([&] {
        server.runToEnd({"pactl", "set-sink-input-volume", input, "50%"});
        ASSERT_TRUE(comes("kesto.Volume.State"));
    });
    letItPlay(700ms);
    const auto pause = bracket([&] {
        player->write("pause\n");
        ASSERT_TRUE(comes("kesto.Playback.Stop"));
    });
    const auto resumption = bracket([&] {
        player->write("play\n");
        ASSERT_TRUE(comes("kesto.Playback.Start", 2));
    });
    letItPlay(1300ms);
    const auto end = bracket([&] {
        player.reset();
        ASSERT_TRUE(comes("kesto.Playback.Deactivate"));
    });
    ASSERT_TRUE(comes("kesto.Volume.Summary", 3));

    EXPECT_THAT(values("kesto.Volume.Summary", "PomoSessionVolume"), ElementsAre("1", "0.5", "0.5"));
    EXPECT_THAT(values("kesto.Volume.Summary", "active_devices"), testing::Each("null-sink"));
    EXPECT_THAT(values("kesto.Volume.Summary", "session_selected_format"), testing::Each("S16LE/44100/2"));
    EXPECT_THAT(values("kesto.Volume.Summary", "HostApplicationDisplayID"), testing::Each("tone-player"));
    const auto lengths = values("kesto.Volume.Summary", "play_seconds");
    expectDuration(lengths[0], start, change);
    expectDuration(lengths[1], change, pause);
    expectDuration(lengths[2], resumption, end);
}

TEST_F(EndToEndTest, TwoStreamsAtOnceDoNotMix)
{
    {
        const auto one = server.playOverPulse("music");
        ASSERT_TRUE(comes("kesto.Playback.Start"));
        server.runToEnd({"pactl", "set-sink-input-volume", server.onlySinkInput(), "50%"});
        ASSERT_TRUE(comes("kesto.Volume.State"));
        const auto other = server.playTone("Game");
        ASSERT_TRUE(comes("nonlongformaudio.Playback.Start"));
        letItPlay(700ms);
    }
    ASSERT_TRUE(comes("longformaudio.Volume.Summary"));
    ASSERT_TRUE(comes("nonlongformaudio.Volume.Summary"));

    EXPECT_THAT(values("longformaudio.Volume.Summary", "HostApplicationDisplayID"), ElementsAre("pacat"));
    EXPECT_THAT(values("longformaudio.Playback.Start", "stream"), ElementsAre(testing::StartsWith("pacat#")));
    EXPECT_THAT(values("longformaudio.Volume.Summary", "PomoSessionVolume"), ElementsAre("0.5"));
    EXPECT_THAT(values("nonlongformaudio.Volume.Summary", "HostApplicationDisplayID"), ElementsAre("tone-player"));
    EXPECT_THAT(values("nonlongformaudio.Volume.Summary", "PomoSessionVolume"), ElementsAre("1"));
}

TEST_F(EndToEndTest, AFilterThatPlaysTwoSecondsBecomesTheseEvents)
{
    const auto filter = server.runFilter(2, 0);
    const auto bracket = [](auto act) {
        const auto before = std::chrono::steady_clock::now();
        act();
        return Bracket{before, std::chrono::steady_clock::now()};
    };
    const auto start = bracket([&] {
        server.link("tone-filter:output_1", "null-sink:playback_FL");
        server.link("tone-filter:output_2", "null-sink:playback_FR");
        ASSERT_TRUE(comes("kesto.Playback.Start"));
    });
    letItPlay(2000ms);
    const auto end = bracket([&] {
        filter->kill(SIGKILL);
        ASSERT_TRUE(comes("kesto.Playback.Deactivate"));
    });
    ASSERT_TRUE(comes("kesto.Volume.Summary"));

    EXPECT_THAT(events(), testing::IsSupersetOf({"Playback.Start", "Playback.Stop", "Playback.Deactivate"}));
    for (const auto* event : {"generic.Playback.Start", "generic.Playback.Stop"}) {
        EXPECT_THAT(values(event, "active_devices"), ElementsAre("null-sink"));
        EXPECT_THAT(values(event, "session_selected_format"), testing::Each(testing::StartsWith("F32P/48000/")));
        EXPECT_THAT(values(event, "PomoSessionVolume"), ElementsAre("1"));
        EXPECT_THAT(values(event, "HostApplicationDisplayID"), ElementsAre("tone-filter"));
        EXPECT_THAT(values(event, "stream"), ElementsAre(testing::MatchesRegex("tone-filter#[0-9]+")));
    }
    EXPECT_THAT(values("generic.Playback.Stop", "session_selected_format"), ElementsAre("F32P/48000/2"));
    EXPECT_THAT(values("generic.Playback.Stop", "mChannelsPerFrame"), ElementsAre("2"));
    EXPECT_THAT(values("kesto.Volume.Summary", "active_devices"), testing::Each("null-sink"));
    double seconds = 0;
    for (const auto& length : values("kesto.Volume.Summary", "play_seconds"))
        seconds += std::stod(length);
    expectDuration(std::to_string(seconds), start, end);
}

TEST_F(EndToEndTest, ASessionsEndTellsWhatTheDevicesDid)
{
    startServiceThatFindsChannels();
    {
        const auto player = server.playTone("Music");
        ASSERT_TRUE(comes("kesto.Playback.Start"));
        letItPlay(2500ms); // the profiler reports about once a second
    }
    ASSERT_TRUE(comes("kesto.Cavlet.State"));
    ASSERT_TRUE(comes("kesto.Cavlet.Simple"));
    ASSERT_TRUE(comes("kesto.Cavlet.Histogram"));

    const auto cycles = values("kesto.Cavlet.Simple", driver + "_Tx_null-sink_Simple_cycles");
    EXPECT_GT(std::stoi(cycles.at(0)), 20);
    EXPECT_EQ(values("kesto.Cavlet.Simple", driver + "_Tx_Simple_cycles"), cycles);
    EXPECT_THAT(values("kesto.Cavlet.Histogram", driver + "_Tx_null-sink_Histogram_work"),
                ElementsAre(testing::HasSubstr("unit=us::")));
    EXPECT_THAT(values("kesto.Cavlet.State", driver + "_Speaker_null-sink_State_state"),
                ElementsAre(testing::HasSubstr("name:Running,")));
}

TEST_F(EndToEndTest, ATerminatedReporterStillTellsWhatTheDevicesDid)
{
    startServiceThatFindsChannels();
    const auto player = server.playTone("Music");
    ASSERT_TRUE(comes("kesto.Playback.Start"));
    letItPlay(2500ms);
    reporter->kill(SIGTERM);
    EXPECT_EQ(reporter->wait(), 0);

    ASSERT_TRUE(comes("kesto.Cavlet.Simple"));
    EXPECT_GT(std::stoi(values("kesto.Cavlet.Simple", driver + "_Tx_null-sink_Simple_cycles").at(0)), 20);
}

TEST_F(EndToEndTest, AReporterThatWasKilledLeavesNoDevicesBehind)
{
    const auto file = [this](const std::string& path) { return directory / "channels" / driver / path; };
    const auto isThere = [](const std::filesystem::path& path) {
        const auto end = std::chrono::steady_clock::now() + patience;
        while (!std::filesystem::exists(path) && std::chrono::steady_clock::now() < end)
            std::this_thread::sleep_for(5ms);
        return std::filesystem::exists(path);
    };
    for (int twin = 0; twin < 2; ++twin)
        server.runToEnd({"pactl", "load-module", "module-null-sink", "sink_name=dock"});
    ASSERT_TRUE(isThere(file("StateTransitionTimes_ms/dock/to Running")));
    ASSERT_TRUE(isThere(file("StateTransitionTimes_ms/dock#2/to Running")));
    reporter->kill(SIGKILL);
    reporter->wait();
    server.runToEnd({"pactl", "unload-module", "module-null-sink"});
    EXPECT_TRUE(std::filesystem::exists(file("Speaker/dock/state")));
    startReporter();
    startServiceThatFindsChannels();
    EXPECT_FALSE(std::filesystem::exists(file("Speaker/dock")));
    EXPECT_FALSE(std::filesystem::exists(file("Speaker/dock#2")));
    {
        const auto player = server.playTone("Music");
        ASSERT_TRUE(comes("kesto.Playback.Start"));
    }
    ASSERT_TRUE(comes("kesto.Cavlet.State"));

    EXPECT_THAT(values("kesto.Cavlet.State", driver + "_Speaker_null-sink_State_state"),
                ElementsAre(testing::HasSubstr("name:")));
    EXPECT_THAT(select("payload", "name LIKE '%Cavlet%' AND payload LIKE '%dock%'"), IsEmpty());
}

TEST_F(EndToEndTest, AnIdleReporterWakesForNothing)
{
    KESTO_SKIP_WHERE_THREADS_ARE_WATCHED();
    ASSERT_TRUE(reporterSays("connected to the reporting service"));
    auto before = reporterSleeps();
    for (std::uint64_t earlier = 0; earlier != before; earlier = std::exchange(before, reporterSleeps()))
        letItPlay(500ms); // until the reports of the beginning are done
    letItPlay(2500ms); // more than twice the publishers' default interval
    EXPECT_EQ(reporterSleeps(), before);
}

TEST_F(EndToEndTest, AKilledServiceGetsTheStateAgainWhenItIsBack)
{
    const auto player = server.playTone("Music");
    ASSERT_TRUE(comes("kesto.Playback.Start"));
    killService();
    startService();
    ASSERT_TRUE(comes("kesto.Playback.Start", 2));
    server.runToEnd({"pactl", "set-sink-input-volume", server.onlySinkInput(), "50%"});
    ASSERT_TRUE(comes("kesto.Volume.State"));
    const auto times = values("kesto.Playback.Start", "kestoreporting_timestamp");

    EXPECT_EQ(times[0], times[1]); // it has played since then
}

TEST_F(EndToEndTest, WhenPipeWireIsKilledSessionsEndAndItsSuccessorIsReported)
{
    {
        const auto player = server.playTone("Music");
        ASSERT_TRUE(comes("longformaudio.Playback.Start"));
        server.kill();
        ASSERT_TRUE(comes("longformaudio.Playback.Deactivate"));
    }
    EXPECT_THAT(events(), ElementsAre("Playback.Start", "Playback.Stop", "Playback.Deactivate"));
    server.clearAway();
    server.start();
    const auto player = server.playTone("Game");

    EXPECT_TRUE(comes("nonlongformaudio.Playback.Start"));
}

TEST_F(EndToEndTest, ATerminatedReporterEndsItsSessionsFirst)
{
    const auto player = server.playTone("Music");
    ASSERT_TRUE(comes("kesto.Playback.Start"));
    reporter->kill(SIGTERM);
    EXPECT_EQ(reporter->wait(), 0);

    EXPECT_THAT(events(), ElementsAre("Playback.Start", "Playback.Stop", "Playback.Deactivate"));
}

TEST_F(EndToEndTest, AReporterFindsTheServiceWhenItComes)
{
    ASSERT_TRUE(reporterSays("connected to the reporting service"));
    killService();
    ASSERT_TRUE(reporterSays("waiting for the reporting service"));
    const auto player = server.playTone("Music");
    startService();

    EXPECT_TRUE(comes("kesto.Playback.Start"));
}

TEST_F(EndToEndTest, AReporterWithoutAServiceEndsCleanlyToo)
{
    ASSERT_TRUE(reporterSays("connected to the reporting service"));
    killService();
    ASSERT_TRUE(reporterSays("waiting for the reporting service"));
    reporter->kill(SIGINT);

    EXPECT_EQ(reporter->wait(), 0);
}

class CommandLineTest : public testing::Test {
protected:
    struct Outcome {
        std::string firstLine;
        int status = 0;
    };
    static Outcome run(std::vector<std::string> arguments)
    {
        arguments.insert(arguments.begin(), KESTO_PIPEWIRE);
        Program program(arguments, {});
        auto line = program.readLine();
        return {std::move(line), program.wait()};
    }
};

TEST_F(CommandLineTest, HelpAndVersionAreNotErrors)
{
    const auto help = run({"--help"});
    EXPECT_THAT(help.firstLine, testing::HasSubstr("Reports every stream"));
    EXPECT_EQ(help.status, 0);
    const auto version = run({"--version"});
    EXPECT_THAT(version.firstLine, testing::StartsWith("kesto-pipewire "));
    EXPECT_EQ(version.status, 0);
}

TEST_F(CommandLineTest, EveryOptionOfTheHelpIsCompleted)
{
    Program bash({"bash", "-c",
                  "source " KESTO_COMPLETION "; COMP_WORDS=(kesto-pipewire --); COMP_CWORD=1; _kesto_pipewire;"
                  "$0 --help | grep -oE -e '--[a-z]+' | sort -u | while read -r option; do"
                  "  [[ \" ${COMPREPLY[*]} \" == *\" $option \"* ]] && echo \"$option\"; done; echo end",
                  KESTO_PIPEWIRE},
                 {});
    for (const auto* option : {"--channels", "--help", "--remote", "--socket", "--verbose", "--version", "end"})
        EXPECT_EQ(bash.readLine(), option);
}

TEST_F(CommandLineTest, TheStatusReportsWrongUse)
{
    EXPECT_EQ(run({"--no-such-option"}).status, 64);
    EXPECT_EQ(run({"surplus"}).status, 64);
    EXPECT_EQ(run({"--socket"}).status, 64);
}

TEST_F(CommandLineTest, TheStatusReportsAnImpossibleSocket)
{
    EXPECT_EQ(run({"--socket", "/" + std::string(200, 'x')}).status, 78);
}

} // namespace

} // namespace kesto_pipewire
