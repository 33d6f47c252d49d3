// SPDX-License-Identifier: Apache-2.0
// The rows of one group stand together in the table of counters, so one pass over it makes the nested dictionaries.
#include "ledger/Report.h"

#include <algorithm>
#include <cmath>
#include <iterator>
#include <span>
#include <utility>
#include <vector>

namespace ledger {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::String;
using foundation::Value;
using Rows = std::span<const CounterRow>;

// Takes the rows whose paths begin with the prefix.
Dictionary::Entries takeCounts(const Account& account, std::string_view prefix, Rows& rows)
{
    Dictionary::Entries entries;
    while (!rows.empty() && rows.front().path.starts_with(prefix)) {
        const std::string_view path = rows.front().path;
        const std::size_t end = path.find('.', prefix.size());
        const std::string_view key = path.substr(prefix.size(), end - prefix.size());
        if (end == std::string_view::npos) {
            entries.push_back({String(key), account[rows.front().counter]});
            rows = rows.subspan(1);
        } else {
            entries.push_back({String(key), Dictionary(takeCounts(account, path.substr(0, end + 1), rows))});
        }
    }
    return entries;
}

Array culprits(const std::vector<CulpritCount>& largest, std::uint64_t all)
{
    std::vector<Value> list;
    for (const auto& [culprit, count] : largest) {
        list.emplace_back(Dictionary{{"user", culprit.user},
                                     {"process", culprit.process},
                                     {"application", culprit.application},
                                     {"count", count}});
        all -= std::min(all, count);
    }
    if (all != 0)
        list.emplace_back(Dictionary{{"count", all}});
    return list;
}

Dictionary::Entries who(const Account& account)
{
    Dictionary::Entries entries;
    for (std::size_t place = 0; place < chargeCount; ++place) {
        const auto charge = static_cast<Charge>(place);
        entries.push_back({String(name(charge)), culprits(account.culprits[place], account.sum(charge))});
    }
    return entries;
}

Dictionary::Entries counts(const Account& account)
{
    Rows rows = counterRows();
    return takeCounts(account, {}, rows);
}

Dictionary::Entries counts(const Account& account, bool withCulprits)
{
    Dictionary::Entries entries = counts(account);
    if (withCulprits)
        entries.push_back({"who", Dictionary(who(account))});
    return entries;
}

// The entries of a work, behind those that say whose it is.
Value work(Dictionary::Entries whose, const Work& work)
{
    whose.push_back({"calls", work.calls});
    whose.push_back({"microseconds",
                     std::chrono::floor<std::chrono::microseconds>(work.time).count()}); // no floats, as for seconds
    whose.push_back({"bytes", work.bytes});
    return Dictionary(std::move(whose));
}

Array workByWhom(const WorkByWhom& byWhom)
{
    std::vector<Value> list;
    list.reserve(byWhom.largest.size() + 1);
    for (const auto& [user, process, each] : byWhom.largest)
        list.push_back(work({{"user", user}, {"process", process}}, each));
    if (byWhom.others != Work())
        list.push_back(work({}, byWhom.others));
    return list;
}

// Of the run; only while it lasts is it known who works.
Dictionary countsOfRun(const Ledger& ledger, const Account& sinceStart, bool withCulprits)
{
    Dictionary::Entries entries = counts(sinceStart);
    if (withCulprits) {
        Dictionary::Entries whose = who(sinceStart);
        whose.push_back({"time", workByWhom(ledger.workloads().byWhom())});
        entries.push_back({"who", Dictionary(std::move(whose))});
    }
    return entries;
}

// Whole seconds, because the service sends no floats; null stands for no time.
Value seconds(double time)
{
    return time == 0 ? Value() : Value(static_cast<std::int64_t>(std::floor(time)));
}

Dictionary store(const StoreState& state)
{
    return {{"events", state.events}, {"bytes", state.bytes}, {"oldest", seconds(state.oldest)}};
}

Dictionary now(const Account& sinceStart, const Backlog& backlog)
{
    const auto [connections, sessions] = openNow(sinceStart);
    return {{"connections", connections},
            {"sessions", sessions},
            {"waitingCalls", backlog.calls},
            {"waitingEvents", backlog.events}};
}

Dictionary memory(const MemoryState& state)
{
    return {{"used", state.used},
            {"limit", state.limit},
            {"limitOfAUser", state.limitOfAUser},
            {"limitOfAClient", state.limitOfAClient}};
}

Dictionary whole(Dictionary::Entries head, const Account& account, bool withCulprits, Value sinceStart)
{
    Dictionary::Entries entries = std::move(head);
    entries.push_back({"began", seconds(account.began)});
    entries.push_back({"store", store(account.store)});
    entries.push_back({"stored", account.store.events});
    std::ranges::move(counts(account, withCulprits), std::back_inserter(entries));
    entries.push_back({"sinceStart", std::move(sinceStart)});
    return entries;
}

} // namespace

OpenNow openNow(const Account& sinceStart)
{
    const auto left = [](std::uint64_t begun, std::uint64_t over) { return begun - std::min(begun, over); };
    return {.connections = left(sinceStart[Counter::ConnectionsAccepted],
                                sinceStart[Counter::ConnectionsEnded] + sinceStart[Counter::ConnectionsInterrupted]),
            .sessions = left(sinceStart[Counter::SessionsCreated], sinceStart[Counter::SessionsGone])};
}

Dictionary report(const Ledger& ledger, const ServiceProcess& process, bool withCulprits)
{
    const Account sinceStart = ledger.sinceStart();
    const auto [deliveries, events] = ledger.lastMinute();
    return whole({{"running", true},
                  {"version", process.version},
                  {"internalBuild", process.isInternalBuild},
                  {"started", seconds(process.started)},
                  {"now", now(sinceStart, process.backlog())},
                  {"rates", Dictionary{{"deliveries", deliveries}, {"events", events}}},
                  {"storing", process.isStoring()},
                  {"storingStretches", process.isStoringStretches()},
                  {"memory", memory(process.memory())}},
                 ledger.account(), withCulprits, countsOfRun(ledger, sinceStart, withCulprits));
}

Dictionary report(const Account& account, bool withCulprits)
{
    return whole({{"running", false},
                  {"version", {}},
                  {"internalBuild", {}},
                  {"started", {}},
                  {"now", {}},
                  {"rates", {}},
                  {"storing", {}},
                  {"storingStretches", {}},
                  {"memory", {}}},
                 account, withCulprits, {});
}

} // namespace ledger
