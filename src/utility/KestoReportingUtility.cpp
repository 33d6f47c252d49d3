// Small functions on the platform's clock, process table and device properties, and on payloads.
#include "utility/KestoReportingUtility.h"

#include "foundation/NumberFormatter.h"
#include "platform/Platform.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cmath>

namespace {

// Of a wait that begins now.
std::chrono::steady_clock::time_point deadline(double timeout)
{
    constexpr double longest = 1e9; // seconds; some thirty years, which every clock can hold
    const std::chrono::duration<double> bounded(std::fmax(0, std::fmin(timeout, longest)));
    return std::chrono::steady_clock::now() + std::chrono::duration_cast<std::chrono::nanoseconds>(bounded);
}

} // namespace

bool KestoReportingUtilityWait(KestoReportingCondition& condition, double timeout, const bool& flag,
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

void KestoReportingUtilitySignal(KestoReportingCondition& condition, bool& flag)
{
    const foundation::Lock lock(condition.lock);
    flag = true;
    condition.signal.notifyOne();
}

bool KestoReportingUtilityIsInternalBuild()
{
    // The number of the platform's installation that was asked, and below it the answer's bit.
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
    const foundation::Value* name = dictionary.find(KestoReportingHostApplicationKey);
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
    return KestoReportingUtilityIsInternalBuild() ? message : message.without(KestoReportingTimestampKey);
}

foundation::Dictionary KestoReportingUtilityRemoveWhiteSpaceFromKeys(const foundation::Dictionary& message)
{
    if (std::ranges::none_of(message, hasBlank, &foundation::DictionaryEntry::key))
        return message;
    foundation::Dictionary::Entries entries;
    entries.reserve(message.size());
    for (const auto& [key, value] : message)
        entries.push_back({withoutBlanks(key), value});
    return entries;
}

foundation::Dictionary KestoReportingUtilityNormaliseMessage(const foundation::Dictionary& message,
                                                             AudioEventCategory category, AudioEventType type)
{
    const bool keepsTime = KestoReportingUtilityIsInternalBuild();
    foundation::Dictionary::Entries entries;
    entries.reserve(message.size() + 1);
    for (const auto& [key, value] : message)
        if (auto name = withoutBlanks(key); keepsTime || name != KestoReportingTimestampKey)
            entries.push_back({std::move(name), value});
    entries.push_back(audioMessageTag(category, type));
    return entries;
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
    return foundation::formatDecimal(*chosen, places == 0 ? 0 : 1, places);
}

std::int64_t KestoReportingUtilityExtractSessionIDFromReporterID(std::int64_t reporterID)
{
    return reporterID;
}
