// SPDX-License-Identifier: Apache-2.0
// A collector gets the metrics, and one that says nothing does not stop others.
#include "kesto-ingest/MetricsServer.h"

#include "tools/kesto-ingest/FleetServers.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <system_error>

namespace kesto_ingest {
namespace {

using testing::HasSubstr;

TEST(MetricsServer, AnswersEachQuestion)
{
    Metrics metrics;
    const MetricsServer server(metrics, 0);
    const std::string address = "http://127.0.0.1:" + std::to_string(server.port()) + "/metrics";
    EXPECT_THAT(ask(address), HasSubstr("\nkesto_ingest_inserts_total 0\n"));
    metrics.add(Counter::Inserts);
    EXPECT_THAT(ask(address), HasSubstr("\nkesto_ingest_inserts_total 1\n"));
}

TEST(MetricsServer, NamesAPortThatIsTaken)
{
    const Metrics metrics;
    const MetricsServer server(metrics, 0);
    try {
        const MetricsServer second(metrics, server.port());
        FAIL();
    } catch (const std::system_error& error) {
        EXPECT_THAT(error.what(), HasSubstr("the metrics cannot use port " + std::to_string(server.port())));
    }
}

} // namespace
} // namespace kesto_ingest
