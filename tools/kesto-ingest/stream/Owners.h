// SPDX-License-Identifier: Apache-2.0
// Which credential used a pseudonym first. The stream knows it: the first message of a pseudonym's subject wins, also
// if two copies of the program ask at the same time. A copy remembers answers only to ask less.
#pragma once

#include "kesto-ingest/stream/Stream.h"

#include <expected>
#include <string>
#include <unordered_map>

namespace kesto_ingest {

// One thread. The stream must outlive it.
class Owners {
public:
    explicit Owners(Stream& stream) : stream_(stream) { }

    // The credential that owns the pseudonym: this one if no other came first.
    [[nodiscard]] std::expected<std::string, std::string> claim(const std::string& device,
                                                                const std::string& credential);

private:
    Stream& stream_;
    std::unordered_map<std::string, std::string> known_;
};

} // namespace kesto_ingest
