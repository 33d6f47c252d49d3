// SPDX-License-Identifier: Apache-2.0
// `kesto prefs`: the service reads the written values, up to the session that gets them.
#include "end_to_end/Kestod.h"
#include "end_to_end/WireClient.h"
#include "platform/linux/settings/TomlFile.h"
#include "tools/kesto/Tool.h"

#include <csignal>
#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>

namespace kesto_tool {
namespace {

namespace fs = std::filesystem;
using foundation::Value;
using testing::HasSubstr;

const std::string domain = "com.quarn.kesto";

class PrefsCommand : public testing::Test {
protected:
    void write(const std::string& text) const
    {
        fs::create_directories(file.parent_path());
        support::writeFile(file, text);
    }
    // The value that the service now reads.
    [[nodiscard]] foundation::Dictionary values() const
    {
        return platform::parseToml(support::readFile(file)).value_or(foundation::Dictionary());
    }
    void expectFailure(const Tool::Arguments& arguments, const std::string& reason) const
    {
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 1);
        EXPECT_EQ(finished.output, "");
        EXPECT_EQ(finished.errors, "kesto: " + reason + "\n");
    }

    const support::TemporaryDirectory directory;
    const fs::path file = directory.path() / "configuration/preferences" / (domain + ".toml");
    Tool tool{directory.path()};
};

// --- set

TEST_F(PrefsCommand, SetsValuesOfTheKindThatTheyLookLike)
{
    const std::vector<std::pair<std::string, Value>> expected{
        {"true", true},
        {"false", false},
        {"5", 5},
        {"-5", -5},
        {"1_000", 1000},
        {"0.5", 0.5},
        {"-1e3", -1000.0},
        {"Kitchen radio", "Kitchen radio"},
        {"\"5\"", "5"},
        {"'a\"b'", "a\"b"},
        {"", ""},
        {" ", " "},
        {"yes", "yes"},
        {"1 radio", "1 radio"},
        {"007", "007"},
        {"5 # 6", "5 # 6"},
        {"set", "set"},
        {"events", "events"},
        {"a\nb = 1\n", "a\nb = 1\n"},
        {"1\nb = 2", "1\nb = 2"},
        {"it's \"so\" \\ #1", "it's \"so\" \\ #1"},
        {"Küche ☕ 日本", "Küche ☕ 日本"},
        {"\x1B[31m\x7F\xC2\x9B", "\x1B[31m\x7F\xC2\x9B"},
        {"[1, \"two\", [3.0]]", foundation::Array{1, "two", foundation::Array{3.0}}},
        {"{on = true}", foundation::Dictionary{{"on", true}}},
        {"1970-01-02", foundation::Date{86400}},
    };
    for (const auto& [text, value] : expected) {
        EXPECT_EQ(tool.print({"prefs", "set", domain, "key", text}), "");
        EXPECT_EQ(values(), (foundation::Dictionary{{"key", value}})) << text << '\n' << support::readFile(file);
    }
    const Value kept = *values().find("key");
    EXPECT_EQ(kept.kind(), Value::Kind::Date);
}

TEST_F(PrefsCommand, SetsAnyTextAsTextWhenAsked)
{
    for (const std::string text : {"true", "5", "\"quoted\"", "[1", "99999999999999999999", "inf"}) {
        EXPECT_EQ(tool.print({"prefs", "set", "--string", domain, "key", text}), "");
        EXPECT_EQ(values(), (foundation::Dictionary{{"key", text}})) << text;
    }
    EXPECT_EQ(tool.print({"prefs", "set", domain, "key", "--", "--string"}), "");
    EXPECT_EQ(values(), (foundation::Dictionary{{"key", "--string"}}));
}

TEST_F(PrefsCommand, RefusesWhatWasMeantAsAnotherKindButIsMalformed)
{
    expectFailure({"prefs", "set", domain, "key", "[1, 2"},
                  "[1, 2 begins like a TOML value but is not valid: correct it, or use --string");
    expectFailure({"prefs", "set", domain, "key", "99999999999999999999"},
                  "99999999999999999999 does not fit in 64 bits: use --string to keep it as text");
    EXPECT_FALSE(fs::exists(file));
}

TEST_F(PrefsCommand, RefusesTextThatIsNotUtf8)
{
    write("a = 1\n");
    for (const Tool::Arguments& arguments : {Tool::Arguments{"prefs", "set", domain, "key", "\xFF"},
                                             Tool::Arguments{"prefs", "set", domain, "\xFF", "5"}}) {
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 1);
        EXPECT_THAT(finished.errors, HasSubstr("cannot be written to " + file.native()));
    }
    EXPECT_EQ(support::readFile(file), "a = 1\n");
}

TEST_F(PrefsCommand, KeepsCommentsOrderAndOtherKeys)
{
    write("# of the kitchen\ndevice_name = \"Radio\" # for now\n\nother = [\n  1, # one\n]\n[table]\nkey = 1\n");
    EXPECT_EQ(tool.print({"prefs", "set", domain, "device_name", "Kitchen radio"}), "");
    EXPECT_EQ(tool.print({"prefs", "set", domain, "new.key", "true"}), "");
    EXPECT_EQ(support::readFile(file),
              "# of the kitchen\ndevice_name = \"Kitchen radio\" # for now\n\nother = [\n  1, # one\n]\n"
              "\"new.key\" = true\n[table]\nkey = 1\n");
}

TEST_F(PrefsCommand, KeepsTheFilesPermissionsAndLeavesNothingBehind)
{
    write("a = 1\n");
    fs::permissions(file, fs::perms(0640));
    EXPECT_EQ(tool.print({"prefs", "set", domain, "a", "2"}), "");
    EXPECT_EQ(fs::status(file).permissions(), fs::perms(0640));
    EXPECT_EQ(std::distance(fs::directory_iterator(file.parent_path()), fs::directory_iterator()), 1);
}

TEST_F(PrefsCommand, MakesWhatIsMissingForTheServiceToRead)
{
    tool.setVariable("CONFIGURATION_DIRECTORY=" + (directory.path() / "etc").native());
    ::umask(0077);
    EXPECT_EQ(tool.print({"prefs", "set", domain, "a", "2"}), "");
    ::umask(0022);
    const fs::path made = directory.path() / "etc/preferences/com.quarn.kesto.toml";
    EXPECT_EQ(support::readFile(made), "a = 2\n");
    EXPECT_EQ(fs::status(made).permissions(), fs::perms(0644));
    EXPECT_EQ(fs::status(made.parent_path()).permissions(), fs::perms(0755));
    EXPECT_EQ(fs::status(made.parent_path().parent_path()).permissions(), fs::perms(0755));
}

TEST_F(PrefsCommand, DoesNotTouchAFileThatSaysSoAlready)
{
    write("a = 1\n");
    struct stat before{};
    struct stat after{};
    ::stat(file.c_str(), &before);
    EXPECT_EQ(tool.print({"prefs", "set", domain, "a", "1"}), "");
    ::stat(file.c_str(), &after);
    EXPECT_EQ(before.st_ino, after.st_ino);
}

TEST_F(PrefsCommand, LosesNoKeyWhenManySetAtOnce)
{
    std::vector<std::unique_ptr<Process>> runs;
    for (int number = 0; number < 20; ++number)
        runs.push_back(tool.start({"prefs", "set", domain, "key" + std::to_string(number), std::to_string(number)}));
    for (const auto& run : runs)
        EXPECT_EQ(run->wait(), 0) << run->errors();
    EXPECT_EQ(values().size(), runs.size());
}

TEST_F(PrefsCommand, ReplacesALinkAndNotWhatItLeadsTo)
{
    write("");
    const fs::path elsewhere = directory.path() / "elsewhere.toml";
    support::writeFile(elsewhere, "a = 1\n");
    fs::remove(file);
    fs::create_symlink(elsewhere, file);
    EXPECT_EQ(tool.print({"prefs", "set", domain, "a", "2"}), "");
    EXPECT_EQ(support::readFile(elsewhere), "a = 1\n");
    EXPECT_EQ(support::readFile(file), "a = 2\n");
    EXPECT_FALSE(fs::is_symlink(file));
}

// --- get, list, unset

TEST_F(PrefsCommand, GetsValuesAsAScriptWantsThem)
{
    write("text = \"a \\\"b\\\"\\nc\"\non = true\nnumber = 0.5\nlist = [1, \"x\"]\nday = 1970-01-01\n"
          "[table]\nkey = false\n");
    EXPECT_EQ(tool.print({"prefs", "get", domain, "text"}), "a \"b\"\nc\n");
    EXPECT_EQ(tool.print({"prefs", "get", domain, "on"}), "true\n");
    EXPECT_EQ(tool.print({"prefs", "get", domain, "number"}), "0.5\n");
    EXPECT_EQ(tool.print({"prefs", "get", domain, "list"}), "[1,\"x\"]\n");
    EXPECT_EQ(tool.print({"prefs", "get", domain, "table"}), "{\"key\":false}\n");
    EXPECT_EQ(tool.print({"prefs", "get", domain, "day"}), "1970-01-01T00:00:00Z\n");
    EXPECT_EQ(tool.print({"prefs", "get", "--json", domain, "text"}), "\"a \\\"b\\\"\\nc\"\n");
}

TEST_F(PrefsCommand, ListsKeysSortedWithTheirKinds)
{
    write("b = \"5\"\na = true\nc = \"\\u001B[31m \\u009B\"\n");
    EXPECT_EQ(tool.print({"prefs", "list", domain}), "a = true\nb = \"5\"\nc = \"\\u001B[31m ?\"\n");
    EXPECT_EQ(tool.print({"prefs", "list", "--json", domain}),
              "{\"a\":true,\"b\":\"5\",\"c\":\"\\u001B[31m \xC2\x9B\"}\n");
    write("");
    EXPECT_EQ(tool.print({"prefs", "list", domain}), "");
    EXPECT_EQ(tool.print({"prefs", "list", "--json", domain}), "{}\n");
}

TEST_F(PrefsCommand, ListsDomains)
{
    EXPECT_EQ(tool.print({"prefs", "list"}), "");
    write("");
    for (const char* name : {"a.toml", ".hidden.toml", "notes.txt", ".toml"})
        support::writeFile(file.parent_path() / name, "");
    EXPECT_EQ(tool.print({"prefs", "list"}), "a\ncom.quarn.kesto\n");
    EXPECT_EQ(tool.print({"prefs", "list", "--json"}), "[\"a\",\"com.quarn.kesto\"]\n");
}

TEST_F(PrefsCommand, CannotSayInJsonWhatJsonHasNot)
{
    write("a = nan\n");
    EXPECT_EQ(tool.print({"prefs", "list", domain}), "a = nan\n");
    expectFailure({"prefs", "get", "--json", domain, "a"},
                  "a number is not finite, which JSON cannot express: try without --json");
}

TEST_F(PrefsCommand, UnsetsAKeyAndNothingElse)
{
    write("# first\na = 1\nb = 2\n\n[c]\na = 3\n");
    EXPECT_EQ(tool.print({"prefs", "unset", domain, "a"}), "");
    EXPECT_EQ(support::readFile(file), "# first\nb = 2\n\n[c]\na = 3\n");
    EXPECT_EQ(tool.print({"prefs", "unset", domain, "c"}), "");
    EXPECT_EQ(support::readFile(file), "# first\nb = 2\n\n");
}

// --- failures

TEST_F(PrefsCommand, SaysThatTheDomainOrKeyIsMissing)
{
    const std::string preferences = file.parent_path();
    for (const char* verb : {"get", "unset"})
        expectFailure({"prefs", verb, domain, "a"}, "the domain com.quarn.kesto has no preferences in " + preferences);
    expectFailure({"prefs", "list", domain}, "the domain com.quarn.kesto has no preferences in " + preferences);
    write("b = 1\n");
    for (const char* verb : {"get", "unset"})
        expectFailure({"prefs", verb, domain, "a"}, "the domain com.quarn.kesto has no key \"a\" in " + file.native());
}

TEST_F(PrefsCommand, TouchesNoFileThatIsBroken)
{
    write("a = 1\nb = [\n");
    for (const Tool::Arguments& arguments :
         {Tool::Arguments{"prefs", "get", domain, "a"}, Tool::Arguments{"prefs", "list", domain},
          Tool::Arguments{"prefs", "set", domain, "a", "2"}, Tool::Arguments{"prefs", "unset", domain, "a"}}) {
        const Finished finished = tool.run(arguments);
        EXPECT_EQ(finished.status, 1);
        EXPECT_THAT(finished.errors, testing::StartsWith("kesto: " + file.native() + ":"));
        EXPECT_THAT(finished.errors, testing::EndsWith("; correct this first\n"));
    }
    EXPECT_EQ(support::readFile(file), "a = 1\nb = [\n");
}

TEST_F(PrefsCommand, WritesNoFileThatTheServiceWouldNotRead)
{
    const std::string large(1024 * 1024 - 10, '#');
    write(large);
    const Finished finished = tool.run({"prefs", "set", domain, "name", "text"});
    EXPECT_EQ(finished.status, 1);
    EXPECT_THAT(finished.errors, HasSubstr("longer than the 1048576 bytes that the service reads"));
    EXPECT_EQ(support::readFile(file), large);
    write(large + std::string(20, '#'));
    EXPECT_THAT(tool.run({"prefs", "list", domain}).errors, HasSubstr("File too large"));
}

TEST_F(PrefsCommand, SaysWhenItMayNot)
{
    write("a = 1\n");
    tool.giveUpRights();
    fs::permissions(file.parent_path(), fs::perms(0555));
    expectFailure({"prefs", "set", domain, "a", "2"}, "cannot write " + file.native() + ": Permission denied");
    expectFailure({"prefs", "unset", domain, "a"}, "cannot write " + file.native() + ": Permission denied");
    EXPECT_EQ(tool.print({"prefs", "get", domain, "a"}), "1\n");
    fs::permissions(file, fs::perms(0000));
    expectFailure({"prefs", "get", domain, "a"}, "cannot read " + file.native() + ": Permission denied");
    fs::permissions(file.parent_path(), fs::perms(0000));
    expectFailure({"prefs", "get", domain, "a"}, "cannot read " + file.native() + ": Permission denied");
    expectFailure({"prefs", "list"}, "cannot read " + file.parent_path().native() + ": Permission denied");
    fs::permissions(file.parent_path(), fs::perms(0755));
    EXPECT_EQ(support::readFile(file), "a = 1\n");
}

TEST_F(PrefsCommand, SaysWhenSomethingElseStandsThere)
{
    fs::create_directories(file);
    expectFailure({"prefs", "get", domain, "a"}, "cannot read " + file.native() + ": Invalid argument");
    expectFailure({"prefs", "set", domain, "a", "1"}, "cannot read " + file.native() + ": Invalid argument");
    support::writeFile(directory.path() / "plain", "");
    expectFailure({"prefs", "set", "--directory", directory.path() / "plain", domain, "a", "1"},
                  "cannot make " + (directory.path() / "plain/preferences").native() + ": Not a directory");
}

TEST_F(PrefsCommand, FindsTheDirectoryThatIsNamed)
{
    const fs::path home = directory.path() / "home/.config/kesto";
    fs::create_directories(home);
    tool.setVariable("CONFIGURATION_DIRECTORY");
    EXPECT_EQ(tool.print({"prefs", "set", domain, "a", "1"}), "");
    EXPECT_EQ(support::readFile(home / "preferences/com.quarn.kesto.toml"), "a = 1\n");
    tool.setVariable("CONFIGURATION_DIRECTORY=" + (directory.path() / "configuration").native() + ":/nonexistent");
    EXPECT_EQ(tool.print({"prefs", "set", domain, "a", "2"}), "");
    EXPECT_EQ(support::readFile(file), "a = 2\n");
    EXPECT_EQ(tool.print({"prefs", "get", "--directory", home, domain, "a"}), "1\n");
}

// --- the path to a session

TEST(PrefsRoad, AChangeReachesASessionAndItsSummary)
{
    end_to_end::Kestod kestod(end_to_end::Kestod::Files{{"device.toml", "InternalBuild = true\n"}});
    kestod.startAndAwait();
    const Tool tool(kestod.directory());
    const std::string name = "Küche \"radio\"\n☕ \\ 'x'";
    const auto client = tool.start({"client", "--socket", kestod.socketPath()});
    client->write("[\"create\", 1]\n[\"start\", 1]\n[\"getAllReporters\"]\n");
    ASSERT_THAT(client->waitForOutput("getAllReporters"), HasSubstr("\"values\":[[1]]"));

    EXPECT_EQ(tool.print({"prefs", "set", "com.quarn.kesto", "device_name", name}), "");
    ASSERT_TRUE(kestod.waitForLog("sending message for session owned by 1"));
    EXPECT_EQ(tool.print({"prefs", "set", "com.quarn.halden", "spatial-audio-accessory-feature", "true"}), "");
    ASSERT_TRUE(
        end_to_end::waitUntil([&] { return kestod.countInLog("sending message for session owned by 1") == 2; }));
    EXPECT_EQ(tool.print({"prefs", "unset", "com.quarn.kesto", "device_name"}), "");
    ASSERT_TRUE(
        end_to_end::waitUntil([&] { return kestod.countInLog("sending message for session owned by 1") == 3; }));
    client->write("[\"stop\", 1]\n");
    client->closeInput();
    EXPECT_EQ(client->wait(), 0) << client->errors();

    const fs::path file = fs::directory_iterator(kestod.directory() / "logs/Audio/Reporting")->path();
    const std::string summary = tool.print({"summary", file});
    EXPECT_THAT(summary, HasSubstr("Setup Setup"));
    EXPECT_THAT(summary, HasSubstr("device_name=Küche \"radio\"?☕ \\ 'x'\n"));
    EXPECT_THAT(summary, HasSubstr("spatial-audio-accessory-feature=true\n"));
    EXPECT_THAT(summary, HasSubstr("-device_name\n"));
    EXPECT_THAT(summary, HasSubstr("\n3 messages in "));
}

} // namespace
} // namespace kesto_tool
