// What a pod claims of its type, its size and its number of elements is looked at before anything is taken from it:
// clients of PipeWire write these.
#include "kesto-pipewire/Pods.h"

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
    // Copying trusts what the array says of its elements' size.
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

// One node's part of a cycle: its ID, its name, four times and how far it came.
std::optional<NodeCycle> readNodeCycle(const spa_pod& block)
{
    spa_pod_parser parser;
    spa_pod_frame frame;
    std::int32_t node = 0;
    const char* name = nullptr;
    std::array<std::int64_t, 4> times{}; // the signal before, the signal, awake, finish
    std::int32_t status = 0;
    spa_pod_parser_pod(&parser, &block);
    if (spa_pod_parser_push_struct(&parser, &frame) < 0 || spa_pod_parser_get_int(&parser, &node) < 0
        || spa_pod_parser_get_string(&parser, &name) < 0)
        return std::nullopt;
    for (auto& time : times)
        if (spa_pod_parser_get_long(&parser, &time) < 0)
            return std::nullopt;
    if (spa_pod_parser_get_int(&parser, &status) < 0)
        return std::nullopt;
    NodeCycle cycle{.node = static_cast<ObjectID>(node), .isLate = status != cycleFinished};
    const auto [signalBefore, signal, awake, finish] = times;
    if (awake > 0 && finish >= awake) // of a node that has not finished they are the cycle's before
        cycle.workNanoseconds = finish - awake;
    return cycle;
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
    if (!(amplitude > 0)) // nor a number at all
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
        result.text += "/" + std::to_string(*rate);
    if (const auto channels = readInteger(format, SPA_FORMAT_AUDIO_channels)) {
        result.text += "/" + std::to_string(*channels);
        result.channels = *channels;
    }
    return result;
}

void readCycles(const spa_pod& profile, const std::function<void(const Cycle&)>& tell)
{
    if (!spa_pod_is_struct(&profile))
        return;
    forEachMember(profile, [&](const spa_pod& object) {
        if (!spa_pod_is_object_type(&object, SPA_TYPE_OBJECT_Profiler))
            return;
        Cycle cycle;
        std::optional<std::int64_t> began;
        std::optional<NodeCycle> driver;
        forEachProperty(object, [&](std::uint32_t key, const spa_pod& value) {
            if (key == SPA_PROFILER_clock)
                began = readCycleBegin(value);
            else if (key == SPA_PROFILER_driverBlock)
                driver = readNodeCycle(value);
            else if (key == SPA_PROFILER_followerBlock)
                if (const auto follower = readNodeCycle(value))
                    cycle.nodes.push_back(*follower);
        });
        if (!began)
            return;
        cycle.began = *began;
        if (driver) { // whose own status is that of a cycle which is just being told
            driver->isLate = std::ranges::any_of(cycle.nodes, &NodeCycle::isLate);
            cycle.nodes.push_back(*driver);
        }
        tell(cycle);
    });
}

} // namespace kesto_pipewire
