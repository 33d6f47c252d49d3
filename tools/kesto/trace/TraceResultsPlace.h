// Where the service writes the results of traces, and what has come there since somebody last looked.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <filesystem>
#include <string>

class TraceResultsPlace {
public:
    // What is there now is not new. Throws std::runtime_error, which gives the reason, when that cannot be found out.
    explicit TraceResultsPlace(std::filesystem::path path);

    [[nodiscard]] const std::filesystem::path& path() const { return path_; }
    // The text of the results that came since the last call. Throws std::runtime_error, which gives the reason, when
    // none came or they cannot be read.
    [[nodiscard]] std::string takeNew();

private:
    [[nodiscard]] platform::FileDescriptor look() const;

    const std::filesystem::path path_;
    platform::FileDescriptor last_; // kept open, so that no file that comes later can be taken for it; may be none
};
