// SPDX-License-Identifier: Apache-2.0
// The message of all measurements: ten entries such as a player sends when its output starts, about 256 bytes of CBOR.
// A running number makes every message different, so that it is recorded.
#pragma once

#include "foundation/values/Value.h"
#include "utility/MessageKinds.h"

#include <cstdint>
#include <string>

namespace bench {

constexpr AudioEventCategory sampleCategory = 4; // Playback
constexpr std::uint16_t sampleType = 1; // Start
constexpr std::int64_t sampleReporterID = 42;

// In a message that is encoded in advance, this number marks the place of the running number. It is also the first
// running number: from it on all numbers take as many bytes.
constexpr std::uint32_t numberMark = 0x5EED'0001;

[[nodiscard]] foundation::Dictionary sampleMessage(std::uint32_t number = numberMark);

} // namespace bench
