// SPDX-License-Identifier: Apache-2.0
// A publisher's claim to its files below one driver: an owner file with a lock that shows that the publisher lives.
//
// A publisher that claims a driver removes the files of this user's dead publishers there: channels, unfinished files
// and owner files, and folders that become empty.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <string>
#include <string_view>

namespace libkesto {

// One thread at a time.
class DriverClaim {
public:
    // `owner` is the publisher's name for itself.
    explicit DriverClaim(std::string owner);
    // Removes the owner file.
    ~DriverClaim();
    DriverClaim(const DriverClaim&) = delete;
    DriverClaim& operator=(const DriverClaim&) = delete;

    // Claims the driver's folder, which belongs to this user or the administrator, unless it is claimed already. If the
    // owner file cannot be made, files name no owner. May throw std::bad_alloc.
    void renew(int driverFolder);
    // Whether another process has removed the owner file.
    [[nodiscard]] bool isLost() const noexcept;
    // The first line of files; empty without a claim.
    [[nodiscard]] std::string_view line() const noexcept { return line_; }

private:
    [[nodiscard]] bool holds(int driverFolder) const noexcept;

    const std::string owner_;
    const std::string fileName_;
    std::string line_;
    platform::FileDescriptor folder_;
    platform::FileDescriptor file_;
};

} // namespace libkesto
