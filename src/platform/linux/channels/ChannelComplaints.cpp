// SPDX-License-Identifier: Apache-2.0
// A reading has its problems in order, so that a look-up is cheap among many.
#include "platform/linux/channels/ChannelComplaints.h"

#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <array>

namespace platform {

namespace {
constexpr std::array leftOutBounds{&LeftOutChannels::beyondDrivers, &LeftOutChannels::beyondFolders,
                                   &LeftOutChannels::beyondNames,   &LeftOutChannels::beyondChannels,
                                   &LeftOutChannels::beyondBytes,   &LeftOutChannels::beyondTime};
} // namespace

void ChannelComplaints::report(const ChannelReading& reading)
{
    const foundation::Lock lock(lock_);
    logProblems(reading.problems);
    logLeftOut(reading.leftOut);
    problems_ = reading.problems;
    leftOut_ = reading.leftOut;
    error_.clear();
}

void ChannelComplaints::reportUnreadable(std::error_code error)
{
    const foundation::Lock lock(lock_);
    if (error != error_)
        log_.error("only sound cards have channels: {} cannot be read: {}", root_.native(),
                   systemErrorText(error.value()));
    error_ = error;
}

void ChannelComplaints::logProblems(const std::vector<ChannelProblem>& problems) const
{
    std::size_t count = 0;
    for (const ChannelProblem& problem : problems) {
        if (std::ranges::binary_search(problems_, problem))
            continue;
        if (++count <= mostNamed)
            log_.error("channel {} is left out: {}", problem.path, problem.reason);
    }
    ledger_.count(ledger::Counter::ChannelsLeftOut, count);
    if (count > mostNamed)
        log_.error("{} more channels are left out", count - mostNamed);
}

void ChannelComplaints::logLeftOut(LeftOutChannels leftOut) const
{
    for (std::size_t LeftOutChannels::* bound : leftOutBounds)
        if (leftOut_.*bound > 0)
            leftOut.*bound = 0;
        else
            ledger_.count(ledger::Counter::ChannelsLeftOut, leftOut.*bound);
    for (const std::string& line : leftOut.inWords(limits_))
        log_.error("{}", line);
}

} // namespace platform
