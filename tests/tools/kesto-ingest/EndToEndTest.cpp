// SPDX-License-Identifier: Apache-2.0
// The whole: a real nats-server, a real ClickHouse, the program as it is shipped, and batches made by hand.
//
// Each test ends with the equation that counts: each row that a device may send is in the database, once by its key.
#include "kesto-ingest/stream/JetStream.h"
#include "support/Relay.h"
#include "tools/kesto-ingest/Batches.h"
#include "tools/kesto-ingest/FleetServers.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <csignal>

namespace kesto_ingest {
namespace {

using testing::HasSubstr;

class IngestEndToEnd : public testing::Test {
protected:
    // So long that what comes again was given back.
    explicit IngestEndToEnd(const std::string& redeliverSeconds = "3600")
    {
        database.makeTables();
        for (const std::string name : {"admin", "ingest"}) {
            support::writeFile(directory / (name + ".secret"),
                               fmt::format("user = \"{0}\"\npassword = \"{0}\"\n", name));
            std::filesystem::permissions(directory / (name + ".secret"), std::filesystem::perms(0600));
        }
        const auto made =
            sdk_test::run({KESTO_INGEST, "setup", "--configuration", configuration("admin", database.address()),
                           "--gigabytes", "0.1", "--dead-gigabytes", "0.1", "--redeliver-seconds", redeliverSeconds});
        EXPECT_EQ(made.status, 0) << made.errors;
        device1 = std::make_unique<JetStream>(as("device-1"));
        device2 = std::make_unique<JetStream>(as("device-2"));
        admin = std::make_unique<JetStream>(as("admin"));
    }

    [[nodiscard]] JetStreamConfiguration as(const std::string& name) const
    {
        return {.servers = {stream.address()},
                .user = name,
                .password = name,
                .timeLimit = std::chrono::milliseconds{10'000}};
    }
    [[nodiscard]] std::string configuration(const std::string& name, const std::string& databaseAddress)
    {
        std::string file = directory / fmt::format("{}-{}.toml", name, ++files_);
        support::writeFile(
            file,
            fmt::format("[stream]\nservers = [\"{}\"]\ncredentials = \"{}\"\n"
                        "[database]\nservers = [\"{}\"]\n[batches]\nseconds = 0.1\n[metrics]\nport = 0\n",
                        stream.address(), (directory / (name + ".secret")).native(), databaseAddress));
        return file;
    }
    [[nodiscard]] std::unique_ptr<sdk_test::Process> start(const std::string& databaseAddress)
    {
        auto ingest = std::make_unique<sdk_test::Process>(
            sdk_test::Process::Arguments{"setpriv", "--pdeathsig", "KILL", KESTO_INGEST, "run", "--configuration",
                                         configuration("ingest", databaseAddress)});
        const std::string ready = "ready; metrics on ";
        waitUntil("kesto-ingest is ready", [&] { return ingest->errors().contains("/metrics\n"); });
        const std::string lines = ingest->errors();
        const std::size_t place = lines.find(ready) + ready.size();
        metricsAddress = lines.substr(place, lines.find('\n', place) - place);
        return ingest;
    }
    static void send(JetStream& device, const std::string& name, const std::string& text, const std::string& identity)
    {
        const auto sent = device.publish("kesto.events." + name, compressed(text),
                                         {{"Kesto-Edition", "1"}, {"Nats-Msg-Id", identity}});
        ASSERT_TRUE(sent) << sent.error();
    }
    void awaitStored(int id, std::string_view device = deviceA, const std::string& name = "device-1")
    {
        waitUntil(fmt::format("stored up to {} of {}", id, name), [&] {
            const auto entry = admin->last(fmt::format("kesto.stored.{}.{}", name, device));
            return entry && *entry && (*entry)->payload == fmt::format(R"({{"epoch":"{}","id":{}}})", epochA, id);
        });
    }
    [[nodiscard]] std::string metrics() const { return ask(metricsAddress); }
    void awaitMetric(const std::string& line)
    {
        waitUntil("the metrics say " + line, [&] { return metrics().contains(line + "\n"); });
    }
    void awaitLetter(const std::string& name, const std::string& payload)
    {
        waitUntil(fmt::format("a letter of {} is \"{}\"", name, payload), [&] {
            const auto entry = admin->last("kesto.dead." + name);
            return entry && *entry && (*entry)->payload == payload;
        });
    }
    static void awaitLine(const sdk_test::Process& ingest, const std::string& words)
    {
        waitUntil("kesto-ingest says " + words, [&] { return ingest.errors().contains(words); });
    }
    // The IDs that are stored, each once.
    [[nodiscard]] std::string events(std::string_view device = deviceA)
    {
        return database.select(fmt::format("SELECT arrayStringConcat(arrayMap(x -> toString(x), "
                                           "arraySort(groupUniqArray(id))), ' ') FROM events WHERE "
                                           "device = '{}'",
                                           device));
    }
    void expectEnd(sdk_test::Process& ingest)
    {
        ingest.signal(SIGTERM);
        EXPECT_EQ(ingest.wait(), 0) << ingest.errors();
    }

    support::TemporaryDirectory directory;
    NatsServer stream{directory / "nats"};
    ClickHouseServer database{directory / "clickhouse"};
    std::string metricsAddress;
    std::unique_ptr<JetStream> device1;
    std::unique_ptr<JetStream> device2;
    std::unique_ptr<JetStream> admin;

private:
    int files_ = 0;
};

TEST_F(IngestEndToEnd, StoresWhatIsRightAndPutsAsideWhatIsWrong)
{
    const auto ingest = start(database.address());
    send(*device1, "device-1", deviceLine(1, 3) + eventLine(1) + "nonsense\n" + eventLine(2) + stretchLine(3), "1");
    awaitStored(3);
    EXPECT_EQ(events(), "1 2");
    awaitLetter("device-1", "{\"reason\":\"it is no JSON from byte 1 on: Invalid value.\",\"row\":\"nonsense\"}\n");

    // The same once more: the stream knows the message; and, as after its window, under another identity.
    send(*device1, "device-1", deviceLine(1, 3) + eventLine(1) + eventLine(2) + stretchLine(3), "1");
    send(*device1, "device-1", deviceLine(1, 3) + eventLine(1) + eventLine(2) + stretchLine(3), "1 again");
    send(*device1, "device-1", deviceLine(4, 4) + eventLine(4), "4");
    awaitStored(4);
    EXPECT_EQ(events(), "1 2 4");
    EXPECT_EQ(database.select("SELECT count() FROM events FINAL"), "3");
    EXPECT_EQ(database.select("SELECT count() FROM stretches FINAL"), "1");

    // The pseudonym of another, and the subject of another.
    send(*device2, "device-2", deviceLine(5, 5) + eventLine(5), "5");
    send(*device2, "device-2", deviceLine(1, 1, deviceB) + eventLine(1, deviceB), "6");
    awaitStored(1, deviceB, "device-2");
    EXPECT_EQ(events(), "1 2 4");
    EXPECT_EQ(events(deviceB), "1");
    awaitLetter("device-2", compressed(deviceLine(5, 5) + eventLine(5)));
    awaitLine(*ingest, "belongs to the credential device-1");
    const auto forbidden = device2->publish("kesto.events.device-1", "x", {});
    ASSERT_FALSE(forbidden);
    EXPECT_THAT(forbidden.error(), HasSubstr("Permissions Violation for Publish to \"kesto.events.device-1\""));

    // A batch that cannot be read.
    ASSERT_TRUE(device1->publish("kesto.events.device-1", "rubbish", {{"Kesto-Edition", "1"}}));
    awaitLetter("device-1", "rubbish");
    awaitMetric("kesto_ingest_batches_refused_total{reason=\"forged\"} 1");
    awaitMetric("kesto_ingest_batches_refused_total{reason=\"unreadable\"} 1");
    awaitMetric("kesto_ingest_rows_refused_total{reason=\"schema\"} 1");
    awaitMetric("kesto_ingest_batches_stored_total 4");
    expectEnd(*ingest);
}

class IngestKilled : public IngestEndToEnd {
protected:
    IngestKilled() : IngestEndToEnd("2") { }
};

TEST_F(IngestKilled, LosesNothingIfItIsKilledBetweenInsertAndAcknowledgement)
{
    support::Relay way(database.port());
    auto ingest = start(fmt::format("http://127.0.0.1:{}", way.port()));
    way.loseAnswersWith("");
    send(*device1, "device-1", deviceLine(1, 2) + eventLine(1) + eventLine(2), "1");
    waitUntil("the database has answered", [&] { return way.hasLostAnAnswer(); });
    EXPECT_EQ(database.select("SELECT count() FROM events"), "2") << "inserted, and not acknowledged";
    ingest->signal(SIGKILL);
    EXPECT_EQ(ingest->wait(), 128 + SIGKILL);

    ingest = start(database.address());
    awaitStored(2);
    EXPECT_EQ(events(), "1 2");
    EXPECT_EQ(database.select("SELECT count() FROM events FINAL"), "2");
    EXPECT_EQ(database.select("SELECT count() FROM batches FINAL"), "1");
    EXPECT_FALSE(metrics().contains("kesto_ingest_batches_repeated_total 0\n"));
    expectEnd(*ingest);
}

TEST_F(IngestEndToEnd, WaitsForADatabaseThatIsAway)
{
    auto ingest = start(database.address());
    database.end();
    send(*device1, "device-1", deviceLine(1, 2) + eventLine(1) + eventLine(2), "1");
    awaitMetric("kesto_ingest_database_up 0");
    awaitLine(*ingest, "Failed to connect");

    // One copy ends meanwhile: the next has the batch without waiting for the end of its time.
    expectEnd(*ingest);
    database.start();
    ingest = start(database.address());
    awaitStored(2);
    EXPECT_EQ(events(), "1 2");
    expectEnd(*ingest);
}

TEST_F(IngestEndToEnd, SaysWhatIsMissing)
{
    EXPECT_EQ(database.select("DROP TABLE edition"), "");
    const std::string file = configuration("ingest", database.address());
    auto ended = sdk_test::run({KESTO_INGEST, "run", "--configuration", file});
    EXPECT_EQ(ended.status, 78);
    EXPECT_EQ(ended.errors,
              "kesto-ingest: the database kesto has no tables: make them by "
              "`kesto-ingest tables | clickhouse-client --multiquery`\n");
    EXPECT_EQ(database.select("CREATE VIEW edition AS SELECT toUInt64(7) AS edition"), "");
    ended = sdk_test::run({KESTO_INGEST, "run", "--configuration", file});
    EXPECT_EQ(ended.status, 78);
    EXPECT_EQ(ended.errors,
              "kesto-ingest: the tables in the database kesto are of edition 7, and this program writes "
              "edition 1: update the older of the two\n");
}

} // namespace
} // namespace kesto_ingest
