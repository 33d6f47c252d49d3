// SPDX-License-Identifier: Apache-2.0
// `kesto-uplink run`: the service. The rounds have a thread of their own, so that a signal ends the program also while a
// round waits for servers. What is not noted then is sent again; so the program need not wait for its end.
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

#include <pthread.h>
#include <sysexits.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <future>
#include <memory>
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

double uptime()
{
    return std::chrono::duration<double>(std::chrono::steady_clock::now().time_since_epoch()).count();
}

class OutboxSource : public Source {
public:
    OutboxSource(const Places& places, const UplinkConfiguration& configuration, const Identity& identity)
        : outbox_(places.database, configuration, identity,
                  {.compressedBytes = std::min<std::size_t>(OutboxLimits().compressedBytes,
                                                            configuration.maximumBytesADay)})
    {
    }

    std::optional<Batch> next(const Cursor& after, const std::set<std::int64_t>& openSessions) override
    {
        return outbox_.next(after, openSessions, wallClock());
    }

private:
    Outbox outbox_;
};

// The parts of the service, connected.
class Service {
public:
    Service(const Places& places, const UplinkConfiguration& configuration, const Credentials& credentials)
        : places_(places), configuration_(configuration), state_(State::open(places.state, wallClock())),
          patience_(places.state / "waiting-since"), sleep_(places.database),
          transport_({.urls = configuration.servers, .authorities = configuration.ca}, credentials)
    {
        state_.noteOn(wallClock());
    }

    void run()
    {
        const Terms terms{.forgetWhen = configuration_.forgetWhen,
                          .maximumBytesADay = configuration_.maximumBytesADay,
                          .pseudonymDays = configuration_.pseudonymDays,
                          .hashKeyDays = configuration_.hashKeyDays};
        Round round(
            terms, state_, patience_, transport_,
            [this](const Identity& identity) {
                return std::make_unique<OutboxSource>(places_, configuration_, identity);
            },
            [this] { return Today{wallClock(), days_.day(wallClock(), uptime())}; }, [this] { return isMetered(); });
        std::mt19937_64 generator(std::random_device{}());
        Schedule schedule(configuration_.intervalSeconds,
                          [&generator] { return std::uniform_real_distribution(0.0, 1.0)(generator); });
        runRounds([&] { return guarded(round); }, schedule, sleep_,
                  [this](const RoundResult& result) { report(result); });
    }

    // Any thread.
    void end()
    {
        sleep_.end();
        transport_.interrupt();
    }

private:
    static RoundResult guarded(Round& round)
    {
        try {
            return round.run();
        } catch (const StateError& error) {
            return {Outcome::Failed, error.what()};
        } catch (const EventStoreError& error) {
            return {Outcome::Failed, error.what()};
        }
    }

    bool isMetered()
    {
        if (configuration_.metered)
            return false;
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
        } catch (const StateError&) { // the next round meets it, too
        }
    }

    Places places_;
    UplinkConfiguration configuration_;
    State state_;
    Patience patience_;
    StoreSleep sleep_;
    JetStream transport_;
    DayCount days_;
    Diary diary_;
    bool saidUnknown_ = false;
};

sigset_t endingSignals()
{
    sigset_t signals;
    sigemptyset(&signals);
    sigaddset(&signals, SIGTERM);
    sigaddset(&signals, SIGINT);
    return signals;
}

int serve(const Places& places, const UplinkConfiguration& configuration, const Credentials& credentials)
{
    const sigset_t signals = endingSignals();
    ::pthread_sigmask(SIG_BLOCK, &signals, nullptr); // in all threads to come
    Service service(places, configuration, credentials);
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

int run(const Places& places)
{
    const auto checked = readUplinkConfiguration(places.configuration);
    for (const std::string& problem : checked.problems)
        log(problem);
    if (!checked.problems.empty())
        return EX_CONFIG;
    if (!checked.configuration.enabled) {
        log(fmt::format("off: nothing leaves this device without enabled = true in {}", places.configuration.native()));
        if (auto state = State::openPresent(places.state))
            state->noteOff();
        return exitOk;
    }
    try {
        return serve(places, checked.configuration, readCredentials(checked.configuration.credentials));
    } catch (const CredentialsError& error) {
        log(error.what());
        return EX_CONFIG;
    }
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
