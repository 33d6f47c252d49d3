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
constexpr std::size_t longestReason = 1000;
constexpr std::size_t largestMessage = 512 * 1024; // without headers

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
    std::string text(reason.substr(0, longestReason));
    foundation::replaceWhatIsNotUtf8(text);
    std::ranges::replace_if(text, [](unsigned char character) { return character < 0x20 || character == 0x7f; }, '?');
    return text;
}

// The text as UTF-8, which a row that was refused need not be.
std::string lineOf(const DeadRow& row)
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
    return std::string(buffer.GetString(), buffer.GetSize()) + '\n';
}

std::expected<LostLetters, std::string> publish(Stream& stream, const Delivery& delivery, std::string_view payload,
                                                const Headers& headers)
{
    const auto published = stream.publish(subjectOf(delivery), payload, headers);
    if (!published)
        return std::unexpected(published.error());
    return *published == Publication::TooLarge ? 1 : 0;
}

} // namespace

std::expected<LostLetters, std::string> putRowsAside(Stream& stream, const Delivery& delivery,
                                                     std::span<const DeadRow> rows, const std::function<void()>& holdOn)
{
    LostLetters lost = 0;
    std::size_t part = 0;
    std::string lines;
    for (std::size_t row = 0; row <= rows.size(); ++row) {
        const std::string next = row < rows.size() ? lineOf(rows[row]) : std::string();
        const bool isFull = next.empty() || lines.size() + next.size() > largestMessage;
        if (isFull && !lines.empty()) {
            const auto put = publish(stream, delivery, lines, headersOf(delivery, fmt::format("{}", part++)));
            if (!put)
                return put;
            lost += *put;
            lines.clear();
            holdOn();
        }
        lines += next;
    }
    return lost;
}

std::expected<LostLetters, std::string> putBatchAside(Stream& stream, const Delivery& delivery,
                                                      const std::string& reason)
{
    Headers headers = headersOf(delivery, "batch");
    headers["Kesto-Reason"] = printable(reason);
    return publish(stream, delivery, delivery.payload.substr(0, largestMessage), headers);
}

} // namespace kesto_ingest
