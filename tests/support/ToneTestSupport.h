// Helpers shared by the tone engine, playback callback and wave generator tests.
#pragma once
#include <pthread.h>

#include <algorithm>
#include <chrono>
#include <functional>
#include <future>
#include <initializer_list>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include "tone/MiniToneGenerator.h"

namespace korvo {
namespace tonetest {

namespace test = korvo::platform::test;
using Engine = android::MiniToneGenerator;
using Gen = Engine::WaveGenerator;
using Seg = Engine::ToneSegment;
using Lines = std::vector<std::string>;
using Samples = std::vector<int16_t>;
constexpr unsigned START = Gen::WAVEGEN_START, CONT = Gen::WAVEGEN_CONT, STOP = Gen::WAVEGEN_STOP;
// A copy: the class constant has no out-of-line definition to bind references to.
constexpr unsigned kInf = Engine::TONEGEN_INF;

// Polls pred until it holds or the time is up.
bool waitUntil(const std::function<bool()>& pred, int timeoutMs = 5000);

// The engine's kept log. A wanted line ending in '*' matches any line that starts with the rest.
Lines toneMessages();
int toneCount(const std::string& msg);
bool hasToneLine(int prio, const std::string& wanted);
::testing::AssertionResult lastToneLine(int prio, const std::string& wanted);
// `wanted` occurs in `lines` as a subsequence / is the whole of `lines`.
::testing::AssertionResult inOrder(const Lines& lines, const Lines& wanted);
::testing::AssertionResult linesAre(const Lines& lines, const Lines& wanted);
inline bool waitForToneMessage(const std::string& msg, int count = 1) {
    return waitUntil([&] { return toneCount(msg) >= count; });
}

// Runs f with the engine's lock held (fields the other thread writes under it).
template <class F>
auto underLock(Engine& gen, F f) -> decltype(f()) {
    pthread_mutex_lock(&gen.mLock);
    struct Unlock {
        pthread_mutex_t* m;
        ~Unlock() { pthread_mutex_unlock(m); }
    } unlock{&gen.mLock};
    return f();
}
template <class T>
T locked(Engine& gen, T Engine::*field) {
    return underLock(gen, [&] { return gen.*field; });
}
inline size_t genCount(Engine& gen) {
    return underLock(gen, [&] { return gen.mWaveGens.size(); });
}
inline uint16_t stateOf(const Engine& gen) { return gen.mState.load(std::memory_order_relaxed); }

template <class F>
auto async(F f) {
    return std::async(std::launch::async, f);
}
template <class T>
bool ready(std::future<T>& f, int seconds = 5) {
    return f.wait_for(std::chrono::seconds(seconds)) == std::future_status::ready;
}

// Log captured, callbacks pumped by hand.
class ToneTest : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        test::captureLog(true);
        test::manualTrackCallbacks(true);
    }
    void TearDown() override { test::resetAll(); }
};

// startTone on another thread, its first buffer pumped once it waits for it.
bool startAndPump(Engine& gen, int code, int ms, test::PumpResult* first = nullptr, size_t samples = 0);
// stopTone on another thread, returned once it waits for the callback.
std::future<void> stopAsync(Engine& gen);
// Pumps until the tone has ended and the track is stopped.
void drain(Engine& gen, int maxPumps = 200);
// Pumps one buffer and checks the state after it; with `want`, also the buffer's samples
// and size and exactly the messages logged meanwhile.
::testing::AssertionResult pumped(Engine& gen, uint16_t state);
::testing::AssertionResult pumped(Engine& gen, uint16_t state, const Samples& want, const Lines& log,
                                  size_t bytes = 1764);

// A hand-built record of the tone table, put back when the scope ends.
class ScopedDescriptor {
public:
    ScopedDescriptor(int code, std::initializer_list<Seg> segments)
        : mCode(code), mSaved(Engine::sToneDescriptors[code]) {
        Engine::ToneDescriptor& d = Engine::sToneDescriptors[code] = Engine::ToneDescriptor{};
        std::copy(segments.begin(), segments.end(), d.segments);
        d.code = static_cast<unsigned>(code);
    }
    ~ScopedDescriptor() { Engine::sToneDescriptors[mCode] = mSaved; }
    ScopedDescriptor(const ScopedDescriptor&) = delete;

private:
    int mCode;
    Engine::ToneDescriptor mSaved;
};

// A fresh sine generator driven block by block: the reference output.
struct RefWave {
    RefWave(unsigned rate, unsigned freq, float gain)
        : gen(static_cast<unsigned short>(rate), static_cast<unsigned short>(freq), gain) {}
    // The next `count` samples produced with the command, from silence.
    Samples block(unsigned count, unsigned command) {
        Samples out(count, 0);
        addInto(out, command);
        return out;
    }
    void addInto(Samples& out, unsigned command) {
        gen.getSamples(out.data(), static_cast<unsigned>(out.size()), command);
    }
    Gen gen;
};

inline void append(Samples& to, const Samples& more) { to.insert(to.end(), more.begin(), more.end()); }

}  // namespace tonetest
}  // namespace korvo
