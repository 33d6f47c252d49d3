// SPDX-License-Identifier: Apache-2.0
// A library to be loaded before all others: it shifts the time of day of one process, by the seconds that stand in a
// file, so that a real service lives through a clock that is set. The clocks that no one can set stay as they are, and
// so do the stamps of files, which the kernel makes, with the clock that is compared with them.
#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace {

// Of the process that set the variable, which changes it at any time.
const volatile std::int64_t* shift()
{
    static const volatile std::int64_t* const mapped = [] {
        static constexpr std::int64_t none = 0;
        const char* path = std::getenv("KESTO_TEST_CLOCK_SHIFT");
        const int file = path == nullptr ? -1 : ::open(path, O_RDONLY | O_CLOEXEC);
        void* bytes = file < 0 ? MAP_FAILED : ::mmap(nullptr, sizeof none, PROT_READ, MAP_SHARED, file, 0);
        ::close(file);
        return bytes == MAP_FAILED ? &none : static_cast<const std::int64_t*>(bytes);
    }();
    return mapped;
}

} // namespace

extern "C" {

int clock_gettime(clockid_t clock, timespec* time) noexcept
{
    const auto done = static_cast<int>(::syscall(SYS_clock_gettime, clock, time));
    if (done == 0 && clock == CLOCK_REALTIME)
        time->tv_sec += *shift();
    return done;
}

time_t time(time_t* out) noexcept
{
    timespec now = {};
    ::clock_gettime(CLOCK_REALTIME, &now);
    if (out != nullptr)
        *out = now.tv_sec;
    return now.tv_sec;
}
}
