// Test-control API of the platform stand-in. Used by tests only: it lets a test
// script the microphone exactly, fail platform calls, capture the log in memory
// and drive output tracks by hand. Everything here is process-wide.
#pragma once
#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include <korvo/platform/Export.h>
#include <utils/Errors.h>

namespace android {
class AudioTrack;
}

namespace korvo {
namespace platform {
namespace test {

// Puts back every setting of this API to its default (script off, log capture off,
// no forced failures, automatic playback). Call it from a test's SetUp.
KORVO_PLATFORM_API void resetAll();

// ---- log --------------------------------------------------------------------
struct LogLine {
    int prio;
    std::string tag;
    std::string msg;  // formatted, trailing newlines removed
};
// While on, every log line of every priority is also kept in memory.
KORVO_PLATFORM_API void captureLog(bool on);
KORVO_PLATFORM_API std::vector<LogLine> logLines();  // copy of the kept lines
KORVO_PLATFORM_API void clearLog();

// ---- microphone ---------------------------------------------------------------
// While the script is on, every AudioRecord of the process reads from it instead
// of its route: a blocking read waits (no pacing) until the script can answer.
KORVO_PLATFORM_API void scriptMic(bool on);
// Appends samples to the script's queue.
KORVO_PLATFORM_API void pushMicSamples(const int16_t* samples, size_t count);
// Queues the answer of one future read: a positive value delivers at most that many
// bytes (a short count, taken from the queued samples); 0 or a negative value is
// returned as it is, without delivering anything.
KORVO_PLATFORM_API void pushMicResult(ssize_t result);
// Number of reads currently blocked in the script, and the byte size asked for
// by the newest read (0 before any).
KORVO_PLATFORM_API int micReadersWaiting();
KORVO_PLATFORM_API size_t lastMicReadRequest();
KORVO_PLATFORM_API size_t micSamplesQueued();
// Runs inside every AudioRecord::stop(), before the stream stops (empty: nothing), so a
// test can see what the caller had done by then.
KORVO_PLATFORM_API void onMicStop(std::function<void()> hook);
// Minimum frame count that getMinFrameCount reports (default 1024); a non-zero
// status makes it fail with that status instead.
KORVO_PLATFORM_API void setMinFrameCount(size_t frames);
KORVO_PLATFORM_API void failMinFrameCount(android::status_t status);

// ---- output -------------------------------------------------------------------
// Output sampling rate reported by AudioSystem::getOutputSamplingRate (0: the
// speaker route's own rate); a non-zero status makes it fail instead.
KORVO_PLATFORM_API void setOutputSamplingRate(uint32_t rate);
KORVO_PLATFORM_API void failOutputSamplingRate(android::status_t status);
// Forced results of AudioTrack calls (0: normal behaviour).
KORVO_PLATFORM_API void failTrackSet(android::status_t status);
KORVO_PLATFORM_API void failTrackInitCheck(android::status_t status);
KORVO_PLATFORM_API void failTrackStart(android::status_t status);
// Samples per callback buffer (default: 20 ms at the track's rate).
KORVO_PLATFORM_API void setTrackBufferSamples(size_t samples);
// While paused, playback threads make no callbacks (a device that stopped calling back).
KORVO_PLATFORM_API void pauseTrackCallbacks(bool paused);
// Manual mode: started tracks get no playback thread; the test drives the newest
// started track with pumpTrack. Samples still go to the track's route.
KORVO_PLATFORM_API void manualTrackCallbacks(bool manual);

struct PumpResult {
    bool called = false;         // a callback was made (a track exists, was started, not stopped)
    size_t sizeBytes = 0;        // Buffer::size after the callback
    std::vector<int16_t> samples;  // the whole buffer as the callback left it
};
// Manual mode: calls the callback of the newest started track once with a buffer
// of `samples` samples (default: the configured buffer size).
KORVO_PLATFORM_API PumpResult pumpTrack(size_t samples = 0);
// State of the newest track: started and not stopped.
KORVO_PLATFORM_API bool trackPlaying();
KORVO_PLATFORM_API int tracksCreated();  // tracks constructed since resetAll
KORVO_PLATFORM_API int trackStops();     // stop() calls since resetAll
// Waits (bounded) until the newest track is stopped; false on timeout.
KORVO_PLATFORM_API bool waitTrackStopped(int timeoutMs);

}  // namespace test
}  // namespace platform
}  // namespace korvo
