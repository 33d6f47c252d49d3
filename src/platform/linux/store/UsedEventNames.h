// Which analytics events are wanted: patterns, and the answers that a thread was given last.
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
    // Each by a hash of its name; one that was driven away is worked out anew.
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
