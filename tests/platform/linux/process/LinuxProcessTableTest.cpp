// SPDX-License-Identifier: Apache-2.0
// Names of real processes, which the tests choose.
#include "platform/linux/process/LinuxProcessTable.h"

#include "foundation/values/String.h"
#include "platform/linux/NamedProcess.h"
#include "platform/linux/process/LinuxClock.h"
#include "support/TemporaryDirectory.h"

#include <gtest/gtest.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace platform {
namespace {

using namespace std::chrono_literals;
using support::NamedProcess;

std::chrono::nanoseconds timeOfTheTest{};

std::chrono::nanoseconds currentTime()
{
    return timeOfTheTest;
}

class LinuxProcessTableTest : public testing::Test {
protected:
    std::optional<std::string> nameOf(int identifier)
    {
        const auto entry = table.entry(identifier);
        if (!entry)
            return std::nullopt;
        EXPECT_EQ(entry->processIdentifier, identifier);
        return entry->commandName;
    }

    LinuxProcessTable table{&currentTime};
};

TEST_F(LinuxProcessTableTest, KnowsItsOwnProcess)
{
    EXPECT_EQ(table.ownProcessIdentifier(), ::getpid());
    EXPECT_EQ(table.ownProcessName() + "\n", support::readFile("/proc/self/comm"));
}

TEST_F(LinuxProcessTableTest, KnowsTheFirstProcessOfTheSystemAndNoneWithALowerNumber)
{
    EXPECT_EQ(nameOf(1).value_or("") + "\n", support::readFile("/proc/1/comm"));
    EXPECT_EQ(nameOf(0), std::nullopt);
    EXPECT_EQ(nameOf(-1), std::nullopt);
}

TEST_F(LinuxProcessTableTest, AProcessThatWasMissingIsLookedForAgain)
{
    // A missing process is not cached.
    NamedProcess process("player");
    const int identifier = process.identifier();
    EXPECT_EQ(LinuxProcessTable(&currentTime).entry(identifier)->commandName, "player");
    process.end();
    EXPECT_EQ(nameOf(identifier), std::nullopt);
    EXPECT_EQ(nameOf(identifier), std::nullopt);
}

TEST_F(LinuxProcessTableTest, BelievesANameForASecond)
{
    NamedProcess process("before");
    EXPECT_EQ(nameOf(process.identifier()), "before");
    process.rename("after");
    timeOfTheTest += 1s - 1ns;
    EXPECT_EQ(nameOf(process.identifier()), "before");
    timeOfTheTest += 1ns;
    EXPECT_EQ(nameOf(process.identifier()), "after");
}

TEST_F(LinuxProcessTableTest, ReadsANameAnewThatItWasToldToForget)
{
    NamedProcess process("before");
    EXPECT_EQ(nameOf(process.identifier()), "before");
    process.rename("after");
    for (const int unrelated : {process.identifier() + static_cast<int>(LinuxProcessTable::mostKept), 0, -1})
        table.forget(unrelated);
    EXPECT_EQ(nameOf(process.identifier()), "before");
    table.forget(process.identifier());
    EXPECT_EQ(nameOf(process.identifier()), "after");
}

TEST_F(LinuxProcessTableTest, NamesAreAlwaysUtf8)
{
    NamedProcess process("\xff\xfe player \xc3\xa9");
    EXPECT_EQ(nameOf(process.identifier()), "?? player é");
    process.rename("cut character\xe9\x9f"); // as the kernel leaves it when it cuts a name
    timeOfTheTest += 1s;
    EXPECT_EQ(nameOf(process.identifier()), "cut character??");
    process.rename(std::string("\xed\xa0\x80 \xc0\xaf \xf0\x9f\x8e\xb5", 11));
    timeOfTheTest += 1s;
    EXPECT_EQ(nameOf(process.identifier()), "??? ?? \xf0\x9f\x8e\xb5");
}

TEST_F(LinuxProcessTableTest, ANameMayHoldAnythingElse)
{
    NamedProcess process("a b) S\n1");
    EXPECT_EQ(nameOf(process.identifier()), "a b) S\n1");
    process.rename("");
    timeOfTheTest += 1s;
    EXPECT_EQ(nameOf(process.identifier()), "");
}

TEST_F(LinuxProcessTableTest, ManyThreadsMayAskAtOnce)
{
    const NamedProcess first("first");
    const NamedProcess second("second");
    std::vector<std::jthread> threads;
    for (int thread = 0; thread < 4; ++thread)
        threads.emplace_back([&] {
            for (int round = 0; round < 1000; ++round) {
                ASSERT_EQ(table.entry(first.identifier())->commandName, "first");
                ASSERT_EQ(table.entry(second.identifier())->commandName, "second");
            }
        });
}

TEST(LinuxClockTest, TellsTheTimeOfTheSystem)
{
    const LinuxClock clock;
    const auto before = static_cast<double>(::time(nullptr));
    EXPECT_GE(clock.secondsSince1970(), before);
    EXPECT_LE(clock.secondsSince1970(), before + 60);
}

TEST(LinuxClockTest, TheUptimeIsThatOfTheDevice)
{
    const LinuxClock clock;
    const double kernels = std::stod(support::readFile("/proc/uptime"));
    EXPECT_NEAR(clock.systemUptime(), kernels, 60);
}

} // namespace
} // namespace platform
