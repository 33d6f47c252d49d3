// The folder of captured bugs on the disk: a folder a capture, numbered from 1 and never again.
//
//     bug-captures/
//         00000007-20260131T180000Z/
//             signature.json      what was seen, and where
//             response.json       what whoever asked was told
//             state/              how the device was: the bulk
//     bug-captures.last           the last number that was used, whatever has been removed since
//
// A capture appears as a whole, by one rename of a hidden folder, and so does its bulk go when room is needed, the
// oldest first. What stays is its tombstone: that this was seen, when, and how often. What hidden folders are left by a
// service that was killed are removed at the next start.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cstdint>
#include <expected>
#include <filesystem>
#include <optional>
#include <string>
#include <system_error>
#include <vector>

namespace platform {

// One thread at a time.
class BugCaptureFolder {
public:
    struct Limits {
        std::size_t mostCaptures = 1000; // tombstones too; beyond it the oldest go altogether
        std::size_t mostWithBulk = 50;
        std::uint64_t mostBytes = std::uint64_t{32} * 1024 * 1024; // of all bulk
        std::uint64_t bytesLeftFree = std::uint64_t{64} * 1024 * 1024; // on the file system, for everybody else
    };

    // One file of a capture.
    struct File {
        std::string name;
        std::string text;
    };

    // Removes what a killed service left. The folder is `bug-captures` in the state directory; it is made with the
    // first capture.
    BugCaptureFolder(std::filesystem::path stateDirectory, Limits limits);
    explicit BugCaptureFolder(std::filesystem::path stateDirectory)
        : BugCaptureFolder(std::move(stateDirectory), Limits())
    {
    }

    [[nodiscard]] const std::filesystem::path& path() const noexcept { return path_; }

    // Whether the file system has so much room that a capture may be taken; `errc::no_space_on_device` if not.
    [[nodiscard]] std::error_code checkFreeSpace() const;

    // The name that the next capture is going to have, at that moment: seconds since 1970.
    [[nodiscard]] std::expected<std::string, std::error_code> nextName(double time) const;

    // Adds a capture of that name, having made room for it. When `state` alone is more than may be kept, it is left
    // out.
    [[nodiscard]] std::error_code add(const std::string& name, const std::vector<File>& files,
                                      const std::vector<File>& state);

private:
    struct Capture;
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> openStateDirectory() const;
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> open() const;
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> openOrMake() const;
    static void removeLeftovers(int folder);
    [[nodiscard]] static std::vector<Capture> capturesIn(int folder);
    [[nodiscard]] std::uint64_t lastNumber() const;
    [[nodiscard]] std::error_code keepLastNumber(std::uint64_t number) const;
    void makeRoom(int folder, std::uint64_t bytes) const;
    [[nodiscard]] std::error_code write(int folder, const std::string& hidden, const std::vector<File>& files,
                                        const std::vector<File>& state) const;

    const std::filesystem::path stateDirectory_;
    const std::filesystem::path path_;
    const Limits limits_;
};

} // namespace platform
