// SPDX-License-Identifier: Apache-2.0
// A round is put together as `kesto-uplink run` does it, but for the sleep between rounds.
#include "fleet/Device.h"

#include "fleet/News.h"
#include "kesto-uplink/outbox/Outbox.h"
#include "kesto-uplink/transport/JetStream.h"

#include <fmt/format.h>
#include <set>
#include <stdexcept>
#include <thread>
#include <utility>

namespace fleet {

namespace {

using kesto_uplink::State;

constexpr std::chrono::seconds patience{180}; // also where other tests run beside this one, under a sanitizer
constexpr std::chrono::seconds waitToHear{10};

kesto_uplink::UplinkConfiguration configurationOfAll()
{
    auto checked = kesto_uplink::parseUplinkConfiguration(
        "uplink.toml",
        std::string("enabled = true\nservers = [\"nats://127.0.0.1\"]\ncredentials = \"/made-up\"\n") + rules);
    if (!checked.problems.empty())
        throw std::runtime_error(checked.problems.front());
    return std::move(checked.configuration);
}

class OutboxSource : public kesto_uplink::Source {
public:
    OutboxSource(const std::filesystem::path& store, const kesto_uplink::UplinkConfiguration& configuration,
                 const kesto_uplink::Identity& identity, double now)
        : outbox_(store, configuration, identity),
          now_(now)
    {
    }

    std::optional<kesto_uplink::Batch> next(const kesto_uplink::Cursor& after,
                                            const std::set<std::int64_t>& openSessions) override
    {
        return outbox_.next(after, openSessions, now_);
    }

private:
    kesto_uplink::Outbox outbox_;
    double now_;
};

double trueTime()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

} // namespace

const char* const rules = R"(
[device]
model = "trial"
version = "1"
[events."com.quarn.kesto.*"]
PomoSessionVolume = "keep"
active_devices = "keep"
late_cycles = { bucket = [10, 100] }
[stretches]
device = "keep"
format = "keep"
channels = "keep"
volume = "keep"
[sessions]
application = "keep"
service = "keep"
)";

Device::Device(std::filesystem::path directory, const std::string& credential, std::vector<std::string> servers)
    : directory_(std::move(directory)),
      credentials_{.name = credential, .password = credential, .isPlain = true},
      configuration_(configurationOfAll()),
      servers_(std::move(servers))
{
    std::filesystem::create_directories(state());
    const std::string pseudonym = State::open(state(), now()).identity().pseudonym;
    chapters_.push_back({.pseudonym = pseudonym, .store = store()});
}

std::filesystem::path Device::store() const
{
    return directory_ / "analytics.sqlite3";
}

double Device::now() const
{
    return trueTime() + secondsAhead_;
}

void Device::makeStore(std::uint32_t seed, std::size_t sessions)
{
    fleet::makeStore(store(), seed, sessions, now());
}

void Device::beginStoreAnew(std::uint32_t seed, std::size_t sessions)
{
    const auto earlier = directory_ / fmt::format("earlier-{}.sqlite3", chapters_.size());
    for (Chapter& chapter : chapters_)
        if (chapter.store == store())
            chapter.store = earlier;
    for (const char* suffix : {"", "-wal", "-shm"}) {
        std::error_code ignored; // SQLite removes what it needs no more
        std::filesystem::rename(store().native() + suffix, earlier.native() + suffix, ignored);
    }
    makeStore(seed, sessions);
    chapters_.push_back({.pseudonym = chapters_.back().pseudonym, .store = store()});
}

void Device::live(int sessions)
{
    addNews(store(), sessions, now());
}

void Device::stealFrom(const Device& victim)
{
    std::filesystem::remove_all(state());
    std::filesystem::copy(victim.state(), state());
    chapters_.clear();
}

void Device::keepCopyOfState() const
{
    std::filesystem::remove_all(directory_ / "copy");
    std::filesystem::copy(state(), directory_ / "copy");
}

void Device::goBackToCopyOfState()
{
    std::filesystem::remove_all(state());
    std::filesystem::copy(directory_ / "copy", state());
}

kesto_uplink::RoundResult Device::round(std::chrono::milliseconds waitForConfirmation)
{
    State state = State::open(this->state(), now());
    kesto_uplink::Patience waits(this->state() / "waiting-since");
    kesto_uplink::JetStream transport({.urls = servers_}, credentials_);
    const kesto_uplink::Cursor before = state.queued();
    auto result = kesto_uplink::Round(
                      {.forgetWhen = configuration_.forgetWhen,
                       .maximumBytesADay = configuration_.maximumBytesADay,
                       .pseudonymDays = configuration_.pseudonymDays,
                       .hashKeyDays = configuration_.hashKeyDays,
                       .waitForConfirmation = waitForConfirmation},
                      state, waits, transport,
                      [this](const kesto_uplink::Identity& identity) {
                          return std::make_unique<OutboxSource>(store(), configuration_, identity, now());
                      },
                      [this] { return kesto_uplink::Today{now(), static_cast<std::int64_t>(now() / 86'400)}; },
                      [] { return false; })
                      .run();
    noteChapter(state.identity().pseudonym, before.id);
    return result;
}

// A pseudonym is renewed at the beginning of a round only.
void Device::noteChapter(const std::string& pseudonym, std::int64_t before)
{
    if (chapters_.empty() || chapters_.back().pseudonym == pseudonym)
        return;
    chapters_.back().upTo = before;
    chapters_.push_back({.pseudonym = pseudonym, .store = store(), .after = before});
}

void Device::sendUntil(const std::function<bool()>& isDone, std::chrono::milliseconds waitForConfirmation)
{
    constexpr std::chrono::milliseconds pause{200};
    const auto end = std::chrono::steady_clock::now() + patience;
    while (!isDone()) {
        const auto result = round(waitForConfirmation);
        if (isDone())
            return;
        if (std::chrono::steady_clock::now() > end)
            throw std::runtime_error(
                fmt::format("{} does not get its rows to the stream: {}", directory_.native(), result.sentence));
        std::this_thread::sleep_for(pause);
    }
}

void Device::sendAll(std::chrono::milliseconds waitForConfirmation)
{
    sendUntil([this] { return isAllSent(); }, waitForConfirmation);
}

void Device::sendAllAndHear()
{
    const auto end = std::chrono::steady_clock::now() + patience;
    for (sendAll(waitToHear); !hasHeard(); sendAll(waitToHear)) {
        if (std::chrono::steady_clock::now() > end)
            throw std::runtime_error(directory_.native() + " does not hear that its rows are stored");
        live(1);
    }
}

bool Device::hasHeard()
{
    State state = State::open(this->state(), now());
    return isAllSent() && state.queued() == state.stored();
}

bool Device::isAllSent()
{
    return State::open(state(), now()).queued() == kesto_uplink::StoreReader(store()).newest();
}

} // namespace fleet
