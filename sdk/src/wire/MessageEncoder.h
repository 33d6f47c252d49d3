// Builds the entries of a message as CBOR while they are added, so that sending is a copy and nothing else.
//
// The head of a container says how much it holds, which is known only at its end: one byte stands in for it until
// then, and is nearly always enough. What was added can therefore be handed on at any time without a second pass.
#pragma once

#include "foundation/values/Value.h"
#include "kesto/kesto.h"

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

    // Makes the encoder fail from outside, for what it cannot see: a null pointer in place of text.
    kesto_status fail(kesto_status status) noexcept;

    // The first failure, or KESTO_MISNESTED while something has begun and not ended.
    [[nodiscard]] kesto_status status() const noexcept;
    // The entries, without the head of the map that they make up, and their number.
    [[nodiscard]] std::string_view entries() const noexcept { return bytes_; }
    [[nodiscard]] std::uint32_t entryCount() const noexcept { return containers_.front().count; }

private:
    struct Container {
        bool isDictionary = true;
        std::uint32_t count = 0;
        std::size_t head = 0; // where its stand-in is
    };

    kesto_status begin(bool isDictionary) noexcept;
    bool takePlace() noexcept;
    template <typename Write> kesto_status add(std::size_t size, Write write) noexcept;

    std::string bytes_;
    std::array<Container, KESTO_DEEPEST_NESTING + 1> containers_; // the message itself first
    std::size_t depth_ = 0; // of the innermost container that has not ended
    bool hasKey_ = false; // and waits for its value
    kesto_status failure_ = KESTO_OK;
};

} // namespace libkesto

struct kesto_message {
    libkesto::MessageEncoder encoder;
};
