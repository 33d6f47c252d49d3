// SPDX-License-Identifier: Apache-2.0
// The name of the driver for a user's devices, and the reasons why publishing may fail.
//
// Every user of a system's service may publish, so every user has a driver: "pipewire-1000" is that of user 1000.
// Another user could take that name first. A folder of another user is left alone, and the driver is then called
// "pipewire-1000<5f3a9c01>", which other users cannot predict and which reports cut at the "<". If this user already
// has a name of that kind, it is used again, so that its old files are removed.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>

namespace kesto_pipewire {

struct DriverName {
    std::string name{};
    std::string reason{}; // why it is not the usual name; empty if it is
};

// The name for this process's user. Any thread.
[[nodiscard]] DriverName driverNameIn(const std::filesystem::path& root);

// A sentence that names the folder that prevents publishing, its owner, and what to do. Any thread.
[[nodiscard]] std::string adviceOn(const std::filesystem::path& root, const std::string& driver);

// "kesto", or "user 1234" for one without a name. Any thread.
[[nodiscard]] std::string userName(uid_t user);

} // namespace kesto_pipewire
