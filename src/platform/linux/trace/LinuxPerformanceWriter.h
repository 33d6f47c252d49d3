// Performance data as a JSON document, for people, for `grep` and for programs alike:
//
//     {"project":"KestoReporting","version":4,"records":[
//     {"name":"mix","value":187250,"unit":"ns"},
//     {"name":"mix","value":190125,"unit":"ns"}
//     ],"lostEvents":0,"lostValues":0}
//
// A record stands in a line of its own and says all that there is to know about it. Remarks stand behind them, where
// all is known: the last one is how many records there was no room for. The file takes its place when it is
// complete: whoever reads it sees the last one or this one, and never half of it.
#pragma once

#include "platform/FileSystem.h"
#include "platform/PerformanceWriter.h"
#include "platform/linux/log/ProviderLog.h"

namespace platform {

// Any thread; a file, one at a time.
class LinuxPerformanceWriter final : public PerformanceWriter {
public:
    // In bytes. Clients choose the names, and may choose long ones.
    static constexpr std::size_t largestFile = std::size_t{256} << 20;

    // Paths are those of the file system, which outlives the writer and its files.
    LinuxPerformanceWriter(FileSystem& files, ProviderLog log, std::size_t largest = largestFile)
        : files_(files),
          log_(log),
          largest_(largest)
    {
    }

    // Says in the log why a file cannot be opened, and when it is closed, what was lost: records that would have made
    // it too large, or all of it on a full disk.
    [[nodiscard]] std::unique_ptr<PerformanceFile> open(const std::filesystem::path& path, std::string_view project,
                                                        std::uint32_t version) override;

private:
    FileSystem& files_;
    const ProviderLog log_;
    const std::size_t largest_;
};

} // namespace platform
