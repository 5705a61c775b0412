// Output-track part of the test-control API.
#include <korvo/platform/TestControl.h>

#include <chrono>

#include "Internal.h"
#include "TrackShared.h"

namespace korvo {
namespace platform {
namespace detail {

TrackControl& trackControl() {
    // Never destroyed: tracks may outlive static destruction at exit.
    static TrackControl* const control = new TrackControl;
    return *control;
}

void resetTrackControl() {
    TrackControl& tc = trackControl();
    tc.outputRate.store(0);
    tc.failRate.store(0);
    tc.failSet.store(0);
    tc.failInitCheck.store(0);
    tc.failStart.store(0);
    tc.bufferSamples.store(0);
    tc.manual.store(false);
    tc.created.store(0);
    tc.stops.store(0);
    {
        std::lock_guard<std::mutex> lk(tc.stateMutex);
        tc.paused = false;
    }
    tc.stateCond.notify_all();
}

}  // namespace detail

namespace test {

using detail::TrackControl;
using detail::TrackCore;
using detail::trackControl;

void setOutputSamplingRate(uint32_t rate) { trackControl().outputRate.store(rate); }
void failOutputSamplingRate(android::status_t status) { trackControl().failRate.store(status); }
void failTrackSet(android::status_t status) { trackControl().failSet.store(status); }
void failTrackInitCheck(android::status_t status) { trackControl().failInitCheck.store(status); }
void failTrackStart(android::status_t status) { trackControl().failStart.store(status); }
void setTrackBufferSamples(size_t samples) { trackControl().bufferSamples.store(samples); }

void pauseTrackCallbacks(bool paused) {
    TrackControl& tc = trackControl();
    {
        std::lock_guard<std::mutex> lk(tc.stateMutex);
        tc.paused = paused;
    }
    tc.stateCond.notify_all();
}

void manualTrackCallbacks(bool manual) { trackControl().manual.store(manual); }

PumpResult pumpTrack(size_t samples) {
    TrackControl& tc = trackControl();
    PumpResult result;
    std::lock_guard<std::recursive_mutex> reg(tc.registryMutex);
    std::shared_ptr<TrackCore> core = tc.newestStarted;
    if (!core) return result;
    {
        std::lock_guard<std::mutex> lk(tc.stateMutex);
        if (!core->active) return result;
    }
    size_t n = samples != 0 ? samples : detail::trackBufferSamples(*core);
    result.sizeBytes = detail::runTrackCallback(*core, result.samples, n);
    result.called = true;
    return result;
}

namespace {
std::shared_ptr<TrackCore> newestTrack() {
    TrackControl& tc = trackControl();
    std::lock_guard<std::recursive_mutex> reg(tc.registryMutex);
    return tc.live.empty() ? nullptr : tc.live.back();
}
}  // namespace

bool trackPlaying() {
    std::shared_ptr<TrackCore> core = newestTrack();
    if (!core) return false;
    TrackControl& tc = trackControl();
    std::lock_guard<std::mutex> lk(tc.stateMutex);
    return core->active;
}

int tracksCreated() { return trackControl().created.load(); }
int trackStops() { return trackControl().stops.load(); }

bool waitTrackStopped(int timeoutMs) {
    std::shared_ptr<TrackCore> core = newestTrack();
    if (!core) return true;
    TrackControl& tc = trackControl();
    std::unique_lock<std::mutex> lk(tc.stateMutex);
    return tc.stateCond.wait_for(lk, std::chrono::milliseconds(timeoutMs),
                                 [&] { return !core->active; });
}

}  // namespace test
}  // namespace platform
}  // namespace korvo
