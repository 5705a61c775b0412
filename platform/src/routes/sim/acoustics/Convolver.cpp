#include "routes/sim/acoustics/Convolver.h"

#include <fftw3.h>

#include <algorithm>
#include <complex>
#include <mutex>

namespace korvo {
namespace platform {
namespace acoustics {

void makeFftPlannerThreadSafe() {
    static std::once_flag once;
    std::call_once(once, [] { fftwf_make_planner_thread_safe(); });
}

namespace {

constexpr int kSize = 2 * Convolver::kBlock;
constexpr int kBins = kSize / 2 + 1;

}  // namespace

struct Convolver::Fft {
    float* time = nullptr;
    fftwf_complex* spectrum = nullptr;
    fftwf_plan forward = nullptr;
    fftwf_plan inverse = nullptr;
    std::vector<std::complex<float>> responses;  // partitions x kBins
    std::vector<std::complex<float>> inputs;     // delay line of input spectra, partitions x kBins
    std::vector<std::complex<float>> sum;

    Fft() {
        makeFftPlannerThreadSafe();
        time = fftwf_alloc_real(kSize);
        spectrum = fftwf_alloc_complex(kBins);
        forward = fftwf_plan_dft_r2c_1d(kSize, time, spectrum, FFTW_ESTIMATE);
        inverse = fftwf_plan_dft_c2r_1d(kSize, spectrum, time, FFTW_ESTIMATE);
    }
    ~Fft() {
        fftwf_destroy_plan(forward);
        fftwf_destroy_plan(inverse);
        fftwf_free(time);
        fftwf_free(spectrum);
    }
    std::complex<float>* bins() { return reinterpret_cast<std::complex<float>*>(spectrum); }
};

Convolver::Convolver(const std::vector<float>& response)
    : mFft(std::make_unique<Fft>()),
      mPartitions(std::max(1, static_cast<int>((response.size() + kBlock - 1) / kBlock))),
      mInput(kSize, 0.0f),
      mOutput(kBlock, 0.0f),
      mSilent(static_cast<size_t>(mPartitions), 1) {
    Fft& f = *mFft;
    f.responses.assign(static_cast<size_t>(mPartitions) * kBins, {});
    f.inputs.assign(static_cast<size_t>(mPartitions) * kBins, {});
    f.sum.assign(kBins, {});
    // Each partition's spectrum, scaled by 1/kSize for the unnormalised inverse.
    for (int p = 0; p < mPartitions; ++p) {
        std::fill(f.time, f.time + kSize, 0.0f);
        for (int i = 0; i < kBlock; ++i) {
            const size_t k = static_cast<size_t>(p) * kBlock + static_cast<size_t>(i);
            if (k < response.size()) f.time[i] = response[k] / kSize;
        }
        fftwf_execute(f.forward);
        std::copy(f.bins(), f.bins() + kBins, f.responses.begin() + static_cast<long>(p) * kBins);
    }
}

Convolver::~Convolver() = default;

void Convolver::process(const float* in, float* out, int count) {
    for (int i = 0; i < count; ++i) {
        out[i] = mOutput[static_cast<size_t>(mFill)];
        mInput[static_cast<size_t>(kBlock + mFill)] = in[i];
        if (++mFill == kBlock) {
            runBlock();
            mFill = 0;
        }
    }
}

void Convolver::runBlock() {
    Fft& f = *mFft;
    mNewest = (mNewest + 1) % mPartitions;
    const bool silent = std::all_of(mInput.begin(), mInput.end(), [](float v) { return v == 0.0f; });
    mSilent[static_cast<size_t>(mNewest)] = silent;
    // Overlap-save: transform the last two blocks; the second half of the circular
    // convolution is the linear one for the newest block.
    if (!silent) {
        std::copy(mInput.begin(), mInput.end(), f.time);
        fftwf_execute(f.forward);
        std::copy(f.bins(), f.bins() + kBins, f.inputs.begin() + static_cast<long>(mNewest) * kBins);
    }
    std::copy(mInput.begin() + kBlock, mInput.end(), mInput.begin());
    if (std::all_of(mSilent.begin(), mSilent.end(), [](char s) { return s != 0; })) {
        std::fill(mOutput.begin(), mOutput.end(), 0.0f);
        return;
    }
    std::fill(f.sum.begin(), f.sum.end(), std::complex<float>{});
    for (int p = 0; p < mPartitions; ++p) {
        const int slot = (mNewest - p + mPartitions) % mPartitions;
        if (mSilent[static_cast<size_t>(slot)]) continue;  // a zero spectrum adds nothing
        const std::complex<float>* x = &f.inputs[static_cast<size_t>(slot) * kBins];
        const std::complex<float>* h = &f.responses[static_cast<size_t>(p) * kBins];
        // Written out: std::complex's operator* checks for infinities on every product.
        for (int b = 0; b < kBins; ++b) {
            const float re = x[b].real() * h[b].real() - x[b].imag() * h[b].imag();
            const float im = x[b].real() * h[b].imag() + x[b].imag() * h[b].real();
            f.sum[static_cast<size_t>(b)] += std::complex<float>(re, im);
        }
    }
    std::copy(f.sum.begin(), f.sum.end(), f.bins());
    fftwf_execute(f.inverse);
    std::copy(f.time + kBlock, f.time + kSize, mOutput.begin());
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
