// Names repeat, patterns rarely change: answers are kept until they do, and all thrown away when there are too many,
// which costs less than knowing which was used last.
#include "platform/linux/UsedEventNames.h"

#include "platform/linux/AnalyticsConfiguration.h"

namespace platform {

void UsedEventNames::setPatterns(std::vector<std::string> patterns)
{
    const foundation::Lock lock(lock_);
    patterns_ = std::move(patterns);
    answers_.clear();
}

bool UsedEventNames::contains(std::string_view name)
{
    const foundation::Lock lock(lock_);
    if (const auto known = answers_.find(name); known != answers_.end())
        return known->second;
    if (answers_.size() >= mostAnswersKept)
        answers_.clear();
    std::string key(name);
    const bool isUsed = matchesAny(patterns_, key);
    answers_.emplace(std::move(key), isUsed);
    return isUsed;
}

} // namespace platform
