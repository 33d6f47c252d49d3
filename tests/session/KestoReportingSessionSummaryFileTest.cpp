// SPDX-License-Identifier: Apache-2.0
// The summary file: its place, its name, its content, and the log line when it cannot be written.
#include "session/GeneratedMessages.h"
#include "session/KestoReportingSession.h"
#include "support/MessageKinds.h"
#include "support/ParseJson.h"
#include "support/TestPlatform.h"

#include <algorithm>
#include <cstdlib>
#include <ctime>
#include <gmock/gmock.h>
#include <rapidcheck/gtest.h>

namespace {

using enum platform::LogLevel;
using foundation::Dictionary;
using foundation::Value;
using support::IsLine;
using support::playback;
using testing::Contains;
using testing::Each;
using testing::ElementsAre;
using testing::EndsWith;
using testing::IsEmpty;
using testing::Key;
using testing::Pair;
using testing::SizeIs;
using testing::StartsWith;

Value parse(const std::string& text)
{
    const auto value = support::parseJson(text);
    EXPECT_TRUE(value.has_value()) << text;
    return value.value_or(Value());
}

// Sets the process's time zone as long as it exists.
class TimeZone {
public:
    explicit TimeZone(const char* zone) { set(zone); }
    ~TimeZone()
    {
        ::unsetenv("TZ");
        ::tzset();
    }
    TimeZone(const TimeZone&) = delete;
    TimeZone& operator=(const TimeZone&) = delete;

    static void set(const char* zone) { ::setenv("TZ", zone, 1); }
};

class SummaryFile : public testing::Test {
protected:
    SummaryFile()
    {
        platform.deviceProperties.setInternalBuild(true);
        platform.clock.set(1'767'225'600.75);
        session->setServiceType(7);
        session->setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.player"}});
        session->start();
    }

    void record(const Dictionary& message)
    {
        session->sendMessage(platform.turn.tally, message, playback, AudioEventTypeError, nullptr);
    }

    // Writes the file, and returns the name and text of the only file.
    std::pair<std::string, std::string> write()
    {
        platform.log.clear();
        session->writeSummaryJson();
        if (platform.fileSystem.files.size() != 1)
            return {};
        const auto& [path, text] = *platform.fileSystem.files.begin();
        EXPECT_EQ(path.parent_path(), "/diagnostics/Audio/Reporting");
        EXPECT_TRUE(platform.fileSystem.keptWithin.back().kept.isOne(path.filename().native())) << path;
        return {path.filename(), text};
    }

    // The name of the file for that application.
    std::string nameFor(const Value& application)
    {
        session->setConfiguration(Dictionary{{"HostApplicationDisplayID", application}});
        record({});
        platform.fileSystem.files.clear();
        return write().first;
    }

    const TimeZone utc{"UTC"};
    support::TestPlatform platform;
    std::shared_ptr<KestoReportingSession> session =
        std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
};

// --- when it is written

TEST_F(SummaryFile, IsNoneWithoutMessages)
{
    session->writeSummaryJson();
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    EXPECT_THAT(platform.fileSystem.directories, IsEmpty());
}

TEST_F(SummaryFile, IsNoneWhileNotStarted)
{
    record({{"a", 1}});
    session->stop(platform.turn);
    platform.fileSystem.files.clear();
    session->writeSummaryJson();
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
}

TEST_F(SummaryFile, IsNoneOfASessionThatWasNeverStarted)
{
    session = std::make_shared<KestoReportingSession>(43, std::vector<std::int32_t>{7});
    record({{"a", 1}});
    platform.log.clear();
    session->stop(platform.turn);
    session->writeSummaryJson();
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    EXPECT_THAT(platform.fileSystem.directories, IsEmpty());
    EXPECT_THAT(platform.log.lines(), ElementsAre(IsLine(Debug, "kerr", "ending session 43")));
}

TEST(SummaryFileOnCustomerBuilds, IsNone)
{
    support::TestPlatform platform;
    const auto session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
    session->start();
    session->sendMessage(platform.turn.tally, Dictionary{{"a", 1}}, playback, 1, nullptr);
    session->writeSummaryJson();
    session->stop(platform.turn);
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    EXPECT_THAT(platform.fileSystem.directories, IsEmpty());
}

// --- its place

TEST_F(SummaryFile, IsInADirectoryForEverybody)
{
    record({{"a", 1}});
    write();
    EXPECT_THAT(platform.fileSystem.directories,
                ElementsAre(Pair("/diagnostics/Audio", 0777), Pair("/diagnostics/Audio/Reporting", 0777)));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Info, "kerr",
                                   "jsonOutput writeToURL: /diagnostics/Audio/Reporting/"
                                   "20260101-000000+0000-kesto-org.player-longformaudio.json")));
    EXPECT_EQ(platform.log.lines()[0].name, "KestoReportingSession");
}

TEST_F(SummaryFile, TakesThePlaceOfAnEarlierOneOfTheSameSecond)
{
    record({{"a", 1}});
    session->stop(platform.turn);
    platform.clock.advance(0.2);
    const auto other = std::make_shared<KestoReportingSession>(43, std::vector<std::int32_t>{7});
    other->setServiceType(7);
    other->setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.player"}});
    other->start();
    other->sendMessage(platform.turn.tally, Dictionary{{"b", 2}}, playback, 1, nullptr);
    other->stop(platform.turn);
    ASSERT_THAT(platform.fileSystem.files, SizeIs(1));
    EXPECT_THAT(platform.fileSystem.files.begin()->second, testing::HasSubstr("\"b\": 2"));
}

TEST_F(SummaryFile, LeavesThoseOfOtherSecondsApplicationsAndServicesAlone)
{
    record({{"a", 1}});
    const auto write = [this] { session->writeSummaryJson(); };
    write();
    platform.clock.advance(1);
    write();
    session->setServiceType(6);
    write();
    session->setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.other"}});
    write();
    EXPECT_THAT(platform.fileSystem.files, SizeIs(4));
}

// --- its name

TEST_F(SummaryFile, IsCalledAfterLocalTimeApplicationAndService)
{
    EXPECT_EQ(nameFor("org.player"), "20260101-000000+0000-kesto-org.player-longformaudio.json");
    TimeZone::set("Asia/Kolkata");
    EXPECT_EQ(nameFor("org.player"), "20260101-053000+0530-kesto-org.player-longformaudio.json");
    TimeZone::set("America/St_Johns");
    EXPECT_EQ(nameFor("org.player"), "20251231-203000-0330-kesto-org.player-longformaudio.json");
    platform.clock.set(1'782'864'000); // in summer
    EXPECT_EQ(nameFor("org.player"), "20260630-213000-0230-kesto-org.player-longformaudio.json");
    session->setServiceType(65535);
    EXPECT_THAT(nameFor("org.player"), EndsWith("-kesto-org.player-unknown.json"));
    session->setServiceType(14);
    EXPECT_THAT(nameFor("org.player"), EndsWith("-kesto-org.player-telephony.json"));
}

TEST_F(SummaryFile, IsCalledAfterAServiceThatWasNeverSet)
{
    session = std::make_shared<KestoReportingSession>(43, std::vector<std::int32_t>{});
    session->start();
    record({});
    EXPECT_THAT(write().first, EndsWith("-kesto-Unknown-generic.json"));
}

TEST_F(SummaryFile, NamesApplicationsThatAreNone)
{
    EXPECT_THAT(nameFor(Value()), EndsWith("-kesto-(null)-longformaudio.json"));
    EXPECT_THAT(nameFor(""), EndsWith("-kesto--longformaudio.json"));
    EXPECT_THAT(nameFor(7), EndsWith("-kesto-7-longformaudio.json"));
    EXPECT_THAT(nameFor(foundation::Array{"a/b"}), EndsWith("-kesto-[\"a_b\"]-longformaudio.json"));
}

TEST_F(SummaryFile, NeverLeavesItsDirectory)
{
    const std::vector<std::pair<std::string, std::string>> expected{{"/", "_"},
                                                                    {"..", ".."},
                                                                    {".", "."},
                                                                    {"../../etc/passwd", ".._.._etc_passwd"},
                                                                    {"/etc/passwd", "_etc_passwd"},
                                                                    {std::string("a\0b", 3), "a_b"},
                                                                    {std::string("\0", 1), "_"},
                                                                    {"~", "~"},
                                                                    {"a\nb", "a\nb"}};
    for (const auto& [application, part] : expected)
        EXPECT_EQ(nameFor(application), "20260101-000000+0000-kesto-" + part + "-longformaudio.json");
}

TEST_F(SummaryFile, IsCalledByAsMuchOfALongNameAsFileSystemsTake)
{
    constexpr std::size_t longestName = 255;
    const std::string around = nameFor("");
    const std::size_t room = longestName - around.size();
    const std::string fits(room, 'x');
    EXPECT_THAT(nameFor(fits), EndsWith("-kesto-" + fits + "-longformaudio.json"));
    EXPECT_EQ(nameFor(fits + "y"), nameFor(fits));
    EXPECT_EQ(nameFor(std::string(10'000, 'x')), nameFor(fits));
    session->setServiceType(11);
    EXPECT_EQ(nameFor(std::string(10'000, 'x')).size(), longestName) << "a shorter service name leaves more room";
}

TEST_F(SummaryFile, CutsALongNameBetweenCharacters)
{
    const std::size_t room = 255 - nameFor("").size();
    for (const std::string character : {"é", "€", "😀"})
        for (std::size_t before = 0; before <= character.size(); ++before) {
            std::string name(before, 'x');
            std::string expected = name;
            while (name.size() < 10'000)
                name += character;
            while (expected.size() + character.size() <= room)
                expected += character;
            EXPECT_THAT(nameFor(name), EndsWith("-kesto-" + expected + "-longformaudio.json"));
        }
}

// --- the number of files

TEST_F(SummaryFile, IsOneOfAsManyAsAreKept)
{
    record({{"a", 1}});
    const std::size_t size = write().second.size();
    ASSERT_THAT(platform.fileSystem.keptWithin, SizeIs(1));
    const auto& [folder, kept, bytes] = platform.fileSystem.keptWithin.front();
    EXPECT_EQ(folder, "/diagnostics/Audio/Reporting");
    EXPECT_EQ(kept.most, KestoReportingSession::mostSummaryFiles);
    EXPECT_EQ(kept.mostBytes, KestoReportingSession::mostSummaryBytes);
    EXPECT_EQ(bytes, size);
    for (const std::string_view other :
         {"", ".json", "notes.json", "20260101-000000+0000-kesto-", "20260101-000000+0000-kesto-a-generic.json.old",
          "20260101-000000+0000-other-a-generic.json", "2026-01-01-kesto-a-generic.json",
          "x20260101-000000+0000-kesto-a-generic.json", "20260101-000000 0000-kesto-a-generic.json",
          "tracing_results.qdj"})
        EXPECT_FALSE(kept.isOne(other)) << other;
}

TEST_F(SummaryFile, CountsForNothingWhenItIsEmpty)
{
    record({{"before", std::string(200'000, 'x')}});
    record({{"a", std::numeric_limits<double>::quiet_NaN()}});
    EXPECT_EQ(write().second, "");
    ASSERT_THAT(platform.fileSystem.keptWithin, SizeIs(1));
    EXPECT_EQ(platform.fileSystem.keptWithin.front().bytes, 0U);
}

TEST_F(SummaryFile, IsNotCountedWhenItWasNotWritten)
{
    platform.fileSystem.writeError = std::make_error_code(std::errc::no_space_on_device);
    record({{"a", 1}});
    write();
    EXPECT_THAT(platform.fileSystem.keptWithin, IsEmpty());
}

// --- its content

TEST_F(SummaryFile, HoldsTheMessagesOneMemberALine)
{
    record({{"a", 1}, {"list", foundation::Array{true, foundation::Array{}}}, {"inner", Dictionary{{"b", "x"}}}});
    session->sendMessage(platform.turn.tally, Dictionary{}, 14, 11, nullptr);
    EXPECT_EQ(write().second, R"([
    {
        "Playback_Error_1": {
            "a": 1,
            "list": [
                true,
                []
            ],
            "inner": {
                "b": "x"
            },
            "audiotag": "PlaybackError"
        }
    },
    {
        "Volume_Summary_1": {
            "audiotag": "VolumeSummary"
        }
    }
])");
}

TEST_F(SummaryFile, WritesFloatsOf32BitsAsTheirShortDecimals)
{
    record({{"play_seconds", 0.6F}});
    record({{"play_seconds", 70.1F}});
    const std::string text = write().second;
    EXPECT_THAT(text, testing::HasSubstr("\"play_seconds\": 0.6,\n"));
    EXPECT_THAT(text, testing::HasSubstr("\"play_seconds\": 70.1,\n"));
}

TEST_F(SummaryFile, HoldsALargeMessageThatIsNotEncoded)
{
    record(
        {{"text", std::string(std::size_t{2} << 20, 'x')}, {"inner", Dictionary{{"b", foundation::Array{1, true}}}}});
    record({{"a", 1}});
    const Value content = parse(write().second);
    EXPECT_EQ(content.text(),
              Value(foundation::Array(std::vector<Value>(
                        {(*session->nestedAggregatedPayloadData())[0], (*session->nestedAggregatedPayloadData())[1]})))
                  .text());
}

bool isFinite(const Value& value)
{
    if (const auto number = value.number())
        return std::isfinite(number->doubleValue());
    if (const auto array = value.array())
        return std::ranges::all_of(*array, isFinite);
    const auto dictionary = value.dictionary().value_or(Dictionary());
    return std::ranges::all_of(dictionary, [](const auto& entry) { return isFinite(entry.value); });
}

RC_GTEST_PROP(SummaryFileOfAnyStore, SaysToAnotherReaderWhatTheStoreHolds, ())
{
    support::TestPlatform platform;
    platform.deviceProperties.setInternalBuild(true);
    for (const Messages& payloads : *generated::manyPayloads(10)) {
        const auto session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{});
        session->start();
        for (const Dictionary& payload : payloads)
            session->sendMessage(platform.turn.tally, payload, playback, AudioEventTypeError, nullptr);
        platform.fileSystem.files.clear();
        session->writeSummaryJson();
        const Messages messages = *session->nestedAggregatedPayloadData();
        RC_ASSERT(platform.fileSystem.files.size() == (messages.empty() ? 0U : 1U));
        if (messages.empty())
            continue;
        const std::string& text = platform.fileSystem.files.begin()->second;
        if (std::ranges::all_of(messages, [](const Dictionary& message) { return isFinite(message); }))
            RC_ASSERT(parse(text).text() == Value(foundation::Array({messages.begin(), messages.end()})).text());
        else
            RC_ASSERT(text.empty());
    }
}

// --- failures

constexpr std::string_view path =
    "/diagnostics/Audio/Reporting/20260101-000000+0000-kesto-org.player-longformaudio.json";

TEST_F(SummaryFile, IsEmptyWhenAValueCannotBeSaidInJson)
{
    for (const Value& impossible :
         {Value(std::numeric_limits<double>::quiet_NaN()), Value(std::numeric_limits<float>::infinity()),
          Value(foundation::Array{Dictionary{{"a", -std::numeric_limits<double>::infinity()}}})}) {
        session = std::make_shared<KestoReportingSession>(42, std::vector<std::int32_t>{7});
        session->setServiceType(7);
        session->setConfiguration(Dictionary{{"HostApplicationDisplayID", "org.player"}});
        session->start();
        record({{"before", std::string(200'000, 'x')}}); // more than one piece
        record({{"a", 1}, {"impossible", impossible}, {"after", true}, {"c", foundation::Array{1}}});
        record({{"after", Dictionary{{"a", true}}}});
        platform.fileSystem.files.clear();
        EXPECT_EQ(write().second, "");
        EXPECT_THAT(platform.fileSystem.files, SizeIs(1)) << "but there is a file";
        EXPECT_THAT(platform.log.lines(),
                    ElementsAre(IsLine(Error, "kerr", "dataWithJSONObject: a number is not finite"),
                                IsLine(Info, "kerr", "jsonOutput writeToURL: " + std::string(path))));
    }
}

TEST_F(SummaryFile, IsWrittenAlthoughItsDirectoryCouldNotBeMadeAndThatIsSaidTwice)
{
    platform.fileSystem.directories = {{"/diagnostics/Audio/Reporting", 0777}}; // the folder nevertheless exists
    platform.fileSystem.directoryError = std::make_error_code(std::errc::permission_denied);
    record({{"a", 1}});
    EXPECT_THAT(write().second, StartsWith("["));
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Error, "kerr",
                                   "can't create logging directory at /diagnostics/Audio/Reporting: Permission denied"),
                            IsLine(Error, "kerr", "jsonOutput writeToURL: Permission denied")));
}

TEST_F(SummaryFile, SaysWhatJsonCannotBeforeItSaysThatItsDirectoryCouldNotBeMade)
{
    platform.fileSystem.directoryError = std::make_error_code(std::errc::permission_denied);
    record({{"a", std::numeric_limits<double>::quiet_NaN()}});
    EXPECT_EQ(write().second, "");
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Error, "kerr", "dataWithJSONObject: a number is not finite"),
                            IsLine(Error, "kerr",
                                   "can't create logging directory at /diagnostics/Audio/Reporting: Permission denied"),
                            IsLine(Error, "kerr", "jsonOutput writeToURL: No such file or directory")));
}

TEST_F(SummaryFile, IsMissedWithOneLineWhenItCannotBeWritten)
{
    platform.fileSystem.writeError = std::make_error_code(std::errc::no_space_on_device);
    record({{"a", 1}});
    write();
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Error, "kerr", "jsonOutput writeToURL: No space left on device")));
}

TEST_F(SummaryFile, IsMissedWithOneLineWhenItCannotBeBegun)
{
    platform.fileSystem.createError = std::make_error_code(std::errc::read_only_file_system);
    record({{"a", std::numeric_limits<double>::quiet_NaN()}});
    write();
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Error, "kerr", "dataWithJSONObject: a number is not finite"),
                            IsLine(Error, "kerr", "jsonOutput writeToURL: Read-only file system")));
}

TEST_F(SummaryFile, NamesTheLastOfTwoErrors)
{
    platform.fileSystem.directoryError = std::make_error_code(std::errc::permission_denied);
    record({{"a", 1}});
    write();
    EXPECT_THAT(platform.fileSystem.files, IsEmpty());
    EXPECT_THAT(platform.log.lines(),
                ElementsAre(IsLine(Error, "kerr",
                                   "can't create logging directory at /diagnostics/Audio/Reporting: Permission denied"),
                            IsLine(Error, "kerr", "jsonOutput writeToURL: No such file or directory")));
}

TEST_F(SummaryFile, DoesNotKeepASessionFromStopping)
{
    platform.fileSystem.directoryError = std::make_error_code(std::errc::permission_denied);
    record({{"a", std::numeric_limits<double>::quiet_NaN()}});
    platform.log.clear();
    session->stop(platform.turn);
    EXPECT_FALSE(session->started());
    EXPECT_THAT(platform.log.lines("kerr"), Contains(IsLine(Default, "kerr", "sending summary event for reporter 42")));
}

} // namespace
