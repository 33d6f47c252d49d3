// SPDX-License-Identifier: Apache-2.0
// One allocation for each string, and none for the empty one; UTF-8 is checked eight characters at a time.
#include "foundation/values/String.h"

#include <algorithm>
#include <cstdint>
#include <cstdlib>
#include <cstring>

namespace foundation {

const StringObject* StringObject::create(std::string_view text)
{
    void* memory = std::malloc(sizeof(StringObject) + text.size());
    if (memory == nullptr)
        throw std::bad_alloc();
    std::memcpy(static_cast<char*>(memory) + sizeof(StringObject), text.data(), text.size());
    return createIn(memory, text.size());
}

void StringObject::destroy(const StringObject* object) noexcept
{
    object->~StringObject();
    std::free(const_cast<StringObject*>(object));
}

String::String(std::string_view text)
    : object_(Reference<StringObject>::adopt(text.empty() ? nullptr : StringObject::create(text)))
{
}

std::string_view cutBetweenCharacters(std::string_view text, std::size_t longest) noexcept
{
    if (text.size() <= longest)
        return text;
    while (longest > 0 && (static_cast<std::uint8_t>(text[longest]) & 0xC0) == 0x80)
        --longest;
    return text.substr(0, longest);
}

namespace {

// The length in bytes of the sequence at the start of `bytes`, or 0 if it is not well-formed (table 3-7 of the Unicode
// Standard: the first byte limits the second).
std::size_t sequenceLength(std::string_view bytes) noexcept
{
    const auto at = [bytes](std::size_t index) { return static_cast<std::uint8_t>(bytes[index]); };
    const std::uint8_t first = at(0);
    if (first < 0x80)
        return 1;
    const std::size_t length = first < 0xC2 ? 0 : first < 0xE0 ? 2 : first < 0xF0 ? 3 : first < 0xF5 ? 4 : 0;
    if (length == 0 || bytes.size() < length)
        return 0;
    const std::uint8_t least = first == 0xE0 ? 0xA0 : first == 0xF0 ? 0x90 : 0x80;
    const std::uint8_t most = first == 0xED ? 0x9F : first == 0xF4 ? 0x8F : 0xBF;
    if (at(1) < least || at(1) > most)
        return 0;
    for (std::size_t index = 2; index < length; ++index)
        if ((at(index) & 0xC0) != 0x80)
            return 0;
    return length;
}

} // namespace

bool isValidUtf8(std::string_view bytes) noexcept
{
    constexpr std::uint64_t highBits = 0x8080808080808080;
    while (!bytes.empty()) {
        if (std::uint64_t word = 0; bytes.size() >= sizeof word) {
            std::memcpy(&word, bytes.data(), sizeof word);
            if ((word & highBits) == 0) { // eight ASCII characters together: nearly all text is ASCII
                bytes.remove_prefix(sizeof word);
                continue;
            }
        }
        const std::size_t length = sequenceLength(bytes);
        if (length == 0)
            return false;
        bytes.remove_prefix(length);
    }
    return true;
}

void replaceWhatIsNotUtf8(std::string& text) noexcept
{
    for (std::size_t at = 0; at < text.size();) {
        const std::size_t length = sequenceLength(std::string_view(text).substr(at));
        if (length == 0)
            text[at] = '?';
        at += std::max<std::size_t>(1, length);
    }
}

} // namespace foundation
