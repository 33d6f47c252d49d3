// SPDX-License-Identifier: Apache-2.0
// Faults in random order on a real service, for as long as asked. The same seed gives the same faults in the same
// order; what the service does at their moments is chance.
//
// Ends with 0 if all sums held after each round, with 1 if one broke, and with 2 if something else went wrong.
#include "soak/Rounds.h"

#include <CLI/CLI.hpp>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <random>
#include <unistd.h>

namespace soak {
namespace {

using Clock = std::chrono::steady_clock;
using ledger::Counter;

constexpr std::size_t mostOfLog = 20'000; // bytes that are shown, from its end

// One line that changes on a terminal, and a line a minute elsewhere.
class Progress {
public:
    explicit Progress(std::uint64_t seconds) : seconds_(seconds) { }
    ~Progress() { end(); }
    Progress(const Progress&) = delete;
    Progress& operator=(const Progress&) = delete;

    void show(const Rounds& rounds)
    {
        if (!isTerminal_ && Clock::now() < next_)
            return;
        next_ = Clock::now() + std::chrono::minutes(1);
        const auto past = std::chrono::duration_cast<std::chrono::seconds>(Clock::now() - begin_).count();
        fmt::print("{}{} of {} s: {} rounds, {} kills, {} messages answered{}", isTerminal_ ? "\r\033[K" : "", past,
                   seconds_, rounds.count(), rounds.kills(), rounds.known().answered.load(), isTerminal_ ? "" : "\n");
        std::fflush(stdout);
        isLineOpen_ = isTerminal_;
    }
    void end()
    {
        if (std::exchange(isLineOpen_, false))
            fmt::print("\n");
    }

private:
    const bool isTerminal_ = ::isatty(STDOUT_FILENO) != 0;
    const std::uint64_t seconds_;
    const Clock::time_point begin_ = Clock::now();
    Clock::time_point next_ = begin_;
    bool isLineOpen_ = false;
};

void report(const Rounds& rounds)
{
    for (const auto& [name, count] : rounds.times())
        fmt::print("{:6} {}\n", count, name);
    const ledger::Account account = end_to_end::readLedger(rounds.kestod());
    fmt::print("{} messages sent, {} answered; {} kills\n", rounds.known().sent.load(), rounds.known().answered.load(),
               rounds.kills());
    fmt::print("deliveries {}; events {}: kept {}, unwanted {}, lost {}; removed {}; salvaged messages {}\n",
               account[Counter::Deliveries], account[Counter::Events], account[Counter::Kept],
               account[Counter::Unwanted], account.sum(ledger::Charge::Lost), account.sum(ledger::Charge::Removed),
               account[Counter::Salvaged]);
}

void reportLosses(const ledger::Account& account)
{
    for (const ledger::CounterRow& row : ledger::counterRows())
        if (ledger::chargeOf(row.counter) == ledger::Charge::Lost && account[row.counter] != 0)
            fmt::print("{}: {}\n", row.path, account[row.counter]);
    for (const auto& [culprit, count] : account.culprits[static_cast<std::size_t>(ledger::Charge::Lost)])
        fmt::print("lost by user {}, process \"{}\", application \"{}\": {}\n", culprit.user, culprit.process,
                   culprit.application, count);
}

void reportBroken(const Rounds& rounds, const std::vector<std::string>& broken, const Options& options)
{
    const std::string log = rounds.kestod().log();
    fmt::print("log of the service:\n{}\n", log.substr(log.size() - std::min(log.size(), mostOfLog)));
    reportLosses(end_to_end::readLedger(rounds.kestod()));
    for (const std::string& each : broken)
        fmt::print("BROKEN: {}\n", each);
    fmt::print("after round {}: {}\nto see it again: --seed {} --clients {}\n", rounds.count(),
               fmt::join(rounds.faultsOfLastRound(), ", "), options.seed, options.clients);
}

// What went wrong; also a service that ended or does not answer.
std::vector<std::string> problemsOfNext(Rounds& rounds)
{
    try {
        return rounds.next();
    } catch (const std::exception& error) {
        return {error.what()};
    }
}

int run(const Options& options, const std::filesystem::path& copy)
{
    fmt::print("seed {}\n", options.seed);
    Rounds rounds(options);
    if (!rounds.leftOut().empty())
        fmt::print("left out, because they need root: {}\n", fmt::join(rounds.leftOut(), ", "));
    Progress progress(options.seconds);
    const auto end = Clock::now() + std::chrono::seconds(options.seconds);
    do {
        const auto broken = problemsOfNext(rounds);
        progress.show(rounds);
        if (broken.empty())
            continue;
        progress.end();
        reportBroken(rounds, broken, options);
        if (!copy.empty())
            std::filesystem::copy(rounds.kestod().directory() / "state", copy,
                                  std::filesystem::copy_options::recursive);
        return 1;
    } while (Clock::now() < end);
    progress.end();
    report(rounds);
    fmt::print("all sums held after each of {} rounds\n", rounds.count());
    return 0;
}

} // namespace
} // namespace soak

int main(int argc, char** argv)
{
    soak::Options options{.seed = std::random_device()()};
    std::string copy;
    CLI::App app("Faults in random order on a real service under load, and the sums of its ledger after each three. "
                 "Ends with 1 if a sum does not hold.");
    app.add_option("--seconds,seconds", options.seconds, "how long")->capture_default_str()->check(CLI::PositiveNumber);
    app.add_option("--seed", options.seed, "the order of the faults; another each time if not given");
    app.add_option("--clients", options.clients, "how many clients send meanwhile")
        ->capture_default_str()
        ->check(CLI::Range(0, 100));
    app.add_option("--without", options.without, "leave out the fault of that name; may be given often");
    app.add_option("--copy", copy, "if a sum does not hold, copy the service's state to this new directory");
    CLI11_PARSE(app, argc, argv);
    try {
        return soak::run(options, copy);
    } catch (const std::exception& error) {
        fmt::print(stderr, "kesto_soak: {}\n", error.what());
        return 2;
    }
}
