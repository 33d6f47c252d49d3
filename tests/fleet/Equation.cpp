// SPDX-License-Identifier: Apache-2.0
// Sums are compared first, for each device, epoch and kind. Only where they differ, the rows are compared one by one.
#include "fleet/Equation.h"

#include <algorithm>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <map>
#include <sstream>

namespace fleet {

namespace {

constexpr std::size_t mostPrinted = 10;

// A row as its text and its amount, as the truth has them. Of a session the copy with the end counts.
std::string rowsOf(Kind kind, const std::string& condition)
{
    constexpr const char* eventText = "concat(toString(id), '|', toString(session), '|', name, '|',"
                                      " visitParamExtractString(payload, 'active_devices'), '|',"
                                      " visitParamExtractString(payload, 'late_cycles'), '|', toString(happened_us))";
    constexpr const char* stretchText = "concat(toString(id), '|', toString(session), '|', toString(recording), '|',"
                                        " audio_device, '|', format, '|', ending, '|', ifNull(toString(channels), ''),"
                                        " '|', ifNull(toString(volume_millionths), ''), '|', toString(began_us))";
    switch (kind) {
    case Kind::Event:
        return fmt::format("SELECT device, epoch, id, any({0}) AS text,"
                           " any(toInt64(round(1000000 * visitParamExtractFloat(payload, 'PomoSessionVolume'))))"
                           " AS amount, uniqExact({0}, payload) AS versions FROM kesto.events{{}} {1}"
                           " GROUP BY device, epoch, id",
                           eventText, condition);
    case Kind::Stretch:
        return fmt::format("SELECT device, epoch, id, any({0}) AS text,"
                           " any(microseconds) AS amount, uniqExact({0}, microseconds) AS versions"
                           " FROM kesto.stretches{{}} {1} GROUP BY device, epoch, id",
                           stretchText, condition);
    case Kind::Session: break;
    }
    constexpr const char* sessionText = "concat(toString(id), '|', application, '|', service)";
    return fmt::format("SELECT device, epoch, id, any({0}) AS text, toInt64(max(isNotNull(ended))) AS amount,"
                       " uniqExact({0}, began) AS versions FROM kesto.sessions{{}} {1} GROUP BY device, epoch, id",
                       sessionText, condition);
}

// Of the rows that are there in different versions, none counts: then the sums differ.
SumsOfRows sumsIn(DatabaseCluster& database, int replica)
{
    SumsOfRows sums;
    for (const Kind kind : allKinds) {
        std::istringstream lines(database.selectFrom(
            replica,
            fmt::format("SELECT device, epoch, count(), sum(halfMD5(text)),"
                        " toUInt64(sum(amount)) FROM ({}) WHERE versions = 1 GROUP BY device, epoch",
                        rowsOf(kind, ""))));
        RowsOf of{.device = {}, .epoch = {}, .kind = kind};
        Sums read;
        while (lines >> of.device >> of.epoch >> read.rows >> read.prints >> read.amounts)
            sums[of] += read; // of all shards
    }
    return sums;
}

using Rows = std::map<std::int64_t, std::string>; // by ID

Rows trueRows(const RowsOf& of, const Chapters& chapters)
{
    Rows rows;
    for (const Chapter& chapter : chapters)
        if (chapter.pseudonym == of.device && epochOf(chapter) == of.epoch)
            forEachRow(chapter, of.kind,
                       [&rows](const TrueRow& row) { rows[row.id] = fmt::format("{} {}", row.text, row.amount); });
    return rows;
}

Rows storedRows(const RowsOf& of, DatabaseCluster& database, int replica)
{
    Rows rows;
    std::istringstream lines(database.selectFrom(
        replica,
        fmt::format("SELECT id, versions, text, amount FROM ({}) ORDER BY id FORMAT TabSeparatedRaw",
                    rowsOf(of.kind, fmt::format("WHERE device = '{}' AND epoch = '{}'", of.device, of.epoch)))));
    for (std::string line; std::getline(lines, line);) {
        std::istringstream fields(line);
        std::int64_t id = 0;
        int versions = 0;
        std::string text;
        std::string amount;
        fields >> id >> versions;
        fields.ignore();
        std::getline(fields, text, '\t');
        std::getline(fields, amount);
        rows[id] = versions == 1 ? fmt::format("{} {}", text, amount) : fmt::format("{} versions", versions);
    }
    return rows;
}

std::string difference(const RowsOf& of, const Rows& wanted, const Rows& stored, int replica)
{
    std::vector<std::string> lines;
    const auto note = [&](std::int64_t id, const std::string& want, const std::string& have) {
        if (lines.size() < mostPrinted)
            lines.push_back(fmt::format("  {}: must be \"{}\", is \"{}\"", id, want, have));
    };
    for (const auto& [id, text] : wanted) {
        const auto found = stored.find(id);
        if (found == stored.end())
            note(id, text, "missing");
        else if (found->second != text)
            note(id, text, found->second);
    }
    for (const auto& [id, text] : stored)
        if (!wanted.contains(id))
            note(id, "nothing", text);
    return fmt::format("{} of device {}, epoch {}, in replica {}: {} must be there, {} are\n{}", nameOf(of.kind),
                       of.device, of.epoch, replica, wanted.size(), stored.size(), fmt::join(lines, "\n"));
}

} // namespace

Equality compare(DatabaseCluster& database, const SumsOfRows& truth, const Chapters& chapters)
{
    Equality equality;
    for (const auto& [of, sums] : truth)
        equality.rows += sums.rows;
    if (equality.rows == 0)
        equality.differences.emplace_back("the devices allow no row, so nothing is compared");
    for (int replica = 1; replica <= database.replicas(); ++replica) {
        const SumsOfRows stored = sumsIn(database, replica);
        std::vector<RowsOf> different;
        for (const auto& [of, sums] : truth)
            if (const auto found = stored.find(of); found == stored.end() || found->second != sums)
                different.push_back(of);
        for (const auto& [of, sums] : stored)
            if (!truth.contains(of))
                different.push_back(of);
        if (different.size() > mostPrinted)
            equality.differences.push_back(fmt::format("{} sums differ in replica {}", different.size(), replica));
        different.resize(std::min(different.size(), mostPrinted));
        for (const RowsOf& of : different)
            equality.differences.push_back(
                difference(of, trueRows(of, chapters), storedRows(of, database, replica), replica));
    }
    return equality;
}

} // namespace fleet
