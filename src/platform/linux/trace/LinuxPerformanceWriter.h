// SPDX-License-Identifier: Apache-2.0
// Performance data as a JSON document, for people, for `grep` and for programs alike:
//
//     {"project":"KestoReporting","version":4,"records":[
//     {"name":"mix","value":187250,"unit":"ns"},
//     {"name":"mix","value":190125,"unit":"ns"}
//     ],"lostEvents":0,"lostValues":0}
//
// Each record has a line of its own with all its data. Remarks follow the records, when their values are known: the
// last is the number of records for which there was no room. The file gets its name when it is complete: a reader sees
// the earlier or the new file, and never an unfinished one.
#pragma once

#include "platform/FileSystem.h"
#include "platform/PerformanceWriter.h"
#include "platform/linux/log/ProviderLog.h"

namespace platform {

// Any thread; one thread at a time for each file.
class LinuxPerformanceWriter final : public PerformanceWriter {
public:
    // In bytes. Clients choose the names, and may choose long ones.
    static constexpr std::size_t largestFile = std::size_t{256} << 20;

    // Paths are those of `files`, which must outlive the writer and its files.
    LinuxPerformanceWriter(FileSystem& files, ProviderLog log, std::size_t largest = largestFile)
        : files_(files),
          log_(log),
          largest_(largest)
    {
    }

    // Logs the reason if a file cannot be opened, and logs losses when it is closed: records that would have made it
    // too large, or the whole file on a full disk.
    [[nodiscard]] std::unique_ptr<PerformanceFile> open(const std::filesystem::path& path, std::string_view project,
                                                        std::uint32_t version) override;

private:
    FileSystem& files_;
    const ProviderLog log_;
    const std::size_t largest_;
};

} // namespace platform
