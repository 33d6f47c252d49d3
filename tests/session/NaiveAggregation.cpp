// SPDX-License-Identifier: Apache-2.0
// Lists of dictionaries, searched from the beginning each time.
#include "session/NaiveAggregation.h"

#include <cmath>
#include <map>

namespace naive {

using foundation::Dictionary;
using foundation::Number;
using foundation::Value;

namespace {

Dictionary payloadOf(const Dictionary& message)
{
    return *message.begin()->value.dictionary();
}

Value valueOf(const Dictionary& dictionary, const char* key)
{
    const Value* value = dictionary.find(key);
    return value == nullptr ? Value() : *value;
}

double numberOf(const Dictionary& dictionary, const char* key)
{
    return valueOf(dictionary, key).asDouble();
}

// A number as it came, and any other value as it is read.
Number comparable(const Value& value)
{
    return value.number() ? *value.number() : Number(value.asDouble());
}

std::string nearest(double number, const std::vector<double>& buckets, const std::vector<std::string>& texts)
{
    std::size_t chosen = 0;
    while (chosen + 1 < buckets.size()
           && !(std::abs(number - buckets[chosen + 1]) > std::abs(number - buckets[chosen])))
        ++chosen;
    return texts[chosen];
}

std::string volumeBucket(double volume)
{
    return nearest(volume,
                   {0, 0.0625, 0.125, 0.1875, 0.25, 0.3125, 0.375, 0.4375, 0.5, 0.5625, 0.625, 0.6875, 0.75, 0.8125,
                    0.875, 0.9375, 1},
                   {"0.0", "0.0625", "0.125", "0.1875", "0.25", "0.3125", "0.375", "0.4375", "0.5", "0.5625", "0.625",
                    "0.6875", "0.75", "0.8125", "0.875", "0.9375", "1.0"});
}

std::string timeBucket(double seconds)
{
    return nearest(seconds, {0, 1, 5, 10, 30, 60, 300, 1800, 3600, 7200, 18000},
                   {"0", "1", "5", "10", "30", "60", "300", "1800", "3600", "7200", "18000"});
}

} // namespace

Messages combineRapidMessages(const Messages& messages, const std::vector<std::string>& keysToCombine,
                              double maximumPausetime)
{
    Messages result;
    std::optional<std::size_t> current;
    std::optional<double> lastBurstTime;
    for (const Dictionary& message : messages) {
        const Dictionary payload = payloadOf(message);
        bool isCombinable = false;
        for (const auto& key : keysToCombine)
            if (payload.contains(key))
                isCombinable = true;
        if (!isCombinable) {
            result.push_back(payload);
            continue;
        }
        if (!current) {
            result.emplace_back();
            current = result.size() - 1;
        }
        if (lastBurstTime && numberOf(payload, "kestoreporting_timestamp") - *lastBurstTime > maximumPausetime) {
            result.emplace_back();
            current = result.size() - 1;
        }
        for (const auto& [key, value] : payload)
            result[*current] = result[*current].with(key, value);
        lastBurstTime.reset();
        if (payload.contains("kestoreporting_timestamp"))
            lastBurstTime = numberOf(payload, "kestoreporting_timestamp");
    }
    return result;
}

VolumeMessages createVolumeMessages(const Messages& messages, const std::optional<Value>& process,
                                    double minimumPlaytime)
{
    const std::string function = "+[KestoReportingSession createVolumeMessages:process:minimumPlaytime:]";
    VolumeMessages result;
    const auto log = [&](const std::string& what, const std::string& action) {
        result.logLines.push_back(what + " { func=" + function + ", action=" + action
                                  + ", count=" + std::to_string(result.events.size()) + " }");
    };
    result.logLines.push_back("entering createVolumeMessages " + function);

    Dictionary state{{"session_selected_format", "unknown"},
                     {"active_devices", "unknown"},
                     {"spatial-audio-accessory-feature", false},
                     {"spatializationEnabled", false},
                     {"ringerstate", false},
                     {"mChannelsPerFrame", -1}};
    int nextIndex = 1;
    std::optional<double> segmentStart;
    bool runningNow = false;

    for (const Dictionary& m :
         combineRapidMessages(messages, {"spatial-audio-accessory-feature", "spatializationEnabled"}, 2.0)) {
        const double t = numberOf(m, "kestoreporting_timestamp");
        const bool wasRunning = valueOf(state, "session_output_running").asBoolean();
        bool changed = m.contains("session_duration");
        if (m.contains("session_output_running")) {
            runningNow = valueOf(m, "session_output_running").asBoolean();
            if (!wasRunning && runningNow)
                segmentStart = t;
            if (wasRunning && !runningNow)
                changed = true;
        } else if (m.contains("session_duration")) {
            runningNow = false;
        }
        if (runningNow) {
            for (const char* key : {"session_selected_format", "active_devices"})
                if (m.contains(key) && state.contains(key) && valueOf(m, key).text() != valueOf(state, key).text())
                    changed = true;
            for (const char* key : {"spatializationEnabled", "ringerstate"})
                if (m.contains(key) && comparable(valueOf(m, key)) != comparable(valueOf(state, key)))
                    changed = true;
            if (m.contains("PomoSessionVolume") && state.contains("PomoSessionVolume")
                && valueOf(m, "PomoSessionVolume") != valueOf(state, "PomoSessionVolume"))
                changed = true;
        }
        if (wasRunning && changed) {
            const double playTime = t - segmentStart.value_or(0);
            if (!(playTime > minimumPlaytime) || !process || !state.contains("PomoSessionVolume")) {
                log("skipped volume message, too short", "skip");
            } else {
                result.events.push_back(
                    {{"session_selected_format", valueOf(state, "session_selected_format")},
                     {"active_devices", valueOf(state, "active_devices")},
                     {"HostApplicationDisplayID", *process},
                     {"PomoSessionVolume", valueOf(state, "PomoSessionVolume")},
                     {"PomoSessionVolumeBucketed", volumeBucket(numberOf(state, "PomoSessionVolume"))},
                     {"play_seconds", static_cast<float>(playTime)},
                     {"spatial-audio-accessory-feature", valueOf(state, "spatial-audio-accessory-feature")},
                     {"spatializationEnabled", valueOf(state, "spatializationEnabled")},
                     {"ringerstate", valueOf(state, "ringerstate")},
                     {"mChannelsPerFrame", valueOf(state, "mChannelsPerFrame")},
                     {"play_secondsBucketed", timeBucket(playTime)},
                     {"msgidx", nextIndex++}});
                log("added volume message", "add");
            }
            segmentStart = t;
        }
        if (!runningNow)
            segmentStart.reset();
        for (const auto& [key, value] : m)
            state = state.with(key, value);
    }
    for (Dictionary& event : result.events)
        event = event.with("msgcnt", result.events.size());
    log("returning volume message", "return");
    return result;
}

std::optional<Dictionary> createSummaryEvent(const Messages& messages, int serviceType)
{
    if (messages.empty())
        return std::nullopt;
    std::vector<std::string> keys{"KESTO_Session_Summary_Event"};
    std::map<std::string, std::vector<std::string>> values{{keys[0], {std::to_string(serviceType)}}};
    for (const Dictionary& message : messages)
        for (const auto& [key, value] : payloadOf(message)) {
            const std::string name(key.view());
            if (!values.contains(name))
                keys.push_back(name);
            values[name].push_back(value.text());
        }
    Dictionary summary;
    for (const auto& key : keys) {
        std::string joined = values[key][0];
        for (std::size_t index = 1; index < values[key].size(); ++index)
            joined += "," + values[key][index];
        summary = summary.with(foundation::String(key), joined);
    }
    return summary;
}

} // namespace naive
