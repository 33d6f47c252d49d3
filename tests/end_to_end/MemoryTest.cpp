// What the service's memory does when long sessions end, as the system sees it.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "support/Sanitizers.h"

#include <fstream>
#include <gtest/gtest.h>
#include <optional>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;

constexpr int playback = 4;
constexpr int typeStart = 1;
constexpr double megabyte = 1024; // in the kernel's unit

class MemoryTest : public testing::Test {
protected:
    void SetUp() override
    {
        KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
        kestod.start();
        client.emplace(kestod.socketPath());
        play(1, 100); // whatever is there from the first session on
    }

    // "VmRSS", or "VmHWM" for the most since `forgetMostMemory`.
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

    // Begins a session and sends so many messages, each with another volume.
    void play(int reporter, int count)
    {
        constexpr int unanswered = 4000; // more than a thread that helps would do
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
    void awaitAnswers()
    {
        while (client->nextReply().value()[0] != foundation::Value(last)) { }
    }

    Kestod kestod{Kestod::Files{{"device.toml", "InternalBuild = true\n"}, {"analytics.toml", "used = []\n"}},
                  {{"KESTO_LOG", "error"}}};
    std::optional<WireClient> client;
    std::uint64_t last = 0; // call
};

TEST_F(MemoryTest, StaysBelowTwiceTheBoundOfVolumeEventsWhileASessionEnds)
{
    constexpr int changes = 200'000; // more than have room within the bound
    constexpr double mostMegabytes = 128;
    play(2, changes);
    const double before = megabytes("VmRSS");
    forgetMostMemory();
    end(2);
    EXPECT_LT(megabytes("VmHWM") - before, mostMegabytes);
}

} // namespace
} // namespace end_to_end
