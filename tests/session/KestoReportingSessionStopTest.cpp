// SPDX-License-Identifier: Apache-2.0
// The end of a run, step by step: volume events, file, summary event.
#include "session/AllocatedBytes.h"
#include "session/KestoReportingSession.h"
#include "session/StoredMessages.h"
#include "support/EmittedCodes.h"
#include "support/MessageKinds.h"
#include "support/Sanitizers.h"
#include "support/TestPlatform.h"

#include <algorithm>
#include <gmock/gmock.h>

namespace {

using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Value;
using support::IsLine;
using support::playback;
using support::sessionMessageAccepted;
using support::sessionStopping;
using testing::Contains;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;

class SessionStop : public testing::Test {
protected:
    explicit SessionStop(bool isInternal = true)
    {
        platform.deviceProperties.setInternalBuild(isInternal);
        platform.analytics.use("*");
        session->setServiceType(7);
        session->setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.player"}});
        session->start();
    }

    void send(double time, const Dictionary& message)
    {
        session->sendMessage(platform.turn.tally, message.with("kestoreporting_timestamp", time), playback, 1, nullptr);
    }
    // Plays 30 seconds at one volume and 70 at another.
    void play()
    {
        send(0, {{"session_output_running", true}, {"PomoSessionVolume", 0.5}});
        send(30, {{"PomoSessionVolume", 0.75}});
        send(100, {{"session_output_running", false}});
    }
    // The identifiers of the messages in the session.
    [[nodiscard]] std::vector<std::string> identifiers() const
    {
        std::vector<std::string> identifiers;
        for (const Dictionary& message : session->nestedAggregatedPayloadData().value_or(Messages()))
            identifiers.emplace_back(message.begin()->key.view());
        return identifiers;
    }
    // Stops, and records the effects that are visible from outside.
    std::vector<std::string> stop()
    {
        std::vector<std::string> steps;
        platform.log.setObserver([&](const support::LogLine& line) {
            if (line.level != Debug)
                steps.push_back(line.message);
        });
        platform.analytics.setObserver(
            [&](const std::string& name) { steps.push_back(name + " after " + identifiers().back()); });
        platform.traceEmitter.setObserver([&](std::uint32_t code) {
            if (code == sessionMessageAccepted)
                steps.push_back("recorded " + identifiers().back());
        });
        session->stop(platform.turn);
        platform.log.setObserver(nullptr);
        platform.analytics.setObserver(nullptr);
        platform.traceEmitter.setObserver(nullptr);
        return steps;
    }

    support::TestPlatform platform;
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
};

class CustomerSessionStop : public SessionStop {
protected:
    CustomerSessionStop() : SessionStop(false) { }
};

TEST_F(SessionStop, RecordsEachVolumeEventThenHandsItToTheBridgeThenWritesTheFileThenRecordsTheSummary)
{
    play();
    const auto steps = stop();
    ASSERT_THAT(steps, SizeIs(10));
    EXPECT_THAT(steps[7], HasSubstr("jsonOutput writeToURL: /diagnostics/Audio/Reporting/"));
    auto others = steps;
    others.erase(others.begin() + 7);
    EXPECT_THAT(others,
                ElementsAre("sending volume event for reporter 42", "recorded Volume_Summary_1",
                            "com.quarn.kesto.Volume.Summary after Volume_Summary_1",
                            "com.quarn.longformaudio.Volume.Summary after Volume_Summary_1",
                            "recorded Volume_Summary_2", "com.quarn.kesto.Volume.Summary after Volume_Summary_2",
                            "com.quarn.longformaudio.Volume.Summary after Volume_Summary_2",
                            "sending summary event for reporter 42", "recorded Undefined_Unknown_1"));
}

TEST_F(SessionStop, CountsAsStartedUntilItIsOver)
{
    play();
    std::vector<bool> started;
    platform.log.setObserver([&](const support::LogLine&) { started.push_back(session->started()); });
    platform.analytics.setObserver([&](const std::string&) { started.push_back(session->started()); });
    platform.traceEmitter.setObserver([&](std::uint32_t) { started.push_back(session->started()); });
    session->stop(platform.turn);
    platform.log.setObserver(nullptr);
    platform.analytics.setObserver(nullptr);
    platform.traceEmitter.setObserver(nullptr);
    EXPECT_THAT(started, SizeIs(testing::Ge(12U)));
    EXPECT_THAT(started, testing::Each(true));
    EXPECT_FALSE(session->started());
}

// What the steps of a run's end do, in the order in which a thread of its own and the server queue carry them out.
void stopInParts(const std::shared_ptr<KestoReportingSession>& session, platform::Turn& turn)
{
    const auto end = session->beginStop();
    end->makeVolumeEvents();
    while (end->hasVolumeEvents())
        end->sendVolumeEvent(turn, session);
    end->summarise();
    end->letGo();
    session->finishStop(turn, *end);
}

TEST_F(SessionStop, InPartsSaysAndMarksAndSendsAndCountsTheSameAsAtOnce)
{
    struct Effects {
        std::vector<std::string> lines;
        std::vector<std::uint32_t> codes;
        std::vector<Dictionary> events;
        std::string file;
        ledger::Tally::Counts counts;
    };
    const auto linesOfTheLog = [&] {
        std::vector<std::string> lines;
        for (const support::LogLine& line : platform.log.lines())
            lines.push_back(std::to_string(static_cast<int>(line.level)) + line.tag + ' ' + line.message);
        return lines;
    };
    const auto effectsOf = [&](auto stopIt) {
        session->start();
        play();
        platform.log.clear();
        platform.traceEmitter.take();
        platform.analytics.clear();
        platform.fileSystem.files.clear();
        platform.turn.tally.clear();
        stopIt();
        return Effects{.lines = linesOfTheLog(),
                       .codes = platform.traceEmitter.take(),
                       .events = platform.analytics.payloads("com.quarn.longformaudio.Volume.Summary"),
                       .file = platform.fileSystem.files.begin()->second,
                       .counts = platform.turn.tally.counts()};
    };
    session->stop(platform.turn);
    const Effects atOnce = effectsOf([&] { session->stop(platform.turn); });
    const Effects inParts = effectsOf([&] { stopInParts(session, platform.turn); });
    EXPECT_THAT(inParts.lines, SizeIs(12));
    EXPECT_EQ(inParts.lines, atOnce.lines);
    EXPECT_THAT(inParts.codes,
                ElementsAre(sessionStopping, sessionMessageAccepted, sessionMessageAccepted, sessionMessageAccepted));
    EXPECT_THAT(inParts.events, SizeIs(2));
    EXPECT_EQ(inParts.events, atOnce.events);
    EXPECT_THAT(inParts.file, HasSubstr("\"Volume_Summary_2\": {"));
    EXPECT_EQ(inParts.file, atOnce.file);
    EXPECT_EQ(inParts.counts, atOnce.counts);
    EXPECT_EQ(platform.turn.tally[ledger::Counter::SessionsStopped], 1U);
    EXPECT_EQ(platform.turn.tally[ledger::Counter::Recorded], 3U) << "two volume events, and the summary";
}

TEST_F(SessionStop, InPartsLeavesTheSessionStoppedFromTheFirstPartOn)
{
    play();
    const auto end = session->beginStop();
    EXPECT_FALSE(session->started());
    EXPECT_EQ(session->nestedAggregatedPayloadData(), std::nullopt);
    EXPECT_EQ(session->messageIdentifierCounts(), std::nullopt);
    platform.turn.tally.clear();
    send(110, {{"a", 1}});
    EXPECT_EQ(platform.turn.tally[ledger::Counter::Inert], 1U);
    end->makeVolumeEvents();
    while (end->hasVolumeEvents())
        end->sendVolumeEvent(platform.turn, session);
    end->summarise();
    EXPECT_THAT(platform.fileSystem.files.begin()->second, Not(HasSubstr("\"a\": 1")));
}

TEST_F(SessionStop, InPartsLetsGoOfTheMessagesWithTheRun)
{
    send(0, {{"a", std::string(100'000, 'x')}});
    const auto end = session->beginStop();
    end->makeVolumeEvents();
    end->summarise();
    const std::size_t before = platform.memory.bytesLetGo();
    end->letGo();
    EXPECT_GT(platform.memory.bytesLetGo() - before, 100'000U);
}

TEST_F(SessionStop, InPartsSaysHowManyMessagesWereLost)
{
    const auto budget = std::make_shared<session::StorageBudget>(1024);
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7}, budget);
    session->start();
    for (int message = 0; message < 100; ++message)
        send(100, {{"a", message}});
    const auto lost = platform.turn.tally[ledger::Counter::RefusedForMemory];
    stopInParts(session, platform.turn);
    EXPECT_GT(lost, 0U);
    EXPECT_THAT(
        platform.log.lines("kerr"),
        Contains(IsLine(Error, "kerr", "session 42 lost " + std::to_string(lost + 1) + " messages for lack of memory")))
        << "with the summary";
    EXPECT_EQ(budget->taken(), 0U);
}

// Others should not wait for a file, nor for many messages.
TEST_F(SessionStop, TakesLongOnInternalBuildsUnlessNothingWasRecorded)
{
    EXPECT_FALSE(session->takesLongToStop());
    send(0, {{"a", 1}});
    EXPECT_TRUE(session->takesLongToStop());
    session->stop(platform.turn);
    EXPECT_FALSE(session->takesLongToStop());
}

TEST_F(CustomerSessionStop, TakesLongWithManyMessages)
{
    for (int message = 0; message < 512; ++message)
        send(0, {{"a", message}});
    EXPECT_FALSE(session->takesLongToStop());
    send(0, {{"a", 512}});
    EXPECT_TRUE(session->takesLongToStop());
}

TEST_F(CustomerSessionStop, TakesLongWithMuchText)
{
    send(0, {{"a", std::string(20'000, 'x')}});
    EXPECT_FALSE(session->takesLongToStop());
    send(0, {{"a", std::string(100'000, 'x')}});
    EXPECT_TRUE(session->takesLongToStop());
}

TEST_F(SessionStop, SaysWhatItDoesAtItsLevel)
{
    play();
    platform.log.clear();
    session->stop(platform.turn);
    const auto lines = platform.log.lines("kerr");
    const auto sending = IsLine(Debug, "kerr", "sending message for session owned by 42");
    ASSERT_THAT(lines, SizeIs(8));
    EXPECT_THAT(lines[0], IsLine(Debug, "kerr", "ending session 42"));
    EXPECT_THAT(lines[1], IsLine(Debug, "kerr", "ending session 42"));
    EXPECT_THAT(lines[2], IsLine(Default, "kerr", "sending volume event for reporter 42"));
    EXPECT_THAT(lines[3], sending);
    EXPECT_THAT(lines[4], sending);
    EXPECT_EQ(lines[5].level, Info);
    EXPECT_THAT(lines[6], IsLine(Default, "kerr", "sending summary event for reporter 42"));
    EXPECT_THAT(lines[7], sending);
    EXPECT_THAT(platform.log.lines("keri"), SizeIs(4));
    for (const auto& line : platform.log.lines())
        EXPECT_EQ(line.name, "KestoReportingSession");
}

TEST_F(SessionStop, MarksItsMomentsForTheKernelTrace)
{
    play();
    platform.traceEmitter.take();
    session->stop(platform.turn);
    EXPECT_THAT(platform.traceEmitter.take(),
                ElementsAre(sessionStopping, sessionMessageAccepted, sessionMessageAccepted, sessionMessageAccepted));
}

TEST_F(SessionStop, HandsVolumeEventsToTheBridgeAsTheyWereMade)
{
    play();
    session->stop(platform.turn);
    const auto events = platform.analytics.payloads("com.quarn.kesto.Volume.Summary");
    ASSERT_THAT(events, SizeIs(2));
    EXPECT_EQ(Value(events[1]).text(),
              R"({"session_selected_format":"unknown","active_devices":"unknown",)"
              R"("HostApplicationDisplayID":"org.player","PomoSessionVolume":0.75,"PomoSessionVolumeBucketed":"0.75",)"
              R"("play_seconds":70,"spatial-audio-accessory-feature":false,"spatializationEnabled":false,)"
              R"("ringerstate":false,"mChannelsPerFrame":-1,"play_secondsBucketed":"60","msgidx":2,"msgcnt":2})");
    EXPECT_EQ(platform.analytics.payloads("com.quarn.longformaudio.Volume.Summary"), events);
    EXPECT_THAT(platform.analytics.sent(), SizeIs(4)) << "the bridge gets nothing else";
}

TEST_F(SessionStop, PutsVolumeEventsIntoTheFileButNotTheSummary)
{
    play();
    session->stop(platform.turn);
    ASSERT_THAT(platform.fileSystem.files, SizeIs(1));
    const std::string& text = platform.fileSystem.files.begin()->second;
    EXPECT_THAT(text, HasSubstr("\"Volume_Summary_2\": {"));
    EXPECT_THAT(text, HasSubstr("\"audiotag\": \"VolumeSummary\""));
    EXPECT_THAT(text, Not(HasSubstr("KESTO_Session_Summary_Event")));
}

TEST_F(SessionStop, PutsVolumeEventsIntoTheSummaryUnderItsOwnTag)
{
    play();
    Dictionary summary;
    platform.traceEmitter.setObserver(
        [&](std::uint32_t) { summary = *session->nestedAggregatedPayloadData()->back().begin()->value.dictionary(); });
    session->stop(platform.turn);
    EXPECT_EQ(summary.find("play_seconds")->text(), "30,70");
    EXPECT_EQ(summary.find("PomoSessionVolume")->text(), "0.5,0.75,0.5,0.75");
    EXPECT_EQ(summary.find("KESTO_Session_Summary_Event")->text(), "7");
    EXPECT_EQ(summary.find("audiotag")->text(), "UndefinedUnknown");
    platform.traceEmitter.setObserver(nullptr);
}

TEST_F(SessionStop, RecordsNoVolumeEventThatRepeatsTheOneBeforeButHandsItToTheBridge)
{
    play();
    const Dictionary asTheFirstWillBe{{"session_selected_format", "unknown"},
                                      {"active_devices", "unknown"},
                                      {"HostApplicationDisplayID", "org.player"},
                                      {"PomoSessionVolume", 0.5},
                                      {"PomoSessionVolumeBucketed", "0.5"},
                                      {"play_seconds", 30},
                                      {"spatial-audio-accessory-feature", false},
                                      {"spatializationEnabled", false},
                                      {"ringerstate", false},
                                      {"mChannelsPerFrame", -1},
                                      {"play_secondsBucketed", "30"},
                                      {"msgidx", 1},
                                      {"msgcnt", 2}};
    session->sendMessage(platform.turn.tally, asTheFirstWillBe.with("kestoreporting_timestamp", 100), 14, 11, nullptr);
    platform.log.clear();
    session->stop(platform.turn);
    EXPECT_THAT(platform.log.lines(), Contains(IsLine(Debug, "kerr", "dropping redundant event")).Times(1));
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Volume.Summary"), SizeIs(2));
}

TEST_F(SessionStop, SendsVolumeEventsOnlyOfMoreThanHalfASecond)
{
    for (const auto& [from, to] : {std::pair(10.0, 10.5), std::pair(20.0, 20.625)}) {
        send(from, {{"session_output_running", true}, {"PomoSessionVolume", 0.5}});
        send(to, {{"session_output_running", false}});
    }
    session->stop(platform.turn);
    const auto events = platform.analytics.payloads("com.quarn.kesto.Volume.Summary");
    ASSERT_THAT(events, SizeIs(1));
    EXPECT_EQ(events[0].find("play_seconds")->text(), "0.625");
}

TEST_F(SessionStop, SendsNoVolumeEventWithoutAnApplication)
{
    session->setConfiguration(Dictionary{{"HostApplicationDisplayID", Value()}});
    play();
    const auto steps = stop();
    EXPECT_THAT(steps,
                ElementsAre(HasSubstr("jsonOutput writeToURL: "), "sending summary event for reporter 42",
                            "recorded Undefined_Unknown_1"));
}

TEST_F(SessionStop, NamesAnApplicationThatItDoesNotKnowUnknown)
{
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
    session->start();
    play();
    session->stop(platform.turn);
    EXPECT_EQ(*platform.analytics.payloads("com.quarn.kesto.Volume.Summary").at(0).find("HostApplicationDisplayID"),
              Value("Unknown"));
}

TEST_F(SessionStop, SaysAndSendsNothingWhenNothingWasRecorded)
{
    EXPECT_THAT(stop(), IsEmpty());
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
}

TEST_F(SessionStop, CountsAnewInTheNextRun)
{
    play();
    session->stop(platform.turn);
    session->start();
    play();
    const auto steps = stop();
    EXPECT_THAT(steps, Contains("recorded Volume_Summary_2"));
    EXPECT_THAT(steps, Contains("recorded Undefined_Unknown_1"));
}

TEST_F(SessionStop, HandsVolumeEventsToTheBridgeEvenWhenThereIsNoMemoryToRecordThem)
{
    const auto budget = std::make_shared<session::StorageBudget>(1024);
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7}, budget);
    session->start();
    play();
    for (int message = 0; message < 100; ++message)
        send(100, {{"a", message}});
    platform.log.clear();
    session->stop(platform.turn);
    EXPECT_THAT(platform.analytics.payloads("com.quarn.kesto.Volume.Summary"), SizeIs(2));
    EXPECT_THAT(platform.log.lines(),
                Contains(IsLine(Error, "kerr", "no memory left for the summary of session 42; it is lost")));
    EXPECT_EQ(budget->taken(), 0U);
}

TEST_F(SessionStop, PaysForVolumeEventsFromItsBudgetUntilTheyAreRecorded)
{
    const auto budget = std::make_shared<session::StorageBudget>(std::size_t{1} << 20);
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7}, budget);
    session->start();
    send(0, {{"session_output_running", true}});
    for (int change = 1; change <= 3000; ++change)
        send(change, {{"PomoSessionVolume", change % 2}});
    ASSERT_LT(budget->taken(), std::size_t{1} << 19);
    platform.log.clear();
    session->stop(platform.turn);
    const auto events = platform.analytics.payloads("com.quarn.kesto.Volume.Summary");
    EXPECT_GT(events.size(), 900U);
    EXPECT_THAT(platform.log.lines("keri"),
                Contains(IsLine(Error, "keri",
                                std::to_string(2999 - events.size()) + " volume events are lost for lack of memory")));
    ASSERT_THAT(platform.fileSystem.files, SizeIs(1));
    EXPECT_THAT(platform.fileSystem.files.begin()->second,
                HasSubstr("\"Volume_Summary_" + std::to_string(events.size() / 2) + '"'))
        << "what is paid for an event makes room for its record";
    EXPECT_EQ(budget->taken(), 0U);
}

TEST_F(SessionStop, TellsHowMuchMemoryItLetGo)
{
    send(0, {{"a", std::string(100'000, 'x')}});
    EXPECT_EQ(platform.memory.bytesLetGo(), 0U);
    session->stop(platform.turn);
    EXPECT_GT(platform.memory.bytesLetGo(), 100'000U);
    EXPECT_LT(platform.memory.bytesLetGo(), 500'000U);
}

TEST_F(SessionStop, TellsItTooOfAConfigurationAndOfItselfWhenItGoes)
{
    session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
    session->setConfiguration(foundation::Dictionary{{"a", std::string(100'000, 'x')}});
    const std::size_t before = platform.memory.bytesLetGo();
    session.reset();
    EXPECT_GT(platform.memory.bytesLetGo() - before, 100'000U + 400);
    EXPECT_LT(platform.memory.bytesLetGo() - before, 110'000U);
}

TEST_F(SessionStop, TellsItTooOfASessionThatGoesWithoutAStop)
{
    send(0, {{"a", std::string(100'000, 'x')}});
    session.reset();
    EXPECT_GT(platform.memory.bytesLetGo(), 100'000U);
    EXPECT_LT(platform.memory.bytesLetGo(), 500'000U);
}

TEST_F(CustomerSessionStop, MeasuresNothingAndWritesNoFileButRecordsTheSummary)
{
    play();
    EXPECT_THAT(stop(), ElementsAre("sending summary event for reporter 42", "recorded Undefined_Unknown_1"));
    EXPECT_THAT(platform.analytics.sent(), IsEmpty());
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    const std::string skipped = "skipped volume message, too short { func=+[KestoReportingSession "
                                "createVolumeMessages:process:minimumPlaytime:], action=skip, count=0 }";
    EXPECT_THAT(platform.log.lines("keri"), Contains(IsLine(Debug, "keri", skipped)).Times(2));
}

// A session whose messages, and so its volume events, have large texts, none of which share memory.
class LargeSessionStop : public SessionStop {
protected:
    static constexpr std::size_t sizeOfText = 600'000;
    static constexpr int largeMessages = 31;
    static constexpr std::size_t bytesOfTexts = largeMessages * 2 * sizeOfText;

    // The summary file is not kept: it would take memory, too.
    void begin(std::size_t limit)
    {
        platform.fileSystem.createError = std::make_error_code(std::errc::no_space_on_device);
        platform.log.setThreshold(Error);
        before_ = allocatedBytes();
        forgetMostAllocatedBytes();
        budget = std::make_shared<session::StorageBudget>(limit);
        session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7}, budget);
        session->setServiceType(7);
        session->setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.player"}});
        session->start();
    }
    // A message that begins a volume event of 1000 seconds; the large ones have texts.
    void sendSmall()
    {
        ++sent_;
        send(sent_ * 1000.0, {{"session_output_running", true}, {"PomoSessionVolume", sent_ % 2}});
    }
    void sendLarge()
    {
        ++sent_;
        const auto letter = static_cast<char>(' ' + sent_ % 64);
        send(sent_ * 1000.0,
             {{"session_output_running", true},
              {"PomoSessionVolume", 0.5},
              {"session_selected_format", std::string(sizeOfText, letter)},
              {"active_devices", std::string(sizeOfText, letter)}});
    }
    void sendEnd() { send(++sent_ * 1000.0, {{"session_output_running", false}}); }
    [[nodiscard]] std::ptrdiff_t allocated() const { return allocatedBytes() - before_; }
    [[nodiscard]] std::ptrdiff_t mostAllocated() const { return mostAllocatedBytes() - before_; }

    std::shared_ptr<session::StorageBudget> budget;

private:
    int sent_ = 0;
    std::ptrdiff_t before_ = 0;
};

// The summary's texts double as they grow. Each ends with nearly 64 of the messages' texts, so with little room to
// spare.
TEST_F(LargeSessionStop, TakesNoMoreMemoryThanTheBudgetHas)
{
    KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
    constexpr std::size_t taken = 4 * bytesOfTexts; // messages, events, and the summary of both
    constexpr std::size_t limit = taken + taken / 20;
    begin(limit);
    for (int number = 0; number < largeMessages; ++number)
        sendLarge();
    sendEnd();
    std::size_t recorded = 0;
    platform.traceEmitter.setObserver([&](std::uint32_t code) {
        recorded += code == sessionMessageAccepted ? 1 : 0;
        platform.analytics.clear(); // the events that it keeps here take memory, too
    });
    session->stop(platform.turn);
    platform.traceEmitter.setObserver(nullptr);
    EXPECT_EQ(recorded, 32U) << "volume events and the summary";
    EXPECT_THAT(platform.log.lines(), Not(Contains(testing::Field(&support::LogLine::message, HasSubstr("lost")))));
    EXPECT_LE(mostAllocated(), static_cast<std::ptrdiff_t>(limit));
}

TEST_F(LargeSessionStop, GoesOnPayingForTheVolumeEventsThatItHasNotRecordedYet)
{
    KESTO_SKIP_WHERE_MEMORY_IS_WATCHED();
    begin(std::size_t{1} << 30);
    for (int number = 0; number < 400; ++number)
        sendSmall();
    for (int number = 0; number < largeMessages; ++number)
        sendLarge();
    sendEnd();
    std::ptrdiff_t mostUnpaid = 0;
    platform.traceEmitter.setObserver([&](std::uint32_t code) {
        platform.analytics.clear();
        if (code == sessionMessageAccepted)
            mostUnpaid = std::max(mostUnpaid, allocated() - static_cast<std::ptrdiff_t>(budget->taken()));
    });
    session->stop(platform.turn);
    platform.traceEmitter.setObserver(nullptr);
    constexpr std::ptrdiff_t eventBeingRecorded = 2 * sizeOfText;
    EXPECT_LT(mostUnpaid, 2 * eventBeingRecorded);
}

} // namespace
