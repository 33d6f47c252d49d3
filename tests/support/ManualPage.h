// SPDX-License-Identifier: Apache-2.0
// What a manual page of a configuration file describes, and what a program knows, to be compared.
#pragma once

#include "support/TemporaryDirectory.h"

#include <filesystem>
#include <regex>
#include <string>
#include <vector>

namespace support {

// What the expression finds in its first parentheses.
inline std::vector<std::string> findAll(const std::string& text, const std::string& expression)
{
    const std::regex wanted(expression);
    return {std::sregex_token_iterator(text.begin(), text.end(), wanted, 1), {}};
}

// The keys that a page describes.
inline std::vector<std::string> keysOnPage(const std::filesystem::path& page)
{
    return findAll(readFile(page), "\n\\.It Ic ([A-Za-z_-]+) No = ");
}

// The keys that a program knows, as it names them at the end of what it says of another one.
inline std::vector<std::string> keysIn(const std::string& problem)
{
    const std::string list = std::regex_replace(problem, std::regex(".*; the keys (are|here are) "), "");
    const std::regex separator(", ");
    return {std::sregex_token_iterator(list.begin(), list.end(), separator, -1), {}};
}

} // namespace support
