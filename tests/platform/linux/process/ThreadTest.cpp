// SPDX-License-Identifier: Apache-2.0
// What the scheduler knows of threads that were started.
#include "platform/linux/process/Thread.h"

#include <array>
#include <cstdint>
#include <cstring>
#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace platform {
namespace {

// In nanoseconds; 0 from a kernel that has only one slice for all threads.
std::uint64_t sliceOfThisThread()
{
    constexpr std::size_t place = 24; // of the runtime in sched_attr(2)
    std::array<char, 48> attributes = {};
    if (syscall(SYS_sched_getattr, 0, attributes.data(), attributes.size(), 0) != 0)
        return 0;
    std::uint64_t slice = 0;
    std::memcpy(&slice, attributes.data() + place, sizeof slice);
    return slice;
}

std::uint64_t sliceOf(QualityOfService quality)
{
    std::uint64_t slice = 0;
    startThread("slice", quality, [&] { slice = sliceOfThisThread(); }).join();
    return slice;
}

TEST(ThreadTest, HasAShortSliceIfSomebodyWaitsForIt)
{
    if (sliceOfThisThread() == 0)
        GTEST_SKIP() << "this kernel has one slice for all threads";
    EXPECT_EQ(sliceOf(QualityOfService::UserInteractive), 100'000U);
    EXPECT_EQ(sliceOf(QualityOfService::Default), sliceOfThisThread());
    EXPECT_EQ(sliceOf(QualityOfService::Background), sliceOfThisThread());
}

TEST(ThreadTest, HasTheKernelsSliceAgainOnceNobodyWaitsForIt)
{
    const std::uint64_t ofTheKernel = sliceOfThisThread();
    std::uint64_t slice = 1;
    startThread("slice", QualityOfService::UserInteractive, [&] {
        setQualityOfThisThread(QualityOfService::Default);
        slice = sliceOfThisThread();
    }).join();
    EXPECT_EQ(slice, ofTheKernel);
}

} // namespace
} // namespace platform
