// SPDX-License-Identifier: Apache-2.0
// The names of the streams, and of the subjects in them.
#pragma once

#include <algorithm>
#include <string>
#include <string_view>

namespace kesto_ingest {

constexpr const char* eventsStream = "KESTO"; // kesto.events.<credential>: batches
constexpr const char* ownerStream = "KESTO_OWNER"; // kesto.owner.<device>: the credential that used it first
constexpr const char* storedStream = "KESTO_STORED"; // kesto.stored.<credential>.<device>: up to which row
constexpr const char* deadStream = "KESTO_DEAD"; // kesto.dead.<credential>: what could not be stored, and why
constexpr const char* consumerName = "ingest";

constexpr std::string_view eventsPrefix = "kesto.events.";
constexpr std::string_view ownerPrefix = "kesto.owner.";
constexpr std::string_view storedPrefix = "kesto.stored.";
constexpr std::string_view deadPrefix = "kesto.dead.";

// The name of the credential; empty if the subject has none that can be one.
[[nodiscard]] inline std::string credentialOf(std::string_view subject)
{
    if (!subject.starts_with(eventsPrefix))
        return {};
    const std::string_view name = subject.substr(eventsPrefix.size());
    const bool isName = std::ranges::all_of(name, [](char character) {
        return (character >= 'a' && character <= 'z') || (character >= 'A' && character <= 'Z')
            || (character >= '0' && character <= '9') || character == '-' || character == '_';
    });
    return isName ? std::string(name) : std::string();
}

} // namespace kesto_ingest
