// SPDX-License-Identifier: Apache-2.0
// The results: one row for each figure, with the peer's figure and the target. Shown as a table for people and as JSON
// for programs.
#pragma once

#include "foundation/values/Value.h"
#include "support/Harness.h"

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace bench {

// The target of a row.
struct Target {
    enum class Of : std::uint8_t { Figure, Ratio };
    enum class Bound : std::uint8_t { AtMost, AtLeast };
    Of of;
    Bound bound;
    double limit;

    static constexpr Target figureAtMost(double limit) { return {Of::Figure, Bound::AtMost, limit}; }
    static constexpr Target figureAtLeast(double limit) { return {Of::Figure, Bound::AtLeast, limit}; }
    static constexpr Target ratioAtMost(double limit) { return {Of::Ratio, Bound::AtMost, limit}; }
    static constexpr Target ratioAtLeast(double limit) { return {Of::Ratio, Bound::AtLeast, limit}; }
};

struct PeerFigure {
    std::string name;
    Series figure;
};

struct Row {
    std::string what;
    std::string_view unit; // of both figures
    Series figure;
    std::optional<PeerFigure> peer = {};
    std::optional<Target> target = {};

    // The figure over the peer's.
    [[nodiscard]] std::optional<double> ratio() const;
    [[nodiscard]] std::optional<bool> isMet() const;
};

class Report {
public:
    void add(Row row) { rows_.push_back(std::move(row)); }
    // Adds a row that could not be measured on this machine, and the reason.
    void skip(std::string what, std::string reason) { skipped_.push_back({std::move(what), std::move(reason)}); }

    [[nodiscard]] std::string table() const;
    [[nodiscard]] foundation::Dictionary json() const;

private:
    struct Skipped {
        std::string what;
        std::string reason;
    };
    std::vector<Row> rows_;
    std::vector<Skipped> skipped_;
};

} // namespace bench
