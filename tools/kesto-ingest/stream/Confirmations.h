// SPDX-License-Identifier: Apache-2.0
// Tells each device up to which row the database has its rows, so that the device may forget them.
#pragma once

#include "kesto-ingest/stream/Stream.h"

#include <cstdint>
#include <expected>
#include <functional>
#include <map>
#include <span>
#include <string>
#include <unordered_map>
#include <utility>

namespace kesto_ingest {

struct Confirmation {
    std::string credential;
    std::string device;
    std::string epoch;
    std::uint64_t id = 0;
    bool isRepeated = false; // its batch came before
};

// One thread. The stream must outlive it.
class Confirmations {
public:
    // `holdOn` is called while many devices are told.
    explicit Confirmations(
        Stream& stream, std::function<void()> holdOn = [] { })
        : stream_(stream),
          holdOn_(std::move(holdOn))
    {
    }

    // Within an epoch what is told never goes back, whatever other copies tell. A batch that came before says nothing
    // if another epoch is told: its own may be the older one. Of several epochs of one device the last counts.
    [[nodiscard]] std::expected<void, std::string> tell(std::span<const Confirmation> confirmations);

private:
    struct Told {
        std::string epoch;
        std::uint64_t id = 0;
        std::uint64_t sequence = 0; // 0: nothing is told
    };

    using Waiting = std::map<std::string, const Confirmation*>; // by subject

    [[nodiscard]] std::expected<void, std::string> leaveOutWhatIsTold(Waiting& waiting);
    [[nodiscard]] std::expected<void, std::string> put(Waiting& waiting);
    [[nodiscard]] std::expected<Told, std::string> look(const std::string& subject);

    Stream& stream_;
    std::function<void()> holdOn_;
    std::unordered_map<std::string, Told> told_; // by subject
};

} // namespace kesto_ingest
