// SPDX-License-Identifier: Apache-2.0
// The contract of platform/linux/store/EventKeeper.h: kept events stay in their order, and those that are too old or
// too many are removed.
#include "platform/contract/Contract.h"
#include "platform/linux/store/ManualClock.h"
#include "platform/linux/store/MemoryKeeper.h"
#include "platform/linux/store/SqliteKeeper.h"
#include "platform/linux/store/StoreReader.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <gmock/gmock.h>
#include <limits>

namespace contract {
namespace {

using foundation::Dictionary;
using ledger::Counter;
using testing::ElementsAre;
using testing::IsEmpty;

constexpr double secondsADay = 86400;

class EventKeeperSubject {
public:
    virtual ~EventKeeperSubject() = default;
    // The keeper; after `close` it is made again in the same place.
    [[nodiscard]] virtual platform::EventKeeper& keeper() = 0;
    virtual void close() = 0;
    // The payloads of the events in that place, in their order.
    [[nodiscard]] virtual std::vector<std::string> payloads() = 0;

    support::ManualClock clock;
};

class MemoryKeeperSubject final : public EventKeeperSubject {
public:
    [[nodiscard]] platform::EventKeeper& keeper() override
    {
        if (!keeper_)
            keeper_.emplace(place_, clock);
        return *keeper_;
    }
    void close() override { keeper_.reset(); }
    [[nodiscard]] std::vector<std::string> payloads() override
    {
        std::vector<std::string> payloads;
        for (const support::KeptEvent& event : place_->all())
            payloads.push_back(event.payload);
        return payloads;
    }

private:
    const std::shared_ptr<support::KeptEvents> place_ = std::make_shared<support::KeptEvents>();
    std::optional<support::MemoryKeeper> keeper_;
};

class SqliteKeeperSubject final : public EventKeeperSubject {
public:
    [[nodiscard]] platform::EventKeeper& keeper() override
    {
        if (!keeper_)
            keeper_.emplace(directory_.path(), clock, platform::ProviderLog(log_));
        return *keeper_;
    }
    void close() override { keeper_.reset(); }
    [[nodiscard]] std::vector<std::string> payloads() override
    {
        return support::StoreReader(directory_ / platform::SqliteKeeper::fileName)
            .texts("SELECT payload FROM events ORDER BY id");
    }

private:
    const support::TemporaryDirectory directory_;
    support::FakeLog log_;
    std::optional<platform::SqliteKeeper> keeper_;
};

class EventKeeperContract : public Suite<EventKeeperSubject> {
protected:
    void SetUp() override { begin(); }
    void begin()
    {
        subject->keeper().setConfiguration(configuration);
        subject->keeper().open();
    }
    void add(Dictionary payload) { batch.add(subject->clock.secondsSince1970(), "com.quarn.a", payload); }
    void keep()
    {
        subject->keeper().keep(batch, tally);
        batch.clear();
    }
    void tidy()
    {
        while (subject->keeper().tidy(true, tally)) { }
    }

    platform::AnalyticsConfiguration configuration;
    platform::EventBatch batch;
    ledger::Tally tally;
};
KESTO_CONTRACT(EventKeeperContract, (provider<EventKeeperSubject, MemoryKeeperSubject>("Memory")),
               (provider<EventKeeperSubject, SqliteKeeperSubject>("Sqlite")));

TEST_P(EventKeeperContract, IsThereAndEmptyOnceItIsOpen)
{
    EXPECT_THAT(subject->payloads(), IsEmpty());
    EXPECT_EQ(tally[Counter::Kept], 0U);
}

TEST_P(EventKeeperContract, KeepsBatchesInTheirOrderWhenItReturns)
{
    add({{"n", 1}});
    add({{"n", 2}});
    keep();
    EXPECT_THAT(subject->payloads(), ElementsAre("{\"n\":1}", "{\"n\":2}"));
    add({{"n", 3}});
    keep();
    EXPECT_THAT(subject->payloads(), ElementsAre("{\"n\":1}", "{\"n\":2}", "{\"n\":3}"));
    EXPECT_EQ(tally[Counter::Kept], 3U);
}

TEST_P(EventKeeperContract, KeepsWhatItKeptWhenItIsClosedAndOpenedAgain)
{
    add({{"n", 1}});
    keep();
    subject->close();
    begin();
    add({{"n", 2}});
    keep();
    EXPECT_THAT(subject->payloads(), ElementsAre("{\"n\":1}", "{\"n\":2}"));
}

TEST_P(EventKeeperContract, LosesOnlyAnEventThatJsonCannotSayAndCountsIt)
{
    add({{"n", 1}});
    add({{"n", std::numeric_limits<double>::infinity()}});
    add({{"n", 2}});
    keep();
    EXPECT_THAT(subject->payloads(), ElementsAre("{\"n\":1}", "{\"n\":2}"));
    EXPECT_EQ(tally[Counter::Kept], 2U);
    EXPECT_EQ(tally[Counter::LostNotJson], 1U);
    EXPECT_EQ(tally[Counter::LostToDiskFull], 0U);
}

TEST_P(EventKeeperContract, ChargesALossToWhoSentTheEvent)
{
    batch.announce(platform::SourceBegin{.number = 7, .userIdentifier = 1000, .processName = "player"});
    batch.add(1, {.source = 7, .session = 0}, "com.quarn.a", {{"n", std::numeric_limits<double>::infinity()}});
    add({{"n", std::numeric_limits<double>::infinity()}}); // from a source that is not known
    keep();
    EXPECT_EQ(tally[Counter::LostNotJson], 2U);
    ASSERT_EQ(tally.charged().size(), 1U);
    EXPECT_EQ(tally.charged()[0].culprit, (ledger::Culprit{.user = 1000, .process = "player", .application = {}}));
    EXPECT_EQ(tally.charged()[0].count, 1U);
}

TEST_P(EventKeeperContract, WhatASessionPlayedCostsNoEventWhateverEndsIt)
{
    batch.announce(platform::SourceBegin{.number = 7, .userIdentifier = 1000, .processName = "player"});
    batch.announce(platform::SessionBegin{.number = 9, .source = 7, .reporterID = 42});
    const double now = subject->clock.secondsSince1970();
    batch.add(now, {.source = 7, .session = 9}, "com.quarn.kesto.Playback.Start", {{"session_output_running", true}});
    keep();
    subject->clock.advance(2);
    batch.announcePlayingEnd(9, now + 2, platform::PlayingEnding::Stopped);
    keep();
    subject->keeper().beginEnd();
    batch.announcePlayingEnd(9, now + 2, platform::PlayingEnding::Vanished);
    batch.announceSessionEnd({.number = 9, .time = now + 2});
    keep();
    tidy();
    EXPECT_THAT(subject->payloads(), ElementsAre("{\"session_output_running\":true}"));
    EXPECT_EQ(tally[Counter::Kept], 1U);
    EXPECT_EQ(subject->keeper().state()->events, 1U);
}

TEST_P(EventKeeperContract, RemovesWhatIsTooOld)
{
    configuration.maximumAgeDays = 10;
    subject->keeper().setConfiguration(configuration);
    add({{"n", 1}});
    keep();
    subject->clock.advance(9 * secondsADay);
    add({{"n", 2}});
    keep();
    tidy();
    EXPECT_THAT(subject->payloads(), ElementsAre("{\"n\":1}", "{\"n\":2}"));
    subject->clock.advance(2 * secondsADay);
    tidy();
    EXPECT_THAT(subject->payloads(), ElementsAre("{\"n\":2}"));
}

TEST_P(EventKeeperContract, RemovesTheOldestOfWhatIsTooMuch)
{
    configuration.maximumSizeMegabytes = 1;
    subject->keeper().setConfiguration(configuration);
    for (int number = 0; number < 40; ++number)
        add({{"text", std::string(50'000, static_cast<char>('a' + number % 26))}, {"n", number}});
    keep();
    tidy();
    const auto left = subject->payloads();
    EXPECT_LE(left.size(), 20U);
    ASSERT_GE(left.size(), 10U);
    EXPECT_THAT(left.back(), testing::HasSubstr("\"n\":39"));
    EXPECT_THAT(left.front(), testing::HasSubstr("\"n\":" + std::to_string(40 - left.size()))) << "the newest stay";
}

} // namespace
} // namespace contract
