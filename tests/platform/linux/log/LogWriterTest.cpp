// SPDX-License-Identifier: Apache-2.0
// The thread behind the log, with a log that these tests hold up as a blocked disk would.
#include "platform/linux/log/LogWriter.h"

#include "support/Progress.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

using testing::ElementsAre;

LogCategory writerCategory{"com.quarn.kesto", "kerr"};

LogRecord recordOf(LogLevel level)
{
    return {writerCategory, level, {"File.cpp", 7}, ""};
}

class LogWriterTest : public testing::Test {
protected:
    ~LogWriterTest() override { release(); }

    bool add(std::string_view line, LogLevel level = LogLevel::Default) { return writer.add(recordOf(level), line); }
    // Until `release` the thread is held up by the lines that it writes.
    void hold()
    {
        progress.change([&] { isHeld = true; });
        EXPECT_TRUE(add("held"));
        EXPECT_TRUE(progress.waitFor([&] { return !texts.empty(); }));
    }
    void release()
    {
        progress.change([&] { isHeld = false; });
    }
    std::vector<std::string> written()
    {
        return progress.look([&] { return texts; });
    }

    support::Progress progress;
    bool isHeld = false;
    std::vector<std::string> texts; // one for each call
    LogWriter writer{[this](const LogLines& lines) {
        progress.change([&] { texts.push_back(lines.text()); });
        EXPECT_TRUE(progress.waitFor([&] { return !isHeld; }));
    }};
};

TEST_F(LogWriterTest, ALineIsWrittenWithoutBeingAskedFor)
{
    EXPECT_TRUE(add("one"));
    EXPECT_TRUE(progress.waitFor([&] { return texts == std::vector<std::string>{"one\n"}; }));
}

TEST_F(LogWriterTest, WhatComesWhileItWritesIsWrittenTogether)
{
    hold();
    EXPECT_TRUE(add("one"));
    EXPECT_TRUE(add(""));
    EXPECT_TRUE(add("three"));
    EXPECT_THAT(written(), ElementsAre("held\n"));
    release();
    writer.flush();
    EXPECT_THAT(written(), ElementsAre("held\n", "one\n\nthree\n"));
}

TEST_F(LogWriterTest, TheLastQuarterOfTheRoomIsForErrors)
{
    hold();
    const std::string line(1000, 'x');
    int lines = 0;
    while (add(line))
        ++lines;
    int errors = 0;
    while (add(line, LogLevel::Error))
        ++errors;
    const auto each = 1001 + sizeof(LogLines::Line);
    EXPECT_EQ(lines, 786'432 / each);
    EXPECT_EQ(lines + errors, 1'048'576 / each);
    EXPECT_FALSE(add("a short line"));
}

TEST_F(LogWriterTest, AFlushDoesNotWaitForLinesThatComeLater)
{
    EXPECT_TRUE(add("one"));
    writer.flush();
    EXPECT_THAT(written(), ElementsAre("one\n"));
    writer.flush();
}

TEST_F(LogWriterTest, AFlushEndsThoughTheLogIsBlocked)
{
    hold();
    EXPECT_TRUE(add("one"));
    writer.flush();
    EXPECT_THAT(written(), ElementsAre("held\n"));
}

TEST(LogWriterEndTest, WritesWhatWaits)
{
    std::string text;
    {
        LogWriter writer([&](const LogLines& lines) { text += lines.text(); });
        EXPECT_TRUE(writer.add(recordOf(LogLevel::Debug), "one"));
        EXPECT_TRUE(writer.add(recordOf(LogLevel::Debug), "two"));
    }
    EXPECT_EQ(text, "one\ntwo\n");
}

TEST(LogLinesTest, GiveEachLineWithWhatItWasGiven)
{
    LogLines lines;
    EXPECT_TRUE(lines.empty());
    lines.add(recordOf(LogLevel::Error), "one");
    lines.add(recordOf(LogLevel::Debug), "");
    EXPECT_EQ(lines.count(), 2U);
    EXPECT_EQ(lines.text(), "one\n\n");
    std::vector<std::pair<LogLevel, std::string>> seen;
    lines.forEach([&](const LogLines::Line& line, std::string_view text) {
        EXPECT_EQ(line.category, &writerCategory);
        EXPECT_EQ(line.location.line, 7);
        seen.emplace_back(line.level, text);
    });
    EXPECT_THAT(seen, ElementsAre(std::pair(LogLevel::Error, "one"), std::pair(LogLevel::Debug, "")));
}

} // namespace
} // namespace platform
