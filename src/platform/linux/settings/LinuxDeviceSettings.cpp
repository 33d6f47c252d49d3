// SPDX-License-Identifier: Apache-2.0
// A flag is off if it, its table or the file is missing. A value of another type is converted to a
// truth value, as a preference would be.
#include "platform/linux/settings/LinuxDeviceSettings.h"

namespace platform {

bool LinuxDeviceSettings::isEnabled(std::string_view domain, std::string_view flag) const
{
    const foundation::Dictionary values = flags_.values();
    const foundation::Value* table = values.find(domain);
    const auto flags = table == nullptr ? std::nullopt : table->dictionary();
    const foundation::Value* value = flags ? flags->find(flag) : nullptr;
    return value != nullptr && value->asBoolean();
}

std::optional<bool> LinuxDeviceSettings::boolean(std::string_view name) const
{
    const foundation::Dictionary values = properties_.values();
    const foundation::Value* value = values.find(name);
    return value == nullptr ? std::nullopt : std::optional(value->asBoolean());
}

} // namespace platform
