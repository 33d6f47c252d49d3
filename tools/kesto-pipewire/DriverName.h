// What the driver is called under which a user's devices are published, and why it may be in vain.
//
// Every user of a system's service may publish, so every user has a driver: "pipewire-1000" is that of user 1000.
// Anybody could be there first with that name. What belongs to somebody else is left alone, and the driver is called
// "pipewire-1000<5f3a9c01>", which nobody can foresee and which reports cut at the "<". A name of that kind that this
// user has already is used again, so that what was left there is taken over.
#pragma once

#include <sys/types.h>

#include <filesystem>
#include <string>

namespace kesto_pipewire {

struct DriverName {
    std::string name{};
    std::string reason{}; // in words, why it is not the usual one; empty if it is
};

// For the user that this process is. Any thread.
[[nodiscard]] DriverName driverNameIn(const std::filesystem::path& root);

// Which folder stands in the way of publishing there, whose it is, and what can be done; a sentence. Any thread.
[[nodiscard]] std::string adviceOn(const std::filesystem::path& root, const std::string& driver);

// "kesto", or "user 1234" for one without a name. Any thread.
[[nodiscard]] std::string userName(uid_t user);

} // namespace kesto_pipewire
