// SPDX-License-Identifier: Apache-2.0
// Reads an analytics database as every program may: through its own read-only connection.
#pragma once

#include <cstdint>
#include <filesystem>
#include <sqlite3.h>
#include <stdexcept>
#include <string>
#include <vector>

namespace support {

class StoreReader {
public:
    explicit StoreReader(const std::filesystem::path& path)
    {
        if (::sqlite3_open_v2(path.c_str(), &connection_, SQLITE_OPEN_READONLY, nullptr) != SQLITE_OK)
            fail();
        ::sqlite3_busy_timeout(connection_, 10'000);
    }
    ~StoreReader() { ::sqlite3_close(connection_); }
    StoreReader(const StoreReader&) = delete;
    StoreReader& operator=(const StoreReader&) = delete;

    // One column of every row.
    std::vector<std::string> texts(const std::string& sql, int column = 0)
    {
        sqlite3_stmt* statement = nullptr;
        if (::sqlite3_prepare_v2(connection_, sql.c_str(), -1, &statement, nullptr) != SQLITE_OK)
            fail();
        std::vector<std::string> rows;
        int step = 0;
        while ((step = ::sqlite3_step(statement)) == SQLITE_ROW) {
            const auto* text = reinterpret_cast<const char*>(::sqlite3_column_text(statement, column));
            rows.emplace_back(text == nullptr ? "NULL" : text);
        }
        ::sqlite3_finalize(statement);
        if (step != SQLITE_DONE)
            fail();
        return rows;
    }
    std::string text(const std::string& sql) { return texts(sql).at(0); }
    std::int64_t number(const std::string& sql) { return std::stoll(text(sql)); }
    std::int64_t eventCount() { return number("SELECT count(*) FROM events"); }

    // For a reader that keeps a transaction open.
    void execute(const std::string& sql)
    {
        if (::sqlite3_exec(connection_, sql.c_str(), nullptr, nullptr, nullptr) != SQLITE_OK)
            fail();
    }

private:
    [[noreturn]] void fail() const { throw std::runtime_error(::sqlite3_errmsg(connection_)); }

    sqlite3* connection_ = nullptr;
};

} // namespace support
