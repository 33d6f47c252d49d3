// A disk with little room, for tests that may mount one.
#pragma once

#include <filesystem>
#include <fstream>
#include <string>
#include <sys/mount.h>

namespace end_to_end {

// 2 MB in that directory, as long as the object exists. A service that uses it should end first.
class SmallDisk {
public:
    explicit SmallDisk(std::filesystem::path place)
        : place_(std::move(place)),
          isMounted_(::mount("none", place_.c_str(), "tmpfs", 0, "size=2m") == 0)
    {
    }
    ~SmallDisk()
    {
        if (isMounted_)
            ::umount2(place_.c_str(), MNT_DETACH);
    }
    SmallDisk(const SmallDisk&) = delete;
    SmallDisk& operator=(const SmallDisk&) = delete;

    // False where the process has no right to mount.
    [[nodiscard]] bool isMounted() const noexcept { return isMounted_; }
    void fill() const
    {
        std::ofstream file(ballast());
        while (file << std::string(4096, 'x')) { }
    }
    void makeRoom() const { std::filesystem::remove(ballast()); }

private:
    [[nodiscard]] std::filesystem::path ballast() const { return place_ / "ballast"; }

    const std::filesystem::path place_;
    const bool isMounted_;
};

} // namespace end_to_end
