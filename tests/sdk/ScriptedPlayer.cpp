// SPDX-License-Identifier: Apache-2.0
// A player that does what its input says, so that a test can let the service go and come back in between: "start",
// "pause", "resume", "stop", "volume 0.5", "route headset", "play 3" (seconds), "flush" (waits until the service has it
// all), "await connected", "await disconnected" and "say done". It ends with its input.
#include <kesto/playback.hpp>

#include <iostream>
#include <string>
#include <thread>

// Without sleeping, which would count as playing.
static void await(const kesto::Client& client, kesto::State state)
{
    while (client.state() != state)
        std::this_thread::yield();
}

int main()
{
    kesto::Options options;
    options.reconnect = true;
    options.firstRetry = std::chrono::milliseconds(5);
    options.longestRetry = std::chrono::milliseconds(5);
    kesto::Client client;
    if (client.open(options) != kesto::Status::Ok)
        return 1;
    kesto::Playback playback(client, "player", kesto::ServiceType::LongFormAudio);
    std::string argument;
    for (std::string word; std::cin >> word;) {
        kesto::Status status = kesto::Status::Ok;
        if (word == "start")
            status = playback.start({"S16LE", 44100, 2}, "speaker");
        else if (word == "pause")
            status = playback.pause();
        else if (word == "resume")
            status = playback.resume();
        else if (word == "stop")
            status = playback.stop();
        else if (word == "volume" && std::cin >> argument)
            status = playback.volume(std::stod(argument));
        else if (word == "route" && std::cin >> argument)
            status = playback.route(argument.c_str());
        else if (word == "play" && std::cin >> argument)
            std::this_thread::sleep_for(std::chrono::seconds(std::stoi(argument)));
        else if (word == "flush")
            status = client.flush(std::chrono::seconds(20));
        else if (word == "await" && std::cin >> argument)
            await(client, argument == "connected" ? kesto::State::Connected : kesto::State::Disconnected);
        else if (word == "say" && std::cin >> argument)
            std::cout << argument << std::endl;
        if (status != kesto::Status::Ok) {
            std::cerr << word << ": " << kesto::errorText(status) << std::endl;
            return 1;
        }
    }
    return client.close(std::chrono::seconds(20)) == kesto::Status::Ok ? 0 : 1;
}
