// The monotonic milliseconds printed in the tone engine's messages (its tag and
// log macros are the plug-in's, in LogTags.h).
#pragma once
#include <cstdint>

#include <utils/Timers.h>

#include "common/LogTags.h"

namespace android {

// Monotonic clock in milliseconds, as a 32-bit signed value for "%d".
inline int toneNowMs() { return static_cast<int32_t>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000); }

}  // namespace android
