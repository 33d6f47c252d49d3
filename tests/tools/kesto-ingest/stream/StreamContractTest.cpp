// SPDX-License-Identifier: Apache-2.0
// What the program relies on of the stream holds for the one in memory and for JetStream.
#include "kesto-ingest/stream/JetStream.h"
#include "tools/kesto-ingest/FleetServers.h"
#include "tools/kesto-ingest/stream/FakeStream.h"

#include <fmt/format.h>
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
    virtual std::string lastLetter() = 0;
    virtual void end() = 0;
    virtual void comeBack() = 0;
};

class FakeProvider : public StreamProvider {
public:
    Stream& stream() override { return stream_; }
    void send(const std::string& payload) override { stream_.send("kesto.events.device-1", payload); }
    std::string lastLetter() override { return stream_.letters.back().payload; }
    void end() override { stream_.isAway = true; }
    void comeBack() override { stream_.isAway = false; }

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
    std::string lastLetter() override
    {
        const auto entry = JetStream(as("admin")).last("kesto.dead.device-1");
        return entry && *entry ? (*entry)->payload : "";
    }
    void end() override { server_.end(); }
    void comeBack() override { server_.start(); }

    [[nodiscard]] JetStreamConfiguration as(const std::string& name) const
    {
        return {.servers = {server_.address()},
                .user = name,
                .password = name,
                .timeLimit = std::chrono::milliseconds{10'000}};
    }

private:
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

    // Whether a fetch succeeds, or fails, within a time: a connection's end, or its return, takes a moment.
    [[nodiscard]] bool becomes(bool isUp)
    {
        for (int attempt = 0; attempt < 100; ++attempt)
            if (stream.fetch(1, milliseconds{200}).has_value() == isUp)
                return true;
        return false;
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
        const auto put = [&](const std::string& payload, std::uint64_t after) {
            const Put asked{.subject = subject, .payload = payload, .after = after};
            return stream.put({&asked, 1}).value().at(0);
        };
        EXPECT_FALSE(stream.last(subject).value());
        const auto first = put("one", 0);
        ASSERT_TRUE(first);
        EXPECT_EQ(put("two", 0), std::nullopt);
        const auto last = stream.last(subject).value();
        ASSERT_TRUE(last);
        EXPECT_EQ(last->payload, "one");
        EXPECT_EQ(last->sequence, *first);
        EXPECT_EQ(put("two", *first + 1000), std::nullopt);
        EXPECT_TRUE(put("two", *first));
        EXPECT_EQ(stream.last(subject).value()->payload, "two");
    }
}

TEST_P(StreamContract, PutsManyMessages)
{
    std::vector<Put> puts;
    for (int place = 0; place < 600; ++place)
        puts.push_back({.subject = fmt::format("kesto.owner.{}", place), .payload = fmt::format("{}", place)});
    const auto answers = stream.put(puts);
    ASSERT_TRUE(answers) << answers.error();
    ASSERT_THAT(*answers, SizeIs(600));
    for (const std::size_t place : {0U, 255U, 256U, 599U}) {
        const auto last = stream.last(puts[place].subject).value();
        ASSERT_TRUE(last);
        EXPECT_EQ(last->payload, std::to_string(place));
        EXPECT_EQ(last->sequence, (*answers)[place]);
    }
    puts.resize(2);
    puts[1] = {.subject = "kesto.owner.new", .payload = "new"};
    EXPECT_EQ(stream.put(puts).value().at(0), std::nullopt);
    EXPECT_TRUE(stream.last("kesto.owner.new").value()) << "one that is overtaken does not stop the others";
}

TEST_P(StreamContract, PublishesWithHeaders)
{
    const Headers headers = {{"Nats-Msg-Id", "KESTO:1:0"}, {"Kesto-Reason", "r"}};
    EXPECT_EQ(stream.publish("kesto.dead.device-1", "letter", headers), Publication::Taken);
    EXPECT_EQ(stream.publish("kesto.dead.device-1", "again", headers), Publication::Taken);
    EXPECT_EQ(provider->lastLetter(), "letter") << "one with the same ID is there";
    for (const std::size_t size : {1'000'001U, 2'000'000U}) { // too large for the stream, and for the server
        const auto published =
            stream.publish("kesto.dead.device-1", std::string(size, 'x'), {{"Nats-Msg-Id", "KESTO:2:0"}});
        ASSERT_TRUE(published) << published.error();
        EXPECT_EQ(*published, Publication::TooLarge);
    }
}

TEST_P(StreamContract, SaysThatItIsAway)
{
    EXPECT_THAT(stream.fetch(1, milliseconds{50}).value(), SizeIs(0));
    provider->end();
    EXPECT_TRUE(becomes(false));
}

TEST_P(StreamContract, TakesWordOfABatchThatItGaveBeforeItWasAway)
{
    provider->send("one");
    const auto before = fetch(1);
    ASSERT_THAT(before, SizeIs(1));
    provider->end();
    EXPECT_TRUE(becomes(false));
    stream.workGoesOn(before[0]);
    provider->comeBack();
    EXPECT_TRUE(becomes(true));
    stream.giveBack(before[0]);
    const auto again = fetch(1);
    ASSERT_THAT(again, SizeIs(1));
    EXPECT_EQ(again[0].payload, "one");
    EXPECT_TRUE(again[0].isRepeated);
    stream.acknowledge(before[0]);
}

TEST(JetStreamSetUp, MayBeRepeatedWithOtherSizesOnAFullServer)
{
    JetStreamProvider provider;
    JetStream admin(provider.as("admin"));
    const StreamSizes large{.eventsBytes = std::int64_t{12} << 30, .deadBytes = std::int64_t{3} << 30};
    for (int attempt = 0; attempt < 2; ++attempt) {
        const auto done = admin.setUp(large);
        EXPECT_TRUE(done) << done.error();
    }
}

TEST(JetStreamConnection, IsNeverPlainIfTLSIsAskedFor)
{
    JetStreamProvider provider;
    JetStreamConfiguration configuration = provider.as("admin");
    configuration.servers[0].replace(0, std::string_view("nats").size(), "tls");
    EXPECT_THROW(JetStream stream(configuration), std::runtime_error);
}

INSTANTIATE_TEST_SUITE_P(Of, StreamContract, testing::Values("Fake", "JetStream"),
                         [](const auto& provider) { return provider.param; });

} // namespace
} // namespace kesto_ingest
