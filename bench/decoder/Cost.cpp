// The frame decoder's cost per frame: a live listener runs 86 frames a second and must
// stay under 2 % of a core, 232 us a frame.
#include <benchmark/benchmark.h>

#include <cmath>
#include <random>
#include <vector>

#include "host/hearing/FrameDecoder.h"

namespace {

void BM_FrameDecoderNoise(benchmark::State& state) {
    korvo::host::FrameDecoder d;
    std::mt19937_64 rng(1);
    std::normal_distribution<double> g(0.0, 1000.0);
    std::vector<int16_t> x(korvo::kFrameSamples * 64);
    for (size_t i = 0; i < x.size(); ++i)
        x[i] = static_cast<int16_t>(g(rng) + (state.range(0) ? 8000.0 * std::sin(0.37 * static_cast<double>(i)) : 0.0));
    size_t at = 0;
    for (auto _ : state) {
        benchmark::DoNotOptimize(d.addFrame(&x[at]));
        at = (at + korvo::kFrameSamples) % x.size();
    }
    state.counters["core %"] = benchmark::Counter(1.0 / (86.1328125 * 100.0), benchmark::Counter::kIsIterationInvariantRate | benchmark::Counter::kInvert);
}
BENCHMARK(BM_FrameDecoderNoise)->Arg(0)->Arg(1)->Unit(benchmark::kMicrosecond);

}  // namespace

BENCHMARK_MAIN();
