// The plug-in's log tags and the first "[%s]" argument of their lines.
//   "TQX": the meter object, capture, analysis and detection; "[%s]" is "SoundMeter",
//          or "WAVEFORM_CANVAS" for the analysis thread's own messages.
//   "MiniToneGenerator": the tone engine and the code plan, which is also their "[%s]".
#pragma once
#include <log/log.h>

namespace korvo {
constexpr const char* kMeterTag = "TQX";
constexpr const char* kMeterWho = "SoundMeter";
constexpr const char* kCanvasWho = "WAVEFORM_CANVAS";
constexpr const char* kToneTag = "MiniToneGenerator";
}  // namespace korvo

// A "TQX" line whose format begins with "[%s]" (or "[%s:%d]"): the argument is filled in.
#define METER_LOG(prio, fmt, ...) \
    __android_log_print(prio, korvo::kMeterTag, fmt, korvo::kMeterWho, ##__VA_ARGS__)
#define METER_LOGD(fmt, ...) METER_LOG(ANDROID_LOG_DEBUG, fmt, ##__VA_ARGS__)
// The analysis thread's own "TQX" lines, "[%s]" being "WAVEFORM_CANVAS".
#define CANVAS_LOG(prio, fmt, ...) \
    __android_log_print(prio, korvo::kMeterTag, fmt, korvo::kCanvasWho, ##__VA_ARGS__)
// Lines of the tone engine and the code plan, as they stand (no argument filled in).
#define TONE_LOGD(...) __android_log_print(ANDROID_LOG_DEBUG, korvo::kToneTag, __VA_ARGS__)
#define TONE_LOGW(...) __android_log_print(ANDROID_LOG_WARN, korvo::kToneTag, __VA_ARGS__)
#define TONE_LOGE(...) __android_log_print(ANDROID_LOG_ERROR, korvo::kToneTag, __VA_ARGS__)
