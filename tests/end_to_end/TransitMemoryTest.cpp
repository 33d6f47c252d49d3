// SPDX-License-Identifier: Apache-2.0
// As many connections as the service allows, whose clients send and never read: the service's memory stays bounded, and
// others are served.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "platform/linux/connection/SocketClient.h"
#include "support/Sanitizers.h"

#include <algorithm>
#include <deque>
#include <fstream>
#include <gtest/gtest.h>
#include <string>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;
using support::framed;
using support::SocketClient;

// 16 MiB for all: what is on its way takes at most 12 of them for the clients of one user. Beside that, a connection
// may have 2 KiB, its object and what it remembers.
class TransitMemoryTest : public testing::Test {
protected:
    static constexpr int connections = 700;
    static constexpr double mostMegabytes = 40; // the allocator keeps some more

    void SetUp() override
    {
        KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
        kestod.startAndAwait();
    }

    [[nodiscard]] double megabytes(std::string_view what) const
    {
        std::ifstream status("/proc/" + std::to_string(kestod.process()) + "/status");
        for (std::string line; std::getline(status, line);)
            if (line.starts_with(what))
                return std::stod(line.substr(what.size() + 1)) / 1024;
        ADD_FAILURE() << "the system does not tell " << what;
        return 0;
    }

    // Lets all clients write the bytes, over and over, until no socket takes more for a while, or for some seconds.
    void flood(std::string_view bytes)
    {
        for (int number = 0; number < connections; ++number)
            clients.emplace_back(kestod.socketPath());
        std::vector<std::size_t> places(clients.size());
        constexpr std::chrono::milliseconds quiet(300);
        constexpr std::chrono::seconds longest(4);
        auto last = std::chrono::steady_clock::now();
        for (const auto end = last + longest; std::chrono::steady_clock::now() < std::min(end, last + quiet);)
            for (std::size_t place = 0; place < clients.size(); ++place)
                if (const std::size_t count = clients[place].writeWhatFits(bytes.substr(places[place]))) {
                    places[place] = (places[place] + count) % bytes.size();
                    last = std::chrono::steady_clock::now();
                }
    }

    void expectBoundedAndServing(double before)
    {
        const double more = megabytes("VmHWM") - before;
        RecordProperty("megabytes", std::to_string(more));
        EXPECT_LT(more, mostMegabytes);
        WireClient modest(kestod.socketPath());
        for (int call = 0; call < 10; ++call)
            EXPECT_EQ(modest.ask(GetServiceName, 1)[1], null);
    }

    Kestod kestod{Kestod::Files{{"limits.toml", "memory_mb = 16\n"}, {"analytics.toml", "used = []\n"}},
                  {{"KESTO_LOG", "error"}}};
    std::deque<SocketClient> clients;
};

TEST_F(TransitMemoryTest, IsBoundedWhenNobodyReadsAnswers)
{
    constexpr int sessions = 4000;
    WireClient owner(kestod.socketPath());
    for (int reporter = 1; reporter <= sessions; ++reporter)
        owner.ask(Create, reporter);
    const double before = megabytes("VmRSS");
    flood(framed(Array{1, static_cast<int>(GetAllReporters)}));
    expectBoundedAndServing(before);
}

TEST_F(TransitMemoryTest, IsBoundedWhenEachFrameComesOnlyInPart)
{
    const double before = megabytes("VmRSS");
    std::string part =
        framed(Array{1, static_cast<int>(SetConfiguration), Dictionary{{"text", std::string(900'000, 'x')}}, Array()});
    part.resize(800'000);
    flood(part);
    expectBoundedAndServing(before);
}

TEST_F(TransitMemoryTest, IsBoundedWhenCallsTakeManyTimesTheirBytes)
{
    const double before = megabytes("VmRSS");
    const std::vector<foundation::Value> empty(60'000, foundation::Value(Array()));
    flood(framed(Array{1, static_cast<int>(SendMessage), Dictionary{{"list", Array(empty)}}, 1, 1, Array{1}}));
    expectBoundedAndServing(before);
}

} // namespace
} // namespace end_to_end
