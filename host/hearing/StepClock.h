// A listener's clock: capture steps of one frame each, live or offline alike.
#pragma once
#include <cstdint>

#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

// Capture steps a device makes before it listens (151 ms): five frames of 11.6 ms fill
// the ring, and the analysis thread, one frame per 20 ms turn, takes frames that were
// captured. A count of steps, not a time: a recording loses the same frames live and offline.
constexpr int kWarmUpSteps = 13;
// Steps --level auto listens to the room for (1.5 s).
constexpr int kAutoCalibrationSteps = 129;

// Seconds of the microphone's clock after `steps` capture steps.
inline double stepSeconds(int64_t steps) {
    return static_cast<double>(steps) * korvo::kFrameSamples / korvo::kSampleRate;
}

}  // namespace host
}  // namespace korvo
