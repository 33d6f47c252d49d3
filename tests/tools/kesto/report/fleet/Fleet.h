// SPDX-License-Identifier: Apache-2.0
// A fleet of a test's own: a real database, filled by the code of kesto-uplink and kesto-ingest, and the tool that
// reads it.
#pragma once

#include "kesto-ingest/batch/Batch.h"
#include "kesto-ingest/database/ClickHouse.h"
#include "kesto-ingest/database/Tables.h"
#include "kesto-uplink/outbox/Outbox.h"
#include "support/ParseJson.h"
#include "support/TemporaryDirectory.h"
#include "tools/kesto-ingest/FleetServers.h"
#include "tools/kesto/Tool.h"

#include <filesystem>
#include <gtest/gtest.h>
#include <string>
#include <string_view>
#include <utility>

namespace kesto_tool {

class FleetReports : public testing::Test {
protected:
    FleetReports() { server.makeTables(); }

    void insert(const kesto_ingest::Batch& batch)
    {
        EXPECT_TRUE(batch.badRows.empty()) << batch.badRows.front().reason;
        std::map<std::string_view, std::string> rows;
        for (const kesto_ingest::Row& row : batch.rows)
            rows[kesto_ingest::name(row.table)] += batch.jsonOf(row);
        for (const auto& [table, text] : rows)
            EXPECT_EQ(database.insert(table, text), kesto_ingest::InsertAnswer());
    }

    // Lines as a device sends them, without the first one.
    void insertLines(const std::string& unit, const std::string& lines, const std::string& model = "lamp",
                     const std::string& version = "1.2")
    {
        const std::string keys = R"({"device":")" + unit + R"(","epoch":"00000000000000000000000000000001",)";
        std::string text = keys + R"("kind":"device","model":")" + model + R"(","version":")" + version
            + R"(","sent":1795264600.5,"first":1,"last":9999})" + "\n";
        std::istringstream stream(lines);
        for (std::string line; std::getline(stream, line);)
            text += keys + line + "\n";
        const auto batch = kesto_ingest::readLines(text);
        ASSERT_TRUE(batch) << batch.error();
        insert(*batch);
    }

    // All that a store has and a fleet can use, in the batches of a device. Each of them `times` times.
    void send(const std::filesystem::path& store, const std::string& unit, int times)
    {
        using kesto_uplink::Rule;
        const auto keep = [](std::initializer_list<const char*> keys) {
            std::vector<Rule> rules;
            for (const char* const key : keys)
                rules.push_back({.key = key, .action = Rule::Action::Keep});
            return rules;
        };
        kesto_uplink::UplinkConfiguration configuration;
        configuration.model = "lamp";
        configuration.version = "1.2";
        configuration.allowed.events = {
            {.names = "com.quarn.kesto.Error.*", .rules = keep({"active_devices", "late_cycles"})}};
        configuration.allowed.stretches = keep({"device", "format", "volume", "application"});
        configuration.allowed.sessions = keep({"service", "application", "process"});
        kesto_uplink::Outbox outbox(store, configuration, {.pseudonym = unit, .hashKey = "key"});
        kesto_uplink::Cursor after;
        std::set<std::int64_t> openSessions;
        while (auto batch = outbox.next(after, openSessions, 1795264600)) {
            after = batch->last;
            openSessions = batch->openSessions;
            if (batch->rows == 0)
                continue;
            const auto received = kesto_ingest::readBatch(batch->bytes);
            ASSERT_TRUE(received) << received.error();
            for (int time = 0; time < times; ++time)
                insert(*received);
        }
    }

    [[nodiscard]] Tool::Arguments withFleet(Tool::Arguments arguments) const
    {
        arguments.insert(arguments.begin(), {"report", "--fleet", server.address()});
        return arguments;
    }
    [[nodiscard]] std::string print(const Tool::Arguments& arguments) const { return tool.print(withFleet(arguments)); }
    // What the tool says when it fails.
    [[nodiscard]] std::string failure(const Tool::Arguments& arguments) const
    {
        const Finished finished = tool.run(withFleet(arguments));
        EXPECT_EQ(finished.status, 1) << finished.output;
        return finished.errors;
    }
    [[nodiscard]] foundation::Dictionary json(Tool::Arguments arguments) const
    {
        arguments.emplace_back("--json");
        return dictionaryOf(print(arguments));
    }
    static foundation::Dictionary dictionaryOf(const std::string& text)
    {
        const auto value = support::parseJson(text);
        EXPECT_TRUE(value && value->dictionary()) << text;
        return value && value->dictionary() ? *value->dictionary() : foundation::Dictionary();
    }

    support::TemporaryDirectory directory;
    kesto_ingest::ClickHouseServer server{directory / "clickhouse"};
    kesto_ingest::ClickHouse database{{.servers = {server.address()}}};
    Tool tool{directory.path()};
};

} // namespace kesto_tool
