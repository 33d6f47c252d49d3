// SPDX-License-Identifier: Apache-2.0
// A library to be loaded before all others: the clocks of the program stand still until it sleeps. Then it goes on at
// once, and they have moved by the time that it wanted to sleep. So a test of how long a program plays takes no longer
// than the calls themselves, and knows the seconds.
//
// The monotonic clock, by which threads wait for others, stays as it is. Processes that find the same file in
// KESTO_TEST_SLEPT share what they slept: so the clocks of a program move when another that it runs sleeps.
#include <algorithm>
#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <threads.h>
#include <unistd.h>

namespace {

constexpr std::int64_t nanosecondsInASecond = 1'000'000'000;

// Of the file, or of this process alone; in nanoseconds.
std::atomic<std::int64_t>& slept() noexcept
{
    static std::atomic<std::int64_t> own = 0;
    static std::atomic<std::int64_t>* const counted = [] {
        const char* const path = std::getenv("KESTO_TEST_SLEPT");
        const int file = path == nullptr ? -1 : ::open(path, O_RDWR | O_CREAT | O_CLOEXEC, 0600);
        if (file < 0)
            return &own;
        void* memory = MAP_FAILED;
        if (::ftruncate(file, sizeof own) == 0)
            memory = ::mmap(nullptr, sizeof own, PROT_READ | PROT_WRITE, MAP_SHARED, file, 0);
        ::close(file);
        return memory == MAP_FAILED ? &own : static_cast<std::atomic<std::int64_t>*>(memory);
    }();
    return *counted;
}

std::int64_t inNanoseconds(const timespec& time) noexcept
{
    return time.tv_sec * nanosecondsInASecond + time.tv_nsec;
}

std::int64_t nanosecondsOf(clockid_t clock) noexcept
{
    timespec time = {};
    ::syscall(SYS_clock_gettime, clock, &time);
    return inNanoseconds(time);
}

int skip(const timespec& duration) noexcept
{
    slept() += inNanoseconds(duration);
    return 0;
}

} // namespace

extern "C" {

int clock_gettime(clockid_t clock, timespec* time) noexcept
{
    if (clock != CLOCK_REALTIME && clock != CLOCK_BOOTTIME)
        return static_cast<int>(::syscall(SYS_clock_gettime, clock, time));
    static const std::int64_t realTime = nanosecondsOf(CLOCK_REALTIME); // when it was first asked
    static const std::int64_t bootTime = nanosecondsOf(CLOCK_BOOTTIME);
    const std::int64_t now = (clock == CLOCK_REALTIME ? realTime : bootTime) + slept().load();
    *time = {now / nanosecondsInASecond, now % nanosecondsInASecond};
    return 0;
}

int nanosleep(const timespec* duration, timespec*)
{
    return skip(*duration);
}

int clock_nanosleep(clockid_t clock, int flags, const timespec* request, timespec*)
{
    timespec duration = *request;
    if ((flags & TIMER_ABSTIME) != 0) { // until then
        timespec now = {};
        clock_gettime(clock, &now);
        const std::int64_t rest = std::max<std::int64_t>(0, inNanoseconds(*request) - inNanoseconds(now));
        duration = {rest / nanosecondsInASecond, rest % nanosecondsInASecond};
    }
    return skip(duration);
}

int thrd_sleep(const timespec* duration, timespec*)
{
    return skip(*duration);
}
}
