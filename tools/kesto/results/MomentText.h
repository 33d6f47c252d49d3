// SPDX-License-Identifier: Apache-2.0
// Moments as people write them.
#pragma once

#include <optional>
#include <string_view>

// Seconds since 1970 of "10m" (so long ago; also s, h and d) or of a local time such as 2026-01-31T18:00:00 (the time
// of day may be left out, "T" may be a blank, and a zone may follow: "Z" or "+02:00"). Nothing for other texts.
[[nodiscard]] std::optional<double> parseMoment(std::string_view text);
