// Which analytics events are wanted: patterns, and the answers that were already given.
#pragma once

#include "foundation/Mutex.h"

#include <cstddef>
#include <functional>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

namespace platform {

// Any thread.
class UsedEventNames {
public:
    // When more names were asked for, the answers are worked out anew.
    static constexpr std::size_t mostAnswersKept = 4096;

    // The globs, in the form of `matchesAny`.
    void setPatterns(std::vector<std::string> patterns);
    [[nodiscard]] bool contains(std::string_view name);

private:
    struct Hash : std::hash<std::string_view> {
        using is_transparent = void;
    };

    foundation::Mutex lock_;
    std::vector<std::string> patterns_ KESTO_GUARDED_BY(lock_);
    std::unordered_map<std::string, bool, Hash, std::equal_to<>> answers_ KESTO_GUARDED_BY(lock_);
};

} // namespace platform
