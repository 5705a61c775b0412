// Helpers shared by the tone engine, playback callback and output track tests.
#pragma once
#include <pthread.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <initializer_list>
#include <string>
#include <vector>

#include <korvo/platform/TestControl.h>

#include "tone/MiniToneGenerator.h"

namespace korvo {
namespace tonetest {

using android::MiniToneGenerator;

// Polls pred until it holds or the time is up.
bool waitUntil(const std::function<bool()>& pred, int timeoutMs = 5000);

// Messages of the kept log under one tag, in order.
std::vector<std::string> messagesOf(const std::string& tag);
std::vector<std::string> toneMessages();
// Number of kept lines of the tag with exactly this message.
int countMessage(const std::string& tag, const std::string& msg);
// Whether the kept log has the message under the tag at the priority.
bool hasLine(const std::string& tag, int prio, const std::string& msg);
// Waits until the engine has logged `msg` at least `count` times.
bool waitForToneMessage(const std::string& msg, int count = 1, int timeoutMs = 5000);
// Whether `wanted` occurs in `lines` as a subsequence; a wanted entry ending in '*'
// matches any message that starts with the rest.
bool inOrder(const std::vector<std::string>& lines, const std::vector<std::string>& wanted);

// Runs f with the engine's lock held (fields the other thread writes under it).
template <class F>
auto underLock(MiniToneGenerator& gen, F f) -> decltype(f()) {
    pthread_mutex_lock(&gen.mLock);
    struct Unlock {
        pthread_mutex_t* m;
        ~Unlock() { pthread_mutex_unlock(m); }
    } unlock{&gen.mLock};
    return f();
}

inline uint16_t stateOf(const MiniToneGenerator& gen) {
    return gen.mState.load(std::memory_order_relaxed);
}

// A hand-built record of the tone table, put back to zero when the scope ends.
class ScopedDescriptor {
public:
    ScopedDescriptor(int code, std::initializer_list<MiniToneGenerator::ToneSegment> segments);
    ~ScopedDescriptor();
    ScopedDescriptor(const ScopedDescriptor&) = delete;
    ScopedDescriptor& operator=(const ScopedDescriptor&) = delete;

private:
    int mCode;
    MiniToneGenerator::ToneDescriptor mSaved;
};

// Reference output of one fresh sine generator driven block by block.
class RefWave {
public:
    RefWave(unsigned rate, unsigned freq, float gain);
    // The next `count` samples produced with the command, from silence.
    std::vector<int16_t> block(unsigned count, unsigned command);
    // The same, added into out (its whole length).
    void addInto(std::vector<int16_t>& out, unsigned command);

private:
    MiniToneGenerator::WaveGenerator mGen;
};

}  // namespace tonetest
}  // namespace korvo
