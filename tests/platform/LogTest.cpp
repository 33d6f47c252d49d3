// SPDX-License-Identifier: Apache-2.0
// Log statements: a disabled statement does not evaluate its arguments, an enabled one shows its place in the source.
#include "platform/Log.h"

#include "support/TestPlatform.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <string>
#include <thread>
#include <vector>

namespace platform {
namespace {

using support::IsLine;
using testing::ElementsAre;

constexpr std::string_view subsystem = "com.quarn.kesto.reporting";

class LogTest : public testing::Test {
protected:
    // As at the start of another service in the same process.
    static void installAnew()
    {
        const Platform same = current();
        install(same);
    }

    LogCategory category_{subsystem, "test"}; // outlives the platform, which makes it forget its threshold
    support::TestPlatform platform_;
};

// How many lines of client 7 these lines report as left out.
std::uint64_t reportedIn(const std::vector<support::LogLine>& lines)
{
    const std::string begin = "client 7 made too many log lines: ";
    std::uint64_t sum = 0;
    for (const support::LogLine& line : lines) {
        if (!line.message.starts_with(begin))
            continue;
        const std::uint64_t leftOut = std::stoull(line.message.substr(begin.size()));
        EXPECT_THAT(
            line,
            IsLine(LogLevel::Error, "log",
                   begin + std::to_string(leftOut) + " were left out; it may have 2000 at once and 50 a second"));
        sum += leftOut;
    }
    return sum;
}

TEST_F(LogTest, ALineCarriesItsLevelTagAndText)
{
    KESTO_LOG(category_, Error, "session {} of \"{}\" is gone", 42, std::string("player"));
    KESTO_LOG(category_, Debug, "plain");
    EXPECT_THAT(platform_.log.take(),
                ElementsAre(IsLine(LogLevel::Error, "test", "session 42 of \"player\" is gone"),
                            IsLine(LogLevel::Debug, "test", "plain")));
}

TEST_F(LogTest, ALineSaysWhereItStands)
{
    KESTO_LOG(category_, Info, "here");
    const int line = __LINE__ - 1;
    const auto lines = platform_.log.take();
    ASSERT_EQ(lines.size(), 1U);
    EXPECT_EQ(lines[0].file, "LogTest.cpp");
    EXPECT_EQ(lines[0].name, "LogTest");
    EXPECT_EQ(lines[0].line, line);
    EXPECT_EQ(lines[0].subsystem, subsystem);
}

TEST_F(LogTest, EveryThresholdLetsThroughItselfAndWhatIsMoreImportant)
{
    const std::vector<LogLevel> levels{LogLevel::Error, LogLevel::Default, LogLevel::Info, LogLevel::Debug};
    for (const LogLevel threshold : levels) {
        platform_.log.setThreshold(threshold);
        installAnew();
        for (const LogLevel level : levels)
            EXPECT_EQ(category_.isEnabled(level), level <= threshold) << name(level) << " at " << name(threshold);
    }
}

TEST_F(LogTest, WhatIsNotSaidIsNotEvaluated)
{
    platform_.log.setThreshold(LogLevel::Default);
    int evaluated = 0;
    KESTO_LOG(category_, Info, "{}", ++evaluated);
    KESTO_LOG(category_, Debug, "{}", ++evaluated);
    EXPECT_EQ(evaluated, 0);
    KESTO_LOG(category_, Default, "{}", ++evaluated);
    EXPECT_EQ(evaluated, 1);
    EXPECT_THAT(platform_.log.take(), ElementsAre(IsLine(LogLevel::Default, "test", "1")));
}

TEST_F(LogTest, TheThresholdIsAskedForOnceACategory)
{
    platform_.log.setThreshold(LogLevel::Info);
    KESTO_LOG(category_, Debug, "dropped");
    platform_.log.setThreshold(LogLevel::Debug);
    KESTO_LOG(category_, Debug, "dropped all the same");
    static LogCategory newcomer(subsystem, "newcomer");
    KESTO_LOG(newcomer, Debug, "kept");
    EXPECT_THAT(platform_.log.take(), ElementsAre(IsLine(LogLevel::Debug, "newcomer", "kept")));
}

TEST_F(LogTest, ANewInstallationIsAskedAnew)
{
    platform_.log.setThreshold(LogLevel::Error);
    KESTO_LOG(category_, Info, "dropped");
    platform_.log.setThreshold(LogLevel::Info);
    installAnew();
    KESTO_LOG(category_, Info, "kept");
    EXPECT_THAT(platform_.log.take(), ElementsAre(IsLine(LogLevel::Info, "test", "kept")));
}

TEST_F(LogTest, ThreadsMayMeetACategoryForTheFirstTimeTogether)
{
    {
        std::vector<std::jthread> threads;
        for (int thread = 0; thread < 4; ++thread)
            threads.emplace_back([this] { KESTO_LOG(category_, Info, "from a thread"); });
    }
    EXPECT_EQ(platform_.log.take().size(), 4U);
}

TEST_F(LogTest, AThreadThatWritesForAShareLeavesOutWhatGoesBeyondIt)
{
    LogShare share("client 7");
    {
        const LogShare::Writing writing(&share);
        for (int line = 0; line < 10'000; ++line)
            KESTO_LOG(category_, Default, "again");
        KESTO_LOG(category_, Error, "an error has a part of its own");
    }
    KESTO_LOG(category_, Default, "for no share");
    const auto lines = platform_.log.take();
    const auto written = static_cast<std::uint64_t>(std::ranges::count(lines, "again", &support::LogLine::message));
    const std::uint64_t leftOut = platform_.ledger.account()[ledger::Counter::LogLinesLeftOut];
    EXPECT_GE(written, 2000U);
    EXPECT_LT(written, 5000U) << "a minute's";
    EXPECT_EQ(written + leftOut, 10'000U);
    EXPECT_THAT(lines, testing::Contains(IsLine(LogLevel::Error, "test", "an error has a part of its own")));
    EXPECT_THAT(lines, testing::Contains(IsLine(LogLevel::Default, "test", "for no share")));

    EXPECT_GT(reportedIn(lines), 0U) << "with the next line that is written";
    reportLeftOutLines(share);
    EXPECT_EQ(reportedIn(lines) + reportedIn(platform_.log.take()), leftOut)
        << "a slow loop earns another line, reports with it, and leaves out more";
    reportLeftOutLines(share);
    EXPECT_THAT(platform_.log.take(), testing::IsEmpty());
}

TEST_F(LogTest, LinesAboutConnectionsHaveAPartOfTheirOwn)
{
    LogShare share("process 7");
    const LogShare::Writing aboutConnection(&share, LogShare::About::Connections);
    for (int line = 0; line < 10'000; ++line)
        KESTO_LOG(category_, Error, "comes and goes");
    EXPECT_LT(std::ranges::count(platform_.log.take(), "comes and goes", &support::LogLine::message), 5000);
    EXPECT_GT(platform_.ledger.account()[ledger::Counter::LogLinesLeftOut], 5000U);
    const LogShare::Writing aboutCalls(&share);
    KESTO_LOG(category_, Default, "a call");
    EXPECT_THAT(platform_.log.take(), testing::Contains(IsLine(LogLevel::Default, "test", "a call")));
}

// A category must neither ask an uninstalled log for a threshold nor keep one without a log.
TEST(LogWithoutPlatform, DropsStatementsAndRemembersNothing)
{
    LogCategory category(subsystem, "early");
    KESTO_LOG(category, Error, "nobody listens");
    {
        support::TestPlatform platform;
        KESTO_LOG(category, Debug, "heard");
        EXPECT_THAT(platform.log.take(), ElementsAre(IsLine(LogLevel::Debug, "early", "heard")));
    }
    KESTO_LOG(category, Error, "nobody listens again");
    EXPECT_FALSE(category.isEnabled(LogLevel::Error));
}

TEST(LogPrefix, HasTheFileRightAlignedAndTheLineLeftAligned)
{
    EXPECT_EQ(logPrefix({"KestoReportingSession", 7}), "    KestoReportingSession:7     ");
    EXPECT_EQ(logPrefix({"Log", 12345}), "                      Log:12345 ");
}

TEST(LogPrefix, LongNamesAreNotCut)
{
    EXPECT_EQ(logPrefix({"KestoReportingServiceDelegate", 123456}), "KestoReportingServiceDelegate:123456 ");
}

TEST(LogLocation, HasTheFileWithoutFoldersAndIsShownWithoutExtension)
{
    constexpr LogLocation inFolders("/a.d/b/Name.cpp", 7);
    EXPECT_EQ(inFolders.file, "Name.cpp");
    EXPECT_EQ(inFolders.name, "Name");
    EXPECT_EQ(inFolders.line, 7);
    EXPECT_EQ(LogLocation("Name.cpp", 1).name, "Name");
    EXPECT_EQ(LogLocation("/a.d/Name", 1).name, "Name");
    EXPECT_EQ(LogLocation("src/Two.Dots.cpp", 1).name, "Two.Dots");
}

TEST(LogLocation, IsShownUnderTheNameThatItIsGiven)
{
    constexpr LogLocation location("/a/ClassContinued.cpp", 7, "Class");
    EXPECT_EQ(location.file, "ClassContinued.cpp");
    EXPECT_EQ(location.name, "Class");
}

TEST(LogLevel, HasAName)
{
    EXPECT_EQ(name(LogLevel::Error), "error");
    EXPECT_EQ(name(LogLevel::Default), "default");
    EXPECT_EQ(name(LogLevel::Info), "info");
    EXPECT_EQ(name(LogLevel::Debug), "debug");
}

} // namespace
} // namespace platform
