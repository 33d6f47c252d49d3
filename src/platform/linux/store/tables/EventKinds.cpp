// SPDX-License-Identifier: Apache-2.0
// A kind is looked up in the database once; then its ID is remembered.
#include "platform/linux/store/tables/EventKinds.h"

namespace platform {

StoreExpected<EventKinds> EventKinds::open(SqliteConnection& connection)
{
    EventKinds kinds;
    auto select = connection.prepare("SELECT id FROM kinds WHERE name = ? AND second_name IS ?");
    auto insert = connection.prepare("INSERT INTO kinds(name, second_name) VALUES (?, ?) RETURNING id");
    if (!select || !insert)
        return std::unexpected(select ? insert.error() : select.error());
    kinds.select_ = std::move(*select);
    kinds.insert_ = std::move(*insert);
    return kinds;
}

StoreExpected<std::int64_t> EventKinds::idOf(std::string_view name, std::string_view secondName)
{
    if (const auto known = ids_.find(NamesView(name, secondName)); known != ids_.end())
        return known->second;
    const auto id = lookUp(name, secondName);
    if (id)
        ids_.emplace(Names{std::string(name), std::string(secondName)}, *id);
    return id;
}

StoreExpected<std::int64_t> EventKinds::lookUp(std::string_view name, std::string_view secondName) const
{
    for (const SqliteStatement* statement : {&select_, &insert_}) {
        statement->bind(1, name);
        statement->bind(2, secondName.empty() ? std::nullopt : std::optional(secondName));
        const auto row = statement->step();
        if (!row)
            return std::unexpected(row.error());
        if (!*row)
            continue;
        const std::int64_t id = statement->integer(0);
        statement->reset();
        return id;
    }
    return std::unexpected(StoreError::Other); // an insertion returns its row
}

} // namespace platform
