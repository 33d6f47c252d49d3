// SPDX-License-Identifier: Apache-2.0
// Everything runs on one machine, so each figure has the others' load in it, as the page on sizing says.
#include "fleet/Measures.h"

#include "fleet/News.h"
#include "fleet/ProcessFigures.h"

#include <algorithm>
#include <chrono>
#include <fmt/format.h>
#include <sstream>
#include <thread>

namespace fleet {

namespace {

using kesto_ingest::waitUntil;

constexpr const char* rowsStored = "kesto_ingest_rows_stored_total";

double seconds(std::chrono::nanoseconds time)
{
    return std::chrono::duration<double>(time).count();
}

double secondsSince(std::chrono::steady_clock::time_point begin)
{
    return seconds(std::chrono::steady_clock::now() - begin);
}

double trueTime()
{
    return std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
}

} // namespace

void measureIngest(Fleet& fleet)
{
    Figures& figures = fleet.figures;
    auto begin = std::chrono::steady_clock::now();
    fleet.withDevices(fleet.devices.size(), [](Device& device) { device.sendAll(std::chrono::milliseconds(0)); });
    figures.secondsOfSending = secondsSince(begin);
    const StreamState before = fleet.broker.stream();
    figures.batches = before.waiting;
    figures.bytesInStream = before.bytes;
    begin = std::chrono::steady_clock::now();
    fleet.startIngests();
    waitUntil("the ingest has emptied the stream", [&] {
        for (const auto& copy : fleet.ingests)
            figures.peakOfIngest = std::max(figures.peakOfIngest, memoryOf(copy->process()).peak);
        const StreamState state = fleet.broker.stream();
        return state.isComplete && state.waiting == 0;
    });
    figures.secondsOfIngest = secondsSince(begin);
    figures.rowsOfWeeks = static_cast<std::uint64_t>(fleet.metric(rowsStored));
    figures.bytesOfBatches = static_cast<std::uint64_t>(fleet.metric("kesto_ingest_taken_bytes_total"));
}

void measureUplink(Fleet& fleet)
{
    constexpr int rounds = 10;
    Figures& figures = fleet.figures;
    const auto store = fleet.directory / "measured.sqlite3";
    makeStore(store, 4711, fleet.edition.measuredSessions, trueTime());
    fleet.furtherUplinks.push_back(
        std::make_unique<RealUplink>(fleet.directory / "measured", store, shared, fleet.broker.configuredAddresses()));
    RealUplink& uplink = *fleet.furtherUplinks.back();
    uplink.start();
    waitUntil("the measured uplink has sent all", [&] {
        figures.ownOfUplink = std::max(figures.ownOfUplink, memoryOf(uplink.process()).own);
        return uplink.isAllSent();
    });
    figures.secondsOfUplink = seconds(processorTimeOf(uplink.process()));
    figures.rowsOfUplink = uplink.rows();
    const std::int64_t before = uplink.batches();
    for (int round = 0; round < rounds; ++round) {
        addNews(store, 1, trueTime());
        uplink.awaitAllSent();
    }
    figures.secondsOfRound = (seconds(processorTimeOf(uplink.process())) - figures.secondsOfUplink)
        / static_cast<double>(uplink.batches() - before);
    figures.peakOfUplink = memoryOf(uplink.process()).peak;
}

void measureRoom(Fleet& fleet)
{
    for (const char* table : {"events", "stretches", "sessions", "batches"})
        static_cast<void>(fleet.database.selectFrom(1, fmt::format("OPTIMIZE TABLE kesto.{}{{}} FINAL", table)));
    std::istringstream lines(fleet.database.selectFrom(
        1, "SELECT sum(bytes_on_disk), sum(rows) FROM system.parts WHERE active AND database = 'kesto'"));
    double bytes = 0;
    double rows = 0;
    for (double bytesOfShard = 0, rowsOfShard = 0; lines >> bytesOfShard >> rowsOfShard;) {
        bytes += bytesOfShard;
        rows += rowsOfShard;
    }
    fleet.figures.bytesOfRow = bytes / rows;
}

std::string textOf(const Figures& figures)
{
    const auto weeks = static_cast<double>(figures.rowsOfWeeks);
    return fmt::format(
        "batches sent in a second            {:10.0f}  ({} in {:.1f} s, each over a connection of its own)\n"
        "rows stored in a second             {:10.0f}  ({} rows in {:.1f} s, all copies of kesto-ingest together)\n"
        "bytes of a row on its way           {:10.1f}  (compressed batches)\n"
        "bytes of a row in the stream        {:10.1f}  (on each server of the broker)\n"
        "bytes of a row in the database      {:10.1f}  (on each replica, merged)\n"
        "processor time of an uplink         {:10.1f}  ms in a round with one session\n"
        "                                    {:10.1f}  us for a row of a long store ({} rows)\n"
        "peak memory of kesto-uplink         {:10.1f}  MB, of which its own: {:.1f} MB\n"
        "peak memory of kesto-ingest         {:10.1f}  MB\n",
        static_cast<double>(figures.batches) / figures.secondsOfSending, figures.batches, figures.secondsOfSending,
        weeks / figures.secondsOfIngest, figures.rowsOfWeeks, figures.secondsOfIngest,
        static_cast<double>(figures.bytesOfBatches) / weeks, static_cast<double>(figures.bytesInStream) / weeks,
        figures.bytesOfRow, figures.secondsOfRound * 1e3,
        figures.secondsOfUplink * 1e6 / static_cast<double>(figures.rowsOfUplink), figures.rowsOfUplink,
        static_cast<double>(figures.peakOfUplink) / 1024, static_cast<double>(figures.ownOfUplink) / 1024,
        static_cast<double>(figures.peakOfIngest) / 1024);
}

} // namespace fleet
