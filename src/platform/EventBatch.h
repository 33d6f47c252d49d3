// Events on their way to the keeper, written in the form in which it stores them.
//
// The thread that built a payload writes its JSON at once: done on another thread, its shared strings would move
// between two processors. Only a large payload waits for the thread that keeps the events, because clients wait for the
// thread that adds it.
#pragma once

#include "foundation/values/Value.h"

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace platform {

// One event in its stored form.
struct EventRow {
    double time = 0; // seconds since 1970 UTC
    std::string_view name;
    std::string_view payload; // JSON
};

// One thread at a time.
class EventBatch {
public:
    // In bytes of memory, roughly: a payload that takes more waits.
    static constexpr std::size_t largestWrittenAtOnce = 64 * 1024;

    // The time is in seconds since 1970 UTC.
    void add(double time, std::string_view name, const foundation::Dictionary& payload);
    // Puts the events of the other behind these; it is then empty.
    void takeFrom(EventBatch& other);
    void clear();

    // How many events were added, and how many bytes they take, roughly.
    [[nodiscard]] std::size_t size() const noexcept { return events_.size(); }
    [[nodiscard]] std::size_t bytes() const noexcept;

    // The events in their order, without those with a payload that JSON cannot express. Valid until the batch changes.
    [[nodiscard]] std::span<const EventRow> rows();

private:
    struct Text { // in `texts_`
        std::size_t begin = 0;
        std::size_t size = 0;
    };
    struct Event {
        double time;
        Text name;
        std::size_t payload; // its place in `payloads_`
    };
    struct Payload {
        Text json; // empty where there is none
        foundation::Dictionary waiting; // becomes JSON in `rows`
    };

    [[nodiscard]] Text write(const foundation::Dictionary& payload);
    [[nodiscard]] std::string_view view(const Text& text) const;

    std::vector<Event> events_;
    std::vector<Payload> payloads_;
    foundation::Dictionary lastPayload_; // both events of a message share one
    std::string texts_;
    std::size_t waitingBytes_ = 0;
    std::vector<EventRow> rows_;
};

} // namespace platform
