// SPDX-License-Identifier: Apache-2.0
// Only the last message of each kind is kept, so that sessions of any length can be read.
#include "kesto/results/Timeline.h"

#include "kesto/Terminal.h"
#include "utility/KestoReportingUtility.h"

#include <algorithm>
#include <array>
#include <fmt/format.h>

namespace {

using foundation::Dictionary;
using foundation::Value;

constexpr std::string_view volumeKind = "Volume_Summary";
constexpr std::string_view playTime = "play_seconds";
// Times, which have a column of their own, and keys that repeat the kind.
constexpr std::array<std::string_view, 4> notShown{"processuptime_ms", "systemuptime_sec", utility::timestampKey,
                                                   "audiotag"};

// "Playback_Start" for "Playback_Start_1"; nothing if it is not an identifier.
std::optional<std::string_view> kindOf(std::string_view identifier)
{
    const std::size_t place = identifier.rfind('_');
    if (place == std::string_view::npos)
        return std::nullopt;
    const std::string_view number = identifier.substr(place + 1);
    const std::string_view kind = identifier.substr(0, place);
    if (number.empty() || number.find_first_not_of("0123456789") != std::string_view::npos || !kind.contains('_'))
        return std::nullopt;
    return kind;
}

} // namespace

void Timeline::Sound::add(const Dictionary& payload, double time)
{
    const Value* running = payload.find(key_);
    const bool isRunning =
        running == nullptr ? isRunning_ && !payload.contains("session_duration") : running->asBoolean();
    if (isRunning && !isRunning_)
        begin_ = time;
    if (!isRunning && isRunning_)
        ended_.push_back({begin_, time});
    isRunning_ = isRunning;
}

std::vector<Stretch> Timeline::Sound::stretches(double now) const
{
    std::vector<Stretch> all = ended_;
    if (isRunning_)
        all.push_back({begin_, now});
    return all;
}

bool Timeline::add(std::string_view identifier, const Dictionary& payload, std::optional<Row>& row)
{
    row.reset();
    const auto kind = kindOf(identifier);
    if (!kind)
        return false;
    ++messages_;
    if (*kind == volumeKind && payload.contains(playTime)) {
        volumeEvents_.push_back(payload);
        return true;
    }
    row.emplace();
    if (const Value* time = payload.find(utility::timestampKey)) {
        if (!start_)
            start_ = time->asDouble();
        row->time = now_ = time->asDouble() - *start_;
    }
    const bool wasRunning = output_.isRunning() || input_.isRunning();
    output_.add(payload, now_);
    input_.add(payload, now_);
    const bool isRunning = output_.isRunning() || input_.isRunning();
    if (isRunning)
        row->run = wasRunning ? Run::GoesOn : Run::Begins;
    else if (wasRunning)
        row->run = Run::Ends;
    row->kind = *kind;
    row->kind[kind->rfind('_')] = ' ';
    row->changes = changes(*kind, payload);
    return true;
}

std::string Timeline::changes(std::string_view kind, const Dictionary& payload)
{
    const auto isShown = [](std::string_view key) { return std::ranges::find(notShown, key) == notShown.end(); };
    const auto [last, isFirst] = lastOfKind_.try_emplace(std::string(kind));
    std::string text;
    const auto append = [&text](std::string_view change) {
        text += text.empty() ? "" : " ";
        text += change;
    };
    for (const auto& [key, value] : payload) {
        const Value* before = last->second.find(key);
        if (!isShown(key) || (before != nullptr && *before == value))
            continue;
        if (before == nullptr)
            append(fmt::format("{}={}", key.view(), shownText(value)));
        else
            append(fmt::format("{}={}→{}", key.view(), shownText(*before), shownText(value)));
    }
    for (const auto& [key, value] : last->second)
        if (isShown(key) && !payload.contains(key))
            append(fmt::format("-{}", key.view()));
    last->second = payload;
    return text.empty() && !isFirst ? "(the same again)" : text;
}
