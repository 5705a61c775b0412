// Clock access in nanoseconds.
#pragma once
#include <cstdint>

#include <korvo/platform/Export.h>

typedef int64_t nsecs_t;

enum {
    SYSTEM_TIME_REALTIME = 0,
    SYSTEM_TIME_MONOTONIC = 1,
    SYSTEM_TIME_PROCESS = 2,
    SYSTEM_TIME_THREAD = 3,
    SYSTEM_TIME_BOOTTIME = 4,
};

// Current time of the given clock in nanoseconds.
KORVO_PLATFORM_API nsecs_t systemTime(int clock = SYSTEM_TIME_MONOTONIC);

inline nsecs_t nanoseconds_to_milliseconds(nsecs_t t) { return t / 1000000; }
