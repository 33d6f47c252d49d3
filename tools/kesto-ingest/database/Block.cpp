// SPDX-License-Identifier: Apache-2.0
// Halves what the database refuses, until single rows are left.
#include "kesto-ingest/database/Block.h"

#include "kesto-ingest/database/Tables.h"

#include <utility>

namespace kesto_ingest {

std::expected<std::vector<RefusedRow>, std::string> insertBlock(Database& database, std::string_view table,
                                                                const Block& block)
{
    std::vector<RefusedRow> refused;
    std::vector<std::pair<std::size_t, std::size_t>> ranges; // the next one last
    if (block.size() > 0)
        ranges.emplace_back(0, block.size());
    bool hasStored = false;
    while (!ranges.empty()) {
        const auto [first, end] = ranges.back();
        ranges.pop_back();
        InsertAnswer answer = database.insert(table, block.rows(first, end));
        if (answer.outcome == InsertOutcome::Unavailable)
            return std::unexpected(std::move(answer.reason));
        if (answer.outcome == InsertOutcome::Stored)
            hasStored = true;
        else if (end - first == 1)
            refused.push_back({first, std::move(answer.reason)});
        else {
            const std::size_t middle = first + (end - first) / 2;
            ranges.emplace_back(middle, end);
            ranges.emplace_back(first, middle);
        }
        if (!hasStored && refused.size() >= suspiciousRefusals)
            return std::unexpected("it refuses every row: " + refused.front().reason);
    }
    if (!hasStored && !refused.empty()) {
        const auto edition = database.edition();
        if (!edition)
            return std::unexpected(edition.error());
        if (*edition != tablesEdition)
            return std::unexpected("the tables are of another edition, or not there: " + refused.front().reason);
    }
    return refused;
}

} // namespace kesto_ingest
