// SPDX-License-Identifier: Apache-2.0
// A store in the service's own schema, with rows of a test under the numbers that the service would give them.
#pragma once

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/StoreSchema.h"

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

namespace kesto_uplink_test {

class MadeEventStore {
public:
    explicit MadeEventStore(const std::filesystem::path& path)
    {
        auto opened = platform::SqliteConnection::open(path);
        if (!opened || !platform::StoreSchema::make(**opened) || !(*opened)->beginLog())
            throw std::runtime_error("no store");
        connection_ = *std::move(opened);
        execute("PRAGMA synchronous = OFF");
        setEpoch("0123456789abcdef0123456789abcdef");
    }

    void execute(const std::string& sql) { EXPECT_TRUE(connection_->execute(sql.c_str())) << sql; }
    void setEpoch(std::string_view epoch) { execute(fmt::format("UPDATE store SET epoch = '{}'", epoch)); }

    // A message with this name, and a second one if there is one. Returns its ID, which is the next.
    std::int64_t addEvent(std::string_view name, std::string_view payload = "{}",
                          std::optional<std::int64_t> session = {}, double time = 1000,
                          std::string_view secondName = {})
    {
        const std::int64_t id = next();
        const std::string second = secondName.empty() ? "NULL" : quoted(secondName);
        execute(fmt::format("INSERT INTO kinds(name, second_name) SELECT {0}, {1} WHERE NOT EXISTS (SELECT 1 FROM"
                            " kinds WHERE name = {0} AND second_name IS {1});"
                            "INSERT INTO messages(id, time, kind, session, source, happened, holder, payload) SELECT"
                            " {2}, {3}, id, {4}, NULL, {3} - 0.5, 1, {5} FROM kinds"
                            " WHERE name = {0} AND second_name IS {1}",
                            quoted(name), second, id, time, sql(session), quoted(payload)));
        advance(secondName.empty() ? 1 : 2);
        return id;
    }
    std::int64_t addStretch(std::optional<std::int64_t> session = {}, double began = 1000)
    {
        const std::int64_t id = next();
        execute(fmt::format("INSERT INTO stretches VALUES ({}, 1, {}, 0, {}, 2.5, 'speaker', 'S16LE/48000/2', 2, 0.6,"
                            " 'stopped')",
                            id, sql(session), began));
        advance(1);
        return id;
    }
    void addSession(std::int64_t id, std::string_view application)
    {
        execute(fmt::format("INSERT INTO sources VALUES ({0}, 'boot', 1000, 4000, 'player', 900, NULL, NULL);"
                            "INSERT INTO sessions VALUES ({0}, {0}, 7, 'longformaudio', {1}, 950, NULL, NULL)",
                            id, quoted(application)));
    }
    void endSession(std::int64_t id, double ended = 1500)
    {
        execute(fmt::format("UPDATE sessions SET ended = {}, past = {} WHERE id = {}", ended, next(), id));
    }
    // As the service does when rows are too old.
    void removeBelow(std::int64_t id)
    {
        execute(fmt::format("DELETE FROM messages WHERE id < {0}; DELETE FROM stretches WHERE id < {0}", id));
    }

    // Whether all of the log can be moved to the database, which no reader then needs.
    [[nodiscard]] bool isLogFree() { return connection_->emptyLog(std::chrono::milliseconds(0)); }
    [[nodiscard]] std::int64_t next() { return connection_->number("SELECT next_event FROM store").value(); }

private:
    void advance(int ids) { execute(fmt::format("UPDATE store SET next_event = next_event + {}", ids)); }

    static std::string quoted(std::string_view text)
    {
        std::string quoted = "'";
        for (const char character : text)
            quoted += character == '\'' ? std::string("''") : std::string(1, character);
        return quoted + "'";
    }
    static std::string sql(std::optional<std::int64_t> number) { return number ? fmt::format("{}", *number) : "NULL"; }

    std::unique_ptr<platform::SqliteConnection> connection_;
};

} // namespace kesto_uplink_test
