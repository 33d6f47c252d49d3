// SPDX-License-Identifier: Apache-2.0
// A tiny player that reports what it plays, and goes on reporting after a restart of the service.
//
//     c++ -std=c++17 player.cpp $(pkg-config --cflags --libs kesto) -o player && ./player
//
// It does not play: where a real player would play, it sleeps.
#include <kesto/playback.hpp>

#include <chrono>
#include <cstdlib>
#include <iostream>
#include <thread>

namespace {

void play(std::chrono::seconds duration)
{
    std::this_thread::sleep_for(duration);
}

} // namespace

int main()
{
    kesto::Options options;
    options.reconnect = true;
    options.stateChanged = [](const kesto::StateChange& change) { // on the client's thread
        if (change.state == kesto::State::Disconnected)
            std::cerr << "player: " << kesto::errorText(change.reason) << " (" << change.socketPath << ")\n";
    };
    kesto::Client client;
    if (const kesto::Status status = client.open(options); status != kesto::Status::Ok) {
        std::cerr << "player: " << kesto::errorText(status) << '\n';
        return EXIT_FAILURE;
    }

    // A real player makes these calls in any of its threads, also in its audio thread.
    kesto::Playback playback(client, "org.example.player", kesto::ServiceType::LongFormAudio);
    playback.volume(0.8);
    playback.start({"F32LE", 48000, 6}, "hdmi");
    play(std::chrono::seconds(3));
    playback.underrun(12, 0.25); // the sound had gaps
    playback.mute(true);
    play(std::chrono::seconds(2));
    playback.mute(false);
    play(std::chrono::seconds(1));
    playback.route("hdmi,speaker"); // on both at once
    playback.format({"F32LE", 48000, 2});
    play(std::chrono::seconds(6));
    playback.stop();

    return client.close(std::chrono::seconds(5)) == kesto::Status::Ok ? EXIT_SUCCESS : EXIT_FAILURE;
}
