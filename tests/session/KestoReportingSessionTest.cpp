// SPDX-License-Identifier: Apache-2.0
// A session's life: its initial state, its growing configuration, and the beginning and end of a run.
#include "session/KestoReportingSession.h"
#include "foundation/cbor/Cbor.h"
#include "support/EmittedCodes.h"
#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <limits>

namespace {

using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Value;
using support::IsLine;
using support::sessionCreated;
using support::sessionDestroyed;
using support::sessionMessageAccepted;
using support::sessionStarted;
using support::sessionStopping;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

class SessionTest : public testing::Test {
protected:
    void forget()
    {
        platform.log.clear();
        platform.traceEmitter.take();
    }

    support::TestPlatform platform;
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7, 8});
};

// --- making and destroying

TEST_F(SessionTest, IsMadeWithItsIdentityAndNothingElse)
{
    EXPECT_EQ(session->reporterID(), 42);
    EXPECT_THAT(session->processIdentifiers(), ElementsAre(7, 8));
    EXPECT_FALSE(session->started());
    EXPECT_FALSE(session->blinReportingEnabled());
    EXPECT_EQ(session->serviceType(), 0);
    EXPECT_EQ(session->serviceName(), "");
    EXPECT_EQ(session->configuration(), Dictionary());
    EXPECT_EQ(session->driverSnapShot(), std::nullopt);
    EXPECT_FALSE(session->transactionCompleteBlock());
    EXPECT_EQ(session->nestedAggregatedPayloadData(), std::nullopt);
    EXPECT_EQ(session->messageIdentifierCounts(), std::nullopt);
}

TEST_F(SessionTest, SaysAndMarksThatItWasMade)
{
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kerr", "created reporting session for ID: 42")));
    EXPECT_EQ(platform.log.lines()[0].name, "KestoReportingSession");
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionCreated));
}

TEST_F(SessionTest, SaysAndMarksThatItGoes)
{
    forget();
    session.reset();
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kerr", "deallocing this session 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionDestroyed));
}

TEST_F(SessionTest, SaysThatItWasMadeBeforeItMarksItAndMarksThatItGoesBeforeItSaysIt)
{
    std::vector<std::string> steps;
    platform.log.setObserver([&](const support::LogLine& line) { steps.push_back(line.message); });
    platform.traceEmitter.setObserver([&](std::uint32_t code) { steps.push_back(std::to_string(code)); });
    session = std::make_shared<KestoReportingSession>(43, std::vector<std::int32_t>{7}); // 42 goes
    platform.log.setObserver(nullptr);
    platform.traceEmitter.setObserver(nullptr);
    EXPECT_THAT(steps,
                ElementsAre("created reporting session for ID: 43", std::to_string(sessionCreated),
                            std::to_string(sessionDestroyed), "deallocing this session 42"));
}

TEST_F(SessionTest, GoesWithoutStoppingWhenItIsLetGoOfWhileStarted)
{
    session->start();
    forget();
    session.reset();
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kerr", "deallocing this session 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionDestroyed));
}

TEST_F(SessionTest, TakesAnyNumberForItsIdentity)
{
    for (const std::int64_t reporterID :
         {std::int64_t{0}, std::int64_t{-1}, std::numeric_limits<std::int64_t>::min()}) {
        platform.log.clear();
        const KestoReportingSession other(reporterID, {});
        EXPECT_EQ(other.reporterID(), reporterID);
        EXPECT_THAT(
            platform.log.lines(),
            ElementsAre(IsLine(Info, "kerr", "created reporting session for ID: " + std::to_string(reporterID))));
    }
}

TEST_F(SessionTest, AnswersThreeQueriesAlwaysTheSame)
{
    EXPECT_EQ(session->getBlinReportingStartedState(), std::nullopt);
    EXPECT_EQ(session->getPTTraceFileURL(), std::nullopt);
    EXPECT_FALSE(session->shouldReportOrientation());
}

TEST_F(SessionTest, HoldsWhatItsClientInstanceKeepsInIt)
{
    session->setBlinReportingEnabled(true);
    EXPECT_TRUE(session->blinReportingEnabled());

    int calls = 0;
    session->setTransactionCompleteBlock([&](auto&, const auto&, bool) { ++calls; });
    session->start();
    session->stop(platform.turn);
    EXPECT_EQ(calls, 0) << "the session itself never calls it";
    session->transactionCompleteBlock()(platform.turn, std::nullopt, true);
    EXPECT_EQ(calls, 1);
    session->setTransactionCompleteBlock(nullptr);
    EXPECT_FALSE(session->transactionCompleteBlock());

    session->setDriverSnapShot(session::DriverSnapShot{{"Rx-(null)", {}}});
    EXPECT_THAT(*session->driverSnapShot(), SizeIs(1));
    session->setDriverSnapShot(std::nullopt);
    EXPECT_EQ(session->driverSnapShot(), std::nullopt);
}

// --- What the store knows of it

TEST_F(SessionTest, TheEndOfPlayingIsAnnouncedOnceBehindTheEventsOfASessionThatTheStoreKnows)
{
    using platform::PlayingEnding;
    const auto ends = [this] { return platform.turn.events.announcements().playingEnds.size(); };
    session->announcePlayingEnd(platform.turn, PlayingEnding::Stopped);
    (void)session->announcedOrigin(platform.turn);
    session->announcePlayingEnd(platform.turn, PlayingEnding::Stopped);
    EXPECT_EQ(ends(), 0U) << "it has no owner yet";
    session->setOwner(3);
    session->announcePlayingEnd(platform.turn, PlayingEnding::Stopped);
    EXPECT_EQ(ends(), 0U) << "the store got no event of it";
    const platform::Origin origin = session->announcedOrigin(platform.turn);
    session->announcePlayingEnd(platform.turn, PlayingEnding::Vanished);
    session->announcePlayingEnd(platform.turn, PlayingEnding::Stopped);
    ASSERT_EQ(ends(), 1U);
    EXPECT_EQ(platform.turn.events.announcements().playingEnds[0].session, origin.session);
    EXPECT_EQ(platform.turn.events.announcements().playingEnds[0].ending, PlayingEnding::Vanished);
    (void)session->announcedOrigin(platform.turn);
    session->announcePlayingEnd(platform.turn, PlayingEnding::Stopped);
    EXPECT_EQ(ends(), 2U);
}

// --- description

TEST_F(SessionTest, DescribesItself)
{
    session->setServiceType(7);
    session->setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.player"}});
    session->start();
    EXPECT_EQ(session->description(),
              "reporterID=42,serviceName=longformaudio,ownerPid=7,HostApplicationDisplayID=org.player,started=1");
}

TEST_F(SessionTest, DescribesWhatItDoesNotKnow)
{
    EXPECT_EQ(session->description(),
              "reporterID=42,serviceName=(null),ownerPid=7,HostApplicationDisplayID=Unknown,started=0");
    EXPECT_EQ(KestoReportingSession(-1, {}).description(),
              "reporterID=-1,serviceName=(null),ownerPid=0,HostApplicationDisplayID=Unknown,started=0");
}

TEST_F(SessionTest, DescribesNoMoreOfAnApplicationThanALogLineNeeds)
{
    session->setConfiguration(Dictionary{{"HostApplicationDisplayID", std::string(255, 'x') + "\u00e9\u00e9"}});
    EXPECT_EQ(session->description(),
              "reporterID=42,serviceName=(null),ownerPid=7,HostApplicationDisplayID=" + std::string(255, 'x')
                  + ",started=0")
        << "and no half of a character";
    session->setConfiguration(Dictionary{{"other", 1}});
    EXPECT_THAT(session->description(), testing::HasSubstr(std::string(255, 'x')));
    session->setConfiguration(Dictionary{{"HostApplicationDisplayID", foundation::Array{1, 2}}});
    EXPECT_THAT(session->description(), testing::HasSubstr("HostApplicationDisplayID=[1,2],"));
}

// --- service type

TEST_F(SessionTest, TakesANameFromItsServiceTypeAndSaysSo)
{
    forget();
    session->setServiceType(3);
    EXPECT_EQ(session->serviceType(), 3);
    EXPECT_EQ(session->serviceName(), "haptics");
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Info, "kerr", "setting service type haptics")));
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

TEST_F(SessionTest, KeepsTheNumberOfAServiceTypeItHasNoNameFor)
{
    session->setServiceType(14);
    EXPECT_EQ(session->serviceType(), 14);
    EXPECT_EQ(session->serviceName(), "telephony");
    session->setServiceType(65535);
    EXPECT_EQ(session->serviceName(), "unknown");
}

TEST_F(SessionTest, TakesAServiceTypeWhileStartedToo)
{
    session->start();
    session->setServiceType(4);
    EXPECT_EQ(session->serviceName(), "alarms");
    EXPECT_TRUE(session->started());
}

// --- configuration

TEST_F(SessionTest, MergesConfigurations)
{
    session->setConfiguration(Dictionary{{"a", 1}});
    session->setConfiguration(Dictionary{{"b", 2}});
    session->setConfiguration(Dictionary{{"a", 3}});
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", 3}, {"b", 2}}));
}

TEST_F(SessionTest, MergesTheContentsOfConfigurationsInTheSameWay)
{
    session->updateConfigurationWithContentsOfConfiguration(Dictionary{{"a", 1}});
    session->updateConfigurationWithContentsOfConfiguration(Dictionary{{"b", 2}});
    session->updateConfigurationWithContentsOfConfiguration(Dictionary{{"a", 3}});
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", 3}, {"b", 2}}));
}

TEST_F(SessionTest, MergesDictionariesWithinAsWholes)
{
    session->setConfiguration(Dictionary{{"inner", Dictionary{{"a", 1}}}});
    session->setConfiguration(Dictionary{{"inner", Dictionary{{"b", 2}}}});
    EXPECT_EQ(session->configuration(), (Dictionary{{"inner", Dictionary{{"b", 2}}}}));
}

TEST_F(SessionTest, IsNotChangedByNoConfiguration)
{
    session->setConfiguration(Dictionary{{"a", 1}});
    session->setConfiguration(std::nullopt);
    session->updateConfigurationWithContentsOfConfiguration(std::nullopt);
    session->updateConfigurationWithContentsOfConfiguration(Dictionary{});
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}}));
}

TEST_F(SessionTest, KeepsItsConfigurationAndServiceTypeOverRuns)
{
    session->setServiceType(4);
    session->setConfiguration(Dictionary{{"a", 1}});
    session->start();
    session->updateConfigurationWithContentsOfConfiguration(Dictionary{{"b", 2}});
    session->stop(platform.turn);
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}, {"b", 2}}));
    EXPECT_EQ(session->serviceType(), 4);
    EXPECT_EQ(session->serviceName(), "alarms");
}

TEST_F(SessionTest, LetsNoConfigurationOutgrowItsLimit)
{
    const std::string half(KestoReportingSession::largestConfiguration / 2, 'x');
    session->setConfiguration(Dictionary{{"a", half}});
    forget();
    session->setConfiguration(Dictionary{{"b", half}});
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", half}}));
    EXPECT_THAT(
        platform.log.lines(),
        ElementsAre(IsLine(Error, "kerr",
                           "configuration of session 42 would take more than 1048576 bytes; the change is ignored")));
    session->setConfiguration(Dictionary{{"a", 1}});
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", 1}}));
}

TEST_F(SessionTest, TakesAConfigurationThatIsExactlyAsLargeAsItsLimitAndNoneThatIsAByteLarger)
{
    const std::string text(1'048'565, 'x'); // 1,048,573 bytes with its key and the heads
    session->setConfiguration(Dictionary{{"a", text}});
    forget();
    session->setConfiguration(Dictionary{{"b", 24}});
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", text}})) << "24 takes two bytes";
    EXPECT_THAT(platform.log.lines(), SizeIs(1));
    forget();
    session->setConfiguration(Dictionary{{"b", 23}});
    EXPECT_EQ(session->configuration(), (Dictionary{{"a", text}, {"b", 23}})) << "23 takes one";
    EXPECT_THAT(platform.log.lines(), IsEmpty());
}

TEST_F(SessionTest, PaysForItsConfiguration)
{
    const Dictionary configuration{{"a", std::string(1000, 'x')}};
    const auto budget = std::make_shared<session::StorageBudget>(3 * configuration.roughBytes() / 2);
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7}, budget);
    auto other = std::make_shared<KestoReportingSession>(43, std::vector<std::int32_t>{7}, budget);
    session->setConfiguration(configuration);
    EXPECT_EQ(budget->taken(), configuration.roughBytes());
    session->setConfiguration(configuration);
    EXPECT_EQ(budget->taken(), configuration.roughBytes()) << "for its content, not for the given entries";

    forget();
    other->setConfiguration(configuration);
    EXPECT_EQ(other->configuration(), Dictionary());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Error, "kerr",
                                   "no memory left for the configuration of session 43; the change is ignored")));
    session->setConfiguration(Dictionary{{"a", 1}});
    other->setConfiguration(configuration);
    EXPECT_EQ(other->configuration(), configuration) << "there is room again";
    session.reset();
    other.reset();
    EXPECT_EQ(budget->taken(), 0U);
}

TEST_F(SessionTest, HoldsThousandsOfValuesOfOneByteOnlyForWhatTheyTake)
{
    const auto budget = std::make_shared<session::StorageBudget>(std::size_t{1} << 20);
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7}, budget);
    const foundation::Array bytes(std::vector<Value>(100'000, Value(1)));
    session->setConfiguration(Dictionary{{"a", bytes}}); // 100 KB on the wire
    EXPECT_EQ(session->configuration(), Dictionary());
}

TEST_F(SessionTest, PaysForTheDriversSnapshot)
{
    platform::ReportingSample sample;
    sample.channels.resize(10);
    for (auto& channel : sample.channels)
        channel.states.resize(10);
    const auto budget = std::make_shared<session::StorageBudget>(10'000);
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7}, budget);
    session->setDriverSnapShot(session::DriverSnapShot{{"Rx-(null)", sample}});
    EXPECT_GT(budget->taken(), 10 * sizeof(platform::ReportingChannel) + 100 * sizeof(platform::StateResidency) - 1);
    EXPECT_THAT(*session->driverSnapShot(), SizeIs(1));

    forget();
    session->setDriverSnapShot(session::DriverSnapShot{{"Rx-(null)", sample}, {"Tx-(null)", sample}});
    EXPECT_EQ(session->driverSnapShot(), std::nullopt);
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Error, "kerr",
                                   "no memory left for the drivers' snapshot of session 42; its driver statistics are "
                                   "lost")));
    EXPECT_EQ(budget->taken(), 0U);
}

// --- the trace type that only in-process code can pass

TEST_F(SessionTest, TellsTheTraceTypeConstantFromEqualText)
{
    EXPECT_EQ(KestoReportingTraceTypeKtrace, std::string_view("ktrace"));
    session->setConfiguration(Dictionary{{"KestoReportingTraceType", KestoReportingTraceTypeKtrace}});
    EXPECT_TRUE(session->configuration()
                    .find("KestoReportingTraceType")
                    ->string()
                    ->isSameObject(KestoReportingTraceTypeKtrace));
    session->setConfiguration(Dictionary{{"KestoReportingTraceType", "ktrace"}});
    EXPECT_FALSE(session->configuration()
                     .find("KestoReportingTraceType")
                     ->string()
                     ->isSameObject(KestoReportingTraceTypeKtrace));
}

TEST(TraceTypeConstant, IsNeverWhatAClientSends)
{
    std::string wire;
    foundation::appendCbor(Dictionary{{"KestoReportingTraceType", KestoReportingTraceTypeKtrace}}, wire);
    foundation::CborDecoder decoder;
    const auto received = decoder.decode(wire)->dictionary()->find("KestoReportingTraceType")->string();
    EXPECT_EQ(*received, KestoReportingTraceTypeKtrace);
    EXPECT_FALSE(received->isSameObject(KestoReportingTraceTypeKtrace));
}

// --- start and stop

TEST_F(SessionTest, BeginsARunWithAnEmptyStore)
{
    forget();
    session->start();
    EXPECT_TRUE(session->started());
    EXPECT_THAT(*session->nestedAggregatedPayloadData(), IsEmpty());
    EXPECT_EQ(session->messageIdentifierCounts(), Dictionary());
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42")));
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionStarted));
}

TEST_F(SessionTest, IsStartedAndHasItsEmptyStoreWhenItMarksItsStart)
{
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, 4, 1, nullptr);
    session->stop(platform.turn);
    std::optional<std::size_t> messages;
    platform.traceEmitter.setObserver([&](std::uint32_t code) {
        EXPECT_EQ(code, sessionStarted);
        EXPECT_TRUE(session->started());
        if (const auto store = session->nestedAggregatedPayloadData())
            messages = store->size();
    });
    session->start();
    platform.traceEmitter.setObserver(nullptr);
    EXPECT_EQ(messages, 0U);
}

TEST_F(SessionTest, StartedTwiceGoesOnAsItIs)
{
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, 4, 1, nullptr);
    forget();
    session->start();
    EXPECT_TRUE(session->started());
    EXPECT_THAT(*session->nestedAggregatedPayloadData(), SizeIs(1));
    EXPECT_EQ(session->messageIdentifierCounts(), (Dictionary{{"Playback_Start", 1}}));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42"),
                            IsLine(Info, "kerr", "42 is already started")));
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
}

TEST_F(SessionTest, EndsARunAndDropsWhatItRecorded)
{
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, 4, 1, nullptr);
    forget();
    session->stop(platform.turn);
    EXPECT_FALSE(session->started());
    EXPECT_EQ(session->nestedAggregatedPayloadData(), std::nullopt);
    EXPECT_EQ(session->messageIdentifierCounts(), std::nullopt);
    const auto lines = platform.log.lines();
    ASSERT_THAT(lines, SizeIs(testing::Ge(2U)));
    EXPECT_THAT(lines[0], IsLine(Debug, "kerr", "ending session 42"));
    EXPECT_THAT(lines[1], IsLine(Debug, "kerr", "ending session 42"));
    EXPECT_EQ(platform.traceEmitter.take().front(), sessionStopping);
}

TEST_F(SessionTest, SaysTwiceThatItEndsBeforeItMarksIt)
{
    session->start();
    std::vector<std::string> steps;
    platform.log.setObserver([&](const support::LogLine& line) { steps.push_back(line.message); });
    platform.traceEmitter.setObserver([&](std::uint32_t code) { steps.push_back(std::to_string(code)); });
    session->stop(platform.turn);
    platform.log.setObserver(nullptr);
    platform.traceEmitter.setObserver(nullptr);
    ASSERT_THAT(steps, SizeIs(testing::Ge(3U)));
    steps.resize(3);
    EXPECT_THAT(steps, ElementsAre("ending session 42", "ending session 42", std::to_string(sessionStopping)));
}

TEST_F(SessionTest, StoppedWithoutAStartOnlySaysSo)
{
    forget();
    platform.analytics.use("*");
    session->stop(platform.turn);
    session->start();
    session->stop(platform.turn);
    forget();
    platform.analytics.clear();
    session->stop(platform.turn);
    EXPECT_FALSE(session->started());
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerr", "ending session 42")));
    EXPECT_THAT(platform.traceEmitter.take(), IsEmpty());
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
}

TEST_F(SessionTest, BeginsEveryKindAnewInTheNextRun)
{
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, 4, 1, nullptr);
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 2}}, 4, 1, nullptr);
    session->stop(platform.turn);
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 2}}, 4, 1, nullptr);
    const auto messages = *session->nestedAggregatedPayloadData();
    ASSERT_THAT(messages, SizeIs(1));
    EXPECT_TRUE(messages[0].contains("Playback_Start_1"));
}

TEST_F(SessionTest, MarksEveryPointOfItsLifeInOrder)
{
    session->setServiceType(4);
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, 4, 1, nullptr);
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionCreated, sessionStarted, sessionMessageAccepted));
    session->stop(platform.turn);
    EXPECT_EQ(platform.traceEmitter.take().front(), sessionStopping);
    session.reset();
    EXPECT_THAT(platform.traceEmitter.take(), ElementsAre(sessionDestroyed));
}

class UntracedSessionTest : public SessionTest,
                            public testing::WithParamInterface<std::tuple<AudioServiceType, bool, Dictionary>> { };

TEST_P(UntracedSessionTest, TracesNothing)
{
    const auto& [serviceType, isTracingOn, configuration] = GetParam();
    if (isTracingOn)
        platform.featureFlags.enable("Sonalis", "Tracing");
    session->setServiceType(serviceType);
    session->setConfiguration(configuration);
    forget();
    session->start();
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerr", "starting session owned by 42")));
    EXPECT_THAT(platform.kernelTrace.sessions(), IsEmpty());
}

const Dictionary wholeConfiguration{{"KestoReportingPellorinPlistFilePath", "/traces.plist"}};

INSTANTIATE_TEST_SUITE_P(
    WithoutOneOfTheConditions, UntracedSessionTest,
    testing::Values(std::tuple(AudioServiceTypeTest, false, wholeConfiguration), // the flag is off
                    std::tuple(AudioServiceType{0}, true, wholeConfiguration), // another service type
                    std::tuple(AudioServiceType{12}, true, wholeConfiguration),
                    std::tuple(AudioServiceTypeTest, true,
                               wholeConfiguration.with("KestoReportingTraceType", "ktrace")),
                    std::tuple(AudioServiceTypeTest, true, wholeConfiguration.with("KestoReportingTraceType", 1)),
                    std::tuple(AudioServiceTypeTest, true, Dictionary{}))); // no file

} // namespace
