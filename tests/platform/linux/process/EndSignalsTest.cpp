// SPDX-License-Identifier: Apache-2.0
// The signals that end the process, each in a process of its own.
#include "platform/linux/process/EndSignals.h"

#include <chrono>
#include <csignal>
#include <cstdlib>
#include <future>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <iostream>
#include <string>
#include <sys/types.h>
#include <thread>
#include <unistd.h>

namespace platform {
namespace {

using namespace std::chrono_literals;

// This process's own signal, as the log shows it.
std::string sentBySelf(std::string_view signal)
{
    return "process " + std::to_string(::getpid()) + " (user " + std::to_string(::getuid()) + ") sent "
        + std::string(signal);
}

[[noreturn]] void waitForEver()
{
    while (true)
        ::pause();
}

class EndSignalsDeathTest : public testing::Test {
protected:
    EndSignalsDeathTest() { GTEST_FLAG_SET(death_test_style, "threadsafe"); }
};

// The end in order: the status is that of the process that goes on.
[[noreturn]] void endInOrder(int signal)
{
    std::promise<void> begun;
    EndSignals signals;
    signals.setHandlers({.begin = [&] { begun.set_value(); }, .giveUp = [](std::string_view) { std::_Exit(3); }});
    ::kill(::getpid(), signal);
    begun.get_future().wait();
    std::cerr << (*signals.request() == sentBySelf(signal == SIGTERM ? "SIGTERM" : "SIGINT") ? "as sent" : "otherwise");
    std::_Exit(7);
}

TEST_F(EndSignalsDeathTest, BeginTheEndAndLeaveItToTheProcess)
{
    EXPECT_EXIT(endInOrder(SIGTERM), testing::ExitedWithCode(7), "^as sent$");
    EXPECT_EXIT(endInOrder(SIGINT), testing::ExitedWithCode(7), "^as sent$");
}

[[noreturn]] void signalBeforeTheHandlersAreSet()
{
    EndSignals signals;
    ::kill(::getpid(), SIGTERM);
    while (!signals.request())
        std::this_thread::yield();
    signals.setHandlers({.begin = [] { std::_Exit(7); }, .giveUp = [](std::string_view) {}});
    std::_Exit(8);
}

TEST_F(EndSignalsDeathTest, BeginTheEndLaterIfTheyComeBeforeTheirHandlers)
{
    EXPECT_EXIT(signalBeforeTheHandlersAreSet(), testing::ExitedWithCode(7), "");
}

[[noreturn]] void signalTwice()
{
    EndSignals signals;
    signals.setHandlers({.begin = [] { ::kill(::getpid(), SIGINT); },
                         .giveUp =
                             [](std::string_view reason) {
                                 std::cerr << (reason == "a second signal came: " + sentBySelf("SIGINT") ? "as sent"
                                                                                                         : reason);
                             }});
    ::kill(::getpid(), SIGTERM);
    waitForEver();
}

TEST_F(EndSignalsDeathTest, EndTheProcessAtTheSecond)
{
    EXPECT_EXIT(signalTwice(), testing::ExitedWithCode(0), "^as sent$");
}

[[noreturn]] void signalTwiceWithoutHandlers()
{
    const EndSignals signals;
    ::kill(::getpid(), SIGTERM);
    while (!signals.request())
        std::this_thread::yield();
    ::kill(::getpid(), SIGTERM);
    waitForEver();
}

TEST_F(EndSignalsDeathTest, EndAProcessThatIsStillStartingAtTheSecond)
{
    EXPECT_EXIT(signalTwiceWithoutHandlers(), testing::ExitedWithCode(0), "");
}

[[noreturn]] void takeTooLong(bool logHangs)
{
    EndSignals signals;
    signals.setHandlers({.begin = [] {},
                         .giveUp =
                             [logHangs](std::string_view reason) {
                                 std::cerr << reason;
                                 if (logHangs)
                                     waitForEver();
                             }});
    ::kill(::getpid(), SIGTERM);
    waitForEver();
}

// These take the time that they are about: it is the kernel's.
TEST_F(EndSignalsDeathTest, EndTheProcessWhenTheEndTakesTooLong)
{
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EXIT(takeTooLong(false), testing::ExitedWithCode(0), "^it takes longer than 4500ms$");
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 4500ms);
}

TEST_F(EndSignalsDeathTest, EndTheProcessEvenIfTheLastLogLineHangs)
{
    const auto begin = std::chrono::steady_clock::now();
    EXPECT_EXIT(takeTooLong(true), testing::ExitedWithCode(0), "^it takes longer than 4500ms$");
    EXPECT_GE(std::chrono::steady_clock::now() - begin, 5s);
}

[[noreturn]] void destroyWithoutASignal()
{
    {
        EndSignals signals;
        signals.setHandlers({.begin = [] { std::_Exit(3); }, .giveUp = [](std::string_view) { std::_Exit(3); }});
    }
    std::_Exit(7);
}

TEST_F(EndSignalsDeathTest, LetTheirObjectGoWithoutASignal)
{
    EXPECT_EXIT(destroyWithoutASignal(), testing::ExitedWithCode(7), "");
}

} // namespace
} // namespace platform
