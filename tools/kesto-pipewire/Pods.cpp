// SPDX-License-Identifier: Apache-2.0
// A pod's type, size and number of elements are checked before its content is read, because clients of PipeWire write
// these.
#include "kesto-pipewire/Pods.h"

#include <fmt/format.h>
#include <spa/debug/types.h>
#include <spa/param/audio/format.h>
#include <spa/param/audio/type-info.h>
#include <spa/param/format-types.h>
#include <spa/param/profiler.h>
#include <spa/param/props.h>
#include <spa/pod/iter.h>
#include <spa/pod/parser.h>

#include <algorithm>
#include <array>
#include <cmath>

namespace kesto_pipewire {

namespace {

constexpr std::int32_t cycleFinished = 3; // a node's last step of a cycle, done in time

const spa_pod* findProperty(const spa_pod& object, std::uint32_t key)
{
    const auto* property = spa_pod_find_prop(&object, nullptr, key);
    if (!property)
        return nullptr;
    std::uint32_t count = 0;
    std::uint32_t choice = 0;
    const auto* values = spa_pod_get_values(&property->value, &count, &choice); // formats hold choices of one value
    return count > 0 ? values : nullptr;
}

std::optional<float> readFloat(const spa_pod& object, std::uint32_t key)
{
    float value = 0;
    const auto* pod = findProperty(object, key);
    return pod && spa_pod_get_float(pod, &value) == 0 ? std::optional(value) : std::nullopt;
}

std::optional<std::int32_t> readInteger(const spa_pod& object, std::uint32_t key)
{
    std::int32_t value = 0;
    const auto* pod = findProperty(object, key);
    return pod && spa_pod_get_int(pod, &value) == 0 ? std::optional(value) : std::nullopt;
}

std::optional<std::uint32_t> readID(const spa_pod& object, std::uint32_t key)
{
    std::uint32_t value = 0;
    const auto* pod = findProperty(object, key);
    return pod && spa_pod_get_id(pod, &value) == 0 ? std::optional(value) : std::nullopt;
}

std::optional<float> readLoudestChannel(const spa_pod& properties)
{
    std::array<float, SPA_AUDIO_MAX_CHANNELS> amplitudes{};
    const auto* pod = findProperty(properties, SPA_PROP_channelVolumes);
    // Copying relies on the array's own element size, so it is checked.
    if (!pod || !spa_pod_is_array(pod) || SPA_POD_ARRAY_VALUE_SIZE(pod) != sizeof(float))
        return std::nullopt;
    const auto count = spa_pod_copy_array(pod, SPA_TYPE_Float, amplitudes.data(), amplitudes.size());
    if (count == 0)
        return std::nullopt;
    return *std::max_element(amplitudes.begin(), amplitudes.begin() + count);
}

std::string shortName(const spa_type_info* types, std::uint32_t type)
{
    const auto* name = spa_debug_type_find_short_name(types, type);
    return name ? name : "unknown";
}

// One node's part of a cycle in the profiler's record.
struct Block {
    std::int32_t node = 0;
    std::int64_t signalBefore = 0; // the previous signal to begin
    std::int64_t signal = 0; // this signal to begin
    std::int64_t awake = 0; // when it woke up
    std::int64_t finish = 0;
    std::int32_t status = 0; // the step that it reached
};

std::optional<Block> readBlock(const spa_pod& pod)
{
    spa_pod_parser parser;
    spa_pod_frame frame;
    Block block;
    const char* name = nullptr;
    spa_pod_parser_pod(&parser, &pod);
    if (spa_pod_parser_push_struct(&parser, &frame) < 0 || spa_pod_parser_get_int(&parser, &block.node) < 0
        || spa_pod_parser_get_string(&parser, &name) < 0)
        return std::nullopt;
    for (auto* time : {&block.signalBefore, &block.signal, &block.awake, &block.finish})
        if (spa_pod_parser_get_long(&parser, time) < 0)
            return std::nullopt;
    if (spa_pod_parser_get_int(&parser, &block.status) < 0)
        return std::nullopt;
    return block;
}

// A time belongs to an earlier cycle if the node has not reached that step in this cycle.
std::optional<std::int64_t> workOf(const Block& block)
{
    const bool isOfThisCycle = block.awake > 0 && block.awake >= block.signal && block.finish >= block.awake;
    return isOfThisCycle ? std::optional(block.finish - block.awake) : std::nullopt;
}

NodeCycle nodeCycleOf(const Block& block, bool isLate)
{
    return {.node = static_cast<ObjectID>(block.node), .workNanoseconds = workOf(block), .isLate = isLate};
}

// The clock's flags, ID and name, and then when the cycle began.
std::optional<std::int64_t> readCycleBegin(const spa_pod& clock)
{
    spa_pod_parser parser;
    spa_pod_frame frame;
    std::int32_t ignored = 0;
    const char* name = nullptr;
    std::int64_t began = 0;
    spa_pod_parser_pod(&parser, &clock);
    if (spa_pod_parser_push_struct(&parser, &frame) < 0 || spa_pod_parser_get_int(&parser, &ignored) < 0
        || spa_pod_parser_get_int(&parser, &ignored) < 0 || spa_pod_parser_get_string(&parser, &name) < 0
        || spa_pod_parser_get_long(&parser, &began) < 0)
        return std::nullopt;
    return began;
}

template <typename Visit> void forEachProperty(const spa_pod& object, Visit visit)
{
    const auto* body = static_cast<const spa_pod_object_body*>(SPA_POD_BODY_CONST(&object));
    const spa_pod_prop* property = nullptr;
    SPA_POD_OBJECT_BODY_FOREACH(body, SPA_POD_BODY_SIZE(&object), property)
    visit(property->key, property->value);
}

template <typename Visit> void forEachMember(const spa_pod& structure, Visit visit)
{
    const auto* first = static_cast<const spa_pod*>(SPA_POD_BODY_CONST(&structure));
    const spa_pod* member = nullptr;
    SPA_POD_FOREACH(first, SPA_POD_BODY_SIZE(&structure), member)
    visit(*member);
}

} // namespace

double userVolume(double amplitude)
{
    if (!(amplitude > 0)) // also false for NaN
        return 0;
    return std::round(std::min(std::cbrt(amplitude), 1.0) * 1e4) / 1e4;
}

std::optional<double> readVolume(const spa_pod& properties)
{
    if (!spa_pod_is_object(&properties))
        return std::nullopt;
    const auto whole = readFloat(properties, SPA_PROP_volume);
    const auto loudest = readLoudestChannel(properties);
    if (!whole && !loudest)
        return std::nullopt;
    bool isMuted = false;
    if (const auto* mute = findProperty(properties, SPA_PROP_mute))
        spa_pod_get_bool(mute, &isMuted);
    return isMuted ? 0 : userVolume(double{whole.value_or(1)} * double{loudest.value_or(1)});
}

std::optional<StreamFormat> readFormat(const spa_pod& format)
{
    if (!spa_pod_is_object(&format) || readID(format, SPA_FORMAT_mediaType) != SPA_MEDIA_TYPE_audio)
        return std::nullopt;
    StreamFormat result;
    if (const auto sample = readID(format, SPA_FORMAT_AUDIO_format))
        result.text = shortName(spa_type_audio_format, *sample);
    else
        result.text = shortName(spa_type_media_subtype, readID(format, SPA_FORMAT_mediaSubtype).value_or(0));
    if (const auto rate = readInteger(format, SPA_FORMAT_AUDIO_rate))
        result.text += fmt::format("/{}", *rate);
    if (const auto channels = readInteger(format, SPA_FORMAT_AUDIO_channels)) {
        result.text += fmt::format("/{}", *channels);
        result.channels = *channels;
    }
    return result;
}

std::optional<std::int32_t> readRate(const spa_pod& format)
{
    const bool isAudio = spa_pod_is_object(&format) && readID(format, SPA_FORMAT_mediaType) == SPA_MEDIA_TYPE_audio;
    return isAudio ? readInteger(format, SPA_FORMAT_AUDIO_rate) : std::nullopt;
}

void readCycles(const spa_pod& profile, const std::function<void(const Cycle&)>& handle)
{
    if (!spa_pod_is_struct(&profile))
        return;
    forEachMember(profile, [&](const spa_pod& object) {
        if (!spa_pod_is_object_type(&object, SPA_TYPE_OBJECT_Profiler))
            return;
        Cycle cycle;
        std::optional<std::int64_t> began;
        std::optional<Block> driver;
        forEachProperty(object, [&](std::uint32_t key, const spa_pod& value) {
            if (key == SPA_PROFILER_clock)
                began = readCycleBegin(value);
            else if (key == SPA_PROFILER_driverBlock)
                driver = readBlock(value);
            else if (key == SPA_PROFILER_followerBlock)
                if (const auto follower = readBlock(value))
                    cycle.followers.push_back(nodeCycleOf(*follower, follower->status != cycleFinished));
        });
        if (!began || (driver && driver->signal == driver->signalBefore))
            return;
        cycle.began = *began;
        if (driver) { // the record of a missed cycle already has the next cycle's clock
            cycle.began = driver->signal;
            cycle.driver = nodeCycleOf(*driver, false); // its own status is that of the cycle that is being reported
        }
        handle(cycle);
    });
}

} // namespace kesto_pipewire
