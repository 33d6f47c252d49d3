// SPDX-License-Identifier: Apache-2.0
// Each row goes into a block of its table that still takes it.
#include "kesto-ingest/Load.h"

#include <algorithm>
#include <array>

namespace kesto_ingest {

namespace {

Counter storedRows(Table table)
{
    constexpr std::array<Counter, tableCount> counters = {Counter::RowsStoredBatches, Counter::RowsStoredEvents,
                                                          Counter::RowsStoredStretches, Counter::RowsStoredSessions};
    return counters[static_cast<std::size_t>(table)];
}

} // namespace

void Load::add(const Row& row, std::string_view json, std::size_t mostRows)
{
    auto place = std::ranges::find_if(blocks, [&row, mostRows](const TableBlock& each) {
        return each.table == row.table && each.block.takes(row.week) && each.block.size() < mostRows;
    });
    if (place == blocks.end())
        place = blocks.insert(place, {.table = row.table, .block = {}});
    place->block.add(json, row.week, batches.size());
    ++rows;
    bytes += json.size();
}

std::expected<void, std::string> storeBlocks(Load& load, Database& database, Metrics& metrics)
{
    while (!load.blocks.empty()) {
        const TableBlock& next = load.blocks.back();
        const auto refused = insertBlock(database, name(next.table), next.block);
        metrics.isDatabaseUp = refused.has_value();
        if (!refused) {
            metrics.add(Counter::InsertFailures);
            return std::unexpected(refused.error());
        }
        for (const RefusedRow& row : *refused)
            load.batches[next.block.source(row.row)].badRows.push_back(
                {row.reason, std::string(next.block.rows(row.row, row.row + 1))});
        if (refused->size() < next.block.size())
            metrics.lastStored =
                std::chrono::duration_cast<std::chrono::seconds>(std::chrono::system_clock::now().time_since_epoch())
                    .count();
        metrics.add(Counter::Inserts);
        metrics.add(Counter::RowsRefusedDatabase, refused->size());
        metrics.add(storedRows(next.table), next.block.size() - refused->size());
        metrics.waitingRows -= next.block.size();
        load.blocks.pop_back();
    }
    return {};
}

} // namespace kesto_ingest
