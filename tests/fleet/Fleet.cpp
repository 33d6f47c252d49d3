// SPDX-License-Identifier: Apache-2.0
// Processes are started by the main thread only: they end with the thread that started them.
#include "fleet/Fleet.h"

#include <fmt/format.h>
#include <future>
#include <thread>

namespace fleet {

namespace {

using kesto_ingest::waitUntil;

std::string realName(std::size_t number)
{
    return fmt::format("real-{}", number + 1);
}

std::vector<std::string> credentialsOf(const Edition& edition)
{
    std::vector<std::string> names{shared, victim, forger};
    for (std::size_t number = 0; number < edition.realDevices; ++number)
        names.push_back(realName(number));
    return names;
}

} // namespace

Fleet::Fleet(const Edition& wanted, const std::filesystem::path& place)
    : edition(wanted),
      directory(place),
      broker(place / "broker", wanted.brokers, credentialsOf(wanted)),
      database(place / "database", wanted.shards, wanted.replicas)
{
    constexpr int redeliverSeconds = 5;
    setUpStreams(directory / "setup", broker.configuredAddresses(), edition.brokers, redeliverSeconds);
    for (std::size_t number = 0; number < edition.devices; ++number)
        devices.push_back(std::make_unique<Device>(directory / fmt::format("device-{}", number),
                                                   number == 0 ? victim : shared, broker.addresses()));
    for (std::size_t number = 0; number < edition.realDevices; ++number)
        realDevices.push_back(
            std::make_unique<RealDevice>(directory / realName(number), realName(number), broker.configuredAddresses()));
    std::atomic<std::uint32_t> seed = 0;
    withDevices(devices.size(), [&](Device& device) { device.makeStore(++seed, edition.sessions); });
}

void Fleet::startIngests()
{
    for (int number = 0; number < edition.ingests; ++number)
        ingests.push_back(std::make_unique<IngestCopy>(directory / fmt::format("ingest-{}", number + 1),
                                                       broker.configuredAddresses(), database.configuredAddresses()));
}

void Fleet::endIngests()
{
    for (const auto& copy : ingests)
        copy->end();
    ingests.clear();
}

std::int64_t Fleet::metric(const std::string& beginning) const
{
    std::int64_t sum = 0;
    for (const auto& copy : ingests)
        sum += copy->metric(beginning);
    return sum;
}

void Fleet::withDevices(std::size_t count, const std::function<void(Device&)>& work)
{
    done_ = 0;
    std::atomic<std::size_t> next = 0;
    std::vector<std::future<void>> workers;
    for (std::size_t worker = 0; worker < edition.workers; ++worker)
        workers.push_back(std::async(std::launch::async, [&] {
            for (std::size_t number = next++; number < count && !isGivenUp_; number = next++) {
                work(*devices[number]);
                ++done_;
            }
        }));
    for (auto& worker : workers)
        worker.wait();
    for (auto& worker : workers)
        worker.get();
}

void Fleet::withDevicesWhile(std::size_t count, const std::function<void(Device&)>& work,
                             const std::function<void()>& happen)
{
    done_ = 0;
    auto all = std::async(std::launch::async, [&] { withDevices(count, work); });
    waitUntil("a quarter of the devices is done",
              [&] { return done_ >= count / 4 || all.wait_for(std::chrono::seconds(0)) == std::future_status::ready; });
    try {
        happen();
    } catch (...) {
        isGivenUp_ = true; // the others would wait for what does not come
        throw;
    }
    all.get();
}

Equality Fleet::settle()
{
    for (const auto& device : realDevices)
        device->uplink().awaitAllSent();
    waitUntil("the ingest has taken all from the stream", [this] {
        const StreamState state = broker.stream();
        return state.isComplete && state.waiting == 0;
    });
    database.awaitReplicas();
    Chapters chapters;
    const auto add = [&chapters](const Chapters& further) {
        chapters.insert(chapters.end(), further.begin(), further.end());
    };
    for (const auto& device : devices)
        add(device->chapters());
    for (const auto& device : realDevices)
        add({device->chapter()});
    for (const auto& uplink : furtherUplinks)
        add({uplink->chapter()});
    return compare(database, truth_.sums(chapters), chapters);
}

} // namespace fleet
