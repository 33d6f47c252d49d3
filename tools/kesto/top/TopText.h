// SPDX-License-Identifier: Apache-2.0
// A look for a person at a terminal.
#pragma once

#include "kesto/top/TopLook.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

struct TopStyle {
    std::size_t width = std::string::npos; // in columns; npos: as wide as need be
    std::size_t height = std::string::npos; // in lines
    bool hasColor = false;
    bool isUTF8 = true; // else ASCII
};

// The lines of the look, without their ends; the first has the time and the note, if there is one. Where not all fit,
// the last one says how many are left out.
[[nodiscard]] std::vector<std::string> topLines(const TopLook& look, std::string_view note, const TopStyle& style);
// The keys that the screen knows.
[[nodiscard]] std::vector<std::string> topHelpLines(const TopStyle& style);
