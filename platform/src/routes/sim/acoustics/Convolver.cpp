#include "routes/sim/acoustics/Convolver.h"

#include <fftw3.h>

#include <algorithm>
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
// Spectra are kept as planes of real and imaginary parts, padded to a multiple of 8 bins with
// zeros: the multiply-add over them is then plain element-wise arithmetic that the compiler
// turns into vector instructions.
constexpr int kPadded = (kBins + 7) / 8 * 8;

// sum += x * h, bin by bin; nothing else reaches the planes meanwhile (restrict), so the
// compiler may use vector instructions without checking for overlap.
void multiplyAdd(float* __restrict sumRe, float* __restrict sumIm, const float* __restrict xr,
                 const float* __restrict xi, const float* __restrict hr, const float* __restrict hi) {
    for (int b = 0; b < kPadded; ++b) {
        sumRe[b] += xr[b] * hr[b] - xi[b] * hi[b];
        sumIm[b] += xr[b] * hi[b] + xi[b] * hr[b];
    }
}

}  // namespace

struct Convolver::Fft {
    float* time = nullptr;
    fftwf_complex* spectrum = nullptr;
    fftwf_plan forward = nullptr;
    fftwf_plan inverse = nullptr;
    // partitions x kPadded each: the response's partitions, and the delay line of input spectra
    std::vector<float> responsesRe, responsesIm, inputsRe, inputsIm;
    std::vector<float> sumRe, sumIm;

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
    // The transform's spectrum into the planes at `at`, and back.
    void split(std::vector<float>& re, std::vector<float>& im, size_t at) const {
        for (int b = 0; b < kBins; ++b) {
            re[at + static_cast<size_t>(b)] = spectrum[b][0];
            im[at + static_cast<size_t>(b)] = spectrum[b][1];
        }
    }
    void join(const std::vector<float>& re, const std::vector<float>& im) {
        for (int b = 0; b < kBins; ++b) {
            spectrum[b][0] = re[static_cast<size_t>(b)];
            spectrum[b][1] = im[static_cast<size_t>(b)];
        }
    }
};

Convolver::Convolver(const std::vector<float>& response)
    : mFft(std::make_unique<Fft>()),
      mPartitions(std::max(1, static_cast<int>((response.size() + kBlock - 1) / kBlock))),
      mInput(kSize, 0.0f),
      mOutput(kBlock, 0.0f),
      mSilent(static_cast<size_t>(mPartitions), 1) {
    Fft& f = *mFft;
    const size_t planes = static_cast<size_t>(mPartitions) * kPadded;
    for (std::vector<float>* v : {&f.responsesRe, &f.responsesIm, &f.inputsRe, &f.inputsIm}) v->assign(planes, 0.0f);
    f.sumRe.assign(kPadded, 0.0f);
    f.sumIm.assign(kPadded, 0.0f);
    // Each partition's spectrum, scaled by 1/kSize for the unnormalised inverse.
    for (int p = 0; p < mPartitions; ++p) {
        std::fill(f.time, f.time + kSize, 0.0f);
        for (int i = 0; i < kBlock; ++i) {
            const size_t k = static_cast<size_t>(p) * kBlock + static_cast<size_t>(i);
            if (k < response.size()) f.time[i] = response[k] / kSize;
        }
        fftwf_execute(f.forward);
        f.split(f.responsesRe, f.responsesIm, static_cast<size_t>(p) * kPadded);
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
        f.split(f.inputsRe, f.inputsIm, static_cast<size_t>(mNewest) * kPadded);
    }
    std::copy(mInput.begin() + kBlock, mInput.end(), mInput.begin());
    if (std::all_of(mSilent.begin(), mSilent.end(), [](char s) { return s != 0; })) {
        std::fill(mOutput.begin(), mOutput.end(), 0.0f);
        return;
    }
    std::fill(f.sumRe.begin(), f.sumRe.end(), 0.0f);
    std::fill(f.sumIm.begin(), f.sumIm.end(), 0.0f);
    for (int p = 0; p < mPartitions; ++p) {
        const int slot = (mNewest - p + mPartitions) % mPartitions;
        if (mSilent[static_cast<size_t>(slot)]) continue;  // a zero spectrum adds nothing
        const size_t x = static_cast<size_t>(slot) * kPadded, h = static_cast<size_t>(p) * kPadded;
        multiplyAdd(f.sumRe.data(), f.sumIm.data(), &f.inputsRe[x], &f.inputsIm[x], &f.responsesRe[h], &f.responsesIm[h]);
    }
    f.join(f.sumRe, f.sumIm);
    fftwf_execute(f.inverse);
    std::copy(f.time + kBlock, f.time + kSize, mOutput.begin());
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
