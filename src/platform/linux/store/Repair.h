// SPDX-License-Identifier: Apache-2.0
// What is done about a damaged database: it is set aside, a new one takes the events that come, and what can be read in
// the damaged one is copied into the new one between them. A service that ends meanwhile begins to copy again at its
// next start.
#pragma once

#include "platform/Clock.h"
#include "platform/linux/damage/SetAsideFiles.h"
#include "platform/linux/log/ProviderLog.h"
#include "platform/linux/store/Salvage.h"
#include "platform/linux/store/SqliteEventFile.h"
#include "platform/linux/store/StoreError.h"

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <memory>
#include <utility>
#include <vector>

namespace platform {

// One thread.
class Repair {
public:
    // The path is that of the database.
    Repair(std::filesystem::path path, const Clock& clock, ProviderLog log)
        : path_(std::move(path)),
          files_(path_, clock),
          log_(log)
    {
    }

    // Finishes what a killed service began. Before the database is opened.
    void finishRenaming() { files_.finish(); }
    // Sets the database aside, which must be closed: a damaged one, or one of a later version. False if that fails.
    [[nodiscard]] bool setAside(StoreError reason);

    // Begins to copy from the databases that were set aside and not copied yet, before the database takes events. True
    // if there are any: the database must be opened again.
    [[nodiscard]] StoreExpected<bool> begin(SqliteEventFile& database);
    [[nodiscard]] bool isDone() const noexcept { return salvages_.empty(); }
    // Copies a little, in one transaction. When this was the last, the database must be opened again.
    [[nodiscard]] StoreExpected<> goOn(SqliteEventFile& database);
    // How many messages were saved from the databases that were finished since the last call.
    [[nodiscard]] std::uint64_t takeSavedMessages() noexcept { return std::exchange(savedMessages_, 0); }

private:
    static constexpr std::chrono::milliseconds waitForReaders{200};

    [[nodiscard]] StoreExpected<bool> finishEarlier(SqliteEventFile& database);
    [[nodiscard]] StoreExpected<> finish(SqliteEventFile& database);

    const std::filesystem::path path_;
    SetAsideFiles files_;
    const ProviderLog log_;
    std::vector<std::unique_ptr<Salvage>> salvages_; // the oldest first
    std::uint64_t savedMessages_ = 0;
};

} // namespace platform
