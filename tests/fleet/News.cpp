// SPDX-License-Identifier: Apache-2.0
// Each message becomes two events, so it takes two IDs.
#include "fleet/News.h"

#include "platform/linux/store/SqliteConnection.h"
#include "support/weeks/MadeUpWeeks.h"
#include "support/weeks/WeeksFile.h"

#include <cmath>
#include <fmt/format.h>
#include <stdexcept>
#include <string>

namespace fleet {

namespace {

constexpr const char* kinds =
    "INSERT INTO kinds(name, second_name) SELECT 'com.quarn.kesto.' || column1, 'com.quarn.generic.' || column1"
    " FROM (VALUES ('Playback.Start'), ('Volume.State'), ('Playback.Deactivate'), ('Error.IssueDetector'))"
    " WHERE NOT EXISTS (SELECT 1 FROM kinds WHERE name = 'com.quarn.kesto.' || column1"
    " AND second_name = 'com.quarn.generic.' || column1);";

std::string message(std::int64_t id, double time, const char* name, std::int64_t session, const std::string& payload)
{
    return fmt::format("INSERT INTO messages(id, time, kind, session, source, happened, holder, payload)"
                       " SELECT {0}, {1}, id, {3}, {3}, {1} - 0.02, 1, '{4}' FROM kinds"
                       " WHERE name = 'com.quarn.kesto.{2}' AND second_name = 'com.quarn.generic.{2}';",
                       id, time, name, session == 0 ? "NULL" : std::to_string(session), payload);
}

// Of one session from the ID on; it has taken the IDs up to `id`.
std::string sessionFrom(std::int64_t& id, std::int64_t session, double now)
{
    constexpr double length = 90;
    const double began = now - length;
    std::string sql = fmt::format("INSERT INTO sources VALUES ({0}, 'boot', 1000, 4000, 'player', {1}, {2}, NULL);"
                                  "INSERT INTO sessions VALUES ({0}, {0}, 7, 'generic', 'org.example.News', {1}, {2},"
                                  " {3});",
                                  session, began, now, id + 7);
    const auto add = [&](double time, const char* name, const std::string& payload) {
        sql += message(id, time, name, session, payload);
        id += 2;
    };
    add(began, "Playback.Start", R"({"session_output_running":true})");
    add(began + 1, "Volume.State", fmt::format(R"({{"PomoSessionVolume":{}}})", static_cast<double>(id % 10) / 10));
    sql += fmt::format("INSERT INTO stretches VALUES ({}, 1, {}, 0, {}, {}, 'speaker', 'S16LE/48000/2', 2, 0.6,"
                       " 'stopped');",
                       id, session, began, length - 0.125 * static_cast<double>(id % 8));
    ++id;
    add(now, "Playback.Deactivate", fmt::format(R"({{"session_duration":{}}})", length));
    return sql;
}

void execute(const std::filesystem::path& store, const auto& work)
{
    const auto connection = platform::SqliteConnection::open(store);
    if (!connection || !(*connection)->beginLog() || !(*connection)->execute("PRAGMA synchronous = OFF")
        || !work(**connection))
        throw std::runtime_error("the store cannot be written: " + store.native());
}

} // namespace

// The service notes of each session that has ended before which row it did.
void makeStore(const std::filesystem::path& store, std::uint32_t seed, std::size_t sessions, double now)
{
    constexpr std::size_t days = 28;
    weeks::writeWeeks(
        weeks::makeWeeks(
            {.seed = seed, .sessions = sessions, .midnights = weeks::midnightsBefore(std::floor(now), days)}),
        store);
    execute(store, [](platform::SqliteConnection& connection) {
        return connection.execute("UPDATE sessions SET past = (SELECT next_event FROM store) WHERE ended IS NOT NULL")
            .has_value();
    });
}

void addNews(const std::filesystem::path& store, int sessions, double now)
{
    execute(store, [&](platform::SqliteConnection& connection) {
        std::int64_t id = connection.number("SELECT next_event FROM store").value();
        std::int64_t session = connection.number("SELECT next_session FROM store").value();
        std::string sql = fmt::format("BEGIN IMMEDIATE; {}", kinds);
        for (int count = 0; count < sessions; ++count)
            sql += sessionFrom(id, session++, now);
        sql += message(id, now, "Error.IssueDetector", 0, fmt::format(R"({{"late_cycles":{}}})", id % 200));
        sql += fmt::format("UPDATE store SET next_event = {}, next_session = {}, next_source = {}; COMMIT", id + 2,
                           session, session);
        return connection.execute(sql.c_str()).has_value();
    });
}

} // namespace fleet
