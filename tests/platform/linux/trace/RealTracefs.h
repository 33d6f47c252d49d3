// SPDX-License-Identifier: Apache-2.0
// The kernel's own tracefs for a test, if this machine allows it: mounted in a namespace of the process, and gone with
// the process.
#pragma once

#include "support/TemporaryDirectory.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <optional>
#include <sched.h>
#include <string>
#include <sys/mount.h>
#include <unistd.h>

namespace support {

class RealTracefs {
public:
    RealTracefs()
    {
        if (::unshare(CLONE_NEWNS) != 0 || ::mount("none", "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0
            || ::mount("none", directory_.path().c_str(), "tracefs", 0, nullptr) != 0)
            problem_ = std::string("tracefs cannot be mounted: ") + std::strerror(errno);
        else
            writeFile(mounts_.path() / "mounts", "none " + directory_.path().native() + " tracefs rw 0 0\n");
    }
    // Removes instances that no process holds open; the kernel keeps the others.
    ~RealTracefs()
    {
        if (problem_)
            return;
        for (const auto& suffix : {"", "-2"})
            ::rmdir((path() / "instances" / (instanceName + suffix)).c_str());
        ::umount2(directory_.path().c_str(), MNT_DETACH);
    }
    RealTracefs(const RealTracefs&) = delete;
    RealTracefs& operator=(const RealTracefs&) = delete;

    // The reason if it is not available.
    [[nodiscard]] const std::optional<std::string>& problem() const { return problem_; }
    [[nodiscard]] const std::filesystem::path& path() const { return directory_.path(); }
    [[nodiscard]] std::filesystem::path mounts() const { return mounts_.path() / "mounts"; }

    const std::string instanceName = "kesto-test-" + std::to_string(::getpid());

private:
    const TemporaryDirectory directory_;
    const TemporaryDirectory mounts_;
    std::optional<std::string> problem_;
};

} // namespace support
