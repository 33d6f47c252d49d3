// SPDX-License-Identifier: Apache-2.0
// A rate needs two looks at the same counters; the service's last minute stands in for the first of them.
#include "kesto/top/TopLook.h"

#include "foundation/values/Json.h"
#include "kesto/JsonValues.h"
#include "ledger/Report.h"

#include <algorithm>
#include <tuple>
#include <utility>

using foundation::Dictionary;
using foundation::Value;
using ledger::numberIn;

namespace {

constexpr double minute = 60;

Dictionary streamEntries(const PlayingStream& stream)
{
    return {{"session", stream.session == 0 ? Value() : Value(stream.session)},
            {"application", known(stream.application)},
            {"recording", stream.isRecording},
            {"since", stream.since},
            {"device", known(stream.device)},
            {"format", known(stream.format)},
            {"volume", valueOf(stream.volume)},
            {"faults", stream.faults}};
}

// True also of an earlier version, which does not tell it.
bool isTold(const Dictionary& status, std::string_view key)
{
    const Value* const told = status.find(key);
    return told == nullptr || told->asBoolean();
}

Value partOf(const TopLook& look, std::string_view key)
{
    const Value* const part = look.status ? look.status->find(key) : nullptr;
    return part == nullptr ? Value() : *part;
}

Value streamsOf(const TopLook& look)
{
    if (!look.streams)
        return {};
    std::vector<Value> streams;
    streams.reserve(look.streams->size());
    for (const PlayingStream& stream : *look.streams)
        streams.emplace_back(streamEntries(stream));
    return foundation::Array(std::move(streams));
}

} // namespace

bool TopLook::isRunning() const
{
    return status && status->find("running")->asBoolean();
}

bool TopLook::isStoring() const
{
    return isRunning() && isTold(*status, "storing");
}

bool TopLook::isStoringStretches() const
{
    return isStoring() && isTold(*status, "storingStretches");
}

std::optional<TopRates> ratesOf(const TopLook& look, const TopLook* before)
{
    if (!look.isRunning())
        return std::nullopt;
    const auto number = [](const TopLook& of, std::string_view path) {
        return static_cast<double>(numberIn(*of.status, path));
    };
    if (before == nullptr || !before->isRunning() || before->steadyTime >= look.steadyTime
        || number(*before, "started") != number(look, "started"))
        return TopRates{.messages = number(look, "rates.deliveries") / minute,
                        .events = number(look, "rates.events") / minute};
    const auto rate = [&](std::string_view path) {
        return std::max(0.0, number(look, path) - number(*before, path)) / (look.steadyTime - before->steadyTime);
    };
    return TopRates{.messages = rate("sinceStart.deliveries"), .events = rate("sinceStart.events")};
}

void sortStreams(std::optional<std::vector<PlayingStream>>& streams, TopOrder order)
{
    if (!streams)
        return;
    const auto byName = [](const PlayingStream& stream) { return std::tie(stream.application, stream.session); };
    const auto precedes = [order](const PlayingStream& left, const PlayingStream& right) {
        switch (order) {
        case TopOrder::Since: return left.since < right.since;
        case TopOrder::Application: return false; // the names, which come next, decide
        case TopOrder::Device: return left.device < right.device;
        case TopOrder::Volume: return left.volume > right.volume;
        case TopOrder::Faults: return left.faults > right.faults;
        }
        return false;
    };
    std::ranges::sort(*streams, {}, byName);
    std::ranges::stable_sort(*streams, precedes);
}

std::string topJson(const TopLook& look)
{
    const Dictionary counts = partOf(look, "sinceStart").dictionary().value_or(Dictionary());
    const Value now = partOf(look, "now");
    const auto open = [&](std::string_view key) {
        const Value* const number = now.isNull() ? nullptr : now.dictionary()->find(key);
        return number == nullptr ? Value() : *number; // an earlier version does not tell each
    };
    const Dictionary entries{{"time", look.time},
                             {"running", look.isRunning()},
                             {"statusProblem", known(look.statusProblem)},
                             {"version", partOf(look, "version")},
                             {"started", partOf(look, "started")},
                             {"connections", open("connections")},
                             {"sessions", open("sessions")},
                             {"waitingCalls", open("waitingCalls")},
                             {"waitingEvents", open("waitingEvents")},
                             {"messagesPerSecond", look.rates ? Value(look.rates->messages) : Value()},
                             {"eventsPerSecond", look.rates ? Value(look.rates->events) : Value()},
                             {"memory", partOf(look, "memory")},
                             {"storing", partOf(look, "storing")},
                             {"storingStretches", partOf(look, "storingStretches")},
                             {"store", partOf(look, "store")},
                             {"losses", look.isRunning() ? Value(ledger::lossesIn(counts)) : Value()},
                             {"streams", streamsOf(look)},
                             {"storeProblem", known(look.storeProblem)}};
    std::string text;
    foundation::appendJsonText(entries, text);
    return text;
}
