// One detectTwoPeakFreq_zorv scan of a 256-level spectrum through the interface.
#include <memory>
#include <random>

#include <benchmark/benchmark.h>

#include "meter/SoundMeter.h"

namespace {

void BM_DetectTwoPeakFreqZorv(benchmark::State& state) {
    std::unique_ptr<SoundMeter> meter(new SoundMeter());
    SoundMeter_vir* api = meter.get();
    // A noisy spectrum: levels near the detection floor, two tones well above it.
    float spectrum[256];
    std::mt19937 rng(99u);
    std::uniform_real_distribution<float> noise(0.0f, 40.0f);
    for (float& v : spectrum) v = rng() % 3 == 0 ? 0.0f : noise(rng);
    spectrum[60] = 95.0f;
    spectrum[180] = 88.0f;
    for (auto _ : state) {
        int first = -1, second = -1;
        benchmark::DoNotOptimize(spectrum);
        api->detectTwoPeakFreq_zorv(0.9f, spectrum, &first, &second);
        benchmark::DoNotOptimize(first);
        benchmark::DoNotOptimize(second);
    }
}
BENCHMARK(BM_DetectTwoPeakFreqZorv);

}  // namespace
