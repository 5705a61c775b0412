// A loudspeaker's distortion, growing with level as a driver's does: y = x + a2 x^2 + a3 x^3
// on samples scaled to full scale 1. A full-scale sine comes out with its second and third
// harmonics at the given levels below its fundamental; at amplitude A the second falls as A^2 and the
// third as A^3, so a quiet tone is nearly clean.
//
// A driver's harmonics above half the rate are ultrasound that no microphone's converter lets
// through; made at the sampling rate they would fold back into the band as tones of their own
// (a code's harmonic heard as another code). So the curve is applied at twice the rate,
// between two linear-phase low-pass filters at half the original rate, which delays the sound
// by kDelay samples. Real-time: process() neither allocates nor blocks.
#pragma once
#include <array>

namespace korvo {
namespace platform {
namespace acoustics {

class Distortion {
public:
    static constexpr int kTaps = 127;              // each filter's, at twice the rate
    static constexpr int kDelay = (kTaps - 1) / 2;  // both filters' delay, at the rate

    // Harmonic levels in dB relative to the fundamental for a full-scale sine; a level at or
    // below -200 dB counts as none (and then the sound passes untouched, undelayed).
    Distortion(double secondDb, double thirdDb);
    bool none() const { return mA2 == 0.0 && mA3 == 0.0; }
    void process(float* samples, int count);

    // The upsampler's span in input samples, and the ring of shaped samples at twice the
    // rate: the filter's length rounded up to whole vectors of eight.
    static constexpr int kUp = (kTaps + 1) / 2;
    static constexpr int kRing = (kTaps + 7) / 8 * 8;

private:
    float shape(float x) const { return static_cast<float>(x + mA2 * x * x + mA3 * x * x * x); }
    float step(float x);
    void push(float shaped);  // the next sample at twice the rate

    double mA2;
    double mA3;
    // Histories, each stored twice over so that the newest kUp (kRing) read as one run.
    std::array<float, 2 * kUp> mIn{};
    std::array<float, 2 * kRing> mShaped{};
    int mInAt = 0, mShapedAt = 0;
    int mZeros = 0;  // silent input samples in a row: past both filters' length, silence out
};

// Total harmonic distortion (second and third) of a full-scale sine, in per cent.
double distortionPercent(double secondDb, double thirdDb);

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
