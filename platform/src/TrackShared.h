// What AudioTrack.cpp, AudioSystem.cpp and TrackControl.cpp share: the playback
// side of an output track and the process-wide output-track controls.
#pragma once
#include <atomic>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <korvo/platform/Routes.h>
#include <media/AudioTrack.h>
#include <utils/Errors.h>

namespace korvo {
namespace platform {
namespace detail {

// The playback side of one output track. Shared by the track object, its playback
// thread (which outlives a track destroyed on that very thread) and the registry.
struct TrackCore {
    // Written by set() before the track can be started; read-only afterwards.
    android::AudioTrack::callback_t cbf = nullptr;
    void* user = nullptr;
    uint32_t sampleRate = 0;
    std::unique_ptr<OutputRoute> route;
    std::string routeText;

    // Guarded by TrackControl::stateMutex.
    bool active = false;  // started and not stopped
    bool exit = false;    // the track is gone: its playback thread ends
};

struct TrackControl {
    // Test settings (0 / false: normal behaviour).
    std::atomic<uint32_t> outputRate{0};
    std::atomic<android::status_t> failRate{0};
    std::atomic<android::status_t> failSet{0};
    std::atomic<android::status_t> failInitCheck{0};
    std::atomic<android::status_t> failStart{0};
    std::atomic<size_t> bufferSamples{0};
    std::atomic<bool> manual{false};
    std::atomic<int> created{0};
    std::atomic<int> stops{0};

    // Run state of every track. Never held across a callback or a route write.
    std::mutex stateMutex;
    std::condition_variable stateCond;
    bool paused = false;

    // Live tracks in creation order, and the newest started one. A pumped callback
    // runs with this held and a track's destructor takes it, so a track cannot be
    // destroyed under a pumped callback. Recursive: a callback may drop its track.
    // Lock order: registryMutex, then the callback's own locks, then stateMutex.
    std::recursive_mutex registryMutex;
    std::vector<std::shared_ptr<TrackCore>> live;
    std::shared_ptr<TrackCore> newestStarted;
};

TrackControl& trackControl();

// Samples per callback buffer of the track: the test setting, else 20 ms.
size_t trackBufferSamples(const TrackCore& core);

// Makes one EVENT_MORE_DATA callback into `buffer` (resized to `samples`, zeroed)
// and writes what it produced to the route, or silence of the buffer length when
// it produced nothing. Returns Buffer::size as the callback left it; `buffer`
// keeps the samples as the callback left them.
size_t runTrackCallback(TrackCore& core, std::vector<int16_t>& buffer, size_t samples);

}  // namespace detail
}  // namespace platform
}  // namespace korvo
