// SPDX-License-Identifier: Apache-2.0
// A name costs memory only while its client is connected, or while it is one of the largest of those that went.
#include "ledger/Workload.h"

#include <algorithm>

namespace ledger {

Work& Work::operator+=(const Work& other) noexcept
{
    calls += other.calls;
    time += other.time;
    bytes += other.bytes;
    return *this;
}

Work Workload::work() const noexcept
{
    return {.calls = calls_.load(std::memory_order_relaxed),
            .time = std::chrono::nanoseconds(nanoseconds_.load(std::memory_order_relaxed)),
            .bytes = bytes_.load(std::memory_order_relaxed)};
}

std::shared_ptr<Workload> Workloads::open(std::uint32_t user)
{
    auto workload = std::make_unique<Workload>();
    {
        const foundation::Lock lock(state_->lock);
        state_->present.emplace(workload.get(), Name(user, std::string()));
    }
    return {workload.release(), [state = state_](const Workload* gone) {
                state->close(*gone);
                delete gone;
            }};
}

void Workloads::setProcess(const Workload& workload, std::string process)
{
    const foundation::Lock lock(state_->lock);
    state_->present.at(&workload).second = std::move(process);
}

void Workloads::State::close(const Workload& workload)
{
    const foundation::Lock guard(lock);
    auto name = present.extract(&workload);
    gone[std::move(name.mapped())] += workload.work();
    if (gone.size() <= mostGone)
        return;
    const auto least =
        std::ranges::min_element(gone, {}, [](const Works::value_type& each) { return each.second.time; });
    others += least->second;
    gone.erase(least);
}

WorkByWhom Workloads::byWhom() const
{
    WorkByWhom result;
    Works works;
    {
        const foundation::Lock lock(state_->lock);
        works = state_->gone;
        result.others = state_->others;
        for (const auto& [workload, name] : state_->present)
            works[name] += workload->work();
    }
    for (const auto& [name, work] : works)
        result.largest.push_back({.user = name.first, .process = name.second, .work = work});
    std::ranges::stable_sort(result.largest, std::ranges::greater(),
                             [](const WorkByWhom::Entry& entry) { return entry.work.time; });
    while (result.largest.size() > mostNamed) {
        result.others += result.largest.back().work;
        result.largest.pop_back();
    }
    return result;
}

} // namespace ledger
