// SPDX-License-Identifier: Apache-2.0
// The status of HTTP does not tell whose fault an error is, but the number of the exception does.
#include "kesto-ingest/database/ClickHouse.h"

#include "kesto-ingest/database/Tables.h"

#include <algorithm>
#include <array>
#include <cstddef>
#include <utility>

namespace kesto_ingest {

namespace {

constexpr std::size_t longestAnswer = 64 * 1024;

// What a row can cause: texts, numbers and dates that do not fit, and JSON that the database reads otherwise than we
// do. 117, data that are no rows of the table, is not among them: columns of another edition look like that.
constexpr std::array<int, 11> faultsOfRows = {6, 25, 26, 27, 38, 41, 53, 69, 70, 72, 131};

bool isFaultOfRows(const fleet_database::Answer& answer)
{
    return std::ranges::find(faultsOfRows, fleet_database::exceptionCode(answer.text)) != faultsOfRows.end();
}

// The answer then says that the rows are on their shard.
ClickHouseConfiguration synchronous(ClickHouseConfiguration configuration)
{
    configuration.settings.insert_or_assign("insert_distributed_sync", std::string("1"));
    return configuration;
}

} // namespace

ClickHouse::ClickHouse(ClickHouseConfiguration configuration)
    : servers_(synchronous(std::move(configuration)), longestAnswer)
{
}

InsertAnswer ClickHouse::insert(std::string_view table, std::string_view rows)
{
    fleet_database::Answer answer = servers_.ask(insertStatement(table), rows, isFaultOfRows);
    if (answer.isGood())
        return {};
    const auto outcome = isFaultOfRows(answer) ? InsertOutcome::Refused : InsertOutcome::Unavailable;
    return {outcome, std::move(answer.text)};
}

std::expected<std::uint64_t, std::string> ClickHouse::edition()
{
    return servers_.edition();
}

} // namespace kesto_ingest
