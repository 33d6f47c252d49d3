// SPDX-License-Identifier: Apache-2.0
// When a leaked haptics session is suspected, and the request for a snapshot.
#include "sinks/KestoReportingVorpStateManagerUtility.h"
#include "support/MessageKinds.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <limits>

namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using platform::LogLevel;
using support::IsLine;
using support::playback;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;
using enum LogLevel;

constexpr AudioEventType gimbo = 8;

Dictionary hapticTime(const Value& seconds)
{
    return {{"Haptic_Active_Hardware_Time_Seconds", seconds}};
}

class SessionOfServiceType final : public sinks::SinkSession {
public:
    explicit SessionOfServiceType(AudioServiceType serviceType) : serviceType_(serviceType) { }
    [[nodiscard]] AudioServiceType serviceType() const override { return serviceType_; }
    [[nodiscard]] Dictionary configuration() const override { return {}; }
    [[nodiscard]] platform::Origin announcedOrigin(platform::Turn&) override { return {}; }

private:
    const AudioServiceType serviceType_;
};

class VorpStateManagerTest : public testing::Test {
protected:
    void send(const std::optional<Dictionary>& message, AudioEventType type = gimbo,
              AudioEventCategory category = playback)
    {
        manager.handleEvent(message, category, type, std::make_shared<SessionOfServiceType>(serviceType), "player");
    }
    void expectNothingHappened()
    {
        EXPECT_EQ(manager.leakedHapticsSessionCounter(), 0U);
        EXPECT_EQ(manager.messageCache(), Dictionary());
        EXPECT_THAT(platform.log.lines(), IsEmpty());
        EXPECT_EQ(platform.bugCapture.reportersMade(), 0);
    }
    [[nodiscard]] auto& snapshots() { return platform.bugCapture.snapshots(); }

    const Dictionary a = hapticTime(1);
    const Dictionary b = hapticTime(2);
    const Dictionary c = hapticTime(3);

    support::TestPlatform platform;
    AudioServiceType serviceType = 3;
    KestoReportingUtilityVorpStateManager manager;
};

// --- what counts

TEST_F(VorpStateManagerTest, BeginsWithNothingCountedAndNoReporter)
{
    expectNothingHappened();
    EXPECT_EQ(manager.ulmetReporter(), nullptr);
}

TEST_F(VorpStateManagerTest, IgnoresAMissingMessage)
{
    send(std::nullopt);
    expectNothingHappened();
}

TEST_F(VorpStateManagerTest, IgnoresEveryOtherTypeOfEvent)
{
    for (AudioEventType type = 0; type <= 20; ++type)
        if (type != gimbo)
            send(a, type);
    send(a, 65535);
    expectNothingHappened();
}

TEST_F(VorpStateManagerTest, IgnoresMessagesWithoutHapticTime)
{
    send(Dictionary());
    send(Dictionary{{"Haptic Active Hardware Time Seconds", 1}, {"haptic_active_hardware_time_seconds", 1}});
    send(Dictionary{{"nested", Value(a)}});
    expectNothingHappened();
}

TEST_F(VorpStateManagerTest, CountsAndKeepsTheFirstReport)
{
    const Dictionary report{{"Haptic_Active_Hardware_Time_Seconds", 1.5}, {"other", "entry"}};
    send(report);
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 1U);
    EXPECT_EQ(manager.messageCache(), report) << "all of it, not only the time";
    EXPECT_THAT(platform.log.take(), ElementsAre(IsLine(Info, "kerb", "Incrementing Vorp counter. player")));
    EXPECT_EQ(platform.bugCapture.reportersMade(), 0);
}

TEST_F(VorpStateManagerTest, CountsForEveryCategory)
{
    send(a, gimbo, 0xFFFFFFFF);
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 1U);
    send(b, gimbo, 0);
    EXPECT_THAT(snapshots(), SizeIs(1));
}

TEST_F(VorpStateManagerTest, CountsForEveryTime)
{
    const Value times[] = {0, -1, "text", Value(), false, std::numeric_limits<double>::quiet_NaN(), Array{1}};
    for (const Value& time : times) {
        KestoReportingUtilityVorpStateManager fresh;
        fresh.handleEvent(hapticTime(time), playback, gimbo, std::make_shared<SessionOfServiceType>(serviceType),
                          "player");
        EXPECT_EQ(fresh.leakedHapticsSessionCounter(), 1U) << time.text();
    }
}

TEST_F(VorpStateManagerTest, IgnoresARepeatOfTheReportCountedLast)
{
    send(a);
    platform.log.clear();
    send(a);
    send(hapticTime(1)); // equal, not the same
    send(hapticTime(1.0)); // by value
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 1U);
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_THAT(snapshots(), IsEmpty());
}

TEST_F(VorpStateManagerTest, IgnoresTheSameMessageSentToAnotherSessionThoughItHoldsWhatIsNoNumber)
{
    const Dictionary message = hapticTime(std::numeric_limits<double>::quiet_NaN());
    send(message);
    send(message);
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 1U);
    EXPECT_THAT(snapshots(), IsEmpty());
}

TEST_F(VorpStateManagerTest, TellsTwoMessagesApartThatHoldWhatIsNoNumber)
{
    send(hapticTime(std::numeric_limits<double>::quiet_NaN()));
    send(hapticTime(std::numeric_limits<double>::quiet_NaN()));
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 0U);
    EXPECT_THAT(snapshots(), SizeIs(1));
}

TEST_F(VorpStateManagerTest, TheOrderOfEntriesMakesNoOtherReport)
{
    send(a.with("x", 1).with("y", 2));
    send(Dictionary{{"y", 2}, {"x", 1}}.mergedWith(a));
    EXPECT_THAT(snapshots(), IsEmpty());
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 1U);
}

TEST_F(VorpStateManagerTest, AnyEntryMakesAnotherReportThoughTheTimeIsTheSame)
{
    send(a);
    send(a.with("kestoreporting_timestamp", 1));
    EXPECT_THAT(snapshots(), SizeIs(1));
}

TEST_F(VorpStateManagerTest, OtherMessagesBetweenTwoReportsMakeNoDifference)
{
    send(a);
    send(b, gimbo + 1);
    send(Dictionary{{"x", 1}});
    send(std::nullopt);
    EXPECT_EQ(manager.messageCache(), a);
    send(a);
    EXPECT_THAT(snapshots(), IsEmpty());
    send(b);
    EXPECT_THAT(snapshots(), SizeIs(1));
}

TEST_F(VorpStateManagerTest, CountsReportsOfAllSessionsTogether)
{
    send(a);
    serviceType = 1;
    send(b);
    EXPECT_THAT(snapshots(), SizeIs(1));
}

// --- the snapshot

TEST_F(VorpStateManagerTest, TheSecondDistinctReportFiresOneSnapshotAndBeginsAnew)
{
    send(a);
    send(b);
    EXPECT_THAT(snapshots(), SizeIs(1));
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 0U);
    EXPECT_EQ(manager.messageCache(), Dictionary());
    platform.log.clear();

    send(c);
    EXPECT_THAT(snapshots(), SizeIs(1)) << "a third only counts";
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 1U);
    EXPECT_EQ(manager.messageCache(), c);
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kerb", "Incrementing Vorp counter. player")));
}

TEST_F(VorpStateManagerTest, TheReportThatFiredIsNotKeptSoItsRepeatCounts)
{
    send(a);
    send(b);
    send(b);
    EXPECT_EQ(manager.leakedHapticsSessionCounter(), 1U);
    EXPECT_EQ(manager.messageCache(), b);
    send(a);
    EXPECT_THAT(snapshots(), SizeIs(2));
}

TEST_F(VorpStateManagerTest, AsksForASnapshotThatSaysWhatWasSeen)
{
    send(a);
    send(b);
    ASSERT_THAT(snapshots(), SizeIs(1));
    EXPECT_EQ(snapshots()[0].signature,
              (Dictionary{{"domain", "Sonalis"},
                          {"type", "haptics"},
                          {"subType", "Playback"},
                          {"subtypeContext", "Gimbo"},
                          {"detectedProcess", "player"}}));
    EXPECT_EQ(snapshots()[0].duration, 0);
    EXPECT_EQ(snapshots()[0].event, std::nullopt);
    EXPECT_EQ(snapshots()[0].payload, std::nullopt);
}

TEST_F(VorpStateManagerTest, NamesTheServiceAndTheWholeCategoryOfTheReportThatFires)
{
    serviceType = 4;
    send(a);
    serviceType = 2;
    send(b, gimbo, 0x10000004);
    ASSERT_THAT(snapshots(), SizeIs(1));
    EXPECT_EQ(*snapshots()[0].signature.find("type"), Value("telephony"));
    EXPECT_EQ(*snapshots()[0].signature.find("subType"), Value("DSP_Playback"));
}

TEST_F(VorpStateManagerTest, NamesTheProcessThatSentTheReportThatFires)
{
    const auto session = std::make_shared<SessionOfServiceType>(serviceType);
    manager.handleEvent(a, playback, gimbo, session, "first");
    manager.handleEvent(b, playback, gimbo, session, "second");
    ASSERT_THAT(snapshots(), SizeIs(1));
    EXPECT_EQ(*snapshots()[0].signature.find("detectedProcess"), Value("second"));
}

TEST_F(VorpStateManagerTest, SaysThatItAsksAndNothingMoreUntilItIsAnswered)
{
    send(a);
    platform.log.clear();
    send(b);
    EXPECT_THAT(platform.log.take(), ElementsAre(IsLine(Info, "kerb", "Getting snapshot with Ulmet Reporter")));

    snapshots()[0].reply({{"success", true}, {"snapshot", "7"}});
    EXPECT_THAT(platform.log.take(),
                ElementsAre(IsLine(Info, "kerb", R"(Response from ulmetReporter : {"success":true,"snapshot":"7"})")));
}

TEST_F(VorpStateManagerTest, EachSnapshotHasANewReporter)
{
    send(a);
    EXPECT_EQ(manager.ulmetReporter(), nullptr);
    send(b);
    const auto* const first = manager.ulmetReporter();
    EXPECT_NE(first, nullptr);
    send(a);
    EXPECT_EQ(manager.ulmetReporter(), first) << "kept until the next is needed";
    send(b);
    EXPECT_EQ(platform.bugCapture.reportersMade(), 2);
    EXPECT_NE(manager.ulmetReporter(), nullptr);
}

TEST_F(VorpStateManagerTest, TheAnswerMayComeWhenTheManagerIsGone)
{
    {
        KestoReportingUtilityVorpStateManager other;
        const auto session = std::make_shared<SessionOfServiceType>(serviceType);
        other.handleEvent(a, playback, gimbo, session, "player");
        other.handleEvent(b, playback, gimbo, session, "player");
    }
    platform.log.clear();
    snapshots()[0].reply({});
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kerb", "Response from ulmetReporter : {}")));
}

} // namespace
