// SPDX-License-Identifier: Apache-2.0
// The place of the service's results, which reports new results since the last check.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <filesystem>
#include <string>

class TraceResultsPlace {
public:
    // A file that exists already does not count as new. Throws std::runtime_error, which gives the reason, if this
    // cannot be checked.
    explicit TraceResultsPlace(std::filesystem::path path);

    [[nodiscard]] const std::filesystem::path& path() const { return path_; }
    // The text of the results that came since the last call. Throws std::runtime_error, which gives the reason, when
    // none came or they cannot be read.
    [[nodiscard]] std::string takeNew();

private:
    [[nodiscard]] platform::FileDescriptor look() const;

    const std::filesystem::path path_;
    platform::FileDescriptor last_; // kept open, so that a later file cannot have the same identity; may be empty
};
