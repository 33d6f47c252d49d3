// SPDX-License-Identifier: Apache-2.0
// A head is written before its number is known, and widened in the rare case that one byte is too small.
#include "wire/MessageEncoder.h"

#include "foundation/cbor/Cbor.h"

#include <new>
#include <stdexcept>

namespace libkesto {
namespace {

constexpr std::size_t longestHead = 9;

// Runs the function; KESTO_OUT_OF_MEMORY if memory is exhausted.
template <typename Function> kesto_status withMemory(Function function) noexcept
{
    try {
        function();
        return KESTO_OK;
    } catch (const std::bad_alloc&) {
        return KESTO_OUT_OF_MEMORY;
    } catch (const std::length_error&) {
        return KESTO_OUT_OF_MEMORY;
    }
}

} // namespace

kesto_status MessageEncoder::reserve(std::size_t bytes) noexcept
{
    return bytes > KESTO_LARGEST_MESSAGE ? KESTO_TOO_LARGE : withMemory([&] { bytes_.reserve(bytes); });
}

void MessageEncoder::clear() noexcept
{
    bytes_.clear();
    containers_.front() = {};
    depth_ = 0;
    hasKey_ = false;
    hasTimestamp_ = false;
    hasUptime_ = false;
    failure_ = KESTO_OK;
}

kesto_status MessageEncoder::fail(kesto_status status) noexcept
{
    if (failure_ == KESTO_OK)
        failure_ = status;
    return failure_;
}

kesto_status MessageEncoder::status() const noexcept
{
    if (failure_ != KESTO_OK)
        return failure_;
    return depth_ > 0 || hasKey_ ? KESTO_MISNESTED : KESTO_OK;
}

// Calls `write` for `size` bytes and a head, if there is room for them and no earlier failure.
template <typename Write> kesto_status MessageEncoder::add(std::size_t size, Write write) noexcept
{
    if (failure_ != KESTO_OK)
        return failure_;
    if (size > KESTO_LARGEST_MESSAGE || bytes_.size() + longestHead + size > KESTO_LARGEST_MESSAGE)
        return fail(KESTO_TOO_LARGE);
    if (const kesto_status status = withMemory(write); status != KESTO_OK)
        return fail(status);
    return KESTO_OK;
}

kesto_status MessageEncoder::addKey(std::string_view key) noexcept
{
    if (hasKey_ || !containers_[depth_].isDictionary)
        return fail(KESTO_MISNESTED);
    if (!foundation::isValidUtf8(key))
        return fail(KESTO_INVALID_UTF8);
    hasKey_ = true;
    hasTimestamp_ |= depth_ == 0 && key == timestampKey;
    hasUptime_ |= depth_ == 0 && key == uptimeKey;
    return add(key.size(), [&] { foundation::appendCborText(key, bytes_); });
}

// Makes the next value that of the key, or an element of the array.
bool MessageEncoder::takePlace() noexcept
{
    Container& container = containers_[depth_];
    if (hasKey_ != container.isDictionary) {
        fail(KESTO_MISNESTED);
        return false;
    }
    hasKey_ = false;
    ++container.count;
    return true;
}

kesto_status MessageEncoder::addValue(const foundation::Value& value) noexcept
{
    if (!takePlace())
        return failure_;
    return add(0, [&] { foundation::appendCbor(value, bytes_); });
}

kesto_status MessageEncoder::addText(std::string_view text) noexcept
{
    if (!takePlace())
        return failure_;
    if (!foundation::isValidUtf8(text))
        return fail(KESTO_INVALID_UTF8);
    return add(text.size(), [&] { foundation::appendCborText(text, bytes_); });
}

kesto_status MessageEncoder::begin(bool isDictionary) noexcept
{
    if (!takePlace())
        return failure_;
    if (depth_ == KESTO_DEEPEST_NESTING)
        return fail(KESTO_TOO_DEEP);
    containers_[++depth_] = {isDictionary, 0, bytes_.size()};
    return add(1, [&] { bytes_.push_back('\0'); });
}

kesto_status MessageEncoder::end() noexcept
{
    if (depth_ == 0 || hasKey_)
        return fail(KESTO_MISNESTED);
    const Container ended = containers_[depth_--];
    return add(0, [&] {
        std::string head; // short enough to need no allocation
        if (ended.isDictionary)
            foundation::appendCborMapHead(ended.count, head);
        else
            foundation::appendCborArrayHead(ended.count, head);
        bytes_.replace(ended.head, 1, head);
    });
}

} // namespace libkesto
