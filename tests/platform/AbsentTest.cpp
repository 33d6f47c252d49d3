// A system that lacks a service: nothing is there, nothing breaks, and whoever asks is told.
#include "platform/Absent.h"

#include "support/TestPlatform.h"

#include <gtest/gtest.h>
#include <optional>

namespace platform {
namespace {

using foundation::Dictionary;
using foundation::Value;

TEST(AbsentReportingChannels, AreNotFound)
{
    AbsentReportingChannels channels;
    const auto found = channels.copyChannelsInGroup("Audio", std::nullopt);
    EXPECT_EQ(found.channels, nullptr);
}

TEST(AbsentBugCapture, MakesSignaturesAndAnswersThatNothingWasTaken)
{
    support::TestPlatform platform;
    AbsentBugCapture capture;
    const auto reporter = capture.makeReporter();
    const Dictionary signature = reporter->makeSignature("domain", "type", "subtype", "context", "player", Value(3));
    EXPECT_EQ(signature,
              (Dictionary{{"domain", "domain"},
                          {"type", "type"},
                          {"subType", "subtype"},
                          {"subtypeContext", "context"},
                          {"detectedProcess", "player"},
                          {"triggerThresholdValues", 3}}));
    EXPECT_FALSE(reporter->makeSignature("d", "t", "s", "c", "p", std::nullopt).contains("triggerThresholdValues"));

    std::optional<Dictionary> answer;
    reporter->requestSnapshot(signature, 1, std::nullopt, std::nullopt,
                              [&answer](const Dictionary& response) { answer = response; });
    EXPECT_FALSE(answer) << "whoever asks is not called back before he has returned";
    platform.workQueues.runAll();
    ASSERT_TRUE(answer) << "whoever waits for the answer must get one";
    EXPECT_EQ(*answer->find("success"), Value(false));
}

TEST(AbsentKernelTrace, HasNoSessions)
{
    EXPECT_FALSE(AbsentKernelTrace().isAvailable());
    EXPECT_EQ(AbsentKernelTrace().createTraceSession(), nullptr);
}

TEST(AbsentPerformanceWriter, OpensNoFile)
{
    EXPECT_EQ(AbsentPerformanceWriter().open("/tmp/file", "project", 1), nullptr);
}

} // namespace
} // namespace platform
