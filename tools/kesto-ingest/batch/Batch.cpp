// SPDX-License-Identifier: Apache-2.0
// Cuts a batch into lines, and writes each good row with the columns of its table, and the device's model and version.
#include "kesto-ingest/batch/Batch.h"

#include "foundation/values/Microseconds.h"
#include "foundation/values/String.h"
#include "kesto-ingest/batch/Compression.h"
#include "kesto-ingest/batch/JsonText.h"
#include "kesto-ingest/batch/RowReader.h"

#include <algorithm>
#include <cstdint>
#include <fmt/format.h>

namespace kesto_ingest {

namespace {

void appendWhole(std::int64_t number, std::string& json)
{
    const fmt::format_int text(number);
    json.append(text.data(), text.size());
}

// What a partition, and a column of moments, can express.
double momentOf(const RowReader& row)
{
    const RowKind& kind = row.kind();
    const double moment = row.number(kind.moment);
    const bool isKnown = row.find(kind.moment) != nullptr && moment >= 0 && moment <= latestMoment;
    return isKnown ? moment : row.number(kind.otherMoment);
}

void appendColumnName(std::string_view column, std::string& json)
{
    ((json += ",\"") += column) += "\":";
}

void appendColumn(const Field& field, const RowReader& row, std::string& json)
{
    const RowEntry* const entry = row.find(field.key);
    if (entry == nullptr || field.column.empty())
        return;
    appendColumnName(field.column, json);
    switch (field.type) {
    case FieldType::Moment:
    case FieldType::Number:
    case FieldType::Identity:
    case FieldType::Integer:
    case FieldType::Count: json += entry->text; break;
    case FieldType::Length: appendWhole(foundation::wholeMicroseconds(entry->number), json); break;
    case FieldType::Share: appendWhole(foundation::wholeMillionths(std::clamp(entry->number, 0.0, 1.0)), json); break;
    case FieldType::Flag: json += entry->kind == ValueKind::True ? '1' : '0'; break;
    case FieldType::Name: appendText(foundation::cutBetweenCharacters(entry->text, longestName), json); break;
    case FieldType::Digits:
    case FieldType::Label:
    case FieldType::Text: appendText(entry->text, json); break;
    case FieldType::Object: ((json += '"') += entry->text) += '"'; break;
    }
}

// The lines after another, and what the first of them says of the device.
class BatchReader {
public:
    std::expected<Batch, std::string> read(std::string_view lines)
    {
        batch_.json.reserve(lines.size() + lines.size() / 2); // enough for most
        while (!lines.empty()) {
            const std::size_t end = lines.find('\n');
            const std::string_view line = lines.substr(0, end);
            lines.remove_prefix(end == std::string_view::npos ? lines.size() : end + 1);
            if (line.empty())
                continue;
            if (!isBegun_) {
                if (auto begun = begin(line); !begun)
                    return std::unexpected(begun.error());
            } else if (auto added = add(line); !added)
                return std::unexpected(added.error());
        }
        if (!isBegun_)
            return std::unexpected("it is empty");
        return std::move(batch_);
    }

private:
    std::expected<void, std::string> begin(std::string_view line)
    {
        if (auto read = row_.read(line); !read)
            return std::unexpected("its first row is wrong: " + read.error());
        if (row_.kind().table != Table::Batches)
            return std::unexpected("its first row is not of kind device");
        batch_.device = row_.text(Key::Device);
        batch_.epoch = row_.text(Key::Epoch);
        batch_.last = row_.identity(Key::Last);
        beginning_ = fmt::format(R"({{"device":"{}","epoch":"{}")", batch_.device, batch_.epoch);
        if (row_.identity(Key::First) > batch_.last)
            return std::unexpected("its first row names a range that ends before it begins");
        for (const Key label : {Key::Model, Key::Version})
            if (const std::string_view text = row_.text(label); !text.empty()) {
                labels_ += fmt::format(",\"{}\":", name(label));
                appendText(text, labels_);
            }
        isBegun_ = true;
        addRow("");
        return {};
    }

    // A few compressed bytes can become many rows, so what becomes of them has bounds.
    std::expected<void, std::string> add(std::string_view line)
    {
        if (auto read = row_.read(line); !read)
            batch_.badRows.push_back({read.error(), std::string(line)});
        else if (row_.kind().table == Table::Batches)
            batch_.badRows.push_back({"only the first row is of kind device", std::string(line)});
        else if (row_.text(Key::Device) != batch_.device || row_.text(Key::Epoch) != batch_.epoch)
            batch_.badRows.push_back({"the first row is of another device or epoch", std::string(line)});
        else
            addRow(labels_);
        if (batch_.badRows.size() > mostBadRows)
            return std::unexpected(fmt::format("more than {} of its rows are wrong; of the first, {}", mostBadRows,
                                               batch_.badRows.front().reason));
        if (batch_.json.size() > largestRows)
            return std::unexpected(fmt::format("its rows become more than {} bytes", largestRows));
        return {};
    }

    void addRow(std::string_view labels)
    {
        constexpr double secondsOfDay = 86400;
        constexpr double secondsOfWeek = 7 * secondsOfDay;
        constexpr double beforeThursday = 3 * 86400; // 1970 began on one
        std::string& json = batch_.json;
        const std::size_t begin = json.size();
        json += beginning_;
        for (const Field& field : row_.kind().fields)
            appendColumn(field, row_, json);
        const double moment = momentOf(row_);
        if (const std::string_view column = row_.kind().microseconds; !column.empty()) {
            appendColumnName(column, json);
            appendWhole(foundation::wholeMicroseconds(moment), json);
        }
        json += labels;
        json += "}\n";
        auto week = static_cast<std::uint32_t>((moment + beforeThursday) / secondsOfWeek);
        if (row_.number(Key::Seconds) > secondsOfDay)
            week += weekOfLong;
        batch_.rows.push_back({.table = row_.kind().table, .week = week, .begin = begin, .size = json.size() - begin});
    }

    RowReader row_;
    Batch batch_;
    bool isBegun_ = false;
    std::string beginning_; // of every row
    std::string labels_; // at the end of every row but the first
};

} // namespace

std::expected<Batch, std::string> readLines(std::string_view lines)
{
    return BatchReader().read(lines);
}

std::expected<Batch, std::string> readBatch(std::string_view compressed)
{
    if (compressed.size() > largestBatch)
        return std::unexpected(
            fmt::format("it has {} compressed bytes; {} are the most", compressed.size(), largestBatch));
    const auto lines = decompress(compressed, largestContent);
    if (!lines)
        return std::unexpected(lines.error());
    return readLines(*lines);
}

} // namespace kesto_ingest
