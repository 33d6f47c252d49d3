// SPDX-License-Identifier: Apache-2.0
// The room of the log: lines to journald or to a descriptor, the enabled levels, and the last lines for a snapshot. It
// uses journald's socket and one descriptor.
//
// The log: journald where the service runs under it, standard error elsewhere.
//
// A thread of its own writes the lines. The journal gets one datagram for each line in its native protocol, with the
// category and the place of the statement as fields that can be searched; a descriptor gets whole lines. Messages hold
// text from clients, so line ends and other control characters are written as escapes: a message cannot look like two
// lines, end a field of the protocol, or control a reader's terminal.
#pragma once

#include "ledger/Ledger.h"
#include "platform/Log.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/log/LogThresholds.h"
#include "platform/linux/log/LogWriter.h"
#include "platform/linux/log/RecentLogLines.h"

#include <atomic>
#include <string>
#include <sys/un.h>

namespace platform {

// Any thread.
class LinuxLog final : public Log {
public:
    struct Destination {
        std::string journalSocket; // empty: lines go to the descriptor
        int descriptor = 2; // not owned
    };

    // In bytes; a longer message is cut, and the line reports how many bytes were cut.
    static constexpr std::size_t longestMessage = 32768;

    // The journal if JOURNAL_STREAM shows that standard error is connected to it, else standard error.
    [[nodiscard]] static Destination destinationOfThisProcess();

    LinuxLog(LogThresholds thresholds, const Destination& destination);

    [[nodiscard]] LogLevel threshold(const LogCategory& category) const override
    {
        return thresholds_.threshold(category.tag());
    }

    // Never waits for the journal or a disk. If they are so slow that a megabyte of lines waits, further lines are
    // lost, and a line reports their number as soon as there is room. If the journal does not exist, lines go to the
    // descriptor.
    void write(const LogRecord& record) override;
    void flush() override { writer_.flush(); }

    // Counts lost lines from now on.
    void setLedger(ledger::Ledger& ledger) noexcept { ledger_ = &ledger; }

    // The last lines, for both destinations.
    [[nodiscard]] const RecentLogLines& recentLines() const noexcept { return recentLines_; }

private:
    void connectToJournal(const std::string& path);
    void reportLost();
    // The following are for the writer's thread.
    void writeOut(const LogLines& lines);
    [[nodiscard]] bool sendToJournal(const LogLines::Line& line, std::string_view text);
    void writeToDescriptor(std::string_view lines) const;

    const LogThresholds thresholds_;
    const int descriptor_;
    FileDescriptor journal_; // empty without a journal
    sockaddr_un journalAddress_{};
    bool journalIsBehind_ = false; // at the end, so that no line waits for it any more
    std::atomic<std::uint64_t> lostLines_ = 0; // since the last line that reported them
    std::atomic<ledger::Ledger*> ledger_ = nullptr;
    RecentLogLines recentLines_;
    LogWriter writer_{[this](const LogLines& lines) { writeOut(lines); }}; // last: its thread uses the others
};

} // namespace platform
