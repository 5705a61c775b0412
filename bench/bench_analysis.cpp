// Speed of the spectrum analysis: the 512-point transform (against FFTW's real transform
// on the same input), one analysed frame, and one masked read-out.
#include <benchmark/benchmark.h>
#include <fftw3.h>

#include <cmath>
#include <cstring>
#include <random>
#include <vector>

#include "analysis/RealDoubleFFT.h"
#include "analysis/WaveformCanvas.h"

namespace {

constexpr int kN = 512;

std::vector<double> benchInput() {
    std::mt19937 rng(512);
    std::uniform_real_distribution<double> dist(-1.0, 1.0);
    std::vector<double> x(kN);
    for (double& v : x) v = dist(rng);
    return x;
}

std::vector<short> benchFrame() {
    std::vector<short> s(kN);
    for (int j = 0; j < kN; ++j) {
        s[j] = static_cast<short>(std::lround(12000.0 * std::sin(2.0 * M_PI * 40.0 * j / kN) +
                                              3000.0 * std::sin(2.0 * M_PI * 97.3 * j / kN)));
    }
    return s;
}

// Both transforms work in place, so both refill their table from the same input first.
void BM_RealDoubleFFT_forward512(benchmark::State& state) {
    const std::vector<double> input = benchInput();
    android::sp<RealDoubleFFT> fft = new RealDoubleFFT(kN);
    android::sp<WaveTable_Double> table = new WaveTable_Double(kN);
    for (auto _ : state) {
        std::memcpy(table->data, input.data(), kN * sizeof(double));
        fft->forwardTransform(table);
        benchmark::DoNotOptimize(table->data);
        benchmark::ClobberMemory();
    }
}
BENCHMARK(BM_RealDoubleFFT_forward512);

void BM_FFTW_r2hc512(benchmark::State& state) {
    const std::vector<double> input = benchInput();
    double* buf = fftw_alloc_real(kN);
    fftw_plan plan = fftw_plan_r2r_1d(kN, buf, buf, FFTW_R2HC, FFTW_MEASURE);
    for (auto _ : state) {
        std::memcpy(buf, input.data(), kN * sizeof(double));
        fftw_execute(plan);
        benchmark::DoNotOptimize(buf);
        benchmark::ClobberMemory();
    }
    fftw_destroy_plan(plan);
    fftw_free(buf);
}
BENCHMARK(BM_FFTW_r2hc512);

// FFTW's complex-output real transform, out of place, for reference.
void BM_FFTW_r2c512(benchmark::State& state) {
    const std::vector<double> input = benchInput();
    double* in = fftw_alloc_real(kN);
    fftw_complex* out = fftw_alloc_complex(kN / 2 + 1);
    fftw_plan plan = fftw_plan_dft_r2c_1d(kN, in, out, FFTW_MEASURE);
    for (auto _ : state) {
        std::memcpy(in, input.data(), kN * sizeof(double));
        fftw_execute(plan);
        benchmark::DoNotOptimize(out);
        benchmark::ClobberMemory();
    }
    fftw_destroy_plan(plan);
    fftw_free(out);
    fftw_free(in);
}
BENCHMARK(BM_FFTW_r2c512);

// One analysed frame as the analysis thread does it: input table, fresh FFT object with
// its tables, transform, magnitudes into the spectrum table.
void BM_drawSpectrum(benchmark::State& state) {
    std::vector<short> frame = benchFrame();
    android::sp<android::WaveformCanvas> canvas = new android::WaveformCanvas();
    for (auto _ : state) {
        canvas->drawSpectrum(frame.data(), kN);
        benchmark::ClobberMemory();
    }
}
BENCHMARK(BM_drawSpectrum);

void BM_getSpectrumData_zorv(benchmark::State& state) {
    std::vector<short> frame = benchFrame();
    android::sp<android::WaveformCanvas> canvas = new android::WaveformCanvas();
    canvas->drawSpectrum(frame.data(), kN);
    std::vector<float> out(256);
    for (auto _ : state) {
        benchmark::DoNotOptimize(canvas->getSpectrumData_zorv(out.data()));
        benchmark::ClobberMemory();
    }
}
BENCHMARK(BM_getSpectrumData_zorv);

}  // namespace

BENCHMARK_MAIN();
