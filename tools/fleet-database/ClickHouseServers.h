// SPDX-License-Identifier: Apache-2.0
// The database of a fleet: ClickHouse by its HTTP interface, one of several servers at a time. What is asked,
// and what the answers mean, is the matter of the programs that share it.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <expected>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace fleet_database {

// Of the tables. Grows with each change that an earlier or later program could not use.
constexpr std::uint64_t tablesEdition = 1;

struct ClickHouseConfiguration {
    std::vector<std::string> servers; // such as "http://127.0.0.1:8123"
    std::string database = "kesto";
    std::string user{};
    std::string password{};
    std::string certificateAuthority{}; // a file, for https; empty: those of the system
    std::chrono::seconds timeLimit{30}; // of one question
    std::map<std::string, std::string> settings{}; // of each question, such as insert_quorum

    friend bool operator==(const ClickHouseConfiguration&, const ClickHouseConfiguration&) = default;
};

struct Answer {
    long status = 0; // of HTTP; 0: there was none
    std::string text; // the body; if the status is not 200, what a person can do something with
    bool isCut = false; // the body was longer

    [[nodiscard]] bool isGood() const noexcept { return status == 200; }
};

// The number in "Code: 27, e.displayText() = ..."; 0 if there is none.
[[nodiscard]] int exceptionCode(std::string_view text) noexcept;

// One thread.
class ClickHouseServers {
public:
    // The rest of a longer answer is left out.
    ClickHouseServers(ClickHouseConfiguration configuration, std::size_t longestAnswer);
    ~ClickHouseServers();
    ClickHouseServers(const ClickHouseServers&) = delete;
    ClickHouseServers& operator=(const ClickHouseServers&) = delete;

    // A query, or one that begins in `query` and goes on in the body: either may be empty. Goes to the next server if
    // one cannot be used, until each was tried; but an answer that `isFinal` would be the same everywhere.
    [[nodiscard]] Answer ask(const std::string& query, std::string_view body,
                             const std::function<bool(const Answer&)>& isFinal);
    // Of each question from now on.
    void set(const std::string& setting, const std::string& value) { configuration_.settings[setting] = value; }
    // Of the tables, 0 if there are none; the error is for a person.
    [[nodiscard]] std::expected<std::uint64_t, std::string> edition();

private:
    struct Connection;

    [[nodiscard]] Answer askServer(const std::string& server, const std::string& query, std::string_view body);

    ClickHouseConfiguration configuration_;
    std::size_t longestAnswer_;
    std::unique_ptr<Connection> connection_;
    std::size_t current_ = 0; // the server that answered last
};

} // namespace fleet_database
