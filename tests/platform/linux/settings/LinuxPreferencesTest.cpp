// SPDX-License-Identifier: Apache-2.0
// Configuration that is edited, replaced, moved and broken while it is in use, in all the ways of editors and people;
// and the watcher that notices the changes.
#include "platform/linux/settings/LinuxPreferences.h"

#include "platform/linux/settings/LinuxDeviceSettings.h"
#include "support/PrintValues.h"
#include "support/ProcessThreads.h"
#include "support/Sanitizers.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"

#include <chrono>
#include <condition_variable>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <mutex>
#include <optional>
#include <sys/resource.h>
#include <thread>

namespace platform {
namespace {

using foundation::Value;
using testing::ElementsAre;
using testing::IsEmpty;
using testing::SizeIs;

namespace fs = std::filesystem;

// Collects the domains with reported changes, and waits for them.
class Changes {
public:
    void add(std::string_view domain)
    {
        const std::scoped_lock lock(lock_);
        domains_.emplace_back(domain);
        changed_.notify_all();
    }
    std::optional<std::string> next()
    {
        std::unique_lock lock(lock_);
        if (!changed_.wait_for(lock, std::chrono::seconds(20), [this] { return !domains_.empty(); }))
            return std::nullopt;
        std::string domain = domains_.front();
        domains_.erase(domains_.begin());
        return domain;
    }
    [[nodiscard]] bool none()
    {
        const std::scoped_lock lock(lock_);
        return domains_.empty();
    }

private:
    std::mutex lock_;
    std::condition_variable changed_;
    std::vector<std::string> domains_;
};

class LinuxPreferencesTest : public testing::Test {
protected:
    void makePreferences()
    {
        watcher = std::make_unique<ConfigurationWatcher>(root, ProviderLog(log));
        preferences = std::make_unique<LinuxPreferences>(*watcher, ProviderLog(log));
    }
    void makePreferencesThatTell()
    {
        makePreferences();
        preferences->setChangeHandler([this](std::string_view domain) { changes.add(domain); });
    }
    void TearDown() override
    {
        preferences.reset();
        watcher.reset();
    }

    // Changes are reported in order, so after this report no earlier change can come.
    void expectNothingWasTold()
    {
        static int number = 0;
        support::writeFile(folder / "last.domain.toml", "number = " + std::to_string(++number));
        EXPECT_EQ(changes.next(), "last.domain");
    }

    support::TemporaryDirectory directory;
    const fs::path root = directory.path() / "configuration";
    const fs::path folder = root / "preferences";
    const fs::path file = folder / "com.quarn.kesto.toml";
    support::FakeLog log;
    Changes changes;
    std::unique_ptr<ConfigurationWatcher> watcher;
    std::unique_ptr<LinuxPreferences> preferences;
};

TEST_F(LinuxPreferencesTest, AnEmptyConfigurationHasNoValues)
{
    makePreferences();
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), std::nullopt);
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(LinuxPreferencesTest, ReadsTheValuesOfADomain)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"\ndisable_reporting = true\nlevels = [1, 2]\n");
    makePreferences();
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Kitchen"));
    EXPECT_EQ(preferences->value("com.quarn.kesto", "disable_reporting"), Value(true));
    EXPECT_EQ(preferences->value("com.quarn.kesto", "levels"), Value(foundation::Array{1, 2}));
    EXPECT_EQ(preferences->value("com.quarn.kesto", "unknown"), std::nullopt);
    EXPECT_EQ(preferences->value("com.quarn.halden", "device_name"), std::nullopt);
}

TEST_F(LinuxPreferencesTest, NoticesAFileThatIsReplacedAtomically)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    support::replaceFile(file, "device_name = \"Bath\"");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Bath"));
}

TEST_F(LinuxPreferencesTest, NoticesAFileThatIsWrittenInPlace)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    support::writeFile(file, "device_name = \"Bath\"");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Bath"));
}

TEST_F(LinuxPreferencesTest, NoticesAFileThatIsRemovedAndOneThatComes)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    fs::remove(file);
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), std::nullopt);
    support::writeFile(file, "device_name = \"Hall\"");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Hall"));
}

TEST_F(LinuxPreferencesTest, NoticesAFileThatIsLinkedIntoPlace)
{
    fs::create_directories(folder);
    support::writeFile(directory.path() / "elsewhere.toml", "device_name = \"Far\"");
    makePreferencesThatTell();
    fs::create_symlink(directory.path() / "elsewhere.toml", file);
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Far"));
}

TEST_F(LinuxPreferencesTest, NoticesDirectoriesThatAreMadeLater)
{
    makePreferencesThatTell();
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Kitchen"));
}

TEST_F(LinuxPreferencesTest, NoticesADirectoryThatComesWithItsFiles)
{
    fs::create_directories(root / "prepared");
    support::writeFile(root / "prepared" / "com.quarn.kesto.toml", "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    fs::rename(root / "prepared", folder);
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Kitchen"));
}

TEST_F(LinuxPreferencesTest, NoticesThatTheConfigurationIsMovedAwayAndAnotherTakesItsPlace)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    fs::rename(folder, root / "old");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), std::nullopt);
    fs::create_directory(folder);
    support::writeFile(file, "device_name = \"Bath\"");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Bath"));
    support::writeFile(root / "old" / "com.quarn.kesto.toml", "device_name = \"Wrong\"");
    expectNothingWasTold();
}

TEST_F(LinuxPreferencesTest, NoticesDirectoriesThatAreRemovedAndMadeAgain)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    for (const char* name : {"first", "second"}) {
        fs::remove_all(root);
        EXPECT_EQ(changes.next(), "com.quarn.kesto");
        fs::create_directories(folder);
        support::writeFile(file, std::string("device_name = \"") + name + "\"");
        EXPECT_EQ(changes.next(), "com.quarn.kesto");
        EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value(name));
    }
}

TEST_F(LinuxPreferencesTest, TellsOnlyOfDomainsWhoseValuesAreOthers)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    support::writeFile(file, "# a remark\ndevice_name = \"Kitchen\"");
    support::writeFile(folder / "README", "not a domain");
    support::writeFile(folder / ".toml", "a = 1");
    support::writeFile(folder / "not a domain.toml", "a = 1");
    expectNothingWasTold();
    EXPECT_TRUE(changes.none());
}

TEST_F(LinuxPreferencesTest, ReportsADomainThatWasNotReadYet)
{
    fs::create_directories(folder);
    makePreferencesThatTell();
    support::writeFile(folder / "com.quarn.halden.toml", "spatial-audio-accessory-feature = 1");
    EXPECT_EQ(changes.next(), "com.quarn.halden");
}

TEST_F(LinuxPreferencesTest, TheHandlerMayReadTheValues)
{
    fs::create_directories(folder);
    makePreferences();
    preferences->setChangeHandler([this](std::string_view domain) {
        if (preferences->value(domain, "device_name") == Value("Kitchen"))
            changes.add(domain);
    });
    support::replaceFile(file, "device_name = \"Kitchen\"");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
}

TEST_F(LinuxPreferencesTest, ABrokenFileKeepsItsValuesAndIsNoticedWhenRepaired)
{
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    makePreferencesThatTell();
    support::replaceFile(file, "device_name = ");
    expectNothingWasTold();
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Kitchen"));
    EXPECT_THAT(log.take(), SizeIs(1));
    support::replaceFile(file, "device_name = \"Bath\"");
    EXPECT_EQ(changes.next(), "com.quarn.kesto");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Bath"));
    EXPECT_THAT(log.take(), IsEmpty());
}

TEST_F(LinuxPreferencesTest, NoNameLeadsOutOfTheDirectory)
{
    using namespace std::string_view_literals;
    fs::create_directories(folder);
    support::writeFile(root / "device.toml", "secret = 1");
    support::writeFile(folder / ".hidden.toml", "secret = 1");
    makePreferences();
    const std::string tooLong(251, 'a');
    for (const std::string_view name :
         {"../device"sv, "..\0/device"sv, "/etc/passwd"sv, "a/../../device"sv, ""sv, "."sv, ".."sv, ".hidden"sv,
          "a\0b"sv, "a b"sv, "a\nb"sv, "ä"sv, "*"sv, std::string_view(tooLong)}) {
        EXPECT_FALSE(LinuxPreferences::isDomainName(name)) << name;
        EXPECT_EQ(preferences->value(name, "secret"), std::nullopt) << name;
    }
    EXPECT_TRUE(LinuxPreferences::isDomainName("com.quarn.kesto"));
    EXPECT_TRUE(LinuxPreferences::isDomainName("a..b-c_9"));
    EXPECT_TRUE(LinuxPreferences::isDomainName(tooLong.substr(1)));
    EXPECT_THAT(log.lines(), IsEmpty());
}

TEST_F(LinuxPreferencesTest, DomainsBeyondThoseKeptAreStillRead)
{
    fs::create_directories(folder);
    makePreferences();
    for (std::size_t number = 0; number < LinuxPreferences::mostKeptDomains; ++number)
        EXPECT_EQ(preferences->value("domain" + std::to_string(number), "key"), std::nullopt);
    support::writeFile(folder / "one.more.toml", "key = 1");
    EXPECT_EQ(preferences->value("one.more", "key"), Value(1));
    support::writeFile(folder / "one.more.toml", "key = 2");
    EXPECT_EQ(preferences->value("one.more", "key"), Value(2));
}

TEST_F(LinuxPreferencesTest, TellsNothingOfDomainsBeyondThoseKept)
{
    fs::create_directories(folder);
    for (int number = 0; number < 64; ++number)
        support::writeFile(folder / ("domain" + std::to_string(number) + ".toml"), "key = 1");
    makePreferencesThatTell();
    support::writeFile(folder / "one.more.toml", "key = 1");
    support::writeFile(folder / "domain63.toml", "key = 2");
    EXPECT_EQ(changes.next(), "domain63");
    EXPECT_TRUE(changes.none());
    EXPECT_EQ(preferences->value("one.more", "key"), Value(1)) << "but they are read";
}

// --- The watcher

TEST_F(LinuxPreferencesTest, NoThreadIsStartedBeforeTheFirstWatch)
{
    const std::size_t before = support::threadsOfTheProcess();
    ConfigurationWatcher unused(root, ProviderLog(log));
    EXPECT_EQ(support::threadsOfTheProcess(), before);
    makePreferences();
    EXPECT_EQ(support::threadsOfTheProcess(), before + 1);
}

TEST_F(LinuxPreferencesTest, AllOfTheConfigurationSharesOneThread)
{
    makePreferences();
    const std::size_t before = support::threadsOfTheProcess();
    const LinuxDeviceSettings settings(*watcher, ProviderLog(log));
    EXPECT_EQ(support::threadsOfTheProcess(), before);
}

TEST_F(LinuxPreferencesTest, WithoutRoomForAWatchTheServiceGoesOnAndSaysSo)
{
    KESTO_SKIP_WHERE_TYPES_ARE_CHECKED();
    // No descriptor is left for inotify.
    struct rlimit before = {};
    ASSERT_EQ(::getrlimit(RLIMIT_NOFILE, &before), 0);
    const rlimit none = {.rlim_cur = 0, .rlim_max = before.rlim_max};
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &none), 0);
    makePreferences();
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &before), 0);
    EXPECT_THAT(log.take(),
                ElementsAre(testing::Field(&support::LogLine::message,
                                           testing::AllOf(testing::HasSubstr(root.string()),
                                                          testing::HasSubstr("will take effect at the next start only"),
                                                          testing::HasSubstr("fs.inotify.max_user_instances")))));
    fs::create_directories(folder);
    support::writeFile(file, "device_name = \"Kitchen\"");
    EXPECT_EQ(preferences->value("com.quarn.kesto", "device_name"), Value("Kitchen"));
}

TEST_F(LinuxPreferencesTest, SaysWhichDirectoryItCannotWatch)
{
    fs::create_directory_symlink("configuration", root); // to itself
    makePreferences();
    EXPECT_THAT(
        log.take(),
        ElementsAre(support::IsLine(LogLevel::Error, "kerl",
                                    "changes of the configuration in " + root.string()
                                        + " will take effect at the next start only: " + (root / "preferences").string()
                                        + ": Too many levels of symbolic links; raising "
                                          "fs.inotify.max_user_instances or fs.inotify.max_user_watches may "
                                          "help")));
}

// --- Feature flags and device properties

class LinuxSettingsTest : public testing::Test {
protected:
    // Waits until the condition holds, because another thread notices changes.
    template <typename Condition> [[nodiscard]] static bool becomesTrue(Condition condition)
    {
        const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
        while (!condition()) {
            if (std::chrono::steady_clock::now() > deadline)
                return false;
            std::this_thread::yield();
        }
        return true;
    }

    support::TemporaryDirectory directory;
    support::FakeLog log;
    ConfigurationWatcher watcher{directory.path(), ProviderLog(log)};
};

TEST_F(LinuxSettingsTest, AFlagThatIsNotSetIsOff)
{
    const LinuxDeviceSettings flags(watcher, ProviderLog(log));
    EXPECT_FALSE(flags.isEnabled("Sonalis", "Tracing"));
    support::writeFile(directory.path() / "feature-flags.toml", "Sonalis = true\n[Other]\nTracing = true\n");
    EXPECT_TRUE(becomesTrue([&] { return flags.isEnabled("Other", "Tracing"); }));
    EXPECT_FALSE(flags.isEnabled("Sonalis", "Tracing"));
    EXPECT_FALSE(flags.isEnabled("Other", "Else"));
}

TEST_F(LinuxSettingsTest, AFlagIsSetInTheTableOfItsDomain)
{
    support::writeFile(directory.path() / "feature-flags.toml", "[Sonalis]\nTracing = true\nOff = false\n");
    const LinuxDeviceSettings flags(watcher, ProviderLog(log));
    EXPECT_TRUE(flags.isEnabled("Sonalis", "Tracing"));
    EXPECT_FALSE(flags.isEnabled("Sonalis", "Off"));
    support::replaceFile(directory.path() / "feature-flags.toml", "[Sonalis]\nTracing = false\n");
    EXPECT_TRUE(becomesTrue([&] { return !flags.isEnabled("Sonalis", "Tracing"); }));
}

TEST_F(LinuxSettingsTest, APropertyIsTrueFalseOrNotThere)
{
    support::writeFile(directory.path() / "device.toml", "InternalBuild = true\nOther = false\n");
    const LinuxDeviceSettings properties(watcher, ProviderLog(log));
    EXPECT_EQ(properties.boolean("InternalBuild"), true);
    EXPECT_EQ(properties.boolean("Other"), false);
    EXPECT_EQ(properties.boolean("Missing"), std::nullopt);
}

TEST_F(LinuxSettingsTest, ABrokenPropertyFileIsComplainedAboutAndCountsAgainOnceRepaired)
{
    support::writeFile(directory.path() / "device.toml", "InternalBuild = ja\n");
    const LinuxDeviceSettings properties(watcher, ProviderLog(log));
    EXPECT_EQ(properties.boolean("InternalBuild"), std::nullopt);
    EXPECT_THAT(log.take(),
                ElementsAre(testing::Field(&support::LogLine::message,
                                           testing::StartsWith((directory.path() / "device.toml:1:").string()))));
    support::replaceFile(directory.path() / "device.toml", "InternalBuild = true\n");
    EXPECT_TRUE(becomesTrue([&] { return properties.boolean("InternalBuild") == true; }));
}

} // namespace
} // namespace platform
