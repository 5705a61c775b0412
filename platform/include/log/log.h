// The platform log. One call writes one line "P/TAG: message".
//
// Where the lines go is chosen per process by the environment:
//   KORVO_LOG       off | stderr | PATH (appended)
//   KORVO_LOG_LEVEL V | D | I | W | E, the lowest priority written
#pragma once

#include <korvo/platform/Export.h>

typedef enum android_LogPriority {
    ANDROID_LOG_UNKNOWN = 0,
    ANDROID_LOG_DEFAULT,
    ANDROID_LOG_VERBOSE,  // 2
    ANDROID_LOG_DEBUG,    // 3
    ANDROID_LOG_INFO,     // 4
    ANDROID_LOG_WARN,     // 5
    ANDROID_LOG_ERROR,    // 6
    ANDROID_LOG_FATAL,    // 7
    ANDROID_LOG_SILENT,   // 8
} android_LogPriority;

#ifdef __cplusplus
extern "C" {
#endif

KORVO_PLATFORM_API int __android_log_print(int prio, const char* tag, const char* fmt, ...)
    __attribute__((format(printf, 3, 4)));

#ifdef __cplusplus
}
#endif
