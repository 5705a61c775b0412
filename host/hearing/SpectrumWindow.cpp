#include "host/hearing/SpectrumWindow.h"

#include <fftw3.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <mutex>

#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

namespace {
constexpr double kPi = 3.14159265358979323846;
// FFTW's planner is not thread-safe; executing a plan is. The lock keeps this program's
// windows apart; FFTW's own (made safe below) keeps them apart from plans that the
// platform's routes make in other threads.
std::mutex gPlanner;
std::once_flag gPlannerSafe;
}  // namespace

SpectrumWindow::SpectrumWindow(int length, int referenceCount)
    : mLength(length), mCount(std::min(referenceCount, kMaxReferenceCount)), mBinHz(static_cast<double>(korvo::kSampleRate) / length),
      mWindow(static_cast<size_t>(length)), mPower(static_cast<size_t>(length / 2 + 1), 0.0f),
      mHeld(static_cast<size_t>(length / 2 + 1), 0.0f) {
    // A Hann window's coherent gain is 1/2: a sine of amplitude A reads |X| = A N / 4.
    const double scale = 4.0 / length;
    for (int i = 0; i < length; ++i)
        mWindow[static_cast<size_t>(i)] = static_cast<float>(scale * 0.5 * (1.0 - std::cos(2.0 * kPi * (i + 0.5) / length)));
    std::call_once(gPlannerSafe, [] { fftwf_make_planner_thread_safe(); });
    std::lock_guard<std::mutex> lock(gPlanner);
    mIn = fftwf_alloc_real(static_cast<size_t>(length));
    auto* out = fftwf_alloc_complex(static_cast<size_t>(bins()));
    mOut = out;
    mPlan = fftwf_plan_dft_r2c_1d(length, mIn, out, FFTW_ESTIMATE);
}

SpectrumWindow::~SpectrumWindow() {
    std::lock_guard<std::mutex> lock(gPlanner);
    fftwf_destroy_plan(static_cast<fftwf_plan>(mPlan));
    fftwf_free(mIn);
    fftwf_free(static_cast<fftwf_complex*>(mOut));
}

void SpectrumWindow::analyse(const float* samples) {
    for (int i = 0; i < mLength; ++i) mIn[i] = samples[i] * mWindow[static_cast<size_t>(i)];
    fftwf_execute(static_cast<fftwf_plan>(mPlan));
    const auto* out = static_cast<const fftwf_complex*>(mOut);
    for (int b = 0; b < bins(); ++b) {
        const float p = out[b][0] * out[b][0] + out[b][1] * out[b][1];
        mPower[static_cast<size_t>(b)] = p;
        mHeld[static_cast<size_t>(b)] = std::max(p, kHeldDecay * mHeld[static_cast<size_t>(b)]);
    }
}

void SpectrumWindow::clear() {
    std::fill(mPower.begin(), mPower.end(), 0.0f);
    std::fill(mHeld.begin(), mHeld.end(), 0.0f);
}

bool SpectrumWindow::referenceBelow(int bin, int gap) const {
    return bin - gap - kReferenceStep * (mCount - 1) >= 1;
}

bool SpectrumWindow::referenceAbove(int bin, int gap) const {
    return bin + gap + kReferenceStep * (mCount - 1) <= bins() - 2;
}

double SpectrumWindow::side(int from, int step) const {
    const int rank = rankOf(mCount);
    const int keep = mCount - rank + 1;
    std::array<float, kMaxReferenceCount> v{};
    if (keep > kInsertionKeep) {
        for (int i = 0; i < mCount; ++i) v[static_cast<size_t>(i)] = power(from + step * i);
        std::nth_element(v.begin(), v.begin() + (rank - 1), v.begin() + mCount);
        return v[static_cast<size_t>(rank - 1)];
    }
    // The rank-th smallest is the keep-th largest: with few to keep, keeping the largest
    // in order by insertion is cheaper than a selection.
    int n = 0;
    for (int i = 0; i < mCount; ++i) {
        const float x = power(from + step * i);
        if (n == keep && x <= v[static_cast<size_t>(n - 1)]) continue;
        int j = n < keep ? n++ : n - 1;
        for (; j > 0 && v[static_cast<size_t>(j - 1)] < x; --j) v[static_cast<size_t>(j)] = v[static_cast<size_t>(j - 1)];
        v[static_cast<size_t>(j)] = x;
    }
    return v[static_cast<size_t>(keep - 1)];
}

double SpectrumWindow::noise(int bin, int gap) const {
    double n = 0.0;
    if (referenceBelow(bin, gap)) n = side(bin - gap, -kReferenceStep);
    if (referenceAbove(bin, gap)) n = std::max(n, side(bin + gap, kReferenceStep));
    // Nothing quieter than a converter's own noise counts as the room: under it, a splatter
    // or a leftover far below anything audible would stand out of digital silence.
    return std::max(n, quietestNoise());
}

double SpectrumWindow::quietestNoise() const {
    // White noise of variance s2 reads 6 s2 / N in a bin of a Hann window of N samples
    // (powers scaled so that a sine of amplitude A reads A^2).
    return 6.0 * kQuietestVariance / mLength;
}

double SpectrumWindow::noiseBound(int bin, int gap) const {
    const int keep = mCount - rankOf(mCount) + 1;
    auto least = [&](int from, int step) {
        float m = power(from);
        for (int i = 1; i < keep; ++i) m = std::min(m, power(from + step * i));
        return static_cast<double>(m);
    };
    double n = 0.0;
    if (referenceBelow(bin, gap)) n = least(bin - gap, -kReferenceStep);
    if (referenceAbove(bin, gap)) n = std::max(n, least(bin + gap, kReferenceStep));
    return std::max(n, 1e-20);
}

int SpectrumWindow::peak(int lo, int hi) const {
    lo = std::max(lo, 1);
    hi = std::min(hi, bins() - 2);
    int best = -1;
    for (int b = lo; b <= hi; ++b) {
        const float p = power(b);
        if (p >= power(b - 1) && p >= power(b + 1) && (best < 0 || p > power(best))) best = b;
    }
    return best;
}

void SpectrumWindow::interpolate(int bin, double* hz, double* power) const {
    const double a = std::log(std::max(this->power(bin - 1), 1e-30f));
    const double b = std::log(std::max(this->power(bin), 1e-30f));
    const double c = std::log(std::max(this->power(bin + 1), 1e-30f));
    const double den = a - 2.0 * b + c;
    const double d = den < 0.0 ? std::clamp(0.5 * (a - c) / den, -0.5, 0.5) : 0.0;
    *hz = (bin + d) * mBinHz;
    *power = std::exp(b - 0.25 * (a - c) * d);
}

}  // namespace host
}  // namespace korvo
