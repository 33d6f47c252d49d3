// SPDX-License-Identifier: Apache-2.0
// Two neighbours with the same payload, sent at nearly the same time under two names, are the two events of a message.
#include "platform/linux/store/tables/FirstEdition.h"

#include <cmath>

namespace platform {
namespace {

constexpr double longestBetweenBothEvents = 1; // seconds

bool isSecondEventOf(const MovedMessage& message, std::int64_t id, double time, std::string_view name,
                     std::string_view payload)
{
    return message.secondName.empty() && !name.empty() && message.name != name && message.id + 1 == id
        && std::abs(time - message.time) <= longestBetweenBothEvents && message.payload == payload;
}

} // namespace

StoreExpected<std::optional<FirstEdition>> FirstEdition::open(SqliteConnection& connection)
{
    const auto isThere = connection.number("SELECT count(*) FROM sqlite_schema WHERE name = 'first_edition'");
    if (!isThere)
        return std::unexpected(isThere.error());
    if (*isThere == 0)
        return std::nullopt;
    const auto last = connection.number("SELECT max(seq) FROM sqlite_sequence WHERE name = 'first_edition'");
    // A stamp that is not a number says nothing.
    auto select = connection.prepare(
        "SELECT id, time, name, payload,"
        " CASE WHEN json_valid(payload) AND json_type(payload, '$.kestoreporting_timestamp') IN ('integer', 'real')"
        " THEN payload ->> '$.kestoreporting_timestamp' END"
        " FROM first_edition ORDER BY id LIMIT ?");
    auto remove = connection.prepare("DELETE FROM first_edition WHERE id <= ?");
    auto oldest = connection.prepare("SELECT min(id) FROM first_edition");
    if (!last || !select || !remove || !oldest)
        return std::unexpected(StoreError::Corrupt);
    FirstEdition edition;
    edition.select_ = std::move(*select);
    edition.delete_ = std::move(*remove);
    edition.oldest_ = std::move(*oldest);
    edition.end_ = *last + 1;
    return edition;
}

StoreExpected<std::vector<MovedMessage>> FirstEdition::next()
{
    std::vector<MovedMessage> messages;
    std::size_t bytes = 0;
    std::int64_t events = 0;
    select_.bind(1, eventsAtOnce);
    bool isLastWhole = false;
    while (true) {
        const auto row = select_.step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row) {
            isLastWhole = events < eventsAtOnce;
            break;
        }
        ++events;
        const std::int64_t id = select_.integer(0);
        const double time = select_.real(1);
        const std::string_view name = select_.text(2);
        const std::string_view payload = select_.text(3);
        if (!messages.empty() && isSecondEventOf(messages.back(), id, time, name, payload)) {
            messages.back().secondName = name;
            continue;
        }
        if (bytes > mostBytesAtOnce) { // the last message is whole: this row is another
            select_.reset();
            return messages;
        }
        bytes += payload.size();
        messages.push_back({id,
                            time,
                            select_.isNull(4) ? std::nullopt : std::optional(select_.real(4)),
                            std::string(name),
                            {},
                            std::string(payload)});
    }
    if (!isLastWhole && messages.size() > 1 && messages.back().secondName.empty())
        messages.pop_back(); // its second event may follow
    return messages;
}

StoreExpected<> FirstEdition::remove(const std::vector<MovedMessage>& moved, StoreCounts& counts)
{
    const std::int64_t last = moved.back().id + (moved.back().secondName.empty() ? 0 : 1);
    delete_.bind(1, last);
    if (const auto done = delete_.run(); !done)
        return done;
    const auto row = oldest_.step();
    if (!row)
        return std::unexpected(row.error());
    const std::int64_t next = oldest_.isNull(0) ? end_ : oldest_.integer(0);
    oldest_.reset();
    std::int64_t events = 0;
    for (const MovedMessage& message : moved)
        events += message.secondName.empty() ? 1 : 2;
    counts.removed += next - moved.front().id - events;
    return {};
}

} // namespace platform
