// The one clock the daemon measures its waits with: monotonic, so that a
// change of the wall clock neither stretches nor cuts a wait.
#pragma once

#include <cstdint>
#include <ctime>

// Microseconds on the monotonic clock.
inline std::int64_t ClockMonotonicUs()
{
    timespec now {};
    clock_gettime(CLOCK_MONOTONIC, &now);
    return static_cast<std::int64_t>(now.tv_sec) * 1000000 + now.tv_nsec / 1000;
}
