// The default place of channels.
#include "channels/ChannelFolder.h"

#include "support/TemporaryDirectory.h"

#include <cstdlib>
#include <filesystem>
#include <gtest/gtest.h>
#include <optional>

namespace {

// Sets a variable, or unsets it, as long as it lives.
class Variable {
public:
    Variable(const char* name, const std::optional<std::string>& value) : name_(name)
    {
        if (const char* before = std::getenv(name); before != nullptr)
            before_ = before;
        set(value);
    }
    ~Variable() { set(before_); }
    Variable(const Variable&) = delete;
    Variable& operator=(const Variable&) = delete;

private:
    void set(const std::optional<std::string>& value)
    {
        if (value)
            ::setenv(name_, value->c_str(), 1);
        else
            ::unsetenv(name_);
    }

    const char* name_;
    std::optional<std::string> before_;
};

TEST(ChannelRoot, IsTheOneOfTheEnvironment)
{
    const Variable root("KESTO_CHANNEL_ROOT", "/given");
    EXPECT_EQ(libkesto::usualChannelRoot(), "/given");
}

TEST(ChannelRoot, IsThatOfTheUsersServiceWhereThereIsOne)
{
    const support::TemporaryDirectory runtime;
    const Variable root("KESTO_CHANNEL_ROOT", "");
    const Variable directory("XDG_RUNTIME_DIR", runtime.path().string());
    EXPECT_EQ(libkesto::usualChannelRoot(), "/run/kesto/channels") << "no service of the user's";
    std::filesystem::create_directory(runtime / "kesto");
    EXPECT_EQ(libkesto::usualChannelRoot(), runtime / "kesto/channels");
}

TEST(ChannelRoot, IsTheSystemsWithoutAUsersSession)
{
    const Variable root("KESTO_CHANNEL_ROOT", std::nullopt);
    const Variable directory("XDG_RUNTIME_DIR", std::nullopt);
    EXPECT_EQ(libkesto::usualChannelRoot(), "/run/kesto/channels");
}

} // namespace
