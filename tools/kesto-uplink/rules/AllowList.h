// SPDX-License-Identifier: Apache-2.0
// What may leave: a rule for each key of an event, by the event's name, and for each column of stretches and sessions.
// What has no rule stays.
//
// Where several rules are about the same key, the one that stands last in the file counts.
#pragma once

#include "foundation/values/Value.h"

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

namespace kesto_uplink {

struct Rule {
    enum class Action : std::uint8_t {
        Keep,
        Drop,
        Hash, // "hash-" and the keyed hash of the text, or of the JSON of another value
        Bucket // between which edges the number is; what is no number stays
    };
    std::string key = {}; // of a payload, or a column
    Action action = Action::Drop;
    std::vector<double> edges = {}; // of buckets, growing; each belongs to the bucket above it
    unsigned line = 0; // in the file, as below
};

// The rules for events whose name matches a glob. Without any rule, such events leave with an empty payload.
struct EventRules {
    std::string names = {}; // a glob
    std::vector<Rule> rules = {}; // at most one for a key
    unsigned line = 0;
};

struct AllowList {
    std::vector<EventRules> events = {};
    std::optional<std::vector<Rule>> stretches = {}; // by column; none: no stretch leaves
    std::optional<std::vector<Rule>> sessions = {}; // the same
};

// Something in the file that meets nothing in the store, so it may be a mistake.
struct Unused {
    unsigned line = 0;
    std::string what; // for a person
};

// Applies an allow list, and notes which of its rules met something. One thread.
class Filter {
public:
    // The hash key is that of `keyedHash`.
    Filter(AllowList allowed, std::string hashKey);
    Filter(const Filter&) = delete;
    Filter& operator=(const Filter&) = delete;

    [[nodiscard]] bool allowsEvent(std::string_view name);
    // The part of the payload that may leave with an event of that name; nothing if the event may not leave. A bucket
    // becomes a text, such as "<1", "1-10" or ">=10".
    [[nodiscard]] std::optional<foundation::Dictionary> event(std::string_view name,
                                                              const foundation::Dictionary& payload);

    [[nodiscard]] bool allowsStretches() const noexcept { return allowed_.stretches.has_value(); }
    [[nodiscard]] bool allowsSessions() const noexcept { return allowed_.sessions.has_value(); }
    // The value of a column as it may leave; nothing if it may not, or if it is null. In place of a number in a bucket
    // comes the bucket's lower edge, so that the column stays one of numbers; below the first edge it is nothing.
    [[nodiscard]] std::optional<foundation::Value> ofStretch(std::string_view column,
                                                             const foundation::Value& value) const
    {
        return ofColumn(allowed_.stretches, column, value);
    }
    [[nodiscard]] std::optional<foundation::Value> ofSession(std::string_view column,
                                                             const foundation::Value& value) const
    {
        return ofColumn(allowed_.sessions, column, value);
    }

    // Names that no event had, and keys that no such event had, in the order of the file.
    [[nodiscard]] std::vector<Unused> unused() const;

private:
    struct RulesOfKey {
        std::vector<const Rule*> all;
        const Rule* last = nullptr; // the one that counts
    };
    using RulesOfName = std::map<std::string, RulesOfKey, std::less<>>; // by key

    // Null: events of that name may not leave.
    [[nodiscard]] const RulesOfName* rulesOf(std::string_view name);
    [[nodiscard]] std::optional<foundation::Value> ofPayload(const Rule& rule, const foundation::Value& value) const;
    [[nodiscard]] std::optional<foundation::Value> ofColumn(const std::optional<std::vector<Rule>>& rules,
                                                            std::string_view column,
                                                            const foundation::Value& value) const;

    const AllowList allowed_;
    const std::string hashKey_;
    std::map<std::string, std::optional<RulesOfName>, std::less<>> known_; // by name
    std::set<const EventRules*> metNames_;
    std::set<const Rule*> metKeys_;
};

} // namespace kesto_uplink
