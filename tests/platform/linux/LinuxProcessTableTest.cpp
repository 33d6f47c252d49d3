// Names of processes, of real ones that bear whatever names a test gives them.
#include "platform/linux/LinuxProcessTable.h"

#include "foundation/String.h"
#include "platform/linux/LinuxClock.h"
#include "support/TemporaryDirectory.h"

#include <csignal>
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/wait.h>
#include <thread>
#include <unistd.h>
#include <vector>

namespace platform {
namespace {

using namespace std::chrono_literals;

std::chrono::nanoseconds now{};

std::chrono::nanoseconds currentTime()
{
    return now;
}

// A process that does nothing but bear names.
class NamedProcess {
public:
    explicit NamedProcess(const std::string& name)
    {
        EXPECT_EQ(::pipe(toChild_), 0);
        EXPECT_EQ(::pipe(fromChild_), 0);
        identifier_ = ::fork();
        if (identifier_ == 0) {
            char next[17] = {};
            while (::read(toChild_[0], next, 16) == 16) {
                ::prctl(PR_SET_NAME, next);
                if (::write(fromChild_[1], "x", 1) != 1)
                    break;
            }
            ::_exit(0);
        }
        rename(name);
    }
    ~NamedProcess()
    {
        end();
        for (const int end : {toChild_[0], toChild_[1], fromChild_[0], fromChild_[1]})
            ::close(end);
    }
    NamedProcess(const NamedProcess&) = delete;
    NamedProcess& operator=(const NamedProcess&) = delete;

    void rename(std::string name)
    {
        name.resize(16);
        char done = 0;
        EXPECT_EQ(::write(toChild_[1], name.data(), 16), 16);
        EXPECT_EQ(::read(fromChild_[0], &done, 1), 1);
    }
    void end()
    {
        if (identifier_ <= 0)
            return;
        ::kill(identifier_, SIGKILL);
        ::waitpid(identifier_, nullptr, 0);
        identifier_ = 0;
    }
    [[nodiscard]] int identifier() const noexcept { return identifier_; }

private:
    int toChild_[2] = {};
    int fromChild_[2] = {};
    pid_t identifier_ = 0;
};

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
    EXPECT_EQ(nameOf(::getpid()), table.ownProcessName());
}

TEST_F(LinuxProcessTableTest, FindsTheNameOfAnotherProcess)
{
    const NamedProcess process("player");
    EXPECT_EQ(nameOf(process.identifier()), "player");
}

TEST_F(LinuxProcessTableTest, AProcessThatDoesNotExistIsNothing)
{
    NamedProcess process("player");
    const int identifier = process.identifier();
    process.end();
    EXPECT_EQ(nameOf(identifier), std::nullopt);
    EXPECT_EQ(nameOf(0), std::nullopt);
    EXPECT_EQ(nameOf(-1), std::nullopt);
    EXPECT_EQ(nameOf(std::numeric_limits<std::int32_t>::min()), std::nullopt);
    EXPECT_EQ(nameOf(std::numeric_limits<std::int32_t>::max()), std::nullopt);
}

TEST_F(LinuxProcessTableTest, AProcessThatWasMissingIsLookedForAgain)
{
    // Nothing is remembered of what was not there.
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
    now += 1s - 1ns;
    EXPECT_EQ(nameOf(process.identifier()), "before");
    now += 1ns;
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
    now += 1s;
    EXPECT_EQ(nameOf(process.identifier()), "cut character??");
    process.rename(std::string("\xed\xa0\x80 \xc0\xaf \xf0\x9f\x8e\xb5", 11));
    now += 1s;
    EXPECT_EQ(nameOf(process.identifier()), "??? ?? \xf0\x9f\x8e\xb5");
}

TEST_F(LinuxProcessTableTest, ANameMayHoldAnythingElse)
{
    NamedProcess process("a b) S\n1");
    EXPECT_EQ(nameOf(process.identifier()), "a b) S\n1");
    process.rename("");
    now += 1s;
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
    const double earlier = clock.systemUptime();
    EXPECT_GE(clock.systemUptime(), earlier);
}

} // namespace
} // namespace platform
