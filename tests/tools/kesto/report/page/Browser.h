// SPDX-License-Identifier: Apache-2.0
// A browser without a window, a network or a past, that opens a page from a file.
#pragma once

#include "support/TemporaryDirectory.h"

#include <filesystem>
#include <string>
#include <vector>

namespace kesto_tool {

class Browser {
public:
    // What is missing for it on this machine, and what to do; empty: nothing.
    [[nodiscard]] static const std::string& missing();

    struct Opened {
        std::string document; // as the browser has it, as HTML
        std::vector<std::string> messages; // of the console: also what the page's policy forbade
    };
    [[nodiscard]] Opened open(const std::filesystem::path& page) const;

    enum class Screen { Light, Dark };
    // A PNG of the page's upper part, so many pixels high.
    void photograph(const std::filesystem::path& page, const std::filesystem::path& image, Screen screen,
                    int height) const;

private:
    [[nodiscard]] std::vector<std::string> command(const std::vector<std::string>& further) const;

    support::TemporaryDirectory home_;
};

} // namespace kesto_tool
