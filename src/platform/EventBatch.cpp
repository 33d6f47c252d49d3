// All texts stand in one buffer, behind each other, so that an event needs none of its own.
#include "platform/EventBatch.h"

#include "foundation/values/Json.h"

#include <cmath>
#include <iterator>

namespace platform {
namespace {

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

std::optional<double> timeIn(const foundation::Dictionary& payload)
{
    const foundation::Value* const stamp = payload.find(timestampKey);
    const auto number = stamp == nullptr ? std::nullopt : stamp->number();
    if (!number || number->kind() == foundation::Number::Kind::Boolean || !std::isfinite(number->doubleValue()))
        return std::nullopt;
    return number->doubleValue();
}

} // namespace

void EventBatch::add(double time, const Origin& origin, std::string_view name, const foundation::Dictionary& payload)
{
    const bool repeatsPayload = !payloads_.empty() && payload.isSameObject(lastPayload_);
    ++events_;
    if (repeatsPayload && isSecondEventOfLast(origin, name)) {
        messages_.back().secondName = append(name);
        return;
    }
    if (!repeatsPayload)
        addPayload(payload);
    messages_.push_back({time, timeIn(payload), origin, append(name), {}, payloads_.size() - 1});
}

// All empty payloads are the same object, so they say nothing about a message.
bool EventBatch::isSecondEventOfLast(const Origin& origin, std::string_view name) const
{
    const Message& last = messages_.back();
    return last.secondName.size == 0 && last.origin == origin && view(last.name) != name && !lastPayload_.empty();
}

void EventBatch::addPayload(const foundation::Dictionary& payload)
{
    lastPayload_ = payload;
    const std::size_t bytes = payload.roughBytes();
    if (bytes > largestWrittenAtOnce) {
        waitingBytes_ += bytes;
        payloads_.push_back({{}, payload});
    } else {
        payloads_.push_back({write(payload), {}});
    }
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
    for (Message message : other.messages_) {
        message.name.begin += texts_.size();
        message.secondName.begin += texts_.size();
        message.payload += payloads_.size();
        messages_.push_back(message);
    }
    for (Payload& payload : other.payloads_) {
        payload.json.begin += texts_.size();
        payloads_.push_back(std::move(payload));
    }
    texts_ += other.texts_;
    events_ += other.events_;
    waitingBytes_ += other.waitingBytes_;
    if (!other.payloads_.empty())
        lastPayload_ = std::move(other.lastPayload_);
    moveBehind(announcements_.sources, other.announcements_.sources);
    moveBehind(announcements_.sessions, other.announcements_.sessions);
    moveBehind(announcements_.sourceEnds, other.announcements_.sourceEnds);
    moveBehind(announcements_.sessionEnds, other.announcements_.sessionEnds);
    other.clear();
}

void EventBatch::clear()
{
    platform::clear(messages_, mostElementsKept);
    platform::clear(payloads_, mostElementsKept);
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
    return messages_.size() * sizeof(Message) + texts_.size() + waitingBytes_ + ends * sizeof(OriginEnd);
}

std::span<const EventRow> EventBatch::rows()
{
    for (Payload& payload : payloads_)
        if (const auto waiting = std::exchange(payload.waiting, {}); !waiting.empty())
            payload.json = write(waiting);
    rows_.clear();
    rowsWithoutJson_.clear();
    for (const auto& [time, happened, origin, name, secondName, payload] : messages_) {
        const Text& json = payloads_[payload].json;
        auto& rows = json.size != 0 ? rows_ : rowsWithoutJson_;
        rows.push_back({time, happened, origin, view(name), view(secondName), view(json)});
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
