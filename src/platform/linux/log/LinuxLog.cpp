// SPDX-License-Identifier: Apache-2.0
// A line is made once, escaped and cut, so that the journal, standard error and a bug capture have the same text.
#include "platform/linux/log/LinuxLog.h"

#include "foundation/values/String.h"
#include "platform/linux/files/WriteAll.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/process/Environment.h"
#include "platform/linux/process/LinuxClock.h"

#include <cerrno>
#include <cstring>
#include <fmt/format.h>
#include <iterator>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <unistd.h>

namespace platform {
namespace {

constexpr timeval longestWaitForJournal = {.tv_sec = 0, .tv_usec = 100'000};

using Buffer = fmt::basic_memory_buffer<char, 1024>;

constexpr int journalPriority(LogLevel level) noexcept
{
    switch (level) {
    case LogLevel::Error: return 3;
    case LogLevel::Default: return 5;
    case LogLevel::Info: return 6;
    case LogLevel::Debug: return 7;
    }
    return 5;
}

constexpr bool isControl(unsigned char byte) noexcept
{
    return (byte < 0x20 && byte != '\t') || byte == 0x7F;
}

// The control characters above ASCII, U+0080 to U+009F, are C2 80 to C2 9F.
bool isWideControl(std::string_view text, std::size_t at) noexcept
{
    return text[at] == '\xC2' && at + 1 < text.size() && static_cast<unsigned char>(text[at + 1]) < 0xA0;
}

void appendEscaped(std::string_view text, Buffer& out)
{
    for (std::size_t at = 0; at < text.size(); ++at) {
        const auto byte = static_cast<unsigned char>(text[at]);
        if (byte == '\n')
            out.append(std::string_view("\\n"));
        else if (byte == '\r')
            out.append(std::string_view("\\r"));
        else if (isControl(byte))
            fmt::format_to(std::back_inserter(out), "\\x{:02x}", byte);
        else if (isWideControl(text, at))
            fmt::format_to(std::back_inserter(out), "\\u{:04x}", static_cast<unsigned char>(text[++at]));
        else
            out.push_back(text[at]);
    }
}

// Prefix and message, as one line without its end.
void appendLine(const LogRecord& record, Buffer& out)
{
    out.append(logPrefix(record.location));
    const std::string_view message = foundation::cutBetweenCharacters(record.message, LinuxLog::longestMessage);
    appendEscaped(message, out);
    if (message.size() < record.message.size())
        fmt::format_to(std::back_inserter(out), "... ({} bytes more)", record.message.size() - message.size());
}

} // namespace

LinuxLog::Destination LinuxLog::destinationOfThisProcess()
{
    struct stat status = {};
    if (::fstat(STDERR_FILENO, &status) != 0
        || environment("JOURNAL_STREAM") != fmt::format("{}:{}", status.st_dev, status.st_ino))
        return {};
    return {.journalSocket = "/run/systemd/journal/socket"};
}

LinuxLog::LinuxLog(LogThresholds thresholds, const Destination& destination)
    : thresholds_(std::move(thresholds)),
      descriptor_(destination.descriptor)
{
    if (!destination.journalSocket.empty())
        connectToJournal(destination.journalSocket);
}

// The socket stays unconnected: each line is sent to the path, so that it reaches a journal that was restarted.
void LinuxLog::connectToJournal(const std::string& path)
{
    if (path.size() >= sizeof journalAddress_.sun_path)
        return;
    journalAddress_.sun_family = AF_UNIX;
    std::memcpy(journalAddress_.sun_path, path.data(), path.size());
    journal_ = FileDescriptor(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0));
    if (journal_)
        ::setsockopt(journal_.get(), SOL_SOCKET, SO_SNDTIMEO, &longestWaitForJournal, sizeof longestWaitForJournal);
}

void LinuxLog::write(const LogRecord& record)
{
    Buffer line;
    appendLine(record, line);
    const std::string_view text(line.data(), line.size());
    recentLines_.add(LinuxClock().secondsSince1970(), record.level, record.category.tag(), text);
    if (writer_.add(record, text))
        return;
    ++lostLines_;
    if (ledger::Ledger* ledger = ledger_)
        ledger->count(ledger::Counter::LogLinesLost);
}

void LinuxLog::reportLost()
{
    if (const std::uint64_t lost = lostLines_.exchange(0); lost > 0)
        ProviderLog(*this).error("{} log lines were lost because the log did not keep up", lost);
}

void LinuxLog::writeOut(const LogLines& lines)
{
    reportLost(); // with the next lines, for which there is room now
    if (!journal_)
        return writeToDescriptor(lines.text());
    lines.forEach([this](const LogLines::Line& line, std::string_view text) {
        if (!sendToJournal(line, text))
            writeToDescriptor(std::string(text) + '\n');
    });
}

// False without a journal. Waits for a slow one as long as the service runs; at its end only once, for all lines.
bool LinuxLog::sendToJournal(const LogLines::Line& line, std::string_view text)
{
    Buffer datagram;
    fmt::format_to(std::back_inserter(datagram),
                   "MESSAGE={}\nSUBSYSTEM={}\nCATEGORY={}\nPRIORITY={}\nCODE_FILE={}\nCODE_LINE={}\n"
                   "SYSLOG_IDENTIFIER={}\n",
                   text, line.category->subsystem(), line.category->tag(), journalPriority(line.level),
                   line.location.file, line.location.line, program_invocation_short_name);
    const int flags = MSG_NOSIGNAL | (journalIsBehind_ ? MSG_DONTWAIT : 0);
    while (::sendto(journal_.get(), datagram.data(), datagram.size(), flags,
                    reinterpret_cast<const sockaddr*>(&journalAddress_), sizeof journalAddress_)
           < 0) {
        if (errno == EINTR)
            continue;
        if (errno != EAGAIN)
            return false;
        journalIsBehind_ = writer_.isEnding();
        if (journalIsBehind_)
            return true;
    }
    return true;
}

void LinuxLog::writeToDescriptor(std::string_view lines) const
{
    static_cast<void>(writeAll(descriptor_, lines)); // a failure here cannot be reported anywhere
}

} // namespace platform
