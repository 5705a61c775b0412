// One step of capture: a blocking read into the five-slot ring; a completed
// slot is published to the shared record and the analysis thread gets its turn.
#include <pthread.h>
#include <time.h>

#include <cstring>

#include <utils/Timers.h>

#include "capture/CaptureLoop.h"
#include "capture/FrameExchange.h"
#include "common/LogTags.h"

using korvo::kRingSlots;
#include "meter/SoundMeter.h"

namespace korvo {

int64_t captureWaitNs(int64_t sleepMs, int64_t elapsedNs) {
    // In nanoseconds: 1000 × sleep is 11 µs, so the wait is nearly always the 5 µs floor.
    int64_t w = 1000 * sleepMs - elapsedNs;
    return w < 5000 ? 5000 : w;
}

struct timespec captureDeadline(const struct timespec& now, int64_t waitNs) {
    struct timespec deadline = now;
    deadline.tv_sec += static_cast<time_t>(waitNs / 1000000000);
    deadline.tv_nsec += static_cast<long>(waitNs % 1000000000);
    if (deadline.tv_nsec > 999999999) {
        deadline.tv_sec += 1;
        deadline.tv_nsec -= 1000000000;
    }
    return deadline;
}

}  // namespace korvo

void SoundMeter::processAudio() {
    if (recordState.load(std::memory_order_relaxed) == 0) return;
    const nsecs_t t0 = systemTime(SYSTEM_TIME_MONOTONIC);
    if (recordState.load(std::memory_order_relaxed) == 0) return;

    const int32_t fill = frameFill.load(std::memory_order_relaxed);
    frameRemaining = frameSamples - fill;
    fillAtRead = fill;
    const int32_t slot = ringIndex.load(std::memory_order_relaxed);

    pthread_mutex_lock(&AudioBufferLock);

    const uint32_t streamBytes = static_cast<uint32_t>(audioRecord->frameCount()) *
                                 static_cast<uint32_t>(audioRecord->frameSize());
    uint32_t request = static_cast<uint32_t>(2 * frameRemaining);
    if (streamBytes < request) request = streamBytes;
    int16_t* target = &pcmRing[slot * frameSamples + fillAtRead];
    const ssize_t r = audioRecord->read(target, request, true);

    if (recordState.load(std::memory_order_relaxed) == 0) {
        pthread_mutex_unlock(&AudioBufferLock);
        return;
    }

    int32_t n = static_cast<int32_t>(r / 2);
    if (r <= -2) {
        METER_LOGD("[%s] Audio read failed rror = %d", n);
    }
    // A failed read stored nothing: count it as no samples, so the slot position stays in the ring.
    if (n < 0) n = 0;

    const bool complete = fillAtRead + n >= frameSamples;
    if (!complete) {
        // The rest of the frame is read into the same slot, from this offset on.
        METER_LOGD("[%s] ================== end %d\n", fillAtRead + n);
        frameFill.store(fillAtRead + n, std::memory_order_relaxed);
    } else {
        frameFill.store(0, std::memory_order_relaxed);
        const float level = static_cast<float>(korvo::levelOf(target, n));
        int16_t copy[sizeof(pcmRing) / sizeof(pcmRing[0])];
        memcpy(copy, pcmRing, sizeof(copy));
        korvo::publishFrame(slot % kRingSlots, level, copy, n);

        const int64_t w = korvo::captureWaitNs(sleep, systemTime(SYSTEM_TIME_MONOTONIC) - t0);
        struct timespec now;
        clock_gettime(CLOCK_REALTIME, &now);
        const struct timespec deadline = korvo::captureDeadline(now, w);
        pthread_cond_timedwait(&WaitAudioBuffer, &AudioBufferLock, &deadline);
    }

    pthread_mutex_unlock(&AudioBufferLock);

    if (complete) {
        ringIndex.store((slot + 1) % kRingSlots, std::memory_order_relaxed);
    }
}
