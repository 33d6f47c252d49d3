// SPDX-License-Identifier: Apache-2.0
// The numbers of the kinds of messages that tests send: a kind is a category and a type.
#pragma once

namespace support {

// Categories.
inline constexpr int playback = 4;
inline constexpr int setup = 8;
inline constexpr int routeChange = 10;
inline constexpr int errorCategory = 11;
inline constexpr int volume = 14;
// Types.
inline constexpr int typeStart = 1;
inline constexpr int typeStop = 2;
inline constexpr int typeDeactivate = 4;
inline constexpr int typeIssueDetector = 7;
inline constexpr int typeState = 18;

} // namespace support
