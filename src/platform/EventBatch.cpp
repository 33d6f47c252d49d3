// SPDX-License-Identifier: Apache-2.0
// All texts stand in one buffer, behind each other, so that an event needs none of its own.
#include "platform/EventBatch.h"

#include "foundation/values/Json.h"

#include <cmath>
#include <iterator>

namespace platform {
namespace {

using foundation::Number;
using foundation::Value;

// What a burst needed beyond that is given back.
constexpr std::size_t mostBytesKept = 256 * 1024;
constexpr std::size_t mostElementsKept = 1024;

template <typename Container> void clear(Container& container, std::size_t mostRoomKept)
{
    container.clear();
    if (container.capacity() > mostRoomKept)
        container = Container();
}

template <typename Element> void moveBehind(std::vector<Element>& elements, std::vector<Element>& others)
{
    if (others.empty())
        return;
    elements.insert(elements.end(), std::make_move_iterator(others.begin()), std::make_move_iterator(others.end()));
    others.clear();
}

template <typename Messages> EventsByOrigin countByOrigin(const Messages& messages)
{
    EventsByOrigin counts;
    for (const auto& message : messages)
        counts[message.origin] += message.events();
    return counts;
}

std::optional<Number> numberIn(const Value& value)
{
    const auto number = value.number();
    const bool isUsable = number && number->kind() != Number::Kind::Boolean && std::isfinite(number->doubleValue());
    return isUsable ? number : std::nullopt;
}

std::optional<double> doubleIn(const Value& value)
{
    const auto number = numberIn(value);
    return number ? std::optional(number->doubleValue()) : std::nullopt;
}

std::optional<std::string_view> textIn(const Value& value, std::size_t longest)
{
    if (value.kind() != Value::Kind::String)
        return std::nullopt;
    return foundation::cutBetweenCharacters(value.stringView(), longest);
}

struct PayloadFacts {
    std::optional<double> happened; // seconds since 1970 UTC
    PlayingFacts playing; // its texts are those of the payload
};

// In one pass. The length of a key comes first: it tells nearly all keys of a message apart.
PayloadFacts readFacts(const foundation::Dictionary& payload)
{
    PayloadFacts facts;
    PlayingFacts& playing = facts.playing;
    const auto keys = payload.keys();
    const auto values = payload.values();
    for (std::size_t place = 0; place < keys.size(); ++place) {
        const std::string_view key = keys[place];
        const Value& value = values[place];
        switch (key.size()) {
        case 14:
            if (key == "active_devices")
                playing.devices = textIn(value, PlayingFacts::longestDevices);
            break;
        case 16: playing.hasDuration |= key == "session_duration"; break;
        case 17:
            if (key == "PomoSessionVolume")
                playing.volume = doubleIn(value);
            else if (const auto channels = key == "mChannelsPerFrame" ? numberIn(value) : std::nullopt)
                playing.channels = channels->int64Value();
            break;
        case 21:
            if (key == "session_input_running")
                playing.isInputRunning = value.asBoolean();
            break;
        case 22:
            if (key == "session_output_running")
                playing.isOutputRunning = value.asBoolean();
            break;
        case 23:
            if (key == "session_selected_format")
                playing.format = textIn(value, PlayingFacts::longestFormat);
            break;
        case 24:
            if (key == timestampKey)
                facts.happened = doubleIn(value);
            break;
        default: break;
        }
    }
    return facts;
}

} // namespace

bool EventBatch::add(double time, const Origin& origin, std::string_view name, const foundation::Dictionary& payload,
                     const PayloadFilter& filter)
{
    const bool repeatsPayload = !payloads_.empty() && payload.isSameObject(lastPayload_);
    if (!repeatsPayload && !addPayload(payload, filter))
        return false;
    ++events_;
    if (repeatsPayload && isSecondEventOfLast(origin, name))
        messages_.back().secondName = append(name);
    else
        messages_.push_back({time, origin, append(name), {}, payloads_.size() - 1});
    return true;
}

// All empty payloads are the same object, so they say nothing about a message.
bool EventBatch::isSecondEventOfLast(const Origin& origin, std::string_view name) const
{
    const Message& last = messages_.back();
    return last.secondName.size == 0 && last.origin == origin && view(last.name) != name && !lastPayload_.empty();
}

bool EventBatch::addPayload(const foundation::Dictionary& payload, const PayloadFilter& filter)
{
    if (!filter) {
        addPayload(payload);
    } else {
        const auto shown = filter(payload);
        if (!shown)
            return false;
        addPayload(*shown);
    }
    lastPayload_ = payload;
    return true;
}

void EventBatch::addPayload(const foundation::Dictionary& payload)
{
    const auto [happened, playing] = readFacts(payload);
    const std::size_t facts = playing == PlayingFacts() ? noFacts : addFacts(playing);
    const std::size_t bytes = payload.roughBytes();
    if (bytes > largestWrittenAtOnce) {
        waitingBytes_ += bytes;
        payloads_.push_back({{}, happened, facts, payload});
    } else {
        payloads_.push_back({write(payload), happened, facts, {}});
    }
}

std::size_t EventBatch::addFacts(const PlayingFacts& playing)
{
    facts_.push_back({playing, append(playing.devices.value_or("")), append(playing.format.value_or(""))});
    return facts_.size() - 1;
}

void EventBatch::announce(SourceBegin begin)
{
    waitingBytes_ += sizeof begin + begin.processName.size();
    announcements_.sources.push_back(std::move(begin));
}

void EventBatch::announce(SessionBegin begin)
{
    waitingBytes_ += sizeof begin + begin.serviceType.size() + begin.application.size();
    announcements_.sessions.push_back(std::move(begin));
}

void EventBatch::takeFrom(EventBatch& other)
{
    if (empty())
        return std::swap(*this, other);
    const std::size_t messagesBefore = messages_.size();
    for (Message message : other.messages_) {
        message.name.begin += texts_.size();
        message.secondName.begin += texts_.size();
        message.payload += payloads_.size();
        messages_.push_back(message);
    }
    for (Payload& payload : other.payloads_) {
        payload.json.begin += texts_.size();
        payload.facts += payload.facts == noFacts ? 0 : facts_.size();
        payloads_.push_back(std::move(payload));
    }
    for (Facts facts : other.facts_) {
        facts.devices.begin += texts_.size();
        facts.format.begin += texts_.size();
        facts_.push_back(facts);
    }
    for (PlayingEnd& end : other.announcements_.playingEnds)
        end.place += messagesBefore;
    texts_ += other.texts_;
    events_ += other.events_;
    waitingBytes_ += other.waitingBytes_;
    if (!other.payloads_.empty())
        lastPayload_ = std::move(other.lastPayload_);
    moveBehind(announcements_.sources, other.announcements_.sources);
    moveBehind(announcements_.sessions, other.announcements_.sessions);
    moveBehind(announcements_.sourceEnds, other.announcements_.sourceEnds);
    moveBehind(announcements_.sessionEnds, other.announcements_.sessionEnds);
    moveBehind(announcements_.playingEnds, other.announcements_.playingEnds);
    other.clear();
}

void EventBatch::clear()
{
    platform::clear(messages_, mostElementsKept);
    platform::clear(payloads_, mostElementsKept);
    platform::clear(facts_, mostElementsKept);
    platform::clear(texts_, mostBytesKept);
    platform::clear(rows_, mostElementsKept);
    platform::clear(rowsWithoutJson_, mostElementsKept);
    announcements_ = {};
    lastPayload_ = {};
    waitingBytes_ = 0;
    events_ = 0;
}

std::size_t EventBatch::bytes() const noexcept
{
    const std::size_t ends = announcements_.sourceEnds.size() + announcements_.sessionEnds.size();
    return messages_.size() * sizeof(Message) + texts_.size() + waitingBytes_ + ends * sizeof(OriginEnd)
        + announcements_.playingEnds.size() * sizeof(PlayingEnd) + facts_.size() * sizeof(Facts);
}

std::span<const EventRow> EventBatch::rows()
{
    for (Payload& payload : payloads_)
        if (const auto waiting = std::exchange(payload.waiting, {}); !waiting.empty())
            payload.json = write(waiting);
    for (auto& [playing, devices, format] : facts_) {
        playing.devices = playing.devices ? std::optional(view(devices)) : std::nullopt;
        playing.format = playing.format ? std::optional(view(format)) : std::nullopt;
    }
    rows_.clear();
    rowsWithoutJson_.clear();
    for (std::size_t place = 0; place < messages_.size(); ++place) {
        const auto& [time, origin, name, secondName, payload] = messages_[place];
        const auto& [json, happened, facts, waiting] = payloads_[payload];
        auto& rows = json.size != 0 ? rows_ : rowsWithoutJson_;
        rows.push_back({time, happened, origin, view(name), view(secondName), view(json),
                        facts == noFacts ? nullptr : &facts_[facts].playing, place});
    }
    return rows_;
}

EventsByOrigin EventBatch::eventsByOrigin() const
{
    return countByOrigin(messages_);
}

EventsByOrigin eventsByOrigin(std::span<const EventRow> rows)
{
    return countByOrigin(rows);
}

EventBatch::Text EventBatch::append(std::string_view text)
{
    const std::size_t begin = texts_.size();
    texts_ += text;
    return {begin, text.size()};
}

EventBatch::Text EventBatch::write(const foundation::Dictionary& payload)
{
    const std::size_t begin = texts_.size();
    return foundation::appendJson(payload, texts_) ? Text{begin, texts_.size() - begin} : Text();
}

std::string_view EventBatch::view(const Text& text) const
{
    return std::string_view(texts_).substr(text.begin, text.size);
}

} // namespace platform
