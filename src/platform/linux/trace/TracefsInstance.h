// One ring buffer of the kernel's tracing, the service's own: made, set up, switched, and read through the files of
// tracefs. Nothing that others trace on the machine is touched by it or seen in it.
//
// A service that was killed leaves its instance behind, perhaps switched on and full of events; the next one takes it
// over, empty. Whoever uses an instance holds a lock on its directory, which goes with the process: so no two services
// read the same buffer. An instance is never removed, for clients hold its marker open.
#pragma once

#include "platform/linux/files/FileDescriptor.h"
#include "platform/linux/trace/TracePage.h"

#include <expected>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

namespace platform {

// Where tracefs is mounted, by a file of the form of /proc/self/mounts; /sys/kernel/tracing before other places.
[[nodiscard]] std::optional<std::filesystem::path> findTracefs(const std::filesystem::path& mounts);

// What cannot be done, for the log.
struct TracefsFailure {
    std::string what; // such as "/sys/kernel/tracing/instances/kesto cannot be made: Read-only file system"
    bool isInUse = false; // another process has the instance
};

// One thread at a time.
class TracefsInstance {
public:
    // What a processor's buffer holds while there is a trace, 150,000 events or so, and what it shrinks to afterwards.
    static constexpr std::size_t kilobytesWhileOn = 8192;
    static constexpr std::size_t fewestKilobytes = 256; // less is not worth a trace
    static constexpr std::size_t kilobytesWhileOff = 4;

    using PageHandler = std::function<void(std::uint32_t cpu, std::span<const std::byte> page)>;

    // Makes or takes over the instance, switched off. Takes some 30 ms.
    [[nodiscard]] static std::expected<TracefsInstance, TracefsFailure> open(const std::filesystem::path& tracefs,
                                                                             const std::string& name);

    // What events are written to: TraceMarkerRecord.
    [[nodiscard]] int marker() const noexcept { return marker_.get(); }
    [[nodiscard]] const TracePageFormat& pageFormat() const noexcept { return pageFormat_; }
    // The type of the records that the marker makes.
    [[nodiscard]] std::uint16_t markerType() const noexcept { return markerType_; }

    // Begins to keep what is written to the marker: some 20 ms. An instance that cannot stays off.
    [[nodiscard]] std::error_code switchOn();
    void switchOff();
    // Hands out all pages that are there, and of a processor no more than twice what its buffer holds: who writes
    // faster than this reads cannot keep it from ending.
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
    TracePageFormat pageFormat_;
    std::uint16_t markerType_ = 0;
};

} // namespace platform
