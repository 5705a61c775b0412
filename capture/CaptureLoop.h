// Deadline arithmetic of the capture step's wait for the analysis thread.
#pragma once
#include <time.h>

#include <cstdint>

namespace korvo {

// Nanoseconds to wait: 1000 × sleep − elapsed, at least 5000.
int64_t captureWaitNs(int64_t sleep, int64_t elapsedNs);
// now + w nanoseconds, with the nanosecond field carried below one second.
struct timespec captureDeadline(const struct timespec& now, int64_t waitNs);

}  // namespace korvo
