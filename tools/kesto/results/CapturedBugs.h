// SPDX-License-Identifier: Apache-2.0
// Reads the bugs that the service captured from its folder.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

struct CapturedBug {
    std::uint64_t number = 0;
    double time = 0; // seconds since 1970
    std::filesystem::path directory;
    foundation::Dictionary signature; // which bug was seen, and where
    foundation::Dictionary response; // the response to the request
    std::optional<std::uint64_t> bytes; // of the device's state; nothing if it was removed to make room
};

// All captures, the oldest first. Throws std::runtime_error with a line for a person.
[[nodiscard]] std::vector<CapturedBug> capturedBugsIn(const std::filesystem::path& directory);

// The state of the device: the content of each file by its name without extension, sorted by name. A log is the list of
// its lines; a file that cannot be read is null.
[[nodiscard]] foundation::Dictionary stateOf(const CapturedBug& capture);
