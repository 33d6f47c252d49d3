// SPDX-License-Identifier: Apache-2.0
// What uplink.toml may say, and what the uplink says about a wrong one.
#include "kesto-uplink/rules/UplinkConfiguration.h"

#include "support/ManualPage.h"
#include "support/TemporaryDirectory.h"

#include <fstream>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iterator>
#include <regex>

namespace kesto_uplink {
namespace {

using testing::ElementsAre;
using testing::ElementsAreArray;
using testing::IsEmpty;
using testing::SizeIs;
using testing::StartsWith;

CheckedUplinkConfiguration parse(std::string_view text)
{
    return parseUplinkConfiguration("/etc/kesto/uplink.toml", text);
}

std::vector<std::string> problems(std::string_view text)
{
    return parse(text).problems;
}

TEST(UplinkConfiguration, IsOffByDefault)
{
    const auto checked = parse("");
    EXPECT_THAT(checked.problems, IsEmpty());
    EXPECT_FALSE(checked.isOn());
    EXPECT_EQ(checked.configuration.intervalSeconds, 900);
    EXPECT_EQ(checked.configuration.maximumBytesADay, 20'000'000U);
    EXPECT_EQ(checked.configuration.forgetWhen, ForgetWhen::Stored);
    EXPECT_TRUE(checked.configuration.metered);
    EXPECT_THAT(checked.configuration.allowed.events, IsEmpty());
    EXPECT_EQ(checked.configuration.allowed.stretches, std::nullopt);
    EXPECT_EQ(checked.configuration.allowed.sessions, std::nullopt);
}

TEST(UplinkConfiguration, ReadsEverySetting)
{
    const auto checked = parse(R"(
enabled = true
servers = ["tls://one.example:4222", "nats://127.0.0.1:4222"]
credentials = "/etc/kesto/uplink.credentials"
ca = "/etc/kesto/fleet.pem"
pseudonym_days = 30
hash_key_days = 7.5
forget = "queued"
interval = 60
maximum_bytes_a_day = 1000000
metered = false
[device]
model = "speaker 2"
version = "7.1"
[stretches]
device = "hash"
volume = { bucket = [0.25, 0.5] }
[sessions]
)");
    EXPECT_THAT(checked.problems, IsEmpty());
    EXPECT_TRUE(checked.isOn());
    const UplinkConfiguration& read = checked.configuration;
    EXPECT_THAT(read.servers, ElementsAre("tls://one.example:4222", "nats://127.0.0.1:4222"));
    EXPECT_EQ(read.credentials, "/etc/kesto/uplink.credentials");
    EXPECT_EQ(read.ca, "/etc/kesto/fleet.pem");
    EXPECT_EQ(read.pseudonymDays, 30);
    EXPECT_EQ(read.hashKeyDays, 7.5);
    EXPECT_EQ(read.forgetWhen, ForgetWhen::Queued);
    EXPECT_EQ(read.intervalSeconds, 60);
    EXPECT_EQ(read.maximumBytesADay, 1'000'000U);
    EXPECT_FALSE(read.metered);
    EXPECT_EQ(read.model, "speaker 2");
    EXPECT_EQ(read.version, "7.1");
    ASSERT_TRUE(read.allowed.stretches);
    ASSERT_THAT(*read.allowed.stretches, SizeIs(2));
    EXPECT_EQ(read.allowed.stretches->at(0).key, "device");
    EXPECT_EQ(read.allowed.stretches->at(0).action, Rule::Action::Hash);
    EXPECT_EQ(read.allowed.stretches->at(1).action, Rule::Action::Bucket);
    EXPECT_THAT(read.allowed.stretches->at(1).edges, ElementsAre(0.25, 0.5));
    ASSERT_TRUE(read.allowed.sessions);
    EXPECT_THAT(*read.allowed.sessions, IsEmpty());
}

TEST(UplinkConfiguration, ReadsRulesInTheOrderOfTheFile)
{
    const auto checked = parse("[events.\"z.*\"]\nb = \"keep\"\na = \"drop\"\n[events.\"a.*\"]\nk = {bucket = [1]}\n");
    EXPECT_THAT(checked.problems, IsEmpty());
    const auto& events = checked.configuration.allowed.events;
    ASSERT_THAT(events, SizeIs(2));
    EXPECT_EQ(events[0].names, "z.*");
    EXPECT_EQ(events[0].line, 1U);
    ASSERT_THAT(events[0].rules, SizeIs(2));
    EXPECT_EQ(events[0].rules[0].key, "a");
    EXPECT_EQ(events[0].rules[0].line, 3U);
    EXPECT_EQ(events[0].rules[1].key, "b");
    EXPECT_EQ(events[0].rules[1].line, 2U);
    EXPECT_EQ(events[1].names, "a.*");
    EXPECT_EQ(events[1].line, 4U);
}

TEST(UplinkConfiguration, SaysWhereAKeyIsUnknown)
{
    EXPECT_THAT(problems("enabled = true\nservers = [\"tls://a:1\"]\nserver = \"tls://a:1\"\n"),
                ElementsAre("/etc/kesto/uplink.toml:3: unknown key server: correct or remove it; the keys here are "
                            "enabled, servers, credentials, ca, pseudonym_days, hash_key_days, forget, interval, "
                            "maximum_bytes_a_day, metered, and the tables [device], [events.\"NAME\"], [stretches] "
                            "and [sessions]"));
    EXPECT_THAT(problems("[device]\nserial = \"1\"\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: unknown key serial: correct or remove it; the keys here are "
                            "model, version"));
    EXPECT_THAT(problems("[stretches]\nseconds = \"keep\"\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: unknown column seconds: correct or remove it; the columns here "
                            "are device, format, channels, volume, application"));
}

TEST(UplinkConfiguration, SaysWhatAValueShouldBe)
{
    EXPECT_THAT(problems("\ninterval = 0\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: interval = 0 should be a number of seconds above 0, a week at "
                            "most"));
    EXPECT_THAT(problems("servers = [\"reports.example\"]"),
                ElementsAre(StartsWith("/etc/kesto/uplink.toml:1: servers")));
    EXPECT_THAT(problems("servers = \"tls://reports.example\""), SizeIs(1));
    EXPECT_THAT(problems("enabled = 1"), SizeIs(1));
    EXPECT_THAT(problems("forget = \"sent\""), SizeIs(1));
    EXPECT_THAT(problems("credentials = \"uplink.credentials\""), SizeIs(1));
    EXPECT_THAT(problems("interval = inf"), SizeIs(1));
    EXPECT_THAT(problems("interval = 700000"), SizeIs(1));
    EXPECT_THAT(problems("maximum_bytes_a_day = -1"), SizeIs(1));
    // A day must have room for the largest batch, else that batch would never leave.
    EXPECT_THAT(problems("maximum_bytes_a_day = 524287"),
                ElementsAre("/etc/kesto/uplink.toml:1: maximum_bytes_a_day = 524287 should be a whole number of "
                            "bytes, at least 524288, which is the largest batch"));
    EXPECT_THAT(problems("maximum_bytes_a_day = 524288"), IsEmpty());
    EXPECT_THAT(problems("maximum_bytes_a_day = 1.5"), SizeIs(1));
    EXPECT_THAT(problems("pseudonym_days = true"), SizeIs(1));
    EXPECT_THAT(problems("events = 1"), SizeIs(1));
    EXPECT_THAT(problems("[device]\nmodel = \"\"\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: model =  should be a text of 1 to 128 bytes"));
    EXPECT_THAT(problems("[device]\nversion = \"" + std::string(129, 'v') + "\"\n"), SizeIs(1));
    EXPECT_THAT(problems("[device]\nversion = \"" + std::string(128, 'v') + "\"\n"), IsEmpty());
}

TEST(UplinkConfiguration, SaysWhatARuleIs)
{
    EXPECT_THAT(problems("[events.\"a\"]\nk = \"keeep\"\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: k = keeep is no rule: a rule is \"keep\", \"drop\", \"hash\" or "
                            "a bucket such as { bucket = [1, 10, 60] }"));
    EXPECT_THAT(problems("[events.\"a\"]\nk = { bucket = [1, 1] }\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: the edges [1,1] of k should be numbers, each larger than the "
                            "one before it, such as [1, 10, 60]"));
    EXPECT_THAT(problems("[events.\"a\"]\nk = { bucket = [] }\n"), SizeIs(1));
    EXPECT_THAT(problems("[events.\"a\"]\nk = { bucket = [inf] }\n"), SizeIs(1));
    EXPECT_THAT(problems("[events.\"a\"]\nk = { bucket = [true] }\n"), SizeIs(1));
    EXPECT_THAT(problems("[events.\"a\"]\nk = { bucket = [1], or = 2 }\n"), SizeIs(1));
    EXPECT_THAT(problems("[events.\"a\"]\nk = true\n"), SizeIs(1));
    EXPECT_THAT(problems("[events]\nk = \"keep\"\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: the rules for events named k stand in a table of their own: "
                            "[events.\"k\"]"));
    EXPECT_THAT(problems("[stretches]\nvolume = \"hash\"\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: volume is a number, and a hash is not: use \"keep\", \"drop\" "
                            "or a bucket such as { bucket = [1, 10, 60] }"));
}

// The uplink sends the edge in place of the number. Receivers take whole numbers in these columns only.
TEST(UplinkConfiguration, SaysWhichEdgesAColumnCanHave)
{
    EXPECT_THAT(problems("[stretches]\nchannels = { bucket = [1, 2.5] }\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: the edges of channels should be whole numbers from 0 to "
                            "4294967295"));
    EXPECT_THAT(problems("[stretches]\nchannels = { bucket = [-1, 2] }\n"), SizeIs(1));
    EXPECT_THAT(problems("[stretches]\nchannels = { bucket = [4294967296] }\n"), SizeIs(1));
    EXPECT_THAT(problems("[stretches]\nchannels = { bucket = [0, 4294967295] }\n"), IsEmpty());
    EXPECT_THAT(problems("[stretches]\nvolume = { bucket = [-0.5, 0.5] }\n"), IsEmpty());
    EXPECT_THAT(problems("[sessions]\nreporter = { bucket = [0.5] }\n"),
                ElementsAre("/etc/kesto/uplink.toml:2: the edges of reporter should be whole numbers from "
                            "-9007199254740992 to 9007199254740992"));
    EXPECT_THAT(problems("[sessions]\nreporter = { bucket = [1e300] }\n"), SizeIs(1));
    EXPECT_THAT(problems("[sessions]\nreporter = { bucket = [-100000, 100000] }\n"), IsEmpty());
}

TEST(UplinkConfiguration, SaysThatNamesOfEventsStandInQuotes)
{
    const auto found = problems("[events.com.quarn.kesto.Stop]\nk = \"keep\"\n");
    ASSERT_THAT(found, SizeIs(1));
    EXPECT_THAT(found[0], StartsWith("/etc/kesto/uplink.toml:1: the table quarn is no rule"));
    EXPECT_THAT(found[0], testing::HasSubstr("[events.\"com.quarn.kesto.Playback.Stop\"]"));
}

TEST(UplinkConfiguration, NeedsServersToBeOn)
{
    const auto checked = parse("enabled = true\n");
    EXPECT_THAT(checked.problems,
                ElementsAre("/etc/kesto/uplink.toml:1: without servers nothing can leave: add servers = "
                            "[\"tls://HOST:4222\"], or set enabled = false"));
    EXPECT_FALSE(checked.isOn());
    EXPECT_THAT(problems("enabled = true\nservers = []\n"), SizeIs(1));
}

TEST(UplinkConfiguration, IsOffWhileAnythingIsWrong)
{
    EXPECT_FALSE(parse("enabled = true\nservers = [\"tls://a:1\"]\nx = 1\n").isOn());
    EXPECT_TRUE(parse("enabled = true\nservers = [\"tls://a:1\"]\n").isOn());
    const auto broken = parse("enabled = true\nservers = [\"tls://a:1\"\n");
    EXPECT_FALSE(broken.isOn());
    ASSERT_THAT(broken.problems, SizeIs(1));
    EXPECT_THAT(broken.problems[0], StartsWith("/etc/kesto/uplink.toml:"));
}

TEST(UplinkConfiguration, ReadsAFile)
{
    const support::TemporaryDirectory directory;
    EXPECT_THAT(readUplinkConfiguration(directory / "missing.toml").problems, IsEmpty());
    support::writeFile(directory / "uplink.toml", "[device]\nmodel = \"m\"\n");
    EXPECT_EQ(readUplinkConfiguration(directory / "uplink.toml").configuration.model, "m");
    EXPECT_THAT(readUplinkConfiguration(directory.path()).problems, SizeIs(1));
}

// As a maker begins: with the example, and the signs of its commented lines removed.
TEST(UplinkConfiguration, ReadsItsExample)
{
    std::ifstream stream(KESTO_EXAMPLES "/uplink.toml");
    const std::string text{std::istreambuf_iterator(stream), {}};
    const auto shown = parse(text);
    EXPECT_THAT(shown.problems, IsEmpty());
    EXPECT_FALSE(shown.isOn());
    EXPECT_EQ(shown.configuration.pseudonymDays, UplinkConfiguration().pseudonymDays);
    EXPECT_EQ(shown.configuration.hashKeyDays, UplinkConfiguration().hashKeyDays);
    EXPECT_EQ(shown.configuration.intervalSeconds, UplinkConfiguration().intervalSeconds);
    EXPECT_EQ(shown.configuration.maximumBytesADay, UplinkConfiguration().maximumBytesADay);
    EXPECT_THAT(shown.configuration.allowed.events, IsEmpty());

    const auto whole = parse(std::regex_replace(text, std::regex("(^|\n)#(?=[a-zA-Z\\[])"), "$1"));
    EXPECT_THAT(whole.problems, IsEmpty());
    EXPECT_THAT(whole.configuration.servers, ElementsAre("tls://reports.example:4222"));
    EXPECT_EQ(whole.configuration.model, "speaker-2");
    ASSERT_THAT(whole.configuration.allowed.events, SizeIs(2));
    EXPECT_THAT(whole.configuration.allowed.events[0].rules, SizeIs(3));
    EXPECT_THAT(*whole.configuration.allowed.stretches, SizeIs(3));
    EXPECT_THAT(*whole.configuration.allowed.sessions, SizeIs(2));
}

TEST(UplinkConfiguration, TheManualPageDescribesEveryKey)
{
    const auto unknown = parse("no_such_key = 1\n[device]\nno_such_key = 1\n");
    ASSERT_THAT(unknown.problems, SizeIs(2));
    std::vector<std::string> known = support::keysIn(unknown.problems[0]);
    std::erase_if(known, [](const std::string& key) { return key.contains('['); }); // tables
    for (const std::string& key : support::keysIn(unknown.problems[1]))
        known.push_back(key);
    EXPECT_THAT(support::keysOnPage(KESTO_EXAMPLES "/../man/kesto-uplink.toml.5"), ElementsAreArray(known));
}

} // namespace
} // namespace kesto_uplink
