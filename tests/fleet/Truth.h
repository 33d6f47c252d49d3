// SPDX-License-Identifier: Apache-2.0
// What must be in the fleet's database, counted by SQL on the stores of the devices. It shares no code with the uplink
// or the ingest: the rules of the trial are written here once more, as SQL.
#pragma once

#include <compare>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <map>
#include <string>
#include <vector>

namespace fleet {

// Rows of one store that left, or are to leave, under one pseudonym: those behind an ID, and, unless it is 0, up to
// another.
struct Chapter {
    std::string pseudonym;
    std::filesystem::path store;
    std::int64_t after = 0;
    std::int64_t upTo = 0;
};
using Chapters = std::vector<Chapter>;

enum class Kind : std::uint8_t { Event, Stretch, Session };
inline constexpr Kind allKinds[] = {Kind::Event, Kind::Stretch, Kind::Session};
[[nodiscard]] const char* nameOf(Kind kind);

struct RowsOf {
    std::string device; // the pseudonym
    std::string epoch;
    Kind kind = Kind::Event;

    auto operator<=>(const RowsOf&) const = default;
};

// Sums are modulo 2^64, so their order does not matter.
struct Sums {
    std::uint64_t rows = 0;
    std::uint64_t prints = 0; // half the MD5 of each row's ID, session and texts
    std::uint64_t amounts = 0; // of stretches: the microseconds that they lasted; of sessions: how many have ended

    Sums& operator+=(const Sums& other);
    friend bool operator==(const Sums&, const Sums&) = default;
};
using SumsOfRows = std::map<RowsOf, Sums>;

// What is printed for a row that differs.
struct TrueRow {
    std::int64_t id = 0;
    std::string text = {};
    std::int64_t amount = 0;
};

// The rows of a kind in a chapter, by ID. Throws std::runtime_error if the store cannot be read.
void forEachRow(const Chapter& chapter, Kind kind, const std::function<void(const TrueRow&)>& read);
[[nodiscard]] std::string epochOf(const Chapter& chapter);
[[nodiscard]] std::uint64_t printOf(const std::string& text); // half of its MD5, as halfMD5 of ClickHouse

// Remembers the sums of stores that have no more rows than before. One thread.
class Truth {
public:
    [[nodiscard]] SumsOfRows sums(const Chapters& chapters);

private:
    struct Known {
        std::int64_t newest = 0; // ID
        SumsOfRows sums;
    };
    std::map<std::string, Known> known_; // by chapter
};

} // namespace fleet
