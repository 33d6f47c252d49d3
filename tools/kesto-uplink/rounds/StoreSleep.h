// SPDX-License-Identifier: Apache-2.0
// Sleep that the store's files end, or the end of the program.
#pragma once

#include "kesto-uplink/rounds/Rounds.h"
#include "kesto/results/EventStore.h"
#include "platform/linux/files/FileDescriptor.h"

#include <filesystem>
#include <optional>

namespace kesto_uplink {

// One thread; `end` is for any.
class StoreSleep : public Sleep {
public:
    explicit StoreSleep(std::filesystem::path database);

    [[nodiscard]] bool sleep(double seconds) override;
    [[nodiscard]] bool untilNews() override;

    // Ends the sleep, and each later one at once.
    void end();

private:
    void watch();

    std::filesystem::path database_;
    std::optional<DatabaseWatch> watch_; // none: there is no folder yet
    platform::FileDescriptor ended_;
};

} // namespace kesto_uplink
