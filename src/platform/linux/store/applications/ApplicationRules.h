// SPDX-License-Identifier: Apache-2.0
// The room of applications that the store must not know: the device owner's rules about them, in applications.toml, say
// that their events are not stored, or under a pseudonym.
//
// The rules are read once, at the start: a session whose name changed while it lives would connect a name with its
// pseudonym.
//
// A name is that of an application, as its client gives it, or of a process, as the kernel does. So an owner who hides
// an application also lists the name of its process, if that tells as much.
#pragma once

#include "foundation/values/Value.h"
#include "platform/Origin.h"
#include "platform/linux/store/applications/Pseudonyms.h"

#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace platform {

struct ApplicationsConfiguration {
    std::vector<std::string> notStored; // globs, as `matchesAny` has them, as below
    std::vector<std::string> hashed;

    [[nodiscard]] bool empty() const noexcept { return notStored.empty() && hashed.empty(); }
    friend bool operator==(const ApplicationsConfiguration&, const ApplicationsConfiguration&) = default;
};

// A configuration, and what was wrong with the values: one line each, for a person.
struct CheckedApplicationsConfiguration {
    ApplicationsConfiguration configuration;
    std::vector<std::string> problems;
};

// Any thread.
[[nodiscard]] CheckedApplicationsConfiguration readApplicationsConfiguration(const foundation::Dictionary& values);

// Any thread; nothing changes after the constructor.
class ApplicationRules {
public:
    ApplicationRules(ApplicationsConfiguration configuration, std::shared_ptr<const Pseudonyms> pseudonyms)
        : configuration_(std::move(configuration)),
          pseudonyms_(std::move(pseudonyms))
    {
    }

    // The name as the store may keep it; nothing if it may keep nothing of it.
    [[nodiscard]] std::optional<std::string> shown(const std::string& name) const;
    // The payload with the names that it may show; nothing if the event may not be stored.
    [[nodiscard]] std::optional<foundation::Dictionary> shown(const foundation::Dictionary& payload) const;
    // Sources and sessions with the names that they may show, or with none.
    void hideNames(OriginAnnouncements& announcements) const;

private:
    ApplicationsConfiguration configuration_;
    std::shared_ptr<const Pseudonyms> pseudonyms_;
};

// The rules of applications.toml in the configuration directory; null if none applies. The key of pseudonyms is in the
// state directory.
[[nodiscard]] std::unique_ptr<const ApplicationRules>
loadApplicationRules(const std::filesystem::path& configurationDirectory, const std::filesystem::path& stateDirectory,
                     ProviderLog log);

} // namespace platform
