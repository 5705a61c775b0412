// Helpers of the tone tests: callbacks pumped by hand while startTone/stopTone block on
// another thread, the engine's log, and reference waves made by fresh generators.
#pragma once
#include <future>
#include <initializer_list>

#include "support/LibraryTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace korvo {
namespace tonetest {

using namespace korvo::testing;
using Engine = android::MiniToneGenerator;
using Gen = Engine::WaveGenerator;
using Seg = Engine::ToneSegment;
using Samples = std::vector<int16_t>;
constexpr unsigned START = Gen::WAVEGEN_START, CONT = Gen::WAVEGEN_CONT, STOP = Gen::WAVEGEN_STOP;
constexpr unsigned kInf = Engine::TONEGEN_INF;

// The engine's kept messages; how often one was logged.
Strings toneLog();
inline long toneCount(const std::string& msg) { const Strings all = toneLog(); return std::count(all.begin(), all.end(), msg); }
// `wanted` occurs in `lines` in this order; a wanted line ending in '*' matches by prefix.
::testing::AssertionResult inOrder(const Strings& lines, const Strings& wanted);

// A field that the playback side writes, read under the engine's lock.
template <class T>
T locked(Engine& gen, T Engine::*field) {
    pthread_mutex_lock(&gen.mLock);
    T v = gen.*field;
    pthread_mutex_unlock(&gen.mLock);
    return v;
}
inline uint16_t stateOf(const Engine& gen) { return gen.mState.load(std::memory_order_relaxed); }
template <class T>
bool ready(std::future<T>& f, int seconds = 5) {
    return f.wait_for(std::chrono::seconds(seconds)) == std::future_status::ready;
}

// Log kept, callbacks pumped by hand.
class Tone : public LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        test::manualTrackCallbacks(true);
    }
};

// startTone on another thread, its first buffer pumped once it waits for it.
bool startAndPump(Engine& gen, int code, int ms, test::PumpResult* first = nullptr, size_t samples = 0);
// stopTone on another thread, handed back once it waits for the callback.
std::future<void> stopAsync(Engine& gen);
// Pumps until the tone has ended and the track is stopped.
void drain(Engine& gen);
// Pumps one buffer: the state after it, its samples, its size and the messages logged meanwhile.
::testing::AssertionResult pumped(Engine& gen, uint16_t state, const Samples& want, const Strings& log,
                                  size_t bytes = 1764);

// A hand-built record of the tone table, put back when the scope ends.
class ScopedDescriptor {
public:
    ScopedDescriptor(int code, std::initializer_list<Seg> segments) : mCode(code), mSaved(Engine::sToneDescriptors[code]) {
        Engine::ToneDescriptor& d = Engine::sToneDescriptors[code] = Engine::ToneDescriptor{};
        std::copy(segments.begin(), segments.end(), d.segments);
        d.code = static_cast<unsigned>(code);
    }
    ~ScopedDescriptor() { Engine::sToneDescriptors[mCode] = mSaved; }

private:
    int mCode;
    Engine::ToneDescriptor mSaved;
};

// A fresh sine generator driven block by block: the reference output.
struct RefWave {
    RefWave(unsigned rate, unsigned freq, float gain = 0.45f)
        : gen(static_cast<unsigned short>(rate), static_cast<unsigned short>(freq), gain) {}
    Samples block(unsigned count, unsigned command) {
        Samples out(count, 0);
        gen.getSamples(out.data(), count, command);
        return out;
    }
    Gen gen;
};

inline Samples operator+(Samples a, const Samples& b) {
    a.insert(a.end(), b.begin(), b.end());
    return a;
}

}  // namespace tonetest
}  // namespace korvo
