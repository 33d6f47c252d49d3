// Problems are sorted, so that a look-up is cheap among many.
#include "platform/linux/channels/ChannelComplaints.h"

#include "platform/linux/files/SystemError.h"

#include <algorithm>
#include <utility>

namespace platform {

ChannelComplaints::Memory ChannelComplaints::addQuery()
{
    const foundation::Lock lock(lock_);
    return memories_.emplace_back(std::make_shared<Findings>());
}

void ChannelComplaints::forgetDroppedQueries()
{
    const foundation::Lock lock(lock_);
    std::erase_if(memories_, [](const Memory& memory) { return memory.use_count() == 1; });
}

void ChannelComplaints::report(Findings found, const Memory& memory)
{
    std::ranges::sort(found.problems);
    const foundation::Lock lock(lock_);
    logProblems(found.problems);
    logLeftOut(found.leftOut);
    *memory = std::move(found);
}

void ChannelComplaints::reportUnreadable(std::error_code error, const Memory& memory)
{
    const foundation::Lock lock(lock_);
    if (!anyRemembers([error](const Findings& each) { return each.error == error; }))
        log_.error("only sound cards have channels: {} cannot be read: {}", root_.native(),
                   systemErrorText(error.value()));
    memory->error = error;
}

template <typename Condition> bool ChannelComplaints::anyRemembers(Condition condition) const
{
    return std::ranges::any_of(memories_, [&](const Memory& memory) { return condition(*memory); });
}

void ChannelComplaints::logProblems(const std::vector<ChannelProblem>& problems) const
{
    std::size_t count = 0;
    for (const ChannelProblem& problem : problems) {
        if (anyRemembers([&](const Findings& each) { return std::ranges::binary_search(each.problems, problem); }))
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
    for (std::size_t LeftOutChannels::* bound :
         {&LeftOutChannels::beyondChannels, &LeftOutChannels::beyondBytes, &LeftOutChannels::beyondNames})
        if (anyRemembers([&](const Findings& each) { return each.leftOut.*bound > 0; }))
            leftOut.*bound = 0;
        else
            ledger_.count(ledger::Counter::ChannelsLeftOut, leftOut.*bound);
    for (const std::string& line : leftOut.inWords(limits_))
        log_.error("{}", line);
}

} // namespace platform
