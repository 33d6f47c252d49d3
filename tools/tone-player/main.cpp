// SPDX-License-Identifier: Apache-2.0
// tone-player: a player for tests and demonstrations, because common players cannot be paused from a script.
//
//   tone-player [ROLE [NAME]]
//
// Plays a quiet tone through PipeWire until its standard input ends, and obeys the lines it reads there: "pause" and
// "play". ROLE is the stream's `media.role`, "Music" if it is not given, NAME its application's name. It is an ordinary
// stream, and does not depend on reporting.

#include "kesto-pipewire/Loop.h"

#include <pipewire/pipewire.h>
#include <spa/param/audio/format-utils.h>

#include <unistd.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <exception>
#include <numbers>
#include <span>
#include <string>
#include <utility>

namespace {

constexpr std::uint32_t rate = 44100;
constexpr std::uint32_t channels = 2;
constexpr double frequency = 440;
constexpr double amplitude = 0.1;

struct Player {
    pw_stream* stream = nullptr;
    double phase = 0;
};

// On PipeWire's own real-time thread.
void fill(void* data)
{
    auto& player = *static_cast<Player*>(data);
    auto* buffer = pw_stream_dequeue_buffer(player.stream);
    if (!buffer)
        return;
    auto& memory = buffer->buffer->datas[0];
    constexpr auto frameBytes = channels * sizeof(std::int16_t);
    auto frames = memory.data ? std::uint64_t{memory.maxsize} / frameBytes : 0;
    if (buffer->requested > 0)
        frames = std::min(frames, buffer->requested);
    const std::span samples(static_cast<std::int16_t*>(memory.data), frames * channels);
    for (std::size_t i = 0; i < samples.size(); i += channels) {
        samples[i] = samples[i + 1] = static_cast<std::int16_t>(32767 * amplitude * std::sin(player.phase));
        player.phase = std::fmod(player.phase + 2 * std::numbers::pi * frequency / rate, 2 * std::numbers::pi);
    }
    memory.chunk->offset = 0;
    memory.chunk->stride = frameBytes;
    memory.chunk->size = static_cast<std::uint32_t>(samples.size_bytes());
    pw_stream_queue_buffer(player.stream, buffer);
}

pw_stream_events streamEvents()
{
    pw_stream_events events{};
    events.version = PW_VERSION_STREAM_EVENTS;
    events.process = fill;
    return events;
}

bool connect(pw_stream* stream)
{
    std::array<std::uint8_t, 1024> bytes{};
    spa_pod_builder builder{};
    spa_pod_builder_init(&builder, bytes.data(), sizeof bytes);
    spa_audio_info_raw format{};
    format.format = SPA_AUDIO_FORMAT_S16_LE;
    format.rate = rate;
    format.channels = channels;
    const auto* parameter = spa_format_audio_raw_build(&builder, SPA_PARAM_EnumFormat, &format);
    const auto flags = PW_STREAM_FLAG_AUTOCONNECT | PW_STREAM_FLAG_MAP_BUFFERS | PW_STREAM_FLAG_RT_PROCESS;
    return pw_stream_connect(stream, PW_DIRECTION_OUTPUT, PW_ID_ANY, static_cast<pw_stream_flags>(flags), &parameter, 1)
        == 0;
}

int play(const char* role, const char* name)
{
    kesto_pipewire::Loop loop;
    const auto events = streamEvents();
    Player player;
    player.stream = pw_stream_new_simple(loop.raw(), "tone",
                                         pw_properties_new(PW_KEY_MEDIA_TYPE, "Audio", PW_KEY_MEDIA_CATEGORY,
                                                           "Playback", PW_KEY_MEDIA_ROLE, role, PW_KEY_APP_NAME, name,
                                                           PW_KEY_NODE_NAME, name, nullptr),
                                         &events, &player);
    if (!player.stream || !connect(player.stream)) {
        std::fputs("tone-player: PipeWire is not running\n", stderr);
        return 1;
    }

    std::string line;
    const auto commands = loop.addReadable(STDIN_FILENO, [&] {
        std::array<char, 256> read{};
        const auto size = ::read(STDIN_FILENO, read.data(), read.size());
        if (size <= 0)
            return loop.quit();
        for (const auto character : std::span(read).first(static_cast<std::size_t>(size))) {
            if (character != '\n')
                line += character;
            else if (const auto command = std::exchange(line, {}); command == "pause" || command == "play")
                pw_stream_set_active(player.stream, command == "play");
        }
    });
    const auto terminate = loop.addSignal(SIGTERM, [&loop] { loop.quit(); });
    loop.run();
    pw_stream_destroy(player.stream);
    return 0;
}

} // namespace

#ifdef __SANITIZE_ADDRESS__
// Switches off the leak check at the program's end, because it sometimes waits for ever for an ending thread of
// PipeWire's library.
extern "C" int __lsan_is_turned_off() // NOLINT(bugprone-reserved-identifier): the sanitizer's name
{
    return 1;
}
#endif

int main(int argumentCount, char** arguments)
{
    pw_init(nullptr, nullptr);
    int status = 1;
    try {
        status = play(argumentCount > 1 ? arguments[1] : "Music", argumentCount > 2 ? arguments[2] : "tone-player");
    } catch (const std::exception& error) {
        std::fprintf(stderr, "tone-player: %s\n", error.what());
    }
    pw_deinit();
    return status;
}
