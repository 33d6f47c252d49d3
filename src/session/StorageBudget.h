// How much memory may be taken by what clients have the service keep: one budget for the service, and within it one a
// client, so that no client, and not all of them together, can fill the device's memory.
//
// Whoever keeps something for a client holds a share of its budget that grows and shrinks with it.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>

namespace session {

// Any thread.
class StorageBudget {
public:
    static constexpr std::size_t serviceLimit = std::size_t{2} << 30;
    static constexpr std::size_t clientLimit = std::size_t{1} << 30;

    // A budget of so many bytes; what is taken from it is taken from `enclosing` too, when there is one.
    explicit StorageBudget(std::size_t limit, std::shared_ptr<StorageBudget> enclosing = nullptr)
        : limit_(limit),
          enclosing_(std::move(enclosing))
    {
    }

    // The budget of the whole service.
    static const std::shared_ptr<StorageBudget>& service();

    // False, and nothing taken, when there is not so much left here or in an enclosing budget.
    [[nodiscard]] bool take(std::size_t bytes);
    void giveBack(std::size_t bytes);
    [[nodiscard]] std::size_t taken() const { return taken_.load(std::memory_order_relaxed); }

private:
    const std::size_t limit_;
    const std::shared_ptr<StorageBudget> enclosing_;
    std::atomic<std::size_t> taken_{0};
};

// What is paid for one thing that is kept; it goes back to the budget when the share goes. One thread at a time.
class StorageShare {
public:
    explicit StorageShare(std::shared_ptr<StorageBudget> budget) : budget_(std::move(budget)) { }
    ~StorageShare() { budget_->giveBack(bytes_); }
    StorageShare(const StorageShare&) = delete;
    StorageShare& operator=(const StorageShare&) = delete;

    [[nodiscard]] std::size_t bytes() const { return bytes_; }
    // Pays for so many bytes more, or for so many in all; false, and nothing changed, when the budget has no more.
    [[nodiscard]] bool grow(std::size_t bytes);
    [[nodiscard]] bool resize(std::size_t bytes);
    void shrink(std::size_t bytes);

private:
    const std::shared_ptr<StorageBudget> budget_;
    std::size_t bytes_ = 0;
};

} // namespace session
