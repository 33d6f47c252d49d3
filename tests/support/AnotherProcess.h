// SPDX-License-Identifier: Apache-2.0
// Runs a part of a test in another process, for what a process cannot take back: a limit, or privileges that it gave
// up.
#pragma once

#include <filesystem>
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

namespace support {

// Failures in the other process are failures of the test; an exception ends the process.
template <typename Test> void runInAnotherProcess(Test test)
{
    const pid_t child = ::fork();
    if (child == 0) {
        [&]() noexcept { test(); }();
        ::_exit(testing::Test::HasFailure() ? 1 : 0);
    }
    int status = 0;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
}

// As an ordinary user, who gets the directory.
template <typename Test> void runUnprivileged(const std::filesystem::path& owned, Test test)
{
    runInAnotherProcess([&] {
        constexpr unsigned nobody = 65534;
        const bool isOrdinary = ::getuid() != 0
            || (::chown(owned.c_str(), nobody, nobody) == 0 && ::setgid(nobody) == 0 && ::setuid(nobody) == 0);
        ASSERT_TRUE(isOrdinary);
        test();
    });
}

} // namespace support
