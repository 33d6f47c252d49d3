// SPDX-License-Identifier: Apache-2.0
// What the program relies on of the database holds for the one in memory and for ClickHouse; and what only ClickHouse
// does.
#include "kesto-ingest/batch/Batch.h"
#include "kesto-ingest/database/ClickHouse.h"
#include "kesto-ingest/database/Tables.h"
#include "tools/kesto-ingest/Batches.h"
#include "tools/kesto-ingest/FleetServers.h"
#include "tools/kesto-ingest/database/FakeDatabase.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace kesto_ingest {
namespace {

using testing::HasSubstr;

constexpr std::string_view goodRow =
    R"({"device":"0123456789abcdef0123456789abcdef","epoch":"00000000000000000000000000000001","id":1,"happened_us":1795264505660000,"time":1795264505.66,"name":"n","payload":"{}"})"
    "\n";
// The database counts IDs without a sign.
constexpr std::string_view badRow = R"({"device":"0123456789abcdef0123456789abcdef","id":-1})"
                                    "\n";

// A database with the tables of this edition.
class DatabaseProvider {
public:
    DatabaseProvider() = default;
    virtual ~DatabaseProvider() = default;
    DatabaseProvider(const DatabaseProvider&) = delete;
    DatabaseProvider& operator=(const DatabaseProvider&) = delete;
    virtual Database& database() = 0;
    virtual int events() = 0;
    virtual void end() = 0;
};

class FakeProvider : public DatabaseProvider {
public:
    FakeProvider() { database_.refusedWord = R"("id":-1)"; }
    Database& database() override { return database_; }
    int events() override { return static_cast<int>(database_.tables["events"].size()); }
    void end() override { database_.isAway = true; }

private:
    FakeDatabase database_;
};

class ClickHouseProvider : public DatabaseProvider {
public:
    ClickHouseProvider() { server.makeTables(); }
    Database& database() override { return database_; }
    int events() override { return std::stoi(server.select("SELECT count() FROM events")); }
    void end() override { server.end(); }

    support::TemporaryDirectory directory;
    ClickHouseServer server{directory / "clickhouse"};

private:
    // The first server is away at any time; what the second keeps must not go to the third, too.
    ClickHouse database_{{.servers = {"http://127.0.0.1:1", server.address(), server.address()}}};
};

std::unique_ptr<DatabaseProvider> makeProvider(const std::string& name)
{
    if (name == "Fake")
        return std::make_unique<FakeProvider>();
    return std::make_unique<ClickHouseProvider>();
}

class DatabaseContract : public testing::TestWithParam<std::string> { };

TEST_P(DatabaseContract, KeepsAllRowsOrNone)
{
    const auto provider = makeProvider(GetParam());
    Database& database = provider->database();
    EXPECT_EQ(database.edition(), 1U);
    EXPECT_EQ(database.insert("events", goodRow), InsertAnswer());
    EXPECT_EQ(provider->events(), 1);
    const InsertAnswer refused = database.insert("events", std::string(goodRow) + std::string(badRow));
    EXPECT_EQ(refused.outcome, InsertOutcome::Refused) << refused.reason;
    EXPECT_FALSE(refused.reason.empty());
    EXPECT_EQ(provider->events(), 1);
    provider->end();
    const InsertAnswer unavailable = database.insert("events", goodRow);
    EXPECT_EQ(unavailable.outcome, InsertOutcome::Unavailable);
    EXPECT_FALSE(unavailable.reason.empty());
    EXPECT_FALSE(database.edition());
}

INSTANTIATE_TEST_SUITE_P(Of, DatabaseContract, testing::Values("Fake", "ClickHouse"),
                         [](const auto& provider) { return provider.param; });

// All in one, since a server takes a second to start.
TEST(ClickHouseTables, HoldWhatRowsTell)
{
    ClickHouseProvider provider;
    const ClickHouseServer& server = provider.server;
    const auto batch =
        readLines(deviceLine(1, 9) + eventLine(3, deviceA, R"({"active_devices":"café","late_cycles":3})")
                  + stretchLine(4) + sessionLine(7, "") + sessionLine(7, "1795264600.125") + sessionLine(7, ""));
    ASSERT_TRUE(batch);
    for (const Row& row : batch->rows)
        EXPECT_EQ(provider.database().insert(name(row.table), batch->jsonOf(row)), InsertAnswer());
    EXPECT_EQ(
        server.select("SELECT device, epoch, id, time, happened, name, session, application, model, version, payload, "
                      "audio_device, late_cycles, happened_us FROM events FORMAT CSV"),
        R"("0123456789abcdef0123456789abcdef","00000000000000000000000000000001",3,1795264505.66,\N,)"
        R"("com.quarn.kesto.Error.IssueDetector",7,"player","lamp","1.2",)"
        R"("{""active_devices"":""café"",""late_cycles"":3}","café",3,1795264505660000)");
    EXPECT_EQ(
        server.select(
            "SELECT id, recording, began, seconds, played_seconds, session, application, audio_device, format, "
            "channels, volume, ending, model, began_us, microseconds, volume_millionths FROM stretches FORMAT CSV"),
        R"(4,0,1795264500.25,12.5,12.5,7,"player","headset","",2,0.5,"stopped","lamp",)"
        "1795264500250000,12500000,500000");
    EXPECT_EQ(server.select("SELECT id, reporter, began, ended, application FROM sessions FINAL FORMAT CSV"),
              R"(7,-5,1795264400,1795264600.125,"player")");
    EXPECT_EQ(server.select("SELECT first_id, last_id, sent, model, version FROM batches FORMAT CSV"),
              R"(1,9,1795264600.5,"lamp","1.2")");
    EXPECT_EQ(server.select("SELECT DISTINCT partition FROM system.parts WHERE database = 'kesto' AND active "
                            "ORDER BY partition FORMAT CSV"),
              "\"('2026-11-16',0)\"\n\"2026-11-16\"");

    // A row that comes twice stays once, and a clock that is wrong makes no error.
    EXPECT_EQ(provider.database().insert("stretches", batch->jsonOf(batch->rows[2])), InsertAnswer());
    EXPECT_EQ(server.select("SELECT count() FROM stretches FINAL"), "1");
    for (const std::string_view time : {"0", "500000", "86400000000", "4294967295000000"})
        EXPECT_EQ(
            provider.database().insert(
                "events",
                fmt::format(
                    R"({{"device":"{}","epoch":"{}","id":99,"happened_us":{},"time":0,"name":"n","payload":"{{}}"}})"
                    "\n",
                    deviceA, epochA, time)),
            InsertAnswer());

    // Columns that the tables do not have are not the rows' fault.
    EXPECT_EQ(provider.database().insert("events", "{\"colour\":1}\n").outcome, InsertOutcome::Unavailable);
    EXPECT_EQ(server.select("DROP TABLE edition"), "");
    EXPECT_EQ(provider.database().edition(), 0U);
    EXPECT_EQ(server.select("CREATE VIEW edition AS SELECT toUInt64(7) AS edition"), "");
    EXPECT_EQ(provider.database().edition(), 7U);

    // The profile need not have the setting that makes an answer mean that the rows are on their shard.
    EXPECT_EQ(server.select("DROP TABLE edition"), "");
    EXPECT_EQ(server.select("CREATE VIEW edition AS SELECT toUInt64(value) AS edition FROM system.settings "
                            "WHERE name = 'insert_distributed_sync'"),
              "");
    EXPECT_EQ(server.select("SELECT max(edition) FROM edition"), "0");
    EXPECT_EQ(provider.database().edition(), 1U);
}

TEST(Tables, AreMadeForOneServerOrACluster)
{
    EXPECT_EQ(support::readFile(std::string(KESTO_FLEET) + "/tables.sql"), tablesSql("kesto", ""));
    EXPECT_EQ(support::readFile(std::string(KESTO_FLEET) + "/tables-replicated.sql"), tablesSql("kesto", "fleet"));
    EXPECT_THAT(tablesSql("kesto", ""), HasSubstr(") ENGINE = ReplacingMergeTree(has_ended)\n"));
    EXPECT_THAT(
        tablesSql("d", "c"),
        HasSubstr(") ENGINE = ReplicatedReplacingMergeTree('/clickhouse/tables/{shard}/d/sessions', '{replica}', "
                  "has_ended)\n"));
    EXPECT_THAT(tablesSql("d", "c"),
                HasSubstr("CREATE TABLE IF NOT EXISTS d.sessions ON CLUSTER c AS d.sessions_local\n"
                          "ENGINE = Distributed(c, d, sessions_local, cityHash64(device));\n"));
}

} // namespace
} // namespace kesto_ingest
