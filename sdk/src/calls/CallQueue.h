// SPDX-License-Identifier: Apache-2.0
// The queue from any number of calling threads to the one thread of a client: a bounded ring of bytes.
//
// It is made for callers that must not wait. Pushing is one compare-and-swap that claims room, a copy, and one store
// that hands the record over: no lock, no allocation, no system call. A caller that loses the race for the room tries
// again immediately; it loses only to a caller that succeeds. A record that does not fit is refused.
//
// If a caller is suspended between claiming and handing over, the reader cannot pass its record, but other callers go
// on. The reader zeroes the room before it frees it; so a record with a head other than zero is complete.
//
// This holds on processors that reorder memory, too. A caller copies before it releases the head, and the reader
// acquires the head before it reads the copy. The reader zeroes before it releases `read_`, and a caller acquires
// `read_` before it claims that room; so the zeros come before the next head. An old `read_` only makes the room look
// smaller. Claims have one order, that of the exchanges of `write_`.
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

    // Copies the parts, one behind the other, as one record, unless less than `keepFree` bytes would then be free. Any
    // thread.
    [[nodiscard]] bool push(std::initializer_list<std::string_view> parts, std::size_t keepFree = 0) noexcept;

    // The oldest record, aligned to 8 bytes and valid until `popFront`; nothing if none is complete. The reading
    // thread.
    [[nodiscard]] std::optional<std::string_view> front() noexcept;
    void popFront() noexcept;

    // Positions only grow. A record has been popped when `readPosition` has reached the `writePosition` read after its
    // push. Both are sequentially consistent with what callers do after a push. Any thread.
    [[nodiscard]] std::uint64_t writePosition() const noexcept { return write_.load(); }
    [[nodiscard]] std::uint64_t readPosition() const noexcept { return read_.load(); }
    // Whether the reader has read all the room that callers claimed.
    [[nodiscard]] bool isEmpty() const noexcept { return writePosition() == readPosition(); }

private:
    // A record's head holds the size of its content and a mark: a record, or a filler up to the end of the ring.
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
