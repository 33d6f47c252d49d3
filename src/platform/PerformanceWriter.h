// SPDX-License-Identifier: Apache-2.0
// The performance-data writer: one file of named measurements.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string_view>

namespace platform {

enum class PerformanceUnit : std::uint8_t { Nanoseconds };

// An open file; its destructor flushes and closes it. Until then the older file of its name stays in place. If writing
// fails, it stays for good: the failure is logged when the file is closed. One thread at a time.
class PerformanceFile {
public:
    virtual ~PerformanceFile() = default;
    virtual void write(std::string_view name, double value, PerformanceUnit unit) = 0;
    // Adds a remark about all measurements together, such as the number of missing ones; once for each key. A value
    // that holds a number which is not finite is kept as null.
    virtual void remark(std::string_view key, const foundation::Value& value) = 0;
};

// Any thread.
class PerformanceWriter {
public:
    virtual ~PerformanceWriter() = default;
    // Null if the file cannot be opened: its folder is missing or not below the diagnostic-log root, or a folder has
    // its name.
    [[nodiscard]] virtual std::unique_ptr<PerformanceFile> open(const std::filesystem::path& path,
                                                                std::string_view project, std::uint32_t version) = 0;
};

} // namespace platform
