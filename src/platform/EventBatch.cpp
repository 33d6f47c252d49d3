// All texts stand in one buffer, behind each other, so that an event needs none of its own.
#include "platform/EventBatch.h"

#include "foundation/values/Json.h"

#include <iterator>
#include <utility>

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

} // namespace

void EventBatch::add(double time, std::string_view name, const foundation::Dictionary& payload)
{
    if (payloads_.empty() || !payload.isSameObject(lastPayload_)) {
        lastPayload_ = payload;
        const std::size_t bytes = payload.roughBytes();
        if (bytes > largestWrittenAtOnce) {
            waitingBytes_ += bytes;
            payloads_.push_back({{}, payload});
        } else {
            payloads_.push_back({write(payload), {}});
        }
    }
    events_.push_back({time, {texts_.size(), name.size()}, payloads_.size() - 1});
    texts_ += name;
}

void EventBatch::takeFrom(EventBatch& other)
{
    if (events_.empty())
        return std::swap(*this, other);
    for (Event event : other.events_) {
        event.name.begin += texts_.size();
        event.payload += payloads_.size();
        events_.push_back(event);
    }
    for (Payload& payload : other.payloads_) {
        payload.json.begin += texts_.size();
        payloads_.push_back(std::move(payload));
    }
    texts_ += other.texts_;
    waitingBytes_ += other.waitingBytes_;
    if (!other.payloads_.empty())
        lastPayload_ = std::move(other.lastPayload_);
    other.clear();
}

void EventBatch::clear()
{
    platform::clear(events_, mostElementsKept);
    platform::clear(payloads_, mostElementsKept);
    platform::clear(texts_, mostBytesKept);
    platform::clear(rows_, mostElementsKept);
    lastPayload_ = {};
    waitingBytes_ = 0;
}

std::size_t EventBatch::bytes() const noexcept
{
    return events_.size() * sizeof(Event) + texts_.size() + waitingBytes_;
}

std::span<const EventRow> EventBatch::rows()
{
    for (Payload& payload : payloads_)
        if (const auto waiting = std::exchange(payload.waiting, {}); !waiting.empty())
            payload.json = write(waiting);
    rows_.clear();
    for (const auto& [time, name, payload] : events_)
        if (const auto& json = payloads_[payload].json; json.size != 0)
            rows_.push_back({time, view(name), view(json)});
    return rows_;
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
