// SPDX-License-Identifier: Apache-2.0
// The size of the table, as the kernel shows it.
#include "platform/linux/process/DescriptorTable.h"

#include <filesystem>
#include <fstream>
#include <gtest/gtest.h>
#include <iterator>
#include <string>
#include <sys/resource.h>

namespace platform {
namespace {

std::size_t sizeOfTable()
{
    std::ifstream status("/proc/self/status");
    for (std::string word; status >> word;)
        if (std::size_t size = 0; word == "FDSize:" && status >> size)
            return size;
    ADD_FAILURE() << "the kernel does not show the size of the table";
    return 0;
}

std::ptrdiff_t openDescriptors()
{
    return std::distance(std::filesystem::directory_iterator("/proc/self/fd"), {});
}

void allowDescriptors(rlim_t count)
{
    rlimit limit = {};
    ::getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = count;
    ASSERT_EQ(::setrlimit(RLIMIT_NOFILE, &limit), 0);
}

TEST(DescriptorTableTest, HasRoomForAsManyAsWereReservedAndMayBeOpenedAndOpensNone)
{
    const auto open = openDescriptors();
    ASSERT_LT(sizeOfTable(), 512U);
    reserveDescriptors(512);
    EXPECT_EQ(sizeOfTable(), 512U);
    allowDescriptors(1024);
    reserveDescriptors(1'000'000'000);
    EXPECT_EQ(sizeOfTable(), 1024U);
    EXPECT_EQ(openDescriptors(), open);
}

} // namespace
} // namespace platform
