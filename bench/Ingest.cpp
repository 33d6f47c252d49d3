// SPDX-License-Identifier: Apache-2.0
// How many rows of a fleet kesto-ingest takes from the stream into the database: from its start until it has told the
// devices of the last batch. The batches are made by the code of kesto-uplink, of one store for 30 pseudonyms, and each
// comes twice, so that a round is long enough. The peer posts the same rows, as kesto-ingest writes them and as many at
// a time, to the same server, and does nothing else.
#include "Groups.h"
#include "support/ChildProcess.h"

#include "fleet/IngestCopy.h"
#include "kesto-ingest/batch/Batch.h"
#include "kesto-ingest/database/ClickHouse.h"
#include "kesto-ingest/stream/JetStream.h"
#include "kesto-uplink/outbox/Outbox.h"
#include "support/TemporaryDirectory.h"
#include "support/weeks/WeeksFile.h"
#include "tools/kesto-ingest/FleetServers.h"

#include <cstdint>
#include <cstdlib>
#include <fmt/format.h>
#include <set>
#include <stdexcept>
#include <string>
#include <vector>

namespace bench {
namespace {

constexpr int devices = 30;
constexpr int batchesOfADevice = 4; // which fill one insert
constexpr std::int64_t rowsOfABatch = 2500;
constexpr int times = 2; // that each batch comes
constexpr std::int64_t differentRows = devices * batchesOfADevice * rowsOfABatch;
constexpr std::int64_t allRows = times * differentRows;

void require(bool holds, const std::string& problem)
{
    if (!holds)
        throw std::runtime_error(problem);
}

bool isInstalled(const std::string& program)
{
    return std::system(("PATH=$PATH:/usr/sbin:/sbin command -v " + program + " >/dev/null").c_str()) == 0;
}

void makeStore(const std::filesystem::path& file)
{
    constexpr std::size_t idleMessages = 10; // each time: more messages than the batches take
    constexpr double present = 1795264600;
    weeks::writeWeeks(
        weeks::makeWeeks(
            {.sessions = 1000, .midnights = weeks::midnightsBefore(present, 6), .idleMessages = idleMessages}),
        file);
}

std::vector<std::string> makeBatches(const std::filesystem::path& store)
{
    kesto_uplink::UplinkConfiguration configuration;
    configuration.model = "lamp";
    configuration.version = "1.2";
    kesto_uplink::EventRules rules{.names = "com.quarn.kesto.*"};
    for (const char* const key : {"active_devices", "issue", "issue_duration", "kestoreporting_timestamp",
                                  "late_cycles", "session_duration", "session_selected_format"})
        rules.rules.push_back({.key = key, .action = kesto_uplink::Rule::Action::Keep});
    configuration.allowed.events = {rules};
    std::vector<std::string> batches;
    for (int device = 1; device <= devices; ++device) {
        kesto_uplink::Outbox outbox(store, configuration,
                                    {.pseudonym = fmt::format("{:032x}", device), .hashKey = "key"},
                                    {.rowBytes = std::size_t{1024} * 1024, .rows = rowsOfABatch});
        kesto_uplink::Cursor after;
        std::set<std::int64_t> openSessions;
        for (int number = 0; number < batchesOfADevice; ++number) {
            auto batch = outbox.next(after, openSessions, 1795264600);
            require(batch && batch->rows == rowsOfABatch, "the outbox does not fill its batches");
            after = batch->last;
            openSessions = batch->openSessions;
            batches.push_back(std::move(batch->bytes));
        }
    }
    return batches;
}

// The rows of each insert. The rows that name the batches are left out: they are few.
std::vector<std::string> makeBlocks(const std::vector<std::string>& batches)
{
    std::vector<std::string> blocks;
    for (std::size_t number = 0; number < batches.size(); ++number) {
        if (number % batchesOfADevice == 0)
            blocks.emplace_back();
        const auto batch = kesto_ingest::readBatch(batches[number]);
        require(batch && batch->badRows.empty(), "a batch of the outbox is wrong");
        for (const kesto_ingest::Row& row : batch->rows)
            if (row.table == kesto_ingest::Table::Events)
                blocks.back() += batch->jsonOf(row);
    }
    return blocks;
}

class IngestTrial {
public:
    IngestTrial()
    {
        database_.makeTables();
        fleet::setUpStreams(directory_ / "setup", brokers(), 1, 60);
    }

    // Rows a second.
    double takeFromStream()
    {
        empty();
        for (int time = 0; time < times; ++time)
            for (const std::string& batch : batches_)
                require(device_.publish("kesto.events.device-1", batch, {{"Kesto-Edition", "1"}}).has_value(),
                        "a batch cannot be published");
        const auto start = Clock::now();
        fleet::IngestCopy ingest(directory_ / "ingest", brokers(), fmt::format(R"(["{}"])", database_.address()));
        kesto_ingest::waitUntil("all batches are stored", [&] {
            return ingest.metric("kesto_ingest_batches_stored_total")
                == times * static_cast<std::int64_t>(batches_.size());
        });
        const double rate = allRows / nanosecondsSince(start) * 1e9;
        microsecondsARow_.push_back(processorSeconds(ingest.process()) / allRows * 1e6);
        ingest.end();
        checkRows();
        return rate;
    }
    double post()
    {
        empty();
        kesto_ingest::ClickHouse client({.servers = {database_.address()}});
        const auto start = Clock::now();
        for (int time = 0; time < times; ++time)
            for (const std::string& block : blocks_)
                require(client.insert("events", block) == kesto_ingest::InsertAnswer(), "the database refuses rows");
        const double rate = allRows / nanosecondsSince(start) * 1e9;
        checkRows();
        return rate;
    }

    // Processor time of kesto-ingest in each round, without the first, which does not count.
    [[nodiscard]] std::vector<double> microsecondsARow() const
    {
        return {microsecondsARow_.begin() + 1, microsecondsARow_.end()};
    }

private:
    [[nodiscard]] std::string brokers() const { return fmt::format(R"(["{}"])", broker_.address()); }
    void empty() const
    {
        for (const char* const table : {"batches", "events"})
            require(database_.select(fmt::format("TRUNCATE TABLE {}", table)).empty(), "a table cannot be emptied");
    }
    void checkRows() const
    {
        require(database_.select("SELECT count() FROM (SELECT DISTINCT device, epoch, id FROM events)")
                    == std::to_string(differentRows),
                "the database does not have all rows");
    }

    const support::TemporaryDirectory directory_;
    const std::vector<std::string> batches_ = [this] {
        showProgress("making the batches of a fleet");
        makeStore(directory_ / "store.sqlite3");
        return makeBatches(directory_ / "store.sqlite3");
    }();
    const std::vector<std::string> blocks_ = makeBlocks(batches_);
    kesto_ingest::NatsServer broker_{directory_ / "nats"};
    kesto_ingest::ClickHouseServer database_{directory_ / "clickhouse"};
    kesto_ingest::JetStream device_{{.servers = {broker_.address()}, .user = "device-1", .password = "device-1"}};
    std::vector<double> microsecondsARow_;
};

} // namespace

void measureIngest(const BenchOptions& options, Report& report)
{
    constexpr double target = 0.7;
    const std::string name = fmt::format("{} rows from the stream into the database", allRows);
    for (const char* const program : {"nats-server", "clickhouse-server", "setpriv"})
        if (!isInstalled(program))
            return report.skip(name, fmt::format("{} is not installed", program));
    IngestTrial trial;
    const auto rates =
        compete(options, name, [&trial] { return trial.takeFromStream(); }, [&trial] { return trial.post(); });
    const PeerFigure peer{"bare POSTs of the same rows", rates[1]};
    const std::vector<double> microseconds = trial.microsecondsARow();
    std::vector<double> ofACore;
    for (const double each : microseconds)
        ofACore.push_back(1e6 / each);
    report.add({name, "/s", rates[0], peer, Target::ratioAtLeast(target)});
    report.add({name + ", for each core that kesto-ingest uses", "/s", ofACore, peer, Target::ratioAtLeast(target)});
    report.add({"processor time of kesto-ingest for a row", "us", microseconds});
}

} // namespace bench
