// SPDX-License-Identifier: Apache-2.0
// A collector gets the metrics, and one that says nothing does not stop others.
#include "kesto-ingest/MetricsServer.h"

#include "tools/kesto-ingest/FleetServers.h"

#include "platform/linux/files/FileDescriptor.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <arpa/inet.h>
#include <netinet/in.h>
#include <sys/socket.h>

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

TEST(MetricsServer, DoesNotWaitForACollectorThatSaysNothing)
{
    const Metrics metrics;
    const MetricsServer server(metrics, 0);
    const platform::FileDescriptor silent(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_port = htons(server.port());
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    ASSERT_EQ(::connect(silent.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_THAT(ask("http://127.0.0.1:" + std::to_string(server.port()) + "/metrics"),
                HasSubstr("\nkesto_ingest_inserts_total 0\n"));
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
