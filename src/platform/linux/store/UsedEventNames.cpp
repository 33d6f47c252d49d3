// SPDX-License-Identifier: Apache-2.0
// Names repeat and patterns rarely change, so each thread remembers its last answers, with the version of the patterns.
#include "platform/linux/store/UsedEventNames.h"

#include "platform/linux/store/AnalyticsConfiguration.h"

#include <array>
#include <cstdint>
#include <functional>

namespace platform {
namespace {

struct RememberedAnswer {
    std::uint64_t version = 0;
    std::string name;
    bool isUsed = false;
};

// The place of the answer about the name; another name's answer may stand there.
RememberedAnswer& rememberedAnswer(std::string_view name)
{
    thread_local std::array<RememberedAnswer, UsedEventNames::answersRemembered> answers;
    return answers[std::hash<std::string_view>()(name) % answers.size()];
}

// A version that was never used before in this process.
std::uint64_t newVersion()
{
    static std::atomic<std::uint64_t> last = 0;
    return ++last;
}

} // namespace

UsedEventNames::UsedEventNames() : version_(newVersion()) { }

void UsedEventNames::setPatterns(std::vector<std::string> patterns)
{
    const foundation::Lock lock(lock_);
    patterns_ = std::move(patterns);
    version_ = newVersion();
}

bool UsedEventNames::contains(std::string_view name)
{
    RememberedAnswer& answer = rememberedAnswer(name);
    if (answer.version != version_ || answer.name != name) {
        std::string copy(name);
        const foundation::Lock lock(lock_);
        const bool isUsed = matchesAny(patterns_, copy);
        answer = {version_, std::move(copy), isUsed};
    }
    return answer.isUsed;
}

} // namespace platform
