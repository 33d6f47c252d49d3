// SPDX-License-Identifier: Apache-2.0
// A message's ID is made of the batch's place in the stream, so that a batch that comes twice is put aside once.
#include "kesto-ingest/stream/DeadLetters.h"

#include "kesto-ingest/stream/Subjects.h"

#include "foundation/values/String.h"

#include <fmt/format.h>
#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include <algorithm>

namespace kesto_ingest {

namespace {

constexpr std::size_t longestRow = 64 * 1024;
constexpr std::size_t largestMessage = 512 * 1024; // escapes may double it

std::string subjectOf(const Delivery& delivery)
{
    const std::string credential = credentialOf(delivery.subject);
    return std::string(deadPrefix) + (credential.empty() ? "unknown" : credential);
}

Headers headersOf(const Delivery& delivery, std::string_view part)
{
    return {{"Nats-Msg-Id", fmt::format("{}:{}:{}", eventsStream, delivery.sequence, part)},
            {"Kesto-Sequence", fmt::format("{}", delivery.sequence)}};
}

// A part of what a device sent may be in it, and cut anywhere.
std::string printable(std::string_view reason)
{
    std::string text(reason);
    foundation::replaceWhatIsNotUtf8(text);
    std::ranges::replace_if(text, [](unsigned char character) { return character < 0x20 || character == 0x7f; }, '?');
    return text;
}

// The text as UTF-8, which a row that was refused need not be.
void appendLine(const DeadRow& row, std::string& lines)
{
    const std::string reason = printable(row.reason);
    std::string text(row.line.substr(0, longestRow));
    foundation::replaceWhatIsNotUtf8(text);
    rapidjson::StringBuffer buffer;
    rapidjson::Writer<rapidjson::StringBuffer> writer(buffer);
    writer.StartObject();
    writer.Key("reason");
    writer.String(reason.data(), static_cast<rapidjson::SizeType>(reason.size()));
    writer.Key("row");
    writer.String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
    writer.EndObject();
    lines.append(buffer.GetString(), buffer.GetSize());
    lines += '\n';
}

} // namespace

std::expected<void, std::string> putRowsAside(Stream& stream, const Delivery& delivery, std::span<const DeadRow> rows)
{
    std::string lines;
    std::size_t part = 0;
    for (const DeadRow& row : rows) {
        appendLine(row, lines);
        if (lines.size() < largestMessage && &row != &rows.back())
            continue;
        if (auto put = stream.publish(subjectOf(delivery), lines, headersOf(delivery, fmt::format("{}", part++))); !put)
            return put;
        lines.clear();
    }
    return {};
}

std::expected<void, std::string> putBatchAside(Stream& stream, const Delivery& delivery, const std::string& reason)
{
    Headers headers = headersOf(delivery, "batch");
    headers["Kesto-Reason"] = printable(reason);
    return stream.publish(subjectOf(delivery), delivery.payload, headers);
}

} // namespace kesto_ingest
