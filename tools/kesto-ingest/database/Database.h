// SPDX-License-Identifier: Apache-2.0
// The room of the database: blocks of rows and how they get into it, the tables, and ClickHouse by its HTTP interface.
// It knows neither the stream nor the devices.
#pragma once

#include <cstdint>
#include <expected>
#include <string>
#include <string_view>

namespace kesto_ingest {

enum class InsertOutcome : std::uint8_t {
    Stored,
    Refused, // for the rows' own sake: the same rows would be refused again
    Unavailable // for now, or until a person does something
};

struct InsertAnswer {
    InsertOutcome outcome = InsertOutcome::Stored;
    std::string reason; // for a person; empty if the rows are stored

    friend bool operator==(const InsertAnswer&, const InsertAnswer&) = default;
};

// One thread.
class Database {
public:
    Database() = default;
    virtual ~Database() = default;
    Database(const Database&) = delete;
    Database& operator=(const Database&) = delete;

    // Lines of JSONEachRow, of which the database keeps all or none. An answer that was lost looks like Unavailable:
    // the rows may be there.
    [[nodiscard]] virtual InsertAnswer insert(std::string_view table, std::string_view rows) = 0;
    // The edition of the tables, 0 if there are none; the error is for a person.
    [[nodiscard]] virtual std::expected<std::uint64_t, std::string> edition() = 0;
};

} // namespace kesto_ingest
