// SPDX-License-Identifier: Apache-2.0
// Events on their way to the keeper, written in the form in which it stores them, and who sent them.
//
// The two events of a message, one for all services and one for its own, differ only in their names: they are one row
// with two names, so that the store keeps the payload once.
//
// The thread that built a payload writes its JSON at once: done on another thread, its shared strings would move
// between two processors. Only a large payload waits for the thread that keeps the events, because clients wait for the
// thread that adds it.
#pragma once

#include "foundation/values/Value.h"
#include "platform/Origin.h"
#include "platform/PlayingFacts.h"

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace platform {

// One message in its stored form: an event, or two with the same payload.
struct EventRow {
    double time = 0; // when the service sent it; seconds since 1970 UTC, as below
    std::optional<double> happened; // where the payload says it
    Origin origin;
    std::string_view name;
    std::string_view secondName; // empty: one event
    std::string_view payload; // JSON
    const PlayingFacts* playing = nullptr; // null: the payload says nothing about playing
    std::size_t place = 0; // its number in the batch, from 0

    [[nodiscard]] std::uint64_t events() const noexcept { return secondName.empty() ? 1 : 2; }
};

[[nodiscard]] EventsByOrigin eventsByOrigin(std::span<const EventRow> rows);

// One thread at a time.
class EventBatch {
public:
    // In bytes of memory, roughly: a payload that takes more waits.
    static constexpr std::size_t largestWrittenAtOnce = 64 * 1024;

    // The payload as it may be stored; nothing if the event may not be stored at all.
    using PayloadFilter = std::function<std::optional<foundation::Dictionary>(const foundation::Dictionary& payload)>;

    // The time is in seconds since 1970 UTC. An event with the payload object and the origin of the one before it, but
    // another name, is the second event of the same message, and has its time. A name is not empty. False if the filter
    // keeps the event out.
    bool add(double time, const Origin& origin, std::string_view name, const foundation::Dictionary& payload,
             const PayloadFilter& filter = {});
    void add(double time, std::string_view name, const foundation::Dictionary& payload)
    {
        add(time, {}, name, payload);
    }
    // Says who is behind an origin, before its first event or again when it changed; says that it ends.
    void announce(SourceBegin begin);
    void announce(SessionBegin begin);
    void announceSourceEnd(OriginEnd end) { announcements_.sourceEnds.push_back(end); }
    void announceSessionEnd(OriginEnd end) { announcements_.sessionEnds.push_back(end); }
    // Says that a session plays nothing any more, behind the messages that were added so far.
    void announcePlayingEnd(std::uint64_t session, double time, PlayingEnding ending)
    {
        announcements_.playingEnds.push_back({session, time, ending, messages_.size()});
    }

    // Puts the events of the other behind these; it is then empty.
    void takeFrom(EventBatch& other);
    void clear();

    // How many events were added, and how many bytes all of this takes, roughly.
    [[nodiscard]] std::size_t size() const noexcept { return events_; }
    [[nodiscard]] bool empty() const noexcept { return events_ == 0 && announcements_.empty(); }
    [[nodiscard]] std::size_t bytes() const noexcept;

    // The messages in their order, without those with a payload that JSON cannot express. Valid until the batch
    // changes.
    [[nodiscard]] std::span<const EventRow> rows();
    // Those that the last call of `rows` left out; they have no payload. Valid as long as its result.
    [[nodiscard]] std::span<const EventRow> rowsWithoutJson() const noexcept { return rowsWithoutJson_; }
    // Of all events. Also while another thread calls `rows`.
    [[nodiscard]] EventsByOrigin eventsByOrigin() const;
    [[nodiscard]] const OriginAnnouncements& announcements() const noexcept { return announcements_; }
    [[nodiscard]] OriginAnnouncements& announcements() noexcept { return announcements_; }

private:
    struct Text { // in `texts_`
        std::size_t begin = 0;
        std::size_t size = 0;
    };
    struct Message {
        double time;
        Origin origin;
        Text name;
        Text secondName;
        std::size_t payload; // its place in `payloads_`

        [[nodiscard]] std::uint64_t events() const noexcept { return secondName.size == 0 ? 1 : 2; }
    };
    struct Facts {
        PlayingFacts playing; // its texts point to where they stand now only in the results of `rows`
        Text devices;
        Text format;
    };
    static constexpr std::size_t noFacts = static_cast<std::size_t>(-1);
    struct Payload {
        Text json; // empty where there is none
        std::optional<double> happened;
        std::size_t facts; // its place in `facts_`, or `noFacts`
        foundation::Dictionary waiting; // becomes JSON in `rows`
    };

    [[nodiscard]] bool isSecondEventOfLast(const Origin& origin, std::string_view name) const;
    [[nodiscard]] bool addPayload(const foundation::Dictionary& payload, const PayloadFilter& filter);
    void addPayload(const foundation::Dictionary& payload);
    [[nodiscard]] Text append(std::string_view text);
    [[nodiscard]] Text write(const foundation::Dictionary& payload);
    [[nodiscard]] std::size_t addFacts(const PlayingFacts& playing);
    [[nodiscard]] std::string_view view(const Text& text) const;

    std::size_t events_ = 0;
    std::vector<Message> messages_;
    std::vector<Payload> payloads_;
    std::vector<Facts> facts_;
    foundation::Dictionary lastPayload_; // both events of a message share one
    std::string texts_;
    std::size_t waitingBytes_ = 0;
    std::vector<EventRow> rows_;
    std::vector<EventRow> rowsWithoutJson_;
    OriginAnnouncements announcements_;
};

} // namespace platform
