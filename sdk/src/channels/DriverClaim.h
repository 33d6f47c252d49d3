// A publisher's claim to what it writes below one driver: an owner file, whose lock tells that the publisher lives.
//
// Whoever claims a driver clears away what publishers of this user left there that live no more: channels, files in the
// making and owner files, and the folders that are empty then.
#pragma once

#include "platform/linux/files/FileDescriptor.h"

#include <string>
#include <string_view>

namespace libkesto {

// One thread at a time.
class DriverClaim {
public:
    // `owner` is what the publisher calls itself.
    explicit DriverClaim(std::string owner);
    // Removes the owner file.
    ~DriverClaim();
    DriverClaim(const DriverClaim&) = delete;
    DriverClaim& operator=(const DriverClaim&) = delete;

    // Claims the driver's folder, which belongs to this user or the administrator, unless that holds already. Where the
    // owner file cannot be made, files name no owner. May throw std::bad_alloc.
    void renew(int driverFolder);
    // Whether somebody has removed the owner file.
    [[nodiscard]] bool isLost() const noexcept;
    // What files begin with; empty where nothing is claimed.
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
