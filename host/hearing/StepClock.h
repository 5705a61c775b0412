// A listener's clock: capture steps of one frame each, live or offline alike.
#pragma once
#include <cstdint>

#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

// Steps --level auto listens to the room for (1.5 s).
constexpr int kAutoCalibrationSteps = 129;

// Seconds of the microphone's clock after `steps` capture steps.
inline double stepSeconds(int64_t steps) {
    return static_cast<double>(steps) * korvo::kFrameSamples / korvo::kSampleRate;
}

}  // namespace host
}  // namespace korvo
