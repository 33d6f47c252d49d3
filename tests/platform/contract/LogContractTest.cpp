// SPDX-License-Identifier: Apache-2.0
// The contract of platform/Log.h for a log: a threshold for each category, and complete lines from any thread.
#include "platform/contract/Contract.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/log/LinuxLog.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <array>
#include <atomic>
#include <gmock/gmock.h>
#include <map>
#include <sys/socket.h>
#include <system_error>

namespace contract {
namespace {

using platform::LogLevel;
using support::LogLine;
using testing::ElementsAre;

class LogSubject {
public:
    virtual ~LogSubject() = default;
    // The log of a process with that general threshold.
    [[nodiscard]] virtual platform::Log& start(LogLevel threshold) = 0;
    // All lines so far, as soon as there are so many.
    [[nodiscard]] virtual std::vector<LogLine> lines(std::size_t count) = 0;
};

class FakeLogSubject final : public LogSubject {
public:
    [[nodiscard]] platform::Log& start(LogLevel threshold) override
    {
        log_.setThreshold(threshold);
        return log_;
    }
    [[nodiscard]] std::vector<LogLine> lines(std::size_t) override { return log_.lines(); }

private:
    support::FakeLog log_;
};

// A socket stands in for the journal: a line is a datagram of fields.
class LinuxLogSubject final : public LogSubject {
public:
    LinuxLogSubject()
    {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path_.copy(address.sun_path, sizeof address.sun_path - 1);
        if (::bind(journal_.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0)
            throw std::system_error(errno, std::generic_category(), "bind");
    }
    [[nodiscard]] platform::Log& start(LogLevel threshold) override
    {
        return log_.emplace(platform::LogThresholds::parse(platform::name(threshold)).value(),
                            platform::LinuxLog::Destination{.journalSocket = path_, .descriptor = -1});
    }
    // A thread reads it, because a real journal is never late for long.
    [[nodiscard]] std::vector<LogLine> lines(std::size_t count) override
    {
        EXPECT_TRUE(progress_.waitFor([&] { return lines_.size() >= count; }));
        return progress_.look([&] { return lines_; });
    }
    ~LinuxLogSubject() override { ::shutdown(journal_.get(), SHUT_RDWR); }
    LinuxLogSubject(const LinuxLogSubject&) = delete;
    LinuxLogSubject& operator=(const LinuxLogSubject&) = delete;

private:
    void read()
    {
        std::array<char, 65536> datagram{};
        for (ssize_t size = 0; (size = ::recv(journal_.get(), datagram.data(), datagram.size(), 0)) > 0;) {
            LogLine line = lineOf({datagram.data(), static_cast<std::size_t>(size)});
            progress_.change([&] { lines_.push_back(std::move(line)); });
        }
    }
    static LogLine lineOf(std::string_view datagram)
    {
        std::map<std::string_view, std::string> fields;
        while (!datagram.empty()) {
            const std::string_view field = datagram.substr(0, datagram.find('\n'));
            const std::size_t equals = field.find('=');
            fields.emplace(field.substr(0, equals), field.substr(equals + 1));
            datagram.remove_prefix(field.size() + 1);
        }
        static const std::map<std::string, LogLevel> levels{
            {"3", LogLevel::Error}, {"5", LogLevel::Default}, {"6", LogLevel::Info}, {"7", LogLevel::Debug}};
        // "    KestoReportingSession:42    the message"
        const std::string& text = fields.at("MESSAGE");
        const std::size_t begin = text.find_first_not_of(' ');
        const std::size_t colon = text.find(':');
        const std::size_t columnsOfLine = std::max<std::size_t>(5, fields.at("CODE_LINE").size());
        return {levels.at(fields.at("PRIORITY")), fields.at("CATEGORY"),  text.substr(colon + 1 + columnsOfLine + 1),
                fields.at("SUBSYSTEM"),           fields.at("CODE_FILE"), std::stoi(fields.at("CODE_LINE")),
                text.substr(begin, colon - begin)};
    }

    const support::TemporaryDirectory directory_;
    const std::string path_ = directory_ / "journal";
    support::Progress progress_;
    std::vector<LogLine> lines_;
    const platform::FileDescriptor journal_{::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)};
    std::optional<platform::LinuxLog> log_;
    std::jthread reader_{[this] { read(); }}; // ends first
};

platform::LogCategory category{"com.quarn.kesto", "kerr"};

platform::LogRecord record(std::string_view message, LogLevel level = LogLevel::Default)
{
    return {category, level, {"/src/KestoReportingSessionVolume.cpp", 42, "KestoReportingSession"}, message};
}

using LogContract = Suite<LogSubject>;
KESTO_CONTRACT(LogContract, (provider<LogSubject, FakeLogSubject>("Fake")),
               (provider<LogSubject, LinuxLogSubject>("Linux")));

TEST_P(LogContract, TellsTheThresholdOfACategory)
{
    for (const LogLevel level : {LogLevel::Error, LogLevel::Default, LogLevel::Info, LogLevel::Debug})
        EXPECT_EQ(subject->start(level).threshold(category), level) << platform::name(level);
}

TEST_P(LogContract, KeepsALineWithAllThatItWasGiven)
{
    platform::Log& log = subject->start(LogLevel::Debug);
    log.write(record("one", LogLevel::Error));
    log.write(record("", LogLevel::Info));
    log.write({category, LogLevel::Debug, {"Other.cpp", 7}, "größer = 3"});
    const auto lines = subject->lines(3);
    ASSERT_EQ(lines.size(), 3U);
    EXPECT_THAT(lines[0], support::IsLine(LogLevel::Error, "kerr", "one"));
    EXPECT_EQ(lines[0].subsystem, "com.quarn.kesto");
    EXPECT_EQ(lines[0].file, "KestoReportingSessionVolume.cpp");
    EXPECT_EQ(lines[0].line, 42);
    EXPECT_EQ(lines[0].name, "KestoReportingSession");
    EXPECT_THAT(lines[1], support::IsLine(LogLevel::Info, "kerr", ""));
    EXPECT_THAT(lines[2], support::IsLine(LogLevel::Debug, "kerr", "größer = 3"));
    EXPECT_EQ(lines[2].file, "Other.cpp");
    EXPECT_EQ(lines[2].line, 7);
    EXPECT_EQ(lines[2].name, "Other");
}

TEST_P(LogContract, WritesEveryRecord)
{
    platform::Log& log = subject->start(LogLevel::Error);
    log.write(record("below the threshold", LogLevel::Debug));
    EXPECT_EQ(subject->lines(1).size(), 1U) << "callers check the threshold first";
}

TEST_P(LogContract, KeepsTheLinesOfManyThreadsWholeAndEachThreadsInOrder)
{
    constexpr int rounds = 60;
    constexpr int each = 3; // with those of the other threads no more than a journal's socket holds
    platform::Log& log = subject->start(LogLevel::Debug);
    std::vector<LogLine> lines;
    for (int round = 0; round < rounds; ++round) {
        {
            std::vector<std::jthread> threads;
            for (const char letter : {'a', 'b', 'c'})
                threads.emplace_back([&log, letter, round] {
                    for (int number = 0; number < each; ++number)
                        log.write(record(letter + std::to_string(round * each + number)));
                });
        }
        lines = subject->lines(static_cast<std::size_t>(3 * each * (round + 1)));
    }
    std::map<char, int> next;
    for (const LogLine& line : lines) {
        const char letter = line.message.at(0);
        EXPECT_EQ(line.message, letter + std::to_string(next[letter]));
        ++next[letter];
    }
    EXPECT_THAT(next, ElementsAre(testing::Pair('a', 180), testing::Pair('b', 180), testing::Pair('c', 180)));
}

} // namespace
} // namespace contract
