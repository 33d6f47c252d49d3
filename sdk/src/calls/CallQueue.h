// The road from any number of calling threads to the one thread of a client: a bounded ring of bytes.
//
// Made for callers that must not wait. Pushing is one compare-and-swap that claims room, a copy, and one store that
// hands the record over: no lock, no allocation, no system call. A caller that loses the race for the room tries
// again at once, and it can only lose to one that got through. A record that does not fit is refused.
//
// A caller that is suspended between claiming and handing over holds back what was pushed after it, but no other
// caller. Room that was read is zeroed before it is given back: a record's head that is not zero is there to be read.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string_view>

namespace libkesto {

class CallQueue {
public:
    // `capacity` is a power of two. The memory is touched here, so that no caller meets a page fault.
    explicit CallQueue(std::size_t capacity);

    // Copies the parts, one behind the other, as one record, unless that left less than `keepFree` bytes free. Any
    // thread.
    [[nodiscard]] bool push(std::initializer_list<std::string_view> parts, std::size_t keepFree = 0) noexcept;

    // The oldest record, aligned to 8 bytes, until `popFront`; nothing while there is none to be read yet. The
    // reading thread.
    [[nodiscard]] std::optional<std::string_view> front() noexcept;
    void popFront() noexcept;

    // Positions only grow: a record has been popped when `readPosition` has reached the `writePosition` that was seen
    // after it was pushed. Sequentially consistent with what callers do next to pushing. Any thread.
    [[nodiscard]] std::uint64_t writePosition() const noexcept { return write_.load(); }
    [[nodiscard]] std::uint64_t readPosition() const noexcept { return read_.load(); }
    // Whether nobody has claimed room that was not read yet.
    [[nodiscard]] bool isEmpty() const noexcept { return writePosition() == readPosition(); }

private:
    // A record's head: the size of its content, and whether it is there, or only fills the ring up to its end.
    enum Mark : std::uint64_t { None = 0, Record = 1, Filling = 2, Mask = 3 };
    static constexpr unsigned sizeShift = 2;
    static constexpr std::size_t wordSize = sizeof(std::uint64_t);
    static constexpr std::size_t cacheLine = 64;

    [[nodiscard]] std::size_t offset(std::uint64_t position) const noexcept { return position & (capacity_ - 1); }
    [[nodiscard]] char* bytesAt(std::uint64_t position) noexcept;
    [[nodiscard]] std::atomic_ref<std::uint64_t> headAt(std::uint64_t position) noexcept;
    void release(std::size_t size) noexcept;

    const std::size_t capacity_;
    const std::unique_ptr<std::uint64_t[]> words_;
    alignas(cacheLine) std::atomic<std::uint64_t> write_ = 0; // everything before it is claimed
    alignas(cacheLine) std::atomic<std::uint64_t> read_ = 0; // everything before it is free again
};

} // namespace libkesto
