// SPDX-License-Identifier: Apache-2.0
// A store in the service's own schema, with the rows of a test.
#pragma once

#include "platform/linux/store/SqliteConnection.h"
#include "platform/linux/store/tables/StoreSchema.h"

#include <chrono>
#include <filesystem>
#include <fmt/format.h>
#include <gtest/gtest.h>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

namespace kesto_tool {

// A row of the table of stretches.
struct MadeStretch {
    std::optional<int> session = 1;
    double began = 0;
    double seconds = 0;
    std::optional<std::string> device = "speaker";
    std::optional<std::string> format = "S16LE/48000/2";
    std::optional<double> volume = 0.5;
    std::string ending = "stopped";
    bool isRecording = false;
};

class MadeStore {
public:
    explicit MadeStore(std::filesystem::path path) : path_(std::move(path))
    {
        auto opened = platform::SqliteConnection::open(path_);
        if (!opened || !platform::StoreSchema::make(**opened))
            throw std::runtime_error("no store");
        connection_ = *std::move(opened);
    }

    void execute(const std::string& sql) { EXPECT_TRUE(connection_->execute(sql.c_str())) << sql; }

    // With a source of its own, of the user 1000 and the process 4000 + id.
    void addSession(int id, std::string_view application, double began = 0, std::optional<double> ended = {})
    {
        execute(fmt::format("INSERT INTO sources VALUES ({0}, 'boot', 1000, {1}, 'process {0}', {2}, NULL, NULL)", id,
                            4000 + id, began));
        execute(fmt::format("INSERT INTO sessions VALUES ({0}, {0}, 7, 'longformaudio', {1}, {2}, {3}, NULL)", id,
                            quoted(application), began, sql(ended)));
    }
    void add(const MadeStretch& row)
    {
        execute(
            fmt::format("INSERT INTO stretches(holder, session, recording, began, seconds, device, format, channels,"
                        " volume, ending) VALUES (1, {}, {}, {}, {}, {}, {}, 2, {}, '{}')",
                        sql(row.session), int{row.isRecording}, row.began, row.seconds, sql(row.device),
                        sql(row.format), sql(row.volume), row.ending));
    }
    // One that runs; `arrived` is when it began by the service's clock.
    void addOpen(const MadeStretch& row, double arrived)
    {
        execute(fmt::format("INSERT INTO open_stretches(holder, session, recording, began, arrived, device, format,"
                            " channels, volume) VALUES (1, {}, {}, {}, {}, {}, {}, 2, {})",
                            sql(row.session), int{row.isRecording}, row.began, arrived, sql(row.device),
                            sql(row.format), sql(row.volume)));
    }
    // A message of the category Error, which is two events.
    void addFault(std::optional<int> session, std::optional<double> happened, std::string_view payload,
                  std::string_view type = "IssueDetector", double stored = 1000)
    {
        execute(
            fmt::format("INSERT INTO kinds SELECT {0}, 'com.quarn.kesto.Error.{1}', 'com.quarn.longformaudio.Error.{1}'"
                        " WHERE NOT EXISTS (SELECT 1 FROM kinds WHERE name = 'com.quarn.kesto.Error.{1}');"
                        "INSERT INTO messages(id, time, kind, session, source, happened, holder, payload) VALUES"
                        " ({0}, {2}, (SELECT id FROM kinds WHERE name = 'com.quarn.kesto.Error.{1}'), {3}, 1, {4},"
                        " 1, {5})",
                        nextMessage_, type, stored, sql(session), sql(happened), quoted(payload)));
        nextMessage_ += 2;
    }
    // Whether all of the log can be moved to the database, which no reader then needs.
    [[nodiscard]] bool isLogFree() { return connection_->emptyLog(std::chrono::milliseconds(0)); }
    // The time of the service's last transaction.
    void setLastWord(double time) { execute(fmt::format("UPDATE store SET wall_time = {}", time)); }

private:
    static std::string quoted(std::string_view text)
    {
        std::string quoted = "'";
        for (const char character : text)
            quoted += character == '\'' ? std::string("''") : std::string(1, character);
        return quoted + "'";
    }
    static std::string sql(const std::optional<std::string>& text) { return text ? quoted(*text) : "NULL"; }
    static std::string sql(std::optional<int> number) { return number ? fmt::format("{}", *number) : "NULL"; }
    static std::string sql(std::optional<double> number) { return number ? fmt::format("{}", *number) : "NULL"; }

    std::filesystem::path path_;
    std::unique_ptr<platform::SqliteConnection> connection_;
    int nextMessage_ = 1;
};

} // namespace kesto_tool
