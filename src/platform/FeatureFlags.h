// SPDX-License-Identifier: Apache-2.0
// Feature flags: switches of the device's software, by domain and name.
#pragma once

#include <string_view>

namespace platform {

// Any thread.
class FeatureFlags {
public:
    virtual ~FeatureFlags() = default;
    // False for a flag that is not set.
    [[nodiscard]] virtual bool isEnabled(std::string_view domain, std::string_view flag) const = 0;
};

} // namespace platform
