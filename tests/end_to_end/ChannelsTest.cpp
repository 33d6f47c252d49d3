// SPDX-License-Identifier: Apache-2.0
// Channels that a driver helper publishes with libkesto, up to the stored event with their change during a session.
#include "kesto/channels.hpp"
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "support/Victim.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace end_to_end {
namespace {

using foundation::Value;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;
using testing::SizeIs;

// A session of that service over which `change` happens.
template <typename Change> void runSession(Kestod& kestod, Change change)
{
    WireClient client(kestod.socketPath());
    client.ask(Create, 42);
    const auto start = client.call(Start, 42);
    client.ask(SetServiceType, 7, 42); // answered once the session has started
    change();
    client.call(Stop, 42);
    EXPECT_EQ((*client.nextReply())[0], Value(start));
    EXPECT_TRUE(client.nextReply());
}

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

    template <typename Change> void runSession(Change change)
    {
        end_to_end::runSession(kestod, [&] {
            change();
            EXPECT_EQ(publisher.flush(), kesto::Status::Ok);
        });
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
    kestod.awaitLog();
    for (const char* name : {"folder", "half", "link", "pipe"})
        EXPECT_EQ(kestod.countInLog("channel hostile/Tx/-/" + std::string(name) + " is left out"), 1U) << name;
}

// A driver "dock" in a process of its own, with its counter and its state.
class KilledDriverTest : public testing::Test {
protected:
    [[nodiscard]] support::Victim dock(const std::string& device) const
    {
        return support::Victim([this, device] {
            static kesto::Publisher publisher;
            static kesto::SimpleChannel cycles;
            static kesto::StateChannel state;
            kesto::PublisherOptions options;
            options.root = kestod.directory() / "run/channels";
            const bool isRight = publisher.open(options) == kesto::Status::Ok
                && cycles.create(publisher, {"dock", "Tx", device, "cycles"}) == kesto::Status::Ok
                && state.create(publisher, {"dock", "Speaker", device, "state"}, {"Idle", "Running"})
                    == kesto::Status::Ok;
            cycles.add(1000);
            state.enter(1);
            return isRight && publisher.flush() == kesto::Status::Ok;
        });
    }
    // The drivers' statistics in all events of sessions.
    [[nodiscard]] std::string told()
    {
        std::string text;
        for (const char* kind : {"Simple", "State"})
            for (const auto& event : kestod.events(std::string("com.quarn.kesto.Cavlet.") + kind))
                text += event.payload;
        return text;
    }

    Kestod kestod;
};

TEST_F(KilledDriverTest, WhatItLeftIsNotReported)
{
    support::Victim killed = dock("old");
    const support::Victim living = dock("new");
    kestod.start();
    runSession(kestod, [] { });
    EXPECT_THAT(told(), AllOf(HasSubstr("dock_Speaker_old_State_state"), HasSubstr("dock_Speaker_new_State_state")));
    runSession(kestod, [&] { killed.kill(); });
    runSession(kestod, [] { });
    const auto states = kestod.events("com.quarn.kesto.Cavlet.State");
    ASSERT_THAT(states, SizeIs(3));
    for (const std::size_t afterwards : {1U, 2U})
        EXPECT_THAT(states[afterwards].payload,
                    AllOf(Not(HasSubstr("dock_Speaker_old")), HasSubstr("dock_Speaker_new_State_state")));
    kestod.awaitLog();
    EXPECT_EQ(kestod.countInLog("is left out"), 0U);
}

TEST_F(KilledDriverTest, ItsSuccessorIsReportedInItsPlace)
{
    const auto folder = kestod.directory() / "run/channels/dock";
    support::Victim killed = dock("old");
    kestod.start();
    runSession(kestod, [] { }); // the service looks for drivers once, before it samples for the first session
    killed.kill();
    ASSERT_TRUE(std::filesystem::exists(folder / "Tx/old/cycles"));
    const support::Victim next = dock("new");
    EXPECT_FALSE(std::filesystem::exists(folder / "Tx/old"));
    EXPECT_FALSE(std::filesystem::exists(folder / "Speaker/old"));
    runSession(kestod, [] { });
    const auto states = kestod.events("com.quarn.kesto.Cavlet.State");
    ASSERT_THAT(states, SizeIs(2));
    EXPECT_THAT(states[0].payload, HasSubstr("dock_Speaker_old_State_state"));
    EXPECT_THAT(states[1].payload, AllOf(HasSubstr("dock_Speaker_new_State_state"), Not(HasSubstr("old"))));
}

} // namespace
} // namespace end_to_end
