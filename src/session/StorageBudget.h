// SPDX-License-Identifier: Apache-2.0
// How much memory the service may use for what it keeps for clients. The service has one budget, within it each user
// has one, and within that each client, so that neither a client nor a user nor all together can fill the device's
// memory. The platform tells the limits, which its owner may change at any time.
//
// Code that keeps something for a client holds a share of the client's budget; the share grows and shrinks with it.
#pragma once

#include "platform/Memory.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <variant>

namespace session {

// Any thread.
class StorageBudget {
public:
    // Whose limit of the platform's memory counts.
    using PlatformLimit = std::size_t platform::MemoryLimits::*;

    // A budget of so many bytes, or of as many as the platform says. What is taken from it is also taken from
    // `enclosing`, unless that is null.
    explicit StorageBudget(std::size_t limit, std::shared_ptr<StorageBudget> enclosing = nullptr)
        : limit_(limit),
          enclosing_(std::move(enclosing))
    {
    }
    explicit StorageBudget(PlatformLimit limit, std::shared_ptr<StorageBudget> enclosing = nullptr)
        : limit_(limit),
          enclosing_(std::move(enclosing))
    {
    }

    // The budget of the whole service.
    static const std::shared_ptr<StorageBudget>& service();
    // A new one for a client, within that of all present clients of its user.
    static std::shared_ptr<StorageBudget> makeForClient(std::uint32_t user);

    // False, with nothing taken, if this or an enclosing budget has not so much left. That may also be because its
    // limit was lowered: what was taken before stays.
    [[nodiscard]] bool take(std::size_t bytes);
    void giveBack(std::size_t bytes);
    [[nodiscard]] std::size_t taken() const { return taken_.load(std::memory_order_relaxed); }

private:
    [[nodiscard]] std::size_t limit() const;

    const std::variant<std::size_t, PlatformLimit> limit_;
    const std::shared_ptr<StorageBudget> enclosing_;
    std::atomic<std::size_t> taken_{0};
};

// What was paid for one thing that is kept. Its destructor returns it to the budget. The platform's memory gets to know
// what is returned. One thread at a time.
class StorageShare {
public:
    explicit StorageShare(std::shared_ptr<StorageBudget> budget) : budget_(std::move(budget)) { }
    ~StorageShare() { shrink(bytes_); }
    StorageShare(const StorageShare&) = delete;
    StorageShare& operator=(const StorageShare&) = delete;

    [[nodiscard]] std::size_t bytes() const { return bytes_; }
    // Pays for so many further bytes, or for so many in all. False, with nothing changed, if the budget has no more.
    [[nodiscard]] bool grow(std::size_t bytes);
    [[nodiscard]] bool resize(std::size_t bytes);
    void shrink(std::size_t bytes);

private:
    const std::shared_ptr<StorageBudget> budget_;
    std::size_t bytes_ = 0;
};

} // namespace session
