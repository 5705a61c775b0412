// Real-time timeline of a route.
#include "routes/common/Pacer.h"
#include "routes/common/SampleClock.h"

#include <ctime>

namespace korvo {
namespace platform {

namespace {

constexpr int64_t kNsPerSec = 1000000000LL;

int64_t monotonicNs() {
    timespec t{};
    clock_gettime(CLOCK_MONOTONIC, &t);
    return static_cast<int64_t>(t.tv_sec) * kNsPerSec + t.tv_nsec;
}

}  // namespace

Pacer::Pacer() {
    pthread_mutex_init(&mLock, nullptr);
    pthread_condattr_t attr;
    pthread_condattr_init(&attr);
    pthread_condattr_setclock(&attr, CLOCK_MONOTONIC);
    pthread_cond_init(&mCond, &attr);
    pthread_condattr_destroy(&attr);
}

Pacer::~Pacer() {
    pthread_cond_destroy(&mCond);
    pthread_mutex_destroy(&mLock);
}

void Pacer::start(uint32_t rate) {
    pthread_mutex_lock(&mLock);
    mAnchorNs = monotonicNs();
    mRate = rate;
    mStopped = false;
    pthread_mutex_unlock(&mLock);
}

void Pacer::stop() {
    pthread_mutex_lock(&mLock);
    mStopped = true;
    pthread_cond_broadcast(&mCond);
    pthread_mutex_unlock(&mLock);
}

bool Pacer::stopped() const {
    pthread_mutex_lock(&mLock);
    const bool s = mStopped;
    pthread_mutex_unlock(&mLock);
    return s;
}

uint64_t Pacer::positionLocked(int64_t nowNs) const {
    if (mRate == 0 || nowNs <= mAnchorNs) return 0;
    return samplesIn(static_cast<uint64_t>(nowNs - mAnchorNs), mRate);
}

uint64_t Pacer::position() const {
    pthread_mutex_lock(&mLock);
    const uint64_t p = positionLocked(monotonicNs());
    pthread_mutex_unlock(&mLock);
    return p;
}

uint64_t Pacer::waitUntil(uint64_t pos) {
    pthread_mutex_lock(&mLock);
    uint64_t reached = pos;
    while (mRate != 0) {
        const uint64_t now = positionLocked(monotonicNs());
        if (now >= pos) break;
        if (mStopped) {
            reached = now;
            break;
        }
        // Deadline of `pos`, rounded up so that the wait never ends before its position.
        const int64_t deadline = mAnchorNs + static_cast<int64_t>(nanosecondsOf(pos, mRate));
        timespec ts{};
        ts.tv_sec = static_cast<time_t>(deadline / kNsPerSec);
        ts.tv_nsec = static_cast<long>(deadline % kNsPerSec);
        pthread_cond_timedwait(&mCond, &mLock, &ts);
    }
    pthread_mutex_unlock(&mLock);
    return reached;
}

size_t CapturePacing::next(size_t count) {
    const uint64_t reached = mPacer.waitUntil(mPos + count);
    const size_t n = reached > mPos ? static_cast<size_t>(reached - mPos) : 0;
    mPos += n;
    return n;
}

void OutputPacing::next(size_t count) {
    const uint64_t now = mPacer.position();
    if (mPos < now) mPos = now;
    const uint64_t begin = mPos;
    mPos += count;
    mPacer.waitUntil(begin);
}

}  // namespace platform
}  // namespace korvo
