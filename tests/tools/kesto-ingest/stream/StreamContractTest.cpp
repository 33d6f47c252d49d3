// SPDX-License-Identifier: Apache-2.0
// What the program relies on of the stream holds for the one in memory and for JetStream.
#include "kesto-ingest/stream/JetStream.h"
#include "tools/kesto-ingest/FleetServers.h"
#include "tools/kesto-ingest/stream/FakeStream.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_ingest {
namespace {

using std::chrono::milliseconds;
using testing::SizeIs;

// A stream, and a device that sends.
class StreamProvider {
public:
    StreamProvider() = default;
    virtual ~StreamProvider() = default;
    StreamProvider(const StreamProvider&) = delete;
    StreamProvider& operator=(const StreamProvider&) = delete;
    virtual Stream& stream() = 0;
    virtual void send(const std::string& payload) = 0;
};

class FakeProvider : public StreamProvider {
public:
    Stream& stream() override { return stream_; }
    void send(const std::string& payload) override { stream_.send("kesto.events.device-1", payload); }

private:
    FakeStream stream_;
};

class JetStreamProvider : public StreamProvider {
public:
    Stream& stream() override { return stream_; }
    void send(const std::string& payload) override
    {
        const auto sent = device_.publish("kesto.events.device-1", payload, {{"Kesto-Edition", "1"}});
        ASSERT_TRUE(sent) << sent.error();
    }

private:
    [[nodiscard]] JetStreamConfiguration as(const std::string& name) const
    {
        return {.servers = {server_.address()}, .user = name, .password = name};
    }
    [[nodiscard]] bool setUp() const
    {
        JetStream admin(as("admin"));
        return admin.setUp({.eventsBytes = 1 << 26, .deadBytes = 1 << 26}).has_value();
    }

    support::TemporaryDirectory directory_;
    NatsServer server_{directory_ / "nats"};
    bool isSetUp_ = setUp();
    JetStream stream_{as("ingest")};
    JetStream device_{as("device-1")};
};

std::unique_ptr<StreamProvider> makeProvider(const std::string& name)
{
    if (name == "Fake")
        return std::make_unique<FakeProvider>();
    return std::make_unique<JetStreamProvider>();
}

class StreamContract : public testing::TestWithParam<std::string> {
protected:
    // Waits for as many, since what is given back comes after a time.
    [[nodiscard]] std::vector<Delivery> fetch(std::size_t count)
    {
        std::vector<Delivery> deliveries;
        for (int attempt = 0; attempt < 20 && deliveries.size() < count; ++attempt) {
            auto fetched = stream.fetch(count - deliveries.size(), milliseconds{500});
            EXPECT_TRUE(fetched) << fetched.error();
            std::ranges::move(fetched.value_or(std::vector<Delivery>()), std::back_inserter(deliveries));
        }
        return deliveries;
    }

    std::unique_ptr<StreamProvider> provider = makeProvider(GetParam());
    Stream& stream = provider->stream();
};

TEST_P(StreamContract, GivesBatchesInTheirOrderUntilTheyAreAcknowledged)
{
    EXPECT_THAT(stream.fetch(5, milliseconds{50}).value(), SizeIs(0));
    provider->send("one");
    provider->send("two");
    auto deliveries = fetch(2);
    ASSERT_THAT(deliveries, SizeIs(2));
    EXPECT_EQ(deliveries[0].payload, "one");
    EXPECT_EQ(deliveries[0].subject, "kesto.events.device-1");
    EXPECT_EQ(deliveries[0].edition, "1");
    EXPECT_FALSE(deliveries[0].isRepeated);
    EXPECT_EQ(deliveries[1].payload, "two");
    EXPECT_GT(deliveries[1].sequence, deliveries[0].sequence);
    stream.workGoesOn(deliveries[0]);
    stream.acknowledge(deliveries[0]);
    stream.giveBack(deliveries[1]);
    deliveries = fetch(1);
    ASSERT_THAT(deliveries, SizeIs(1));
    EXPECT_EQ(deliveries[0].payload, "two");
    EXPECT_TRUE(deliveries[0].isRepeated);
}

TEST_P(StreamContract, PutsAMessageOnlyAfterTheOneThatIsThere)
{
    for (const std::string subject : {"kesto.owner.d", "kesto.stored.device-1.d"}) {
        EXPECT_EQ(stream.last(subject).value(), std::nullopt);
        const auto first = stream.put(subject, "one", 0).value();
        ASSERT_TRUE(first);
        EXPECT_EQ(stream.put(subject, "two", 0).value(), std::nullopt);
        auto last = stream.last(subject).value();
        ASSERT_TRUE(last);
        EXPECT_EQ(last->payload, "one");
        EXPECT_EQ(last->sequence, *first);
        EXPECT_EQ(stream.put(subject, "two", *first + 1000).value(), std::nullopt);
        const auto second = stream.put(subject, "two", *first).value();
        ASSERT_TRUE(second);
        EXPECT_EQ(stream.last(subject).value()->payload, "two");
    }
}

TEST_P(StreamContract, PublishesWithHeaders)
{
    EXPECT_TRUE(stream.publish("kesto.dead.device-1", "letter", {{"Nats-Msg-Id", "KESTO:1:0"}, {"Kesto-Reason", "r"}}));
}

INSTANTIATE_TEST_SUITE_P(Of, StreamContract, testing::Values("Fake", "JetStream"),
                         [](const auto& provider) { return provider.param; });

} // namespace
} // namespace kesto_ingest
