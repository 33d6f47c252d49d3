// SPDX-License-Identifier: Apache-2.0
// One ring buffer of the kernel's tracing, which belongs to the service: made, set up, switched and read through the
// files of tracefs. It does not touch other traces on the machine.
//
// A killed service leaves its instance behind, perhaps switched on and full of events; the next service empties it and
// takes it over. A service that uses an instance holds a lock on its directory, which ends with the process: so two
// services never read the same buffer. An instance is never removed, because clients hold its marker open.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/trace/RingBufferPage.h"

#include <expected>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

namespace platform {

// The mount point of tracefs, from a file of the form of /proc/self/mounts; /sys/kernel/tracing is preferred.
[[nodiscard]] std::optional<std::filesystem::path> findTracefs(const std::filesystem::path& mounts);

// A failure, for the log.
struct TracefsFailure {
    std::string what; // such as "/sys/kernel/tracing/instances/kesto cannot be made: Read-only file system"
    bool isInUse = false; // another process uses the instance
};

// One thread at a time.
class TracefsInstance {
public:
    // The size of a processor's buffer while a trace runs, about 150,000 events, and afterwards.
    static constexpr std::size_t kilobytesWhileOn = 8192;
    static constexpr std::size_t fewestKilobytes = 256; // less is not worth a trace
    static constexpr std::size_t kilobytesWhileOff = 4;

    using PageHandler = std::function<void(std::uint32_t cpu, std::span<const std::byte> page)>;

    // Makes or takes over the instance, switched off. Takes some 30 ms.
    [[nodiscard]] static std::expected<TracefsInstance, TracefsFailure> open(const std::filesystem::path& tracefs,
                                                                             const std::string& name);

    // The descriptor to which events are written as EmittedEvent.
    [[nodiscard]] int marker() const noexcept { return marker_.get(); }
    [[nodiscard]] const RingBufferPageFormat& pageFormat() const noexcept { return pageFormat_; }
    // The type of the records that the marker makes.
    [[nodiscard]] std::uint16_t markerType() const noexcept { return markerType_; }

    // Starts recording the marker's events, which takes some 20 ms. On failure the instance stays off.
    [[nodiscard]] std::error_code switchOn();
    void switchOff();
    // Calls the handler with all present pages, for each processor at most twice the size of its buffer: so it ends
    // even if a client writes faster than it reads.
    void readPages(const PageHandler& handle);

private:
    struct Pages {
        std::uint32_t cpu;
        FileDescriptor file;
    };

    TracefsInstance() = default;
    [[nodiscard]] std::expected<void, TracefsFailure> setUp(const std::filesystem::path& path);
    [[nodiscard]] std::expected<void, TracefsFailure> readFormats(const std::filesystem::path& path);
    [[nodiscard]] std::expected<void, TracefsFailure> openPages(const std::filesystem::path& path);

    FileDescriptor directory_; // locked
    FileDescriptor marker_;
    std::vector<Pages> pages_;
    std::vector<std::byte> page_; // room for one
    RingBufferPageFormat pageFormat_;
    std::uint16_t markerType_ = 0;
};

} // namespace platform
