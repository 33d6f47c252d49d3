// SPDX-License-Identifier: Apache-2.0
// Immutable shared text; and data, which need not be text.
//
// A string has an identity besides its characters: a copy is the same object, but a new string of equal characters is
// not. By this identity the service recognises one constant that only code of this process can pass.
#pragma once

#include "foundation/values/Reference.h"

#include <compare>
#include <cstddef>
#include <new>
#include <string_view>
#include <utility>

namespace foundation {

// The characters behind a `String`: length and bytes in one allocation, from `malloc`, so that a `StringBuilder` can
// let it grow in place.
class StringObject : public ReferenceCounted {
public:
    static const StringObject* create(std::string_view text);
    // Makes an object in this memory; the bytes are already in it, behind the room for the object.
    static const StringObject* createIn(void* memory, std::size_t size) noexcept
    {
        return new (memory) StringObject(size);
    }
    static void destroy(const StringObject* object) noexcept;

    [[nodiscard]] std::string_view view() const noexcept
    {
        return {reinterpret_cast<const char*>(this + 1), size_}; // the bytes stand right behind the object
    }

private:
    explicit StringObject(std::size_t size) noexcept : size_(size) { }
    ~StringObject() = default;

    std::size_t size_;
};

// UTF-8 text. Code that makes a string from foreign bytes validates them first (`isValidUtf8`). Any thread.
class String {
public:
    String() noexcept = default; // the empty string
    String(std::string_view text);
    String(const char* text) : String(std::string_view(text)) { }

    [[nodiscard]] std::string_view view() const noexcept { return object_ ? object_->view() : std::string_view(); }
    operator std::string_view() const noexcept { return view(); }
    [[nodiscard]] bool empty() const noexcept { return view().empty(); }

    // Whether both are one object; all empty strings are.
    [[nodiscard]] bool isSameObject(const String& other) const noexcept { return object_.get() == other.object_.get(); }

    friend bool operator==(const String& left, const String& right) noexcept
    {
        return left.isSameObject(right) || left.view() == right.view();
    }
    friend bool operator==(const String& left, std::string_view right) noexcept { return left.view() == right; }

private:
    friend class StringBuilder;
    friend class Value;
    explicit String(Reference<StringObject> object) noexcept : object_(std::move(object)) { }

    Reference<StringObject> object_;
};

// The beginning of the text, up to so many bytes, that does not end inside a character.
[[nodiscard]] std::string_view cutBetweenCharacters(std::string_view text, std::size_t longest) noexcept;

// Whether the bytes are well-formed UTF-8 (RFC 3629: no overlong forms, no surrogates, nothing above
// U+10FFFF).
[[nodiscard]] bool isValidUtf8(std::string_view bytes) noexcept;

// Writes a "?" in the place of each byte that is not part of a UTF-8 character. Any thread.
void replaceWhatIsNotUtf8(std::string& text) noexcept;

} // namespace foundation
