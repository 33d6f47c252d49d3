// SPDX-License-Identifier: Apache-2.0
// A report as a person and as node_exporter read it.
#include "kesto/status/StatusText.h"
#include "kesto/status/StatusMetrics.h"
#include "ledger/Report.h"
#include "support/EnvironmentVariable.h"

#include <gmock/gmock.h>
#include <regex>
#include <set>
#include <sstream>

namespace {

using foundation::Dictionary;
using ledger::Counter;
using ledger::Ledger;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

const ledger::ServiceProcess process{.version = "1.2.3",
                                     .isInternalBuild = true,
                                     .started = 1700000000,
                                     .memory =
                                         [] {
                                             return ledger::MemoryState{.used = 4'000,
                                                                        .limit = 64'000'000,
                                                                        .limitOfAUser = 48'000'000,
                                                                        .limitOfAClient = 32'100'000};
                                         },
                                     .backlog = [] { return ledger::Backlog{.calls = 3, .events = 5}; }};

class StatusText : public testing::Test {
protected:
    StatusText()
    {
        image.begin({.began = 1600000000, .counts = {}, .store = {}, .culprits = {}});
        {
            Ledger earlier(image);
            earlier.count(Counter::Kept, 2'000'000);
            earlier.count(Counter::RemovedForAge, {.user = 1000, .process = "player", .application = "org.example"}, 5);
        }
        ledger.emplace(image);
        ledger::Tally tally;
        tally.add(Counter::Kept, 1204);
        tally.add(Counter::Deliveries, 1);
        ledger->post(tally, ledger::StoreState{.events = 7, .bytes = 35'200'000, .oldest = 1650000000});
    }
    [[nodiscard]] Dictionary running(bool withCulprits = false) const
    {
        return ledger::report(*ledger, process, withCulprits);
    }

    const support::EnvironmentVariable zone{"TZ", "UTC"};
    ledger::LedgerImage image = {};
    std::optional<Ledger> ledger;
};

TEST_F(StatusText, HasTheRunAndTheWhole)
{
    EXPECT_EQ(statusText(running(), std::string::npos),
              "kestod 1.2.3 (internal build), running since 2023-11-14 22:13:20\n"
              "0 connections and 0 sessions now; 1 message and 0 events in the last minute\n"
              "what clients sent takes 4 kB of at most 64.0 MB of memory; a user may have 48.0 MB, a client 32.1 MB\n"
              "the store has 7 events in 35.2 MB, the oldest of 2022-04-15 05:20:00\n"
              "\n"
              "COUNTED                                  SINCE START  SINCE 2020-09-13\n"
              "messages, at each session                          1                 1\n"
              "  recorded                                         0                 0\n"
              "  repeated                                         0                 0\n"
              "  at no started session                            0                 0\n"
              "  refused                                          0                 0\n"
              "events                                             0                 0\n"
              "  kept                                         1,204         2,001,204\n"
              "  not wanted                                       0                 0\n"
              "  lost                                             0                 0\n"
              "removed from the store                             0                 5\n"
              "connections                                        0                 0\n"
              "sessions                                           0                 0\n"
              "\n"
              "LOST, REFUSED AND LEFT OUT               SINCE START  SINCE 2020-09-13\n"
              "removed.age                                        0                 5\n"
              "  because: older than maximum_age_days\n"
              "  to do:   raise maximum_age_days in analytics.toml\n");
}

TEST_F(StatusText, NamesTheCulpritsItKnows)
{
    const std::string text = statusText(running(true), std::string::npos);
    EXPECT_THAT(text,
                HasSubstr("\nBY WHOM         USER             COUNT  PROCESS          APPLICATION\n"
                          "removed         1000                 5  player           org.example\n"));
}

TEST_F(StatusText, NamesThoseWhoTakeTheTimeAndSumsUpTheOthers)
{
    using namespace std::chrono_literals;
    std::vector<std::shared_ptr<ledger::Workload>> workloads;
    for (std::uint32_t user = 1000; user <= 1010; ++user) {
        workloads.push_back(ledger->workloads().open(user));
        ledger->workloads().setProcess(*workloads.back(), "player\n" + std::to_string(user));
        workloads.back()->received(1'204, 35'200'000);
        workloads.back()->took(1s * (1011 - user) + 26ms);
    }
    const std::string text = statusText(running(true), std::string::npos);
    EXPECT_THAT(text,
                HasSubstr("\n"
                          "    TIME TAKEN        USER             CALLS    RECEIVED  PROCESS, SINCE START\n"
                          "      11.026 s        1000             1,204     35.2 MB  player?1000\n"));
    EXPECT_THAT(text,
                testing::EndsWith("       2.026 s        1009             1,204     35.2 MB  player?1009\n"
                                  "       1.026 s           -             1,204     35.2 MB  all others\n"));
    EXPECT_THAT(statusText(running(), std::string::npos), Not(HasSubstr("TIME TAKEN")));
}

TEST_F(StatusText, SaysThatNothingIsStored)
{
    constexpr std::string_view line = "\nno event is stored: analytics.toml says enabled = false\n";
    EXPECT_THAT(statusText(running(), std::string::npos), Not(HasSubstr(line)));
    ledger::ServiceProcess silent = process;
    silent.isStoring = [] { return false; };
    const Dictionary report = ledger::report(*ledger, silent, false);
    EXPECT_THAT(statusText(report, std::string::npos), HasSubstr(line));
    EXPECT_THAT(metricsText(report), HasSubstr("\nkesto_store_enabled 0\n"));
    EXPECT_THAT(metricsText(running()), HasSubstr("\nkesto_store_enabled 1\n"));
}

TEST_F(StatusText, SaysThatTheServiceDoesNotRun)
{
    const std::string text = statusText(ledger::report(*accountIn(image), false), std::string::npos);
    EXPECT_THAT(text, StartsWith("kestod does not run; this is what it counted before\nthe store has 7 events"));
    EXPECT_THAT(text, HasSubstr("  kept                                                       2,001,204\n"));
}

TEST_F(StatusText, SaysThatPlayingTimesAreNotStored)
{
    constexpr std::string_view line = "\nno playing times are stored: analytics.toml says stretches = false\n";
    EXPECT_THAT(statusText(running(), std::string::npos), Not(HasSubstr(line)));
    ledger::ServiceProcess without = process;
    without.isStoringStretches = [] { return false; };
    EXPECT_THAT(statusText(ledger::report(*ledger, without, false), std::string::npos), HasSubstr(line));
}

TEST_F(StatusText, SaysNothingOfWhatAnEarlierVersionDoesNotTell)
{
    Dictionary::Entries entries;
    for (const auto& [key, value] : running())
        if (key.view() != "memory")
            entries.push_back({key, key.view() == "now" ? Dictionary{{"connections", 0}, {"sessions", 0}} : value});
    EXPECT_THAT(statusText(Dictionary(entries), std::string::npos), Not(HasSubstr("memory")));
    EXPECT_THAT(metricsText(Dictionary(entries)), Not(HasSubstr("waiting")));
}

TEST_F(StatusText, IsCutToItsWidth)
{
    std::istringstream lines(statusText(running(true), 40));
    for (std::string line; std::getline(lines, line);)
        EXPECT_LE(line.size(), 42U) << line; // the sign of a cut takes three bytes
}

// --- Metrics

using StatusMetrics = StatusText;

TEST_F(StatusMetrics, HasTheProcessTheStoreAndAllCounters)
{
    const std::string text = metricsText(running());
    EXPECT_THAT(text,
                StartsWith("# HELP kesto_up Whether the service runs.\n"
                           "# TYPE kesto_up gauge\n"
                           "kesto_up 1\n"
                           "# HELP kesto_build_info The version of the running service.\n"
                           "# TYPE kesto_build_info gauge\n"
                           "kesto_build_info{version=\"1.2.3\",internal=\"true\"} 1\n"
                           "# HELP kesto_start_time_seconds When the service started, in seconds since 1970.\n"
                           "# TYPE kesto_start_time_seconds gauge\n"
                           "kesto_start_time_seconds 1700000000\n"));
    EXPECT_THAT(text,
                HasSubstr("\n# HELP kesto_store_size_bytes The size of the store's files.\n"
                          "# TYPE kesto_store_size_bytes gauge\n"
                          "kesto_store_size_bytes 35200000\n"));
    EXPECT_THAT(text,
                HasSubstr("\n# HELP kesto_removed_total The count \"removed\" of the service.\n"
                          "# TYPE kesto_removed_total counter\n"
                          "kesto_removed_total{reason=\"age\"} 5\n"
                          "kesto_removed_total{reason=\"size\"} 0\n"
                          "kesto_removed_total{reason=\"share\"} 0\n"
                          "kesto_removed_total{reason=\"damage\"} 0\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_waiting_calls 3\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_waiting_events 5\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_memory_used_bytes 4000\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_memory_limit_bytes 64000000\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_kept_total 2001204\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_calls_total{operation=\"sendMessage\"} 0\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_connections_refused_total{reason=\"userLimit\"} 0\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_connections_answer_bytes_dropped_total 0\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_captures_refused_total 0\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_sessions_refused_total 0\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_sessions_lost_total{reason=\"summaries\"} 0\n"));
}

TEST_F(StatusMetrics, WithoutAServiceHasNothingOfAProcess)
{
    const std::string text = metricsText(ledger::report(*accountIn(image), false));
    EXPECT_THAT(text, HasSubstr("\nkesto_up 0\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_kept_total 2001204\n"));
    EXPECT_THAT(text, HasSubstr("\nkesto_store_events 7\n"));
    for (const char* name : {"kesto_start_time_seconds", "kesto_build_info", "kesto_connections ", "kesto_losses"})
        EXPECT_THAT(text, Not(HasSubstr(name)));
}

// What the format demands: each metric once, all its lines together behind its HELP and TYPE, and names in snake case.
TEST_F(StatusMetrics, KeepsTheRulesOfTheFormat)
{
    const std::regex sample(
        "([a-z]+(_[a-z0-9]+)*)(\\{[a-z]+=\"[A-Za-z0-9.]+\"(,[a-z]+=\"[A-Za-z0-9.]+\")*\\})? [0-9]+");
    const std::regex head("# (HELP|TYPE) ([a-z_0-9]+) (.+)");
    std::istringstream lines(metricsText(running(true)));
    std::set<std::string> described;
    std::set<std::string> samples;
    std::string current;
    std::size_t counters = 0;
    for (std::string line; std::getline(lines, line);) {
        std::smatch match;
        if (std::regex_match(line, match, head)) {
            const bool isHelp = match[1] == "HELP";
            EXPECT_EQ(described.insert(match[2].str() + " " + match[1].str()).second, true) << line;
            if (isHelp)
                current = match[2];
            EXPECT_EQ(match[2], current) << line;
            EXPECT_EQ(!isHelp && match[3] == "counter", !isHelp && current.ends_with("_total")) << line;
            continue;
        }
        ASSERT_TRUE(std::regex_match(line, match, sample)) << line;
        EXPECT_EQ(match[1], current) << line;
        EXPECT_TRUE(samples.insert(match[1].str() + match[3].str()).second) << line;
        counters += current.ends_with("_total") ? 1 : 0;
    }
    EXPECT_EQ(counters, ledger::counterCount);
}

} // namespace
