// Output track of the stand-in: callback mode only. A playback thread per track
// pulls buffers from the callback and writes them to the speaker route, which
// paces it at real time.
#include <media/AudioTrack.h>

#include <algorithm>
#include <chrono>
#include <mutex>
#include <string>
#include <thread>

#include <korvo/platform/Routes.h>
#include <log/log.h>
#include <media/AudioSystem.h>

#include "RouteStatus.h"
#include "TrackShared.h"

namespace android {

using korvo::platform::detail::TrackControl;
using korvo::platform::detail::TrackCore;
using korvo::platform::detail::trackControl;

namespace {

const char* const kTag = "AudioTrack";

void playbackLoop(std::shared_ptr<TrackCore> core) {
    TrackControl& tc = trackControl();
    std::vector<int16_t> buffer;
    for (;;) {
        {
            std::unique_lock<std::mutex> lk(tc.stateMutex);
            tc.stateCond.wait(lk, [&] { return core->exit || (core->active && !tc.paused); });
            if (core->exit) return;
        }
        korvo::platform::detail::runTrackCallback(*core, buffer,
                                                  korvo::platform::detail::trackBufferSamples(*core));
    }
}

}  // namespace

struct AudioTrack::Impl {
    std::shared_ptr<TrackCore> core = std::make_shared<TrackCore>();
    status_t status = NO_INIT;  // result of set()
    bool configured = false;
    std::atomic<float> volume{1.0f};
    // Held while start() stores the thread handle: the new thread's first callback
    // may already drop the track, and its destructor reads the handle.
    std::mutex threadLock;
    std::thread thread;
};

AudioTrack::AudioTrack() : mImpl(new Impl) {
    TrackControl& tc = trackControl();
    tc.created.fetch_add(1, std::memory_order_relaxed);
    std::lock_guard<std::recursive_mutex> reg(tc.registryMutex);
    tc.live.push_back(mImpl->core);
}

AudioTrack::~AudioTrack() {
    TrackControl& tc = trackControl();
    std::shared_ptr<TrackCore> core = mImpl->core;
    {
        // Waits for a pumped callback of this track to end.
        std::lock_guard<std::recursive_mutex> reg(tc.registryMutex);
        tc.live.erase(std::remove(tc.live.begin(), tc.live.end(), core), tc.live.end());
        if (tc.newestStarted == core) tc.newestStarted.reset();
    }
    {
        std::lock_guard<std::mutex> lk(tc.stateMutex);
        core->exit = true;
        core->active = false;
    }
    tc.stateCond.notify_all();
    if (core->route) core->route->stop();  // a paced write returns at once
    std::thread thread;
    {
        std::lock_guard<std::mutex> lk(mImpl->threadLock);
        thread = std::move(mImpl->thread);
    }
    if (thread.joinable()) {
        // Dropped from inside its own callback: the thread ends by itself once the
        // callback returns, and keeps the core alive until then.
        if (thread.get_id() == std::this_thread::get_id()) {
            thread.detach();
        } else {
            thread.join();
        }
    }
}

status_t AudioTrack::set(audio_stream_type_t streamType, uint32_t sampleRate, audio_format_t format,
                         audio_channel_mask_t channelMask, size_t frameCount,
                         audio_output_flags_t flags, callback_t cbf, void* user,
                         int32_t notificationFrames, const sp<IMemory>& sharedBuffer,
                         bool threadCanCallJava, audio_session_t sessionId,
                         transfer_type transferType, const audio_offload_info_t* offloadInfo,
                         int uid, pid_t pid, const audio_attributes_t* pAttributes,
                         bool doNotReconnect, float maxRequiredSpeed) {
    TrackControl& tc = trackControl();
    Impl& d = *mImpl;
    if (d.configured) return INVALID_OPERATION;

    status_t forced = tc.failSet.load(std::memory_order_relaxed);
    if (forced != OK) {
        d.status = forced;
        return forced;
    }
    // Only what the engine uses: mono 16-bit PCM.
    if ((format != AUDIO_FORMAT_PCM_16_BIT && format != AUDIO_FORMAT_DEFAULT) ||
        channelMask != AUDIO_CHANNEL_OUT_MONO) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "set: only mono 16-bit PCM is supported");
        d.status = BAD_VALUE;
        return BAD_VALUE;
    }
    uint32_t rate = sampleRate;
    if (rate == 0) {
        status_t st = AudioSystem::getOutputSamplingRate(&rate, streamType);
        if (st != OK || rate == 0) {
            __android_log_print(ANDROID_LOG_ERROR, kTag, "set: output sampling rate unknown (%d)", st);
            d.status = st != OK ? st : BAD_VALUE;
            return d.status;
        }
    }
    using korvo::platform::detail::Stream;
    const std::string routeText = korvo::platform::speakerRoute();
    korvo::platform::detail::noteRoute(Stream::Speaker, routeText);
    std::string error;
    std::unique_ptr<korvo::platform::OutputRoute> route = korvo::platform::makeOutputRoute(routeText, &error);
    if (!route) {
        __android_log_print(ANDROID_LOG_ERROR, kTag, "set: speaker route %s: %s", routeText.c_str(), error.c_str());
        korvo::platform::detail::noteFailure(Stream::Speaker, routeText + ": " + error);
        d.status = BAD_VALUE;
        return BAD_VALUE;
    }
    int opened = route->open(rate);
    if (opened != 0) {
        const std::string cause = route->failure();
        __android_log_print(ANDROID_LOG_ERROR, kTag, "set: speaker route %s did not open: %s (status %d)",
                            routeText.c_str(), cause.c_str(), opened);
        korvo::platform::detail::noteFailure(
            Stream::Speaker, routeText + ": " + (cause.empty() ? "cannot open (status " + std::to_string(opened) + ")" : cause));
        d.status = BAD_VALUE;
        return BAD_VALUE;
    }
    // frameCount is the device's whole buffer; callback buffers stay 20 ms here.
    d.core->cbf = cbf;
    d.core->user = user;
    d.core->sampleRate = rate;
    d.core->route = std::move(route);
    d.core->routeText = routeText;
    d.configured = true;
    d.status = OK;
    return OK;
}

status_t AudioTrack::initCheck() const {
    status_t forced = trackControl().failInitCheck.load(std::memory_order_relaxed);
    return forced != OK ? forced : mImpl->status;
}

status_t AudioTrack::setVolume(float volume) {
    if (!(volume >= 0.0f && volume <= 1.0f)) return BAD_VALUE;
    // Kept for getVolume only: the route receives the samples as the callback made them.
    mImpl->volume.store(volume, std::memory_order_relaxed);
    return OK;
}

float AudioTrack::getVolume() const { return mImpl->volume.load(std::memory_order_relaxed); }

status_t AudioTrack::start() {
    TrackControl& tc = trackControl();
    Impl& d = *mImpl;
    if (d.status != OK) return d.status;
    status_t forced = tc.failStart.load(std::memory_order_relaxed);
    if (forced != OK) return forced;
    {
        std::lock_guard<std::recursive_mutex> reg(tc.registryMutex);
        tc.newestStarted = d.core;
        std::lock_guard<std::mutex> lk(tc.stateMutex);
        d.core->active = true;
    }
    tc.stateCond.notify_all();
    // In manual mode the test pumps the callbacks; a later start in automatic mode
    // still gets its thread.
    std::lock_guard<std::mutex> lk(d.threadLock);
    if (!d.thread.joinable() && !tc.manual.load(std::memory_order_relaxed)) {
        d.thread = std::thread(playbackLoop, d.core);
    }
    return OK;
}

void AudioTrack::stop() {
    TrackControl& tc = trackControl();
    tc.stops.fetch_add(1, std::memory_order_relaxed);
    {
        std::lock_guard<std::mutex> lk(tc.stateMutex);
        mImpl->core->active = false;
    }
    tc.stateCond.notify_all();
}

bool AudioTrack::stopped() const {
    TrackControl& tc = trackControl();
    std::lock_guard<std::mutex> lk(tc.stateMutex);
    return !mImpl->core->active;
}

uint32_t AudioTrack::getSampleRate() const { return mImpl->core->sampleRate; }

}  // namespace android

namespace korvo {
namespace platform {
namespace detail {

size_t trackBufferSamples(const TrackCore& core) {
    size_t n = trackControl().bufferSamples.load(std::memory_order_relaxed);
    if (n != 0) return n;
    n = static_cast<size_t>(core.sampleRate) * 20 / 1000;
    return n != 0 ? n : 1;
}

size_t runTrackCallback(TrackCore& core, std::vector<int16_t>& buffer, size_t samples) {
    buffer.assign(samples, 0);
    android::AudioTrack::Buffer b;
    b.frameCount = samples;
    b.size = samples * sizeof(int16_t);
    b.i16 = buffer.data();
    if (core.cbf) core.cbf(android::AudioTrack::EVENT_MORE_DATA, core.user, &b);
    size_t produced = std::min(b.size, samples * sizeof(int16_t)) / sizeof(int16_t);
    if (!core.route) return b.size;
    int written;
    if (produced != 0) {
        written = core.route->write(buffer.data(), produced);
    } else {
        // Nothing produced: the timeline goes on with silence, written from the same buffer
        // so that the playback thread allocates nothing per callback.
        std::fill(buffer.begin(), buffer.end(), 0);
        written = core.route->write(buffer.data(), samples);
    }
    if (written < 0) {
        noteFailure(Stream::Speaker, core.routeText + ": " + core.route->failure());
        // A broken loudspeaker: the callbacks keep their real-time pace, nothing is played.
        const size_t n = produced != 0 ? produced : samples;
        TrackControl& tc = trackControl();
        std::unique_lock<std::mutex> lk(tc.stateMutex);
        tc.stateCond.wait_for(lk, std::chrono::microseconds(static_cast<int64_t>(n) * 1000000 / core.sampleRate),
                              [&] { return core.exit; });
    }
    return b.size;
}

}  // namespace detail
}  // namespace platform
}  // namespace korvo
