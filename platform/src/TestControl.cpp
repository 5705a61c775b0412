// Test controls of the log and of the microphone (korvo/platform/TestControl.h).
#include <korvo/platform/TestControl.h>

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <deque>
#include <functional>
#include <mutex>

#include "Internal.h"
#include "TestHooks.h"

namespace korvo {
namespace platform {

namespace {

constexpr size_t kDefaultMinFrameCount = 1024;

std::atomic<bool> gCaptureOn{false};
std::atomic<bool> gScriptOn{false};
std::atomic<size_t> gLastMicRequest{0};
std::atomic<size_t> gMinFrameCount{kDefaultMinFrameCount};
std::atomic<android::status_t> gMinFrameCountFailure{android::OK};

struct Controls {
    std::mutex captureLock;
    std::vector<test::LogLine> capturedLines;

    std::mutex micLock;
    std::condition_variable micCond;
    std::deque<int16_t> micSamples;
    std::deque<ssize_t> micResults;
    int micWaiting = 0;  // scripted reads blocked now
    std::function<void()> micStopHook;  // guarded by micLock
};

// Never destroyed: streams and threads may still log or stop during static destruction.
Controls& controls() {
    static Controls* c = new Controls;
    return *c;
}

}  // namespace

namespace detail {

bool logCaptureOn() { return gCaptureOn.load(std::memory_order_relaxed); }

void keepLogLine(int prio, const char* tag, const char* msg, size_t len) {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.captureLock);
    c.capturedLines.push_back(test::LogLine{prio, tag, std::string(msg, len)});
}

bool micScriptOn() { return gScriptOn.load(std::memory_order_acquire); }

ssize_t scriptedMicRead(int16_t* out, size_t bytes, const std::atomic<bool>& stopped) {
    size_t want = bytes / 2;  // whole samples only
    Controls& c = controls();
    std::unique_lock<std::mutex> lock(c.micLock);
    if (!c.micResults.empty()) {
        const ssize_t result = c.micResults.front();
        c.micResults.pop_front();
        if (result <= 0) return result;
        want = std::min(want, static_cast<size_t>(result) / 2);
    }
    auto answerable = [&] {
        return c.micSamples.size() >= want || stopped.load(std::memory_order_acquire) ||
               !gScriptOn.load(std::memory_order_acquire);
    };
    if (!answerable()) {
        ++c.micWaiting;
        c.micCond.wait(lock, answerable);
        --c.micWaiting;
    }
    // Stopped or switched off: what is queued so far, as a stopped device would deliver.
    const size_t n = std::min(want, c.micSamples.size());
    std::copy_n(c.micSamples.begin(), n, out);
    c.micSamples.erase(c.micSamples.begin(), c.micSamples.begin() + static_cast<ptrdiff_t>(n));
    return static_cast<ssize_t>(n * 2);
}

void wakeMicReaders() {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.micLock);
    c.micCond.notify_all();
}

void runMicStopHook() {
    std::function<void()> hook;
    {
        Controls& c = controls();
        std::lock_guard<std::mutex> lock(c.micLock);
        hook = c.micStopHook;
    }
    if (hook) hook();
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
        Controls& c = controls();
        std::lock_guard<std::mutex> lock(c.micLock);
        gScriptOn.store(false, std::memory_order_release);
        c.micSamples.clear();
        c.micResults.clear();
        c.micStopHook = nullptr;
        c.micCond.notify_all();
    }
    gLastMicRequest.store(0, std::memory_order_relaxed);
    gMinFrameCount.store(kDefaultMinFrameCount, std::memory_order_relaxed);
    gMinFrameCountFailure.store(android::OK, std::memory_order_relaxed);
    detail::resetTrackControl();
}

void captureLog(bool on) { gCaptureOn.store(on, std::memory_order_relaxed); }

std::vector<LogLine> logLines() {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.captureLock);
    return c.capturedLines;
}

void clearLog() {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.captureLock);
    c.capturedLines.clear();
}

void scriptMic(bool on) {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.micLock);
    gScriptOn.store(on, std::memory_order_release);
    c.micCond.notify_all();  // readers waiting on the script give up when it goes off
}

void pushMicSamples(const int16_t* samples, size_t count) {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.micLock);
    c.micSamples.insert(c.micSamples.end(), samples, samples + count);
    c.micCond.notify_all();
}

void pushMicResult(ssize_t result) {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.micLock);
    c.micResults.push_back(result);
    c.micCond.notify_all();
}

int micReadersWaiting() {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.micLock);
    return c.micWaiting;
}

size_t lastMicReadRequest() { return gLastMicRequest.load(std::memory_order_relaxed); }

size_t micSamplesQueued() {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.micLock);
    return c.micSamples.size();
}

void onMicStop(std::function<void()> hook) {
    Controls& c = controls();
    std::lock_guard<std::mutex> lock(c.micLock);
    c.micStopHook = std::move(hook);
}

void setMinFrameCount(size_t frames) { gMinFrameCount.store(frames, std::memory_order_relaxed); }

void failMinFrameCount(android::status_t status) {
    gMinFrameCountFailure.store(status, std::memory_order_relaxed);
}

}  // namespace test
}  // namespace platform
}  // namespace korvo
