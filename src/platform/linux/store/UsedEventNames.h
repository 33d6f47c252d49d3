// SPDX-License-Identifier: Apache-2.0
// Decides which analytics events the service keeps: the patterns, and the last answers of each thread.
#pragma once

#include "foundation/Mutex.h"

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

// Any thread.
class UsedEventNames {
public:
    // The hash of a name gives the place of its answer; an answer that another name replaced is computed again.
    static constexpr std::size_t answersRemembered = 128;

    UsedEventNames();
    // The globs, in the form of `matchesAny`.
    void setPatterns(std::vector<std::string> patterns);
    [[nodiscard]] bool contains(std::string_view name);

private:
    foundation::Mutex lock_;
    std::vector<std::string> patterns_ KESTO_GUARDED_BY(lock_);
    std::atomic<std::uint64_t> version_; // of the patterns
};

} // namespace platform
