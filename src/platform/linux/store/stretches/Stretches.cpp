// SPDX-License-Identifier: Apache-2.0
// All open stretches of a session are in the session's state, because every change of that cuts them.
#include "platform/linux/store/stretches/Stretches.h"

#include <algorithm>
#include <limits>
#include <ranges>
#include <utility>

namespace platform {
namespace {

constexpr std::size_t playing = 0;
constexpr std::size_t recording = 1;
constexpr std::array<std::size_t, 2> directions = {playing, recording};

// What the name of a message says, besides its payload.
enum class NameSays : std::uint8_t { Nothing, PlaybackRuns, PlaybackEnds, RecordRuns, RecordEnds, Derived };

NameSays meaningOf(std::string_view name)
{
    const auto takeLast = [&name] {
        const std::size_t dot = name.rfind('.');
        const std::string_view last = name.substr(dot == std::string_view::npos ? 0 : dot + 1);
        name = name.substr(0, dot == std::string_view::npos ? 0 : dot);
        return last;
    };
    const std::string_view type = takeLast();
    const std::string_view category = takeLast();
    const bool runs = type == "Start";
    const bool ends = type == "Stop" || type == "Deactivate";
    if (category == "Playback" && (runs || ends))
        return runs ? NameSays::PlaybackRuns : NameSays::PlaybackEnds;
    if (category == "Record" && (runs || ends))
        return runs ? NameSays::RecordRuns : NameSays::RecordEnds;
    if (category == "Cavlet" || (category == "Volume" && type == "Summary"))
        return NameSays::Derived;
    return NameSays::Nothing;
}

// Whether that direction runs from now on; nothing if the message does not say it.
std::optional<bool> runs(std::size_t direction, const PlayingFacts& facts, NameSays name)
{
    if (const auto& key = direction == playing ? facts.isOutputRunning : facts.isInputRunning)
        return key;
    if (facts.hasDuration)
        return false;
    if (facts.isOutputRunning || facts.isInputRunning)
        return std::nullopt;
    if (name == (direction == playing ? NameSays::PlaybackRuns : NameSays::RecordRuns))
        return true;
    if (name == (direction == playing ? NameSays::PlaybackEnds : NameSays::RecordEnds))
        return false;
    return std::nullopt;
}

// A first volume is no change: it counts from the beginning.
bool changes(const PlayingState& state, const PlayingFacts& facts)
{
    return (facts.devices && facts.devices != state.devices) || (facts.format && facts.format != state.format)
        || (facts.channels && facts.channels != state.channels)
        || (facts.volume && state.volume && facts.volume != state.volume);
}

// True if that makes a difference.
bool merge(PlayingState& state, const PlayingFacts& facts)
{
    bool differs = false;
    const auto take = [&differs](auto& known, const auto& said) {
        if (said && said != known) {
            known = said;
            differs = true;
        }
    };
    take(state.devices, facts.devices);
    take(state.format, facts.format);
    take(state.channels, facts.channels);
    take(state.volume, facts.volume);
    return differs;
}

// When it began, by the client's clock: what was counted is cut off. A clock that was set back began before all of
// that.
std::optional<double> beginning(const StretchMoment& began, const std::optional<CountedTime>& counted)
{
    if (!began.happened || !counted || *began.happened < counted->from)
        return began.happened;
    return std::max(*began.happened, counted->until);
}

// Two clocks cannot be compared: only where both messages say when they happened, these times count. What an earlier
// run has counted is cut off; stamps that all lie before its end are those of another clock.
std::pair<double, double> lengthOf(std::optional<double> beganHappened, double beganArrived, const StretchMoment& ended,
                                   std::optional<double> earlierEnd)
{
    if (!beganHappened || !ended.happened)
        return {beganArrived, lengthOfTime(beganArrived, ended.arrived)};
    const bool isCountedInPart = earlierEnd && *beganHappened < *earlierEnd && *earlierEnd < *ended.happened;
    const double from = isCountedInPart ? *earlierEnd : *beganHappened;
    return {from, lengthOfTime(from, *ended.happened)};
}

Stretches::Key keyOf(std::uint64_t session, std::size_t direction)
{
    return 2 * session + direction;
}

} // namespace

// --- Following the messages

void Stretches::take(std::span<const EventRow> rows, const OriginAnnouncements& announced, const OwnerOf& ownerOf,
                     StretchEnding vanished)
{
    auto next = announced.playingEnds.begin();
    const auto endBefore = [&](std::size_t place) {
        for (; next != announced.playingEnds.end() && next->place <= place; ++next)
            end(next->session, next->time, next->ending == PlayingEnding::Vanished ? vanished : StretchEnding::Stopped);
    };
    for (const EventRow& row : rows) {
        endBefore(row.place);
        if (row.origin.session != 0)
            take(row, ownerOf);
    }
    endBefore(std::numeric_limits<std::size_t>::max());
    for (const OriginEnd& session : announced.sessionEnds) {
        end(session.number, session.time, StretchEnding::Stopped);
        sessions_.erase(session.number);
    }
}

void Stretches::take(const EventRow& row, const OwnerOf& ownerOf)
{
    const NameSays name = meaningOf(row.name);
    if (name == NameSays::Derived || (name == NameSays::Nothing && row.playing == nullptr))
        return;
    Session* const session = sessionOf(row.origin.session, ownerOf);
    if (session == nullptr)
        return;
    constexpr PlayingFacts nothing;
    const PlayingFacts& facts = row.playing == nullptr ? nothing : *row.playing;
    const StretchMoment now{.arrived = row.time, .happened = row.happened};
    const bool cuts = changes(session->state, facts);
    std::array<std::optional<bool>, 2> says;
    std::array<bool, 2> goesOn = {};
    for (const std::size_t direction : directions) {
        says[direction] = runs(direction, facts, name);
        const bool ends = says[direction] == false;
        if (!session->open[direction] || (!ends && !cuts))
            continue;
        end(row.origin.session, *session, direction, now, ends ? StretchEnding::Stopped : StretchEnding::Change);
        goesOn[direction] = !ends;
    }
    const bool differs = merge(session->state, facts);
    for (const std::size_t direction : directions)
        if (goesOn[direction] || (says[direction] == true && !session->open[direction]))
            begin(row.origin.session, *session, direction, {row.origin, now});
        else if (differs && session->open[direction])
            changed_.push_back(keyOf(row.origin.session, direction));
}

void Stretches::begin(std::uint64_t number, Session& session, std::size_t direction, const OpenStretch& open)
{
    session.open[direction] = open;
    changed_.push_back(keyOf(number, direction));
}

void Stretches::end(std::uint64_t number, Session& session, std::size_t direction, const StretchMoment& when,
                    StretchEnding ending)
{
    const OpenStretch open = *std::exchange(session.open[direction], std::nullopt);
    changed_.push_back(keyOf(number, direction));
    const auto& counted = session.counted[direction];
    const auto happened = beginning(open.began, counted);
    const auto [began, seconds] = lengthOf(happened, open.began.arrived, when, earlierEnd_);
    if (ending == StretchEnding::Vanished && happened) {
        const bool goesOn = *happened > *open.began.happened;
        rememberBrokenOff({session.owner, direction, {goesOn ? counted->from : *happened, *happened + seconds}});
    }
    if (seconds > 0)
        ended_.push_back({open.origin, direction == recording, began, seconds, session.state, ending});
    else
        ++leftOut_;
}

void Stretches::end(std::uint64_t session, double time, StretchEnding ending)
{
    Session* const found = find(session);
    for (const std::size_t direction : directions)
        if (found != nullptr && found->open[direction])
            end(session, *found, direction, {.arrived = time, .happened = {}}, ending);
}

void Stretches::endAll(double time)
{
    for (const auto& [number, session] : sessions_)
        end(number, time, StretchEnding::ServiceEnded);
    sessions_.clear();
}

Stretches::Session* Stretches::find(std::uint64_t number)
{
    const auto found = sessions_.find(number);
    return found == sessions_.end() ? nullptr : &found->second;
}

// Null of one that does not live: no end of it would come.
Stretches::Session* Stretches::sessionOf(std::uint64_t number, const OwnerOf& ownerOf)
{
    if (Session* const session = find(number))
        return session;
    const auto owner = ownerOf(number);
    if (!owner)
        return nullptr;
    Session& session = sessions_[number];
    session.owner = *owner;
    for (const std::size_t direction : directions)
        session.counted[direction] = lastBrokenOff(*owner, direction);
    return &session;
}

void Stretches::rememberBrokenOff(const BrokenOff& brokenOff)
{
    brokenOff_.push_back(brokenOff);
    if (brokenOff_.size() > mostBrokenOff)
        brokenOff_.pop_front();
}

std::optional<CountedTime> Stretches::lastBrokenOff(const SessionOwner& owner, std::size_t direction) const
{
    for (const BrokenOff& each : brokenOff_ | std::views::reverse)
        if (each.owner == owner && each.direction == direction)
            return each.counted;
    return std::nullopt;
}

// --- Writing them

void Stretches::sortChanged()
{
    std::ranges::sort(changed_);
    const auto repeated = std::ranges::unique(changed_);
    changed_.erase(repeated.begin(), repeated.end());
    // What began and ended since the last transaction has no row and needs none.
    std::erase_if(changed_, [this](Key key) {
        const Session* const session = find(key / 2);
        return !rows_.contains(key) && (session == nullptr || !session->open[key % 2]);
    });
}

std::vector<Stretches::Change> Stretches::rowChanges()
{
    sortChanged();
    std::vector<Change> changes;
    for (const Key key : changed_) {
        Session* const session = find(key / 2);
        const bool isOpen = session != nullptr && session->open[key % 2];
        changes.push_back({.key = key,
                           .open = isOpen ? &*session->open[key % 2] : nullptr,
                           .isRecording = key % 2 == recording,
                           .state = isOpen ? &session->state : nullptr});
    }
    return changes;
}

void Stretches::written()
{
    for (const auto& [key, open, isRecording, state] : rowChanges())
        if (open != nullptr)
            rows_.insert(key);
        else
            rows_.erase(key);
    ended_.clear();
    changed_.clear();
    wereWritten_ = true;
}

void Stretches::notWritten()
{
    sortChanged();
    if (ended_.size() > mostWaiting) {
        leftOut_ += ended_.size() - mostWaiting;
        ended_.resize(mostWaiting);
    }
}

void Stretches::forgetRows()
{
    rows_.clear();
    changed_.clear();
    for (const auto& [number, session] : sessions_)
        for (const std::size_t direction : directions)
            if (session.open[direction])
                changed_.push_back(keyOf(number, direction));
}

} // namespace platform
