// SPDX-License-Identifier: Apache-2.0
// What a real service counted, from a shell: while it runs, after it ended, and when there is nothing to read.
#include "end_to_end/Disks.h"
#include "end_to_end/Kestod.h"
#include "end_to_end/Sums.h"
#include "end_to_end/WireClient.h"
#include "sdk/FakeService.h"
#include "support/AnotherProcess.h"
#include "tools/kesto/Tool.h"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <rapidjson/document.h>
#include <sys/prctl.h>
#include <unistd.h>
#include <utility>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using foundation::Array;
using foundation::Dictionary;
using testing::HasSubstr;
using testing::MatchesRegex;
using testing::Pair;
using testing::StartsWith;

class StatusCommand : public testing::Test {
protected:
    StatusCommand() { tool.setVariable("KESTO_SOCKET=" + kestod.socketPath().native()); }

    // Messages to a started session, one of them twice, and one to a session that is not started. The end of the
    // client would be another message, so it stays.
    end_to_end::WireClient use()
    {
        end_to_end::WireClient client(kestod.socketPath());
        client.ask(end_to_end::Create, 1);
        client.call(end_to_end::Start, 1);
        client.ask(end_to_end::SendMessage, Dictionary{{"a", 1}}, 4, 1, Array{1});
        client.ask(end_to_end::SendMessage, Dictionary{{"a", 1}}, 4, 1, Array{1});
        client.ask(end_to_end::Create, 2); // and never started
        client.ask(end_to_end::SendMessage, Dictionary{{"a", 2}}, 4, 1, Array{2});
        return client;
    }
    // A message to more sessions than may get one of its size.
    void sendTooMuch()
    {
        constexpr std::size_t size = 900 * 1024;
        constexpr int sessions = 100;
        end_to_end::WireClient client(kestod.socketPath());
        std::vector<foundation::Value> reporters;
        for (int reporter = 1; reporter <= sessions; ++reporter) {
            client.ask(end_to_end::Create, reporter);
            reporters.emplace_back(reporter);
        }
        client.ask(end_to_end::SendMessage, Dictionary{{"a", std::string(size, 'x')}}, 4, 1, Array(reporters));
    }
    // A payload that JSON cannot express is an event that is lost.
    void loseAnEvent()
    {
        end_to_end::WireClient client(kestod.socketPath());
        client.ask(end_to_end::Create, 1);
        client.call(end_to_end::Start, 1);
        client.ask(end_to_end::SendMessage, Dictionary{{"a", std::nan("")}}, 4, 1, Array{1});
    }
    // Another user's process of that name sends more than a full disk takes.
    // There is room again before it goes, so that no event of its end is lost.
    void overfillAs(const char* name, const end_to_end::SmallDisk& disk) const
    {
        support::runInAnotherProcess([&] {
            ASSERT_EQ(::setgid(stranger), 0);
            ASSERT_EQ(::setuid(stranger), 0);
            ASSERT_EQ(::prctl(PR_SET_NAME, name), 0);
            end_to_end::WireClient client(kestod.socketPath());
            client.ask(end_to_end::Create, 2);
            client.ask(end_to_end::SetConfiguration, Dictionary{{"HostApplicationDisplayID", "org.example.a"}}, 2);
            client.call(end_to_end::Start, 2);
            client.ask(end_to_end::Validate, 2);
            for (int number = 0; number < 100; ++number)
                client.ask(end_to_end::SendMessage, Dictionary{{"n", number}, {"text", std::string(4000, 'x')}}, 4, 1,
                           Array{2});
            disk.free();
        });
    }
    void letStrangersIn() const
    {
        for (const char* folder : {"", "run"})
            fs::permissions(kestod.directory() / folder, fs::perms(0755));
        fs::permissions(kestod.socketPath(), fs::perms(0666));
    }
    [[nodiscard]] fs::path ledgerFile() const { return kestod.directory() / "state" / "analytics.ledger"; }
    [[nodiscard]] rapidjson::Document json(int exitStatus) const
    {
        const Finished finished = tool.run({"status", "--json"});
        EXPECT_EQ(finished.status, exitStatus);
        EXPECT_EQ(finished.errors, "");
        rapidjson::Document document;
        document.Parse(finished.output.c_str());
        EXPECT_TRUE(document.IsObject()) << finished.output;
        return document;
    }

    static constexpr unsigned stranger = 65534;
    end_to_end::Kestod kestod;
    Tool tool{kestod.directory()};
};

TEST_F(StatusCommand, OfAHealthyServiceEndsWith0AndHasAllNumbersAsJson)
{
    kestod.startAndAwait();
    const auto client = use();
    const auto status = json(0);
    EXPECT_TRUE(status["running"].GetBool());
    EXPECT_THAT(status["version"].GetString(), MatchesRegex("[0-9]+\\.[0-9]+\\.[0-9]+"));
    EXPECT_FALSE(status["internalBuild"].GetBool());
    EXPECT_EQ(status["deliveries"].GetUint64(), 3U);
    EXPECT_EQ(status["recorded"].GetUint64(), 1U);
    EXPECT_EQ(status["repeated"].GetUint64(), 1U);
    EXPECT_EQ(status["inert"].GetUint64(), 1U);
    EXPECT_EQ(status["refused"]["memory"].GetUint64(), 0U);
    EXPECT_EQ(status["events"].GetUint64(), status["kept"].GetUint64());
    EXPECT_EQ(status["kept"].GetUint64(), status["stored"].GetUint64());
    EXPECT_EQ(status["stored"].GetUint64(), status["store"]["events"].GetUint64());
    EXPECT_GE(status["events"].GetUint64(), 5U);
    EXPECT_EQ(status["sinceStart"]["deliveries"].GetUint64(), 3U);
    EXPECT_EQ(status["rates"]["deliveries"].GetUint64(), 3U);
    EXPECT_EQ(status["calls"]["sendMessage"].GetUint64(), 3U);
    EXPECT_EQ(status["calls"]["status"].GetUint64(), 1U);
    EXPECT_TRUE(status["who"]["lost"].Empty());
}

TEST_F(StatusCommand, SaysWhoTookTheTime)
{
    const auto begin = std::chrono::steady_clock::now();
    kestod.startAndAwait();
    const auto client = use();
    const auto all = std::chrono::steady_clock::now() - begin;
    const auto status = json(0);
    const auto& works = status["sinceStart"]["who"]["time"];
    const auto* const found = std::ranges::find_if(
        works.Begin(), works.End(), [](const auto& work) { return work["process"] == "kesto_tool_test"; });
    ASSERT_NE(found, works.End());
    const auto& work = *found;
    EXPECT_EQ(work["user"].GetUint64(), ::geteuid());
    EXPECT_EQ(work["calls"].GetUint64(), 6U);
    EXPECT_EQ(work["bytes"].GetUint64(), 69U) << "3 calls of 8 and 3 of 15 bytes";
    EXPECT_GT(work["microseconds"].GetUint64(), 0U);
    EXPECT_LE(std::chrono::microseconds(work["microseconds"].GetUint64()), all);
    EXPECT_THAT(tool.run({"status"}).output, HasSubstr("    69 B  kesto_tool_test\n"));
}

TEST_F(StatusCommand, AfterALossEndsWith1AndSaysWhyAndWhatToDo)
{
    kestod.startAndAwait();
    loseAnEvent();
    EXPECT_EQ(json(1)["lost"]["notJson"].GetUint64(), 2U);
    const Finished text = tool.run({"status"});
    EXPECT_EQ(text.status, 1);
    EXPECT_THAT(text.output,
                HasSubstr("lost.notJson                                       2                 2\n"
                          "  because: their payloads hold NaN or infinity, which JSON cannot express\n"
                          "  to do:   correct the programs that send them\n"));
}

TEST_F(StatusCommand, SaysWhoseMessagesWereRefused)
{
    kestod.startAndAwait();
    sendTooMuch();
    const auto status = json(1);
    EXPECT_GT(status["refused"]["size"].GetUint64(), 0U);
    const auto& who = status["who"]["refused"][0];
    EXPECT_EQ(who["user"].GetUint64(), ::geteuid());
    EXPECT_STREQ(who["process"].GetString(), "kesto_tool_test");
    EXPECT_EQ(who["count"].GetUint64(), status["refused"]["size"].GetUint64());
    EXPECT_THAT(tool.run({"status"}).output, HasSubstr("  kesto_tool_test"));
}

TEST_F(StatusCommand, SaysWhoseEventsWereLostToThoseWhoMayKnow)
{
    const end_to_end::SmallDisk disk(kestod.directory() / "state", "2m");
    if (!disk)
        GTEST_SKIP() << "needs the right to mount";
    kestod.startAndAwait();
    letStrangersIn();
    loseAnEvent();
    EXPECT_TRUE(end_to_end::waitUntil([&] { return kestod.events("*uptime").size() == 2; })) << "of all clients so far";
    disk.fill();
    overfillAs("recorder", disk);

    const auto status = json(1);
    const std::uint64_t lostToDisk = status["lost"]["diskFull"].GetUint64();
    EXPECT_GT(lostToDisk, 0U);
    EXPECT_EQ(status["lost"]["notJson"].GetUint64(), 2U);
    EXPECT_EQ(end_to_end::readLedger(kestod).sum(ledger::Charge::Lost), lostToDisk + 2);
    const auto& lost = status["who"]["lost"];
    EXPECT_STREQ(lost[0]["application"].GetString(), "org.example.a");
    std::map<std::pair<unsigned, std::string>, std::uint64_t> byProcess; // its end may cost the recorder an event, too
    for (const auto& culprit : lost.GetArray())
        byProcess[{culprit["user"].GetUint(), culprit["process"].GetString()}] += culprit["count"].GetUint64();
    EXPECT_THAT(byProcess,
                testing::UnorderedElementsAre(Pair(Pair(stranger, "recorder"), lostToDisk),
                                              Pair(Pair(::geteuid(), "kesto_tool_test"), 2U)));

    tool.giveUpRights();
    EXPECT_FALSE(json(1).HasMember("who"));
    kestod.kill();
}

TEST_F(StatusCommand, AfterARestartIsHealthyAgainAndStillKnowsTheLoss)
{
    kestod.startAndAwait();
    loseAnEvent();
    kestod.kill();
    kestod.startAndAwait();
    const auto status = json(0);
    EXPECT_EQ(status["lost"]["notJson"].GetUint64(), 2U);
    EXPECT_EQ(status["sinceStart"]["lost"]["notJson"].GetUint64(), 0U);
}

TEST_F(StatusCommand, WithoutTheServiceEndsWith3AndShowsWhatItLeft)
{
    kestod.startAndAwait();
    const auto client = use();
    kestod.kill();
    const auto status = json(3);
    EXPECT_FALSE(status["running"].GetBool());
    EXPECT_EQ(status["deliveries"].GetUint64(), 3U);
    EXPECT_TRUE(status["sinceStart"].IsNull());
    const Finished text = tool.run({"status"});
    EXPECT_EQ(text.status, 3);
    EXPECT_THAT(text.output, StartsWith("kestod does not run; this is what it counted before\n"));
    const Finished metrics = tool.run({"status", "--prometheus"});
    EXPECT_EQ(metrics.status, 3);
    EXPECT_THAT(metrics.output, HasSubstr("\nkesto_up 0\n"));
}

TEST_F(StatusCommand, WithoutTheServiceAndItsLedgerSaysSo)
{
    const Finished finished = tool.run({"status"});
    EXPECT_EQ(finished.status, 3);
    EXPECT_EQ(finished.output, "");
    EXPECT_EQ(finished.errors,
              "kesto status: the service does not run, and left no status: cannot read " + ledgerFile().native()
                  + ": No such file or directory\n");
}

TEST_F(StatusCommand, OfALedgerThatIsDamagedOrOfAnotherVersionSaysSo)
{
    kestod.startAndAwait();
    static_cast<void>(use()); // the service listens before its ledger is there
    kestod.kill();
    const auto expectRefusal = [&](const char* what) {
        SCOPED_TRACE(what);
        const Finished finished = tool.run({"status", "--json"});
        EXPECT_EQ(finished.status, 3);
        EXPECT_EQ(finished.output, "");
        EXPECT_EQ(finished.errors,
                  "kesto status: the service does not run, and " + ledgerFile().native()
                      + " is damaged or of another version\n");
    };
    const auto size = fs::file_size(ledgerFile());
    fs::resize_file(ledgerFile(), size - 1);
    expectRefusal("cut off");
    fs::resize_file(ledgerFile(), size);
    std::fstream(ledgerFile(), std::ios::in | std::ios::out).write("KSTOLDG9", 8);
    expectRefusal("another version");
    std::ofstream(ledgerFile()) << std::string(size, 'x');
    expectRefusal("other bytes");
    fs::resize_file(ledgerFile(), 0);
    expectRefusal("empty");
}

TEST_F(StatusCommand, ToAStrangerDoesNotSayWhoDidIt)
{
    if (::geteuid() != 0)
        GTEST_SKIP() << "only root can become another user";
    kestod.startAndAwait();
    sendTooMuch();
    letStrangersIn();
    tool.giveUpRights();
    const auto status = json(1);
    EXPECT_GT(status["refused"]["size"].GetUint64(), 0U);
    EXPECT_FALSE(status.HasMember("who"));
    EXPECT_FALSE(status["sinceStart"].HasMember("who"));
}

TEST_F(StatusCommand, WatchedPrintsALineForEachLookOverOneConnection)
{
    kestod.startAndAwait();
    const std::string lines = tool.print({"status", "--watch", "--count", "3", "--interval", "0.01"});
    EXPECT_THAT(lines,
                MatchesRegex("([12] connections?, 0 sessions; 0 messages and [0-9] events? in the minute to "
                             "[0-9:]+; nothing lost\n)+"));
    EXPECT_EQ(std::ranges::count(lines, '\n'), 3);
    const std::string objects = tool.print({"status", "--watch", "--json", "--count", "2", "--interval", "0.01"});
    EXPECT_EQ(std::ranges::count(objects, '\n'), 2);
    EXPECT_EQ(json(0)["connections"]["accepted"].GetUint64(), 4U) << "one to see that it listens, and one for each run";
}

TEST_F(StatusCommand, WatchedGoesOnWhenTheServiceEndsAndStartsAgain)
{
    kestod.startAndAwait();
    auto watching = tool.start({"status", "--watch", "--interval", "0.01"});
    EXPECT_THAT(watching->waitForOutput("nothing lost\n"), HasSubstr("nothing lost\n"));
    kestod.kill();
    EXPECT_THAT(watching->waitForOutput("kestod does not run\n"), HasSubstr("kestod does not run\n"));
    kestod.startAndAwait();
    EXPECT_TRUE(end_to_end::waitUntil([&] { return watching->output().ends_with("nothing lost\n"); }));
}

TEST_F(StatusCommand, PassesPromtool)
{
    if (tool.runShell("command -v promtool >/dev/null").status != 0)
        GTEST_SKIP() << "promtool is not installed";
    kestod.startAndAwait();
    loseAnEvent();
    const Finished checked = tool.runShell("$kesto status --prometheus | promtool check metrics");
    EXPECT_EQ(checked.status, 0);
    EXPECT_EQ(checked.output + checked.errors, "");
}

TEST_F(StatusCommand, OfAServiceThatSendsSomethingElseIsAnError)
{
    const Dictionary whole{{"running", true},
                           {"version", "9.8.7"},
                           {"internalBuild", false},
                           {"now", Dictionary()},
                           {"sinceStart", Dictionary()}};
    for (const std::string_view missing : {"", "running", "version", "internalBuild", "now", "sinceStart"}) {
        Dictionary::Entries entries;
        for (const auto& [key, value] : whole)
            if (key.view() != missing)
                entries.push_back({key, value});
        const sdk_test::FakeService service(kestod.socketPath(), [&](sdk_test::Peer& peer, const Array& call) {
            peer.answer(sdk_test::callNumber(call), {Dictionary(entries)});
        });
        const Finished finished = tool.run({"status"});
        EXPECT_EQ(finished.status, missing.empty() ? 0 : 3) << missing;
        EXPECT_EQ(finished.errors.contains("does not answer: it sent something else than a status"), !missing.empty())
            << finished.errors;
    }
}

TEST_F(StatusCommand, OfAPathThatNoSocketCanHaveIsAnError)
{
    const Finished finished = tool.run({"status", "--socket", kestod.directory() / std::string(200, 'x')});
    EXPECT_EQ(finished.status, 3);
    EXPECT_THAT(finished.errors, HasSubstr("does not answer: the path is too long for a socket"));
}

} // namespace
} // namespace kesto_tool
