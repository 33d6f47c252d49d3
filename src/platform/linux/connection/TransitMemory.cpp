// SPDX-License-Identifier: Apache-2.0
// Bytes are counted by atomic numbers, and what is below `free` only at its connection: a client that reads what it
// gets costs no more than that. Whether a holder is full decides the connection thread alone.
#include "platform/linux/connection/TransitMemory.h"

#include <algorithm>
#include <utility>

namespace platform {
namespace {

std::size_t counted(std::size_t bytes) noexcept
{
    return bytes - std::min(bytes, TransitMemory::free);
}

// Reading pauses beyond the first, and goes on at the second.
std::size_t highMark(std::size_t limit) noexcept
{
    return limit / TransitMemory::partForReading;
}
std::size_t lowMark(std::size_t limit) noexcept
{
    return highMark(limit) / 4 * 3;
}

// Whether the number fell to the mark.
bool fellTo(std::size_t mark, std::size_t before, std::size_t after) noexcept
{
    return before > mark && after <= mark;
}

void compare(TransitMemory::Holder& holder, std::size_t limit) noexcept
{
    holder.isFull = holder.bytes > (holder.isFull ? lowMark(limit) : highMark(limit));
}

} // namespace

std::shared_ptr<TransitMemory::Share> TransitMemory::makeShare(std::uint32_t user)
{
    auto share = std::make_shared<Share>();
    const foundation::Lock lock(lock_);
    std::weak_ptr<User>& known = users_[user];
    share->user = known.lock();
    if (share->user == nullptr) {
        known = share->user = std::make_shared<User>();
        std::erase_if(users_, [](const auto& each) { return each.second.expired(); });
    }
    return share;
}

bool TransitMemory::add(Share& share, std::size_t bytes) noexcept
{
    const std::size_t before = share.bytes.fetch_add(bytes);
    const std::size_t more = counted(before + bytes) - counted(before);
    if (more == 0)
        return false;
    share.user->bytes += more;
    all_.bytes += more;
    return true;
}

void TransitMemory::remove(Share& share, std::size_t bytes) noexcept
{
    const std::size_t before = share.bytes.fetch_sub(bytes);
    const std::size_t after = before - bytes;
    const std::size_t less = counted(before) - counted(after);
    if (less == 0)
        return;
    const std::size_t ofUser = share.user->bytes.fetch_sub(less);
    const std::size_t ofAll = all_.bytes.fetch_sub(less);
    if (!isRoomAwaited_)
        return;
    const MemoryLimits limits = limits_();
    if ((fellTo(free, before, after) || fellTo(lowMark(limits.ofAClient), before, after)
         || fellTo(lowMark(limits.ofAUser), ofUser, ofUser - less)
         || fellTo(lowMark(limits.ofTheService), ofAll, ofAll - less))
        && isRoomAwaited_.exchange(false))
        wake_();
}

// Nothing counts as long as all clients read what they get, and then there is nothing to compare.
bool TransitMemory::hasRoomForReading(Share& share)
{
    if (all_.bytes == 0)
        return true;
    const MemoryLimits limits = limits_();
    compare(all_, limits.ofTheService);
    compare(*share.user, limits.ofAUser);
    compare(share, limits.ofAClient);
    return !all_.isFull && !share.user->isFull && !share.isFull;
}

TransitMemory::Room TransitMemory::look(Share& share, std::size_t ofAPart)
{
    if (hasRoomForReading(share))
        return Room::Ample;
    const std::size_t bytes = share.bytes;
    if (bytes <= free)
        return Room::Little;
    const Share* const completing = share.user->completing;
    const bool mayComplete = completing == nullptr || completing == &share;
    return ofAPart != 0 && bytes - ofAPart <= free && mayComplete ? Room::ForTheFrame : Room::None;
}

TransitMemory::Room TransitMemory::find(Share& share, std::size_t ofAPart)
{
    if (const Room room = look(share, ofAPart); room != Room::None)
        return room;
    isRoomAwaited_ = true; // before the second look, so that what is removed meanwhile wakes this thread
    return look(share, ofAPart);
}

std::size_t TransitMemory::roomFor(Share& share, std::size_t ofAPart)
{
    switch (find(share, ofAPart)) {
    case Room::None: return 0;
    case Room::Little: return leastRead;
    case Room::ForTheFrame: share.user->completing = &share; break;
    case Room::Ample: break;
    }
    return std::numeric_limits<std::size_t>::max();
}

void TransitMemory::completed(const Share& share)
{
    if (share.user->completing != &share)
        return;
    share.user->completing = nullptr;
    if (isRoomAwaited_.exchange(false))
        wake_();
}

std::shared_ptr<const TransitMemory::User> TransitMemory::largestUser()
{
    std::shared_ptr<const User> largest;
    const foundation::Lock lock(lock_);
    for (const auto& [number, weak] : users_)
        if (auto user = weak.lock(); user && (!largest || user->bytes > largest->bytes))
            largest = std::move(user);
    return largest;
}

TransitMemory::Excess TransitMemory::excess(const Share& share) const
{
    const MemoryLimits limits = limits_();
    if (share.bytes > limits.ofAClient)
        return Excess::OfTheClient;
    if (share.user->bytes > limits.ofAUser)
        return Excess::OfTheUser;
    return all_.bytes > limits.ofTheService ? Excess::OfTheService : Excess::None;
}

} // namespace platform
