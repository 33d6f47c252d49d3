// SPDX-License-Identifier: Apache-2.0
// How long a client waits for the status while the service is busy: no other call may hold it up.
#include "Groups.h"
#include "support/ServiceProcess.h"
#include "support/Waits.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <cstring>
#include <fmt/format.h>
#include <functional>
#include <optional>
#include <stdexcept>
#include <thread>

namespace bench {
namespace {

constexpr std::size_t messageCount = 1'000'000;
constexpr std::chrono::milliseconds pause(1); // between two requests, as of a client that watches closely

// Asks again and again, and notes how long each answer took.
class StatusClient {
public:
    explicit StatusClient(const ServiceProcess& service)
        : socket_(service.connect()),
          request_(frame(foundation::Array{1, "status"}))
    {
    }

    [[nodiscard]] double millisecondsOfOne()
    {
        const auto start = Clock::now();
        writeAll(socket_.get(), request_);
        std::array<char, 4> head = {};
        std::uint32_t size = 0;
        bool isWhole = readAll(socket_.get(), head.data(), head.size());
        std::memcpy(&size, head.data(), sizeof size);
        answer_.resize(size);
        isWhole = isWhole && readAll(socket_.get(), answer_.data(), size);
        if (!isWhole)
            throw std::runtime_error("the service did not answer");
        return nanosecondsSince(start) / 1e6;
    }

private:
    platform::FileDescriptor socket_;
    const std::string request_;
    std::string answer_;
};

// The waits while the work runs on another thread.
std::vector<double> waitsBeside(StatusClient& client, const std::function<void()>& work)
{
    std::vector<double> times;
    std::atomic<bool> isDone = false;
    const std::jthread worker([&] {
        work();
        isDone = true;
    });
    while (!isDone) {
        times.push_back(client.millisecondsOfOne());
        std::this_thread::sleep_for(pause);
    }
    return times;
}

// What the machine alone makes a client wait.
Waits waitsOfAnIdleService(const BenchOptions& options)
{
    constexpr std::chrono::milliseconds duration(200);
    const ServiceProcess service(options);
    StatusClient status(service);
    Waits waits;
    for (int round = 0; round < options.rounds; ++round)
        waits.add(waitsBeside(status, [&] { std::this_thread::sleep_for(duration); }));
    return waits;
}

void add(const BenchOptions& options, std::string_view beside, Waits waits, Report& report)
{
    Waits idle = waitsOfAnIdleService(options);
    const auto add = [&](std::string_view which, std::vector<double> times, std::vector<double> ofIdle) {
        report.add({fmt::format("status beside {}, {}", beside, which), "ms", std::move(times),
                    PeerFigure{"of an idle service", std::move(ofIdle)}, Target::figureAtMost(1)});
    };
    add("median", std::move(waits.median), std::move(idle.median));
    add("99th percentile", std::move(waits.percentile99), std::move(idle.percentile99));
    add("longest", std::move(waits.longest), std::move(idle.longest));
}

// The client's end stops its session; the trips of another client show when that is over.
void measureStop(const BenchOptions& options, Report& report)
{
    const ServiceProcess service(options, "used = []", ServiceProcess::Build::Internal);
    StatusClient status(service);
    RawClient other = service.makeClient();
    Waits waits;
    for (int round = 0; round < options.rounds; ++round) {
        showProgress(fmt::format("status beside a stop: round {} of {}", round + 1, options.rounds));
        std::optional<RawClient> client(service.makeClient());
        client->pipeline(messageCount);
        waits.add(waitsBeside(status, [&] {
            constexpr int trips = 20;
            client.reset();
            for (int trip = 0; trip < trips; ++trip) {
                other.roundTrip();
                std::this_thread::sleep_for(pause);
            }
        }));
    }
    add(options, fmt::format("a stop of {} messages", messageCount), std::move(waits), report);
}

void measureFlood(const BenchOptions& options, Report& report, std::string_view analytics, std::string_view what,
                  std::size_t count)
{
    const ServiceProcess service(options, analytics);
    StatusClient status(service);
    Waits waits;
    for (int round = 0; round < options.rounds; ++round) {
        showProgress(fmt::format("status beside {}: round {} of {}", what, round + 1, options.rounds));
        RawClient client = service.makeClient();
        waits.add(waitsBeside(status, [&] { client.pipeline(count); }));
    }
    add(options, what, std::move(waits), report);
}

} // namespace

void measureStatusRequest(const BenchOptions& options, Report& report)
{
    measureStop(options, report);
    measureFlood(options, report, "used = []", "a flood of messages", messageCount);
    measureFlood(options, report, "used = [\"*\"]", "a flood of stored messages", messageCount / 10);
    clearProgress();
}

} // namespace bench
