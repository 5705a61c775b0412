#include "routes/sim/acoustics/Distortion.h"

#include <algorithm>
#include <cmath>

namespace korvo {
namespace platform {
namespace acoustics {

namespace {

double amplitudeOf(double db) { return db <= -200.0 ? 0.0 : std::pow(10.0, db / 20.0); }

double besselI0(double x) {
    double sum = 1.0, term = 1.0;
    for (int k = 1; k < 50; ++k) {
        term *= (x / (2.0 * k)) * (x / (2.0 * k));
        sum += term;
    }
    return sum;
}

// A Kaiser-windowed sinc cutting at a quarter of the doubled rate (the original half rate),
// 80 dB down from about 23.8 kHz at 44.1 kHz; unit gain at DC.
const std::array<float, Distortion::kTaps>& halfRateLowPass() {
    static const std::array<float, Distortion::kTaps> taps = [] {
        constexpr double kPi = 3.14159265358979323846;
        constexpr double kBeta = 7.857;  // Kaiser's beta for 80 dB
        constexpr int m = Distortion::kTaps - 1;
        std::array<double, Distortion::kTaps> h{};
        double sum = 0.0;
        for (int n = 0; n <= m; ++n) {
            const double t = n - m / 2.0;
            const double sinc = t == 0.0 ? 0.5 : std::sin(0.5 * kPi * t) / (kPi * t);
            const double r = 2.0 * n / m - 1.0;
            h[static_cast<size_t>(n)] = sinc * besselI0(kBeta * std::sqrt(1.0 - r * r)) / besselI0(kBeta);
            sum += h[static_cast<size_t>(n)];
        }
        std::array<float, Distortion::kTaps> out{};
        for (int n = 0; n <= m; ++n) out[static_cast<size_t>(n)] = static_cast<float>(h[static_cast<size_t>(n)] / sum);
        return out;
    }();
    return taps;
}

// The filter's taps in the orders its three uses read them, so that every dot product runs
// forward over two arrays (histories are kept oldest first): the upsampler's even and odd
// phases over the newest kUp inputs, and the whole filter over the newest kRing samples at
// twice the rate (its first entry zero: the ring is one longer than the filter).
struct Phases {
    std::array<float, Distortion::kUp> even{}, odd{};
    std::array<float, Distortion::kRing> whole{};
};

const Phases& phases() {
    static const Phases p = [] {
        const std::array<float, Distortion::kTaps>& h = halfRateLowPass();
        constexpr int up = Distortion::kUp, ring = Distortion::kRing;
        Phases q;
        for (int i = 0; i < up; ++i) q.even[static_cast<size_t>(i)] = 2.0f * h[static_cast<size_t>(2 * (up - 1 - i))];
        for (int i = 1; i < up; ++i) q.odd[static_cast<size_t>(i)] = 2.0f * h[static_cast<size_t>(2 * (up - 1 - i) + 1)];
        for (int i = 1; i < ring; ++i) q.whole[static_cast<size_t>(i)] = h[static_cast<size_t>(ring - 1 - i)];
        return q;
    }();
    return p;
}

// sum of a[i] * b[i] over i < n (a multiple of 8), in eight lanes that the compiler may keep
// in vector registers.
float dot(const float* __restrict a, const float* __restrict b, int n) {
    float lane[8] = {};
    for (int i = 0; i < n; i += 8) {
        for (int j = 0; j < 8; ++j) lane[j] += a[i + j] * b[i + j];
    }
    return ((lane[0] + lane[1]) + (lane[2] + lane[3])) + ((lane[4] + lane[5]) + (lane[6] + lane[7]));
}

}  // namespace

// For x = cos(wt): x^2 = (1 + cos 2wt) / 2 and x^3 = (3 cos wt + cos 3wt) / 4, so the output's
// fundamental is 1 + 3 a3 / 4, its second harmonic a2 / 2 and its third a3 / 4. Solving for
// harmonics r2 and r3 relative to that fundamental: a3 = 4 r3 / (1 - 3 r3) and
// a2 = 2 r2 (1 + 3 a3 / 4).
Distortion::Distortion(double secondDb, double thirdDb) {
    const double r2 = amplitudeOf(secondDb), r3 = amplitudeOf(thirdDb);
    mA3 = 4.0 * r3 / (1.0 - 3.0 * r3);
    mA2 = 2.0 * r2 * (1.0 + 0.75 * mA3);
    phases();  // the filters are made here, not on the first sound played
}

void Distortion::push(float shaped) {
    mShapedAt = (mShapedAt + 1) % kRing;
    mShaped[static_cast<size_t>(mShapedAt)] = mShaped[static_cast<size_t>(mShapedAt + kRing)] = shaped;
}

// One input sample in, one out, kDelay later: upsampled by two (the even and odd phases of
// the filter on the input), shaped, and filtered back down at the even instants.
float Distortion::step(float x) {
    const Phases& p = phases();
    mInAt = (mInAt + 1) % kUp;
    mIn[static_cast<size_t>(mInAt)] = mIn[static_cast<size_t>(mInAt + kUp)] = x;
    const float* in = &mIn[static_cast<size_t>(mInAt + 1)];  // the newest kUp, oldest first
    push(shape(dot(p.even.data(), in, kUp)));
    const float out = dot(p.whole.data(), &mShaped[static_cast<size_t>(mShapedAt + 1)], kRing);
    push(shape(dot(p.odd.data(), in, kUp)));
    return out;
}

void Distortion::process(float* samples, int count) {
    if (none()) return;
    for (int i = 0; i < count; ++i) {
        const float x = samples[i];
        // Once both histories hold only zeros the output is silence (the curve keeps zero at
        // zero); the count stops there, so hours of silence cannot overflow it.
        mZeros = x != 0.0f ? 0 : std::min(mZeros + 1, kUp + kRing + 1);
        samples[i] = mZeros > kUp + kRing ? 0.0f : step(x);
    }
}

double distortionPercent(double secondDb, double thirdDb) {
    const double h2 = amplitudeOf(secondDb), h3 = amplitudeOf(thirdDb);
    return 100.0 * std::sqrt(h2 * h2 + h3 * h3);
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
