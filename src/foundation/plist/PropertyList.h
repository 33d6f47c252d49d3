// SPDX-License-Identifier: Apache-2.0
// The room of property lists: their text and binary forms as values. It reads from memory, and opens no file.
//
// Property lists: the files in which people and programs describe things as dictionaries of dictionaries, written as
// XML, in UTF-8 or UTF-16, or in a binary form.
//
// Any program may write such a file. So everything that a file can make grow has a limit. The readers fetch nothing
// that a file names. They refuse a file that is not exactly a property list, and report the place of the error.
//
// The values: integers are signed of 64 bits, or unsigned where only that holds them; reals are floats of 64 bits, in
// the binary form also of 32; a UID, which only the binary form has, is the dictionary that the XML form writes for it,
// with the one key "CF$UID". A repeated key takes the last of its values.
#pragma once

#include "foundation/values/Value.h"

#include <cstddef>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>

namespace foundation {

enum class PropertyListError : std::uint8_t {
    TooLarge, // the file, or the text and data that it yields
    TooDeep, // more nested containers than allowed
    TooManyObjects, // the values that it yields and the keys of its dictionaries
    Malformed, // of neither form, or broken
    InvalidText, // not UTF-8 or UTF-16, or with a reference that is not to a character
    InvalidValue, // a malformed number, date or data, or one that no `Value` can hold
    Unsupported, // well-formed, but not part of property lists, such as a set
    Cycle // a container that contains itself
};

struct PropertyListFailure {
    PropertyListError error;
    // The error and its place, such as "line 7: not an integer of 64 bits".
    std::string text;
};

// Objects of the binary form may share others; a shared object counts once for each reference.
struct PropertyListLimits {
    std::size_t bytes = std::size_t{1} << 20; // of the file
    unsigned depth = 32; // of the containers; a UID is one
    std::size_t objects = std::size_t{1} << 16;
    std::size_t content = std::size_t{1} << 22; // bytes of text and data
};

// The value of the file. Its first bytes give the form. Any thread.
[[nodiscard]] std::expected<Value, PropertyListFailure> readPropertyList(std::string_view bytes,
                                                                         const PropertyListLimits& limits = {});

} // namespace foundation
