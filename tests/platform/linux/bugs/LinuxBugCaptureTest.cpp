// SPDX-License-Identifier: Apache-2.0
// The service as its callers see it: the replies, their times, and the files on the disk.
#include "platform/linux/bugs/LinuxBugCapture.h"

#include "platform/linux/log/LinuxLog.h"
#include "support/ParseJson.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeClock.h"
#include "support/fakes/FakeWorkQueues.h"

#include <algorithm>
#include <gmock/gmock.h>
#include <limits>

namespace platform {
namespace {

namespace fs = std::filesystem;
using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::SizeIs;
using testing::UnorderedElementsAre;

class LinuxBugCaptureTest : public testing::Test {
protected:
    LinuxBugCaptureTest()
    {
        clock.set(1'800'000'000); // 2027-01-15T08:00:00Z
        fs::create_directories(state);
        fs::create_directories(proc / "7");
        support::writeFile(proc / "7/comm", "player\n");
        support::writeFile(proc / "7/status", "State:\tR (running)\n");
        fs::create_directories(proc / "asound/card0");
        support::writeFile(proc / "asound/card0/id", "PCH\n");
    }

    LinuxBugCapture::Sources sources()
    {
        return {.log = log.recentLines(), .clock = clock, .workQueues = queues, .ledger = ledger, .proc = proc};
    }
    Dictionary signature(BugCaptureReporter& reporter, std::string_view process = "player")
    {
        return reporter.makeSignature("Sonalis", "haptics", "Playback", "Gimbo", process, std::nullopt);
    }
    // Requests a snapshot of the player and keeps the reply.
    void request(LinuxBugCapture& capture)
    {
        const auto reporter = capture.makeReporter(); // destroyed before the snapshot is taken
        reporter->requestSnapshot(signature(*reporter), 0, std::nullopt, std::nullopt,
                                  [this](Dictionary response) { responses.push_back(std::move(response)); });
    }
    // The file of the first snapshot.
    [[nodiscard]] std::string file(const std::string& name) const
    {
        return support::readFile(captures / "00000001-20270115T080000Z" / name);
    }
    [[nodiscard]] Dictionary json(const std::string& name) const
    {
        const auto value = support::parseJson(file(name));
        return value && value->dictionary() ? *value->dictionary() : Dictionary{{"no JSON", file(name)}};
    }
    static bool succeeded(const Dictionary& response) { return response.find("success")->asBoolean(); }

    const support::TemporaryDirectory directory;
    const fs::path state = directory.path() / "state";
    const fs::path captures = state / "bug-captures";
    const fs::path proc = directory.path() / "proc";
    LinuxLog log{LogThresholds(), {.journalSocket = {}, .descriptor = -1}};
    support::FakeClock clock;
    support::FakeWorkQueues queues{clock};
    ledger::Ledger ledger;
    std::vector<Dictionary> responses;
};

TEST_F(LinuxBugCaptureTest, WhoAsksDoesNotWaitForTheDisk)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    request(capture);
    EXPECT_THAT(responses, IsEmpty());
    EXPECT_FALSE(fs::exists(captures)) << "nothing is written before the background queue runs";
    queues.runAll();
    ASSERT_THAT(responses, SizeIs(1));
    EXPECT_TRUE(succeeded(responses[0]));
}

TEST_F(LinuxBugCaptureTest, TellsWhereTheSnapshotIs)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    request(capture);
    queues.runAll();
    EXPECT_THAT(responses,
                ElementsAre(Dictionary{{"success", true},
                                       {"snapshot", "00000001-20270115T080000Z"},
                                       {"directory", (captures / "00000001-20270115T080000Z").native()}}));
    EXPECT_EQ(json("response.json"), responses[0]) << "as in the request";
    EXPECT_THAT(log.recentLines().text(),
                HasSubstr("captured a bug: " + (captures / "00000001-20270115T080000Z").native()));
}

TEST_F(LinuxBugCaptureTest, KeepsWhatWasSeenWhatWasSaidAndHowTheDeviceWas)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    ProviderLog(log).error("something is wrong");
    const auto reporter = capture.makeReporter();
    const Dictionary seen = signature(*reporter);
    reporter->requestSnapshot(seen, 2.5, Value("event"), Value(Dictionary{{"a", 1}}), [](const Dictionary&) { });
    queues.runAll();
    EXPECT_EQ(json("signature.json"), seen);
    EXPECT_EQ(json("state/request.json"),
              (Dictionary{{"time", 1'800'000'000},
                          {"systemUptime", 5000},
                          {"duration", 2.5},
                          {"event", "event"},
                          {"payload", Dictionary{{"a", 1}}},
                          {"sender", Value()},
                          {"refusedBefore", 0}}));
    EXPECT_THAT(file("state/log.txt"), HasSubstr("something is wrong\n"));
    EXPECT_EQ(*json("state/processes.json").find("found"), Value(1));
    EXPECT_THAT(file("state/processes.json"), HasSubstr("State:\\tR (running)"));
    EXPECT_EQ(json("state/sound.json"), (Dictionary{{"card0/id", Array{"PCH"}}}));
}

TEST_F(LinuxBugCaptureTest, KeepsHowTheServiceWasWhenItAsked)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log), {.mostAtOnce = 1});
    int timesAsked = 0;
    capture.setStateDescription([&timesAsked] { return Value(Dictionary{{"sessions", ++timesAsked}}); });
    request(capture);
    EXPECT_EQ(timesAsked, 1) << "immediately, because the state differs later";
    queues.runAll();
    EXPECT_EQ(json("state/service.json"), (Dictionary{{"sessions", 1}}));
    request(capture);
    EXPECT_EQ(timesAsked, 1) << "a refusal needs none";
    queues.runAll();
}

TEST_F(LinuxBugCaptureTest, KeepsTheProcessWhoseMessageWasHandledBeforeOthersOfItsName)
{
    fs::copy(proc / "7", proc / "70");
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    {
        const BugCapture::SenderScope sender(70);
        request(capture);
    }
    queues.runAll();
    const Array processes = *json("state/processes.json").find("processes")->array();
    ASSERT_EQ(processes.size(), 2U);
    EXPECT_EQ(*processes[0].dictionary()->find("pid"), Value(70)) << "the sender";
    EXPECT_EQ(*processes[1].dictionary()->find("pid"), Value(7));
    EXPECT_EQ(*json("state/request.json").find("sender"), Value(70));
}

TEST_F(LinuxBugCaptureTest, KeepsEvidenceOfADeviceWithoutProcOrSound)
{
    auto without = sources();
    without.proc = directory.path() / "missing";
    LinuxBugCapture capture(state, without, ProviderLog(log));
    request(capture);
    queues.runAll();
    EXPECT_TRUE(succeeded(responses.at(0)));
    EXPECT_EQ(*json("state/processes.json").find("found"), Value(0));
    EXPECT_EQ(json("state/sound.json"), Dictionary());
}

TEST_F(LinuxBugCaptureTest, NamesFromClientsNeverLeaveTheDirectory)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    const auto reporter = capture.makeReporter();
    for (const std::string_view name : {"../../escaped", "/etc/passwd", "a\nb", "..", "", "7/../8"}) {
        reporter->requestSnapshot(signature(*reporter, name), 0, std::nullopt, std::nullopt,
                                  [this](Dictionary response) { responses.push_back(std::move(response)); });
        queues.runAll();
    }
    EXPECT_THAT(responses, SizeIs(6));
    EXPECT_TRUE(std::ranges::all_of(responses, succeeded));
    const std::vector<fs::path> beside(fs::directory_iterator(state), {});
    EXPECT_THAT(beside, UnorderedElementsAre(captures, state / "bug-captures.last"));
    for (const auto& entry : fs::directory_iterator(captures))
        EXPECT_THAT(entry.path().filename().native(), testing::MatchesRegex("0000000[1-6]-20270115T080000Z"));
    EXPECT_EQ(*json("signature.json").find("detectedProcess"), Value("../../escaped")) << "as text it is kept";
}

TEST_F(LinuxBugCaptureTest, WhatJsonCannotSayIsKeptAsText)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    const auto reporter = capture.makeReporter();
    reporter->requestSnapshot({{"value", std::numeric_limits<double>::quiet_NaN()}}, 0, std::nullopt, std::nullopt,
                              [](const Dictionary&) { });
    queues.runAll();
    EXPECT_EQ(support::parseJson(file("signature.json")), Value(R"({"value":nan})"));
}

TEST_F(LinuxBugCaptureTest, TakesOneSnapshotAfterTheOther)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    request(capture);
    request(capture);
    request(capture);
    EXPECT_EQ(queues.pending(), 1U) << "the queue is not crowded out";
    queues.runAll();
    EXPECT_EQ(std::ranges::count_if(responses, succeeded), 3);
    EXPECT_EQ(std::distance(fs::directory_iterator(captures), {}), 3);
    request(capture);
    queues.runAll();
    EXPECT_THAT(responses, SizeIs(4)) << "and begins again";
    EXPECT_EQ(ledger.account()[ledger::Counter::CapturesTaken], 4U);
}

TEST_F(LinuxBugCaptureTest, CountsTheSnapshotsThatMakeRoomForLaterOnes)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log), {.folder = {.mostCaptures = 2}});
    for (int each = 0; each < 5; ++each)
        request(capture);
    queues.runAll();
    EXPECT_EQ(ledger.account()[ledger::Counter::CapturesEvicted], 3U);
}

TEST_F(LinuxBugCaptureTest, RefusesSnapshotsThatComeTooThick)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log), {.mostAtOnce = 2, .seconds = 60});
    for (int each = 0; each < 5; ++each)
        request(capture);
    EXPECT_THAT(responses, IsEmpty()) << "refusals are answered later, too";
    queues.runAll();
    EXPECT_THAT(responses, SizeIs(5)) << "each is answered";
    EXPECT_EQ(std::ranges::count_if(responses, succeeded), 2);
    EXPECT_EQ(ledger.account()[ledger::Counter::CapturesRefused], 3U);
    EXPECT_EQ(std::ranges::count(
                  responses,
                  Dictionary{{"success", false}, {"reason", "too many snapshots were asked for: wait some minutes"}}),
              3);

    responses.clear();
    clock.advance(59);
    request(capture);
    queues.runAll();
    EXPECT_FALSE(succeeded(responses.at(0)));
    clock.advance(1);
    request(capture);
    queues.runAll();
    EXPECT_TRUE(succeeded(responses.at(1)));
    const std::string third = support::readFile(captures / "00000003-20270115T080100Z/state/request.json");
    EXPECT_EQ(*support::parseJson(third)->dictionary()->find("refusedBefore"), Value(4)) << "it is not forgotten";
}

TEST_F(LinuxBugCaptureTest, RefusesSnapshotsWhileAsManyWaitForTheDiskHoweverLongThatTakes)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log), {.mostAtOnce = 2, .seconds = 60});
    request(capture);
    request(capture);
    clock.advance(1000);
    request(capture);
    queues.runAll();
    EXPECT_EQ(std::ranges::count_if(responses, succeeded), 2);
    EXPECT_EQ(ledger.account()[ledger::Counter::CapturesRefused], 1U);
    request(capture);
    queues.runAll();
    EXPECT_EQ(std::ranges::count_if(responses, succeeded), 3) << "none waits any more";
}

TEST_F(LinuxBugCaptureTest, AClockThatIsSetBackDoesNotMakeItRefuseForEver)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log), {.mostAtOnce = 1, .seconds = 60});
    request(capture);
    queues.runAll();
    clock.set(0);
    clock.setSystemUptime(5060);
    request(capture);
    queues.runAll();
    EXPECT_EQ(std::ranges::count_if(responses, succeeded), 2);
}

TEST_F(LinuxBugCaptureTest, LeavesTheDiskToOthersWhenThereIsLittleRoom)
{
    LinuxBugCapture capture(state, sources(), ProviderLog(log), {.folder = {.bytesLeftFree = std::uint64_t{1} << 60}});
    request(capture);
    queues.runAll();
    EXPECT_THAT(responses,
                ElementsAre(Dictionary{{"success", false}, {"reason", "less than 1099511627776 MiB are free"}}));
    EXPECT_EQ(ledger.account()[ledger::Counter::CapturesFailed], 1U);
    EXPECT_EQ(ledger.account()[ledger::Counter::CapturesTaken], 0U);
    EXPECT_FALSE(fs::exists(captures)) << "this is checked first";
    EXPECT_THAT(log.recentLines().text(), HasSubstr("a bug was not captured in " + captures.native()));
}

TEST_F(LinuxBugCaptureTest, SaysWhatIsWrongWithTheDisk)
{
    support::writeFile(captures, "a file in its place");
    LinuxBugCapture capture(state, sources(), ProviderLog(log));
    request(capture);
    queues.runAll();
    EXPECT_THAT(responses, ElementsAre(Dictionary{{"success", false}, {"reason", "Not a directory"}}));
    fs::remove(captures);
    request(capture);
    queues.runAll();
    EXPECT_TRUE(succeeded(responses.at(1))) << "goes on when the problem is solved";
}

TEST_F(LinuxBugCaptureTest, RemovesLeftoversWhenItStarts)
{
    fs::create_directories(captures / ".new/state");
    const LinuxBugCapture capture(state, sources(), ProviderLog(log));
    EXPECT_FALSE(fs::exists(captures / ".new"));
}

} // namespace
} // namespace platform
