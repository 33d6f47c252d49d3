// SPDX-License-Identifier: Apache-2.0
// The rows of a batch as lines of JSON, as docs/uplink.md describes them. What a rule does not allow is not written.
#pragma once

#include "kesto-uplink/outbox/StoreReader.h"
#include "kesto-uplink/rules/UplinkConfiguration.h"

#include <cstdint>
#include <expected>
#include <optional>
#include <string>

namespace kesto_uplink {

enum class WhyNot : std::uint8_t {
    NotAllowed, // no rule is about it
    Unreadable // its payload is no JSON object, it has a number that JSON cannot express, or its name is too long
};

// One thread.
class Rows {
public:
    Rows(const UplinkConfiguration& configuration, const Identity& identity);

    // Each a line with its end, without columns of too long a text. The application is that of the row's session.
    using Line = std::expected<std::string, WhyNot>;
    [[nodiscard]] Line event(const StoredEvent& event, const std::string& epoch, const std::string* application);
    [[nodiscard]] Line stretch(const StoredStretch& stretch, const std::string& epoch,
                               const std::string* application) const;
    [[nodiscard]] Line session(const StoredSession& session, const std::string& epoch) const;
    // The first line of a batch.
    [[nodiscard]] std::string device(const Cursor& first, const Cursor& last, double sent) const;

    [[nodiscard]] const Filter& filter() const noexcept { return filter_; }

private:
    class Object;

    Filter filter_;
    const std::string pseudonym_;
    const std::string model_;
    const std::string version_;
};

} // namespace kesto_uplink
