// SPDX-License-Identifier: Apache-2.0
// The contract of platform/BugCapture.h: the content of a signature, the data that a caller passes with a request, and
// the time of the answer.
#include "platform/contract/Contract.h"
#include "platform/linux/bugs/LinuxBugCapture.h"
#include "platform/linux/log/LinuxLog.h"
#include "support/ParseJson.h"
#include "support/TemporaryDirectory.h"
#include "support/TestPlatform.h"
#include "support/fakes/FakeBugCapture.h"

#include <gmock/gmock.h>
#include <optional>

namespace contract {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;
using platform::BugCaptureReporter;
using testing::ElementsAre;
using testing::IsEmpty;

// The kept data of one request.
struct Kept {
    Dictionary signature;
    double duration;
    Value event; // null if it was missing; the same holds below
    Value payload;
    Value state;
    friend bool operator==(const Kept&, const Kept&) = default;
};

class BugCaptureSubject {
public:
    virtual ~BugCaptureSubject() = default;
    [[nodiscard]] virtual platform::BugCapture& capture() = 0;
    // Answers all requests so far.
    virtual void work() = 0;
    // The snapshots that were taken, in order.
    [[nodiscard]] virtual std::vector<Kept> kept() = 0;
};

class FakeBugCaptureSubject final : public BugCaptureSubject {
public:
    [[nodiscard]] platform::BugCapture& capture() override { return capture_; }
    void work() override
    {
        while (answered_ < capture_.snapshots().size()) {
            auto reply = std::move(capture_.snapshots()[answered_++].reply); // the reply may request more snapshots
            reply({{"success", true}});
        }
    }
    [[nodiscard]] std::vector<Kept> kept() override
    {
        std::vector<Kept> kept;
        for (const auto& snapshot : capture_.snapshots())
            kept.push_back({snapshot.signature, snapshot.duration, snapshot.event.value_or(Value()),
                            snapshot.payload.value_or(Value()), snapshot.state});
        return kept;
    }

private:
    support::FakeBugCapture capture_;
    std::size_t answered_ = 0;
};

class LinuxBugCaptureSubject final : public BugCaptureSubject {
public:
    [[nodiscard]] platform::BugCapture& capture() override { return capture_; }
    void work() override { queues_.runAll(); }
    [[nodiscard]] std::vector<Kept> kept() override
    {
        std::vector<std::filesystem::path> folders;
        for (const auto& entry : std::filesystem::directory_iterator(directory_ / "bug-captures"))
            folders.push_back(entry.path());
        std::ranges::sort(folders);
        std::vector<Kept> kept;
        for (const auto& folder : folders) {
            const Dictionary request = read(folder / "state/request.json").dictionary().value();
            kept.push_back({read(folder / "signature.json").dictionary().value(),
                            request.find("duration")->number()->doubleValue(), *request.find("event"),
                            *request.find("payload"), read(folder / "state/service.json")});
        }
        return kept;
    }

private:
    static Value read(const std::filesystem::path& path) { return support::parseJson(support::readFile(path)).value(); }

    const support::TemporaryDirectory directory_;
    support::FakeClock clock_;
    support::FakeWorkQueues queues_{clock_};
    platform::LinuxLog log_{platform::LogThresholds(), {.journalSocket = {}, .descriptor = -1}};
    ledger::Ledger ledger_;
    platform::LinuxBugCapture capture_{directory_.path(),
                                       {.log = log_.recentLines(),
                                        .clock = clock_,
                                        .workQueues = queues_,
                                        .ledger = ledger_,
                                        .proc = directory_ / "proc"},
                                       platform::ProviderLog(log_)};
};

class BugCaptureContract : public Suite<BugCaptureSubject> {
protected:
    Dictionary signature(std::optional<Value> triggerThresholdValues = {})
    {
        return subject->capture().makeReporter()->makeSignature("Sonalis", "haptics", "Playback", "Gimbo", "player",
                                                                triggerThresholdValues);
    }
    // Requests a snapshot with its own reporter, which is destroyed immediately.
    void request(int number)
    {
        subject->capture().makeReporter()->requestSnapshot(signature(), 0, std::nullopt, std::nullopt,
                                                           [this, number](const Dictionary& response) {
                                                               answered.push_back(number);
                                                               responses.push_back(response);
                                                           });
    }

    std::vector<int> answered;
    std::vector<Dictionary> responses;
};
KESTO_CONTRACT(BugCaptureContract, (provider<BugCaptureSubject, FakeBugCaptureSubject>("Fake")),
               (provider<BugCaptureSubject, LinuxBugCaptureSubject>("Linux")));

TEST_P(BugCaptureContract, MakesSignaturesOfTheArgumentsByTheirNames)
{
    EXPECT_EQ(signature(Value(3)),
              (Dictionary{{"domain", "Sonalis"},
                          {"type", "haptics"},
                          {"subType", "Playback"},
                          {"subtypeContext", "Gimbo"},
                          {"detectedProcess", "player"},
                          {"triggerThresholdValues", 3}}));
}

TEST_P(BugCaptureContract, LeavesOutOfASignatureWhatThereIsNot)
{
    EXPECT_EQ(signature(),
              (Dictionary{{"domain", "Sonalis"},
                          {"type", "haptics"},
                          {"subType", "Playback"},
                          {"subtypeContext", "Gimbo"},
                          {"detectedProcess", "player"}}));
}

TEST_P(BugCaptureContract, AnswersEveryRequestOnceAndNeverBeforeTheRequestHasReturned)
{
    for (int number = 1; number <= 3; ++number)
        request(number);
    EXPECT_THAT(answered, IsEmpty());
    subject->work();
    EXPECT_THAT(answered, ElementsAre(1, 2, 3));
    subject->work();
    EXPECT_EQ(answered.size(), 3U);
}

TEST_P(BugCaptureContract, SaysInTheAnswerThatASnapshotWasTaken)
{
    request(1);
    subject->work();
    ASSERT_EQ(responses.size(), 1U);
    const Value* const success = responses[0].find("success");
    ASSERT_NE(success, nullptr);
    EXPECT_EQ(*success, Value(true));
    EXPECT_EQ(subject->kept().size(), 1U);
}

TEST_P(BugCaptureContract, LetsAReplyAskForTheNextSnapshot)
{
    const auto reporter = subject->capture().makeReporter();
    reporter->requestSnapshot(signature(), 0, std::nullopt, std::nullopt, [this](const Dictionary&) { request(2); });
    subject->work();
    subject->work();
    EXPECT_THAT(answered, ElementsAre(2));
}

TEST_P(BugCaptureContract, KeepsWhatItWasAskedWithAndTheStateOfThatMoment)
{
    int timesAsked = 0;
    subject->capture().setStateDescription([&timesAsked] { return Value(Dictionary{{"asked", ++timesAsked}}); });
    subject->capture().makeReporter()->requestSnapshot(signature(), 2.5, Value("event"), Value(Array{1}),
                                                       [](const Dictionary&) { });
    request(2);
    const int askedBeforeWork = timesAsked;
    subject->work();
    EXPECT_EQ(timesAsked, askedBeforeWork) << "later the state differs";
    EXPECT_EQ(askedBeforeWork, 2);
    EXPECT_THAT(subject->kept(),
                ElementsAre(Kept{signature(), 2.5, "event", Array{1}, Dictionary{{"asked", 1}}},
                            Kept{signature(), 0, {}, {}, Dictionary{{"asked", 2}}}));
}

TEST_P(BugCaptureContract, KeepsNoStateUnlessItWasToldWhomToAsk)
{
    request(1);
    subject->work();
    EXPECT_THAT(subject->kept(), ElementsAre(Kept{signature(), 0, {}, {}, {}}));
}

} // namespace
} // namespace contract
