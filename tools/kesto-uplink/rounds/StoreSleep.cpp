// SPDX-License-Identifier: Apache-2.0
// While it sleeps for a time, changes gather in the watch and wake nobody.
#include "kesto-uplink/rounds/StoreSleep.h"

#include <poll.h>
#include <sys/eventfd.h>

#include <algorithm>
#include <array>
#include <chrono>
#include <cmath>
#include <utility>

namespace kesto_uplink {

StoreSleep::StoreSleep(std::filesystem::path database)
    : database_(std::move(database)),
      ended_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK))
{
    watch();
}

void StoreSleep::watch()
{
    try {
        watch_.emplace(database_);
    } catch (const EventStoreError&) {
        watch_.reset(); // the service has not run yet: looked for again after the next interval
    }
}

bool StoreSleep::sleep(double seconds)
{
    constexpr double longest = 1'000'000; // in milliseconds an int
    pollfd ended{ended_.get(), POLLIN, 0};
    const auto end = std::chrono::steady_clock::now() + std::chrono::duration<double>(std::min(seconds, longest));
    while (true) {
        const std::chrono::duration<double, std::milli> left = end - std::chrono::steady_clock::now();
        if (::poll(&ended, 1, std::max(0, static_cast<int>(std::ceil(left.count())))) > 0)
            return false;
        if (left.count() <= 0)
            return true;
    }
}

bool StoreSleep::untilNews()
{
    if (!watch_) {
        watch();
        return true;
    }
    std::array<pollfd, 2> watched{pollfd{ended_.get(), POLLIN, 0}, pollfd{watch_->descriptor(), POLLIN, 0}};
    while (::poll(watched.data(), watched.size(), -1) < 0) { } // a signal
    while (watch_->wait(std::chrono::milliseconds(0))) { }
    return watched[0].revents == 0;
}

void StoreSleep::end()
{
    ::eventfd_write(ended_.get(), 1);
}

} // namespace kesto_uplink
