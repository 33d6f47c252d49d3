// SPDX-License-Identifier: Apache-2.0
// Queries of a store with ten million events: the view must find them by its indexes. The payloads are short, so that
// the file has less than a gigabyte; a query reads only the rows that it finds.
#include "Groups.h"
#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/StoreSchema.h"
#include "support/Report.h"
#include "support/TemporaryDirectory.h"

#include <fmt/format.h>
#include <stdexcept>
#include <string>
#include <utility>

namespace bench {
namespace {

constexpr const char* fill =
    "PRAGMA synchronous = OFF; BEGIN;"
    "WITH RECURSIVE n(i) AS (SELECT 1 UNION ALL SELECT i + 1 FROM n WHERE i < 30)"
    " INSERT INTO kinds SELECT i, 'com.quarn.kesto.Kind' || i || '.Start', 'com.quarn.media.Kind' || i || '.Start' "
    "FROM n;"
    "WITH RECURSIVE n(i) AS (SELECT 0 UNION ALL SELECT i + 1 FROM n WHERE i < 4999999)"
    " INSERT INTO messages(id, time, kind, session, source, happened, holder, payload)"
    " SELECT 2 * i + 1, 1700000000 + i, 1 + (i * 7919) % 30, 1, 1, NULL, 1, '{\"n\":' || i || '}' FROM n;"
    "COMMIT";

void require(bool isDone)
{
    if (!isDone)
        throw std::runtime_error("SQLite failed");
}

} // namespace

void measureStoredQueries(const BenchOptions& options, Report& report)
{
    constexpr double longest = 50; // milliseconds
    const support::TemporaryDirectory directory;
    const auto open = [&directory] { return platform::SqliteConnection::open(directory / "store.sqlite3"); };
    {
        const auto writer = open();
        require(writer.has_value() && platform::StoreSchema::make(**writer).has_value());
        showProgress("filling a store with ten million events");
        require((*writer)->execute(fill).has_value());
    }
    const auto connection = open(); // as a reader: SQLite reads the figures about the tables when it opens them
    require(connection.has_value());
    for (const auto& [what, sql] :
         {std::pair{"by name and time, a thousand events",
                    "SELECT sum(length(payload)) FROM events WHERE name = "
                    "'com.quarn.media.Kind7.Start' AND time > 1704970000"},
          std::pair{"by time, two thousand events", "SELECT sum(length(payload)) FROM events WHERE time > 1704999000"},
          std::pair{"by ID, the next thousand events",
                    "SELECT sum(length(payload)) FROM (SELECT id, payload FROM events WHERE id > "
                    "5000000 ORDER BY id LIMIT 1000)"},
          std::pair{"the last twenty events",
                    "SELECT sum(length(payload)) FROM (SELECT id, payload FROM events ORDER BY id "
                    "DESC LIMIT 20)"}}) {
        const std::string name = fmt::format("a query of ten million events: {}", what);
        const auto times = compete(options, name, [&, query = sql] {
            const auto start = Clock::now();
            require((*connection)->number(query).value_or(0) > 0);
            return nanosecondsSince(start) / 1e6;
        });
        report.add({name, "ms", times.front(), {}, Target::figureAtMost(longest)});
    }
}

} // namespace bench
