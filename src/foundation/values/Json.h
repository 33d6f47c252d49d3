// SPDX-License-Identifier: Apache-2.0
// Values as JSON text (RFC 8259), for the store, the tools, and the text of arrays and dictionaries.
//
// Numbers are written by `Number::text`, so that a float of 32 bits stays short (0.6, not
// 0.6000000238418579); booleans are true and false. Data becomes base64, a date ISO 8601 in UTC.
#pragma once

#include "foundation/values/Value.h"

#include <string>

namespace foundation {

// Appends the compact JSON of the value. If the value holds NaN or infinity, which JSON cannot express, returns false
// and leaves `out` as it was. Any thread.
[[nodiscard]] bool appendJson(const Value& value, std::string& out);

// The same for people: NaN and infinity are written as the bare words nan, inf and -inf.
void appendJsonText(const Value& value, std::string& out);

} // namespace foundation
