// SPDX-License-Identifier: Apache-2.0
// Rows of one table that are inserted together.
//
// The database makes a part of each week that a block touches, so a block touches few: a device whose clock jumps could
// otherwise make thousands.
#pragma once

#include "kesto-ingest/database/Database.h"

#include <cstddef>
#include <cstdint>
#include <expected>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_ingest {

class Block {
public:
    static constexpr std::size_t mostWeeks = 49;
    static constexpr std::size_t mostBytes = 16 * 1024 * 1024; // and one row

    [[nodiscard]] bool takes(std::uint32_t week) const
    {
        return text_.size() < mostBytes && (weeks_.size() < mostWeeks || weeks_.contains(week));
    }
    // `source` tells the caller where a row came from.
    void add(std::string_view row, std::uint32_t week, std::size_t source)
    {
        text_ += row;
        ends_.push_back(text_.size());
        sources_.push_back(source);
        weeks_.insert(week);
    }

    [[nodiscard]] std::size_t size() const noexcept { return ends_.size(); }
    [[nodiscard]] std::size_t source(std::size_t row) const { return sources_[row]; }
    // The text of the rows from `first` up to, without, `end`.
    [[nodiscard]] std::string_view rows(std::size_t first, std::size_t end) const
    {
        const std::size_t begin = first == 0 ? 0 : ends_[first - 1];
        return std::string_view(text_).substr(begin, end == first ? 0 : ends_[end - 1] - begin);
    }

private:
    std::string text_;
    std::vector<std::size_t> ends_;
    std::vector<std::size_t> sources_;
    std::set<std::uint32_t> weeks_;
};

struct RefusedRow {
    std::size_t row;
    std::string reason;

    friend bool operator==(const RefusedRow&, const RefusedRow&) = default;
};

// Inserts the block, and returns the rows that the database refuses; it halves the block to find them. The error says
// why the database could not be used; a part of the block may then be stored. So it is if the database refuses
// everything of a block with `suspiciousRefusals` rows or more, or of a smaller one if the tables are of another
// edition: then not the rows are wrong, but the tables.
constexpr std::size_t suspiciousRefusals = 32;
[[nodiscard]] std::expected<std::vector<RefusedRow>, std::string>
insertBlock(Database& database, std::string_view table, const Block& block);

} // namespace kesto_ingest
