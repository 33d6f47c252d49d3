// SPDX-License-Identifier: Apache-2.0
// Whether the network costs money by the byte, as NetworkManager knows or guesses.
#pragma once

#include <cstdint>

namespace kesto_uplink {

enum class Metered : std::uint8_t {
    Yes,
    No,
    Unknown // there is no NetworkManager, or it does not answer within two seconds
};

[[nodiscard]] Metered networkIsMetered();

} // namespace kesto_uplink
