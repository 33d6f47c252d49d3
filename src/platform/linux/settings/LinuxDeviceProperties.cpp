// A property of another type is converted to a truth value, as a preference would be.
#include "platform/linux/settings/LinuxDeviceProperties.h"

namespace platform {

std::optional<bool> LinuxDeviceProperties::boolean(std::string_view name) const
{
    const foundation::Dictionary values = file_.values();
    const foundation::Value* value = values.find(name);
    return value == nullptr ? std::nullopt : std::optional(value->asBoolean());
}

} // namespace platform
