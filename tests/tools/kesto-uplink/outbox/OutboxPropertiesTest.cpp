// SPDX-License-Identifier: Apache-2.0
// What must hold for every store and every allow list: no key leaves that no rule names, and each row that may leave
// does so exactly once, however the batches are cut.
#include "kesto-uplink/outbox/Outbox.h"

#include "support/TemporaryDirectory.h"
#include "tools/kesto-uplink/MadeEventStore.h"
#include "tools/kesto-uplink/outbox/Sent.h"

#include <array>
#include <gtest/gtest.h>
#include <rapidcheck/gtest.h>

namespace kesto_uplink_test {
namespace {

using kesto_uplink::Batch;
using kesto_uplink::Outbox;
using kesto_uplink::OutboxLimits;
using kesto_uplink::Rule;
using kesto_uplink::UplinkConfiguration;

constexpr std::array<const char*, 4> names = {"a.x", "a.y", "b.x", "b.y"};
constexpr std::array<const char*, 4> keys = {"one", "two", "three", "four"};
constexpr std::array<const char*, 5> globs = {"*", "a.*", "*.y", "b.x", "c"};
constexpr std::array<const char*, 5> values = {"1", "2.5", "\"text\"", "null", "{\"one\":[1]}"};

template <std::size_t size> const char* oneOf(const std::array<const char*, size>& choices)
{
    return choices[*rc::gen::inRange<std::size_t>(0, size)];
}

// A key is allowed for a name, by the rules as a person reads them.
bool mayLeave(const UplinkConfiguration& configuration, const std::string& name, const std::string& key)
{
    const auto fits = [&name](const std::string& glob) {
        return glob == "*" || glob == name || (glob == "a.*" && name[0] == 'a') || (glob == "*.y" && name[2] == 'y');
    };
    bool may = false;
    for (const auto& table : configuration.allowed.events)
        for (const Rule& rule : table.rules)
            if (fits(table.names) && rule.key == key)
                may = rule.action != Rule::Action::Drop;
    return may;
}

UplinkConfiguration someConfiguration()
{
    UplinkConfiguration configuration;
    unsigned line = 1;
    const int tables = *rc::gen::inRange(0, 4);
    for (int table = 0; table < tables; ++table) {
        kesto_uplink::EventRules rules{.names = oneOf(globs), .line = line++};
        for (const char* key : keys)
            if (*rc::gen::arbitrary<bool>())
                rules.rules.push_back({.key = key,
                                       .action = static_cast<Rule::Action>(*rc::gen::inRange(0, 4)),
                                       .edges = {2},
                                       .line = line++});
        configuration.allowed.events.push_back(rules);
    }
    if (*rc::gen::arbitrary<bool>())
        configuration.allowed.stretches.emplace();
    return configuration;
}

struct Made {
    support::TemporaryDirectory directory = {};
    std::filesystem::path database = directory / "analytics.sqlite3";
    UplinkConfiguration configuration = someConfiguration();
    std::vector<std::string> names = {}; // by ID - 1; empty: removed; "stretch"

    Made()
    {
        MadeEventStore store(database);
        const int rows = *rc::gen::inRange(0, 40);
        store.execute("BEGIN");
        for (int row = 0; row < rows; ++row)
            add(store);
        store.execute("COMMIT");
    }

    // Whether the row may leave, by the globs of the configuration.
    [[nodiscard]] bool leaves(const std::string& name) const
    {
        if (name.empty())
            return false;
        if (name == "stretch")
            return configuration.allowed.stretches.has_value();
        return std::ranges::any_of(configuration.allowed.events, [&name](const auto& table) {
            return table.names == "*" || table.names == name || (table.names == "a.*" && name.starts_with("a."))
                || (table.names == "*.y" && name.ends_with(".y"));
        });
    }

    [[nodiscard]] std::vector<std::string> expected() const
    {
        std::vector<std::string> result;
        for (std::size_t place = 0; place < names.size(); ++place)
            if (leaves(names[place]))
                result.push_back((names[place] == "stretch" ? "stretch " : "event ") + std::to_string(place + 1));
        return result;
    }

    [[nodiscard]] Outbox outbox(const OutboxLimits& limits = {}) const
    {
        return {database, configuration, {.pseudonym = "d", .hashKey = "key"}, limits};
    }

private:
    void add(MadeEventStore& store)
    {
        switch (*rc::gen::inRange(0, 6)) {
        case 0:
            store.addStretch();
            names.emplace_back("stretch");
            break;
        case 1:
            store.execute("UPDATE store SET next_event = next_event + 1");
            names.emplace_back("");
            break;
        default: {
            const std::string name = oneOf(kesto_uplink_test::names);
            std::string payload;
            for (const char* key : keys)
                if (*rc::gen::arbitrary<bool>())
                    payload += std::string(payload.empty() ? "" : ",") + '"' + key + "\":" + oneOf(values);
            store.addEvent(name, "{" + payload + "}");
            names.push_back(name);
        }
        }
    }
};

OutboxLimits someLimits()
{
    return {.rowBytes = *rc::gen::inRange<std::size_t>(1, 2000),
            .rows = *rc::gen::inRange(1, 20),
            .rowsLookedAt = *rc::gen::inRange(1, 30),
            .slice = {.rows = *rc::gen::inRange(1, 20), .payloadBytes = *rc::gen::inRange(1, 500)}};
}

RC_GTEST_PROP(OutboxProperties, NoKeyLeavesThatNoRuleNames, ())
{
    const Made made;
    Outbox outbox = made.outbox();
    for (const Batch& batch : allBatches(outbox))
        for (const Dictionary& row : rowsIn(batch.lines))
            if (textIn(row, "kind") == "event") {
                const auto payload = row.find("payload")->dictionary();
                for (const auto& [key, value] : *payload)
                    RC_ASSERT(mayLeave(made.configuration, textIn(row, "name"), std::string(key.view())));
            }
}

RC_GTEST_PROP(OutboxProperties, EachRowLeavesOnceHoweverBatchesAreCut, ())
{
    const Made made;
    Outbox outbox = made.outbox(someLimits());
    RC_ASSERT(keysIn(allBatches(outbox)) == made.expected());
}

RC_GTEST_PROP(OutboxProperties, WhatDoesNotLeaveIsCounted, ())
{
    const Made made;
    Outbox outbox = made.outbox(someLimits());
    std::int64_t counted = 0;
    std::int64_t first = 0;
    std::int64_t last = 0;
    for (const Batch& batch : allBatches(outbox)) {
        counted += batch.rows + batch.leftOut.rows() + batch.leftOut.lostToAge;
        first = first == 0 ? batch.first.id : first;
        last = batch.last.id;
    }
    RC_ASSERT(counted == (last == 0 ? 0 : last - first + 1));
    RC_ASSERT(last == 0 || last == std::ssize(made.names));
}

} // namespace
} // namespace kesto_uplink_test
