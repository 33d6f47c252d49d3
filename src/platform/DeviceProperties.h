// SPDX-License-Identifier: Apache-2.0
// Facts about this device that its maker set, such as whether it runs an internal build.
#pragma once

#include <optional>
#include <string_view>

namespace platform {

// Any thread.
class DeviceProperties {
public:
    virtual ~DeviceProperties() = default;
    // The property's truth value, or nothing if the device does not have the property.
    [[nodiscard]] virtual std::optional<bool> boolean(std::string_view name) const = 0;
};

} // namespace platform
