// The room of the log: lines to journald or to a descriptor, the levels that are wanted, and the last lines for a
// snapshot. It touches journald's socket and one descriptor.
//
// The log: journald where the service runs under it, standard error elsewhere.
//
// To the journal goes one datagram a line in its native protocol, with the category and the place of the
// statement as fields that can be searched; to a descriptor one write a line. What clients say ends up in
// messages, so no message can look like two: line ends and other control characters are written as escapes,
// which also keeps them from ending a field of the protocol or steering somebody's terminal.
#pragma once

#include "platform/Log.h"
#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/log/LogThresholds.h"
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

    // In bytes; the rest of a longer message is cut off, and the line says how much.
    static constexpr std::size_t longestMessage = 32768;

    // The journal when standard error is connected to it, as JOURNAL_STREAM tells, else standard error.
    [[nodiscard]] static Destination destinationOfThisProcess();

    LinuxLog(LogThresholds thresholds, const Destination& destination);

    [[nodiscard]] LogLevel threshold(const LogCategory& category) const override
    {
        return thresholds_.threshold(category.tag());
    }

    // Waits for a journal that is behind, but not long and not again until it took a line: what it does not
    // take is lost, and the next line that it takes is followed by one that tells how many were. A journal
    // that is not there is replaced by the descriptor.
    void write(const LogRecord& record) override;

    // What was written last, wherever it went.
    [[nodiscard]] const RecentLogLines& recentLines() const noexcept { return recentLines_; }

private:
    enum class Sent : std::uint8_t { Yes, Lost, NoJournal };

    void connectToJournal(const std::string& path);
    [[nodiscard]] Sent sendToJournal(const LogRecord& record, std::string_view line);
    void reportLost();
    void writeToDescriptor(std::string_view line) const;

    const LogThresholds thresholds_;
    const int descriptor_;
    FileDescriptor journal_; // none: there is no journal
    sockaddr_un journalAddress_{};
    std::atomic<bool> journalIsBehind_ = false;
    std::atomic<std::uint64_t> lostLines_ = 0;
    RecentLogLines recentLines_;
};

} // namespace platform
