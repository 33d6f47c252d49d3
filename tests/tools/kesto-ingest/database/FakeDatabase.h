// SPDX-License-Identifier: Apache-2.0
// A database in memory, which can be away, and refuses rows that hold a word.
#pragma once

#include "kesto-ingest/database/Database.h"

#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_ingest {

class FakeDatabase : public Database {
public:
    [[nodiscard]] InsertAnswer insert(std::string_view table, std::string_view rows) override
    {
        if (isAway)
            return {InsertOutcome::Unavailable, "away"};
        if (rows.contains(refusedWord))
            return {InsertOutcome::Refused, "no such word"};
        blocks.emplace_back(rows);
        for (std::string_view rest = rows; !rest.empty(); rest.remove_prefix(rest.find('\n') + 1))
            tables[std::string(table)].emplace_back(rest.substr(0, rest.find('\n')));
        return {};
    }
    [[nodiscard]] std::expected<std::uint64_t, std::string> edition() override
    {
        if (isAway)
            return std::unexpected("away");
        return editionOfTables;
    }

    bool isAway = false;
    std::uint64_t editionOfTables = 1;
    std::string refusedWord = "a word that no row has";
    std::map<std::string, std::vector<std::string>> tables;
    std::vector<std::string> blocks;
};

} // namespace kesto_ingest
