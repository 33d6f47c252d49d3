// SPDX-License-Identifier: Apache-2.0
// The common part of the readers of both forms, only for them: the first failure ends the reading, the objects are
// counted, and characters become UTF-8.
#pragma once

#include "foundation/plist/PropertyList.h"

#include <bit>
#include <limits>
#include <optional>
#include <utility>

namespace foundation {

// After a failure every step does nothing and returns null, so that only loops check for a failure.
class PropertyListReader {
protected:
    explicit PropertyListReader(const PropertyListLimits& limits) : limits_(limits), objectsLeft_(limits.objects) { }

    // Returns null, so that a function can return it as its value. Of several failures the first counts.
    Value failWith(PropertyListError error, std::string text)
    {
        if (!failure_)
            failure_ = {error, std::move(text)};
        return {};
    }
    [[nodiscard]] bool failed() const noexcept { return failure_.has_value(); }

    std::expected<Value, PropertyListFailure> outcome(Value value)
    {
        if (failure_)
            return std::unexpected(*std::move(failure_));
        return value;
    }

    // Subtracts so many objects from the rest of the limit; false when these are too many.
    [[nodiscard]] bool spendObjects(std::uint64_t count) noexcept
    {
        if (count > objectsLeft_)
            return false;
        objectsLeft_ -= count;
        return true;
    }

    const PropertyListLimits limits_;

private:
    std::size_t objectsLeft_;
    std::optional<PropertyListFailure> failure_;
};

// Signed if that kind can hold it, so that one integer has one kind in all forms.
inline Number propertyListInteger(std::uint64_t value) noexcept
{
    return std::in_range<std::int64_t>(value) ? Number(static_cast<std::int64_t>(value)) : Number(value);
}

// For a number that is not a Unicode character it returns false and appends nothing.
[[nodiscard]] bool appendUtf8(std::uint32_t character, std::string& out);
// Nothing if the bytes are not well-formed. A byte order mark is a character like any other.
[[nodiscard]] std::optional<std::string> utf8FromUtf16(std::string_view bytes, std::endian order);

[[nodiscard]] std::expected<Value, PropertyListFailure> readXmlPropertyList(std::string_view bytes,
                                                                            const PropertyListLimits& limits);
[[nodiscard]] std::expected<Value, PropertyListFailure> readBinaryPropertyList(std::string_view bytes,
                                                                               const PropertyListLimits& limits);

} // namespace foundation
