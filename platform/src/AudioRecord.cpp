// Microphone capture stream on the process's capture route, or on the test script.
#include <media/AudioRecord.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>

#include <korvo/platform/Routes.h>
#include <log/log.h>

#include "RouteStatus.h"
#include "TestHooks.h"

namespace android {

namespace {

constexpr const char* kTag = "AudioRecord";
constexpr uint32_t kDefaultSampleRate = 44100;

uint32_t channelCountOf(audio_channel_mask_t mask) {
    if (mask & AUDIO_CHANNEL_INDEX_HDR) return static_cast<uint32_t>(__builtin_popcount(mask & ~AUDIO_CHANNEL_INDEX_HDR));
    return static_cast<uint32_t>(__builtin_popcount(mask));
}

size_t bytesPerSampleOf(audio_format_t format) {
    switch (format) {
        case AUDIO_FORMAT_PCM_16_BIT: return 2;
        case AUDIO_FORMAT_PCM_32_BIT:
        case AUDIO_FORMAT_PCM_8_24_BIT:
        case AUDIO_FORMAT_PCM_FLOAT: return 4;
        default: return 1;
    }
}

}  // namespace

struct AudioRecord::Impl {
    std::mutex stateLock;  // start and stop
    std::mutex readLock;   // held by a read; start waits for it, so a route never reopens mid-read
    std::unique_ptr<korvo::platform::CaptureRoute> route;
    status_t status = NO_INIT;
    bool configured = false;
    uint32_t sampleRate = 0;
    audio_format_t format = AUDIO_FORMAT_DEFAULT;
    audio_channel_mask_t channelMask = AUDIO_CHANNEL_NONE;
    size_t frameCount = 0;
    callback_t callback = nullptr;  // kept only: a synchronous stream has no events to report
    void* user = nullptr;
    // True while not started; a read that sees it returns, and stop() sets it to end a read.
    std::atomic<bool> stopped{true};
    std::string routeText;

    // A read that cannot deliver (no route, not started, the route failed) returns only
    // after the time its samples would take, as a broken microphone would; a stop ends
    // the wait at once.
    std::mutex paceLock;
    std::condition_variable paceCond;
    uint64_t stopCount = 0;  // guarded by paceLock

    void paceFailedRead(size_t samples) {
        const uint32_t rate = sampleRate != 0 ? sampleRate : kDefaultSampleRate;
        const auto until = std::chrono::steady_clock::now() +
                           std::chrono::microseconds(static_cast<int64_t>(samples) * 1000000 / rate);
        std::unique_lock<std::mutex> lock(paceLock);
        const uint64_t stops = stopCount;
        paceCond.wait_until(lock, until, [&] { return stopCount != stops; });
    }
    void failed(const std::string& cause) {
        korvo::platform::detail::noteFailure(korvo::platform::detail::Stream::Microphone, routeText + ": " + cause);
    }
};

status_t AudioRecord::getMinFrameCount(size_t* frameCount, uint32_t /*sampleRate*/,
                                       audio_format_t /*format*/, audio_channel_mask_t /*channelMask*/) {
    if (!frameCount) return BAD_VALUE;
    return korvo::platform::detail::minFrameCount(frameCount);
}

AudioRecord::AudioRecord(const String16& /*opPackageName*/) : mImpl(std::make_unique<Impl>()) {}

AudioRecord::~AudioRecord() { stop(); }

status_t AudioRecord::set(audio_source_t /*inputSource*/, uint32_t sampleRate, audio_format_t format,
                          audio_channel_mask_t channelMask, size_t frameCount, callback_t cbf,
                          void* user, uint32_t /*notificationFrames*/, bool /*threadCanCallJava*/,
                          audio_session_t /*sessionId*/, transfer_type /*transferType*/,
                          audio_input_flags_t /*flags*/, int /*uid*/, pid_t /*pid*/,
                          const audio_attributes_t* /*pAttributes*/) {
    Impl& d = *mImpl;
    if (d.configured) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "set() called twice");
        return INVALID_OPERATION;
    }
    d.configured = true;
    if (format == AUDIO_FORMAT_DEFAULT) format = AUDIO_FORMAT_PCM_16_BIT;
    if (channelMask == AUDIO_CHANNEL_NONE) channelMask = AUDIO_CHANNEL_IN_MONO;
    d.sampleRate = sampleRate ? sampleRate : kDefaultSampleRate;
    d.format = format;
    d.channelMask = channelMask;
    d.callback = cbf;
    d.user = user;
    if (frameCount == 0) {
        const status_t st = getMinFrameCount(&frameCount, d.sampleRate, format, channelMask);
        if (st != OK) {
            __android_log_print(ANDROID_LOG_ERROR, kTag, "no minimum frame count: status %d", st);
            d.status = st;
            return st;
        }
    }
    d.frameCount = frameCount;

    // The routes deliver 16-bit mono samples only.
    if (format != AUDIO_FORMAT_PCM_16_BIT || channelCountOf(channelMask) != 1) {
        __android_log_print(ANDROID_LOG_ERROR, kTag,
                            "unsupported format %#x / channel mask %#x (16-bit mono only)",
                            static_cast<unsigned>(format), static_cast<unsigned>(channelMask));
        d.status = BAD_VALUE;
        return BAD_VALUE;
    }

    d.routeText = korvo::platform::micRoute();
    korvo::platform::detail::noteRoute(korvo::platform::detail::Stream::Microphone, d.routeText);
    std::string error;
    d.route = korvo::platform::makeCaptureRoute(d.routeText, &error);
    if (!d.route) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "capture route %s: %s", d.routeText.c_str(), error.c_str());
        d.failed(error);
        d.status = NO_INIT;
        return NO_INIT;
    }
    d.status = OK;
    return OK;
}

status_t AudioRecord::initCheck() const { return mImpl->status; }

status_t AudioRecord::start(AudioSystem::sync_event_t /*event*/, audio_session_t /*triggerSession*/) {
    Impl& d = *mImpl;
    std::lock_guard<std::mutex> state(d.stateLock);
    if (d.status != OK) return d.status;
    if (!d.stopped.load(std::memory_order_acquire)) return OK;  // already capturing
    // A read that saw the stream running is being interrupted; let it leave the route first.
    std::lock_guard<std::mutex> reading(d.readLock);
    const int rc = d.route->open(d.sampleRate);
    if (rc < 0) {
        const std::string cause = d.route->failure();
        __android_log_print(ANDROID_LOG_ERROR, kTag, "capture route %s did not open: %s (status %d)",
                            d.routeText.c_str(), cause.c_str(), rc);
        d.failed(cause.empty() ? "cannot open (status " + std::to_string(rc) + ")" : cause);
        return rc;
    }
    d.stopped.store(false, std::memory_order_release);
    return OK;
}

void AudioRecord::stop() {
    korvo::platform::detail::runMicStopHook();
    Impl& d = *mImpl;
    std::lock_guard<std::mutex> state(d.stateLock);
    {
        std::lock_guard<std::mutex> pace(d.paceLock);
        ++d.stopCount;
    }
    d.paceCond.notify_all();
    if (d.stopped.exchange(true, std::memory_order_acq_rel)) return;
    if (d.route) d.route->stop();
    korvo::platform::detail::wakeMicReaders();
}

bool AudioRecord::stopped() const { return mImpl->stopped.load(std::memory_order_acquire); }

ssize_t AudioRecord::read(void* buffer, size_t size, bool blocking) {
    Impl& d = *mImpl;
    const size_t samples = size / sizeof(int16_t);
    if (d.status != OK) {
        d.paceFailedRead(samples);
        return NO_INIT;
    }
    // The library reads synchronously only; a non-blocking read has nothing to offer here.
    if (!blocking) return INVALID_OPERATION;
    if (!buffer || reinterpret_cast<uintptr_t>(buffer) % alignof(int16_t) != 0) return BAD_VALUE;
    korvo::platform::detail::noteMicRead(size);
    auto* out = static_cast<int16_t*>(buffer);
    if (korvo::platform::detail::micScriptOn()) {
        std::lock_guard<std::mutex> reading(d.readLock);
        if (d.stopped.load(std::memory_order_acquire)) return 0;
        return korvo::platform::detail::scriptedMicRead(out, size, d.stopped);
    }

    ssize_t n = 0;
    {
        std::lock_guard<std::mutex> reading(d.readLock);
        if (!d.stopped.load(std::memory_order_acquire)) {
            n = d.route->read(out, samples);
            if (n < 0) d.failed(d.route->failure());
            const korvo::platform::SourceProgress progress = d.route->progress();
            if (progress.finite) korvo::platform::detail::noteProgress(progress);
            if (n >= 0) return n * static_cast<ssize_t>(sizeof(int16_t));
        }
    }
    // Not started (or stopped) or failed: nothing to deliver, at the pace of a microphone.
    d.paceFailedRead(samples);
    return n;
}

size_t AudioRecord::frameCount() const { return mImpl->frameCount; }

size_t AudioRecord::frameSize() const {
    const Impl& d = *mImpl;
    if (!d.configured) return 0;
    return channelCountOf(d.channelMask) * bytesPerSampleOf(d.format);
}

uint32_t AudioRecord::getSampleRate() const { return mImpl->sampleRate; }

}  // namespace android
