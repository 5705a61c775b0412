// Real-time timeline of a route: sample positions against the monotonic clock.
//
// Position 0 is the moment of start(); position p falls p / rate seconds later.
// Waits end at their position or at once when stop() is called from another thread.
// stop() is the only call that may come from another thread than the route's user.
#pragma once
#include <pthread.h>

#include <cstddef>
#include <cstdint>

namespace korvo {
namespace platform {

class Pacer {
public:
    Pacer();
    ~Pacer();
    Pacer(const Pacer&) = delete;
    Pacer& operator=(const Pacer&) = delete;

    // Anchors position 0 at now and clears a stop.
    void start(uint32_t rate);
    // Ends the current wait and makes later waits return at once, until the next start().
    void stop();
    bool stopped() const;

    // Position reached by the clock now (0 before start()).
    uint64_t position() const;
    // Waits until the clock reaches `pos`. Returns `pos`, or the position reached when
    // stopped (possibly less). Returns at once before start().
    uint64_t waitUntil(uint64_t pos);

private:
    uint64_t positionLocked(int64_t nowNs) const;

    mutable pthread_mutex_t mLock;
    pthread_cond_t mCond;  // on the monotonic clock
    int64_t mAnchorNs = 0;
    uint32_t mRate = 0;  // 0: not started
    bool mStopped = false;
};

// Pace of a capture route: samples become available as the clock passes them.
class CapturePacing {
public:
    void start(uint32_t rate) {
        mPos = 0;
        mPacer.start(rate);
    }
    void stop() { mPacer.stop(); }
    // Waits until `count` more samples are due; returns how many are (fewer after stop()).
    size_t next(size_t count);

private:
    Pacer mPacer;
    uint64_t mPos = 0;  // samples delivered since start()
};

// Pace of an output route: a write returns when its buffer starts to play, so the writer
// stays one buffer ahead; a writer that fell behind goes on from now (the device played
// silence meanwhile).
class OutputPacing {
public:
    void start(uint32_t rate) {
        mPos = 0;
        mPacer.start(rate);
    }
    void stop() { mPacer.stop(); }
    void next(size_t count);

private:
    Pacer mPacer;
    uint64_t mPos = 0;  // end of the samples written, on the timeline
};

}  // namespace platform
}  // namespace korvo
