// The room's timeline: sample positions at the room rate counted on
// CLOCK_MONOTONIC, which every process of the machine shares, so processes agree
// on "now" without talking to each other.
#pragma once
#include <condition_variable>
#include <cstdint>
#include <mutex>

namespace korvo {
namespace platform {
namespace sim {

// Position of the current instant.
int64_t timelineNow();
// Monotonic-clock time (ns) at which the timeline reaches `position`.
int64_t timeOfPosition(int64_t position);

// Sleeps until a timeline position is reached; stop() from any thread cuts the
// sleep short and makes later waits return at once until rearm().
class TimelineWaiter {
public:
    // False when stopped (before or during the wait).
    bool waitFor(int64_t position);
    void stop();
    void rearm();
    bool stopped();

private:
    std::mutex mMutex;
    std::condition_variable mCond;
    bool mStopped = false;
};

}  // namespace sim
}  // namespace platform
}  // namespace korvo
