// SPDX-License-Identifier: Apache-2.0
// The lists of sessions that a client's calls write into the log.
//
// A call of a few bytes may log a line about every session of every client. So each client has an allowance of bytes a
// minute for such lists, and once it is used up, the lines show the number of sessions in place of the list. A client
// that connects again begins with a new allowance; therefore all clients together have one, too.
#pragma once

#include "session/KestoReportingSession.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <span>
#include <string>

namespace client {

// Bytes that were used up in the present minute.
class BytesOfTheMinute {
public:
    explicit BytesOfTheMinute(std::size_t most) : most_(most) { }
    // The last use in a minute may go beyond the limit.
    [[nodiscard]] bool isUsedUp();
    void use(std::size_t bytes) { used_ += bytes; }

private:
    const std::size_t most_;
    std::size_t used_ = 0;
    double minuteBegan_ = 0; // by the system's uptime
};

// Gives one session after the other, each once.
using NextSession = std::function<std::shared_ptr<KestoReportingSession>()>;

// Only on the server queue.
class ListAllowance {
public:
    // The list that reaches a limit is written in full, of which a log line shows 24 KiB and one description.
    static constexpr std::size_t mostBytesAMinute = std::size_t{256} << 10;
    static constexpr std::size_t mostBytesAMinuteOfAllClients = std::size_t{1} << 20;

    // The sessions' descriptions, as many as one log line shows; or, without allowance, "12 sessions".
    [[nodiscard]] std::string describe(std::size_t count, const NextSession& next);
    // The same of reporter IDs, all of them.
    [[nodiscard]] std::string describe(std::span<const std::int64_t> reporterIDs);

private:
    template <typename Describe> std::string use(std::size_t sessions, Describe describe);

    BytesOfTheMinute ofThisClient_{mostBytesAMinute};
};

// The sessions' descriptions as one text for the log; further ones are left out when a log line is full.
[[nodiscard]] std::string descriptionOfSessions(std::size_t count, const NextSession& next);

} // namespace client
