// SPDX-License-Identifier: Apache-2.0
// Everything that the service counts, in one table: what came in, what became of it, and what was left out and why.
//
// Who adds a limit or another way to lose something adds a row here, and the row reaches every reader: the answer to
// `status`, `kesto status` and the file of the ledger. The paths are their keys, and stay the same for good.
//
// The rows keep three promises, as soon as nothing is on its way:
//
//     deliveries = recorded + repeated + inert + refused
//     events     = kept + unwanted + lost
//     kept       = in the store + removed          (over all starts, since the ledger began)
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string_view>

namespace ledger {

enum class Counter : std::uint8_t {
    // A message at one session, or without a session.
    Deliveries,
    Recorded,
    Repeated, // equal to the last one of its kind
    Inert, // at a session that is not started, or without a session: nothing is recorded there
    RefusedForMemory,
    RefusedForSize,

    // An analytics event under one name.
    Events,
    Kept,
    Unwanted, // the configuration does not want its name
    LostToDiskFull,
    LostToReadOnly,
    LostToLock,
    LostToOtherService,
    LostToOpening,
    LostToInputOutput,
    LostToDamage,
    LostToNewerStore,
    LostToReader,
    LostNotJson,
    LostToOther,
    LostToEnd,
    RemovedForAge,
    RemovedForSize,
    RemovedForShare,
    RemovedByDamage,
    Salvaged, // messages, from a damaged database; their events were kept before, and still are

    StretchesKept, // rows about who played what for how long
    StretchesRemoved,
    StretchesLeftOut,

    ConnectionsAccepted,
    ConnectionsRefused, // because of their user's others
    ConnectionsRefusedUnfinished, // because of those that ended
    ConnectionsEnded,
    ConnectionsInterrupted,
    AcceptingPauses,
    ReadingPauses,
    MemoryPauses, // of reading, because all connections together hold too much
    AnswerBytesDropped,
    FramesTooLong,
    FramesNotCbor,
    FramesCutOff,
    FramesNotACall,
    CallsCreateReportingSession, // the operations, in the order of their numbers
    CallsSetServiceType,
    CallsGetServiceName,
    CallsSetConfiguration,
    CallsStartReportingSession,
    CallsSendMessage,
    CallsStopReportingSession,
    CallsDestroyReportingSession,
    CallsReporterID,
    CallsGetAllReporters,
    CallsKillService,
    CallsTrace,
    CallsStatus,
    CallsLostToEnd, // with the ends of connections

    SessionsCreated,
    SessionsRefused,
    SessionsStarted,
    SessionsStopped,
    SessionsGone, // destroyed, replaced, or ended with their connection
    ConfigurationsRefused,
    SnapShotsLost,
    VolumeEventsLost,
    SummariesLost,

    ChannelsLeftOut,
    CapturesTaken,
    CapturesFailed,
    CapturesRefused,
    CapturesEvicted,
    TraceEventsLost,
    TraceIntervalsLost,
    TracePointsLost,
    LogLinesLost,
    LogLinesLeftOut,
    WorkLostToEnd // captures, and other work in the background
};
inline constexpr std::size_t counterCount = static_cast<std::size_t>(Counter::WorkLostToEnd) + 1;

// What a count means for the health of the service.
enum class Meaning : std::uint8_t {
    Work, // the service did what it should
    Limit, // something was left out or removed by a limit that is meant for it
    Loss // something that should have been kept is gone
};

struct CounterRow {
    Counter counter;
    std::string_view path; // "lost.diskFull": keys within keys
    Meaning meaning;
    std::string_view reason; // for people; empty for work
    std::string_view remedy; // what the device's owner can do; empty for work
};

[[nodiscard]] const CounterRow& row(Counter counter) noexcept;
// In the order of the counters.
[[nodiscard]] const std::array<CounterRow, counterCount>& counterRows() noexcept;
// The counter of that path.
[[nodiscard]] std::optional<Counter> counterOf(std::string_view path) noexcept;

// The first keys of what clients cause: for these the ledger also knows which client.
enum class Charge : std::uint8_t { Refused, Lost, Removed };
inline constexpr std::size_t chargeCount = static_cast<std::size_t>(Charge::Removed) + 1;

// The charge of a counter that has one.
[[nodiscard]] std::optional<Charge> chargeOf(Counter counter) noexcept;
[[nodiscard]] std::string_view name(Charge charge) noexcept; // "refused"

} // namespace ledger
