// What a microphone costs while it runs in real time, as a share of one core: a broken
// route under a loop of hearing steps, and a 48 kHz stereo recording converted to the
// capture rate. Both are paced like a microphone, so each iteration lasts the time of its
// samples; the share is the thread's CPU time over that wall time.
#include <sndfile.h>
#include <unistd.h>

#include <chrono>
#include <cmath>
#include <cstdlib>
#include <ctime>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <korvo/platform/Routes.h>

#include "meter/SoundMeter.h"

namespace {

double threadCpuSeconds() {
    timespec t{};
    clock_gettime(CLOCK_THREAD_CPUTIME_ID, &t);
    return double(t.tv_sec) + t.tv_nsec / 1e9;
}

// Runs `step` for every iteration and reports the thread's CPU share of the wall time.
template <class Step>
void measureShare(benchmark::State& state, Step step) {
    const double cpu0 = threadCpuSeconds();
    const auto wall0 = std::chrono::steady_clock::now();
    for (auto _ : state) step();
    const double wall = std::chrono::duration<double>(std::chrono::steady_clock::now() - wall0).count();
    state.counters["core_share_percent"] = 100.0 * (threadCpuSeconds() - cpu0) / wall;
}

// HearFreqIdx in a loop on a microphone whose route cannot open: each failing read takes a
// frame's time, so the loop costs what a working microphone's would.
void BM_HearingOnAnUnusableRoute(benchmark::State& state) {
    setenv("KORVO_MIC", "wav:/nonexistent/microphone.wav", 1);
    SoundMeter meter;
    meter.setRole(1);
    meter.startRecord();
    measureShare(state, [&] { benchmark::DoNotOptimize(meter.HearFreqIdx(3)); });
    meter.stopRecord();
    unsetenv("KORVO_MIC");
}
BENCHMARK(BM_HearingOnAnUnusableRoute)->Iterations(200)->UseRealTime()->Unit(benchmark::kMillisecond);

// A frame at a time from a 48 kHz stereo file: decoding, the mix-down and the rate converter.
void BM_RecordingConvertedToTheCaptureRate(benchmark::State& state) {
    const std::string path = "/tmp/korvo-bench-" + std::to_string(getpid()) + ".wav";
    SF_INFO info{};
    info.samplerate = 48000;
    info.channels = 2;
    info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
    std::vector<short> frames(2 * 48000 * 5);  // 5 s of code 5's tone, looped by reopening
    for (size_t i = 0; i < frames.size() / 2; ++i)
        frames[2 * i] = frames[2 * i + 1] = short(16000 * std::sin(2 * M_PI * 6880.0 * double(i) / 48000.0));
    SNDFILE* file = sf_open(path.c_str(), SFM_WRITE, &info);
    sf_writef_short(file, frames.data(), sf_count_t(frames.size() / 2));
    sf_close(file);
    std::string error;
    auto route = korvo::platform::makeCaptureRoute("wav:" + path, &error);
    unlink(path.c_str());  // the route holds the file open
    if (!route || route->open(44100) != 0) {
        state.SkipWithError(error.c_str());
        return;
    }
    std::vector<int16_t> frame(512);
    measureShare(state, [&] { benchmark::DoNotOptimize(route->read(frame.data(), frame.size())); });
}
BENCHMARK(BM_RecordingConvertedToTheCaptureRate)->Iterations(400)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace
