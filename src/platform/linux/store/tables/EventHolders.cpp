// SPDX-License-Identifier: Apache-2.0
// All holders are in memory; their rows are written with the transactions that change them. A holder without events
// goes with the next.
#include "platform/linux/store/tables/EventHolders.h"

#include <algorithm>
#include <initializer_list>
#include <string_view>
#include <utility>

namespace platform {

StoreExpected<EventHolders> EventHolders::open(SqliteConnection& connection)
{
    EventHolders holders;
    const std::initializer_list<std::pair<SqliteStatement*, std::string_view>> wanted = {
        {&holders.select_, "SELECT id, user, process, application, bytes, oldest FROM holders"},
        {&holders.insert_,
         "INSERT INTO holders(user, process, application, bytes, oldest) VALUES (?, ?, ?, 0, ?) RETURNING id"},
        {&holders.update_, "UPDATE holders SET bytes = ?2, oldest = ?3 WHERE id = ?1"},
        {&holders.delete_, "DELETE FROM holders WHERE id = ?"}};
    for (const auto& [statement, sql] : wanted) {
        auto prepared = connection.prepare(sql);
        if (!prepared)
            return std::unexpected(prepared.error());
        *statement = std::move(*prepared);
    }
    if (const auto done = holders.load(); !done)
        return std::unexpected(done.error());
    return holders;
}

StoreExpected<> EventHolders::load()
{
    ids_.clear();
    shares_.clear();
    changed_.clear();
    while (true) {
        const auto row = select_.step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row)
            return {};
        const std::int64_t id = select_.integer(0);
        EventHolder holder{
            .user = {}, .process = std::string(select_.text(2)), .application = std::string(select_.text(3))};
        if (!select_.isNull(1))
            holder.user = static_cast<std::uint32_t>(select_.integer(1));
        ids_.emplace(std::move(holder), id);
        shares_.emplace(id, Share{.bytes = select_.integer(4), .oldest = select_.integer(5)});
    }
}

EventHolder EventHolders::holderOf(std::int64_t id) const
{
    const auto found = std::ranges::find(ids_, id, [](const auto& known) { return known.second; });
    return found == ids_.end() ? EventHolder() : found->first;
}

StoreExpected<std::int64_t> EventHolders::idOf(EventHolder holder, std::int64_t nextEvent)
{
    if (const auto known = ids_.find(holder); known != ids_.end())
        return known->second;
    limit(holder);
    if (const auto known = ids_.find(holder); known != ids_.end())
        return known->second;
    insert_.bind(1, holder.user ? std::optional<std::int64_t>(*holder.user) : std::nullopt);
    insert_.bind(2, std::string_view(holder.process));
    insert_.bind(3, std::string_view(holder.application));
    insert_.bind(4, nextEvent);
    const auto row = insert_.step();
    if (!row)
        return std::unexpected(row.error());
    const std::int64_t id = insert_.integer(0);
    insert_.reset();
    ids_.emplace(std::move(holder), id);
    shares_.emplace(id, Share{.bytes = 0, .oldest = nextEvent});
    return id;
}

void EventHolders::limit(EventHolder& holder) const
{
    std::set<std::string_view> processes;
    std::size_t applications = 0;
    for (const auto& [other, id] : ids_) {
        if (other.user != holder.user)
            continue;
        processes.insert(other.process);
        applications += other.process == holder.process ? 1 : 0;
    }
    if (!processes.contains(holder.process) && processes.size() >= mostProcesses)
        holder.process.clear();
    if (holder.process.empty() || applications >= mostApplications)
        holder.application.clear();
}

void EventHolders::add(std::int64_t id, std::size_t payloadBytes)
{
    shares_[id].bytes += static_cast<std::int64_t>(payloadBytes) + bytesBesidesPayload;
    changed_.insert(id);
}

void EventHolders::add(std::int64_t id, std::size_t payloadBytes, std::int64_t event)
{
    add(id, payloadBytes);
    shares_[id].oldest = std::min(shares_[id].oldest, event);
}

void EventHolders::remove(std::int64_t id, std::int64_t payloadBytes)
{
    const auto share = shares_.find(id);
    if (share == shares_.end())
        return;
    share->second.bytes = std::max<std::int64_t>(share->second.bytes - payloadBytes - bytesBesidesPayload, 0);
    changed_.insert(id);
}

void EventHolders::setOldest(std::int64_t id, std::int64_t event)
{
    shares_[id].oldest = event;
    changed_.insert(id);
}

void EventHolders::setEmpty(std::int64_t id)
{
    shares_[id].bytes = 0;
    changed_.insert(id);
}

std::optional<EventHolders::Largest> EventHolders::largest() const
{
    std::map<std::optional<std::uint32_t>, std::int64_t> users;
    std::map<std::string_view, std::int64_t> processes;
    const auto largestOf = [](const auto& sums) {
        return std::ranges::max_element(sums, {}, [](const auto& sum) { return sum.second; })->first;
    };
    std::size_t holders = 0;
    for (const auto& [holder, id] : ids_)
        if (const std::int64_t bytes = shares_.at(id).bytes; bytes > 0) {
            users[holder.user] += bytes;
            ++holders;
        }
    if (holders == 0)
        return std::nullopt;
    const auto user = largestOf(users);
    for (const auto& [holder, id] : ids_)
        if (holder.user == user)
            processes[holder.process] += shares_.at(id).bytes;
    const auto process = largestOf(processes);
    Largest largest;
    std::int64_t most = 0;
    for (const auto& [holder, id] : ids_)
        if (holder.user == user && holder.process == process)
            if (const Share& share = shares_.at(id); share.bytes > most) {
                most = share.bytes;
                largest = {.id = id, .holder = holder, .isOnlyOne = holders == 1, .oldest = share.oldest};
            }
    return largest;
}

StoreExpected<> EventHolders::writeChanges()
{
    for (const std::int64_t id : changed_) {
        const Share& share = shares_[id];
        const SqliteStatement& statement = share.bytes == 0 ? delete_ : update_;
        statement.bind(1, id);
        if (share.bytes != 0) {
            statement.bind(2, share.bytes);
            statement.bind(3, share.oldest);
        }
        if (const auto done = statement.run(); !done)
            return done;
        if (share.bytes == 0) {
            shares_.erase(id);
            std::erase_if(ids_, [id](const auto& holder) { return holder.second == id; });
        }
    }
    return {};
}

} // namespace platform
