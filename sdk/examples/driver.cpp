// SPDX-License-Identifier: Apache-2.0
// A tiny driver helper that publishes a mixer's statistics: how many cycles were late, how long cycles take, and
// whether it runs. The service reports at the end of each session how these changed.
//
//     c++ driver.cpp $(pkg-config --cflags --libs kesto) -o driver && ./driver
//
// It does not mix: where a real mixer would have a callback from its device, it only counts.
#include <kesto/channels.hpp>

#include <cstdint>
#include <cstdlib>
#include <iostream>

namespace {

class Mixer {
public:
    enum State : std::size_t { Idle, Running };

    kesto::Status publish(const kesto::Publisher& publisher)
    {
        auto status = late_.create(publisher, {"mixer", "Tx", "", "late cycles"});
        if (status == kesto::Status::Ok)
            status = duration_.create(publisher, {"mixer", "Tx", "", "cycle time"}, "us", {0, 100, 1000, 10000});
        if (status == kesto::Status::Ok)
            status = state_.create(publisher, {"mixer", "Speaker", "", "state"}, {"Idle", "Running"}, Idle);
        return status;
    }

    void enter(State state) { state_.enter(state); }

    // A real helper does this in its real-time thread: no lock, no allocation, no wait.
    void finishCycle(std::int64_t microseconds)
    {
        duration_.record(microseconds);
        if (microseconds > 1000)
            late_.add(1);
    }

private:
    kesto::SimpleChannel late_;
    kesto::HistogramChannel duration_;
    kesto::StateChannel state_;
};

} // namespace

int main()
{
    kesto::Publisher publisher;
    Mixer mixer; // declared after its publisher, so that it is destroyed first
    auto status = publisher.open();
    if (status == kesto::Status::Ok)
        status = mixer.publish(publisher);
    if (status == kesto::Status::Ok) {
        mixer.enter(Mixer::Running);
        for (std::int64_t cycle = 0; cycle < 100; ++cycle)
            mixer.finishCycle(cycle * 20);
        status = publisher.flush(); // a real helper leaves this to the publisher's thread
    }
    if (status != kesto::Status::Ok) {
        std::cerr << "driver: " << kesto::errorText(status) << '\n';
        return EXIT_FAILURE;
    }
    std::cout << "published; press return to take it away" << std::endl;
    std::cin.get();
    return EXIT_SUCCESS;
}
