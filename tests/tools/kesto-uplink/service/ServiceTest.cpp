// SPDX-License-Identifier: Apache-2.0
// A real kestod, a real uplink and a real nats-server. Each event that a client reports arrives in the stream once,
// although tests kill the uplink or the server in between.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "kesto-uplink/state/State.h"
#include "support/MessageKinds.h"
#include "support/ParseJson.h"
#include "support/Relay.h"
#include "tools/kesto-uplink/service/UplinkProcess.h"
#include "tools/kesto-uplink/transport/NatsServer.h"

#include <chrono>
#include <csignal>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <map>
#include <random>
#include <set>
#include <sstream>
#include <zstd.h>

namespace uplink_test {
namespace {

using end_to_end::Kestod;
using end_to_end::waitUntil;
using foundation::Array;
using foundation::Dictionary;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Pair;
using testing::StartsWith;

// Names events by epoch and ID.
using Keys = std::multiset<std::string>;

class UplinkService : public testing::Test {
protected:
    // The stream has the first batch, and the device does not know it.
    UplinkService()
    {
        proxy.loseAnswersWith(R"("stream":"KESTO")");
        kestod.startAndAwait();
    }

    // So many new messages in the store; each becomes two events.
    void report(int count)
    {
        end_to_end::WireClient client(kestod.socketPath());
        const int session = ++sessions_;
        client.ask(end_to_end::Create, session);
        client.ask(end_to_end::SetServiceType, 7, session);
        const std::uint64_t before = kestod.eventCount();
        std::uint64_t call = 0;
        for (int number = 0; number < count; ++number)
            call = client.call(end_to_end::SendMessage, Dictionary{{"number", number}}, support::playback,
                               support::typeStart, Array{session});
        for (auto reply = client.nextReply(); reply && (*reply)[0] != foundation::Value(call);)
            reply = client.nextReply();
        const auto all = before + 2 * static_cast<std::uint64_t>(count);
        EXPECT_TRUE(waitUntil([&] { return kestod.eventCount() >= all; }));
    }

    Keys keysInStore()
    {
        const std::string epoch = kestod.query("SELECT epoch FROM store").at(0);
        Keys keys;
        for (const std::string& id : kestod.query("SELECT id FROM events"))
            keys.insert(epoch + ":" + id);
        return keys;
    }

    std::vector<Dictionary> eventsInStream()
    {
        std::vector<Dictionary> events;
        for (const StoredMessage& message : nats.stored()) {
            const auto size = ZSTD_getFrameContentSize(message.bytes.data(), message.bytes.size());
            std::string lines(size, '\0');
            EXPECT_EQ(ZSTD_decompress(lines.data(), size, message.bytes.data(), message.bytes.size()), size);
            std::istringstream stream(lines);
            for (std::string line; std::getline(stream, line);) {
                const auto row = support::parseJson(line)->dictionary().value();
                if (row.find("kind")->stringView() == "event")
                    events.push_back(row);
            }
        }
        return events;
    }

    Keys keysInStream()
    {
        Keys keys;
        for (const Dictionary& row : eventsInStream())
            keys.insert(fmt::format("{}:{}", row.find("epoch")->text(), row.find("id")->text()));
        return keys;
    }

    // What clients reported, and how often it is there.
    std::map<std::int64_t, int> numbersInStream()
    {
        std::map<std::int64_t, int> numbers;
        for (const Dictionary& row : eventsInStream()) {
            const auto payload = row.find("payload")->dictionary();
            if (const auto* number = payload->find("number"))
                ++numbers[number->exactly<std::int64_t>().value()];
        }
        return numbers;
    }

    std::set<std::string> messageIDs()
    {
        std::set<std::string> ids;
        for (const StoredMessage& message : nats.stored())
            EXPECT_TRUE(ids.insert(message.id).second) << message.id;
        return ids;
    }

    // Waits until another round ends: each notes its answer.
    bool anotherRoundEnds()
    {
        const double now = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
        return waitUntil([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(50)); // a look locks the state
            return kesto_uplink::State::openPresent(uplink.state())->lastAnswer()->time > now;
        });
    }

    // Waits until the uplink has an answer to all that is in the store.
    bool isAllQueued()
    {
        const std::string newest = "SELECT epoch || ':' || (next_event - 1) FROM store";
        return waitUntil([&] {
            std::this_thread::sleep_for(std::chrono::milliseconds(50)); // a look locks the state
            auto state = kesto_uplink::State::openPresent(uplink.state());
            const auto queued = state ? state->queued() : kesto_uplink::Cursor();
            return fmt::format("{}:{}", queued.epoch, queued.id) == kestod.query(newest).at(0);
        });
    }

    NatsServer nats;
    support::Relay proxy{nats.port()};
    Kestod kestod;
    UplinkProcess uplink{kestod.directory() / "state" / "analytics.sqlite3",
                         fmt::format("nats://127.0.0.1:{}", proxy.port())};

private:
    int sessions_ = 0;
};

TEST_F(UplinkService, WhatIsAllowedIsInTheStreamOnceWhateverIsKilled)
{
    // Killed behind the stream's answer, before the device noted it.
    report(3);
    uplink.start();
    ASSERT_TRUE(waitUntil([this] { return proxy.hasLostAnAnswer(); }));
    uplink.signal(SIGKILL);
    EXPECT_EQ(uplink.exitStatus(), -SIGKILL);
    EXPECT_EQ(kesto_uplink::State::openPresent(uplink.state())->queued(), kesto_uplink::Cursor());
    EXPECT_EQ(messageIDs().size(), 1U);
    proxy.loseNothing();
    uplink.start();
    ASSERT_TRUE(isAllQueued());
    EXPECT_EQ(messageIDs().size(), 1U);
    EXPECT_EQ(keysInStream(), keysInStore());
    EXPECT_THAT(numbersInStream(), ElementsAre(Pair(0, 2), Pair(1, 2), Pair(2, 2)));

    // The server is away, and comes back.
    nats.kill();
    report(20);
    ASSERT_TRUE(waitUntil([this] { return uplink.log().contains("is not reached"); }));
    nats.start();
    ASSERT_TRUE(isAllQueued());
    EXPECT_EQ(keysInStream(), keysInStore());

    // The store is begun anew.
    Keys expected = keysInStore();
    kestod.kill();
    for (const std::string& name : support::namesIn(kestod.directory() / "state"))
        std::filesystem::remove_all(kestod.directory() / "state" / name);
    kestod.startAndAwait();
    report(20);
    ASSERT_TRUE(isAllQueued());
    expected.merge(keysInStore());
    EXPECT_GE(expected.size(), 86U);
    EXPECT_EQ(keysInStream(), expected);

    uplink.signal(SIGTERM);
    EXPECT_EQ(uplink.exitStatus(), 0);
}

TEST_F(UplinkService, TheDeviceForgetsWhatTheFleetsStoreHas)
{
    std::string configuration = support::readFile(uplink.state() / "uplink.toml");
    configuration.replace(configuration.find("queued"), 6, "stored");
    uplink.writeConfiguration(configuration);
    proxy.loseNothing();
    report(5);
    uplink.start();
    ASSERT_TRUE(isAllQueued());
    auto state = *kesto_uplink::State::openPresent(uplink.state());
    const auto queued = state.queued();
    EXPECT_EQ(state.stored(), (kesto_uplink::Cursor{queued.epoch, 0}));
    nats.publish("kesto.stored.alpha." + state.identity().pseudonym,
                 fmt::format(R"({{"epoch":"{}","id":{}}})", queued.epoch, queued.id));
    report(1); // the next round asks for confirmations, also if the last one waits no longer
    EXPECT_TRUE(waitUntil([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
        return state.stored() == queued;
    }));
}

// New events come between the kills, so a batch may have more rows when it is sent again: then it is another message,
// and receivers know its rows by their keys.
TEST_F(UplinkService, KillsAtRandomLoseNothing)
{
    proxy.loseNothing();
    std::mt19937 random(7);
    for (int kill = 0; kill < 8; ++kill) {
        report(5);
        const int connections = proxy.connections();
        uplink.start();
        ASSERT_TRUE(waitUntil([&] { return proxy.connections() > connections; })); // the round has begun
        std::this_thread::sleep_for(std::chrono::milliseconds(random() % 20));
        uplink.signal(SIGKILL);
        EXPECT_EQ(uplink.exitStatus(), -SIGKILL);
    }
    uplink.start();
    ASSERT_TRUE(isAllQueued());
    static_cast<void>(messageIDs());
    const Keys stream = keysInStream();
    const Keys store = keysInStore();
    EXPECT_GE(store.size(), 80U);
    EXPECT_EQ(std::set(stream.begin(), stream.end()), std::set(store.begin(), store.end()));
}

TEST_F(UplinkService, ASignalEndsItAlsoWhileItWaitsForAnAnswer)
{
    report(5);
    uplink.start();
    ASSERT_TRUE(waitUntil([this] { return proxy.hasLostAnAnswer(); }));
    uplink.signal(SIGTERM);
    EXPECT_EQ(uplink.exitStatus(), 0);
    EXPECT_EQ(kesto_uplink::State::openPresent(uplink.state())->queued(), kesto_uplink::Cursor());
}

TEST_F(UplinkService, WithoutEnabledItSaysSoAndEnds)
{
    uplink.writeConfiguration("enabled = false\n");
    uplink.start();
    EXPECT_EQ(uplink.exitStatus(), 0);
    EXPECT_THAT(uplink.log(), StartsWith("kesto-uplink: off: "));
    EXPECT_FALSE(std::filesystem::exists(uplink.state() / kesto_uplink::State::fileName));
}

TEST_F(UplinkService, AChangeOfItsFilesCountsFromTheNextRoundOn)
{
    proxy.loseNothing();
    report(5);
    uplink.start();
    ASSERT_TRUE(isAllQueued());
    const std::string configuration = support::readFile(uplink.state() / "uplink.toml");
    uplink.writeConfiguration("enabled = false\n");
    report(1); // a round that has begun may send it still
    ASSERT_TRUE(waitUntil([this] { return uplink.log().contains("off: "); }));
    const Keys before = keysInStream();
    report(5);
    ASSERT_TRUE(anotherRoundEnds());
    EXPECT_EQ(keysInStream(), before);
    uplink.writeConfiguration(configuration);
    report(5);
    EXPECT_TRUE(isAllQueued());
    EXPECT_EQ(keysInStream(), keysInStore());
}

TEST_F(UplinkService, AMistakeInItsFilesEndsItWithASentence)
{
    uplink.writeCredentials("name = \"alpha\"\n");
    uplink.start();
    EXPECT_EQ(uplink.exitStatus(), 78);
    EXPECT_THAT(uplink.log(), HasSubstr("needs either a password"));
    uplink.writeConfiguration("enabled = true\nserver = \"tls://a\"\n");
    uplink.start();
    EXPECT_EQ(uplink.exitStatus(), 78);
    EXPECT_THAT(uplink.log(), HasSubstr("unknown key server"));
    EXPECT_THAT(nats.stored(), IsEmpty());
}

TEST_F(UplinkService, ARefusalIsInTheLogOnceAndInTheState)
{
    uplink.writeCredentials("name = \"alpha\"\npassword = \"guessed\"\nplain = true\n");
    report(5);
    uplink.start();
    const auto refusals = [this] {
        std::istringstream lines(uplink.log());
        int count = 0;
        for (std::string line; std::getline(lines, line);)
            count += line.contains("check the credentials file") ? 1 : 0;
        return count;
    };
    EXPECT_TRUE(waitUntil([&] { return refusals() > 0; }));
    const int connections = proxy.connections();
    EXPECT_TRUE(waitUntil([&] { return proxy.connections() > connections + 1; })); // a whole round has come meanwhile
    EXPECT_EQ(refusals(), 1);
    EXPECT_THAT(kesto_uplink::State::openPresent(uplink.state())->lastAnswer()->text,
                HasSubstr("check the credentials file"));
}

} // namespace
} // namespace uplink_test
