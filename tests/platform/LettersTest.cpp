// SPDX-License-Identifier: Apache-2.0
// The letters of a turn: what one connection gets arrives as one letter, in the order in which it was written, and
// nothing is written before the letters are sent.
#include "platform/Letters.h"

#include "platform/Connection.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

class Recipient final : public Connection, public std::enable_shared_from_this<Recipient> {
public:
    Recipient(std::string name, std::vector<std::string>& post) : name_(std::move(name)), post_(post) { }

    [[nodiscard]] std::int32_t processIdentifier() const override { return 1; }
    [[nodiscard]] std::uint32_t userIdentifier() const override { return 0; }
    [[nodiscard]] std::string description() const override { return name_; }
    void setCallHandler(CallHandler /*handler*/) override { }
    void setInterruptionHandler(EndHandler /*handler*/) override { }
    void setInvalidationHandler(EndHandler /*handler*/) override { }
    void setLane(std::shared_ptr<Lane>, std::shared_ptr<ledger::Workload>) override { }
    void setLogShare(std::shared_ptr<LogShare>) override { }
    void resume() override { }
    void send(Turn& /*turn*/, std::string /*frame*/) override { }
    void write(std::string letter) override { post_.push_back(name_ + ": " + letter); }

private:
    const std::string name_;
    std::vector<std::string>& post_;
};

class LettersTest : public testing::Test {
protected:
    std::shared_ptr<Recipient> recipient(const std::string& name) { return std::make_shared<Recipient>(name, post); }

    std::vector<std::string> post; // what the connections have written
    Letters letters;
};

TEST_F(LettersTest, WithoutLettersNothingIsToBeSent)
{
    EXPECT_FALSE(letters.take());
}

TEST_F(LettersTest, NothingIsWrittenBeforeTheLettersAreSent)
{
    const auto player = recipient("player");
    letters.to(*player) += "one";
    auto send = letters.take();
    EXPECT_THAT(post, IsEmpty());
    send();
    EXPECT_THAT(post, ElementsAre("player: one"));
}

TEST_F(LettersTest, FramesForOneConnectionShareALetterInTheirOrder)
{
    const auto player = recipient("player");
    letters.to(*player) += "one,";
    letters.to(*player) += "two";
    letters.take()();
    EXPECT_THAT(post, ElementsAre("player: one,two"));
}

TEST_F(LettersTest, EachConnectionGetsOneLetterEvenIfTheirFramesAlternate)
{
    const auto player = recipient("player");
    const auto recorder = recipient("recorder");
    letters.to(*player) += "p1,";
    letters.to(*recorder) += "r1,";
    letters.to(*player) += "p2,";
    letters.to(*recorder) += "r2,";
    letters.to(*player) += "p3";
    letters.take()();
    EXPECT_THAT(post, ElementsAre("player: p1,p2,p3", "recorder: r1,r2,")) << "in the order of the first frames";
}

TEST_F(LettersTest, TakenLettersAreNotTakenAgain)
{
    const auto player = recipient("player");
    letters.to(*player) += "one";
    letters.take()();
    EXPECT_FALSE(letters.take());
    letters.to(*player) += "two";
    letters.take()();
    EXPECT_THAT(post, ElementsAre("player: one", "player: two"));
}

TEST_F(LettersTest, ALetterKeepsItsConnectionUntilItIsSentAndNoLonger)
{
    auto player = recipient("player");
    const std::weak_ptr<Recipient> observed = player;
    letters.to(*player) += "one";
    player.reset();
    auto send = letters.take();
    EXPECT_FALSE(observed.expired());
    send();
    EXPECT_THAT(post, ElementsAre("player: one"));
    send = nullptr;
    EXPECT_TRUE(observed.expired());
}

} // namespace
} // namespace platform
