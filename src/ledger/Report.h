// SPDX-License-Identifier: Apache-2.0
// What stands in the ledger, as one dictionary: the answer to `status`, and what `kesto status` prints for programs.
//
// Every counter of the table is there, also when it is 0: its path gives the keys, keys within keys. docs/status.md
// explains each.
#pragma once

#include "foundation/values/Value.h"
#include "ledger/Ledger.h"

#include <cstdint>
#include <functional>
#include <string>
#include <string_view>

namespace ledger {

// How much memory what clients send takes at the moment, and may take, in bytes.
struct MemoryState {
    std::uint64_t used = 0;
    std::uint64_t limit = 0;
    std::uint64_t limitOfAUser = 0;
    std::uint64_t limitOfAClient = 0;
};

// What has come in and is not done.
struct Backlog {
    std::uint64_t calls = 0; // that wait for the server queue or run
    std::uint64_t events = 0; // that the store has not written
};

// The process that counts.
struct ServiceProcess {
    std::string_view version;
    bool isInternalBuild = false;
    double started = 0; // seconds since 1970
    std::function<bool()> isStoring = [] { return true; }; // whether it stores any events
    std::function<bool()> isStoringStretches = [] { return true; };
    std::function<MemoryState()> memory = [] { return MemoryState(); };
    std::function<Backlog()> backlog = [] { return Backlog(); };
};

// What is open, by the counts since the start of the process.
struct OpenNow {
    std::uint64_t connections = 0;
    std::uint64_t sessions = 0;
};
[[nodiscard]] OpenNow openNow(const Account& sinceStart);

// With `withCulprits` also whose messages and events were refused, lost and removed. Any thread.
[[nodiscard]] foundation::Dictionary report(const Ledger& ledger, const ServiceProcess& process, bool withCulprits);
// The same without a process: of what an ended one left. What only a process has is null.
[[nodiscard]] foundation::Dictionary report(const Account& account, bool withCulprits);

// Reading a report. The number of the path, such as "store.events"; 0 if there is none.
[[nodiscard]] std::uint64_t numberIn(const foundation::Dictionary& report, std::string_view path);
// How much is gone that should have been kept: of the report, or of its part "sinceStart".
[[nodiscard]] std::uint64_t lossesIn(const foundation::Dictionary& counts);
// One line about a running service: "3 connections, 2 sessions; 1,204 messages and 2,380 events in the minute to
// 15:42:10; nothing lost". The losses are those since its start.
[[nodiscard]] std::string statusLine(const foundation::Dictionary& report, double secondsSince1970);
// 1204 as "1,204"; and with what is counted: "1,204 events", but "1 event".
[[nodiscard]] std::string groupedText(std::uint64_t number);
[[nodiscard]] std::string countedText(std::uint64_t number, std::string_view one);

} // namespace ledger
