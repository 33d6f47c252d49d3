// A system that lacks a service: nothing is there, nothing breaks, and whoever asks is told.
#include "platform/Absent.h"

#include <gtest/gtest.h>
#include <optional>

namespace platform {
namespace {

TEST(AbsentReportingChannels, AreNotFound)
{
    AbsentReportingChannels channels;
    const auto found = channels.copyChannelsInGroup("Audio", std::nullopt);
    EXPECT_EQ(found.channels, nullptr);
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
