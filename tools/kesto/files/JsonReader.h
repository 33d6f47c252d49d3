// JSON read as values, one after the other, so that of a long list only one element is in memory.
#pragma once

#include "foundation/values/Value.h"

#include <cstdio>
#include <expected>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

// The value of a JSON text, or nothing when it is none, not all of it, or nested deeper than the service takes.
[[nodiscard]] std::optional<foundation::Value> parseJson(std::string_view text);

// Calls `visit` with each element of the list that the file holds; it returns false to go no further. The error says
// why the file could not be read to its end: no JSON, no list, or nested too deep.
[[nodiscard]] std::expected<void, std::string>
forEachJsonElement(std::FILE* file, const std::function<bool(foundation::Value element)>& visit);
