// A flag is off if it, its table or the file is missing or has another type.
#include "platform/linux/settings/LinuxFeatureFlags.h"

namespace platform {

bool LinuxFeatureFlags::isEnabled(std::string_view domain, std::string_view flag) const
{
    const foundation::Dictionary values = file_.values();
    const foundation::Value* table = values.find(domain);
    const auto flags = table == nullptr ? std::nullopt : table->dictionary();
    const foundation::Value* value = flags ? flags->find(flag) : nullptr;
    return value != nullptr && value->asBoolean();
}

} // namespace platform
