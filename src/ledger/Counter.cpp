// SPDX-License-Identifier: Apache-2.0
// The table of all counts.
#include "ledger/Counter.h"

namespace ledger {
namespace {

constexpr std::array<std::string_view, chargeCount> chargeNames = {"refused", "lost", "removed"};

constexpr std::array<CounterRow, counterCount> makeRows()
{
    using enum Counter;
    using enum Meaning;
    return {{
        {Deliveries, "deliveries", Work, "", ""},
        {Recorded, "recorded", Work, "", ""},
        {Repeated, "repeated", Work, "", ""},
        {Inert, "inert", Work, "", ""},
        {RefusedForMemory, "refused.memory", Loss, "no memory was left for the messages of a session",
         "stop sessions from time to time, send less, or raise memory_mb in limits.toml"},
        {RefusedForSize, "refused.size", Loss, "the message was too large for so many receivers",
         "send a smaller message, or to fewer sessions"},

        {Events, "events", Work, "", ""},
        {Kept, "kept", Work, "", ""},
        {Unwanted, "unwanted", Work, "", ""},
        {LostToDiskFull, "lost.diskFull", Loss, "the disk is full",
         "make room, or lower maximum_size_mb in analytics.toml"},
        {LostToReadOnly, "lost.readOnly", Loss, "the database is read-only", "let the user of the service write to it"},
        {LostToLock, "lost.locked", Loss, "another program writes to the database",
         "end it; programs should open the database read-only"},
        {LostToOtherService, "lost.inUse", Loss, "another process keeps its events in the same directory",
         "give each service its own state directory"},
        {LostToOpening, "lost.cannotOpen", Loss, "the database cannot be opened or made",
         "let the user of the service write to its directory"},
        {LostToInputOutput, "lost.inputOutput", Loss, "the disk failed", "look for its errors in the kernel's log"},
        {LostToDamage, "lost.damage", Loss, "the database is damaged and cannot be set aside",
         "move it to another place by hand"},
        {LostToNewerStore, "lost.newer", Loss, "the database is of a later version and cannot be set aside",
         "move it to another place by hand"},
        {LostToReader, "lost.logHeld", Loss, "a program has been reading the database for too long",
         "end it, or let it read in short transactions"},
        {LostNotJson, "lost.notJson", Loss, "their payloads hold NaN or infinity, which JSON cannot express",
         "correct the programs that send them"},
        {LostToOther, "lost.other", Loss, "SQLite refused", "restart the service and report this"},
        {LostToEnd, "lost.end", Loss, "the service had no time left to store them when it ended",
         "look for a disk that is slow or hangs"},
        {RemovedForAge, "removed.age", Limit, "older than maximum_age_days",
         "raise maximum_age_days in analytics.toml"},
        {RemovedForSize, "removed.size", Limit, "the store reached maximum_size_mb",
         "raise maximum_size_mb in analytics.toml"},
        {RemovedForShare, "removed.share", Limit, "their sender took more than a fair share of maximum_size_mb",
         "let it send less, or raise maximum_size_mb in analytics.toml"},
        {RemovedByDamage, "removed.damage", Loss, "they were in a database that was damaged, removed or replaced",
         "look for errors of the disk in the kernel's log"},
        {Salvaged, "salvaged", Work, "", ""},

        {StretchesKept, "stretches.kept", Work, "", ""},
        {StretchesRemoved, "stretches.removed", Limit, "the events around them were too old or too many",
         "raise maximum_age_days or maximum_size_mb in analytics.toml"},
        {StretchesLeftOut, "stretches.leftOut", Limit,
         "they took no time, or too many waited for a database that could not be written to",
         "nothing, unless events are lost, too"},

        {ConnectionsAccepted, "connections.accepted", Work, "", ""},
        {ConnectionsRefused, "connections.refused.userLimit", Limit, "one user had too many connections",
         "let its programs share a connection, or raise LimitNOFILE of the service"},
        {ConnectionsRefusedUnfinished, "connections.refused.unfinished", Limit,
         "a process opened and closed connections faster than the service could remove them",
         "let it keep a connection"},
        {ConnectionsEnded, "connections.ended", Work, "", ""},
        {ConnectionsInterrupted, "connections.interrupted", Work, "", ""},
        {AcceptingPauses, "connections.acceptingPauses", Limit, "no descriptor was left for new connections",
         "raise LimitNOFILE of the service"},
        {ReadingPauses, "connections.readingPauses", Work, "", ""},
        {MemoryPauses, "connections.memoryPauses", Limit,
         "calls and unread answers of all clients took too much memory",
         "let programs read their answers, or raise memory_mb in limits.toml"},
        {AnswerBytesDropped, "connections.answerBytesDropped", Work, "", ""},
        {FramesTooLong, "frames.refused.tooLong", Limit, "a frame was too long", "correct the client"},
        {FramesNotCbor, "frames.refused.notCbor", Limit, "a frame was not a CBOR array", "correct the client"},
        {FramesCutOff, "frames.refused.cutOff", Limit, "a connection ended inside a frame", "correct the client"},
        {FramesNotACall, "frames.refused.notACall", Limit, "a frame was not a call", "correct the client"},
        {CallsCreateReportingSession, "calls.createReportingSession", Work, "", ""},
        {CallsSetServiceType, "calls.setServiceType", Work, "", ""},
        {CallsGetServiceName, "calls.getServiceNameForReporterID", Work, "", ""},
        {CallsSetConfiguration, "calls.setConfiguration", Work, "", ""},
        {CallsStartReportingSession, "calls.startReportingSessionForID", Work, "", ""},
        {CallsSendMessage, "calls.sendMessage", Work, "", ""},
        {CallsStopReportingSession, "calls.stopReportingSessionForID", Work, "", ""},
        {CallsDestroyReportingSession, "calls.destroyReportingSession", Work, "", ""},
        {CallsReporterID, "calls.reporterID", Work, "", ""},
        {CallsGetAllReporters, "calls.getAllReporters", Work, "", ""},
        {CallsKillService, "calls.killService", Work, "", ""},
        {CallsTrace, "calls.trace", Work, "", ""},
        {CallsStatus, "calls.status", Work, "", ""},
        {CallsLostToEnd, "calls.lost.end", Loss, "the service had no time left to carry them out when it ended",
         "end the programs that send much before the service"},

        {SessionsCreated, "sessions.created", Work, "", ""},
        {SessionsRefused, "sessions.refused", Loss, "a client, or all of them, had too many sessions",
         "destroy sessions that are over"},
        {SessionsStarted, "sessions.started", Work, "", ""},
        {SessionsStopped, "sessions.stopped", Work, "", ""},
        {SessionsGone, "sessions.gone", Work, "", ""},
        {ConfigurationsRefused, "sessions.lost.configurations", Loss,
         "a session's configuration was too large, or no memory was left for it",
         "send a smaller configuration, or raise memory_mb in limits.toml"},
        {SnapShotsLost, "sessions.lost.driverStatistics", Loss, "no memory was left for a session's driver statistics",
         "stop sessions from time to time, send less, or raise memory_mb in limits.toml"},
        {VolumeEventsLost, "sessions.lost.volumeEvents", Loss, "no memory was left for a session's volume events",
         "stop sessions from time to time, send less, or raise memory_mb in limits.toml"},
        {SummariesLost, "sessions.lost.summaries", Loss, "no memory was left for a session's summary",
         "stop sessions from time to time, send less, or raise memory_mb in limits.toml"},

        {ChannelsLeftOut, "channels.leftOut", Limit, "channels were too many, too large, too late or not readable",
         "look for their names in the service's log"},
        {CapturesTaken, "captures.taken", Work, "", ""},
        {CapturesFailed, "captures.failed", Loss, "a bug capture could not be written",
         "look for its reason in the service's log"},
        {CapturesRefused, "captures.refused", Limit, "bug captures came too soon after others",
         "look at the captures that were taken"},
        {CapturesEvicted, "captures.evicted", Limit, "bug captures made room for later ones",
         "copy captures to another place in time"},
        {TraceEventsLost, "traces.lostEvents", Loss, "the kernel's trace buffer was full",
         "let the trace's parameters name fewer points"},
        {TraceIntervalsLost, "traces.lostIntervals", Loss, "a trace measured too many intervals",
         "let the trace's parameters name fewer points"},
        {TracePointsLost, "traces.lostPoints", Loss, "a trace's parameters named too many traces and points",
         "let the trace's parameters name fewer points"},
        {LogLinesLost, "log.lostLines", Limit, "the journal or the disk did not take them in time",
         "let the service log less"},
        {LogLinesLeftOut, "log.leftOutLines", Limit, "a process made more log lines than its share",
         "look for its number in the service's log"},
        {WorkLostToEnd, "work.lost.end", Loss, "the service had no time left for background work when it ended",
         "look for a disk that is slow or hangs"},
    }};
}
constexpr auto rows = makeRows();

static_assert(
    [] {
        for (std::size_t place = 0; place < rows.size(); ++place)
            if (static_cast<std::size_t>(rows[place].counter) != place || rows[place].path.empty())
                return false;
        return true;
    }(),
    "the table has one row for each counter, in their order");

// By place: one more than the charge, or 0.
constexpr auto charges = [] {
    std::array<std::uint8_t, counterCount> result = {};
    for (std::size_t place = 0; place < rows.size(); ++place)
        for (std::size_t charge = 0; charge < chargeCount; ++charge)
            if (const auto& path = rows[place].path;
                path.starts_with(chargeNames[charge]) && path.substr(chargeNames[charge].size()).starts_with('.'))
                result[place] = static_cast<std::uint8_t>(charge + 1);
    return result;
}();

} // namespace

const std::array<CounterRow, counterCount>& counterRows() noexcept
{
    return rows;
}

const CounterRow& row(Counter counter) noexcept
{
    return rows[static_cast<std::size_t>(counter)];
}

std::optional<Counter> counterOf(std::string_view path) noexcept
{
    for (const CounterRow& row : rows)
        if (row.path == path)
            return row.counter;
    return std::nullopt;
}

std::optional<Charge> chargeOf(Counter counter) noexcept
{
    const std::uint8_t charge = charges[static_cast<std::size_t>(counter)];
    if (charge == 0)
        return std::nullopt;
    return static_cast<Charge>(charge - 1);
}

std::string_view name(Charge charge) noexcept
{
    return chargeNames[static_cast<std::size_t>(charge)];
}

} // namespace ledger
