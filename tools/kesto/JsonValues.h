// SPDX-License-Identifier: Apache-2.0
// What is not known is null in the JSON of each command.
#pragma once

#include "foundation/values/Value.h"

#include <optional>
#include <string_view>

template <typename Number> [[nodiscard]] foundation::Value valueOf(const std::optional<Number>& number)
{
    return number ? foundation::Value(*number) : foundation::Value();
}

// Null for an empty text.
[[nodiscard]] inline foundation::Value known(std::string_view text)
{
    return text.empty() ? foundation::Value() : foundation::Value(text);
}
