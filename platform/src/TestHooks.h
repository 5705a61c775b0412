// Hooks by which the log and the capture stream consult the test controls.
#pragma once
#include <sys/types.h>

#include <atomic>
#include <cstddef>
#include <cstdint>

#include <utils/Errors.h>

namespace korvo {
namespace platform {
namespace detail {

// True while the test log capture is on; then keepLogLine stores the line.
bool logCaptureOn();
void keepLogLine(int prio, const char* tag, const char* msg, size_t len);

// True while the scripted microphone replaces the capture routes.
bool micScriptOn();
// Serves one read of `bytes` bytes from the script; returns early with what it has
// when `stopped` becomes true or the script is switched off.
ssize_t scriptedMicRead(int16_t* out, size_t bytes, const std::atomic<bool>& stopped);
// Wakes scripted reads so that they look at their stop flag again.
void wakeMicReaders();
// Runs the test's stop hook, if any.
void runMicStopHook();
// Records the size of the newest capture read.
void noteMicRead(size_t bytes);

// getMinFrameCount's answer: the configured minimum, or the forced failure status.
android::status_t minFrameCount(size_t* frames);

}  // namespace detail
}  // namespace platform
}  // namespace korvo
