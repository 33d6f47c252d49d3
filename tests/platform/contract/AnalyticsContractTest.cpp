// SPDX-License-Identifier: Apache-2.0
// The contract of platform/Analytics.h: wanted events are kept, in order, with payloads that are built once; other
// events are dropped completely.
#include "platform/contract/Contract.h"
#include "platform/linux/process/LinuxClock.h"
#include "platform/linux/store/AnalyticsStore.h"
#include "platform/linux/store/MemoryKeeper.h"
#include "platform/linux/store/SqliteKeeper.h"
#include "platform/linux/store/StoreReader.h"
#include "support/ParseJson.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeAnalytics.h"
#include "support/fakes/FakeLog.h"

#include <atomic>
#include <gmock/gmock.h>
#include <limits>
#include <set>

namespace contract {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using support::AnalyticsEvent;
using testing::ElementsAre;
using testing::IsEmpty;

class AnalyticsSubject {
public:
    virtual ~AnalyticsSubject() = default;
    [[nodiscard]] virtual platform::Analytics& analytics() = 0;
    // From now on events with names that match the globs are wanted; at first none are. It takes effect a moment later.
    virtual void use(const std::string& pattern) = 0;
    // Does what the platform does at the end of a turn.
    virtual void end(platform::Turn&) { }
    // What is counted, once everything is kept that was sent; of turns only what `end` took.
    [[nodiscard]] virtual ledger::Account account() = 0;
    // The kept events, in order; this ends the service.
    [[nodiscard]] virtual std::vector<AnalyticsEvent> events() = 0;
};

class FakeAnalyticsSubject final : public AnalyticsSubject {
public:
    [[nodiscard]] platform::Analytics& analytics() override { return analytics_; }
    void use(const std::string& pattern) override { analytics_.use(pattern); }
    void end(platform::Turn& turn) override { ledger_.post(turn.tally); }
    [[nodiscard]] ledger::Account account() override { return ledger_.account(); }
    [[nodiscard]] std::vector<AnalyticsEvent> events() override { return analytics_.events(); }

private:
    ledger::Ledger ledger_;
    support::FakeAnalytics analytics_{ledger_};
};

// The store of Linux, on any keeper of events.
class StoreSubject : public AnalyticsSubject {
public:
    StoreSubject() { configure(); }

    [[nodiscard]] platform::Analytics& analytics() override
    {
        if (!store_)
            store_.emplace(makeKeeper(), watcher_, clock_, ledger_, platform::ProviderLog(log_));
        return *store_;
    }
    void use(const std::string& pattern) override
    {
        patterns_ += (patterns_.empty() ? "\"" : ", \"") + pattern + '"';
        configure();
    }
    void end(platform::Turn& turn) override { store_->endTurn(turn, nullptr); }
    [[nodiscard]] ledger::Account account() override
    {
        store_->flush();
        return ledger_.account();
    }
    [[nodiscard]] std::vector<AnalyticsEvent> events() override
    {
        store_.reset(); // it keeps all of them first
        return kept();
    }

protected:
    [[nodiscard]] virtual std::unique_ptr<platform::EventKeeper> makeKeeper() = 0;
    [[nodiscard]] virtual std::vector<AnalyticsEvent> kept() = 0;
    [[nodiscard]] static AnalyticsEvent event(const std::string& name, const std::string& payload)
    {
        return {name, support::parseJson(payload).value().dictionary().value()};
    }

    const support::TemporaryDirectory directory_;
    support::FakeLog log_;
    platform::LinuxClock clock_;

private:
    void configure() { support::replaceFile(directory_ / "analytics.toml", "used = [" + patterns_ + "]\n"); }

    ledger::Ledger ledger_;
    std::string patterns_;
    platform::ConfigurationWatcher watcher_{directory_.path(), platform::ProviderLog(log_)};
    std::optional<platform::AnalyticsStore> store_;
};

class LinuxAnalyticsSubject final : public StoreSubject {
private:
    [[nodiscard]] std::unique_ptr<platform::EventKeeper> makeKeeper() override
    {
        return std::make_unique<platform::SqliteKeeper>(directory_.path(), clock_, platform::ProviderLog(log_));
    }
    [[nodiscard]] std::vector<AnalyticsEvent> kept() override
    {
        support::StoreReader reader(directory_ / platform::SqliteKeeper::fileName);
        const auto names = reader.texts("SELECT name FROM events ORDER BY id");
        const auto payloads = reader.texts("SELECT payload FROM events ORDER BY id");
        std::vector<AnalyticsEvent> events;
        for (std::size_t index = 0; index < names.size(); ++index)
            events.push_back(event(names[index], payloads.at(index)));
        return events;
    }
};

class MemoryAnalyticsSubject final : public StoreSubject {
private:
    [[nodiscard]] std::unique_ptr<platform::EventKeeper> makeKeeper() override
    {
        return std::make_unique<support::MemoryKeeper>(place_, clock_);
    }
    [[nodiscard]] std::vector<AnalyticsEvent> kept() override
    {
        std::vector<AnalyticsEvent> events;
        for (const support::KeptEvent& each : place_->all())
            events.push_back(event(each.name, each.payload));
        return events;
    }

    const std::shared_ptr<support::KeptEvents> place_ = std::make_shared<support::KeptEvents>();
};

class AnalyticsContract : public Suite<AnalyticsSubject> {
protected:
    // Returns when events of that name are wanted.
    void want(const std::string& name)
    {
        subject->use(name);
        ASSERT_TRUE(eventually([&] { return subject->analytics().isAnalyticsEventUsed(name); }));
    }
    void send(const std::string& name, Dictionary payload)
    {
        subject->analytics().sendAnalyticsEventLazy(platform::outsideTurn, {}, name,
                                                    [payload = std::move(payload)] { return payload; });
    }
};
KESTO_CONTRACT(AnalyticsContract, (provider<AnalyticsSubject, FakeAnalyticsSubject>("Fake")),
               (provider<AnalyticsSubject, LinuxAnalyticsSubject>("Linux")),
               (provider<AnalyticsSubject, MemoryAnalyticsSubject>("LinuxInMemory")));

TEST_P(AnalyticsContract, WantsEventsOfTheUsedNames)
{
    EXPECT_FALSE(subject->analytics().isAnalyticsEventUsed("com.quarn.a"));
    want("com.quarn.a");
    EXPECT_FALSE(subject->analytics().isAnalyticsEventUsed("com.quarn.b"));
    EXPECT_FALSE(subject->analytics().isAnalyticsEventUsed("com.quarn.a.more"));
    EXPECT_FALSE(subject->analytics().isAnalyticsEventUsed(""));
    subject->use("com.quarn.kesto.*");
    EXPECT_TRUE(eventually([&] { return subject->analytics().isAnalyticsEventUsed("com.quarn.kesto.a.b"); }));
    EXPECT_TRUE(subject->analytics().isAnalyticsEventUsed("com.quarn.a")) << "still";
}

TEST_P(AnalyticsContract, KeepsEventsInTheOrderInWhichTheyWereSent)
{
    want("com.quarn.a");
    want("com.quarn.b");
    const Dictionary payload{
        {"text", "é"}, {"on", true}, {"list", Array{1, Dictionary{{"a", -0.5}}}}, {"none", Value()}};
    send("com.quarn.a", payload);
    send("com.quarn.b", {});
    send("com.quarn.a", {{"n", 2}});
    EXPECT_THAT(subject->events(),
                ElementsAre(AnalyticsEvent{"com.quarn.a", payload}, AnalyticsEvent{"com.quarn.b", {}},
                            AnalyticsEvent{"com.quarn.a", {{"n", 2}}}));
}

TEST_P(AnalyticsContract, KeepsTheEventsOfATurnInTheirOrderOnceItIsOver)
{
    want("com.quarn.a");
    platform::Turn turn;
    for (int number = 1; number <= 3; ++number)
        subject->analytics().sendAnalyticsEventLazy(turn, {}, "com.quarn.a",
                                                    [number] { return Dictionary{{"n", number}}; });
    subject->end(turn);
    send("com.quarn.a", {{"n", 4}});
    EXPECT_THAT(subject->events(),
                ElementsAre(AnalyticsEvent{"com.quarn.a", {{"n", 1}}}, AnalyticsEvent{"com.quarn.a", {{"n", 2}}},
                            AnalyticsEvent{"com.quarn.a", {{"n", 3}}}, AnalyticsEvent{"com.quarn.a", {{"n", 4}}}));
}

TEST_P(AnalyticsContract, CountsWhatBecameOfEachEventAndHandsTheCountsOfATurnToItsEnd)
{
    want("com.quarn.a");
    platform::Turn turn;
    for (const char* name : {"com.quarn.a", "com.quarn.b", "com.quarn.a"})
        subject->analytics().sendAnalyticsEventLazy(turn, {}, name, [] { return Dictionary(); });
    EXPECT_EQ(subject->account()[ledger::Counter::Events], 0U);
    subject->end(turn);
    send("com.quarn.a", {});
    send("com.quarn.b", {});
    const ledger::Account account = subject->account();
    EXPECT_EQ(account[ledger::Counter::Events], 5U);
    EXPECT_EQ(account[ledger::Counter::Kept], 3U);
    EXPECT_EQ(account[ledger::Counter::Unwanted], 2U);
}

TEST_P(AnalyticsContract, BuildsAPayloadOnceAndLetsItsBuilderGo)
{
    want("com.quarn.a");
    int built = 0;
    auto held = std::make_shared<int>(7);
    const std::weak_ptr<int> watched = held;
    subject->analytics().sendAnalyticsEventLazy(platform::outsideTurn, {}, "com.quarn.a",
                                                [&built, held = std::move(held)] {
                                                    ++built;
                                                    return Dictionary{{"n", *held}};
                                                });
    EXPECT_LE(built, 1);
    EXPECT_EQ(subject->events().size(), 1U);
    EXPECT_EQ(subject->events().size(), 1U) << "even if it is read several times";
    EXPECT_EQ(built, 1);
    EXPECT_TRUE(watched.expired());
}

TEST_P(AnalyticsContract, DropsAnUnwantedEventWithItsBuilder)
{
    want("com.quarn.a");
    auto held = std::make_shared<int>(7);
    const std::weak_ptr<int> watched = held;
    subject->analytics().sendAnalyticsEventLazy(platform::outsideTurn, {}, "com.quarn.b", [held = std::move(held)] {
        ADD_FAILURE() << "the service does not need the payload";
        return Dictionary{{"n", *held}};
    });
    EXPECT_TRUE(watched.expired());
    subject->use("com.quarn.*");
    ASSERT_TRUE(eventually([&] { return subject->analytics().isAnalyticsEventUsed("com.quarn.b"); }));
    EXPECT_THAT(subject->events(), IsEmpty()) << "also when such events are wanted later";
}

TEST_P(AnalyticsContract, LosesAnEventWhosePayloadHoldsANumberThatIsNotFinite)
{
    want("com.quarn.a");
    send("com.quarn.a", {{"n", 1}});
    send("com.quarn.a", {{"n", std::numeric_limits<double>::quiet_NaN()}});
    send("com.quarn.a", {{"n", Array{std::numeric_limits<float>::infinity()}}});
    send("com.quarn.a", {{"n", 2}});
    EXPECT_THAT(subject->events(),
                ElementsAre(AnalyticsEvent{"com.quarn.a", {{"n", 1}}}, AnalyticsEvent{"com.quarn.a", {{"n", 2}}}));
}

TEST_P(AnalyticsContract, TakesEventsFromManyThreadsEachInItsOrder)
{
    constexpr int threads = 4;
    constexpr int each = 500;
    want("com.quarn.a");
    {
        std::vector<std::jthread> senders;
        for (int sender = 0; sender < threads; ++sender)
            senders.emplace_back([&, sender] {
                for (int number = 0; number < each; ++number) {
                    EXPECT_TRUE(subject->analytics().isAnalyticsEventUsed("com.quarn.a"));
                    send("com.quarn.a", {{"sender", sender}, {"number", number}});
                }
            });
    }
    std::vector<int> next(threads, 0);
    for (const AnalyticsEvent& event : subject->events()) {
        int& expected = next.at(static_cast<std::size_t>(event.payload.find("sender")->number()->int64Value()));
        EXPECT_EQ(event.payload.find("number")->number()->int64Value(), expected);
        ++expected;
    }
    EXPECT_EQ(next, std::vector<int>(threads, each));
}

} // namespace
} // namespace contract
