// The bugs that the service captured, as its folder shows them.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

struct BugCapture {
    std::uint64_t number = 0;
    double time = 0; // seconds since 1970
    std::filesystem::path directory;
    foundation::Dictionary signature; // what was seen, and where
    foundation::Dictionary response; // what whoever asked was told
    std::optional<std::uint64_t> bytes; // of the device's state; nothing once that made room for newer ones
};

// All of them, the oldest first; none where the service captured none. Throws std::runtime_error with a line for a
// person.
[[nodiscard]] std::vector<BugCapture> bugCapturesIn(const std::filesystem::path& directory);

// How the device was: what each file says, by its name without extension, in the order of the names. A log is the list
// of its lines; what cannot be read is null.
[[nodiscard]] foundation::Dictionary stateOf(const BugCapture& capture);
