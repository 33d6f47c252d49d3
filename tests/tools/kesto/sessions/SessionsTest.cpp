// SPDX-License-Identifier: Apache-2.0
// Lines, tables and timelines of sessions that are made up.
#include "kesto/sessions/SessionText.h"
#include "kesto/sessions/SessionTimeline.h"
#include "support/EnvironmentVariable.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <limits>

namespace {

using testing::ElementsAre;
using testing::HasSubstr;

constexpr double begin = 1'700'000'000; // 2023-11-14 22:13:20

PlayedStretch stretch(std::int64_t session, double after, double seconds, std::optional<double> volume,
                      const char* device = "speaker")
{
    return {.session = session,
            .began = begin + after,
            .seconds = seconds,
            .device = device,
            .format = "S16LE/44100/2",
            .volume = volume};
}

HistorySession session(std::int64_t id, const char* application, double after)
{
    return {.id = id, .application = application, .service = "", .process = "", .began = begin + after};
}

class Sessions : public testing::Test {
protected:
    Sessions()
    {
        history.sessions = {session(1, "player", 0), session(2, "radio", 100), session(3, "silent", 200)};
        history.sessions[0].service = "longformaudio";
        history.sessions[0].process = "aplay";
        history.sessions[0].user = 1000;
        history.sessions[0].processID = 7864;
        history.sessions[0].ended = begin + 80;
        history.stretches = {stretch(1, 0, 10, 1.0), stretch(1, 10, 30, 0.5, "headset"),
                             stretch(1, 40, 10, 0, "headset"), stretch(1, 60, 20, std::nullopt),
                             stretch(2, 100, 3600.5, 0.25)};
        history.stretches.back().isRunning = true;
        history.faults = {
            {.session = 1, .happened = begin + 5, .kind = "IssueDetector", .device = "", .lateCycles = 3},
            {.session = 3, .happened = begin + 205, .kind = "Error", .device = "", .lateCycles = 0},
            {.session = 1, .happened = begin + 65, .kind = "IssueDetector", .device = "", .lateCycles = 4}};
    }
    [[nodiscard]] History ofFirst() const
    {
        History first = history;
        first.sessions.resize(1);
        first.stretches.resize(4);
        std::erase_if(first.faults, [](const Fault& fault) { return fault.session != 1; });
        return first;
    }
    [[nodiscard]] std::vector<SessionLine> lines() const { return makeSessionLines(history); }
    [[nodiscard]] std::vector<std::int64_t> numbers(const SessionChoice& choice) const
    {
        std::vector<std::int64_t> numbers;
        for (const SessionLine& line : chosen(lines(), choice))
            numbers.push_back(line.session.id);
        return numbers;
    }

    const support::EnvironmentVariable zone{"TZ", "UTC"};
    History history;
};

TEST_F(Sessions, SumUpTheirStretchesAndFaults)
{
    const auto all = lines();
    ASSERT_EQ(all.size(), 3U);
    EXPECT_EQ(all[0].played.seconds, 70);
    EXPECT_EQ(all[0].played.mutedSeconds, 10);
    EXPECT_EQ(all[0].played.noVolumeSeconds, 20);
    EXPECT_EQ(all[0].played.meanVolume(), 0.625) << "10 s at 1 and 30 s at 0.5";
    EXPECT_EQ(all[0].played.faults, 2U);
    EXPECT_EQ(all[0].devices, "headset; speaker");
    EXPECT_EQ(all[0].end, SessionEnd::Stopped);
    EXPECT_EQ(all[1].end, SessionEnd::Running);
    EXPECT_EQ(all[2].end, SessionEnd::Unknown);
    EXPECT_EQ(all[2].played.faults, 1U);
}

TEST_F(Sessions, EndAsTheirLastStretch)
{
    history.stretches[3].hasVanished = true;
    EXPECT_EQ(lines()[0].end, SessionEnd::Vanished);
    history.stretches[3].hasVanished = false;
    history.stretches[3].hasServiceEnded = true;
    EXPECT_EQ(lines()[0].end, SessionEnd::ServiceEnded);
    history.stretches[3].hasServiceEnded = false;
    history.stretches[0].hasVanished = true;
    EXPECT_EQ(lines()[0].end, SessionEnd::Stopped);
}

TEST_F(Sessions, RunAlsoIfTheClockWasSetBackMeanwhile)
{
    history.stretches[1].isRunning = true;
    EXPECT_EQ(lines()[0].end, SessionEnd::Running);
    EXPECT_THAT(numbers({.isRunning = true}), ElementsAre(2, 1));
}

TEST_F(Sessions, LeaveOutWhatBelongsToNone)
{
    history.stretches.insert(history.stretches.begin(), stretch(0, 0, 10, 1.0));
    history.stretches.push_back(stretch(99, 0, 10, 1.0));
    history.faults.push_back({.session = 0, .happened = begin, .kind = "Error", .device = "", .lateCycles = 0});
    EXPECT_EQ(lines().size(), 3U);
    EXPECT_EQ(lines()[0].played.seconds, 70);
}

TEST_F(Sessions, AreSortedAndChosen)
{
    EXPECT_THAT(numbers({}), ElementsAre(3, 2, 1));
    EXPECT_THAT(numbers({.order = SessionOrder::Played}), ElementsAre(2, 1, 3));
    EXPECT_THAT(numbers({.order = SessionOrder::Faults}), ElementsAre(1, 3, 2));
    EXPECT_THAT(numbers({.order = SessionOrder::Faults, .most = 1}), ElementsAre(1));
    EXPECT_THAT(numbers({.withFaults = true}), ElementsAre(3, 1));
    EXPECT_THAT(numbers({.isRunning = true}), ElementsAre(2));
}

TEST_F(Sessions, AreATable)
{
    history.sessions[2].application = "a\nb";
    history.stretches[4].volume = 0;
    EXPECT_EQ(sessionsText(lines(), 100),
              "SESSION BEGAN            APPLICATION              PLAYED VOLUME FAULTS DEVICE                END\n"
              "      1 2023-11-14 22:13 player                  0:01:10   62 %      2 headset; speaker      stopped\n"
              "      2 2023-11-14 22:15 radio                   1:00:00  muted      0 speaker               running\n"
              "      3 2023-11-14 22:16 a?b                     0:00:00      -      1 -                     -\n");
}

TEST_F(Sessions, AreCutToTheTerminal)
{
    history.sessions[0].application = "org.example.player";
    EXPECT_THAT(sessionsText(lines(), 70),
                HasSubstr("      1 2023-11-14 22:13 org.e…   0:01:10   62 %      2 heads… stopped\n"));
    EXPECT_THAT(sessionsText(lines(), 20), HasSubstr("      1 2023-11-14 …\n"));
    EXPECT_THAT(sessionsText(lines(), std::string::npos), HasSubstr("headset; speaker          stopped\n"));
}

TEST_F(Sessions, AreCutBeforeTheirEnds)
{
    history.sessions[0].application = "org.example.player";
    history.stretches[3].hasServiceEnded = true;
    EXPECT_THAT(sessionsText(lines(), 80),
                HasSubstr("      1 2023-11-14 22:13 org.exa…   0:01:10   62 %      2 headset… service ended\n"));
    history.stretches[3].hasServiceEnded = false;
    history.stretches[3].hasVanished = true;
    EXPECT_THAT(sessionsText(lines(), 80),
                HasSubstr("      1 2023-11-14 22:13 org.examp…   0:01:10   62 %      2 headset; … vanished\n"));
}

TEST_F(Sessions, AreCsv)
{
    history.sessions[1].application = "a,\"b\"";
    history.sessions[1].began += 0.25;
    EXPECT_EQ(sessionsCsv(lines()),
              "session,began,application,seconds,device,mean_volume,faults,end\n"
              "1,2023-11-14T22:13:20.000Z,player,70.0,headset; speaker,0.625,2,stopped\n"
              "2,2023-11-14T22:15:00.250Z,\"a,\"\"b\"\"\",3600.5,speaker,0.25,0,running\n"
              "3,2023-11-14T22:16:40.000Z,silent,0.0,,,1,\n");
    history.sessions[0].began = std::numeric_limits<double>::infinity();
    EXPECT_THAT(sessionsCsv(lines()), HasSubstr("\n1,,player,"));
    EXPECT_EQ(sessionsCsv({}), "session,began,application,seconds,device,mean_volume,faults,end\n");
}

TEST_F(Sessions, AreJson)
{
    history.sessions[1].application = "a\"\n";
    history.sessions.resize(2);
    EXPECT_EQ(sessionsJson(lines()),
              R"({"session":1,"began":1700000000,"ended":1700000080,"application":"player",)"
              R"("service":"longformaudio","user":1000,"process":"aplay","process_id":7864,"seconds":70,)"
              R"("muted_seconds":10,"no_volume_seconds":20,"device":"headset; speaker","mean_volume":0.625,)"
              R"("faults":2,"end":"stopped"})"
              "\n"
              R"({"session":2,"began":1700000100,"ended":null,"application":"a\"\n","service":null,"user":null,)"
              R"("process":null,"process_id":null,"seconds":3600.5,"muted_seconds":0,"no_volume_seconds":0,)"
              R"("device":"speaker","mean_volume":0.25,"faults":0,"end":"running"})"
              "\n");
}

TEST_F(Sessions, OneIsItsStretches)
{
    History first = ofFirst();
    first.stretches[3].hasVanished = true;
    EXPECT_EQ(sessionCsv(first),
              "began,seconds,device,format,volume,end\n"
              "2023-11-14T22:13:20.000Z,10.0,speaker,S16LE/44100/2,1.0,\n"
              "2023-11-14T22:13:30.000Z,30.0,headset,S16LE/44100/2,0.5,\n"
              "2023-11-14T22:14:00.000Z,10.0,headset,S16LE/44100/2,0.0,\n"
              "2023-11-14T22:14:20.000Z,20.0,speaker,S16LE/44100/2,,vanished\n");
    first.stretches.resize(1);
    first.faults.resize(1);
    EXPECT_THAT(sessionJson(makeSessionLines(first)[0], first),
                HasSubstr(R"("end":"stopped","stretches":[{"began":1700000000,"seconds":10,"device":"speaker",)"
                          R"("format":"S16LE/44100/2","volume":1,"end":null}],"fault_list":[{"happened":1700000005,)"
                          R"("kind":"IssueDetector","device":null,"late_cycles":3}]})"
                          "\n"));
}

// --- The timeline: 80 seconds on 40 columns

TEST_F(Sessions, OneIsATimeline)
{
    const History first = ofFirst();
    EXPECT_EQ(sessionTimeline(makeSessionLines(first)[0], first, {.width = 49}),
              "session 1, player, longformaudio\n"
              "by       aplay, process 7864 of user 1000\n"
              "played   0:01:10; stopped\n"
              "on       headset; speaker\n"
              "at       62 % on average; muted for 0:00:10\n"
              "faults   2, with 7 late cycles\n"
              "\n"
              "         2023-11-14 22:13:20  2023-11-14 22:14:40\n"
              "playing  █████████████████████████     ██████████\n"
              "volume   █████▄▄▄▄▄▄▄▄▄▄▄▄▄▄▄xxxxx     ----------\n"
              "faults     1                             1       \n");
}

TEST_F(Sessions, OneIsAnAsciiTimelineInOtherLocales)
{
    History first = ofFirst();
    first.sessions[0].application = "Küche";
    first.stretches[3].began += 1.5; // in the second part of a column
    first.stretches[3].seconds -= 1.5;
    const std::string text = sessionTimeline(makeSessionLines(first)[0], first, {.width = 49, .isUTF8 = false});
    EXPECT_THAT(text, HasSubstr("session 1, K?che, longformaudio\n"));
    EXPECT_THAT(text,
                HasSubstr("playing  #########################     +#########\n"
                          "volume   88888444444444444444xxxxx     ----------\n"
                          "faults     1                             1       \n"));
}

TEST_F(Sessions, OneIsDrawnOnEightyColumnsWithoutATerminal)
{
    const History first = ofFirst();
    EXPECT_THAT(sessionTimeline(makeSessionLines(first)[0], first, {.isUTF8 = false}),
                HasSubstr("\nvolume   888888888444444444444444444444444444xxxxxxxxx        ------------------\n"));
}

TEST_F(Sessions, OneWithoutLengthOrWithManyFaultsIsDrawn)
{
    History third;
    third.sessions = {session(3, "", 200)};
    for (int fault = 0; fault < 10; ++fault)
        third.faults.push_back({.session = 3, .happened = begin + 200, .kind = "Error", .device = "", .lateCycles = 0});
    EXPECT_EQ(sessionTimeline(makeSessionLines(third)[0], third, {.width = 20}),
              "session 3, of an un…\n"
              "by       an unknown…\n"
              "played   0:00:00\n"
              "at       -\n"
              "faults   10\n"
              "\n"
              "         2023-11-14…\n"
              "playing             \n"
              "volume              \n"
              "faults   *          \n");
}

TEST(ClockText, HasHoursMinutesAndSeconds)
{
    EXPECT_EQ(clockText(0), "0:00:00");
    EXPECT_EQ(clockText(3'725.9), "1:02:05");
    EXPECT_EQ(clockText(360'000), "100:00:00");
    EXPECT_EQ(clockText(-1), "0:00:00");
}

} // namespace
