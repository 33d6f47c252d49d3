// SPDX-License-Identifier: Apache-2.0
// A line of the kernel's list: "1: FLOCK  ADVISORY  WRITE 7864 fe:00:408224 0 EOF", the device's numbers in
// hexadecimal, the inode's in decimal.
#include "kesto/store/StoreHolder.h"

#include <fstream>
#include <sstream>
#include <string>
#include <sys/stat.h>
#include <sys/sysmacros.h>

namespace {

// Filesystems without a device of their own, such as Btrfs, tell a file's status another minor number.
bool isOf(const struct stat& directory, const std::string& place)
{
    unsigned long majorNumber = 0;
    unsigned long minorNumber = 0;
    unsigned long inode = 0;
    char colon = 0;
    std::istringstream text(place);
    text >> std::hex >> majorNumber >> colon >> minorNumber >> colon >> std::dec >> inode;
    return text && majorNumber == major(directory.st_dev)
        && (majorNumber == 0 || minorNumber == minor(directory.st_dev)) && inode == directory.st_ino;
}

} // namespace

bool isHeldByService(const std::filesystem::path& database)
{
    struct stat directory = {};
    if (::stat(std::filesystem::absolute(database).parent_path().c_str(), &directory) != 0)
        return false;
    std::ifstream locks("/proc/locks");
    for (std::string line; std::getline(locks, line);) {
        std::string number;
        std::string kind;
        std::string advisory;
        std::string mode;
        std::string process;
        std::string place;
        std::istringstream(line) >> number >> kind >> advisory >> mode >> process >> place;
        if (kind == "FLOCK" && mode == "WRITE" && isOf(directory, place))
            return true;
    }
    return false;
}
