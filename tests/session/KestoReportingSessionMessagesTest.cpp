// SPDX-License-Identifier: Apache-2.0
// A session's handling of a message: it normalises it, compares it with the previous one of its kind, and records it.
#include "session/KestoReportingSession.h"
#include "support/EmittedCodes.h"
#include "support/MessageKinds.h"
#include "support/TestPlatform.h"

#include <charconv>
#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace {

using namespace std::chrono_literals;
using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Value;
using support::IsLine;
using support::playback;
using support::sessionMessageAccepted;
using testing::Contains;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;

constexpr AudioEventCategory errorCategory = 11;
constexpr AudioEventType start = 1;
constexpr AudioEventType errorType = 6;

Dictionary record(const std::string& identifier, const Dictionary& payload)
{
    return {{foundation::String(identifier), payload}};
}

class SessionMessagesTest : public testing::Test {
protected:
    explicit SessionMessagesTest(bool isInternal = false)
    {
        platform.deviceProperties.setInternalBuild(isInternal);
        session->start();
        platform.log.clear();
        platform.traceEmitter.take();
    }

    void send(const std::optional<Dictionary>& message, AudioEventCategory category = playback,
              AudioEventType type = start)
    {
        session->sendMessage(platform.turn.tally, message, category, type, nullptr);
    }
    // The recorded payload; the session sets the tag itself.
    [[nodiscard]] std::vector<Dictionary> recorded() const { return session->nestedAggregatedPayloadData().value(); }
    [[nodiscard]] std::vector<std::string> identifiers() const
    {
        std::vector<std::string> identifiers;
        for (const auto& message : recorded())
            identifiers.emplace_back(message.keys().front().view());
        return identifiers;
    }

    support::TestPlatform platform;
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
};

class InternalSessionMessagesTest : public SessionMessagesTest {
protected:
    InternalSessionMessagesTest() : SessionMessagesTest(true) { }
};

// --- normalisation

TEST_F(SessionMessagesTest, AreRecordedUnderAnIdentifierWithTheirTag)
{
    send(Dictionary{{"a", 1}});
    EXPECT_THAT(recorded(), ElementsAre(record("Playback_Start_1", {{"a", 1}, {"audiotag", "PlaybackStart"}})));
    EXPECT_EQ(session->messageIdentifierCounts(), (Dictionary{{"Playback_Start", 1}}));
}

TEST_F(SessionMessagesTest, AreTaggedWithTheirOwnTypeAfterOthersOfTheirCategory)
{
    for (const AudioEventType type : {1, 2, 3, 1})
        send(Dictionary{{"type", type}}, playback, type);
    EXPECT_THAT(recorded(),
                ElementsAre(record("Playback_Start_1", {{"type", 1}, {"audiotag", "PlaybackStart"}}),
                            record("Playback_Stop_1", {{"type", 2}, {"audiotag", "PlaybackStop"}}),
                            record("Playback_Activate_1", {{"type", 3}, {"audiotag", "PlaybackActivate"}})));
}

TEST_F(SessionMessagesTest, AreNamedByGroupAndUnknownNumbersToo)
{
    send(Dictionary{}, 0x10000004, start);
    send(Dictionary{}, 0x00030004, 0);
    send(Dictionary{}, 0xFFFFFFFF, 65535);
    EXPECT_THAT(identifiers(), ElementsAre("DSP_Playback_Start_1", "_Playback_Generic_1", "Undefined_Unknown_1"));
}

TEST_F(SessionMessagesTest, HaveTheirKeysFreedOfBlanks)
{
    send(Dictionary{{"a b", 1}});
    EXPECT_THAT(recorded(), ElementsAre(record("Playback_Start_1", {{"a_b", 1}, {"audiotag", "PlaybackStart"}})));
}

TEST_F(SessionMessagesTest, GetTheirTagAfterTheirKeysWereFreedOfBlanks)
{
    send(Dictionary{{"audiotag", "mine"}, {"kestoreporting timestamp", 5}});
    EXPECT_THAT(recorded(), ElementsAre(record("Playback_Start_1", {{"audiotag", "PlaybackStart"}})));
}

TEST_F(SessionMessagesTest, LoseTheirTimestampOutsideInternalBuilds)
{
    send(Dictionary{{"kestoreporting_timestamp", 5}, {"systemuptime_sec", 6}, {"processuptime_ms", 7}});
    EXPECT_THAT(recorded(),
                ElementsAre(record("Playback_Start_1",
                                   {{"systemuptime_sec", 6}, {"processuptime_ms", 7}, {"audiotag", "PlaybackStart"}})));
}

TEST_F(InternalSessionMessagesTest, KeepTheirTimestamp)
{
    send(Dictionary{{"kestoreporting_timestamp", 5}});
    EXPECT_THAT(
        recorded(),
        ElementsAre(record("Playback_Start_1", {{"kestoreporting_timestamp", 5}, {"audiotag", "PlaybackStart"}})));
}

TEST_F(SessionMessagesTest, ThatAreNoneCountAsEmpty)
{
    send(std::nullopt, 8, 5);
    EXPECT_THAT(recorded(), ElementsAre(record("Setup_Setup_1", {{"audiotag", "SetupSetup"}})));
    send(Dictionary{}, 8, 5);
    EXPECT_THAT(recorded(), SizeIs(1));
}

TEST_F(SessionMessagesTest, AreNotChangedForWhoeverSentThem)
{
    const Dictionary message{{"a b", 1}, {"kestoreporting_timestamp", 5}};
    send(message);
    EXPECT_EQ(message, (Dictionary{{"a b", 1}, {"kestoreporting_timestamp", 5}}));
}

// --- repetition

TEST_F(SessionMessagesTest, ThatRepeatTheOneBeforeAreDroppedWithAWord)
{
    send(Dictionary{{"a", 1}});
    platform.log.clear();
    send(Dictionary{{"a", 1}});
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1"));
    EXPECT_EQ(session->messageIdentifierCounts(), (Dictionary{{"Playback_Start", 1}}));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerr", "sending message for session owned by 42"),
                            IsLine(Debug, "kerr", "dropping redundant event")));
}

TEST_F(SessionMessagesTest, ThatAreRecordedAreNotSaidToBeDropped)
{
    send(Dictionary{{"a", 1}});
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerr", "sending message for session owned by 42")));
}

class TimeKeyTest : public InternalSessionMessagesTest, public testing::WithParamInterface<const char*> { };

TEST_P(TimeKeyTest, DoesNotMakeAMessageAnotherOne)
{
    const foundation::String key(GetParam());
    send(Dictionary{{"a", 1}, {key, 1}});
    send(Dictionary{{"a", 1}, {key, 2}});
    send(Dictionary{{"a", 1}});
    send(Dictionary{{key, "not even a number"}, {"a", 1}});
    EXPECT_THAT(recorded(),
                ElementsAre(record("Playback_Start_1", {{"a", 1}, {key, 1}, {"audiotag", "PlaybackStart"}})));
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Debug, "kerr", "dropping redundant event")).Times(3));
}

TEST_P(TimeKeyTest, IsRecordedWithAMessageThatSaysSomethingElse)
{
    const foundation::String key(GetParam());
    send(Dictionary{{"a", 1}, {key, 1}});
    send(Dictionary{{"a", 2}, {key, 2}});
    EXPECT_THAT(recorded().at(1), record("Playback_Start_2", {{"a", 2}, {key, 2}, {"audiotag", "PlaybackStart"}}));
}

TEST_P(TimeKeyTest, CountsWithinADictionary)
{
    const foundation::String key(GetParam());
    send(Dictionary{{"a", Dictionary{{key, 1}}}});
    send(Dictionary{{"a", Dictionary{{key, 2}}}});
    EXPECT_THAT(recorded(), SizeIs(2));
}

INSTANTIATE_TEST_SUITE_P(TimeKeys, TimeKeyTest,
                         testing::Values("processuptime_ms", "systemuptime_sec", "kestoreporting_timestamp"));

TEST_F(SessionMessagesTest, WithAnErrorCategoryAreNeverDropped)
{
    send(Dictionary{{"a", 1}}, errorCategory, start);
    send(Dictionary{{"a", 1}}, errorCategory, start);
    EXPECT_THAT(identifiers(), ElementsAre("Error_Start_1", "Error_Start_2"));
    EXPECT_THAT(platform.log.lines(), Not(Contains(IsLine(Debug, "kerr", "dropping redundant event"))));
}

TEST_F(SessionMessagesTest, WithAnErrorTypeAreNeverDropped)
{
    send(Dictionary{{"a", 1}}, playback, errorType);
    send(Dictionary{{"a", 1}}, playback, errorType);
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Error_1", "Playback_Error_2"));
}

TEST_F(SessionMessagesTest, WithAnErrorCategoryOfAGroupAreDropped)
{
    send(Dictionary{{"a", 1}}, 0x10000000 | errorCategory, start);
    send(Dictionary{{"a", 1}}, 0x10000000 | errorCategory, start);
    EXPECT_THAT(identifiers(), ElementsAre("DSP_Error_Start_1"));
}

TEST_F(SessionMessagesTest, ThatGoBackAndForthAreAllRecorded)
{
    send(Dictionary{{"a", 1}});
    send(Dictionary{{"a", 2}});
    send(Dictionary{{"a", 1}});
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "Playback_Start_2", "Playback_Start_3"));
}

TEST_F(SessionMessagesTest, AreComparedWithTheLastOfTheirOwnKind)
{
    send(Dictionary{{"a", 1}}, playback, start);
    send(Dictionary{{"a", 1}}, playback, 2);
    send(Dictionary{{"a", 1}}, 2, start);
    send(Dictionary{{"a", 1}}, playback, start);
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "Playback_Stop_1", "Record_Start_1"));
}

TEST_F(SessionMessagesTest, WhoseNumbersShareTheirNamesAreOneKind)
{
    send(Dictionary{{"a", 1}}, 0, 0);
    send(Dictionary{{"a", 1}}, 16, 19);
    send(Dictionary{{"a", 2}}, 0xFFFFFFFF, 77);
    EXPECT_THAT(identifiers(), ElementsAre("Undefined_Generic_1", "Undefined_Generic_2"));
}

TEST_F(SessionMessagesTest, AreEqualWhateverTheOrderOfTheirKeysAndTheKindsOfTheirNumbers)
{
    send(Dictionary{{"a", 1}, {"b", 0}});
    send(Dictionary{{"b", false}, {"a", 1.0}});
    send(Dictionary{{"b", 0U}, {"a", true}});
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1"));
}

TEST_F(SessionMessagesTest, ThatHaveMoreOrFewerKeysAreOtherMessages)
{
    send(Dictionary{{"a", 1}});
    send(Dictionary{{"a", 1}, {"b", Value()}});
    send(Dictionary{{"a", 1}});
    EXPECT_THAT(recorded(), SizeIs(3));
}

TEST_F(SessionMessagesTest, TellWhetherTheyWereDropped)
{
    EXPECT_FALSE(session->createMessageIdentifier(platform.turn.tally, playback, start, {{"a", 1}}));
    EXPECT_TRUE(session->createMessageIdentifier(platform.turn.tally, playback, start, {{"a", 1}}));
    EXPECT_FALSE(session->createMessageIdentifier(platform.turn.tally, playback, errorType, {{"a", 1}}));
    EXPECT_FALSE(session->createMessageIdentifier(platform.turn.tally, playback, errorType, {{"a", 1}}));
    EXPECT_THAT(recorded().front(), record("Playback_Start_1", {{"a", 1}})) << "as given";
}

TEST_F(SessionMessagesTest, AreCountedByWhatBecameOfThem)
{
    using ledger::Counter;
    platform.turn.tally.clear();
    send(Dictionary{{"a", 1}});
    send(Dictionary{{"a", 1}});
    send(Dictionary{{"a", 2}});
    const ledger::Tally& tally = platform.turn.tally;
    EXPECT_EQ(tally[Counter::Deliveries], 3U);
    EXPECT_EQ(tally[Counter::Recorded], 2U);
    EXPECT_EQ(tally[Counter::Repeated], 1U);
    session->stop(platform.turn); // with a summary
    EXPECT_EQ(tally[Counter::Deliveries], 4U);
    EXPECT_EQ(tally[Counter::Recorded], 3U);
    EXPECT_EQ(tally[Counter::SessionsStopped], 1U);
    session->stop(platform.turn);
    EXPECT_EQ(tally[Counter::SessionsStopped], 1U);
    send(Dictionary{{"a", 3}});
    EXPECT_EQ(tally[Counter::Deliveries], 5U);
    EXPECT_EQ(tally[Counter::Inert], 1U);
}

// --- outside a run

TEST_F(SessionMessagesTest, ToASessionThatIsNotStartedAreNotRecorded)
{
    session->stop(platform.turn);
    platform.log.clear();
    platform.traceEmitter.take();
    send(Dictionary{{"a", 1}});
    EXPECT_FALSE(session->createMessageIdentifier(platform.turn.tally, playback, start, {{"a", 1}}));
    EXPECT_EQ(session->nestedAggregatedPayloadData(), std::nullopt);
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerr", "sending message for session owned by 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionMessageAccepted));
}

// --- markers and replies

TEST_F(SessionMessagesTest, LeaveAMarkerEachRecordedOrNot)
{
    send(Dictionary{{"a", 1}});
    send(Dictionary{{"a", 1}});
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionMessageAccepted, sessionMessageAccepted));
}

TEST_F(SessionMessagesTest, AreAnsweredBeforeTheCallReturnsWithNoErrorWhateverBecomesOfThem)
{
    int replies = 0;
    const auto reply = [&](const std::optional<utility::ReplyError>& error) {
        EXPECT_EQ(error, std::nullopt);
        EXPECT_THAT(platform.traceEmitter.take(), SizeIs(1)) << "the reply comes after the marker";
        ++replies;
    };
    for (const bool sync : {true, false})
        session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, playback, start, sync, reply);
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, playback, start, reply);
    session->stop(platform.turn);
    platform.traceEmitter.take();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, playback, start, reply);
    EXPECT_EQ(replies, 4);
}

TEST_F(SessionMessagesTest, AreHandledTheSameSynchronouslyOrNot)
{
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, playback, start, true, nullptr);
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 2}}, playback, start, false, nullptr);
    EXPECT_THAT(identifiers(), ElementsAre("Playback_Start_1", "Playback_Start_2"));
    EXPECT_EQ(platform.workQueues.pending(), 0U);
}

// --- memory

TEST(SessionMemory, ThatIsUsedUpCostsMessagesAndIsSaidOnce)
{
    support::TestPlatform platform;
    const auto budget = std::make_shared<session::StorageBudget>(1240);
    const ledger::Culprit player{.user = 1000, .process = "player", .application = ""};
    KestoReportingSession session(42, {7}, budget, player);
    session.setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.example.player"}});
    const std::size_t ofConfiguration = budget->taken();
    session.start();
    const std::string large(600, 'x');
    session.sendMessage(platform.turn.tally, Dictionary{{"a", large}}, playback, start, nullptr);
    platform.log.clear();
    for (const int value : {1, 2, 3})
        session.sendMessage(platform.turn.tally, Dictionary{{"a", large}, {"b", value}}, playback, start, nullptr);
    EXPECT_THAT(session.nestedAggregatedPayloadData().value(), SizeIs(1));
    EXPECT_THAT(platform.log.lines(),
                Contains(IsLine(Error, "kerr",
                                "no memory left for the messages of session 42; they are lost until sessions stop"))
                    .Times(1));

    const ledger::Tally& tally = platform.turn.tally;
    EXPECT_EQ(tally[ledger::Counter::Deliveries], 4U);
    EXPECT_EQ(tally[ledger::Counter::Recorded], 1U);
    EXPECT_EQ(tally[ledger::Counter::RefusedForMemory], 3U);
    ASSERT_THAT(tally.charged(), SizeIs(1));
    EXPECT_EQ(tally.charged()[0].culprit,
              (ledger::Culprit{.user = 1000, .process = "player", .application = "org.example.player"}));
    EXPECT_EQ(tally.charged()[0].count, 3U);

    platform.log.clear();
    session.stop(platform.turn);
    EXPECT_EQ(platform.ledger.account()[ledger::Counter::SummariesLost], 1U);
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Error, "kerr", "session 42 lost 4 messages for lack of memory")))
        << "its summary is the fourth";
    EXPECT_EQ(budget->taken(), ofConfiguration);

    platform.log.clear();
    session.start();
    session.stop(platform.turn);
    EXPECT_THAT(platform.log.lines(), Not(Contains(testing::Field("level", &support::LogLine::level, Error))))
        << "the next run has lost nothing";
}

// --- single messages

class SingleMessageTest : public testing::Test {
protected:
    // Sends one message, and returns the delta that the log shows.
    int send(AudioServiceType serviceType)
    {
        platform.log.clear();
        KestoReportingSession::sendSingleMessage({{"a", 1}}, playback, start, serviceType, {{"user", "info"}},
                                                 [](const auto&) { ADD_FAILURE() << "the reply is never called"; });
        const auto lines = platform.log.lines();
        if (lines.size() != 1)
            return -1;
        constexpr std::string_view prefix = "sending single message after delta ";
        int delta = -1;
        const std::string& text = lines[0].message;
        if (text.starts_with(prefix))
            std::from_chars(text.data() + prefix.size(), text.data() + text.size(), delta);
        EXPECT_THAT(
            lines[0],
            IsLine(Debug, "kerr",
                   std::string(prefix) + std::to_string(delta) + " for service " + std::to_string(serviceType)));
        return delta;
    }

    support::TestPlatform platform;
};

TEST_F(SingleMessageTest, IsDelayedInWordsForAlarmsOnly)
{
    for (const AudioServiceType serviceType : {0, 3, 5, 11, 65535})
        EXPECT_EQ(send(serviceType), 0);
}

TEST_F(SingleMessageTest, DrawsTheDelayOfAnAlarmFromAMinute)
{
    std::vector<int> times(60);
    for (int message = 0; message < 6000; ++message) {
        const int delta = send(4);
        ASSERT_GE(delta, 0);
        ASSERT_LE(delta, 59);
        ++times[static_cast<std::size_t>(delta)];
    }
    for (const int count : times) {
        EXPECT_GT(count, 30) << "each of the sixty comes about 100 times";
        EXPECT_LT(count, 200);
    }
}

TEST_F(SingleMessageTest, DoesNothingASecondLaterOnTheBackgroundQueue)
{
    platform.analytics.use("*");
    send(4);
    EXPECT_THAT(platform.workQueues.delayed(), ElementsAre(&platform.workQueues.backgroundQueue()));
    platform.log.clear();
    platform.workQueues.advance(999'999'999ns);
    EXPECT_THAT(platform.workQueues.delayed(), SizeIs(1));
    platform.workQueues.advance(1ns);
    EXPECT_THAT(platform.workQueues.delayed(), IsEmpty());
    EXPECT_THAT(platform.log.lines(), IsEmpty());
    EXPECT_THAT(platform.analytics.asked(), IsEmpty());
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

} // namespace
