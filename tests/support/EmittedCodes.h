// SPDX-License-Identifier: Apache-2.0
// The codes of the events that clients and sessions emit.
#pragma once

#include <cstdint>

namespace support {

inline constexpr std::uint32_t clientCreate = 0x21044814;
inline constexpr std::uint32_t clientStart = 0x21044818;
inline constexpr std::uint32_t clientStop = 0x2104481C;
inline constexpr std::uint32_t clientDestroy = 0x21044820;
inline constexpr std::uint32_t clientSendMessage = 0x21044824;
inline constexpr std::uint32_t sessionCreated = 0x21044828;
inline constexpr std::uint32_t sessionStarted = 0x2104482C;
inline constexpr std::uint32_t sessionStopping = 0x21044830;
inline constexpr std::uint32_t sessionDestroyed = 0x21044834;
inline constexpr std::uint32_t sessionMessageAccepted = 0x21044838;

} // namespace support
