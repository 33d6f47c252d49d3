// SPDX-License-Identifier: Apache-2.0
// The run of the machine is known by the kernel's random boot ID.
#include "platform/linux/store/tables/OpenRun.h"

namespace platform {

StoreExpected<bool> OpenRun::isLeftByAnother(SqliteConnection& connection, std::string_view bootIdentifier)
{
    const auto others = connection.prepare("SELECT count(*) FROM open_run WHERE boot != ? OR boot = ''");
    if (!others)
        return std::unexpected(others.error());
    others->bind(1, bootIdentifier);
    if (const auto row = others->step(); !row)
        return std::unexpected(row.error());
    return others->integer(0) > 0;
}

StoreExpected<> OpenRun::begin(SqliteConnection& connection, std::string_view bootIdentifier, double now)
{
    const auto note = connection.prepare("INSERT OR REPLACE INTO open_run VALUES (1, ?, ?)");
    if (!note)
        return std::unexpected(note.error());
    note->bind(1, bootIdentifier);
    note->bind(2, now);
    return note->run();
}

StoreExpected<> OpenRun::end(SqliteConnection& connection)
{
    return connection.execute("DELETE FROM open_run");
}

} // namespace platform
