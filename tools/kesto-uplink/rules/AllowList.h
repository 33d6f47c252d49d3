// SPDX-License-Identifier: Apache-2.0
// What may leave: a rule for each key of an event, by the event's name, and for each column of stretches and sessions.
// What has no rule stays.
//
// Where several rules are about the same key, the one that stands last in the file counts.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_uplink {

struct Rule {
    enum class Action : std::uint8_t {
        Keep,
        Drop,
        Hash, // a keyed hash of the value, as text
        Bucket // the range that the number is in
    };
    std::string key = {}; // of a payload, or a column
    Action action = Action::Drop;
    std::vector<double> edges = {}; // of buckets, growing
    unsigned line = 0; // in the file, as below
};

// The rules for events whose name matches a glob. Without any rule, such events leave without their payload.
struct EventRules {
    std::string names; // a glob
    std::vector<Rule> rules; // in the order of the file, as all that follow
    unsigned line = 0;
};

struct AllowList {
    std::vector<EventRules> events;
    std::optional<std::vector<Rule>> stretches; // none: no stretch leaves
    std::optional<std::vector<Rule>> sessions; // the same
};

// Applies an allow list, and counts what its rules met, so that a rule that never applies is found. One thread.
class Filter {
public:
    // The hash key is that of `keyedHash`.
    Filter(AllowList allowed, std::string hashKey);

    // The part of the payload that may leave with an event of that name; nothing if the event may not leave.
    [[nodiscard]] std::optional<foundation::Dictionary> event(std::string_view name,
                                                              const foundation::Dictionary& payload);
    [[nodiscard]] bool allowsEvent(std::string_view name) const;
    [[nodiscard]] bool allowsStretches() const noexcept { return allowed_.stretches.has_value(); }
    [[nodiscard]] bool allowsSessions() const noexcept { return allowed_.sessions.has_value(); }

    // The value of a column as it may leave; nothing if it may not, or if there is none.
    [[nodiscard]] std::optional<foundation::Value> ofStretch(std::string_view column, const foundation::Value& value);
    [[nodiscard]] std::optional<foundation::Value> ofSession(std::string_view column, const foundation::Value& value);

    // Lines that met nothing so far: what stands in the file by mistake, each a sentence for a person.
    [[nodiscard]] std::vector<std::string> unused() const;

private:
    AllowList allowed_;
    std::string hashKey_;
};

} // namespace kesto_uplink
