// SPDX-License-Identifier: Apache-2.0
// Which names of applications the store may keep, and under which pseudonyms.
#include "platform/linux/store/applications/ApplicationRules.h"

#include "platform/linux/settings/TomlFile.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <filesystem>
#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace platform {
namespace {

using foundation::Dictionary;
using testing::ElementsAre;
using testing::IsEmpty;

// --- pseudonyms

TEST(PseudonymsTest, AreTheFirstBytesOfAKeyedHash)
{
    EXPECT_EQ(Pseudonyms("Jefe").of("what do ya want for nothing?"), "app-5bdcc146bf60754e") << "RFC 4231, case 2";
    EXPECT_NE(Pseudonyms("Other").of("what do ya want for nothing?"), "app-5bdcc146bf60754e");
}

class KeyTest : public testing::Test {
protected:
    std::string pseudonym() { return Pseudonyms(directory.path(), ProviderLog(log)).of("org.example.player"); }

    support::TemporaryDirectory directory;
    support::FakeLog log;
    const std::filesystem::path file = directory.path() / "applications.key";
};

TEST_F(KeyTest, IsMadeOnceAndReadByTheServiceAlone)
{
    const std::string first = pseudonym();
    EXPECT_EQ(pseudonym(), first);
    EXPECT_EQ(std::filesystem::file_size(file), 32U);
    EXPECT_EQ(std::filesystem::status(file).permissions(), std::filesystem::perms(0600));
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(KeyTest, ThatIsRemovedMakesOtherPseudonyms)
{
    const std::string first = pseudonym();
    std::filesystem::remove(file);
    EXPECT_NE(pseudonym(), first);
}

TEST_F(KeyTest, OfAnotherLengthIsReplaced)
{
    support::writeFile(file, "too short");
    const std::string first = pseudonym();
    EXPECT_EQ(pseudonym(), first);
    EXPECT_EQ(std::filesystem::file_size(file), 32U);
}

TEST_F(KeyTest, ThatCannotBeMadeLastsUntilTheEndAndALineSaysSo)
{
    std::filesystem::create_directories(file / "in the way");
    EXPECT_NE(pseudonym(), pseudonym());
    const auto lines = log.take();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0].message,
              file.string()
                  + " cannot be made: Is a directory; the pseudonyms of applications last until the service ends");
    EXPECT_EQ(std::distance(std::filesystem::directory_iterator(directory.path()), {}), 1)
        << "nothing unfinished stays";
}

// --- rules

ApplicationRules rules()
{
    return {{.notStored = {"org.example.secret*"}, .hashed = {"org.bank.*", "bank"}},
            std::make_shared<const Pseudonyms>("Jefe")};
}

TEST(ApplicationRulesTest, LeaveOutHashOrShowAName)
{
    EXPECT_EQ(rules().shown("org.example.secret.player"), std::nullopt);
    EXPECT_EQ(rules().shown("org.example.player"), "org.example.player");
    EXPECT_EQ(rules().shown("bank"), Pseudonyms("Jefe").of("bank"));
    EXPECT_EQ(rules().shown(std::string()), "");
}

TEST(ApplicationRulesTest, ApplyToTheNamesInAPayloadAndToNothingElse)
{
    const Dictionary player{{"HostApplicationDisplayID", "org.example.player"}, {"bank", "bank"}};
    EXPECT_EQ(rules().shown(player), player);
    EXPECT_EQ(rules().shown(Dictionary{{"n", 1}, {"HostApplicationDisplayID", "bank"}}),
              (Dictionary{{"n", 1}, {"HostApplicationDisplayID", Pseudonyms("Jefe").of("bank")}}));
    EXPECT_EQ(rules().shown(Dictionary{{"processName", "bank"}, {"seconds", 2}}),
              (Dictionary{{"processName", Pseudonyms("Jefe").of("bank")}, {"seconds", 2}}));
    EXPECT_EQ(rules().shown(Dictionary{{"HostApplicationDisplayID", "org.example.secret"}}), std::nullopt);
    EXPECT_EQ(rules().shown(Dictionary{{"HostApplicationDisplayID", 7}}),
              (Dictionary{{"HostApplicationDisplayID", 7}}));
}

TEST(ApplicationRulesTest, HideTheNamesOfSourcesAndSessions)
{
    OriginAnnouncements announcements;
    announcements.sources = {{.number = 1, .processName = "bank"}, {.number = 2, .processName = "player"}};
    announcements.sessions = {{.number = 3, .application = "org.example.secret"},
                              {.number = 4, .application = "org.bank.a"}};
    rules().hideNames(announcements);
    EXPECT_EQ(announcements.sources[0].processName, Pseudonyms("Jefe").of("bank"));
    EXPECT_EQ(announcements.sources[1].processName, "player");
    EXPECT_EQ(announcements.sessions[0].application, "");
    EXPECT_EQ(announcements.sessions[1].application, Pseudonyms("Jefe").of("org.bank.a"));
}

TEST(ApplicationRulesTest, AreReadFromTheConfigurationDirectory)
{
    const support::TemporaryDirectory configuration;
    const support::TemporaryDirectory state;
    support::FakeLog log;
    const auto load = [&] { return loadApplicationRules(configuration.path(), state.path(), ProviderLog(log)); };
    EXPECT_EQ(load(), nullptr);
    support::writeFile(configuration.path() / "applications.toml", "not_stored = [\"a\"]\n");
    EXPECT_EQ(load()->shown("a"), std::nullopt);
    EXPECT_TRUE(std::filesystem::is_empty(state.path())) << "no pseudonym, no key";
    support::writeFile(configuration.path() / "applications.toml", "hashed = [\"a\"]\nhash = 1\n");
    EXPECT_THAT(*load()->shown("a"), testing::StartsWith("app-"));
    EXPECT_EQ(load()->shown("a"), load()->shown("a"));
    EXPECT_THAT(log.take()[0].message, testing::EndsWith("unknown key hash, ignored; the keys are not_stored, hashed"));
}

TEST(ApplicationsConfigurationTest, HasTwoListsAndNamesWhatIsWrong)
{
    const auto read = [](const char* text) { return readApplicationsConfiguration(*parseToml(text)); };
    EXPECT_TRUE(read("").configuration.empty());
    const auto [configuration, problems] = read("not_stored = [\"a\"]\nhashed = 3\nhash = []\n");
    EXPECT_EQ(configuration, (ApplicationsConfiguration{.notStored = {"a"}, .hashed = {}}));
    EXPECT_THAT(problems,
                ElementsAre("unknown key hash, ignored; the keys are not_stored, hashed",
                            "hashed = 3 should be a list of patterns such as [\"org.example.*\"]; the default counts "
                            "until this is corrected"));
}

} // namespace
} // namespace platform
