// Time for the host's own lines and deadlines.
#pragma once
#include <cstdint>
#include <ctime>

namespace korvo {
namespace host {

// Milliseconds on the monotonic clock. Every process of the machine shares this
// clock, so the timestamps two local devices print can be compared directly.
inline int64_t monotonicMs() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

}  // namespace host
}  // namespace korvo
