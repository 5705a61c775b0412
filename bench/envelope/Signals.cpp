#include "envelope/Signals.h"

#include <algorithm>
#include <cmath>

namespace korvo {
namespace envelope {

namespace {
constexpr double kPi = 3.14159265358979323846;
}  // namespace

const char* noiseName(Noise noise) { return noise == Noise::White ? "white" : "speech"; }

double dbfsToRms(double dbfs) { return std::pow(10.0, dbfs / 20.0); }

double Gaussian::next() {
    if (mHaveSpare) {
        mHaveSpare = false;
        return mSpare;
    }
    const double u1 = (static_cast<double>(mRandom() >> 11) + 1.0) * 0x1.0p-53;
    const double u2 = static_cast<double>(mRandom() >> 11) * 0x1.0p-53;
    const double r = std::sqrt(-2.0 * std::log(u1));
    mSpare = r * std::sin(2.0 * kPi * u2);
    mHaveSpare = true;
    return r * std::cos(2.0 * kPi * u2);
}

NoiseSource::NoiseSource(Noise kind, uint64_t seed) : mKind(kind), mGaussian(seed), mRandom(seed ^ 0x5bd1e995u) {}

double NoiseSource::pink() { return mPink.next(mGaussian.next()); }

// Syllables of 120..250 ms with a raised-cosine shape and a peak of 0.5..1, pauses of
// 20..150 ms between them and a breath of 300..600 ms every 8..12 syllables; a floor
// of 0.05 stays in the pauses (the room behind the voice).
double NoiseSource::envelope() {
    if (mAt >= mSyllable + mPause) {
        std::uniform_real_distribution<double> u(0.0, 1.0);
        mAt = 0;
        mSyllable = static_cast<int64_t>((0.12 + 0.13 * u(mRandom)) * kRate);
        mPeak = 0.5 + 0.5 * u(mRandom);
        if (--mSyllablesToBreath <= 0) {
            mSyllablesToBreath = 8 + static_cast<int>(5 * u(mRandom));
            mPause = static_cast<int64_t>((0.3 + 0.3 * u(mRandom)) * kRate);
        } else {
            mPause = static_cast<int64_t>((0.02 + 0.13 * u(mRandom)) * kRate);
        }
    }
    const int64_t at = mAt++;
    if (at >= mSyllable) return 0.05;
    const double shape = 0.5 - 0.5 * std::cos(2.0 * kPi * static_cast<double>(at) / static_cast<double>(mSyllable));
    return std::max(0.05, mPeak * shape);
}

double NoiseSource::next() {
    if (mKind == Noise::White) return mGaussian.next();
    static const double scale = 1.0 / std::sqrt(speechPower());
    return pink() * envelope() * scale;
}

double NoiseSource::speechPower() {
    NoiseSource raw(Noise::Speech, 1);
    double sum = 0.0;
    const int64_t n = static_cast<int64_t>(300 * kRate);
    for (int64_t i = 0; i < n; ++i) {
        const double v = raw.pink() * raw.envelope();
        sum += v * v;
    }
    return sum / static_cast<double>(n);
}

void synthesize(const ToneInNoise& spec, NoiseSource& noise, int64_t from, int64_t count, std::vector<int16_t>* out) {
    const double amplitude = std::sqrt(2.0) * dbfsToRms(kToneDbfs);
    const double noiseRms = spec.noiseDbfs < -150.0 ? 0.0 : dbfsToRms(spec.noiseDbfs);
    const double step = 2.0 * kPi * spec.hz / kRate;
    for (int64_t n = from; n < from + count; ++n) {
        double v = noiseRms > 0.0 ? noiseRms * noise.next() : 0.0;
        if (n >= spec.toneStart && n < spec.toneEnd) v += amplitude * std::sin(step * static_cast<double>(n - spec.toneStart) + spec.phase);
        out->push_back(static_cast<int16_t>(std::clamp(std::lrint(v * 32768.0), -32768L, 32767L)));
    }
}

}  // namespace envelope
}  // namespace korvo
