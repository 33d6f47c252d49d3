// SPDX-License-Identifier: Apache-2.0
// A stream in memory, which can be away. What is taken and neither acknowledged nor given back stays taken until
// `forgetTaken`.
#pragma once

#include "kesto-ingest/stream/Stream.h"

#include <algorithm>
#include <deque>
#include <list>
#include <map>
#include <memory>
#include <string>
#include <vector>

namespace kesto_ingest {

class FakeStream : public Stream {
public:
    struct Letter {
        std::string subject;
        std::string payload;
        Headers headers;
    };

    // As a device does.
    void send(const std::string& subject, std::string payload, const std::string& edition = "1")
    {
        waiting_.push_back({++sequence_, subject, edition, std::make_shared<std::string>(std::move(payload)), false});
    }

    [[nodiscard]] std::expected<std::vector<Delivery>, std::string> fetch(std::size_t most,
                                                                          std::chrono::milliseconds) override
    {
        if (isAway)
            return std::unexpected("away");
        std::vector<Delivery> deliveries;
        while (!waiting_.empty() && deliveries.size() < most) {
            Batch batch = std::move(waiting_.front());
            waiting_.pop_front();
            deliveries.push_back(
                {batch.subject, batch.edition, *batch.payload, batch.sequence, batch.isRepeated, batch.payload});
            batch.isRepeated = true;
            taken_.push_back(std::move(batch));
        }
        return deliveries;
    }
    void acknowledge(const Delivery& delivery) override { taken_.erase(find(delivery)); }
    void workGoesOn(const Delivery&) override { ++toldThatWorkGoesOn; }
    void giveBack(const Delivery& delivery) override
    {
        const auto place = find(delivery);
        waiting_.push_back(*place);
        taken_.erase(place);
    }
    [[nodiscard]] std::expected<std::optional<Entry>, std::string> last(const std::string& subject) override
    {
        if (isAway)
            return std::unexpected("away");
        const auto entry = entries.find(subject);
        return entry == entries.end() ? std::nullopt : std::optional(entry->second);
    }
    [[nodiscard]] std::expected<std::vector<PutAnswer>, std::string> put(std::span<const Put> asked) override
    {
        if (isAway || takesNoPut)
            return std::unexpected("away");
        std::vector<PutAnswer> answers;
        for (const Put& each : asked) {
            Entry& entry = entries[each.subject];
            PutAnswer& answer = answers.emplace_back();
            if (entry.sequence != each.after)
                continue;
            ++puts;
            answer = ++sequence_;
            entry = {.payload = each.payload, .sequence = *answer};
        }
        return answers;
    }
    [[nodiscard]] std::expected<Publication, std::string> publish(const std::string& subject, std::string_view payload,
                                                                  const Headers& headers) override
    {
        if (isAway || isDeaf)
            return std::unexpected("away");
        if (payload.size() > largestLetter)
            return Publication::TooLarge;
        const std::string& identity = headers.at("Nats-Msg-Id");
        if (std::ranges::none_of(letters,
                                 [&](const Letter& each) { return each.headers.at("Nats-Msg-Id") == identity; }))
            letters.push_back({subject, std::string(payload), headers});
        return Publication::Taken;
    }

    // As the stream does if a copy of the program was killed.
    void forgetTaken()
    {
        waiting_.insert(waiting_.end(), taken_.begin(), taken_.end());
        taken_.clear();
    }
    // Gives back in any order, as several copies do.
    void rotate() { std::ranges::rotate(waiting_, waiting_.begin() + 1); }
    [[nodiscard]] std::size_t unacknowledged() const { return waiting_.size() + taken_.size(); }

    bool isAway = false;
    bool isDeaf = false; // for what is published
    bool takesNoPut = false;
    std::size_t largestLetter = 1'000'000;
    int toldThatWorkGoesOn = 0;
    int puts = 0; // those that were taken
    std::map<std::string, Entry> entries;
    std::vector<Letter> letters;

private:
    struct Batch {
        std::uint64_t sequence;
        std::string subject;
        std::string edition;
        std::shared_ptr<std::string> payload;
        bool isRepeated;
    };
    [[nodiscard]] std::list<Batch>::iterator find(const Delivery& delivery)
    {
        return std::ranges::find(taken_, delivery.sequence, &Batch::sequence);
    }

    std::uint64_t sequence_ = 0;
    std::deque<Batch> waiting_;
    std::list<Batch> taken_;
};

} // namespace kesto_ingest
