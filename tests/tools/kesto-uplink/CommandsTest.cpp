// SPDX-License-Identifier: Apache-2.0
// The program as it is shipped: preview, status, forget, and the way to it through kesto.
#include "kesto-uplink/outbox/Outbox.h"
#include "kesto-uplink/state/State.h"
#include "sdk/Process.h"
#include "support/ParseJson.h"
#include "support/TemporaryDirectory.h"
#include "tools/kesto-uplink/MadeEventStore.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <regex>
#include <sstream>

namespace kesto_uplink_test {
namespace {

using kesto_uplink::Cursor;
using kesto_uplink::Identity;
using kesto_uplink::State;
using sdk_test::Finished;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

constexpr const char* epoch = "0123456789abcdef0123456789abcdef";
constexpr const char* start = "com.quarn.kesto.Playback.Start";
constexpr const char* rules = "enabled = true\nservers = [\"tls://reports.example:4222\"]\n"
                              "[events.\"com.quarn.kesto.*\"]\nkey = \"keep\"\n";

class UplinkCommands : public testing::Test {
protected:
    UplinkCommands() { std::filesystem::create_directory(state); }

    [[nodiscard]] Finished run(std::vector<std::string> words) const
    {
        words.insert(words.begin(), KESTO_UPLINK_PATH);
        for (const auto& word : {std::string("--configuration"), configuration.native(), std::string("--database"),
                                 database.native(), std::string("--state"), state.native()})
            words.push_back(word);
        return sdk_test::run(words, {}, {"TZ=UTC", "LC_ALL=C.UTF-8"});
    }
    [[nodiscard]] foundation::Dictionary status() const
    {
        return support::parseJson(run({"status", "--json"}).output).value().dictionary().value();
    }
    void configure(std::string_view text) const { support::writeFile(configuration, std::string(text)); }

    // Without what differs from run to run: the clock, and a pseudonym that is made up.
    static std::string steady(const std::string& lines)
    {
        const std::string without = std::regex_replace(lines, std::regex("\"sent\":[0-9.]+"), "\"sent\":0");
        return std::regex_replace(without, std::regex("\"device\":\"[0-9a-f]{32}\""), "\"device\":\"D\"");
    }

    const support::TemporaryDirectory directory;
    const std::filesystem::path configuration = directory / "uplink.toml";
    const std::filesystem::path database = directory / "analytics.sqlite3";
    const std::filesystem::path state = directory / "state";
};

TEST_F(UplinkCommands, FailWhenTheirOutputIsLost)
{
    configure(rules);
    const MadeEventStore store(database);
    const Finished status = sdk_test::run({"/bin/sh", "-c", R"(exec "$0" "$@" <&- >&-)", KESTO_UPLINK_PATH, "status",
                                           "--configuration", configuration, "--database", database, "--state", state},
                                          {}, {"TZ=UTC", "LC_ALL=C.UTF-8"});
    EXPECT_EQ(status.status, 1);
    EXPECT_EQ(status.errors, "kesto-uplink: the output could not be written\n");
}

TEST_F(UplinkCommands, PreviewPrintsTheLinesThatWouldLeave)
{
    configure(rules);
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":1,"secret":2})");
    store.addEvent("com.quarn.music.Playback.Start");
    store.addEvent(start, "no json");
    const Finished preview = run({"preview"});
    EXPECT_EQ(preview.status, 0);
    EXPECT_EQ(steady(preview.output),
              R"({"device":"D","epoch":"0123456789abcdef0123456789abcdef","kind":"device","sent":0,"first":1,"last":3})"
              "\n"
              R"({"device":"D","epoch":"0123456789abcdef0123456789abcdef","kind":"event","id":1,"time":1000,)"
              R"("name":"com.quarn.kesto.Playback.Start","happened":999.5,"payload":{"key":1}})"
              "\n");
    EXPECT_EQ(std::regex_replace(preview.errors, std::regex("compressed: [0-9]+ B"), "compressed: N B"),
              state.native()
                  + " has no state yet: the pseudonym here is made up, and no other preview has it.\n"
                    "1 row would leave (batches: 1; compressed: N B).\n"
                    "These stay, because no rule allows them:\n"
                    "        1  com.quarn.music.Playback.Start\n"
                    "These cannot leave, because their payload is no JSON object or has a number that JSON has not, "
                    "or their name is longer than 16384 bytes:\n"
                    "        1  com.quarn.kesto.Playback.Start\n");
    EXPECT_THAT(std::filesystem::is_empty(state), true);
}

TEST_F(UplinkCommands, PreviewPrintsWhatIsSent)
{
    configure(rules);
    MadeEventStore store(database);
    for (int count = 0; count < 5000; ++count)
        store.addEvent(start, R"({"key":)" + std::to_string(count) + "}");
    Identity identity;
    {
        State remembered = State::open(state, 1000);
        identity = remembered.identity();
        EXPECT_TRUE(remembered.noteQueued(identity, {.last = {epoch, 100}, .rows = 100}, 1));
    }
    kesto_uplink::Outbox outbox(database, kesto_uplink::readUplinkConfiguration(configuration).configuration, identity);
    std::string sent;
    Cursor after{epoch, 100};
    while (const auto batch = outbox.next(after, {}, 0)) {
        sent += batch->lines;
        after = batch->last;
    }
    const Finished preview = run({"preview"});
    EXPECT_EQ(std::regex_replace(preview.output, std::regex("\"sent\":[0-9.]+"), "\"sent\":0"), sent);
    EXPECT_THAT(preview.errors, HasSubstr("4900 rows would leave (batches: 3; compressed: "));
}

TEST_F(UplinkCommands, PreviewSaysThatTheNextRoundRenewsThePseudonym)
{
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":1})");
    static_cast<void>(State::open(state, 1'700'000'000));
    constexpr const char* sentence = "The pseudonym or the key of hashes is older than the configuration allows: the "
                                     "next round renews it, and these lines leave with the new one.\n";
    for (const char* key : {"pseudonym_days", "hash_key_days"}) {
        configure(std::string("pseudonym_days = 36500\nhash_key_days = 36500\n") + rules);
        EXPECT_THAT(run({"preview"}).errors, Not(HasSubstr(sentence)));
        EXPECT_THAT(run({"preview", "--json"}).errors, HasSubstr("\"renewal_is_due\":false"));
        const std::string other = key == std::string("hash_key_days") ? "pseudonym_days" : "hash_key_days";
        configure(std::string(key) + " = 1\n" + other + " = 36500\n" + rules);
        EXPECT_THAT(run({"preview"}).errors, HasSubstr(sentence));
        EXPECT_THAT(run({"preview", "--json"}).errors, HasSubstr("\"renewal_is_due\":true"));
        EXPECT_THAT(run({"preview", "--json"}).errors, HasSubstr("\"pseudonym_is_made_up\":false"));
    }
}

TEST_F(UplinkCommands, PreviewGoesBackToATime)
{
    configure(rules);
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":"early"})", {}, 1'700'000'000);
    store.addEvent(start, R"({"key":"late"})", {}, 1'700'000'100);
    {
        State remembered = State::open(state, 1000);
        EXPECT_TRUE(remembered.noteQueued(remembered.identity(), {.last = {epoch, 2}, .rows = 2}, 1));
    }
    EXPECT_EQ(run({"preview"}).output, "");
    const std::string lines = run({"preview", "--since", "2023-11-14T22:14:00Z"}).output;
    EXPECT_THAT(lines, HasSubstr("late"));
    EXPECT_THAT(lines, Not(HasSubstr("early")));
    EXPECT_EQ(run({"preview", "--since", "yesterday"}).status, 2);
}

TEST_F(UplinkCommands, PreviewWorksWhileTheUplinkIsOff)
{
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":1})");
    configure("[events.\"com.quarn.kesto.*\"]\nkey = \"keep\"\n");
    const Finished preview = run({"preview"});
    EXPECT_THAT(preview.output, HasSubstr(R"("payload":{"key":1})"));
    EXPECT_THAT(preview.errors,
                StartsWith("The uplink is off: " + configuration.native()
                           + " does not say enabled = true. This would leave if it was on.\n"));
    std::filesystem::remove(configuration);
    EXPECT_EQ(run({"preview"}).output, "");
    EXPECT_EQ(run({"preview"}).status, 0);
}

TEST_F(UplinkCommands, PreviewExplainsItselfToPrograms)
{
    configure(std::string(rules) + "kye = \"keep\"\n");
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":1})");
    store.addEvent("a");
    store.addEvent("a");
    const auto explained = support::parseJson(run({"preview", "--json"}).errors).value().dictionary().value();
    EXPECT_EQ(explained.find("rows")->text(), "1");
    EXPECT_EQ(explained.find("not_allowed")->text(), R"({"a":2})");
    EXPECT_EQ(explained.find("lost_to_age")->text(), "0");
    EXPECT_EQ(
        explained.find("suspects")->text(),
        R"([")" + configuration.native()
            + R"(:5: no event that matches \"com.quarn.kesto.*\" had the key \"kye\" among the newest in the event )"
              R"(store: correct the line, or remove it"])");
}

TEST_F(UplinkCommands, NothingIsPreviewedOfAWrongConfiguration)
{
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":1})");
    configure(std::string(rules) + "other = \"kep\"\n");
    const Finished preview = run({"preview"});
    EXPECT_EQ(preview.status, 1);
    EXPECT_EQ(preview.output, "");
    EXPECT_EQ(preview.errors,
              configuration.native()
                  + ":5: other = kep is no rule: a rule is \"keep\", \"drop\", \"hash\" or a bucket such as "
                    "{ bucket = [1, 10, 60] }\n"
                    "kesto-uplink: nothing leaves until this is corrected\n");
    const Finished finished = run({"status"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.output,
                StartsWith("uplink       off: nothing leaves until " + configuration.native() + " is corrected\n"));
    EXPECT_THAT(finished.output, HasSubstr(":5: other = kep is no rule"));
}

TEST_F(UplinkCommands, NeedsAnEventStore)
{
    configure(rules);
    const Finished preview = run({"preview"});
    EXPECT_EQ(preview.status, 1);
    EXPECT_EQ(preview.errors,
              "kesto-uplink: the event store " + database.native()
                  + " does not exist: has kestod run? Name another with --database\n");
    EXPECT_THAT(run({"status"}).output, HasSubstr("does not exist: has kestod run?"));
}

TEST_F(UplinkCommands, StatusSaysWhatWasSentAndWhatWaits)
{
    configure(rules);
    MadeEventStore store(database);
    for (int count = 0; count < 20; ++count)
        store.addEvent(start, R"({"key":1})", {}, 1'700'000'000 + count);
    {
        State remembered = State::open(state, 1'700'000'000);
        remembered.noteOn(1'700'000'050);
        const Identity as = remembered.identity();
        EXPECT_TRUE(remembered.noteQueued(
            as, {.last = {epoch, 12}, .rows = 9, .bytes = 700, .notAllowed = 3, .lostToAge = 2}, 1));
        EXPECT_TRUE(remembered.noteStored(as, {epoch, 5}));
        remembered.noteRetry(100, 1);
        remembered.noteAnswer({"the stream is full", 1'700'000'060});
    }
    const std::string text = run({"status"}).output;
    EXPECT_THAT(text, StartsWith("uplink       on since 2023-11-14 22:14:10\npseudonym    "));
    EXPECT_THAT(text,
                HasSubstr(" since 2023-11-14 22:13:20\n"
                          "sent         9 rows, 700 B (0 B today); batches: 1, retries: 1\n"
                          "stored       up to ID 5; sent up to ID 12\n"
                          "left out     3 rows may not leave; lost to age: 2\n"
                          "waiting      8 rows, "));
    EXPECT_THAT(text,
                HasSubstr("; the oldest since 2023-11-14 22:13:32\n"
                          "last answer  2023-11-14 22:14:20: the stream is full\n"));
    const auto json = status();
    EXPECT_EQ(json.find("on")->text(), "1");
    EXPECT_EQ(json.find("on_since")->text(), "1700000050");
    EXPECT_EQ(json.find("sent")->text(), R"({"rows":9,"batches":1,"bytes":700,"bytes_today":0,"retries":1})");
    EXPECT_EQ(json.find("left_out")->text(), R"({"not_allowed":3,"lost_to_age":2})");
    EXPECT_EQ(json.find("queued")->text(), R"({"epoch":"0123456789abcdef0123456789abcdef","id":12})");
    EXPECT_EQ(json.find("stored")->text(), R"({"epoch":"0123456789abcdef0123456789abcdef","id":5})");
    EXPECT_EQ(json.find("last_answer")->text(), R"({"text":"the stream is full","time":1700000060})");
    EXPECT_EQ(json.find("waiting")->dictionary()->find("rows")->text(), "8");
    EXPECT_EQ(json.find("waiting")->dictionary()->find("oldest")->text(), "1700000012");
    EXPECT_EQ(json.find("problems")->text(), "[]");
}

TEST_F(UplinkCommands, StatusSaysThatTheUplinkIsOff)
{
    MadeEventStore store(database);
    EXPECT_THAT(run({"status"}).output,
                StartsWith("uplink       off: " + configuration.native() + " does not say enabled = true\n"));
    EXPECT_EQ(status().find("on")->text(), "0");
    configure(rules);
    EXPECT_THAT(run({"status"}).output, StartsWith("uplink       on, but kesto-uplink run has not run since\n"));
    EXPECT_FALSE(std::filesystem::exists(state / State::fileName));
}

TEST_F(UplinkCommands, StatusNamesADamagedState)
{
    MadeEventStore store(database);
    support::writeFile(state / State::fileName, "a text of a person");
    const Finished finished = run({"status"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.output, HasSubstr("it is damaged: move it away"));
    EXPECT_EQ(run({"forget"}).status, 1);
    EXPECT_THAT(run({"preview"}).errors, HasSubstr("it is damaged: move it away"));
}

TEST_F(UplinkCommands, ForgetMakesANewPseudonymAndDropsWhatWaits)
{
    configure(rules);
    MadeEventStore store(database);
    store.addEvent(start, R"({"key":1})");
    store.addEvent(start, R"({"key":2})");
    const std::string before = State::open(state, 1000).identity().pseudonym;
    const Finished forgotten = run({"forget"});
    EXPECT_EQ(forgotten.status, 0);
    const std::string after = State::open(state, 1000).identity().pseudonym;
    EXPECT_NE(before, after);
    EXPECT_THAT(forgotten.output, StartsWith("The device has a new pseudonym, " + after + ".\n"));
    EXPECT_EQ(run({"preview"}).output, "");
    store.addEvent(start, R"({"key":3})");
    const std::string lines = run({"preview"}).output;
    EXPECT_THAT(lines, HasSubstr(R"("id":3)"));
    EXPECT_THAT(lines, HasSubstr(after));
}

TEST_F(UplinkCommands, ForgetChangesNothingIfItCannotForgetAll)
{
    support::writeFile(database, "a text of a person, which is no database");
    const std::string before = State::open(state, 1000).identity().pseudonym;
    EXPECT_EQ(run({"forget"}).status, 1);
    EXPECT_EQ(State::open(state, 1000).identity().pseudonym, before);
}

// The store that comes later may have rows that should not leave.
TEST_F(UplinkCommands, ForgetNeedsAnEventStore)
{
    const std::string before = State::open(state, 1000).identity().pseudonym;
    const Finished forgotten = run({"forget"});
    EXPECT_EQ(forgotten.status, 1);
    EXPECT_EQ(forgotten.output, "");
    EXPECT_EQ(forgotten.errors,
              "kesto-uplink: the event store " + database.native()
                  + " does not exist: has kestod run? Name another with --database\n");
    EXPECT_EQ(State::open(state, 1000).identity().pseudonym, before);
}

TEST_F(UplinkCommands, SayHowTheyAreCalled)
{
    EXPECT_EQ(sdk_test::run({KESTO_UPLINK_PATH}).status, 2);
    EXPECT_EQ(sdk_test::run({KESTO_UPLINK_PATH, "send"}).status, 2);
    EXPECT_THAT(sdk_test::run({KESTO_UPLINK_PATH, "--help"}).output, HasSubstr("preview"));
    EXPECT_THAT(sdk_test::run({KESTO_UPLINK_PATH, "--version"}).output, StartsWith("kesto-uplink "));
}

// --- Through kesto

class KestoUplink : public testing::Test {
protected:
    [[nodiscard]] static Finished shell(const std::string& script)
    {
        return sdk_test::run({"/bin/bash", "-c", script}, {}, {"LD_LIBRARY_PATH=" LIBKESTO_DIRECTORY});
    }
    const support::TemporaryDirectory directory;
};

TEST_F(KestoUplink, StartsTheProgramBesideIt)
{
    EXPECT_EQ(shell("cp " KESTO_PATH " " KESTO_UPLINK_PATH " " + directory.path().native()).status, 0);
    const std::string kesto = directory / "kesto";
    EXPECT_THAT(shell("PATH= " + kesto + " uplink --version").output, StartsWith("kesto-uplink "));
    EXPECT_THAT(shell("PATH= " + kesto + " uplink preview --help").output, HasSubstr("--since"));
    EXPECT_EQ(shell("PATH= " + kesto + " uplink preview --sinc").status, 2);
}

TEST_F(KestoUplink, FindsTheProgramInThePath)
{
    EXPECT_EQ(shell("cp " KESTO_PATH " " + directory.path().native()).status, 0);
    const std::string program = KESTO_UPLINK_PATH;
    EXPECT_THAT(shell("PATH=" + program.substr(0, program.rfind('/')) + " " + (directory / "kesto").native()
                      + " uplink --version")
                    .output,
                StartsWith("kesto-uplink "));
}

TEST_F(KestoUplink, SaysThatTheProgramIsNotInstalled)
{
    EXPECT_EQ(shell("cp " KESTO_PATH " " + directory.path().native()).status, 0);
    const Finished finished = shell("PATH=/nowhere " + (directory / "kesto").native() + " uplink status");
    EXPECT_EQ(finished.status, 1);
    EXPECT_EQ(finished.errors,
              "kesto: kesto uplink needs kesto-uplink, which is not installed: install that package\n");
}

std::vector<std::string> completions(const std::string& words)
{
    const Finished finished = sdk_test::run(
        {"bash", "-c",
         "source " KESTO_COMPLETION "; source " KESTO_UPLINK_COMPLETION "; COMP_WORDS=(" + words
             + R"(); COMP_CWORD=$((${#COMP_WORDS[@]} - 1)); "_${COMP_WORDS[0]//-/_}"; printf "%s\n" "${COMPREPLY[@]}")"});
    EXPECT_EQ(finished.errors, "");
    std::istringstream lines(finished.output);
    std::vector<std::string> all;
    for (std::string line; std::getline(lines, line);)
        if (!line.empty())
            all.push_back(line);
    return all;
}

TEST_F(KestoUplink, CompletesEveryOption)
{
    for (const std::string verb : {"forget", "preview", "status"}) {
        std::istringstream help(sdk_test::run({KESTO_UPLINK_PATH, verb, "--help"}).output);
        for (std::string word; help >> word;)
            if (word.starts_with("--")) {
                EXPECT_THAT(completions("kesto-uplink " + verb + " --"), testing::Contains(word)) << verb;
                EXPECT_THAT(completions("kesto uplink " + verb + " --"), testing::Contains(word)) << verb;
            }
    }
    EXPECT_THAT(completions("kesto upl"), ElementsAre("uplink"));
    EXPECT_THAT(completions("kesto uplink st"), ElementsAre("status"));
    EXPECT_THAT(completions("kesto-uplink send --"), IsEmpty());
}

} // namespace
} // namespace kesto_uplink_test
