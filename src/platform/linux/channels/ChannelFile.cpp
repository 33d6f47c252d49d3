// SPDX-License-Identifier: Apache-2.0
// The parser cuts fields off the text from the left, but those of a state from the right, because its name may hold
// blanks. It accepts a file as a whole or not at all.
#include "platform/linux/channels/ChannelFile.h"

#include "foundation/values/String.h"

#include <algorithm>
#include <charconv>
#include <cmath>

namespace platform {
namespace {

// Takes the text before the separator, and the separator; the whole rest if the separator is missing.
std::string_view takeUntil(char separator, std::string_view& text)
{
    const std::size_t at = text.find(separator);
    const std::string_view taken = text.substr(0, at);
    text.remove_prefix(at == std::string_view::npos ? text.size() : at + 1);
    return taken;
}

// Takes the last field off a line, which is empty if it had only one.
std::string_view takeLastField(std::string_view& line)
{
    const std::size_t blank = line.rfind(' ');
    const std::string_view taken = blank == std::string_view::npos ? line : line.substr(blank + 1);
    line = line.substr(0, blank == std::string_view::npos ? 0 : blank);
    return taken;
}

template <typename Number> bool isRead(std::string_view field, Number& number)
{
    const auto [end, error] = std::from_chars(field.data(), field.data() + field.size(), number);
    return error == std::errc() && end == field.data() + field.size();
}

bool isShare(double number)
{
    return std::isfinite(number) && number >= 0;
}

// Nothing on success.
using Outcome = std::optional<ChannelFileError>;

Outcome parseSimple(std::string_view lines, ReportingChannel& channel)
{
    const bool isValue = isRead(takeUntil('\n', lines), channel.value) && lines.empty();
    return isValue ? Outcome() : ChannelFileError::Malformed;
}

bool parseBucket(std::string_view line, HistogramBucket& bucket)
{
    return isRead(takeUntil(' ', line), bucket.lower) && isRead(takeUntil(' ', line), bucket.upper)
        && isRead(line, bucket.hits) && bucket.hits >= 0;
}

Outcome parseHistogram(std::string_view lines, std::size_t count, ReportingChannel& channel)
{
    std::string_view extremes = takeUntil('\n', lines);
    if (!isRead(takeUntil(' ', extremes), channel.minimum) || !isRead(extremes, channel.maximum))
        return ChannelFileError::Malformed;
    channel.buckets.resize(count - 1);
    for (HistogramBucket& bucket : channel.buckets)
        if (!parseBucket(takeUntil('\n', lines), bucket))
            return ChannelFileError::Malformed;
    return {};
}

bool parseState(std::string_view line, StateResidency& state)
{
    const bool isRight = isRead(takeLastField(line), state.dutyCycle) && isShare(state.dutyCycle)
        && isRead(takeLastField(line), state.residency) && isRead(takeLastField(line), state.transitions);
    state.name = line;
    return isRight && !line.empty();
}

Outcome parseStates(std::string_view lines, std::size_t count, ReportingChannel& channel)
{
    channel.states.resize(count);
    for (auto state = channel.states.begin(); state != channel.states.end(); ++state) {
        if (!parseState(takeUntil('\n', lines), *state))
            return ChannelFileError::Malformed;
        if (std::ranges::find(channel.states.begin(), state, state->name, &StateResidency::name) != state)
            return ChannelFileError::RepeatedState;
    }
    return {};
}

Outcome parseLines(std::string_view kind, std::string_view lines, ReportingChannel& channel)
{
    constexpr std::string_view histogram = "histogram";
    const auto count = static_cast<std::size_t>(std::ranges::count(lines, '\n'));
    if (kind == "simple") {
        channel.format = static_cast<std::uint8_t>(ChannelFormat::Simple);
        return parseSimple(lines, channel);
    }
    if (kind == "state") {
        channel.format = static_cast<std::uint8_t>(ChannelFormat::State);
        return count > mostChannelStates ? ChannelFileError::TooManyLines : parseStates(lines, count, channel);
    }
    if (takeUntil(' ', kind) != histogram)
        return ChannelFileError::UnknownKind;
    channel.format = static_cast<std::uint8_t>(ChannelFormat::Histogram);
    if (!kind.empty())
        channel.unit = kind;
    if (count == 0)
        return ChannelFileError::Malformed;
    return count - 1 > mostChannelBuckets ? ChannelFileError::TooManyLines : parseHistogram(lines, count, channel);
}

} // namespace

std::string_view description(ChannelFileError error) noexcept
{
    switch (error) {
    case ChannelFileError::Unfinished: return "it is not finished";
    case ChannelFileError::UnknownKind: return "it is neither simple nor histogram nor state";
    case ChannelFileError::Malformed: return "a line is malformed";
    case ChannelFileError::TooManyLines: return "it has too many buckets or states";
    case ChannelFileError::RepeatedState: return "two states have the same name";
    case ChannelFileError::NotUtf8: return "it is not UTF-8";
    }
    return "unknown error";
}

std::expected<ReportingChannel, ChannelFileError> parseChannelFile(std::string_view text)
{
    if (!text.ends_with('\n'))
        return std::unexpected(ChannelFileError::Unfinished);
    if (!foundation::isValidUtf8(text))
        return std::unexpected(ChannelFileError::NotUtf8);
    ReportingChannel channel;
    const std::string_view kind = takeUntil('\n', text);
    if (const auto error = parseLines(kind, text, channel))
        return std::unexpected(*error);
    return channel;
}

} // namespace platform
