// SPDX-License-Identifier: Apache-2.0
// Puts aside what cannot be stored, with the reason, so that nothing is lost and nothing waits for it.
#pragma once

#include "kesto-ingest/stream/Stream.h"

#include <expected>
#include <span>
#include <string>
#include <string_view>

namespace kesto_ingest {

struct DeadRow {
    std::string_view reason;
    std::string_view line;
};

// Rows of a batch, as JSON lines with "reason" and "row", in messages of a bounded size. A row that is too long for one
// is cut.
[[nodiscard]] std::expected<void, std::string> putRowsAside(Stream& stream, const Delivery& delivery,
                                                            std::span<const DeadRow> rows);
// A batch as it came; the header "Kesto-Reason" has the reason.
[[nodiscard]] std::expected<void, std::string> putBatchAside(Stream& stream, const Delivery& delivery,
                                                             const std::string& reason);

} // namespace kesto_ingest
