// SPDX-License-Identifier: Apache-2.0
// The rules of a name are worked out once and remembered, because a device has few names.
#include "kesto-uplink/rules/AllowList.h"

#include "foundation/values/Json.h"
#include "kesto/store/EventDatabase.h"
#include "platform/linux/store/applications/KeyedHash.h"

#include <algorithm>
#include <fmt/format.h>
#include <utility>

namespace kesto_uplink {

using foundation::Dictionary;
using foundation::Number;
using foundation::Value;

namespace {

constexpr std::size_t mostKnownNames = 1024;

std::optional<double> numberOf(const Value& value)
{
    const auto number = value.number();
    return number && number->kind() != Number::Kind::Boolean ? std::optional(number->doubleValue()) : std::nullopt;
}

// How many of the edges are not above the number.
std::optional<std::size_t> bucketOf(const Value& value, const std::vector<double>& edges)
{
    const auto number = numberOf(value);
    if (!number || *number != *number)
        return std::nullopt;
    return static_cast<std::size_t>(std::ranges::upper_bound(edges, *number) - edges.begin());
}

std::string bucketText(std::size_t bucket, const std::vector<double>& edges)
{
    const auto edge = [&edges](std::size_t place) { return Number(edges[place]).text(); };
    if (bucket == 0)
        return "<" + edge(0);
    if (bucket == edges.size())
        return ">=" + edge(bucket - 1);
    return edge(bucket - 1) + "-" + edge(bucket);
}

Value hashOf(const Value& value, const std::string& key)
{
    std::string json;
    if (value.kind() != Value::Kind::String)
        foundation::appendJsonText(value, json);
    return "hash-" + platform::keyedHash(key, value.kind() == Value::Kind::String ? value.stringView() : json);
}

const Rule* ruleOf(std::string_view key, const std::optional<std::vector<Rule>>& rules)
{
    if (!rules)
        return nullptr;
    const auto found = std::ranges::find(*rules, key, &Rule::key);
    return found == rules->end() ? nullptr : &*found;
}

} // namespace

Filter::Filter(AllowList allowed, std::string hashKey) : allowed_(std::move(allowed)), hashKey_(std::move(hashKey)) { }

const Filter::RulesOfName* Filter::rulesOf(std::string_view name)
{
    if (const auto known = known_.find(name); known != known_.end())
        return known->second ? &*known->second : nullptr;
    std::optional<RulesOfName> rules;
    for (const EventRules& table : allowed_.events) {
        if (!matches(std::string(name), table.names))
            continue;
        metNames_.insert(&table);
        if (!rules)
            rules.emplace();
        for (const Rule& rule : table.rules) {
            auto& ofKey = (*rules)[rule.key];
            ofKey.all.push_back(&rule);
            if (ofKey.last == nullptr || rule.line >= ofKey.last->line)
                ofKey.last = &rule;
        }
    }
    if (known_.size() == mostKnownNames)
        known_.clear();
    const auto& kept = known_.emplace(std::string(name), std::move(rules)).first->second;
    return kept ? &*kept : nullptr;
}

bool Filter::allowsEvent(std::string_view name)
{
    return rulesOf(name) != nullptr;
}

std::optional<Dictionary> Filter::event(std::string_view name, const Dictionary& payload)
{
    const RulesOfName* const rules = rulesOf(name);
    if (rules == nullptr)
        return std::nullopt;
    Dictionary::Entries entries;
    for (const auto& [key, value] : payload) {
        const auto found = rules->find(key.view());
        if (found == rules->end())
            continue;
        metKeys_.insert(found->second.all.begin(), found->second.all.end());
        if (auto left = ofPayload(*found->second.last, value))
            entries.push_back({key, *std::move(left)});
    }
    return Dictionary(std::move(entries));
}

std::optional<Value> Filter::ofPayload(const Rule& rule, const Value& value) const
{
    switch (rule.action) {
    case Rule::Action::Keep: return value;
    case Rule::Action::Drop: return std::nullopt;
    case Rule::Action::Hash: return hashOf(value, hashKey_);
    case Rule::Action::Bucket: break;
    }
    const auto bucket = bucketOf(value, rule.edges);
    return bucket ? std::optional<Value>(bucketText(*bucket, rule.edges)) : std::nullopt;
}

std::optional<Value> Filter::ofColumn(const std::optional<std::vector<Rule>>& rules, std::string_view column,
                                      const Value& value) const
{
    const Rule* const rule = ruleOf(column, rules);
    if (rule == nullptr || value.isNull())
        return std::nullopt;
    if (rule->action != Rule::Action::Bucket)
        return ofPayload(*rule, value);
    const auto bucket = bucketOf(value, rule->edges);
    return bucket && *bucket > 0 ? std::optional<Value>(rule->edges[*bucket - 1]) : std::nullopt;
}

std::vector<Unused> Filter::unused() const
{
    std::vector<Unused> found;
    for (const EventRules& table : allowed_.events) {
        if (!metNames_.contains(&table)) {
            found.push_back({table.line, fmt::format("no event has a name that matches \"{}\"", table.names)});
            continue;
        }
        for (const Rule& rule : table.rules)
            if (!metKeys_.contains(&rule))
                found.push_back(
                    {rule.line, fmt::format("no event that matches \"{}\" had the key \"{}\"", table.names, rule.key)});
    }
    std::ranges::stable_sort(found, {}, &Unused::line);
    return found;
}

} // namespace kesto_uplink
