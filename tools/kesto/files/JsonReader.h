// SPDX-License-Identifier: Apache-2.0
// Reads JSON as values one after the other, so that only one element of a long list is in memory.
#pragma once

#include "foundation/values/Value.h"

#include <cstdio>
#include <expected>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

// The value of a JSON text; nothing if the text is not valid JSON, has more behind it, or is nested deeper than the
// service accepts.
[[nodiscard]] std::optional<foundation::Value> parseJson(std::string_view text);

// Calls `visit` with each element of the file's list; `visit` returns false to stop. The error gives the reason if the
// file could not be read to its end: not JSON, not a list, or nested too deep.
[[nodiscard]] std::expected<void, std::string>
forEachJsonElement(std::FILE* file, const std::function<bool(foundation::Value element)>& visit);
