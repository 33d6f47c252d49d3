// SPDX-License-Identifier: Apache-2.0
// In which run of the machine the database was opened and not closed. A machine that loses power loses the last
// transactions, but readers may have read them: so the next run skips the IDs that they may have used.
#pragma once

#include "platform/linux/store/SqliteConnection.h"

#include <string_view>

namespace platform {

class OpenRun {
public:
    // Whether another run of the machine did not close the database. Where the kernel does not name its runs, whether
    // anybody did not.
    [[nodiscard]] static StoreExpected<bool> isLeftByAnother(SqliteConnection& connection,
                                                             std::string_view bootIdentifier);
    // Notes this run, inside a transaction that must reach the disk; `now` is for people.
    [[nodiscard]] static StoreExpected<> begin(SqliteConnection& connection, std::string_view bootIdentifier,
                                               double now);
    // The database is closed in order. If this does not reach the disk, the next run skips IDs for nothing.
    [[nodiscard]] static StoreExpected<> end(SqliteConnection& connection);
};

} // namespace platform
