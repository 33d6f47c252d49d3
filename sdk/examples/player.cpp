// A tiny player that reports what it plays, and goes on reporting after a restart of the service.
//
//     c++ -std=c++17 player.cpp $(pkg-config --cflags --libs kesto) -o player && ./player
//
// It does not play: where a real player would start its output, it only sends "Playback", "Start", and so on.
#include <kesto/kesto.hpp>

#include <chrono>
#include <cstdlib>
#include <iostream>
#include <random>
#include <thread>

namespace {

class Player {
public:
    Player()
    {
        message_.reserve(512); // so that the audio thread never allocates
        kesto::Options options;
        options.reconnect = true;
        options.stateChanged = [this](const kesto::StateChange& change) { stateChanged(change); };
        if (const kesto::Status status = client_.open(options); status != kesto::Status::Ok)
            std::cerr << "player: " << kesto::errorText(status) << '\n';
    }

    // A real player does this in its audio thread: no lock, no allocation, no system call.
    void report(bool running, kesto::EventType type)
    {
        message_.clear();
        message_.add("session_output_running", running).add("PomoSessionVolume", 0.8);
        message_.beginDictionary("session_selected_format").add("mChannelsPerFrame", 2).end();
        message_.beginArray("active_devices").append("Speaker").end();
        client_.send(message_, kesto::Category::Playback, type, reporter_);
    }

    bool finish()
    {
        client_.stopSession(reporter_);
        client_.destroySession(reporter_);
        const kesto::Status status = client_.close(std::chrono::seconds(5));
        const kesto::Statistics statistics = client_.statistics();
        std::cout << statistics.answered << " messages answered, " << statistics.lost << " lost\n";
        return status == kesto::Status::Ok;
    }

private:
    // On the client's thread. Every connection begins without sessions. Calls that are made here go before messages
    // that were sent while the client was connecting.
    void stateChanged(const kesto::StateChange& change)
    {
        if (change.state == kesto::State::Disconnected)
            std::cerr << "player: " << kesto::errorText(change.reason) << " (" << change.socketPath << ")\n";
        if (change.state != kesto::State::Connected)
            return;
        kesto::Message configuration;
        configuration.add("HostApplicationDisplayID", "org.example.player");
        client_.createSession(reporter_);
        client_.setServiceType(kesto::ServiceType::LongFormAudio, reporter_);
        client_.setConfiguration(configuration, reporter_);
        client_.startSession(reporter_, [](const kesto::Answer& answer) {
            if (answer.ok())
                std::cout << "the session's run has ended\n";
        });
    }

    static kesto::ReporterID randomReporter()
    {
        std::random_device random;
        return std::uniform_int_distribution<kesto::ReporterID>(1)(random);
    }

    const kesto::ReporterID reporter_ = randomReporter(); // unique in the whole system
    kesto::Message message_;
    kesto::Client client_; // declared last: its thread must end before the members that its callbacks use
};

} // namespace

int main()
{
    Player player;
    player.report(true, kesto::EventType::Start);
    std::this_thread::sleep_for(std::chrono::milliseconds(100)); // the music
    player.report(false, kesto::EventType::Stop);
    return player.finish() ? EXIT_SUCCESS : EXIT_FAILURE;
}
