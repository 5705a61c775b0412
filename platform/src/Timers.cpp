// Clock readings in nanoseconds.
#include <utils/Timers.h>

#include <ctime>

nsecs_t systemTime(int clock) {
    clockid_t id;
    switch (clock) {
        case SYSTEM_TIME_REALTIME: id = CLOCK_REALTIME; break;
        case SYSTEM_TIME_PROCESS: id = CLOCK_PROCESS_CPUTIME_ID; break;
        case SYSTEM_TIME_THREAD: id = CLOCK_THREAD_CPUTIME_ID; break;
        case SYSTEM_TIME_BOOTTIME: id = CLOCK_BOOTTIME; break;
        case SYSTEM_TIME_MONOTONIC:
        default: id = CLOCK_MONOTONIC; break;  // unknown clocks read the monotonic one
    }
    timespec t{};
    clock_gettime(id, &t);
    return static_cast<nsecs_t>(t.tv_sec) * 1000000000LL + t.tv_nsec;
}
