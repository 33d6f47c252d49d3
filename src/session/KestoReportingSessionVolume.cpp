// SPDX-License-Identifier: Apache-2.0
// What a session's messages say about its playing: the session replays them in order, and each stretch during which
// output ran unchanged becomes a volume event.
//
// The switches of spatial audio arrive in bursts, which are folded into one payload first.
#define KESTO_LOG_NAME "KestoReportingSession"
#include "platform/Platform.h"
#include "session/KestoReportingSession.h"
#include "session/RapidMessages.h"
#include "session/VolumeFields.h"
#include "utility/KestoReportingUtility.h"

#include <algorithm>
#include <array>
#include <deque>

namespace {

using foundation::Dictionary;
using foundation::Value;
using Fields = session::VolumeFields;
using Key = session::VolumeKey;

constexpr std::string_view functionName = "+[KestoReportingSession createVolumeMessages:process:minimumPlaytime:]";
constexpr double longestPause = 2.0; // seconds, within a burst

// The parts of the state that an event contains.
constexpr std::array keysOfAnEvent{
    Key::SelectedFormat,        Key::ActiveDevices, Key::Volume,          Key::SpatialAudioAccessoryFeature,
    Key::SpatializationEnabled, Key::RingerState,   Key::ChannelsPerFrame};

// The keys of an event; all events share them.
const foundation::Reference<foundation::DictionaryShape>& shapeOfEvents()
{
    static const auto shape = foundation::DictionaryShape::make({
        session::volumeKeyName(Key::SelectedFormat),
        session::volumeKeyName(Key::ActiveDevices),
        utility::hostApplicationKey,
        session::volumeKeyName(Key::Volume),
        "PomoSessionVolumeBucketed",
        "play_seconds",
        session::volumeKeyName(Key::SpatialAudioAccessoryFeature),
        session::volumeKeyName(Key::SpatializationEnabled),
        session::volumeKeyName(Key::RingerState),
        session::volumeKeyName(Key::ChannelsPerFrame),
        "play_secondsBucketed",
        "msgidx",
        "msgcnt",
    });
    return shape;
}

// The values in their order, without the count.
using ValuesOfEvent = std::array<Value, 13>;

// How folding reads, compares and merges payloads that the analysis reads.
struct VolumePayloads {
    session::VolumeFieldsReader reader;

    Fields read(const session::MessageStore::Cursor& message) { return reader.read(message); }
    static bool isCombinable(const Fields& payload)
    {
        return payload.has(Key::SpatialAudioAccessoryFeature) || payload.has(Key::SpatializationEnabled);
    }
    static std::optional<double> timeOf(const Fields& payload)
    {
        return payload.has(Key::Timestamp) ? std::optional(payload.number(Key::Timestamp).doubleValue()) : std::nullopt;
    }
    static void merge(Fields& into, const Fields& payload) { into.merge(payload); }
};

// The same for whole payloads and any keys.
struct WholePayloads {
    std::span<const std::string_view> keysToCombine;

    static Dictionary read(const session::MessageStore::Cursor& message) { return message.payload().dictionary(); }
    [[nodiscard]] bool isCombinable(const Dictionary& payload) const
    {
        return std::ranges::any_of(keysToCombine, [&](std::string_view key) { return payload.contains(key); });
    }
    static std::optional<double> timeOf(const Dictionary& payload)
    {
        const Value* time = payload.find(utility::timestampKey);
        return time == nullptr ? std::nullopt : std::optional(time->asDouble());
    }
    static void merge(Dictionary& into, const Dictionary& payload) { into = into.mergedWith(payload); }
};

// Replays payloads and gathers the events of the stretches that end.
class VolumeAnalysis {
public:
    VolumeAnalysis(const std::optional<Value>& process, double minimumPlaytime, session::StorageShare& share)
        : process_(process),
          minimumPlaytime_(minimumPlaytime),
          share_(share)
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
        const double time = payload.number(Key::Timestamp).doubleValue();
        const bool wasRunning = stateIsRunning_;
        bool isChanged = payload.has(Key::Duration);
        if (payload.has(Key::OutputRunning)) {
            isRunning_ = payload.boolean(Key::OutputRunning);
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
        merge(payload);
    }

    // The events, each with its number. The data that they are made of is freed on the way.
    std::vector<Dictionary> finish() &&
    {
        const std::size_t count = events_.size();
        std::vector<Dictionary> events;
        events.reserve(count);
        for (; !events_.empty(); events_.pop_front()) {
            events_.front().back() = count;
            events.emplace_back(shapeOfEvents(), events_.front());
        }
        platform::current().ledger.count(ledger::Counter::VolumeEventsLost, eventsBeyondBound_ + eventsUnpaid_);
        if (eventsBeyondBound_ != 0)
            KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Error,
                      "{} volume events are lost: with them all would take more than {} bytes", eventsBeyondBound_,
                      KestoReportingSession::mostVolumeEventBytes);
        if (eventsUnpaid_ != 0)
            KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Error,
                      "{} volume events are lost for lack of memory", eventsUnpaid_);
        return events;
    }

private:
    // A value of the state, and whether an event with it has been paid for.
    struct Unpacked {
        Value value;
        bool isPaidFor = false;
    };

    [[nodiscard]] bool changesOutput(const Fields& payload) const
    {
        return changesText(payload, Key::SelectedFormat) || changesText(payload, Key::ActiveDevices)
            || changesNumber(payload, Key::SpatializationEnabled) || changesNumber(payload, Key::RingerState)
            || changesVolume(payload);
    }

    [[nodiscard]] bool changesText(const Fields& payload, Key key) const
    {
        return payload.has(key) && !payload.isSame(state_, key)
            && payload.value(key).text() != state_.value(key).text();
    }

    [[nodiscard]] bool changesNumber(const Fields& payload, Key key) const
    {
        return payload.has(key) && payload.number(key) != state_.number(key);
    }

    [[nodiscard]] bool changesVolume(const Fields& payload) const
    {
        return payload.has(Key::Volume) && state_.has(Key::Volume)
            && payload.value(Key::Volume) != state_.value(Key::Volume);
    }

    void merge(const Fields& payload)
    {
        for (std::size_t index = 0; index < stateValues_.size(); ++index)
            if (const auto key = static_cast<Key>(index); payload.has(key) && !payload.isSame(state_, key))
                stateValues_[index].reset();
        if (payload.has(Key::OutputRunning))
            stateIsRunning_ = payload.boolean(Key::OutputRunning);
        state_.merge(payload);
    }

    // A value is unpacked once, and all events share it until it changes: a million events may repeat what a client
    // said once.
    Unpacked& unpacked(Key key)
    {
        auto& unpacked = stateValues_[static_cast<std::size_t>(key)];
        if (!unpacked)
            unpacked = Unpacked{state_.value(key)};
        return *unpacked;
    }
    const Value& stateValue(Key key) { return unpacked(key).value; }

    void endSegment(double playTime)
    {
        if (!(playTime > minimumPlaytime_) || !process_ || !state_.has(Key::Volume)) {
            KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug,
                      "skipped volume message, too short {{ func={}, action=skip, count={} }}", functionName,
                      events_.size());
            return;
        }
        if (!makeRoomForEvent())
            return;
        events_.push_back(makeEvent(playTime));
        KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug,
                  "added volume message {{ func={}, action=add, count={} }}", functionName, events_.size());
    }

    // All events together have a limit. An event takes, in bytes: 224 for a dictionary's object of 13 values; 8 for its
    // place in the list; twice 32 for the texts of its buckets, as the allocator rounds them up. The client's values
    // come on top: the first event with a value counts it in full. All others count only its text: they share it in
    // memory, but each writes it out.
    bool makeRoomForEvent()
    {
        constexpr std::size_t bytesOfAnEvent = 224 + 8 + 2 * 32;
        std::size_t bytes = bytesOfAnEvent + process_->stringView().size();
        for (const Key key : keysOfAnEvent)
            bytes += bytesBesideEvent(unpacked(key));
        const bool isWithinBound = bytes <= KestoReportingSession::mostVolumeEventBytes - bytesOfEvents_;
        const bool isPaidFor = isWithinBound && payFor(bytesOfEvents_ + bytes);
        if (!isPaidFor) {
            ++(isWithinBound ? eventsUnpaid_ : eventsBeyondBound_);
            return false;
        }
        bytesOfEvents_ += bytes;
        for (const Key key : keysOfAnEvent)
            unpacked(key).isPaidFor = true;
        return true;
    }

    // Without the place of the value itself, which `bytesOfAnEvent` contains.
    [[nodiscard]] static std::size_t bytesBesideEvent(const Unpacked& unpacked)
    {
        const bool isTextOnly = unpacked.isPaidFor && unpacked.value.kind() == Value::Kind::String;
        return isTextOnly ? unpacked.value.stringView().size() : unpacked.value.roughBytes() - sizeof(Value);
    }

    bool payFor(std::size_t bytes)
    {
        constexpr std::size_t paidAtOnce = std::size_t{16} << 10;
        const std::size_t paid = share_.bytes() + KestoReportingSession::unpaidVolumeEventBytes;
        return bytes <= paid || share_.grow(std::max(bytes - paid, paidAtOnce));
    }

    [[nodiscard]] ValuesOfEvent makeEvent(double playTime)
    {
        const auto bucketed = [](double number, std::span<const double> buckets, unsigned places) {
            return Value(*KestoReportingUtilityBucketNumberToString(number, buckets, places));
        };
        return {stateValue(Key::SelectedFormat),
                stateValue(Key::ActiveDevices),
                *process_,
                stateValue(Key::Volume),
                bucketed(stateValue(Key::Volume).asDouble(), KestoReportingUtilityBucketNumberToStringVolumes, 4),
                static_cast<float>(playTime),
                stateValue(Key::SpatialAudioAccessoryFeature),
                stateValue(Key::SpatializationEnabled),
                stateValue(Key::RingerState),
                stateValue(Key::ChannelsPerFrame),
                bucketed(playTime, KestoReportingUtilityBucketNumberToStringTimes, 0),
                events_.size() + 1,
                {}};
    }

    const std::optional<Value>& process_;
    const double minimumPlaytime_;
    session::StorageShare& share_;
    session::VolumeFieldsReader constants_;
    Fields state_;
    std::array<std::optional<Unpacked>, static_cast<std::size_t>(Key::Count)> stateValues_; // those that were asked for
    bool stateIsRunning_ = false;
    bool isRunning_ = false;
    std::optional<double> segmentStart_;
    std::deque<ValuesOfEvent> events_;
    std::size_t bytesOfEvents_ = 0;
    std::uint64_t eventsBeyondBound_ = 0;
    std::uint64_t eventsUnpaid_ = 0;
};

} // namespace

std::vector<Dictionary> KestoReportingSession::combineRapidMessages(const session::MessageStore& messages,
                                                                    std::span<const std::string_view> keysToCombine,
                                                                    double maximumPausetime)
{
    std::vector<Dictionary> combined;
    WholePayloads payloads{keysToCombine};
    session::combineRapidMessages(messages, maximumPausetime, payloads,
                                  [&](const Dictionary& payload) { combined.push_back(payload); });
    return combined;
}

std::vector<Dictionary> KestoReportingSession::createVolumeMessages(const session::MessageStore& messages,
                                                                    const std::optional<Value>& process,
                                                                    double minimumPlaytime,
                                                                    session::StorageShare& share)
{
    KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug, "entering createVolumeMessages {}", functionName);
    VolumePayloads payloads;
    VolumeAnalysis analysis(process, minimumPlaytime, share);
    session::combineRapidMessages(messages, longestPause, payloads,
                                  [&](const Fields& payload) { analysis.process(payload); });
    auto events = std::move(analysis).finish();
    KESTO_LOG(KestoReportingSessionBlinReportingCategory(), Debug,
              "returning volume message {{ func={}, action=return, count={} }}", functionName, events.size());
    return events;
}
