// A preloaded twin of the system's clocks for tests: time passes faster, the wall clock can be set, and the device can
// seem to have slept. The case that preloads it maps the file that CLOCKTWIN names, and may change its numbers at any
// time but the first two.

#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <fcntl.h>
#include <sys/mman.h>
#include <sys/syscall.h>
#include <sys/time.h>
#include <sys/timerfd.h>
#include <unistd.h>

namespace {

struct Numbers {
    std::int64_t began; ///< CLOCK_MONOTONIC from which on time passes faster, in nanoseconds
    std::int64_t rate;
    std::int64_t set;   ///< added to the wall clock, in nanoseconds
    std::int64_t slept; ///< added to the wall clock and CLOCK_BOOTTIME
};

/// System calls are made directly: a sanitizer asks for the time before its own versions of the C library's calls work.
const volatile Numbers& numbers()
{
    static const auto* const mapped = [] {
        const long file = syscall(SYS_openat, AT_FDCWD, std::getenv("CLOCKTWIN"), O_RDONLY | O_CLOEXEC);
        const long memory = syscall(SYS_mmap, nullptr, sizeof(Numbers), PROT_READ, MAP_SHARED, file, 0L);
        if (memory < 0) std::abort();
        return reinterpret_cast<const volatile Numbers*>(memory);
    }();
    return *mapped;
}

std::int64_t realTime(clockid_t clock)
{
    timespec now{};
    syscall(SYS_clock_gettime, clock, &now);
    return now.tv_sec * 1'000'000'000 + now.tv_nsec;
}

std::int64_t twinTime(clockid_t clock)
{
    const volatile Numbers& twin = numbers();
    const std::int64_t ahead = (realTime(CLOCK_MONOTONIC) - twin.began) * (twin.rate - 1);
    switch (clock) {
    case CLOCK_REALTIME:
    case CLOCK_REALTIME_COARSE: return realTime(clock) + ahead + twin.slept + twin.set;
    case CLOCK_BOOTTIME: return realTime(clock) + ahead + twin.slept;
    case CLOCK_MONOTONIC:
    case CLOCK_MONOTONIC_COARSE:
    case CLOCK_MONOTONIC_RAW: return realTime(clock) + ahead;
    default: // processor time
        return realTime(clock);
    }
}

timespec parts(std::int64_t nanoseconds)
{
    return {nanoseconds / 1'000'000'000, nanoseconds % 1'000'000'000};
}

} // namespace

extern "C" {

int clock_gettime(clockid_t clock, timespec* result) noexcept
{
    *result = parts(twinTime(clock));
    return 0;
}

time_t time(time_t* result) noexcept
{
    const time_t now = twinTime(CLOCK_REALTIME) / 1'000'000'000;
    if (result) *result = now;
    return now;
}

int gettimeofday(timeval* __restrict result, void*) noexcept
{
    const timespec now = parts(twinTime(CLOCK_REALTIME));
    *result = {now.tv_sec, now.tv_nsec / 1000};
    return 0;
}

/// For timers of CLOCK_MONOTONIC, which are all that the daemon has.
int timerfd_settime(int timer, int flags, const itimerspec* value, itimerspec* old) noexcept
{
    const volatile Numbers& twin = numbers();
    const std::int64_t due = value->it_value.tv_sec * 1'000'000'000 + value->it_value.tv_nsec;
    const std::int64_t start = flags & TFD_TIMER_ABSTIME ? twin.began : 0;
    itimerspec real = *value;
    if (due != 0) real.it_value = parts(start + (due - start) / twin.rate + 1);
    return static_cast<int>(syscall(SYS_timerfd_settime, timer, flags, &real, old));
}
}
