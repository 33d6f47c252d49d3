// SPDX-License-Identifier: Apache-2.0
// ClickHouse by its HTTP interface: rows as JSONEachRow, one of several servers at a time.
#pragma once

#include "kesto-ingest/database/Database.h"

#include <chrono>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace kesto_ingest {

struct ClickHouseConfiguration {
    std::vector<std::string> servers; // such as "http://127.0.0.1:8123"
    std::string database = "kesto";
    std::string user{};
    std::string password{};
    std::string certificateAuthority{}; // a file, for https; empty: those of the system
    std::chrono::seconds timeLimit{30}; // of one question
    std::map<std::string, std::string> settings{}; // of each insert, such as insert_quorum

    friend bool operator==(const ClickHouseConfiguration&, const ClickHouseConfiguration&) = default;
};

class ClickHouse : public Database {
public:
    explicit ClickHouse(ClickHouseConfiguration configuration);
    ~ClickHouse() override;

    // Goes to the next server if one cannot be used, until each was tried.
    [[nodiscard]] InsertAnswer insert(std::string_view table, std::string_view rows) override;
    [[nodiscard]] std::expected<std::uint64_t, std::string> edition() override;

private:
    struct Answer {
        long status = 0; // of HTTP; 0: there was none
        std::string text; // the body, or why there was no answer
    };
    struct Connection;

    [[nodiscard]] Answer ask(const std::string& query, std::string_view body);
    [[nodiscard]] Answer askServer(const std::string& server, const std::string& query, std::string_view body);

    ClickHouseConfiguration configuration_;
    std::unique_ptr<Connection> connection_;
    std::size_t current_ = 0; // the server that answered last
};

// The number in "Code: 27, e.displayText() = ..."; 0 if there is none.
[[nodiscard]] int exceptionCode(std::string_view text) noexcept;

} // namespace kesto_ingest
