// What a driver helper publishes with libkesto, up to the stored event that tells how it changed over a session.
#include "kesto/channels.hpp"
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace end_to_end {
namespace {

using foundation::Value;
using testing::HasSubstr;
using testing::SizeIs;

class ChannelsTest : public testing::Test {
protected:
    ChannelsTest()
    {
        kesto::PublisherOptions options;
        options.root = kestod.directory() / "run/channels";
        EXPECT_EQ(publisher.open(options), kesto::Status::Ok);
        EXPECT_EQ(late.create(publisher, {"mixer<7>", "Tx", "", "late cycles"}), kesto::Status::Ok);
        EXPECT_EQ(duration.create(publisher, {"mixer<7>", "Tx", "", "cycle time"}, "us", {0, 100, 1000}),
                  kesto::Status::Ok);
        late.add(40);
        EXPECT_EQ(publisher.flush(), kesto::Status::Ok);
    }

    // A session over which `change` happens.
    template <typename Change> void runSession(Change change)
    {
        WireClient client(kestod.socketPath());
        client.ask(Create, 42);
        const auto start = client.call(Start, 42);
        client.ask(SetServiceType, 7, 42); // answered once the session has started
        change();
        EXPECT_EQ(publisher.flush(), kesto::Status::Ok);
        client.call(Stop, 42);
        EXPECT_EQ((*client.nextReply())[0], Value(start));
        EXPECT_TRUE(client.nextReply());
    }

    Kestod kestod;
    kesto::Publisher publisher;
    kesto::SimpleChannel late;
    kesto::HistogramChannel duration;
};

TEST_F(ChannelsTest, WhatChangesOverASessionBecomesItsDriverStatistics)
{
    kestod.start();
    runSession([&] {
        late.add(7);
        duration.record(50);
        duration.record(700);
        duration.record(800);
    });
    const auto simple = kestod.events("com.quarn.kesto.Cavlet.Simple");
    ASSERT_THAT(simple, SizeIs(1));
    EXPECT_THAT(simple[0].payload, HasSubstr(R"("mixer_Tx_Simple_latecycles":7)"));
    const auto histogram = kestod.events("com.quarn.longformaudio.Cavlet.Histogram");
    ASSERT_THAT(histogram, SizeIs(1));
    EXPECT_THAT(histogram[0].payload,
                HasSubstr(R"("mixer_Tx_Histogram_cycletime":)"
                          R"("count=2,lower=0,upper=1000,min=50,max=800,unit=us::0-100:1;100-1000:2")"));
}

TEST_F(ChannelsTest, AHostileTreeCostsItsFilesAndNothingElse)
{
    const auto folder = kestod.directory() / "run/channels/hostile/Tx/-";
    std::filesystem::create_directories(folder / "folder");
    std::filesystem::create_symlink("/dev/zero", folder / "link");
    ASSERT_EQ(::mkfifo((folder / "pipe").c_str(), 0600), 0);
    support::writeFile(folder / "half", "simple\n1");
    kestod.start();
    runSession([&] { late.add(7); });
    EXPECT_THAT(kestod.events("com.quarn.kesto.Cavlet.Simple"), SizeIs(1));
    for (const char* name : {"folder", "half", "link", "pipe"})
        EXPECT_EQ(kestod.countInLog("channel hostile/Tx/-/" + std::string(name) + " is left out"), 1U) << name;
}

} // namespace
} // namespace end_to_end
