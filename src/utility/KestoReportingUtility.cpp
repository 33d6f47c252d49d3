// SPDX-License-Identifier: Apache-2.0
// Small functions on the platform's clock, process table and device properties, and on payloads.
#include "utility/KestoReportingUtility.h"

#include "foundation/text/NumberFormatter.h"
#include "platform/Platform.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <cmath>
#include <cstddef>
#include <functional>
#include <iterator>
#include <vector>

namespace {

// The deadline of a wait that begins now.
std::chrono::steady_clock::time_point deadline(double timeout)
{
    constexpr double longest = 1e9; // seconds; some thirty years, which fits in every clock
    const std::chrono::duration<double> bounded(std::fmax(0, std::fmin(timeout, longest)));
    return std::chrono::steady_clock::now() + std::chrono::duration_cast<std::chrono::nanoseconds>(bounded);
}

} // namespace

bool KestoReportingUtilityWait(utility::ConditionWithLock& condition, double timeout, const bool& flag,
                               std::string_view waitMessage, std::string_view timeoutMessage,
                               platform::LogCategory& logCategory)
{
    const foundation::Lock lock(condition.lock);
    while (!flag) {
        KESTO_LOG(logCategory, Info, "{}", waitMessage);
        if (condition.signal.waitUntil(condition.lock, deadline(timeout)) == std::cv_status::timeout) {
            KESTO_LOG(logCategory, Error, "{}", timeoutMessage);
            return false;
        }
        KESTO_LOG(logCategory, Info, "continuing");
    }
    return true;
}

void KestoReportingUtilitySignal(utility::ConditionWithLock& condition, bool& flag)
{
    const foundation::Lock lock(condition.lock);
    flag = true;
    condition.signal.notifyOne();
}

bool KestoReportingUtilityIsInternalBuild()
{
    // The number of the installed platform for which the answer holds, and in the lowest bit the answer.
    static std::atomic<std::uint64_t> remembered;
    const std::uint64_t installation = platform::installationNumber();
    const auto isRemembered = [&] { return remembered.load(std::memory_order_relaxed) >> 1 == installation; };
    if (!isRemembered()) {
        static foundation::Mutex asking;
        const foundation::Lock lock(asking);
        if (!isRemembered())
            remembered.store(
                installation << 1
                    | (platform::current().deviceProperties.boolean("InternalBuild").value_or(false) ? 1U : 0U),
                std::memory_order_relaxed);
    }
    return (remembered.load(std::memory_order_relaxed) & 1) != 0;
}

std::optional<std::string> KestoReportingUtilityProcessNameForPID(std::int32_t pid)
{
    const platform::ProcessTable& processes = platform::current().processTable;
    if (pid == processes.ownProcessIdentifier())
        return processes.ownProcessName();
    platform::ProcessTableEntry entry;
    if (pid < 1 || !KestoReportingUtilityProcessInfoForPID(pid, entry))
        return std::nullopt;
    return entry.commandName;
}

bool KestoReportingUtilityProcessInfoForPID(std::int32_t pid, platform::ProcessTableEntry& entry)
{
    auto found = platform::current().processTable.entry(pid);
    if (!found)
        return false;
    entry = *std::move(found);
    return true;
}

foundation::Value KestoReportingUtilityRetrieveAppName(const foundation::Dictionary& dictionary)
{
    static const foundation::Value unknown("Unknown");
    const foundation::Value* name = dictionary.find(utility::hostApplicationKey);
    return name == nullptr ? unknown : *name;
}

namespace {

// A thread says the same tag many times in a row.
foundation::DictionaryEntry audioMessageTag(AudioEventCategory category, AudioEventType type)
{
    struct Tag {
        AudioEventCategory category;
        AudioEventType type;
        foundation::String text;
    };
    static const foundation::String tagKey("audiotag");
    thread_local std::optional<Tag> last;
    if (!last || last->category != category || last->type != type) {
        std::string text = KestoReportingUtilityCategoryString(category);
        text += KestoReportingUtilityTypeString(type);
        last = Tag{category, type, foundation::String(text)};
    }
    return {tagKey, last->text};
}

bool hasBlank(const foundation::String& key)
{
    return key.view().contains(' ');
}

foundation::String withoutBlanks(const foundation::String& key)
{
    if (!hasBlank(key))
        return key;
    std::string changed(key.view());
    std::ranges::replace(changed, ' ', '_');
    return {changed};
}

} // namespace

foundation::Dictionary KestoReportingUtilityAddAudioMessageTag(const foundation::Dictionary& message,
                                                               AudioEventCategory category, AudioEventType type)
{
    auto [key, tag] = audioMessageTag(category, type);
    return message.with(std::move(key), std::move(tag));
}

foundation::Dictionary KestoReportingUtilityRemoveEventEpochTime(const foundation::Dictionary& message)
{
    return KestoReportingUtilityIsInternalBuild() ? message : message.without(utility::timestampKey);
}

foundation::Dictionary KestoReportingUtilityRemoveWhiteSpaceFromKeys(const foundation::Dictionary& message)
{
    if (std::ranges::none_of(message.keys(), hasBlank))
        return message;
    std::vector<foundation::String> keys;
    keys.reserve(message.size());
    std::ranges::transform(message.keys(), std::back_inserter(keys), withoutBlanks);
    std::vector<foundation::Value> values(message.values().begin(), message.values().end());
    return {std::move(keys), values};
}

namespace {

// How messages of one shape are normalised: which of their values stay, and the shape of these values with the tag
// behind them.
struct NormalisedShape {
    foundation::Reference<foundation::DictionaryShape> of;
    bool keepsTime = false;
    std::vector<std::size_t> kept;
    foundation::Reference<foundation::DictionaryShape> shape;
};

// Each thread caches the last shapes: a session's messages nearly always repeat an earlier shape.
NormalisedShape& rememberedShape(const foundation::DictionaryShape* of)
{
    constexpr std::size_t remembered = 16;
    thread_local std::array<NormalisedShape, remembered> recent;
    return recent[std::hash<const void*>()(of) / alignof(std::max_align_t) % remembered];
}

// Caches how the message's shape was normalised, unless keys became equal or there are many keys.
foundation::Dictionary normaliseAnew(const foundation::Dictionary& message, const foundation::DictionaryEntry& tag,
                                     bool keepsTime, NormalisedShape& remembered)
{
    std::vector<foundation::String> keys;
    std::vector<foundation::Value> values;
    std::vector<std::size_t> kept;
    keys.reserve(message.size() + 1);
    values.reserve(message.size() + 1);
    kept.reserve(message.size());
    for (std::size_t position = 0; position < message.size(); ++position) {
        auto key = withoutBlanks(message.keys()[position]);
        if (!keepsTime && key == utility::timestampKey)
            continue;
        kept.push_back(position);
        keys.push_back(std::move(key));
        values.push_back(message.values()[position]);
    }
    keys.push_back(tag.key);
    values.push_back(tag.value);
    foundation::Dictionary normalised(std::move(keys), values);
    if (normalised.size() == values.size() && normalised.shape()->isSmall())
        remembered = {message.shape(), keepsTime, std::move(kept), normalised.shape()};
    return normalised;
}

} // namespace

foundation::Dictionary utility::normaliseMessage(const foundation::Dictionary& message, AudioEventCategory category,
                                                 AudioEventType type)
{
    const bool keepsTime = KestoReportingUtilityIsInternalBuild();
    const auto tag = audioMessageTag(category, type);
    const auto shape = message.shape();
    NormalisedShape& known = rememberedShape(shape.get());
    if (!known.shape || known.of.get() != shape.get() || known.keepsTime != keepsTime)
        return normaliseAnew(message, tag, keepsTime, known);
    std::vector<foundation::Value> values;
    values.reserve(known.kept.size() + 1);
    for (const std::size_t position : known.kept)
        values.push_back(message.values()[position]);
    values.push_back(tag.value);
    return {known.shape, values};
}

double KestoReportingUtilityRoundWithPlaces(double value, int places)
{
    const double scale = std::pow(10.0, places);
    return std::round(value * scale) / scale;
}

std::optional<std::string> KestoReportingUtilityBucketNumberToString(double number, std::span<const double> buckets,
                                                                     unsigned places)
{
    std::optional<double> chosen;
    double previousDistance = -1;
    for (const double bucket : buckets) {
        const double distance = std::abs(number - bucket);
        if (previousDistance >= 0 && distance > previousDistance)
            break;
        chosen = bucket;
        previousDistance = distance;
    }
    if (!chosen)
        return std::nullopt;
    return foundation::formatDecimal(*chosen, 1, places);
}

std::int64_t KestoReportingUtilityExtractSessionIDFromReporterID(std::int64_t reporterID)
{
    return reporterID;
}
