// SPDX-License-Identifier: Apache-2.0
// What is stored together: batches that were taken, and their rows in blocks.
#pragma once

#include "kesto-ingest/Metrics.h"
#include "kesto-ingest/batch/Batch.h"
#include "kesto-ingest/database/Block.h"
#include "kesto-ingest/stream/Confirmations.h"
#include "kesto-ingest/stream/Stream.h"

#include <chrono>
#include <cstddef>
#include <expected>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_ingest {

// A batch that the ingest holds until it has told the device.
struct Held {
    Delivery delivery;
    std::vector<BadRow> badRows{};
    std::string refusal{}; // of the batch as a whole; empty: it is stored
    Confirmation confirmation{};
    bool isPutAside = false; // what is wrong with it
};

struct TableBlock {
    Table table;
    Block block;
};

struct Load {
    std::vector<Held> batches;
    std::vector<TableBlock> blocks; // not stored
    std::size_t rows = 0;
    std::size_t bytes = 0;
    std::chrono::steady_clock::time_point oldest; // when the first batch came

    // Of the batch that comes next into `batches`. No block gets more than `mostRows`.
    void add(const Row& row, std::string_view json, std::size_t mostRows);
};

// Inserts the blocks; a block that is stored is not stored again if a later one fails. The rows that the database
// refuses become bad rows of their batches. The error says why the database could not be used.
[[nodiscard]] std::expected<void, std::string> storeBlocks(Load& load, Database& database, Metrics& metrics);

} // namespace kesto_ingest
