// SPDX-License-Identifier: Apache-2.0
// The folder of captured bugs on the disk: a folder for each capture, numbered from 1; no number is used again.
//
//     bug-captures/
//         00000007-20260131T180000Z/
//             signature.json      which bug was seen, and where
//             response.json       the response to the request
//             state/              the state of the device: nearly all bytes ("bulk")
//     bug-captures.last           the last used number, even if its capture was removed
//
// A capture appears completely, by one rename of a hidden folder. When room is needed, the bulk of the oldest captures
// is removed in the same way, and the rest stays as a tombstone: the bug and its time. At its start the service removes
// hidden folders that a killed service left.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cstdint>
#include <expected>
#include <filesystem>
#include <optional>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

namespace platform {

// One thread at a time.
class BugCaptureFolder {
public:
    struct Limits {
        std::size_t mostCaptures = 1000; // tombstones too; beyond it the oldest are removed completely
        std::size_t mostWithBulk = 50;
        std::uint64_t mostBytes = std::uint64_t{32} * 1024 * 1024; // of all bulk
        std::uint64_t bytesLeftFree = std::uint64_t{64} * 1024 * 1024; // on the file system, for other programs
    };

    // One file of a capture.
    struct File {
        std::string name;
        std::string text;
    };

    // Removes the hidden folders of a killed service. The folder is `bug-captures` in the state directory; it is made
    // with the first capture.
    BugCaptureFolder(std::filesystem::path stateDirectory, Limits limits);
    explicit BugCaptureFolder(std::filesystem::path stateDirectory)
        : BugCaptureFolder(std::move(stateDirectory), Limits())
    {
    }

    [[nodiscard]] const std::filesystem::path& path() const noexcept { return path_; }

    // Checks that the file system has enough room for a capture; `errc::no_space_on_device` if not.
    [[nodiscard]] std::error_code checkFreeSpace() const;

    // The name of the next capture at that time, in seconds since 1970.
    [[nodiscard]] std::expected<std::string, std::error_code> nextName(double time) const;

    // Makes room and adds a capture of that name. If `state` alone exceeds the limit, it is left out.
    [[nodiscard]] std::error_code add(const std::string& name, const std::vector<File>& files,
                                      const std::vector<File>& state);

    // How many captures were removed, wholly or but for a tombstone, since the last call.
    [[nodiscard]] std::size_t takeRemoved() noexcept { return std::exchange(removed_, 0); }

private:
    struct Capture;
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> openStateDirectory() const;
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> open() const;
    [[nodiscard]] std::expected<FileDescriptor, std::error_code> openOrMake() const;
    static void removeLeftovers(int folder);
    [[nodiscard]] static std::vector<Capture> capturesIn(int folder);
    [[nodiscard]] std::uint64_t lastNumber() const;
    [[nodiscard]] std::error_code keepLastNumber(std::uint64_t number) const;
    void makeRoom(int folder, std::uint64_t bytes);
    [[nodiscard]] std::error_code write(int folder, const std::string& hidden, const std::vector<File>& files,
                                        const std::vector<File>& state) const;

    const std::filesystem::path stateDirectory_;
    const std::filesystem::path path_;
    const Limits limits_;
    std::size_t removed_ = 0;
};

} // namespace platform
