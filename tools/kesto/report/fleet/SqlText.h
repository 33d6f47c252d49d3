// SPDX-License-Identifier: Apache-2.0
// What a person wrote, as a part of a query: it must not end the literal in which it stands, and its pattern must match
// what it matches on a device.
#pragma once

#include <string>
#include <string_view>

// A text as a literal of SQL.
[[nodiscard]] std::string sqlText(std::string_view text);
// A GLOB of SQLite as a regular expression of the database.
[[nodiscard]] std::string regularExpression(std::string_view glob);
