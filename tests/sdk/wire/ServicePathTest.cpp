// Where a client looks for the service: what it was told comes before the environment, and that before the places that
// the service has as packaged.
#include "wire/ServicePath.h"

#include <cstdlib>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <optional>
#include <string>

namespace {

using libkesto::servicePaths;
using testing::ElementsAre;

// Sets a variable, or unsets it, as long as it lives.
class Variable {
public:
    Variable(const char* name, const char* value) : name_(name)
    {
        if (const char* before = std::getenv(name); before != nullptr)
            before_ = before;
        set(value);
    }
    ~Variable() { set(before_ ? before_->c_str() : nullptr); }
    Variable(const Variable&) = delete;
    Variable& operator=(const Variable&) = delete;

private:
    void set(const char* value)
    {
        if (value == nullptr)
            ::unsetenv(name_);
        else
            ::setenv(name_, value, 1);
    }

    const char* name_;
    std::optional<std::string> before_;
};

TEST(ServicePath, IsTheOneThatWasGiven)
{
    const Variable socket("KESTO_SOCKET", "/from/environment");
    EXPECT_THAT(servicePaths("/given", "").value(), ElementsAre("/given"));
}

TEST(ServicePath, ComesFromTheEnvironmentNext)
{
    const Variable socket("KESTO_SOCKET", "/from/environment");
    const Variable runtime("XDG_RUNTIME_DIR", "/run/user/1000");
    EXPECT_THAT(servicePaths("", "").value(), ElementsAre("/from/environment"));
}

TEST(ServicePath, IsTheUsersOwnServiceAndThenTheSystems)
{
    const Variable socket("KESTO_SOCKET", nullptr);
    const Variable runtime("XDG_RUNTIME_DIR", "/run/user/1000");
    EXPECT_THAT(servicePaths("", "").value(),
                ElementsAre("/run/user/1000/kesto/com.quarn.kesto.reporting", "/run/kesto/com.quarn.kesto.reporting"));
    EXPECT_THAT(servicePaths("", "other").value(), ElementsAre("/run/user/1000/kesto/other", "/run/kesto/other"));
}

TEST(ServicePath, IsTheSystemsWhereThereIsNoUsersSession)
{
    const Variable socket("KESTO_SOCKET", nullptr);
    const Variable runtime("XDG_RUNTIME_DIR", nullptr);
    EXPECT_THAT(servicePaths("", "").value(), ElementsAre("/run/kesto/com.quarn.kesto.reporting"));
    const Variable empty("XDG_RUNTIME_DIR", "");
    EXPECT_THAT(servicePaths("", "").value(), ElementsAre("/run/kesto/com.quarn.kesto.reporting"));
}

TEST(ServicePath, IsNeverOneThatNoSocketCanHave)
{
    EXPECT_EQ(servicePaths(std::string(108, 'x'), "").error(), KESTO_INVALID_ARGUMENT);
    EXPECT_TRUE(servicePaths(std::string(107, 'x'), ""));
    EXPECT_EQ(servicePaths("", "a/b").error(), KESTO_INVALID_ARGUMENT);
    EXPECT_EQ(servicePaths(std::string("a\0b", 3), "").error(), KESTO_INVALID_ARGUMENT);
}

} // namespace
