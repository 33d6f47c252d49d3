// What a session's messages tell about its playing: the messages are replayed in order, and each stretch during
// which output ran in one and the same way becomes a volume event.
//
// Switches arrive in bursts; a burst is folded into one payload first, at the place of its first message.
#define KESTO_LOG_FILE "KestoReportingSession"
#include "session/KestoReportingRapidMessages.h"
#include "session/KestoReportingSession.h"
#include "session/KestoReportingVolumeFields.h"
#include "utility/KestoReportingUtility.h"

#include <algorithm>

namespace {

using foundation::Dictionary;
using foundation::Value;
using Fields = KestoReportingVolumeFields;
using Key = KestoReportingVolumeKey;

constexpr std::string_view functionName = "+[KestoReportingSession createVolumeMessages:process:minimumPlaytime:]";
constexpr double maximumPauseTime = 2.0;

std::optional<double> timeOf(const Fields& fields)
{
    if (!fields.has(Key::Timestamp))
        return std::nullopt;
    return fields.value(Key::Timestamp).asDouble();
}

// Replays payloads and gathers the events of the stretches that end.
class VolumeAnalysis {
public:
    VolumeAnalysis(const std::optional<Value>& process, double minimumPlaytime)
        : process_(process),
          minimumPlaytime_(minimumPlaytime)
    {
        const auto begin = [this](Key key, const Value& value) { state_.set(key, constants_.keep(value)); };
        begin(Key::SelectedFormat, "unknown");
        begin(Key::ActiveDevices, "unknown");
        begin(Key::SpatialAudioAccessoryFeature, false);
        begin(Key::SpatializationEnabled, false);
        begin(Key::RingerState, false);
        begin(Key::ChannelsPerFrame, -1);
    }

    void process(const Fields& payload)
    {
        const double time = timeOf(payload).value_or(0);
        const bool wasRunning = state_.value(Key::OutputRunning).asBoolean();
        bool isChanged = payload.has(Key::Duration);
        if (payload.has(Key::OutputRunning)) {
            isRunning_ = payload.value(Key::OutputRunning).asBoolean();
            if (!wasRunning && isRunning_)
                segmentStart_ = time;
            isChanged |= wasRunning && !isRunning_;
        } else if (payload.has(Key::Duration)) {
            isRunning_ = false;
        }
        if (wasRunning && (isChanged || (isRunning_ && changesOutput(payload)))) {
            endSegment(time - segmentStart_.value_or(0));
            segmentStart_ = time;
        }
        if (!isRunning_)
            segmentStart_.reset();
        state_.merge(payload);
    }

    // The events, each with their number.
    std::vector<Dictionary> finish() &&
    {
        for (Dictionary& event : events_)
            event = event.with("msgcnt", events_.size());
        return std::move(events_);
    }

private:
    [[nodiscard]] bool changesOutput(const Fields& payload) const
    {
        return changesText(payload, Key::SelectedFormat) || changesText(payload, Key::ActiveDevices)
            || changesNumber(payload, Key::SpatializationEnabled) || changesNumber(payload, Key::RingerState)
            || changesVolume(payload);
    }

    [[nodiscard]] bool changesText(const Fields& payload, Key key) const
    {
        return payload.has(key) && !payload.isSameEncoding(state_, key)
            && payload.value(key).text() != state_.value(key).text();
    }

    [[nodiscard]] bool changesNumber(const Fields& payload, Key key) const
    {
        const auto numberOf = [](const Value& value) {
            return value.number().value_or(foundation::Number(value.asDouble()));
        };
        return payload.has(key) && numberOf(payload.value(key)) != numberOf(state_.value(key));
    }

    [[nodiscard]] bool changesVolume(const Fields& payload) const
    {
        return payload.has(Key::Volume) && state_.has(Key::Volume)
            && payload.value(Key::Volume) != state_.value(Key::Volume);
    }

    void endSegment(double playTime)
    {
        if (!(playTime > minimumPlaytime_) || !process_ || !state_.has(Key::Volume)) {
            KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug,
                      "skipped volume message, too short {{ func={}, action=skip, count={} }}", functionName,
                      events_.size());
            return;
        }
        events_.push_back(makeEvent(playTime));
        KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug,
                  "added volume message {{ func={}, action=add, count={} }}", functionName, events_.size());
    }

    [[nodiscard]] Dictionary makeEvent(double playTime) const
    {
        const auto bucketed = [](double number, std::span<const double> buckets, unsigned places) {
            return Value(KestoReportingUtilityBucketNumberToString(number, buckets, places).value_or(""));
        };
        const auto fromState = [this](Key key) {
            return Dictionary::Entry{KestoReportingVolumeKeyName(key), state_.value(key)};
        };
        return {fromState(Key::SelectedFormat),
                fromState(Key::ActiveDevices),
                {KestoReportingHostApplicationKey, *process_},
                fromState(Key::Volume),
                {"PomoSessionVolumeBucketed",
                 bucketed(state_.value(Key::Volume).asDouble(), KestoReportingUtilityBucketNumberToStringVolumes, 4)},
                {"play_seconds", static_cast<float>(playTime)},
                fromState(Key::SpatialAudioAccessoryFeature),
                fromState(Key::SpatializationEnabled),
                fromState(Key::RingerState),
                fromState(Key::ChannelsPerFrame),
                {"play_secondsBucketed", bucketed(playTime, KestoReportingUtilityBucketNumberToStringTimes, 0)},
                {"msgidx", events_.size() + 1}};
    }

    const std::optional<Value>& process_;
    const double minimumPlaytime_;
    KestoReportingVolumeFieldsReader constants_;
    Fields state_;
    bool isRunning_ = false;
    std::optional<double> segmentStart_;
    std::vector<Dictionary> events_;
};

// The bursts of a store: which burst each of their messages belongs to, in order, and what it folds into.
struct Bursts {
    std::vector<std::size_t> memberOf;
    std::vector<Fields> folded;
};

Bursts findBursts(const KestoReportingMessageStore& messages, KestoReportingVolumeFieldsReader& reader)
{
    Bursts bursts;
    KestoReportingBurstFinder finder(maximumPauseTime);
    messages.forEach([&](const KestoReportingMessageStore::Message& message) {
        if (!message.isMarked)
            return;
        const Fields fields = reader.read(message.payload);
        const std::size_t burst = finder.burstOf(timeOf(fields));
        bursts.memberOf.push_back(burst);
        bursts.folded.resize(std::max(bursts.folded.size(), burst + 1));
        bursts.folded[burst].merge(fields);
    });
    return bursts;
}

} // namespace

std::vector<Dictionary> KestoReportingSession::combineRapidMessages(const KestoReportingMessageStore& messages,
                                                                    std::span<const std::string_view> keysToCombine,
                                                                    double maximumPausetime)
{
    std::vector<Dictionary::Entries> combined;
    std::vector<std::size_t> placeOfBurst;
    KestoReportingBurstFinder finder(maximumPausetime);
    messages.forEach([&](const KestoReportingMessageStore::Message& message) {
        const Dictionary payload = message.payload.dictionary();
        std::size_t place = combined.size();
        if (std::ranges::any_of(keysToCombine, [&](std::string_view key) { return payload.contains(key); })) {
            const foundation::Value* time = payload.find(KestoReportingTimestampKey);
            const std::size_t burst = finder.burstOf(time == nullptr ? std::nullopt : std::optional(time->asDouble()));
            if (burst == placeOfBurst.size())
                placeOfBurst.push_back(place);
            place = placeOfBurst[burst];
        }
        combined.resize(std::max(combined.size(), place + 1));
        combined[place].insert(combined[place].end(), payload.begin(), payload.end());
    });
    return {std::make_move_iterator(combined.begin()), std::make_move_iterator(combined.end())};
}

std::vector<Dictionary> KestoReportingSession::createVolumeMessages(const KestoReportingMessageStore& messages,
                                                                    const std::optional<Value>& process,
                                                                    double minimumPlaytime)
{
    KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug, "entering createVolumeMessages {}", functionName);
    KestoReportingVolumeFieldsReader reader;
    const Bursts bursts = findBursts(messages, reader);
    VolumeAnalysis analysis(process, minimumPlaytime);
    std::size_t member = 0;
    std::size_t burstsSeen = 0;
    messages.forEach([&](const KestoReportingMessageStore::Message& message) {
        if (!message.isMarked)
            return analysis.process(reader.read(message.payload));
        if (bursts.memberOf[member++] == burstsSeen)
            analysis.process(bursts.folded[burstsSeen++]);
    });
    auto events = std::move(analysis).finish();
    KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug,
              "returning volume message {{ func={}, action=return, count={} }}", functionName, events.size());
    return events;
}
