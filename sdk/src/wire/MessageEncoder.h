// SPDX-License-Identifier: Apache-2.0
// Encodes the entries of a message as CBOR while they are added, so that sending them is only a copy.
//
// The head of a container holds the number of its entries, which is known only at its end. One byte stands in for it
// until then, and is nearly always large enough. So the entries can be sent at any time without a second pass.
#pragma once

#include "foundation/values/Value.h"
#include "kesto/kesto.h"
#include "wire/Stamps.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace libkesto {

// One thread at a time. The first failure stays and makes every later addition return it, until `clear`.
class MessageEncoder {
public:
    kesto_status reserve(std::size_t bytes) noexcept;
    void clear() noexcept;

    // The key of the value that is added next.
    kesto_status addKey(std::string_view key) noexcept;
    // Null or a number.
    kesto_status addValue(const foundation::Value& value) noexcept;
    kesto_status addText(std::string_view text) noexcept;
    kesto_status beginArray() noexcept { return begin(false); }
    kesto_status beginDictionary() noexcept { return begin(true); }
    kesto_status end() noexcept;

    // Sets a failure that the encoder cannot see itself, such as a null pointer in place of text.
    kesto_status fail(kesto_status status) noexcept;

    // The first failure, or KESTO_MISNESTED while a container has begun and not ended.
    [[nodiscard]] kesto_status status() const noexcept;
    // The entries, without the head of their map, and their number.
    [[nodiscard]] std::string_view entries() const noexcept { return bytes_; }
    [[nodiscard]] std::uint32_t entryCount() const noexcept { return containers_.front().count; }
    // The stamps of that moment that the message does not have itself.
    [[nodiscard]] Stamps missingStamps(Moment moment) const noexcept { return {moment, !hasTimestamp_, !hasUptime_}; }

private:
    struct Container {
        bool isDictionary = true;
        std::uint32_t count = 0;
        std::size_t head = 0; // the place of its stand-in
    };

    kesto_status begin(bool isDictionary) noexcept;
    bool takePlace() noexcept;
    template <typename Write> kesto_status add(std::size_t size, Write write) noexcept;

    std::string bytes_;
    std::array<Container, KESTO_DEEPEST_NESTING + 1> containers_; // the first is the message itself
    std::size_t depth_ = 0; // of the innermost container that has not ended
    bool hasKey_ = false; // a key waits for its value
    bool hasTimestamp_ = false; // the message itself has it, not a container in it
    bool hasUptime_ = false;
    kesto_status failure_ = KESTO_OK;
};

} // namespace libkesto

struct kesto_message {
    libkesto::MessageEncoder encoder;
};
