// SPDX-License-Identifier: Apache-2.0
// The service with few descriptors: clients take their part and no more, and its own work goes on.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "kesto/channels.hpp"
#include "support/MessageKinds.h"

#include <deque>
#include <gmock/gmock.h>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using testing::SizeIs;

TEST(DescriptorsTest, With64OfThemAUserGets24ConnectionsAndTheServiceKeepsItsOwn)
{
    constexpr std::size_t mostOfOneUser = 24; // of 64, 32 are for clients; of these a fourth for other users
    Kestod kestod(Kestod::Files{{"device.toml", "InternalBuild = true\n"}});
    kesto::PublisherOptions options;
    options.root = kestod.directory() / "run/channels";
    kesto::Publisher publisher;
    kesto::SimpleChannel late;
    ASSERT_EQ(publisher.open(options), kesto::Status::Ok);
    ASSERT_EQ(late.create(publisher, {"mixer", "Tx", "", "late cycles"}), kesto::Status::Ok);
    kestod.limitDescriptors(64);
    kestod.start();

    std::deque<WireClient> clients;
    for (std::size_t number = 0; number < mostOfOneUser; ++number)
        EXPECT_EQ(clients.emplace_back(kestod.socketPath()).ask(GetAllReporters)[1], null);
    for (int attempt = 0; attempt < 20; ++attempt)
        EXPECT_TRUE(WireClient(kestod.socketPath()).isClosed());

    for (std::size_t number = 0; number < mostOfOneUser; ++number) {
        const auto reporter = static_cast<std::int64_t>(number + 1);
        WireClient& client = clients[number];
        client.ask(Create, reporter);
        const auto start = client.call(Start, reporter);
        client.ask(SendMessage, Dictionary{{"number", reporter}}, support::playback, support::typeStart,
                   Array{reporter});
        late.add(1);
        ASSERT_EQ(publisher.flush(), kesto::Status::Ok);
        const auto stop = client.call(Stop, reporter);
        client.replyTo(start);
        client.replyTo(stop);
    }
    EXPECT_EQ(kestod.countInLog("has 24 connections and gets no more until one ends"), 1U);
    EXPECT_EQ(kestod.countInLog("Too many open files"), 0U);
    EXPECT_THAT(kestod.events("com.quarn.kesto.Playback.Start"), SizeIs(mostOfOneUser)) << "the database";
    EXPECT_THAT(kestod.events("com.quarn.kesto.Cavlet.Simple"), SizeIs(mostOfOneUser)) << "channels";
    const auto summaries = kestod.directory() / "logs" / "Audio" / "Reporting";
    EXPECT_TRUE(waitUntil([&] { return !std::filesystem::is_empty(summaries); })) << "summary files";
}

} // namespace
} // namespace end_to_end
