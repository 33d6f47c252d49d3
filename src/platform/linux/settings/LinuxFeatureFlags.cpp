// Whatever is not plainly switched on is off: a flag, a table or a file that is missing or of another kind.
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
