// SPDX-License-Identifier: Apache-2.0
// The events of a message, and their names.
#include "sinks/KestoReportingFennicBridge.h"
#include "sinks/KestoReportingGimboUtility.h"
#include "sinks/KestoReportingTrelmBridge.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <thread>

namespace {

using foundation::Dictionary;
using testing::ElementsAre;
using testing::IsEmpty;

class GivenSession final : public sinks::SinkSession {
public:
    [[nodiscard]] AudioServiceType serviceType() const override { return type; }
    [[nodiscard]] Dictionary configuration() const override { return settings; }
    [[nodiscard]] platform::Origin announcedOrigin(platform::Turn& turn) override
    {
        turn.events.announce(platform::SessionBegin{.number = origin.session});
        return origin;
    }

    AudioServiceType type = 2;
    Dictionary settings;
    platform::Origin origin;
};

class FennicBridgeTest : public testing::Test {
protected:
    void send(const Dictionary& message, AudioEventCategory category = 4, AudioEventType type = 1)
    {
        KestoReportingFennicBridge::handleEvent(platform.turn, message, category, type, session);
    }

    support::TestPlatform platform;
    std::shared_ptr<GivenSession> session = std::make_shared<GivenSession>();
};

TEST_F(FennicBridgeTest, OffersAnEventForAllServicesAndThenOneForTheSessionsOwn)
{
    platform.analytics.use("*");
    send({});
    EXPECT_THAT(platform.analytics.asked(),
                ElementsAre("com.quarn.kesto.Playback.Start", "com.quarn.telephony.Playback.Start"));
    EXPECT_THAT(platform.analytics.sent(),
                ElementsAre("com.quarn.kesto.Playback.Start", "com.quarn.telephony.Playback.Start"));
}

TEST_F(FennicBridgeTest, SaysWhoIsBehindTheEventsAndAnnouncesItOnce)
{
    platform.analytics.use("*");
    session->origin = {.source = 3, .session = 4};
    send({});
    EXPECT_THAT(platform.analytics.origins(),
                ElementsAre(platform::Origin{.source = 3, .session = 4}, platform::Origin{.source = 3, .session = 4}))
        << "the session's owner";
    EXPECT_THAT(platform.turn.events.announcements().sessions, ElementsAre(platform::SessionBegin{.number = 4}));
    platform.analytics.clear();
    KestoReportingFennicBridge::handleEvent(platform.turn, {}, 4, 1, session, 9);
    EXPECT_THAT(platform.analytics.origins(),
                ElementsAre(platform::Origin{.source = 9, .session = 4}, platform::Origin{.source = 9, .session = 4}))
        << "another client sent the message";
}

TEST_F(FennicBridgeTest, AnnouncesNothingForEventsThatAreNotWanted)
{
    session->origin = {.source = 3, .session = 4};
    send({});
    EXPECT_TRUE(platform.turn.events.empty());
}

TEST_F(FennicBridgeTest, SendsTheFirstEventBeforeItAsksAboutTheSecond)
{
    platform.analytics.use("*");
    std::vector<std::size_t> sentBefore;
    platform.analytics.setObserver([&](const std::string&) { sentBefore.push_back(platform.analytics.sent().size()); });
    send({});
    platform.analytics.setObserver(nullptr);
    EXPECT_THAT(sentBefore, ElementsAre(0, 1));
}

TEST_F(FennicBridgeTest, BuildsThePayloadOfBothEventsOnSeveralThreadsAtOnce)
{
    platform.analytics.use("*");
    for (int round = 0; round < 100; ++round) {
        send({{"a", round}});
        std::vector<std::jthread> threads;
        for (auto& builder : platform.analytics.takeBuilders())
            threads.emplace_back([&session = session, round, builder = std::move(builder)]() mutable {
                EXPECT_EQ(builder(), (Dictionary{{"a", round}, {"HostApplicationDisplayID", "Unknown"}}));
                EXPECT_GT(session.use_count(), 1) << "until it is released";
            });
        EXPECT_EQ(threads.size(), 2U);
    }
    EXPECT_EQ(session.use_count(), 1);
}

TEST_F(FennicBridgeTest, NamesEventsByCategoryTypeAndService)
{
    platform.analytics.use("*");
    send({}, 7, 6);
    EXPECT_THAT(platform.analytics.sent(), ElementsAre("com.quarn.kesto.IO.Error", "com.quarn.telephony.IO.Error"));
}

TEST_F(FennicBridgeTest, NamesTheGroupOfACategory)
{
    platform.analytics.use("*");
    send({}, 0x10000004, 1);
    EXPECT_THAT(platform.analytics.sent(),
                ElementsAre("com.quarn.kesto.DSP_Playback.Start", "com.quarn.telephony.DSP_Playback.Start"));
}

TEST_F(FennicBridgeTest, NamesWhatItDoesNotKnow)
{
    platform.analytics.use("*");
    session->type = 65535;
    send({}, 0xFFFFFFFF, 65535);
    session->type = 14;
    send({}, 0, 0);
    EXPECT_THAT(platform.analytics.sent(),
                ElementsAre("com.quarn.kesto.Undefined.Unknown", "com.quarn.unknown.Undefined.Unknown",
                            "com.quarn.kesto.Undefined.Generic", "com.quarn.telephony.Undefined.Generic"));
}

// Numbers determine the cache places of names: 65 has the place of 1, 64 that of 0, 68 that of 4.
TEST_F(FennicBridgeTest, NamesEventsByTheirOwnNumbersAfterOthers)
{
    platform.analytics.use("*");
    session->type = 0;
    send({}, 4, 1);
    send({}, 4, 65);
    session->type = 64;
    send({}, 4, 65);
    send({}, 68, 65);
    session->type = 0;
    send({}, 4, 1);
    EXPECT_THAT(platform.analytics.sent(),
                ElementsAre("com.quarn.kesto.Playback.Start", "com.quarn.generic.Playback.Start",
                            "com.quarn.kesto.Playback.Generic", "com.quarn.generic.Playback.Generic",
                            "com.quarn.kesto.Playback.Generic", "com.quarn.telephony.Playback.Generic",
                            "com.quarn.kesto.Undefined.Generic", "com.quarn.telephony.Undefined.Generic",
                            "com.quarn.kesto.Playback.Start", "com.quarn.generic.Playback.Start"));
}

TEST_F(FennicBridgeTest, SendsEachNameOnlyWhenItIsWanted)
{
    platform.analytics.use("com.quarn.kesto.*");
    send({{"a", 1}});
    EXPECT_THAT(platform.analytics.sent(), ElementsAre("com.quarn.kesto.Playback.Start"));

    platform.analytics.use("com.quarn.alarms.*");
    platform.analytics.clear();
    session->type = 4;
    send({{"a", 1}}, 14, 11);
    EXPECT_THAT(platform.analytics.sent(),
                ElementsAre("com.quarn.kesto.Volume.Summary", "com.quarn.alarms.Volume.Summary"));
}

TEST_F(FennicBridgeTest, SendsTheServicesNameAloneWhenOnlyThatIsWanted)
{
    platform.analytics.use("com.quarn.telephony.*");
    send({});
    EXPECT_THAT(platform.analytics.asked(),
                ElementsAre("com.quarn.kesto.Playback.Start", "com.quarn.telephony.Playback.Start"));
    EXPECT_THAT(platform.analytics.sent(), ElementsAre("com.quarn.telephony.Playback.Start"));
}

TEST_F(FennicBridgeTest, BuildsNothingWhenNeitherNameIsWanted)
{
    send({{"a", 1}});
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
    EXPECT_EQ(session.use_count(), 1) << "an unneeded payload does not hold the session";
}

TEST_F(FennicBridgeTest, BuildsNoPayloadBeforeItIsNeeded)
{
    platform.analytics.use("*");
    send({{"a", 1}});
    EXPECT_EQ(platform.analytics.timesBuilt(), 0);
    EXPECT_GT(session.use_count(), 1);
}

TEST_F(FennicBridgeTest, AddsTheApplicationOfTheSessionsConfiguration)
{
    platform.analytics.use("*");
    session->settings = {{"HostApplicationDisplayID", "org.player"}};
    send({{"a", 1}});
    const Dictionary expected{{"a", 1}, {"HostApplicationDisplayID", "org.player"}};
    EXPECT_THAT(platform.analytics.events(),
                ElementsAre(support::AnalyticsEvent{"com.quarn.kesto.Playback.Start", expected},
                            support::AnalyticsEvent{"com.quarn.telephony.Playback.Start", expected}));
}

TEST_F(FennicBridgeTest, AddsUnknownWhereTheConfigurationNamesNoApplication)
{
    platform.analytics.use("com.quarn.kesto.*");
    send({});
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Playback.Start"),
                ElementsAre(Dictionary{{"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(FennicBridgeTest, NeverOverwritesTheApplicationOfAPayload)
{
    platform.analytics.use("com.quarn.kesto.*");
    session->settings = {{"HostApplicationDisplayID", "org.player"}};
    const Dictionary message{{"HostApplicationDisplayID", "org.other"}};
    send(message);
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Playback.Start"), ElementsAre(message));
}

TEST_F(FennicBridgeTest, PassesThePayloadOnAsItCame)
{
    platform.analytics.use("com.quarn.kesto.*");
    send({{"a key", 1}, {"kestoreporting_timestamp", 2.5}});
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Playback.Start"),
                ElementsAre(Dictionary{
                    {"a key", 1}, {"kestoreporting_timestamp", 2.5}, {"HostApplicationDisplayID", "Unknown"}}));
}

TEST_F(FennicBridgeTest, ReadsTheConfigurationWhenThePayloadIsBuilt)
{
    platform.analytics.use("com.quarn.kesto.*");
    send({});
    session->settings = {{"HostApplicationDisplayID", "org.player"}};
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Playback.Start"),
                ElementsAre(Dictionary{{"HostApplicationDisplayID", "org.player"}}));
}

TEST_F(FennicBridgeTest, HoldsTheSessionNoLongerThanItsPayload)
{
    platform.analytics.use("*");
    send({});
    platform.analytics.clear();
    EXPECT_EQ(session.use_count(), 1);
}

TEST_F(FennicBridgeTest, LogsNothing)
{
    platform.analytics.use("*");
    send({{"a", 1}});
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

class SilentSinksTest : public FennicBridgeTest { };

TEST_F(SilentSinksTest, AcceptEveryMessageAndDoNothing)
{
    platform.analytics.use("*");
    KestoReportingGimboUtility::handleEvent({{"a", 1}}, 4, 8, session);
    KestoReportingTrelmBridge::handleEvent({{"a", 1}}, 4, 1, session);
    EXPECT_THAT(platform.analytics.asked(), IsEmpty());
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
    EXPECT_EQ(session.use_count(), 1);
}

} // namespace
