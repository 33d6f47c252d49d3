// SPDX-License-Identifier: Apache-2.0
// A confirmation as it stands in a message: {"epoch":"…","id":N}.
#pragma once

#include "kesto-uplink/transport/Transport.h"

#include <optional>
#include <string_view>

namespace kesto_uplink {

// None if the text is no confirmation: it then confirms nothing, and a later one may.
[[nodiscard]] std::optional<Confirmation> confirmationIn(std::string_view text);

} // namespace kesto_uplink
