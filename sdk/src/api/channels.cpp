// SPDX-License-Identifier: Apache-2.0
// Implements channels.h with the classes of the library: checks callers' arguments, and lets no exception out.
#include "kesto/channels.h"

#include "channels/Publisher.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <new>
#include <set>
#include <span>

using libkesto::ChannelClock;
using std::chrono::milliseconds;

namespace {

constexpr std::uint32_t defaultWriteInterval = 500;
constexpr std::uint32_t defaultRefreshInterval = 1000;

// The options of a caller, which may have been built with another version of the header, in this version's form.
kesto_publisher_options completed(const kesto_publisher_options* given) noexcept
{
    kesto_publisher_options options{};
    if (given != nullptr)
        std::memcpy(&options, given, std::min(given->size, sizeof options));
    return options;
}

milliseconds orDefault(std::uint32_t given, std::uint32_t fallback)
{
    return milliseconds(given == 0 ? fallback : given);
}

libkesto::PublisherSettings settings(const kesto_publisher_options& options)
{
    libkesto::PublisherSettings settings{.root = options.root == nullptr ? libkesto::usualChannelRoot() : options.root,
                                         .writeInterval = orDefault(options.write_interval_ms, defaultWriteInterval),
                                         .refreshInterval = {}};
    if (options.refresh_interval_ms != UINT32_MAX)
        settings.refreshInterval = orDefault(options.refresh_interval_ms, defaultRefreshInterval);
    return settings;
}

// Publishes the channel that `make` makes, or returns the error.
template <typename Make>
kesto_status create(kesto_publisher* publisher, const kesto_channel_name* name, kesto_channel** channel,
                    Make make) noexcept
try {
    if (channel == nullptr)
        return KESTO_INVALID_ARGUMENT;
    *channel = nullptr;
    if (publisher == nullptr || name == nullptr)
        return KESTO_INVALID_ARGUMENT;
    const auto driver = libkesto::channelFileName(name->driver);
    const auto group = libkesto::channelGroupName(name->group);
    const auto subgroup = libkesto::channelGroupName(name->subgroup);
    const auto file = libkesto::channelFileName(name->channel);
    for (const auto* each : {&driver, &group, &subgroup, &file})
        if (!*each)
            return each->error();
    auto made = make(publisher->bell());
    if (!made)
        return made.error();
    const auto added = publisher->add(*std::move(made), {*driver, *group, *subgroup}, *file);
    if (!added)
        return added.error();
    *channel = *added;
    return KESTO_OK;
} catch (const std::bad_alloc&) {
    return KESTO_OUT_OF_MEMORY;
}

using Made = std::expected<std::unique_ptr<kesto_channel>, kesto_status>;

Made makeHistogram(libkesto::Doorbell& bell, const char* unit, std::span<const std::int64_t> bounds)
{
    if (bounds.size() < 2 || !std::ranges::is_sorted(bounds, std::less_equal()))
        return std::unexpected(KESTO_INVALID_ARGUMENT);
    if (bounds.size() - 1 > KESTO_MOST_BUCKETS)
        return std::unexpected(KESTO_TOO_LARGE);
    std::expected<std::string, kesto_status> text;
    if (unit != nullptr)
        text = libkesto::channelText(unit);
    if (!text)
        return std::unexpected(text.error());
    return std::make_unique<libkesto::HistogramChannelValue>(bell, *std::move(text),
                                                             std::vector(bounds.begin(), bounds.end()));
}

Made makeState(libkesto::Doorbell& bell, std::span<const char* const> states, std::size_t first)
{
    if (first >= states.size())
        return std::unexpected(KESTO_INVALID_ARGUMENT);
    if (states.size() > KESTO_MOST_STATES)
        return std::unexpected(KESTO_TOO_LARGE);
    std::vector<std::string> names;
    for (const char* state : states) {
        auto name = libkesto::channelText(state);
        if (!name)
            return std::unexpected(name.error());
        names.push_back(*std::move(name));
    }
    if (std::set(names.begin(), names.end()).size() < names.size())
        return std::unexpected(KESTO_INVALID_ARGUMENT);
    return std::make_unique<libkesto::StateChannelValue>(bell, std::move(names), first, ChannelClock::now());
}

} // namespace

kesto_status kesto_publisher_open(const kesto_publisher_options* given, kesto_publisher** publisher)
try {
    if (publisher == nullptr)
        return KESTO_INVALID_ARGUMENT;
    *publisher = nullptr;
    if (given != nullptr && given->size == 0)
        return KESTO_INVALID_ARGUMENT;
    auto made = kesto_publisher::create(settings(completed(given)));
    if (made == nullptr)
        return KESTO_SYSTEM_ERROR;
    *publisher = made.release();
    return KESTO_OK;
} catch (const std::bad_alloc&) {
    return KESTO_OUT_OF_MEMORY;
}

kesto_status kesto_publisher_flush(kesto_publisher* publisher)
{
    return publisher == nullptr ? KESTO_INVALID_ARGUMENT : publisher->flush();
}

void kesto_publisher_free(kesto_publisher* publisher)
{
    if (publisher != nullptr && publisher->isOfThisProcess())
        delete publisher;
}

const char* kesto_publisher_root(const kesto_publisher* publisher)
{
    return publisher == nullptr ? nullptr : publisher->root().c_str();
}

void kesto_publisher_get_statistics(const kesto_publisher* publisher, kesto_publisher_statistics* statistics,
                                    size_t size)
{
    if (statistics == nullptr)
        return;
    const kesto_publisher_statistics current =
        publisher == nullptr ? kesto_publisher_statistics{} : publisher->statistics();
    std::memset(statistics, 0, size);
    std::memcpy(statistics, &current, std::min(size, sizeof current));
}

kesto_status kesto_channel_create_simple(kesto_publisher* publisher, const kesto_channel_name* name,
                                         kesto_channel** channel)
{
    return create(publisher, name, channel,
                  [](libkesto::Doorbell& bell) { return Made(std::make_unique<libkesto::SimpleChannelValue>(bell)); });
}

kesto_status kesto_channel_create_histogram(kesto_publisher* publisher, const kesto_channel_name* name,
                                            const char* unit, const int64_t* bounds, size_t bound_count,
                                            kesto_channel** channel)
{
    const std::span given(bounds, bounds == nullptr ? 0 : bound_count);
    return create(publisher, name, channel, [&](libkesto::Doorbell& bell) { return makeHistogram(bell, unit, given); });
}

kesto_status kesto_channel_create_state(kesto_publisher* publisher, const kesto_channel_name* name,
                                        const char* const* states, size_t state_count, size_t first,
                                        kesto_channel** channel)
{
    const std::span given(states, states == nullptr ? 0 : state_count);
    return create(publisher, name, channel, [&](libkesto::Doorbell& bell) { return makeState(bell, given, first); });
}

void kesto_channel_destroy(kesto_channel* channel)
{
    if (channel != nullptr)
        channel->publisher().remove(*channel);
}

kesto_status kesto_channel_add(kesto_channel* channel, int64_t amount)
{
    return channel == nullptr ? KESTO_INVALID_ARGUMENT : channel->add(amount);
}

kesto_status kesto_channel_set(kesto_channel* channel, int64_t value)
{
    return channel == nullptr ? KESTO_INVALID_ARGUMENT : channel->set(value);
}

kesto_status kesto_channel_record(kesto_channel* channel, int64_t value)
{
    return channel == nullptr ? KESTO_INVALID_ARGUMENT : channel->record(value);
}

kesto_status kesto_channel_enter(kesto_channel* channel, size_t state)
{
    return channel == nullptr ? KESTO_INVALID_ARGUMENT : channel->enter(state, ChannelClock::now());
}
