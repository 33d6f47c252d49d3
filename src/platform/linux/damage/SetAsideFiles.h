// SPDX-License-Identifier: Apache-2.0
// Databases that were set aside: renamed, with their logs, so that a new one can be begun under their name.
//
// A damaged one has a mark beside it, "<name>-unsaved", until everything that can be read in it has been copied. The
// mark is there before the renaming begins, so a service that is killed in the middle finishes at its next start.
#pragma once

#include "platform/Clock.h"

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string_view>
#include <vector>

namespace platform {

// One thread.
class SetAsideFiles {
public:
    static constexpr std::size_t mostDamagedKept = 3; // older ones are removed

    // The path is that of the database.
    SetAsideFiles(std::filesystem::path path, const Clock& clock) : path_(std::move(path)), clock_(clock) { }

    // Both rename the database, which must be closed, and return its new name. None if that fails.
    [[nodiscard]] std::optional<std::filesystem::path> setAsideDamaged();
    // One of a later version is good, so it is never removed.
    [[nodiscard]] std::optional<std::filesystem::path> setAsideNewer();
    // Finishes what a killed service began. Before the database is opened.
    void finish();

    // The damaged databases that still have their mark, the oldest first.
    [[nodiscard]] std::vector<std::filesystem::path> unsaved() const;
    // Removes the mark.
    static void markSaved(const std::filesystem::path& damaged);

private:
    [[nodiscard]] std::filesystem::path freeName(std::string_view mark) const;
    [[nodiscard]] bool rename(const std::filesystem::path& target) const;
    [[nodiscard]] std::vector<std::filesystem::path> damagedOnes(std::string_view suffix) const;
    void removeOldestDamaged() const;

    const std::filesystem::path path_;
    const Clock& clock_;
};

} // namespace platform
