// SPDX-License-Identifier: Apache-2.0
// Entries never move, so a record may hold the address of its stream.
#include "calls/Streams.h"

#include <algorithm>
#include <cstring>
#include <new>

namespace libkesto {

Stream& Streams::create(Direction direction, std::string_view application, kesto_service_type type)
{
    const foundation::Lock lock(mutex_);
    if (entries_.size() == most)
        throw std::bad_alloc();
    return entries_.emplace_back(direction, application, type).stream;
}

void Streams::free(const Stream& stream, std::uint64_t position, Moment when) noexcept
{
    const foundation::Lock lock(mutex_);
    const auto entry =
        std::ranges::find_if(entries_, [&stream](const Entry& candidate) { return &candidate.stream == &stream; });
    if (isClosed_)
        entries_.erase(entry);
    else
        entry->freed = {position, when};
}

void Streams::follow(std::string_view record, CallTaker* service)
{
    StreamRecord head;
    std::memcpy(&head, record.data(), sizeof head);
    record.remove_prefix(sizeof head);
    if (head.stream != nullptr)
        return head.stream->follow(head, record, service);
    const foundation::Lock lock(mutex_);
    for (Entry& entry : entries_)
        entry.stream.follow(head, record, service);
}

void Streams::letGo(std::uint64_t position, CallTaker* service)
{
    const foundation::Lock lock(mutex_);
    entries_.remove_if([&](Entry& entry) {
        if (!entry.freed || entry.freed->position > position)
            return false;
        entry.stream.stop(entry.freed->when, service);
        return true;
    });
}

void Streams::renewSessions(CallTaker& service)
{
    const foundation::Lock lock(mutex_);
    for (const Entry& entry : entries_)
        if (entry.stream.isStarted())
            entry.stream.renewSession(service);
}

bool Streams::isAnyStarted() const noexcept
{
    const foundation::Lock lock(mutex_);
    return std::ranges::any_of(entries_, [](const Entry& entry) { return entry.stream.isStarted(); });
}

void Streams::close() noexcept
{
    const foundation::Lock lock(mutex_);
    isClosed_ = true;
    entries_.remove_if([](const Entry& entry) { return entry.freed.has_value(); });
}

} // namespace libkesto
