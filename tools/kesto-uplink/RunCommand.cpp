// SPDX-License-Identifier: Apache-2.0
// `kesto-uplink run`: the service. The rounds have a thread of their own, so that a signal ends the program also while
// a round waits for servers. What is not noted then is sent again; so the program need not wait for its end.
#include "kesto-uplink/Commands.h"
#include "kesto-uplink/outbox/Outbox.h"
#include "kesto-uplink/rounds/Metered.h"
#include "kesto-uplink/rounds/Patience.h"
#include "kesto-uplink/rounds/Round.h"
#include "kesto-uplink/rounds/Rounds.h"
#include "kesto-uplink/rounds/Schedule.h"
#include "kesto-uplink/rounds/StoreSleep.h"
#include "kesto-uplink/rules/UplinkConfiguration.h"
#include "kesto-uplink/state/State.h"
#include "kesto-uplink/transport/JetStream.h"
#include "kesto/ExitStatus.h"

#include <fmt/format.h>
#include <systemd/sd-daemon.h>

#include <malloc.h>
#include <pthread.h>
#include <sysexits.h>
#include <unistd.h>

#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <future>
#include <memory>
#include <mutex>
#include <optional>
#include <random>
#include <set>
#include <string>
#include <utility>

namespace kesto_uplink {

namespace {

constexpr std::chrono::milliseconds mostTimeToEnd{1500};

void log(const std::string& line)
{
    fmt::print(stderr, "kesto-uplink: {}\n", line);
}

double wallClock()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

// Nobody sets this clock, and it goes on while the device sleeps.
double uptime()
{
    timespec now{};
    ::clock_gettime(CLOCK_BOOTTIME, &now);
    return static_cast<double>(now.tv_sec);
}

class OutboxSource : public Source {
public:
    OutboxSource(const Places& places, const UplinkConfiguration& configuration, const Identity& identity)
        : outbox_(places.database, configuration, identity)
    {
    }

    std::optional<Batch> next(const Cursor& after, const std::set<std::int64_t>& openSessions) override
    {
        return outbox_.next(after, openSessions, wallClock());
    }

private:
    Outbox outbox_;
};

// Why the uplink may not run; nothing if it may.
std::optional<std::string> reasonToBeOff(const Places& places, const CheckedUplinkConfiguration& checked)
{
    if (!checked.problems.empty())
        return fmt::format("{}", fmt::join(checked.problems, "\n"));
    if (!checked.configuration.enabled)
        return fmt::format("off: nothing leaves this device without enabled = true in {}",
                           places.configuration.native());
    return std::nullopt;
}

// The parts of the service, connected. Each round reads the configuration anew, so that a change counts without a new
// start.
class Service {
public:
    Service(const Places& places, double interval)
        : places_(places),
          state_(State::open(places.state, wallClock())),
          patience_(places.state / "waiting-since"),
          sleep_(places.database),
          schedule_(interval, [this] { return std::uniform_real_distribution(0.0, 1.0)(generator_); })
    {
    }

    void run()
    {
        runRounds([this] { return guardedRound(); }, schedule_, sleep_,
                  [this](const RoundResult& result) { report(result); });
    }

    // Any thread.
    void end()
    {
        sleep_.end();
        const std::scoped_lock lock(mutex_);
        isEnding_ = true;
        if (transport_)
            transport_->interrupt();
    }

private:
    RoundResult guardedRound()
    {
        try {
            return round();
        } catch (const StateError& error) {
            return {Outcome::Failed, error.what()};
        } catch (const EventStoreError& error) {
            return {Outcome::Failed, error.what()};
        } catch (const CredentialsError& error) {
            return {Outcome::Off, error.what()};
        }
    }

    RoundResult round()
    {
        const auto checked = readUplinkConfiguration(places_.configuration);
        const UplinkConfiguration& configuration = checked.configuration;
        if (auto reason = reasonToBeOff(places_, checked)) {
            state_.noteOff();
            return {Outcome::Off, *std::move(reason)};
        }
        state_.noteOn(wallClock());
        schedule_.setInterval(configuration.intervalSeconds);
        const auto transport =
            std::make_shared<JetStream>(Servers{.urls = configuration.servers, .authorities = configuration.ca},
                                        readCredentials(configuration.credentials));
        {
            const std::scoped_lock lock(mutex_);
            if (isEnding_)
                return {Outcome::Interrupted};
            transport_ = transport;
        }
        return Round(
                   {.forgetWhen = configuration.forgetWhen,
                    .maximumBytesADay = configuration.maximumBytesADay,
                    .pseudonymDays = configuration.pseudonymDays,
                    .hashKeyDays = configuration.hashKeyDays},
                   state_, patience_, *transport,
                   [&](const Identity& identity) {
                       return std::make_unique<OutboxSource>(places_, configuration, identity);
                   },
                   [this] { return Today{wallClock(), days_.day(wallClock(), uptime())}; },
                   [&] { return !configuration.metered && isMetered(); })
            .run();
    }

    bool isMetered()
    {
        const Metered metered = networkIsMetered();
        if (metered == Metered::Unknown && !std::exchange(saidUnknown_, true))
            log("NetworkManager does not say whether the network is metered: it counts as not metered");
        return metered == Metered::Yes;
    }

    void report(const RoundResult& result)
    {
        if (const auto line = diary_.line(result))
            log(*line);
        if (result.outcome == Outcome::Nothing)
            return;
        ::sd_notifyf(0, "STATUS=%s", result.sentence.c_str());
        try {
            state_.noteAnswer({result.sentence, wallClock()});
        } catch (const StateError& error) {
            log(error.what());
        }
    }

    Places places_;
    State state_;
    Patience patience_;
    StoreSleep sleep_;
    std::mt19937_64 generator_{std::random_device{}()};
    Schedule schedule_;
    DayCount days_;
    Diary diary_;
    bool saidUnknown_ = false;

    std::mutex mutex_; // of the two below
    bool isEnding_ = false;
    std::shared_ptr<JetStream> transport_; // of the last round
};

sigset_t endingSignals()
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    return signals;
}

int serve(const Places& places, double interval)
{
    const sigset_t signals = endingSignals();
    ::pthread_sigmask(SIG_BLOCK, &signals, nullptr); // in all threads to come
    Service service(places, interval);
    ::sd_notify(0, "READY=1\nSTATUS=waiting for the first round");
    auto rounds = std::async(std::launch::async, [&service] {
        try {
            service.run();
        } catch (...) {
            ::kill(::getpid(), SIGTERM); // `get` below has the reason
            throw;
        }
    });
    int signal = 0;
    ::sigwait(&signals, &signal);
    ::sd_notify(0, "STOPPING=1");
    service.end();
    if (rounds.wait_for(mostTimeToEnd) != std::future_status::ready)
        std::_Exit(exitOk); // servers do not answer; the state is true at every moment
    rounds.get();
    return exitOk;
}

// Batches come and go for months. In a heap for each thread, and without large blocks that go back to the system, they
// leave twice the room behind that they need.
void keepMemorySmall()
{
    constexpr int leastOfItsOwn = 64 * 1024;
    ::mallopt(M_ARENA_MAX, 1);
    ::mallopt(M_MMAP_THRESHOLD, leastOfItsOwn);
}

int run(const Places& places)
{
    keepMemorySmall();
    const auto checked = readUplinkConfiguration(places.configuration);
    if (const auto reason = reasonToBeOff(places, checked)) {
        log(*reason);
        if (auto state = State::openPresent(places.state))
            state->noteOff();
        ::sd_notify(0, "READY=1\nSTATUS=off"); // a unit that ends without it has failed
        return checked.problems.empty() ? exitOk : EX_CONFIG;
    }
    try {
        static_cast<void>(readCredentials(checked.configuration.credentials));
    } catch (const CredentialsError& error) {
        log(error.what());
        return EX_CONFIG;
    }
    return serve(places, checked.configuration.intervalSeconds);
}

} // namespace

void addRunCommand(CLI::App& application, int& exitStatus)
{
    CLI::App* command = application.add_subcommand("run", "Send what is allowed until a signal ends the program");
    const auto places = std::make_shared<Places>(usualPlaces());
    addPlaceOptions(*command, *places);
    command->callback([places, &exitStatus] { exitStatus = run(*places); });
}

} // namespace kesto_uplink
