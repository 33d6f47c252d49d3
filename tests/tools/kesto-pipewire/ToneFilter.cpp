// SPDX-License-Identifier: Apache-2.0
// tone-filter: a program for tests that plays or records as JACK's programs do: PipeWire links its ports only as it is
// asked to, and its node has no class.
//
//   tone-filter OUTPUTS INPUTS
//
// Has that many ports for sound, and one output port for MIDI; puts a quiet tone on the outputs until its standard
// input ends. The node's name is "tone-filter".

#include "kesto-pipewire/Loop.h"

#include <pipewire/filter.h>
#include <pipewire/pipewire.h>

#include <unistd.h>

#include <array>
#include <csignal>
#include <cstdint>
#include <cstdio>
#include <exception>
#include <span>
#include <string>
#include <vector>

namespace {

constexpr auto sound = "32 bit float mono audio";
constexpr auto midi = "8 bit raw midi";

struct Filter {
    pw_filter* filter = nullptr;
    std::vector<void*> outputs;
};

// On PipeWire's own real-time thread.
void fill(void* data, spa_io_position* position)
{
    constexpr std::uint64_t period = 100; // frames
    const auto frames = position->clock.duration;
    for (auto* port : static_cast<Filter*>(data)->outputs)
        if (auto* samples = static_cast<float*>(pw_filter_get_dsp_buffer(port, static_cast<std::uint32_t>(frames))))
            for (std::uint64_t frame = 0; frame < frames; ++frame)
                samples[frame] = 0.001F * static_cast<float>(frame % period);
}

void* addPort(Filter& filter, pw_direction direction, const char* format, const std::string& name)
{
    return pw_filter_add_port(filter.filter, direction, PW_FILTER_PORT_FLAG_MAP_BUFFERS, sizeof(std::uint64_t),
                              pw_properties_new(PW_KEY_FORMAT_DSP, format, PW_KEY_PORT_NAME, name.c_str(), nullptr),
                              nullptr, 0);
}

int run(int outputs, int inputs)
{
    kesto_pipewire::Loop loop;
    Filter filter;
    pw_filter_events events{};
    events.version = PW_VERSION_FILTER_EVENTS;
    events.process = fill;
    filter.filter =
        pw_filter_new_simple(loop.raw(), "tone-filter", pw_properties_new(nullptr, nullptr), &events, &filter);
    if (!filter.filter)
        return 1;
    for (int port = 1; port <= outputs; ++port)
        filter.outputs.push_back(addPort(filter, PW_DIRECTION_OUTPUT, sound, "output_" + std::to_string(port)));
    for (int port = 1; port <= inputs; ++port)
        addPort(filter, PW_DIRECTION_INPUT, sound, "input_" + std::to_string(port));
    addPort(filter, PW_DIRECTION_OUTPUT, midi, "midi");
    if (pw_filter_connect(filter.filter, PW_FILTER_FLAG_RT_PROCESS, nullptr, 0) != 0)
        return 1;

    const auto input = loop.addReadable(STDIN_FILENO, [&loop] {
        std::array<char, 256> ignored{};
        if (::read(STDIN_FILENO, ignored.data(), ignored.size()) <= 0)
            loop.quit();
    });
    const auto terminate = loop.addSignal(SIGTERM, [&loop] { loop.quit(); });
    loop.run();
    pw_filter_destroy(filter.filter);
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
        const std::span words(arguments, static_cast<std::size_t>(argumentCount));
        status = words.size() == 3 ? run(std::stoi(words[1]), std::stoi(words[2])) : status;
    } catch (const std::exception& error) {
        std::fprintf(stderr, "tone-filter: %s\n", error.what());
    }
    pw_deinit();
    return status;
}
