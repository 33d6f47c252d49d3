// SPDX-License-Identifier: Apache-2.0
// What Transport.h promises, of the fake that other tests use and of JetStream before a real server.
#include "tools/kesto-uplink/transport/FakeTransport.h"
#include "tools/kesto-uplink/transport/NatsServer.h"

#include "kesto-uplink/transport/JetStream.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <chrono>
#include <memory>
#include <thread>

namespace uplink_test {
namespace {

using kesto_uplink::Answer;
using kesto_uplink::Confirmation;
using kesto_uplink::Transport;
using namespace std::chrono_literals;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Pair;

enum class Credential { right, wrongPassword, anothersSubject };

// Of the device, where an answer must come: it may take long on a busy machine.
constexpr auto patience = 10s;

const std::string device = "0123456789abcdef0123456789abcdef";
const std::string anotherDevice = "fedcba9876543210fedcba9876543210";

// The servers, as the contract needs them.
class Fleet {
public:
    virtual ~Fleet() = default;
    virtual std::unique_ptr<Transport> device(Credential credential, std::chrono::milliseconds timeLimit) = 0;
    virtual void kill() = 0;
    virtual void start() = 0;
    virtual void freeze(Transport& transport) = 0;
    virtual void fill() = 0;
    virtual void drain() = 0;
    virtual void confirm(const std::string& device, const std::string& epoch, int id) = 0;
    virtual std::vector<std::pair<std::string, std::string>> stored() = 0;
};

class FakeFleet : public Fleet {
public:
    std::unique_ptr<Transport> device(Credential credential, std::chrono::milliseconds timeLimit) override
    {
        auto transport = std::make_unique<FakeTransport>(stream_);
        transport->timeLimit = timeLimit;
        transport->hasWrongPassword = credential == Credential::wrongPassword;
        transport->lacksPermission = credential == Credential::anothersSubject;
        return transport;
    }
    void kill() override { stream_.isReachable = false; }
    void start() override { stream_.isReachable = true; }
    void freeze(Transport& transport) override { dynamic_cast<FakeTransport&>(transport).isFrozen = true; }
    void fill() override { stream_.isFull = true; }
    void drain() override { stream_.isFull = false; }
    void confirm(const std::string& device, const std::string& epoch, int id) override
    {
        stream_.confirmations[device] = {epoch, id};
    }
    std::vector<std::pair<std::string, std::string>> stored() override { return stream_.messages; }

private:
    FakeStream stream_;
};

class NatsFleet : public Fleet {
public:
    std::unique_ptr<Transport> device(Credential credential, std::chrono::milliseconds timeLimit) override
    {
        return std::make_unique<kesto_uplink::JetStream>(
            kesto_uplink::Servers{.urls = {server_.url()}},
            kesto_uplink::Credentials{.name = credential == Credential::anothersSubject ? "forger" : "alpha",
                                      .password = credential == Credential::wrongPassword ? "guessed" : "secret",
                                      .isPlain = true},
            kesto_uplink::TimeLimits{.connect = 10s, .answer = timeLimit});
    }
    void kill() override { server_.kill(); }
    void start() override { server_.start(); }
    void freeze(Transport&) override { server_.freeze(); }
    void fill() override { server_.fill(); }
    void drain() override { server_.drain(); }
    void confirm(const std::string& device, const std::string& epoch, int id) override
    {
        server_.publish("kesto.stored.alpha." + device,
                        R"({"epoch":")" + epoch + R"(","id":)" + std::to_string(id) + "}");
    }
    std::vector<std::pair<std::string, std::string>> stored() override
    {
        std::vector<std::pair<std::string, std::string>> messages;
        for (const StoredMessage& message : server_.stored())
            messages.emplace_back(message.id, message.bytes);
        return messages;
    }

private:
    NatsServer server_;
};

template <typename Side> class TransportContract : public testing::Test {
protected:
    Side fleet;
    std::unique_ptr<Transport> transport = fleet.device(Credential::right, patience);
};

struct Names {
    template <typename Side> static std::string GetName(int)
    {
        return std::is_same_v<Side, FakeFleet> ? "Fake" : "Nats";
    }
};
using Fleets = testing::Types<FakeFleet, NatsFleet>;
TYPED_TEST_SUITE(TransportContract, Fleets, Names);

TYPED_TEST(TransportContract, aBatchIsStoredWithItsIDAndItsBytes)
{
    const std::string bytes("\x28\xb5\x00\xff", 4);
    ASSERT_EQ(this->transport->connect().kind, Answer::Kind::Stored);
    const Answer answer = this->transport->put("device:epoch:1:7", bytes);
    EXPECT_EQ(answer.kind, Answer::Kind::Stored);
    EXPECT_FALSE(answer.duplicate);
    EXPECT_THAT(this->fleet.stored(), ElementsAre(Pair("device:epoch:1:7", bytes)));
}

TYPED_TEST(TransportContract, aBatchThatIsSentTwiceIsStoredOnceAndSaysSo)
{
    ASSERT_TRUE(this->transport->connect().isStored());
    EXPECT_TRUE(this->transport->put("a", "1").isStored());
    ASSERT_TRUE(this->transport->connect().isStored());
    const Answer again = this->transport->put("a", "1");
    EXPECT_TRUE(again.isStored());
    EXPECT_TRUE(again.duplicate);
    EXPECT_THAT(this->fleet.stored(), ElementsAre(Pair("a", "1")));
}

TYPED_TEST(TransportContract, withoutAServerItIsAwayAndSaysSo)
{
    this->fleet.kill();
    const Answer answer = this->transport->connect();
    EXPECT_EQ(answer.kind, Answer::Kind::Away);
    EXPECT_NE(answer.sentence, "");
}

TYPED_TEST(TransportContract, withoutAConnectionItIsAway)
{
    EXPECT_EQ(this->transport->put("a", "1").kind, Answer::Kind::Away);
    EXPECT_EQ(this->transport->lastConfirmation(device).error().kind, Answer::Kind::Away);
    EXPECT_EQ(this->transport->awaitConfirmation(1ms).error().kind, Answer::Kind::Away);
    ASSERT_TRUE(this->transport->connect().isStored());
    this->transport->disconnect();
    EXPECT_EQ(this->transport->put("a", "1").kind, Answer::Kind::Away);
}

TYPED_TEST(TransportContract, aServerThatIsKilledInTheMiddleIsAwayAndTakesBatchesAgainWhenItIsBack)
{
    ASSERT_TRUE(this->transport->connect().isStored());
    EXPECT_TRUE(this->transport->put("a", "1").isStored());
    this->fleet.kill();
    const Answer answer = this->transport->put("b", "2");
    EXPECT_EQ(answer.kind, Answer::Kind::Away);
    EXPECT_NE(answer.sentence, "");
    this->fleet.start();
    ASSERT_TRUE(this->transport->connect().isStored());
    EXPECT_TRUE(this->transport->put("b", "2").isStored());
    EXPECT_THAT(this->fleet.stored(), ElementsAre(Pair("a", "1"), Pair("b", "2")));
}

TYPED_TEST(TransportContract, aServerThatDoesNotAnswerIsAway)
{
    const auto impatient = this->fleet.device(Credential::right, 400ms);
    ASSERT_TRUE(impatient->connect().isStored());
    this->fleet.freeze(*impatient);
    EXPECT_EQ(impatient->put("a", "1").kind, Answer::Kind::Away);
}

TYPED_TEST(TransportContract, aFullStreamTakesNothingAndLaterTakesTheSameBatch)
{
    this->fleet.fill();
    ASSERT_TRUE(this->transport->connect().isStored());
    const std::string batch(512 << 10, 'b');
    const Answer answer = this->transport->put("a", batch);
    EXPECT_EQ(answer.kind, Answer::Kind::Full);
    EXPECT_THAT(answer.sentence, HasSubstr("full"));
    this->fleet.drain();
    EXPECT_TRUE(this->transport->put("a", batch).isStored());
    EXPECT_THAT(this->fleet.stored(), ElementsAre(Pair("a", batch)));
}

TYPED_TEST(TransportContract, aWrongPasswordIsRefused)
{
    const Answer answer = this->fleet.device(Credential::wrongPassword, patience)->connect();
    EXPECT_EQ(answer.kind, Answer::Kind::Refused);
    EXPECT_THAT(answer.sentence, HasSubstr("credentials file"));
}

TYPED_TEST(TransportContract, aNameWithoutRightsOnItsSubjectIsRefusedAndStoresNothing)
{
    const auto forger = this->fleet.device(Credential::anothersSubject, 5s); // no server answers it
    ASSERT_TRUE(forger->connect().isStored());
    const Answer answer = forger->put("a", "1");
    EXPECT_EQ(answer.kind, Answer::Kind::Refused);
    EXPECT_THAT(answer.sentence, HasSubstr("permissions"));
    EXPECT_THAT(this->fleet.stored(), IsEmpty());
}

TYPED_TEST(TransportContract, theLastConfirmationOfTheDeviceIsTold)
{
    ASSERT_TRUE(this->transport->connect().isStored());
    EXPECT_EQ(this->transport->lastConfirmation(device).value(), std::nullopt);
    this->fleet.confirm(device, "aa", 5);
    this->fleet.confirm(device, "bb", 2);
    this->fleet.confirm(anotherDevice, "cc", 9);
    EXPECT_EQ(this->transport->lastConfirmation(device).value(), (Confirmation{"bb", 2}));
}

TYPED_TEST(TransportContract, aNewConfirmationOfTheDeviceIsAwaited)
{
    this->fleet.confirm(device, "aa", 5);
    ASSERT_TRUE(this->transport->connect().isStored());
    ASSERT_EQ(this->transport->lastConfirmation(device).value(), (Confirmation{"aa", 5}));
    EXPECT_EQ(this->transport->awaitConfirmation(20ms).value(), std::nullopt);
    this->fleet.confirm(anotherDevice, "cc", 9);
    this->fleet.confirm(device, "aa", 6);
    EXPECT_EQ(this->transport->awaitConfirmation(10s).value(), (Confirmation{"aa", 6}));
    EXPECT_EQ(this->transport->awaitConfirmation(20ms).value(), std::nullopt);
}

TYPED_TEST(TransportContract, anInterruptionEndsACallThatWaitsAndAllLaterOnes)
{
    const auto patient = this->fleet.device(Credential::right, 1h);
    ASSERT_TRUE(patient->connect().isStored());
    this->fleet.freeze(*patient);
    std::jthread interrupter([&] {
        std::this_thread::sleep_for(50ms);
        patient->interrupt();
    });
    EXPECT_EQ(patient->put("a", "1").kind, Answer::Kind::Interrupted);
    EXPECT_EQ(patient->put("a", "1").kind, Answer::Kind::Interrupted);
    EXPECT_EQ(patient->awaitConfirmation(1h).error().kind, Answer::Kind::Interrupted);
    EXPECT_EQ(patient->connect().kind, Answer::Kind::Interrupted);
}

} // namespace
} // namespace uplink_test
