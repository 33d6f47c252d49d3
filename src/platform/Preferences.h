// SPDX-License-Identifier: Apache-2.0
// The preferences store: values by domain and key, changed by the device's owner while the service runs.
#pragma once

#include "foundation/values/Value.h"

#include <optional>
#include <string_view>

namespace platform {

// Any thread.
class Preferences {
public:
    virtual ~Preferences() = default;
    // The stored value, or nothing. A change may become visible a moment later.
    [[nodiscard]] virtual std::optional<foundation::Value> value(std::string_view domain,
                                                                 std::string_view key) const = 0;
};

} // namespace platform
