// SPDX-License-Identifier: Apache-2.0
// The room of batches: what a device sent in one message, opened, checked row by row, and written as rows of the
// database. It knows neither the stream nor the database.
//
// A batch is newline-delimited JSON, compressed. Its first row is of the kind "device" and says whose batch it is. A
// row that is wrong does not stop the others.
#pragma once

#include "kesto-ingest/batch/Schema.h"

#include <cstddef>
#include <cstdint>
#include <expected>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_ingest {

constexpr std::size_t largestBatch = 512 * 1024; // compressed
constexpr std::size_t largestContent = 8 * 1024 * 1024;
constexpr std::size_t largestRows = 32 * 1024 * 1024; // as they are written for the database
constexpr std::size_t mostBadRows = 1000;

// Is added to the week of a stretch of more than a day: such have partitions of their own.
constexpr std::uint32_t weekOfLong = 1'000'000;

struct Row {
    Table table;
    std::uint32_t week; // from Monday on, as the partitions of the tables; 1970 begins in week 0. See weekOfLong
    std::size_t begin; // of its line in the JSON of the batch
    std::size_t size; // with the line's end
};

struct BadRow {
    std::string reason;
    std::string line;
};

struct Batch {
    std::string device; // the pseudonym
    std::string epoch;
    std::uint64_t last = 0; // the ID up to which the batch tells all that may be told
    std::vector<Row> rows;
    std::string json; // of all rows: lines of JSONEachRow
    std::vector<BadRow> badRows;

    [[nodiscard]] std::string_view jsonOf(const Row& row) const
    {
        return std::string_view(json).substr(row.begin, row.size);
    }
};

// The error says why nothing of the batch can be used.
[[nodiscard]] std::expected<Batch, std::string> readBatch(std::string_view compressed);
// The same for lines that are not compressed.
[[nodiscard]] std::expected<Batch, std::string> readLines(std::string_view lines);

} // namespace kesto_ingest
