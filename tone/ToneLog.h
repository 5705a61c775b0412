// Log helpers of the tone engine: one tag for the engine, the callback and the
// wave generator, and the monotonic milliseconds printed in its messages.
#pragma once
#include <cstdint>

#include <log/log.h>
#include <utils/Timers.h>

#define TONE_LOG_TAG "MiniToneGenerator"
#define TONE_LOGD(...) __android_log_print(ANDROID_LOG_DEBUG, TONE_LOG_TAG, __VA_ARGS__)
#define TONE_LOGW(...) __android_log_print(ANDROID_LOG_WARN, TONE_LOG_TAG, __VA_ARGS__)
#define TONE_LOGE(...) __android_log_print(ANDROID_LOG_ERROR, TONE_LOG_TAG, __VA_ARGS__)

namespace android {

// Monotonic clock in milliseconds, as a 32-bit signed value for "%d".
inline int toneNowMs() { return static_cast<int32_t>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000); }

}  // namespace android
