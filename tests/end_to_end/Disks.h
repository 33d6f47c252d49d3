// SPDX-License-Identifier: Apache-2.0
// Disks that are small or read-only, in place of the service's state directory or over its database. They need the
// right to mount, which root has.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <cerrno>
#include <fcntl.h>
#include <filesystem>
#include <string>
#include <sys/mount.h>
#include <system_error>
#include <unistd.h>

namespace end_to_end {

// Mounts at a directory, and takes the mount away at the end; files that are open then stay usable.
class Mount {
public:
    Mount(const Mount&) = delete;
    Mount& operator=(const Mount&) = delete;

    // Whether the system allowed it.
    [[nodiscard]] explicit operator bool() const noexcept { return isMounted_; }

protected:
    explicit Mount(std::filesystem::path place) : place_(std::move(place)) { }
    ~Mount()
    {
        if (isMounted_)
            ::umount2(place_.c_str(), MNT_DETACH);
    }

    const std::filesystem::path place_;
    bool isMounted_ = false;
};

// An empty disk of that size.
class SmallDisk : public Mount {
public:
    SmallDisk(std::filesystem::path place, const std::string& size) : Mount(std::move(place))
    {
        isMounted_ = ::mount("none", place_.c_str(), "tmpfs", 0, ("size=" + size).c_str()) == 0;
        if (isMounted_)
            ballast_ = platform::FileDescriptor(::open(place_.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, 0600));
    }

    // Leaves no room at all.
    void fill() const
    {
        off_t size = 0;
        for (off_t step = 1 << 20; step >= 4096; step /= 2)
            while (::posix_fallocate(ballast_.get(), size, step) == 0)
                size += step;
    }
    // Works without rights, too: the file is open already, also in a forked process.
    void free() const
    {
        if (::ftruncate(ballast_.get(), 0) != 0)
            throw std::system_error(errno, std::generic_category(), "making room");
    }

private:
    platform::FileDescriptor ballast_;
};

// The same file or directory, without the right to write to it. Programs that have it open are not hindered.
class ReadOnlyView : public Mount {
public:
    explicit ReadOnlyView(std::filesystem::path place) : Mount(std::move(place))
    {
        isMounted_ = ::mount(place_.c_str(), place_.c_str(), nullptr, MS_BIND, nullptr) == 0;
        if (isMounted_ && ::mount(nullptr, place_.c_str(), nullptr, MS_REMOUNT | MS_BIND | MS_RDONLY, nullptr) != 0)
            throw std::system_error(errno, std::generic_category(), "mounting read-only");
    }
};

} // namespace end_to_end
