// SPDX-License-Identifier: Apache-2.0
// The contract of platform/Preferences.h: the stored values by domain and key.
#include "platform/contract/Contract.h"
#include "platform/linux/settings/LinuxPreferences.h"
#include "support/TemporaryDirectory.h"
#include "support/fakes/FakeLog.h"
#include "support/fakes/FakeSettings.h"

#include <map>
#include <vector>

namespace contract {
namespace {

using foundation::Array;
using foundation::Dictionary;
using foundation::Value;

// A value, and its text as the device's owner writes it.
struct Setting {
    Value value;
    std::string text;
};

class PreferencesSubject {
public:
    virtual ~PreferencesSubject() = default;
    [[nodiscard]] virtual const platform::Preferences& preferences() const = 0;
    // The device's owner changes values. It takes effect a moment later.
    virtual void set(const std::string& domain, const std::string& key, const Setting& setting) = 0;
    virtual void remove(const std::string& domain, const std::string& key) = 0;
};

class FakePreferencesSubject final : public PreferencesSubject {
public:
    [[nodiscard]] const platform::Preferences& preferences() const override { return preferences_; }
    void set(const std::string& domain, const std::string& key, const Setting& setting) override
    {
        preferences_.set(domain, key, setting.value);
    }
    void remove(const std::string& domain, const std::string& key) override { preferences_.remove(domain, key); }

private:
    support::FakePreferences preferences_;
};

class LinuxPreferencesSubject final : public PreferencesSubject {
public:
    [[nodiscard]] const platform::Preferences& preferences() const override { return preferences_; }
    void set(const std::string& domain, const std::string& key, const Setting& setting) override
    {
        texts_[domain][key] = setting.text;
        write(domain);
    }
    void remove(const std::string& domain, const std::string& key) override
    {
        texts_[domain].erase(key);
        write(domain);
    }

private:
    void write(const std::string& domain)
    {
        std::string text;
        for (const auto& [key, value] : texts_[domain])
            text.append(key).append(" = ").append(value).append("\n");
        std::filesystem::create_directories(directory_ / "preferences");
        support::replaceFile(directory_.path() / "preferences" / (domain + ".toml"), text);
    }

    const support::TemporaryDirectory directory_;
    std::map<std::string, std::map<std::string, std::string>> texts_;
    support::FakeLog log_;
    platform::ConfigurationWatcher watcher_{directory_.path(), platform::ProviderLog(log_)};
    platform::LinuxPreferences preferences_{watcher_, platform::ProviderLog(log_)};
};

class PreferencesContract : public Suite<PreferencesSubject> {
protected:
    [[nodiscard]] std::optional<Value> value(std::string_view domain, std::string_view key) const
    {
        return subject->preferences().value(domain, key);
    }
};
KESTO_CONTRACT(PreferencesContract, (provider<PreferencesSubject, FakePreferencesSubject>("Fake")),
               (provider<PreferencesSubject, LinuxPreferencesSubject>("Linux")));

const Setting kitchen{"Kitchen", "\"Kitchen\""};
const Setting bath{"Bath", "\"Bath\""};

TEST_P(PreferencesContract, HaveOnlyStoredValues)
{
    EXPECT_EQ(value("com.quarn.kesto", "device_name"), std::nullopt);
    subject->set("com.quarn.kesto", "other", kitchen);
    ASSERT_TRUE(eventually([&] { return value("com.quarn.kesto", "other") == kitchen.value; }));
    EXPECT_EQ(value("com.quarn.kesto", "device_name"), std::nullopt);
}

TEST_P(PreferencesContract, TellValuesOfEveryKindAsTheyAreStored)
{
    const std::vector<Setting> settings{{true, "true"},
                                        {false, "false"},
                                        {-3, "-3"},
                                        {0.5, "0.5"},
                                        {"", "\"\""},
                                        {"text \"é\"", R"("text \"é\"")"},
                                        {Array{1, "two"}, "[1, \"two\"]"},
                                        {Dictionary{{"a", 1}}, "{ a = 1 }"}};
    for (const Setting& setting : settings) {
        subject->set("com.quarn.kesto", "key", setting);
        EXPECT_TRUE(eventually([&] { return value("com.quarn.kesto", "key") == setting.value; })) << setting.text;
    }
}

TEST_P(PreferencesContract, TellWhatIsStoredNowWhenItChangesAndGoes)
{
    subject->set("com.quarn.kesto", "device_name", kitchen);
    ASSERT_TRUE(eventually([&] { return value("com.quarn.kesto", "device_name") == kitchen.value; }));
    subject->set("com.quarn.kesto", "device_name", bath);
    EXPECT_TRUE(eventually([&] { return value("com.quarn.kesto", "device_name") == bath.value; }));
    subject->remove("com.quarn.kesto", "device_name");
    EXPECT_TRUE(eventually([&] { return value("com.quarn.kesto", "device_name") == std::nullopt; }));
}

TEST_P(PreferencesContract, KeepDomainsAndKeysApart)
{
    subject->set("com.quarn.kesto", "a", kitchen);
    subject->set("com.quarn.kesto", "b", bath);
    subject->set("com.quarn.halden", "a", bath);
    EXPECT_TRUE(eventually([&] { return value("com.quarn.halden", "a") == bath.value; }));
    EXPECT_TRUE(eventually([&] { return value("com.quarn.kesto", "a") == kitchen.value; }));
    EXPECT_TRUE(eventually([&] { return value("com.quarn.kesto", "b") == bath.value; }));
    EXPECT_EQ(value("com.quarn.halden", "b"), std::nullopt);
    subject->remove("com.quarn.halden", "a");
    EXPECT_TRUE(eventually([&] { return value("com.quarn.halden", "a") == std::nullopt; }));
    EXPECT_EQ(value("com.quarn.kesto", "a"), kitchen.value);
}

} // namespace
} // namespace contract
