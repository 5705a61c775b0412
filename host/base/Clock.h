// Time for the host's own lines and deadlines, and the microphone's clock of capture steps.
#pragma once
#include <cstdint>
#include <ctime>

#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

// Milliseconds on the monotonic clock. Every process of the machine shares this
// clock, so the timestamps two local devices print can be compared directly.
inline int64_t monotonicMs() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

// Seconds of the microphone's clock after `steps` capture steps of one frame each, live or
// offline alike.
inline double stepSeconds(int64_t steps) {
    return static_cast<double>(steps) * korvo::kFrameSamples / korvo::kSampleRate;
}

}  // namespace host
}  // namespace korvo
