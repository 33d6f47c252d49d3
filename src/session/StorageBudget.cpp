// SPDX-License-Identifier: Apache-2.0
// What is taken from a budget never exceeds its limit at that time, nor that of the budgets around it.
#include "session/StorageBudget.h"

#include "foundation/Mutex.h"
#include "platform/Platform.h"

#include <map>

namespace session {
namespace {

struct Users {
    foundation::Mutex lock;
    std::map<std::uint32_t, std::weak_ptr<StorageBudget>> budgets KESTO_GUARDED_BY(lock); // of those with clients
};

} // namespace

const std::shared_ptr<StorageBudget>& StorageBudget::service()
{
    static const auto budget = std::make_shared<StorageBudget>(&platform::MemoryLimits::ofTheService);
    return budget;
}

std::shared_ptr<StorageBudget> StorageBudget::makeForClient(std::uint32_t user)
{
    static Users users;
    const foundation::Lock lock(users.lock);
    std::erase_if(users.budgets, [](const auto& entry) { return entry.second.expired(); });
    auto& known = users.budgets[user];
    auto ofUser = known.lock();
    if (!ofUser) {
        ofUser = std::make_shared<StorageBudget>(&platform::MemoryLimits::ofAUser, service());
        known = ofUser;
    }
    return std::make_shared<StorageBudget>(&platform::MemoryLimits::ofAClient, std::move(ofUser));
}

std::size_t StorageBudget::limit() const
{
    if (const std::size_t* fixed = std::get_if<std::size_t>(&limit_))
        return *fixed;
    return platform::current().memory.limits().*std::get<PlatformLimit>(limit_);
}

bool StorageBudget::take(std::size_t bytes)
{
    const std::size_t most = limit();
    std::size_t before = taken_.load(std::memory_order_relaxed);
    do {
        if (before > most || bytes > most - before)
            return false;
    } while (!taken_.compare_exchange_weak(before, before + bytes, std::memory_order_relaxed));
    if (!enclosing_ || enclosing_->take(bytes))
        return true;
    taken_.fetch_sub(bytes, std::memory_order_relaxed);
    return false;
}

void StorageBudget::giveBack(std::size_t bytes)
{
    taken_.fetch_sub(bytes, std::memory_order_relaxed);
    if (enclosing_)
        enclosing_->giveBack(bytes);
}

bool StorageShare::grow(std::size_t bytes)
{
    if (!budget_->take(bytes))
        return false;
    bytes_ += bytes;
    return true;
}

bool StorageShare::resize(std::size_t bytes)
{
    if (bytes > bytes_)
        return grow(bytes - bytes_);
    shrink(bytes_ - bytes);
    return true;
}

void StorageShare::shrink(std::size_t bytes)
{
    budget_->giveBack(bytes);
    bytes_ -= bytes;
    if (bytes != 0 && platform::isInstalled())
        platform::current().memory.letGo(bytes);
}

} // namespace session
