// SPDX-License-Identifier: Apache-2.0
// Lines as they reach a descriptor and a journal, byte for byte, with clients that try to forge lines and a journal
// that is slow or missing.
#include "platform/linux/log/LinuxLog.h"

#include "platform/linux/log/ProviderLog.h"
#include "support/TemporaryDirectory.h"

#include <array>
#include <cerrno>
#include <fcntl.h>
#include <fmt/format.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace platform {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::StartsWith;

LogCategory category{"com.quarn.kesto", "kerr"};

LogRecord record(std::string_view message, LogLevel level = LogLevel::Default)
{
    return {category, level, {"/a/KestoReportingSessionVolume.cpp", 42, "KestoReportingSession"}, message};
}

constexpr std::string_view prefix = "    KestoReportingSession:42    ";

// --- Lines on a descriptor

class LinuxLogDescriptorTest : public testing::Test {
protected:
    void SetUp() override
    {
        std::array<int, 2> ends{};
        // A packet socket separates the writes.
        ASSERT_EQ(::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends.data()), 0);
        reader = FileDescriptor(ends[0]);
        writer = FileDescriptor(ends[1]);
    }

    // The bytes of the next write(2), or nothing without one.
    std::optional<std::string> nextWrite(LinuxLog& log)
    {
        log.flush();
        return nextWrite();
    }
    std::optional<std::string> nextWrite()
    {
        std::string bytes(1 << 20, '\0');
        const ssize_t length = ::recv(reader.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
        if (length < 0)
            return std::nullopt;
        bytes.resize(static_cast<std::size_t>(length));
        return bytes;
    }

    LinuxLog log() { return LinuxLog(LogThresholds(), {.journalSocket = {}, .descriptor = writer.get()}); }

    FileDescriptor reader;
    FileDescriptor writer;
};

TEST_F(LinuxLogDescriptorTest, WritesOneLineWithThePrefixInOneWrite)
{
    log().write(record("started"));
    EXPECT_EQ(nextWrite(), std::string(prefix) + "started\n");
    EXPECT_EQ(nextWrite(), std::nullopt);
}

TEST_F(LinuxLogDescriptorTest, AClientCannotForgeALine)
{
    log().write(record("name\n    KestoReportingSession:42    forged\r\nagain"));
    EXPECT_EQ(nextWrite(), std::string(prefix) + "name\\n    KestoReportingSession:42    forged\\r\\nagain\n");
    EXPECT_EQ(nextWrite(), std::nullopt);
}

TEST_F(LinuxLogDescriptorTest, AClientCannotSteerTheTerminal)
{
    using namespace std::string_view_literals;
    log().write(record("a\x1b[2Jb\x07\x7f\x00"
                       "c\xc2\x9b"
                       "d\xc2\xa0\tz"sv));
    EXPECT_EQ(nextWrite(), std::string(prefix) + "a\\x1b[2Jb\\x07\\x7f\\x00c\\u009bd\xc2\xa0\tz\n");
}

TEST_F(LinuxLogDescriptorTest, KeepsTextBeyondAsciiAsItIs)
{
    log().write(record("Größe in µs 音量 \xf0\x9f\x8e\xb5"));
    EXPECT_EQ(nextWrite(), std::string(prefix) + "Größe in µs 音量 \xf0\x9f\x8e\xb5\n");
}

TEST_F(LinuxLogDescriptorTest, LooksAtNothingBehindTheEndOfTheMessage)
{
    log().write(record(std::string_view("half a character\xc2\x9b").substr(0, 17)));
    EXPECT_EQ(nextWrite(), std::string(prefix) + "half a character\xc2\n");
}

TEST_F(LinuxLogDescriptorTest, AnEmptyMessageIsALineToo)
{
    log().write(record(""));
    EXPECT_EQ(nextWrite(), std::string(prefix) + "\n");
}

TEST_F(LinuxLogDescriptorTest, CutsALongMessageAndSaysHowMuchIsMissing)
{
    log().write(record(std::string(LinuxLog::longestMessage + 7, 'x')));
    EXPECT_EQ(nextWrite(), std::string(prefix) + std::string(LinuxLog::longestMessage, 'x') + "... (7 bytes more)\n");
}

TEST_F(LinuxLogDescriptorTest, NeverCutsInsideACharacter)
{
    std::string message(LinuxLog::longestMessage - 1, 'x');
    message += "é!";
    log().write(record(message));
    EXPECT_EQ(nextWrite(),
              std::string(prefix) + std::string(LinuxLog::longestMessage - 1, 'x') + "... (3 bytes more)\n");
}

TEST_F(LinuxLogDescriptorTest, AskedForAThresholdAnswersWithTheOneOfTheTag)
{
    const LinuxLog log(*LogThresholds::parse("error,kerr=info"), {.journalSocket = {}, .descriptor = writer.get()});
    static LogCategory other{"com.quarn.kesto", "kers"};
    EXPECT_EQ(log.threshold(category), LogLevel::Info);
    EXPECT_EQ(log.threshold(other), LogLevel::Error);
}

TEST_F(LinuxLogDescriptorTest, ManyThreadsDoNotMixTheirLines)
{
    LinuxLog shared(LogThresholds(), {.journalSocket = {}, .descriptor = writer.get()});
    constexpr int lines = 50;
    {
        std::vector<std::jthread> threads;
        for (char letter : {'a', 'b', 'c'})
            threads.emplace_back([&shared, letter] {
                for (int line = 0; line < lines; ++line)
                    shared.write(record(std::string(100, letter)));
            });
    }
    shared.flush();
    std::string all;
    while (const auto written = nextWrite())
        all += *written;
    ASSERT_EQ(all.size(), 3 * lines * (prefix.size() + 101));
    for (std::string_view rest = all; !rest.empty(); rest.remove_prefix(prefix.size() + 101)) {
        const char letter = rest[prefix.size()];
        ASSERT_EQ(rest.substr(0, prefix.size() + 101), std::string(prefix) + std::string(100, letter) + "\n");
    }
}

TEST(LinuxLogTest, AClosedDescriptorIsNotAFailure)
{
    LinuxLog(LogThresholds(), {.journalSocket = {}, .descriptor = -1}).write(record("into the void"));
}

// --- The journal

class LinuxLogJournalTest : public testing::Test {
protected:
    void listen()
    {
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.copy(address.sun_path, sizeof address.sun_path - 1);
        journal = FileDescriptor(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
        ASSERT_EQ(::bind(journal.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    }
    void stopListening()
    {
        journal = FileDescriptor();
        std::filesystem::remove(path);
    }

    std::optional<std::string> nextDatagram()
    {
        std::string bytes(1 << 20, '\0');
        const ssize_t length = ::recv(journal.get(), bytes.data(), bytes.size(), MSG_DONTWAIT);
        if (length < 0)
            return std::nullopt;
        bytes.resize(static_cast<std::size_t>(length));
        return bytes;
    }

    // Waits for it.
    std::optional<std::string> awaitDatagram()
    {
        pollfd readable{.fd = journal.get(), .events = POLLIN, .revents = 0};
        constexpr int longest = 20'000;
        return ::poll(&readable, 1, longest) == 1 ? nextDatagram() : std::nullopt;
    }

    LinuxLog log() { return LinuxLog(LogThresholds(), {.journalSocket = path, .descriptor = fallback.get()}); }
    std::string fallbackText() { return support::readFile(directory.path() / "fallback"); }

    support::TemporaryDirectory directory;
    const std::string path = directory.path() / "journal";
    FileDescriptor journal;
    const FileDescriptor fallback{
        ::open((directory.path() / "fallback").c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600)};
};

TEST_F(LinuxLogJournalTest, SendsTheFieldsInTheNativeProtocol)
{
    listen();
    log().write(record("started"));
    EXPECT_EQ(nextDatagram(),
              fmt::format("MESSAGE={}started\n"
                          "SUBSYSTEM=com.quarn.kesto\n"
                          "CATEGORY=kerr\n"
                          "PRIORITY=5\n"
                          "CODE_FILE=KestoReportingSessionVolume.cpp\n"
                          "CODE_LINE=42\n"
                          "SYSLOG_IDENTIFIER={}\n",
                          prefix, program_invocation_short_name));
    EXPECT_EQ(fallbackText(), "");
}

TEST_F(LinuxLogJournalTest, EveryLevelHasItsPriority)
{
    listen();
    LinuxLog log = LinuxLog(LogThresholds(), {.journalSocket = path, .descriptor = fallback.get()});
    for (const auto& [level, priority] :
         {std::pair(LogLevel::Error, "\nPRIORITY=3\n"), std::pair(LogLevel::Default, "\nPRIORITY=5\n"),
          std::pair(LogLevel::Info, "\nPRIORITY=6\n"), std::pair(LogLevel::Debug, "\nPRIORITY=7\n")}) {
        log.write(record("message", level));
        log.flush();
        EXPECT_THAT(nextDatagram().value_or(""), HasSubstr(priority));
    }
}

TEST_F(LinuxLogJournalTest, AClientCannotForgeAField)
{
    listen();
    log().write(record("x\nPRIORITY=0\n_PID=1"));
    EXPECT_THAT(nextDatagram().value_or(""),
                StartsWith(fmt::format("MESSAGE={}x\\nPRIORITY=0\\n_PID=1\nSUBSYSTEM=", prefix)));
}

TEST_F(LinuxLogJournalTest, TheLongestMessageThatIsAllEscapesStillFits)
{
    listen();
    log().write(record(std::string(LinuxLog::longestMessage, '\x01')));
    EXPECT_GT(nextDatagram().value_or("").size(), 4 * LinuxLog::longestMessage);
}

TEST_F(LinuxLogJournalTest, WithoutAJournalLinesGoToTheDescriptor)
{
    log().write(record("nobody listens"));
    EXPECT_EQ(fallbackText(), std::string(prefix) + "nobody listens\n");
}

TEST_F(LinuxLogJournalTest, ReachesAJournalThatWasRestarted)
{
    LinuxLog log(LogThresholds(), {.journalSocket = path, .descriptor = fallback.get()});
    listen();
    log.write(record("before"));
    log.flush();
    EXPECT_TRUE(nextDatagram());
    stopListening();
    log.write(record("between"));
    log.flush();
    listen();
    log.write(record("after"));
    log.flush();
    EXPECT_THAT(nextDatagram().value_or(""), HasSubstr("after"));
    EXPECT_EQ(fallbackText(), std::string(prefix) + "between\n");
}

TEST_F(LinuxLogJournalTest, AJournalThatIsBehindLosesNoLineUntilTooManyWait)
{
    listen();
    LinuxLog log(LogThresholds(), {.journalSocket = path, .descriptor = fallback.get()});
    ledger::Ledger ledger;
    log.setLedger(ledger);
    // Without a reader the journal's socket fills up, and then the lines wait.
    constexpr int written = 500;
    const std::string message(1000, 'x');
    for (int line = 0; line < written; ++line)
        log.write(record(message));
    for (int line = 0; line < written; ++line)
        ASSERT_TRUE(awaitDatagram());

    EXPECT_EQ(ledger.account()[ledger::Counter::LogLinesLost], 0U);
    EXPECT_EQ(fallbackText(), "");
}

TEST_F(LinuxLogJournalTest, LinesBeyondThoseThatMayWaitAreLostAndALineReportsHowMany)
{
    listen();
    LinuxLog log(LogThresholds(), {.journalSocket = path, .descriptor = fallback.get()});
    ledger::Ledger ledger;
    log.setLedger(ledger);
    constexpr std::uint64_t written = 6000;
    const std::string message(1000, 'x');
    for (std::uint64_t line = 0; line < written; ++line)
        log.write(record(message));
    const std::uint64_t lost = ledger.account()[ledger::Counter::LogLinesLost];
    ASSERT_GT(lost, 0U);
    ASSERT_LT(lost, written);

    for (std::uint64_t line = 0; line < written - lost; ++line)
        ASSERT_THAT(awaitDatagram().value_or(""), HasSubstr("xxx"));
    EXPECT_THAT(awaitDatagram().value_or(""),
                AllOf(HasSubstr(fmt::format("{} log lines were lost because the log did not keep up", lost)),
                      HasSubstr("\nPRIORITY=3\n")));
    log.write(record("no more of that"));
    EXPECT_THAT(awaitDatagram().value_or(""), HasSubstr("no more of that"));
    log.flush();
    EXPECT_EQ(nextDatagram(), std::nullopt);
}

TEST_F(LinuxLogJournalTest, AnEndWaitsOnlyOnceForAJournalThatIsBehind)
{
    listen();
    const auto start = std::chrono::steady_clock::now();
    {
        LinuxLog log(LogThresholds(), {.journalSocket = path, .descriptor = fallback.get()});
        for (int line = 0; line < 500; ++line)
            log.write(record(std::string(1000, 'x')));
    }
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(20)) << "500 waits take 50 s";
}

// --- The choice between the two

class ScopedVariable {
public:
    ScopedVariable(const char* name, const std::string& value) : name_(name) { ::setenv(name, value.c_str(), 1); }
    ~ScopedVariable() { ::unsetenv(name_); }
    ScopedVariable(const ScopedVariable&) = delete;
    ScopedVariable& operator=(const ScopedVariable&) = delete;

private:
    const char* name_;
};

TEST(LinuxLogDestinationTest, IsTheJournalWhenStandardErrorIsItsStream)
{
    struct stat status = {};
    ASSERT_EQ(::fstat(STDERR_FILENO, &status), 0);
    const ScopedVariable stream("JOURNAL_STREAM", fmt::format("{}:{}", status.st_dev, status.st_ino));
    EXPECT_EQ(LinuxLog::destinationOfThisProcess().journalSocket, "/run/systemd/journal/socket");
}

TEST(LinuxLogDestinationTest, IsStandardErrorWhenThatWasRedirected)
{
    const ScopedVariable stream("JOURNAL_STREAM", "1:1");
    EXPECT_EQ(LinuxLog::destinationOfThisProcess().journalSocket, "");
    EXPECT_EQ(LinuxLog::destinationOfThisProcess().descriptor, STDERR_FILENO);
}

TEST(LinuxLogDestinationTest, IsStandardErrorWithoutAJournal)
{
    ::unsetenv("JOURNAL_STREAM");
    EXPECT_EQ(LinuxLog::destinationOfThisProcess().journalSocket, "");
}

// --- The providers' own lines

TEST_F(LinuxLogDescriptorTest, AProvidersLineNamesWhereItStands)
{
    LinuxLog log(LogThresholds(), {.journalSocket = {}, .descriptor = writer.get()});
    ProviderLog(log).error("{} of {}", 1, "two");
    const int line = __LINE__ - 1;
    EXPECT_EQ(nextWrite(log), fmt::format("{:>25}:{:<5} 1 of two\n", "LinuxLogTest", line));
}

TEST_F(LinuxLogDescriptorTest, AProvidersLineBelowTheThresholdIsDropped)
{
    LinuxLog log(*LogThresholds::parse("kerl=error"), {.journalSocket = {}, .descriptor = writer.get()});
    ProviderLog(log).note("not wanted");
    EXPECT_EQ(nextWrite(log), std::nullopt);
    ProviderLog(log).error("wanted");
    EXPECT_TRUE(nextWrite(log));
}

} // namespace
} // namespace platform
