// SPDX-License-Identifier: Apache-2.0
// One connection to an SQLite file, and its prepared statements. It reduces SQLite's errors to the few kinds that an
// owner can act on.
//
// Only one connection of the system writes and checkpoints, because SQLite 3.40 can damage a database when two
// connections do so at the same time.
#pragma once

#include "platform/linux/store/StoreError.h"

#include <chrono>
#include <cstdint>
#include <expected>
#include <filesystem>
#include <memory>
#include <optional>
#include <string_view>

struct sqlite3;
struct sqlite3_stmt;

namespace platform {

template <typename Result = void> using StoreExpected = std::expected<Result, StoreError>;

// Parameters count from 1, columns from 0. A text that is bound must stay in place until the statement is reset.
class SqliteStatement {
public:
    SqliteStatement() = default;
    explicit SqliteStatement(sqlite3_stmt* statement) : statement_(statement) { }

    void bind(int parameter, std::int64_t number) const;
    void bind(int parameter, std::uint64_t number) const { bind(parameter, static_cast<std::int64_t>(number)); }
    void bind(int parameter, double number) const;
    void bind(int parameter, std::string_view text) const;
    void bindNull(int parameter) const;
    template <typename Value> void bind(int parameter, const std::optional<Value>& value) const
    {
        value ? bind(parameter, *value) : bindNull(parameter);
    }

    // True if there is a row; false at the end. After the end or an error the statement is reset.
    [[nodiscard]] StoreExpected<bool> step() const;
    // Runs the statement to its first row or to its end, and resets it.
    [[nodiscard]] StoreExpected<> run() const;
    void reset() const;

    [[nodiscard]] std::int64_t integer(int column) const;
    [[nodiscard]] double real(int column) const;
    [[nodiscard]] std::string_view text(int column) const; // valid until the next step
    [[nodiscard]] bool isNull(int column) const;

private:
    struct Finalize {
        void operator()(sqlite3_stmt* statement) const noexcept;
    };
    std::unique_ptr<sqlite3_stmt, Finalize> statement_;
};

// One thread at a time.
class SqliteConnection {
public:
    // How long a program that locks the database may delay the store.
    static constexpr std::chrono::milliseconds longestWaitForLock{2000};

    // Opens the file, or makes it.
    [[nodiscard]] static StoreExpected<std::unique_ptr<SqliteConnection>> open(const std::filesystem::path& path);
    SqliteConnection(const SqliteConnection&) = delete;
    SqliteConnection& operator=(const SqliteConnection&) = delete;
    ~SqliteConnection();

    // Prepares the write-ahead log, which stays when the connection closes.
    [[nodiscard]] StoreExpected<> beginLog();
    // In pages, after the last commit.
    [[nodiscard]] std::uint64_t logPages() const noexcept { return logPages_; }
    // Moves the log to the database, as far as readers allow, and waits for them that long. True if all was moved and
    // no reader needs the log. False also after an error of the disk: a log can be moved later.
    [[nodiscard]] bool emptyLog(std::chrono::milliseconds wait);
    // The same without a wait, and makes the log's file empty, as closing the connection does.
    void truncateLog();

    [[nodiscard]] StoreExpected<> execute(const char* sql);
    // The first column of the first row.
    [[nodiscard]] StoreExpected<std::int64_t> number(const char* sql);
    [[nodiscard]] StoreExpected<SqliteStatement> prepare(std::string_view sql);
    // Drops the transaction, if there is one.
    void rollBack();

private:
    struct Close {
        void operator()(sqlite3* connection) const noexcept;
    };

    SqliteConnection() = default;

    std::unique_ptr<sqlite3, Close> connection_;
    std::uint64_t logPages_ = 0;
};

} // namespace platform
