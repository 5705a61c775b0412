// Test controls of the log and of the microphone (korvo/platform/TestControl.h).
#include <korvo/platform/TestControl.h>

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <deque>
#include <mutex>

#include "Internal.h"
#include "TestHooks.h"

namespace korvo {
namespace platform {

namespace {

constexpr size_t kDefaultMinFrameCount = 1024;

// ---- log capture
std::atomic<bool> gCaptureOn{false};
std::mutex gCaptureLock;
std::vector<test::LogLine> gCapturedLines;

// ---- scripted microphone
std::atomic<bool> gScriptOn{false};
std::mutex gMicLock;
std::condition_variable gMicCond;
std::deque<int16_t> gMicSamples;
std::deque<ssize_t> gMicResults;
int gMicWaiting = 0;
std::atomic<size_t> gLastMicRequest{0};

std::atomic<size_t> gMinFrameCount{kDefaultMinFrameCount};
std::atomic<android::status_t> gMinFrameCountFailure{android::OK};

}  // namespace

namespace detail {

bool logCaptureOn() { return gCaptureOn.load(std::memory_order_relaxed); }

void keepLogLine(int prio, const char* tag, const char* msg, size_t len) {
    std::lock_guard<std::mutex> lock(gCaptureLock);
    gCapturedLines.push_back(test::LogLine{prio, tag, std::string(msg, len)});
}

bool micScriptOn() { return gScriptOn.load(std::memory_order_acquire); }

ssize_t scriptedMicRead(int16_t* out, size_t bytes, const std::atomic<bool>& stopped) {
    size_t want = bytes / 2;  // whole samples only
    std::unique_lock<std::mutex> lock(gMicLock);
    if (!gMicResults.empty()) {
        const ssize_t result = gMicResults.front();
        gMicResults.pop_front();
        if (result <= 0) return result;
        want = std::min(want, static_cast<size_t>(result) / 2);
    }
    auto answerable = [&] {
        return gMicSamples.size() >= want || stopped.load(std::memory_order_acquire) ||
               !gScriptOn.load(std::memory_order_acquire);
    };
    if (!answerable()) {
        ++gMicWaiting;
        gMicCond.wait(lock, answerable);
        --gMicWaiting;
    }
    // Stopped or switched off: what is queued so far, as a stopped device would deliver.
    const size_t n = std::min(want, gMicSamples.size());
    std::copy_n(gMicSamples.begin(), n, out);
    gMicSamples.erase(gMicSamples.begin(), gMicSamples.begin() + static_cast<ptrdiff_t>(n));
    return static_cast<ssize_t>(n * 2);
}

void wakeMicReaders() {
    std::lock_guard<std::mutex> lock(gMicLock);
    gMicCond.notify_all();
}

void noteMicRead(size_t bytes) { gLastMicRequest.store(bytes, std::memory_order_relaxed); }

android::status_t minFrameCount(size_t* frames) {
    const android::status_t failure = gMinFrameCountFailure.load(std::memory_order_relaxed);
    if (failure != android::OK) return failure;
    *frames = gMinFrameCount.load(std::memory_order_relaxed);
    return android::OK;
}

}  // namespace detail

namespace test {

void resetAll() {
    captureLog(false);
    clearLog();
    {
        std::lock_guard<std::mutex> lock(gMicLock);
        gScriptOn.store(false, std::memory_order_release);
        gMicSamples.clear();
        gMicResults.clear();
        gMicCond.notify_all();
    }
    gLastMicRequest.store(0, std::memory_order_relaxed);
    gMinFrameCount.store(kDefaultMinFrameCount, std::memory_order_relaxed);
    gMinFrameCountFailure.store(android::OK, std::memory_order_relaxed);
    detail::resetTrackControl();
}

void captureLog(bool on) { gCaptureOn.store(on, std::memory_order_relaxed); }

std::vector<LogLine> logLines() {
    std::lock_guard<std::mutex> lock(gCaptureLock);
    return gCapturedLines;
}

void clearLog() {
    std::lock_guard<std::mutex> lock(gCaptureLock);
    gCapturedLines.clear();
}

void scriptMic(bool on) {
    std::lock_guard<std::mutex> lock(gMicLock);
    gScriptOn.store(on, std::memory_order_release);
    gMicCond.notify_all();  // readers waiting on the script give up when it goes off
}

void pushMicSamples(const int16_t* samples, size_t count) {
    std::lock_guard<std::mutex> lock(gMicLock);
    gMicSamples.insert(gMicSamples.end(), samples, samples + count);
    gMicCond.notify_all();
}

void pushMicResult(ssize_t result) {
    std::lock_guard<std::mutex> lock(gMicLock);
    gMicResults.push_back(result);
    gMicCond.notify_all();
}

int micReadersWaiting() {
    std::lock_guard<std::mutex> lock(gMicLock);
    return gMicWaiting;
}

size_t lastMicReadRequest() { return gLastMicRequest.load(std::memory_order_relaxed); }

size_t micSamplesQueued() {
    std::lock_guard<std::mutex> lock(gMicLock);
    return gMicSamples.size();
}

void setMinFrameCount(size_t frames) { gMinFrameCount.store(frames, std::memory_order_relaxed); }

void failMinFrameCount(android::status_t status) {
    gMinFrameCountFailure.store(status, std::memory_order_relaxed);
}

}  // namespace test
}  // namespace platform
}  // namespace korvo
