// What is taken from a budget never exceeds its limit, nor that of the budget around it.
#include "session/StorageBudget.h"

namespace session {

const std::shared_ptr<StorageBudget>& StorageBudget::service()
{
    static const auto budget = std::make_shared<StorageBudget>(serviceLimit);
    return budget;
}

bool StorageBudget::take(std::size_t bytes)
{
    std::size_t before = taken_.load(std::memory_order_relaxed);
    do {
        if (bytes > limit_ - before)
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
}

} // namespace session
