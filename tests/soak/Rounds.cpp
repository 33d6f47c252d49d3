// SPDX-License-Identifier: Apache-2.0
// The sums are compared when the load has ended. What a fault leaves to be repaired is repaired when events come, so
// some come until the sums hold.
#include "soak/Rounds.h"

#include "end_to_end/WireClient.h"

#include <csignal>
#include <fmt/format.h>
#include <numeric>
#include <stdexcept>
#include <thread>

namespace soak {
namespace {

using namespace end_to_end;
using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;
using ledger::Counter;

constexpr int faultsInARound = 3;
constexpr unsigned longestPause = 50; // between faults, in milliseconds
constexpr auto pauseOfReader = 50ms; // one that reads all the time would keep the log from starting again
constexpr const char* roomOnDisk = "768m"; // for bursts, too: the store shrinks when there is time

// A damaged store that was not looked at since shows it at the next check, which is once a day.
void passADay(Kestod& kestod)
{
    kestod.signal(SIGTERM);
    if (kestod.exitStatus() != 0)
        throw std::runtime_error("SIGTERM ended the service with another status than 0");
    std::filesystem::remove(kestod.directory() / "state" / "analytics.sqlite3-checked");
    kestod.startAndAwait();
}

} // namespace

Rounds::Rounds(const Options& options)
    : options_(options),
      disk_(kestod_.directory() / "state", roomOnDisk),
      random_(options.seed),
      scene_{.kestod = kestod_, .disk = disk_, .random = {}},
      faults_(allFaults(scene_))
{
    for (const std::string& name : options.without)
        if (std::erase_if(faults_.possible, [&](const Fault& fault) { return fault.name == name; }) == 0)
            throw std::invalid_argument("there is no fault \"" + name + "\"");
    kestod_.shiftClock(0s);
    kestod_.startAndAwait();
}

std::vector<std::string> Rounds::next()
{
    ++count_;
    last_.clear();
    scene_.isDamaged = false;
    {
        const Load load(kestod_.socketPath(), known_, options_.clients);
        for (int fault = 0; fault < faultsInARound; ++fault) {
            std::this_thread::sleep_for(std::chrono::milliseconds(random_() % longestPause));
            happen(choose());
        }
    }
    if (scene_.isDamaged)
        passADay(kestod_);
    return problems();
}

const Fault& Rounds::choose()
{
    const auto add = [](unsigned sum, const Fault& fault) { return sum + fault.weight; };
    unsigned place =
        static_cast<unsigned>(random_()) % std::accumulate(faults_.possible.begin(), faults_.possible.end(), 0U, add);
    auto fault = faults_.possible.begin();
    for (; place >= fault->weight; ++fault)
        place -= fault->weight;
    return *fault;
}

void Rounds::happen(const Fault& fault)
{
    last_.push_back(fault.name);
    ++times_[fault.name];
    scene_.random.seed(random_());
    fault.happen(scene_);
}

std::vector<std::string> Rounds::problems() const
{
    WireClient client(kestod_.socketPath());
    client.ask(Create, 1);
    std::vector<std::string> broken;
    Clock::time_point next;
    std::int64_t number = 0;
    const bool doHold = waitUntil([&] {
        if (Clock::now() >= next) {
            client.ask(SendMessage, foundation::Dictionary{{"last", ++number}}, 4, 1, foundation::Array{1});
            next = Clock::now() + 250ms;
        }
        try {
            broken = brokenSums(kestod_);
        } catch (const std::exception& error) { // the store is not there yet
            broken = {error.what()};
        }
        if (!broken.empty())
            std::this_thread::sleep_for(pauseOfReader);
        return broken.empty();
    });
    if (!doHold)
        return broken;
    const ledger::Account account = readLedger(kestod_);
    const std::uint64_t answered = known_.answered;
    if (account[Counter::Deliveries] < answered)
        broken.push_back(
            fmt::format("{} messages were answered, but {} are counted", answered, account[Counter::Deliveries]));
    if (account[Counter::Events] < 2 * answered)
        broken.push_back(
            fmt::format("{} messages were answered, but {} events are counted", answered, account[Counter::Events]));
    return broken;
}

} // namespace soak
