// SPDX-License-Identifier: Apache-2.0
// Payloads are built only when a test asks for them, because the test decides whether they are needed.
#include "support/fakes/FakeAnalytics.h"

#include "foundation/values/Json.h"

#include <algorithm>
#include <fnmatch.h>
#include <ostream>
#include <utility>

namespace support {

void PrintTo(const AnalyticsEvent& event, std::ostream* out)
{
    *out << event.name << ' ' << foundation::Value(event.payload).text();
}

void FakeAnalytics::use(std::string pattern)
{
    const foundation::Lock lock(lock_);
    used_.push_back(std::move(pattern));
}

std::vector<std::string> FakeAnalytics::asked() const
{
    const foundation::Lock lock(lock_);
    return asked_;
}

std::vector<std::string> FakeAnalytics::sent() const
{
    const foundation::Lock lock(lock_);
    std::vector<std::string> names;
    for (const auto& event : sent_)
        names.push_back(event.name);
    return names;
}

std::vector<platform::Origin> FakeAnalytics::origins() const
{
    const foundation::Lock lock(lock_);
    std::vector<platform::Origin> origins;
    for (const auto& event : sent_)
        origins.push_back(event.origin);
    return origins;
}

std::vector<AnalyticsEvent> FakeAnalytics::events()
{
    const foundation::Lock lock(lock_);
    std::vector<AnalyticsEvent> events;
    for (auto& [name, origin, builder, payload] : sent_) {
        if (!payload) {
            payload = builder();
            builder = nullptr;
            ++timesBuilt_;
        }
        if (std::string json; foundation::appendJson(*payload, json))
            events.push_back({name, *payload});
    }
    return events;
}

std::vector<foundation::Dictionary> FakeAnalytics::payloads(std::string_view name)
{
    std::vector<foundation::Dictionary> payloads;
    for (const auto& event : events())
        if (event.name == name)
            payloads.push_back(event.payload);
    return payloads;
}

std::vector<platform::Analytics::PayloadBuilder> FakeAnalytics::takeBuilders()
{
    const foundation::Lock lock(lock_);
    std::vector<PayloadBuilder> builders;
    for (auto& event : std::exchange(sent_, {}))
        builders.push_back(std::move(event.builder));
    return builders;
}

int FakeAnalytics::timesBuilt() const
{
    const foundation::Lock lock(lock_);
    return timesBuilt_;
}

void FakeAnalytics::clear()
{
    std::vector<Sent> released;
    const foundation::Lock lock(lock_);
    asked_.clear();
    released.swap(sent_);
    timesBuilt_ = 0;
}

bool FakeAnalytics::isAnalyticsEventUsed(std::string_view eventName)
{
    const std::string name(eventName);
    if (observer_)
        observer_(name);
    const foundation::Lock lock(lock_);
    asked_.push_back(name);
    return isUsed(name);
}

bool FakeAnalytics::isUsed(const std::string& name) const
{
    return std::ranges::any_of(used_,
                               [&](const auto& pattern) { return fnmatch(pattern.c_str(), name.c_str(), 0) == 0; });
}

// Events are stored immediately: only real stores delay the events of a turn, and their tests cover this.
void FakeAnalytics::sendAnalyticsEventLazy(platform::Turn& turn, const platform::Origin& origin,
                                           std::string_view eventName, PayloadBuilder payloadBuilder)
{
    send(turn.tally, origin, std::string(eventName), std::move(payloadBuilder));
}

void FakeAnalytics::sendAnalyticsEventLazy(platform::OutsideTurn, const platform::SourceBegin& source,
                                           std::string_view eventName, PayloadBuilder payloadBuilder)
{
    ledger::Tally tally;
    send(tally, {.source = source.number, .session = 0}, std::string(eventName), std::move(payloadBuilder));
    ledger_.post(tally);
}

void FakeAnalytics::send(ledger::Tally& tally, const platform::Origin& origin, std::string name,
                         PayloadBuilder payloadBuilder)
{
    const foundation::Lock lock(lock_);
    const bool isWanted = isUsed(name);
    tally.add(ledger::Counter::Events);
    tally.add(isWanted ? ledger::Counter::Kept : ledger::Counter::Unwanted);
    if (isWanted)
        sent_.push_back({std::move(name), origin, std::move(payloadBuilder), std::nullopt});
}

} // namespace support
