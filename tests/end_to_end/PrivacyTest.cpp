// SPDX-License-Identifier: Apache-2.0
// What the device owner's switches keep out of the store, looked for in the bytes of its files.
#include "end_to_end/Kestod.h"
#include "end_to_end/Sums.h"
#include "end_to_end/WireClient.h"
#include "support/MessageKinds.h"
#include "support/TemporaryDirectory.h"

#include <csignal>
#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <string>

namespace end_to_end {
namespace {

using foundation::Array;
using foundation::Dictionary;
using support::playback;
using support::typeStart;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::SizeIs;

constexpr const char* startEvent = "com.quarn.kesto.Playback.Start";

class PrivacyTest : public testing::Test {
protected:
    void start(const char* file, const char* text)
    {
        kestod.emplace(Kestod::Files{{file, text}});
        kestod->startAndAwait();
    }

    // A session of the application that plays and stops.
    void play(const char* application) const
    {
        WireClient client(kestod->socketPath());
        client.ask(Create, 1);
        client.ask(SetConfiguration, Dictionary{{"HostApplicationDisplayID", application}}, 1);
        client.call(Start, 1);
        client.ask(SendMessage, Dictionary{{"session_output_running", true}, {"PomoSessionVolume", 0.5}}, playback,
                   typeStart, Array{1});
        client.call(Stop, 1);
        for (int answer = 0; answer < 2; ++answer) // to the start, too
            ASSERT_TRUE(client.nextReply());
    }

    [[nodiscard]] bool isStoring() const
    {
        WireClient client(kestod->socketPath());
        client.sendFrame(Array{1, "status"});
        const auto reply = client.nextReply();
        return reply && (*reply)[2].dictionary()->find("storing")->asBoolean();
    }

    // Everything in the store's files, after the service ended in order.
    std::string bytesOfTheStore()
    {
        kestod->signal(SIGTERM);
        EXPECT_EQ(kestod->exitStatus(), 0);
        std::string bytes;
        for (const char* file : {"analytics.sqlite3", "analytics.sqlite3-wal"})
            if (std::filesystem::exists(kestod->directory() / "state" / file))
                bytes += support::readFile(kestod->directory() / "state" / file);
        return bytes;
    }

    std::optional<Kestod> kestod;
};

TEST_F(PrivacyTest, SwitchedOffNothingIsStoredAndClientsAreAnsweredAsEver)
{
    start("analytics.toml", "enabled = false\n");
    EXPECT_FALSE(isStoring());
    play("org.example.player");
    EXPECT_THAT(kestod->events(), IsEmpty());
    EXPECT_TRUE(waitUntil([this] { return brokenSums(*kestod).empty(); }))
        << "the ends of the connections are on their way";
    support::replaceFile(kestod->directory() / "configuration" / "analytics.toml", "enabled = true\n");
    ASSERT_TRUE(waitUntil([&] { return isStoring(); }));
    play("org.example.player");
    EXPECT_THAT(kestod->events(startEvent), SizeIs(1));
    EXPECT_TRUE(waitUntil([this] { return brokenSums(*kestod).empty(); }))
        << "the ends of the connections are on their way";
}

TEST_F(PrivacyTest, OfAnApplicationThatIsNotStoredTheFilesHoldNothing)
{
    start("applications.toml", "not_stored = [\"org.example.diary*\", \"end_to_end_test\"]\n");
    play("org.example.diary.first");
    play("org.example.player");
    EXPECT_THAT(kestod->events(startEvent), SizeIs(1));
    EXPECT_THAT(kestod->query("SELECT application FROM sessions"), ElementsAre("org.example.player"));
    EXPECT_TRUE(waitUntil([this] { return brokenSums(*kestod).empty(); }))
        << "the ends of the connections are on their way";
    const std::string bytes = bytesOfTheStore();
    EXPECT_THAT(bytes, Not(HasSubstr("diary")));
    EXPECT_THAT(bytes, Not(HasSubstr("end_to_end_test"))) << "the process's name";
    EXPECT_THAT(bytes, HasSubstr("org.example.player"));
}

TEST_F(PrivacyTest, AHashedApplicationHasOnePseudonymAndTheFilesHoldItsNameNowhere)
{
    start("applications.toml", "hashed = [\"org.example.bank\"]\n");
    play("org.example.bank");
    play("org.example.bank");
    EXPECT_THAT(kestod->events(startEvent), SizeIs(2));
    const auto names =
        kestod->query("SELECT application FROM sessions UNION "
                      "SELECT payload ->> 'HostApplicationDisplayID' FROM events WHERE session NOT NULL");
    ASSERT_THAT(names, SizeIs(1)) << "the same in both places";
    EXPECT_THAT(names[0], testing::MatchesRegex("app-[0-9a-f]{16}"));
    EXPECT_TRUE(waitUntil([this] { return brokenSums(*kestod).empty(); }))
        << "the ends of the connections are on their way";
    EXPECT_THAT(bytesOfTheStore(), Not(HasSubstr("org.example.bank")));
}

} // namespace
} // namespace end_to_end
