// SPDX-License-Identifier: Apache-2.0
// The small tables of all damaged databases are copied at once, since their numbers go on from one to the next.
#include "platform/linux/store/Repair.h"

#include "platform/linux/store/tables/SalvagedTables.h"

#include <algorithm>
#include <tuple>

namespace platform {

bool Repair::setAside(StoreError reason)
{
    const bool isNewer = reason == StoreError::Newer;
    const auto target = isNewer ? files_.setAsideNewer() : files_.setAsideDamaged();
    if (!target)
        return false;
    log_.error("{} {}; it is now {}, and a new one is begun", path_.native(),
               isNewer ? "was made by a later version of the service" : "is damaged or not a database of events",
               target->native());
    return true;
}

StoreExpected<bool> Repair::begin(SqliteEventFile& database)
{
    salvages_.clear();
    for (const std::filesystem::path& damaged : files_.unsaved()) {
        auto begun = Salvage::begin(damaged, database.connection());
        if (!begun)
            return std::unexpected(begun.error());
        salvages_.push_back(*std::move(begun));
    }
    if (salvages_.empty())
        return finishEarlier(database);
    const auto hasMore = [](const std::unique_ptr<Salvage>& salvage) { return salvage->hasMore(); };
    if (std::ranges::none_of(salvages_, hasMore))
        if (const auto done = finish(database); !done)
            return std::unexpected(done.error());
    return true;
}

// A database may be there whose saving was begun, but nothing to save from any more: it is an old copy, or its
// origin was removed.
StoreExpected<bool> Repair::finishEarlier(SqliteEventFile& database)
{
    const auto isBegun = SalvagedTables::isBegun(database.connection());
    if (!isBegun || !*isBegun)
        return isBegun;
    if (const auto done = finish(database); !done)
        return std::unexpected(done.error());
    return true;
}

StoreExpected<> Repair::goOn(SqliteEventFile& database)
{
    for (const std::unique_ptr<Salvage>& salvage : salvages_)
        if (salvage->hasMore())
            return salvage->copySome(database);
    return finish(database);
}

StoreExpected<> Repair::finish(SqliteEventFile& database)
{
    if (const auto done = SalvagedTables::finish(database.connection()); !done)
        return done;
    // What is saved must be on the disk before its origin counts for nothing. If a reader needs the log, it can only be
    // lost together with the log.
    std::ignore = database.connection().emptyLog(waitForReaders);
    for (const std::unique_ptr<Salvage>& salvage : std::exchange(salvages_, {})) {
        SetAsideFiles::markSaved(salvage->damaged());
        savedMessages_ += salvage->messages();
        if (salvage->messages() > 0)
            log_.note("{} messages that could be read in {} are kept in the new database", salvage->messages(),
                      salvage->damaged().native());
    }
    return {};
}

} // namespace platform
