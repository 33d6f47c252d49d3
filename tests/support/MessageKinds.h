// The kind of message that tests send most: the start of a playback.
#pragma once

namespace support {

inline constexpr int playback = 4; // a category
inline constexpr int typeStart = 1;

} // namespace support
