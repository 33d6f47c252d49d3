// SPDX-License-Identifier: Apache-2.0
// Changing a channel takes no lock. Only one thread at a time makes its text, from the values that it sees.
#include "channels/Channel.h"

#include "foundation/text/Format.h"

#include <algorithm>
#include <iterator>
#include <limits>

namespace libkesto {
namespace {

using Limits = std::numeric_limits<std::int64_t>;

} // namespace

kesto_status SimpleChannelValue::add(std::int64_t amount) noexcept
{
    value_.fetch_add(amount);
    changed();
    return KESTO_OK;
}

kesto_status SimpleChannelValue::set(std::int64_t value) noexcept
{
    value_.store(value);
    changed();
    return KESTO_OK;
}

void SimpleChannelValue::appendText(std::string& text, Time)
{
    foundation::format_to(std::back_inserter(text), "simple\n{}\n", value_.load());
}

HistogramChannelValue::HistogramChannelValue(Doorbell& bell, std::string unit, std::vector<std::int64_t> bounds)
    : kesto_channel(bell),
      unit_(std::move(unit)),
      bounds_(std::move(bounds)),
      hits_(bounds_.size() - 1),
      minimum_(Limits::max()),
      maximum_(Limits::min())
{
}

std::size_t HistogramChannelValue::bucketOf(std::int64_t value) const noexcept
{
    const auto above = std::upper_bound(bounds_.begin() + 1, bounds_.end() - 1, value);
    return static_cast<std::size_t>(above - bounds_.begin()) - 1;
}

kesto_status HistogramChannelValue::record(std::int64_t value) noexcept
{
    for (std::int64_t least = minimum_.load(); value < least && !minimum_.compare_exchange_weak(least, value);) { }
    for (std::int64_t most = maximum_.load(); value > most && !maximum_.compare_exchange_weak(most, value);) { }
    hits_[bucketOf(value)].fetch_add(1);
    changed();
    return KESTO_OK;
}

void HistogramChannelValue::appendText(std::string& text, Time)
{
    const auto out = std::back_inserter(text);
    foundation::format_to(out, "histogram{}{}\n", unit_.empty() ? "" : " ", unit_);
    const bool isEmpty = minimum_.load() > maximum_.load(); // or a thread is just recording the first value
    foundation::format_to(out, "{} {}\n", isEmpty ? 0 : minimum_.load(), isEmpty ? 0 : maximum_.load());
    for (std::size_t bucket = 0; bucket < hits_.size(); ++bucket)
        foundation::format_to(out, "{} {} {}\n", bounds_[bucket], bounds_[bucket + 1], hits_[bucket].load());
}

StateChannelValue::StateChannelValue(Doorbell& bell, std::vector<std::string> names, std::size_t first, Time now)
    : kesto_channel(bell),
      begin_(now),
      states_(names.size()),
      present_(Present{first, 0})
{
    for (std::size_t place = 0; place < names.size(); ++place)
        states_[place].name = std::move(names[place]);
    states_[first].transitions.store(1);
}

std::uint64_t StateChannelValue::microsecondsAt(Time now) const noexcept
{
    const auto since = std::chrono::duration_cast<std::chrono::microseconds>(now - begin_).count();
    return since > 0 ? static_cast<std::uint64_t>(since) : 0;
}

kesto_status StateChannelValue::enter(std::size_t state, Time now) noexcept
{
    if (state >= states_.size())
        return KESTO_INVALID_ARGUMENT;
    const std::uint64_t moment = microsecondsAt(now);
    Present before = present_.load();
    Present next{};
    do {
        if (before.state == state)
            return KESTO_OK;
        // Concurrent threads may have read the clock in a different order.
        next = {state, std::max<std::uint64_t>(before.since, moment)};
    } while (!present_.compare_exchange_weak(before, next));
    states_[before.state].microseconds.fetch_add(next.since - before.since);
    states_[state].transitions.fetch_add(1);
    changed();
    return KESTO_OK;
}

// The present state gets its time when it is left. A reader must not count that time twice, so it checks that the state
// did not change while it read; a time that is not added yet merely comes later.
std::optional<StateChannelValue::Present> StateChannelValue::readTimes()
{
    constexpr int mostAttempts = 100;
    for (int attempt = 0; attempt < mostAttempts; ++attempt) {
        const Present present = present_.load();
        for (State& state : states_)
            state.read = state.microseconds.load();
        const Present after = present_.load();
        if (present.state == after.state && present.since == after.since)
            return present;
    }
    return std::nullopt;
}

void StateChannelValue::appendText(std::string& text, Time now)
{
    if (const auto present = readTimes()) {
        const std::uint64_t moment = microsecondsAt(now);
        states_[present->state].read += moment > present->since ? moment - present->since : 0;
        for (State& state : states_)
            state.shown = std::max(state.shown, state.read / 1000);
    }
    std::uint64_t total = 0;
    for (const State& state : states_)
        total += state.shown;
    text += "state\n";
    for (const State& state : states_) {
        const double share = total > 0 ? static_cast<double>(state.shown) / static_cast<double>(total) : 0;
        foundation::format_to(std::back_inserter(text), "{} {} {} {:f}\n", state.name, state.transitions.load(),
                              state.shown, share);
    }
}

} // namespace libkesto
