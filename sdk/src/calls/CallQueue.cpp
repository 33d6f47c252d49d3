// SPDX-License-Identifier: Apache-2.0
// Callers claim room at one end, and the reader frees it at the other; both positions are numbers that only grow. Where
// a record would cross the end of the ring, a filler takes its place.
#include "calls/CallQueue.h"

#include <bit>
#include <cassert>
#include <cstring>

namespace libkesto {
namespace {

constexpr std::size_t roundedUp(std::size_t size, std::size_t unit) noexcept
{
    return (size + unit - 1) / unit * unit;
}

} // namespace

CallQueue::CallQueue(std::size_t capacity) : capacity_(capacity), words_(new std::uint64_t[capacity / wordSize]())
{
    assert(std::has_single_bit(capacity) && capacity >= cacheLine);
}

char* CallQueue::bytesAt(std::uint64_t position) noexcept
{
    return reinterpret_cast<char*>(words_.get()) + offset(position);
}

std::atomic_ref<std::uint64_t> CallQueue::headAt(std::uint64_t position) noexcept
{
    return std::atomic_ref(words_[offset(position) / wordSize]);
}

bool CallQueue::push(std::initializer_list<std::string_view> parts, std::size_t keepFree) noexcept
{
    std::size_t size = 0;
    for (const std::string_view part : parts)
        size += part.size();
    const std::size_t needed = wordSize + roundedUp(size, wordSize);

    std::uint64_t position = write_.load();
    std::size_t filling = 0;
    do {
        const std::uint64_t read = read_.load(std::memory_order_acquire);
        const std::size_t toTheEnd = capacity_ - offset(position);
        filling = needed > toTheEnd ? toTheEnd : 0; // a record lies in one piece
        // Meanwhile other callers may have advanced `write_`, and the reader may even have passed `position`: the
        // exchange then fails and returns the new position.
        if (read <= position && position - read + filling + needed + keepFree > capacity_)
            return false;
    } while (!write_.compare_exchange_weak(position, position + filling + needed));

    if (filling > 0) {
        headAt(position).store((filling - wordSize) << sizeShift | Filling, std::memory_order_release);
        position += filling;
    }
    char* to = bytesAt(position) + wordSize;
    for (const std::string_view part : parts)
        if (!part.empty())
            to = static_cast<char*>(std::memcpy(to, part.data(), part.size())) + part.size();
    headAt(position).store(size << sizeShift | Record, std::memory_order_release);
    return true;
}

std::optional<std::string_view> CallQueue::front() noexcept
{
    for (;;) {
        const std::uint64_t position = read_.load(std::memory_order_relaxed);
        const std::uint64_t head = headAt(position).load(std::memory_order_acquire);
        const std::size_t size = head >> sizeShift;
        switch (head & Mask) {
        case Record: return std::string_view(bytesAt(position) + wordSize, size);
        case Filling: release(wordSize + size); break;
        default: return std::nullopt;
        }
    }
}

void CallQueue::popFront() noexcept
{
    release(wordSize + roundedUp(front()->size(), wordSize));
}

void CallQueue::release(std::size_t size) noexcept
{
    const std::uint64_t position = read_.load(std::memory_order_relaxed);
    std::memset(bytesAt(position), 0, size);
    read_.store(position + size); // hands the zeros to the caller that claims the room next
}

} // namespace libkesto
