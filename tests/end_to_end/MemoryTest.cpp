// SPDX-License-Identifier: Apache-2.0
// The service's memory when long sessions end, as the system sees it: how large it becomes, and that the system gets it
// back.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"
#include "support/Sanitizers.h"

#include <deque>
#include <fstream>
#include <gtest/gtest.h>
#include <optional>
#include <thread>
#include <unistd.h>

namespace end_to_end {
namespace {

using support::playback;
using support::typeStart;

using foundation::Array;
using foundation::Dictionary;

constexpr double megabyte = 1024; // in the kernel's unit

class MemoryTest : public testing::Test {
protected:
    void SetUp() override
    {
        KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
        kestod.start();
        client.emplace(kestod.socketPath());
        play(1, 100); // allocates the memory that stays from the first session on
    }

    // "VmRSS", or "VmHWM" for the maximum since `forgetMostMemory`.
    [[nodiscard]] double megabytes(std::string_view what) const
    {
        std::ifstream status("/proc/" + std::to_string(kestod.process()) + "/status");
        for (std::string line; std::getline(status, line);)
            if (line.starts_with(what))
                return std::stod(line.substr(what.size() + 1)) / megabyte;
        ADD_FAILURE() << "the system does not tell " << what;
        return 0;
    }
    void forgetMostMemory() const { std::ofstream("/proc/" + std::to_string(kestod.process()) + "/clear_refs") << "5"; }

    // Begins a session and sends so many messages, each with a different volume.
    void play(int reporter, int count)
    {
        constexpr int unanswered = 4000; // more than a helping thread would run
        client->ask(Create, reporter);
        client->call(Start, reporter);
        for (int number = 0; number <= count; ++number) {
            last = client->call(SendMessage,
                                Dictionary{{"session_output_running", true},
                                           {"PomoSessionVolume", number % 2},
                                           {"kestoreporting_timestamp", number}},
                                playback, typeStart, Array{reporter});
            if (number % unanswered == 0 || number == count)
                awaitAnswers();
        }
    }
    void end(int reporter)
    {
        client->call(Stop, reporter);
        last = client->call(Destroy, reporter);
        awaitAnswers();
    }
    // The same at the end of a burst that is too long for the connection thread to help with, so that the queue's own
    // thread runs it.
    void endInABurst(int reporter)
    {
        constexpr int burst = 4000;
        client->sendFrame(Array{0, static_cast<int>(GetServiceName), 99}, burst);
        end(reporter);
    }
    void awaitAnswers()
    {
        while (client->nextReply().value()[0] != foundation::Value(last)) { }
    }

    // The processor time that the service has taken.
    [[nodiscard]] std::chrono::milliseconds timeWorked() const
    {
        std::ifstream stat("/proc/" + std::to_string(kestod.process()) + "/stat");
        std::string skipped;
        for (int field = 0; field < 13; ++field)
            stat >> skipped;
        long user = 0;
        long system = 0;
        stat >> user >> system;
        return std::chrono::milliseconds((user + system) * 1000 / ::sysconf(_SC_CLK_TCK));
    }

    // Waits until the system has the memory again that the service did not have before.
    void expectBack(double before) const
    {
        constexpr double mostMegabytes = 16;
        constexpr std::chrono::seconds most(10);
        const auto ended = std::chrono::steady_clock::now();
        EXPECT_TRUE(waitUntil([&] { return megabytes("VmRSS") - before < mostMegabytes; }))
            << megabytes("VmRSS") << " MB, and there were " << before;
        EXPECT_LT(std::chrono::steady_clock::now() - ended, most);
    }
    // Makes three sessions end, and waits until the system has their memory and the service sleeps again.
    template <typename End> void expectBackAfter(End endSession)
    {
        constexpr int changes = 60'000;
        const double before = megabytes("VmRSS");
        for (int reporter = 2; reporter <= 4; ++reporter) {
            play(reporter, changes);
            endSession(reporter);
        }
        expectBack(before);
        constexpr std::chrono::milliseconds watched(500);
        constexpr std::chrono::milliseconds mostOfIt(100);
        const auto worked = timeWorked();
        std::this_thread::sleep_for(watched);
        EXPECT_LT(timeWorked() - worked, mostOfIt);
    }

    Kestod kestod{Kestod::Files{{"device.toml", "InternalBuild = true\n"}, {"analytics.toml", "used = []\n"}},
                  {{"KESTO_LOG", "error"}}};
    std::optional<WireClient> client;
    std::uint64_t last = 0; // call
};

TEST_F(MemoryTest, StaysBelowTwiceTheBoundOfVolumeEventsWhileASessionEnds)
{
    constexpr int changes = 230'000; // more than the limit has room for
    constexpr double mostMegabytes = 128;
    play(2, changes);
    const double before = megabytes("VmRSS");
    forgetMostMemory();
    end(2);
    EXPECT_LT(megabytes("VmHWM") - before, mostMegabytes);
}

TEST_F(MemoryTest, GoesBackToTheSystemSecondsAfterSessionsEnded)
{
    expectBackAfter([&](int reporter) { end(reporter); });
}

TEST_F(MemoryTest, GoesBackToTheSystemWhicheverThreadEndedTheSessions)
{
    expectBackAfter([&](int reporter) { endInABurst(reporter); });
}

TEST_F(MemoryTest, GoesBackToTheSystemAfterClientsWithLargeConfigurationsGo)
{
    constexpr int configurations = 160; // more than the limits have room for
    constexpr double muchOfThem = 64;
    const double before = megabytes("VmRSS");
    {
        const Dictionary configuration{{"text", std::string(900'000, 'x')}};
        std::deque<WireClient> clients;
        for (int number = 2; number <= 4; ++number) {
            WireClient& each = clients.emplace_back(kestod.socketPath());
            for (int reporter = 1; reporter <= configurations; ++reporter) {
                each.ask(Create, reporter);
                each.ask(SetConfiguration, configuration, reporter);
            }
        }
        EXPECT_GT(megabytes("VmRSS") - before, muchOfThem);
    }
    expectBack(before);
}

TEST_F(MemoryTest, GoesBackToTheSystemAfterClientsThatLeaveInTheMiddleOfAFrame)
{
    constexpr int count = 64;
    constexpr double muchOfThem = 32;
    const double before = megabytes("VmRSS");
    {
        std::deque<WireClient> clients;
        for (int number = 0; number < count; ++number)
            clients.emplace_back(kestod.socketPath())
                .sendBytes(std::string{0, 0, 0x10, 0} + std::string(1'000'000, 'x')); // of 2^20 bytes
        EXPECT_TRUE(waitUntil([&] { return megabytes("VmRSS") - before > muchOfThem; }));
    }
    expectBack(before);
}

} // namespace
} // namespace end_to_end
