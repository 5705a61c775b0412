#include "routes/sim/SimRoomClock.h"

#include <time.h>

#include <chrono>

#include "routes/sim/SimRoomLayout.h"

namespace korvo {
namespace platform {
namespace sim {

namespace {
constexpr int64_t kNsPerSecond = 1000000000;
}

int64_t timelineNow() {
    timespec ts{};
    clock_gettime(CLOCK_MONOTONIC, &ts);
    // Split so that years of uptime cannot overflow.
    return int64_t(ts.tv_sec) * kRoomRate + int64_t(ts.tv_nsec) * kRoomRate / kNsPerSecond;
}

int64_t timeOfPosition(int64_t position) {
    const int64_t seconds = position / kRoomRate;
    const int64_t rest = position % kRoomRate;
    // Rounded up: at that instant timelineNow() has reached `position`.
    return seconds * kNsPerSecond + (rest * kNsPerSecond + kRoomRate - 1) / kRoomRate;
}

bool TimelineWaiter::waitFor(int64_t position) {
    // steady_clock is CLOCK_MONOTONIC here, the clock of the timeline.
    const std::chrono::steady_clock::time_point deadline{
        std::chrono::nanoseconds(timeOfPosition(position))};
    std::unique_lock<std::mutex> lock(mMutex);
    while (!mStopped && timelineNow() < position) {
        mCond.wait_until(lock, deadline);
    }
    return !mStopped;
}

void TimelineWaiter::stop() {
    {
        std::lock_guard<std::mutex> lock(mMutex);
        mStopped = true;
    }
    mCond.notify_all();
}

void TimelineWaiter::rearm() {
    std::lock_guard<std::mutex> lock(mMutex);
    mStopped = false;
}

bool TimelineWaiter::stopped() {
    std::lock_guard<std::mutex> lock(mMutex);
    return mStopped;
}

}  // namespace sim
}  // namespace platform
}  // namespace korvo
