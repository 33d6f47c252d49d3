// SPDX-License-Identifier: Apache-2.0
// Puts aside what cannot be stored, with the reason, so that nothing is lost and nothing waits for it.
#pragma once

#include "kesto-ingest/stream/Stream.h"

#include <cstddef>
#include <expected>
#include <functional>
#include <span>
#include <string>
#include <string_view>

namespace kesto_ingest {

struct DeadRow {
    std::string_view reason;
    std::string_view line;
};

// How many letters the stream refused for their size: they are lost.
using LostLetters = std::size_t;

// Rows of a batch, as JSON lines with "reason" and "row", in messages of a bounded size. A row that is too long for one
// is cut. `holdOn` is called after each letter.
[[nodiscard]] std::expected<LostLetters, std::string> putRowsAside(Stream& stream, const Delivery& delivery,
                                                                   std::span<const DeadRow> rows,
                                                                   const std::function<void()>& holdOn);
// A batch as it came, cut if it is larger than a batch may be; the header "Kesto-Reason" has the reason.
[[nodiscard]] std::expected<LostLetters, std::string> putBatchAside(Stream& stream, const Delivery& delivery,
                                                                    const std::string& reason);

} // namespace kesto_ingest
