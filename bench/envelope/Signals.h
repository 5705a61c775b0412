// The signals of the envelope: a code's tone in noise, as a microphone would capture it.
//
// The tone is a sine at the code's frequency with an RMS of kToneDbfs; the noise is
// full-band white noise, or speech-like noise (pink noise under a syllable-rate
// envelope). SNR is the tone's power over the noise's mean power across 0..22050 Hz.
#pragma once
#include <cstdint>
#include <random>
#include <vector>

#include "interface/SoundMeterConstants.h"
#include "routes/sim/acoustics/PinkFilter.h"

namespace korvo {
namespace envelope {

// The microphone's rate and a capture step's frame.
constexpr double kRate = korvo::kSampleRate;
constexpr int kFrame = korvo::kFrameSamples;

enum class Noise { White, Speech };
const char* noiseName(Noise noise);

// RMS of the tones: low enough that the noise of the lowest SNR stays clear of clipping.
constexpr double kToneDbfs = -36.0;

// Gaussian samples, quickly (Box-Muller on a 64-bit generator).
class Gaussian {
public:
    explicit Gaussian(uint64_t seed) : mRandom(seed) {}
    double next();

private:
    std::mt19937_64 mRandom;
    double mSpare = 0.0;
    bool mHaveSpare = false;
};

// Noise of unit mean power (full scale 1), sample by sample.
class NoiseSource {
public:
    NoiseSource(Noise kind, uint64_t seed);
    double next();
    // Mean power of the speech-like noise before scaling (measured once on a long stretch).
    static double speechPower();

private:
    double pink();
    double envelope();

    Noise mKind;
    Gaussian mGaussian;
    std::mt19937_64 mRandom;
    platform::acoustics::PinkFilter mPink;
    // The syllable in progress: its samples, where we are, its peak; then a pause.
    int64_t mSyllable = 0, mAt = 0, mPause = 0;
    double mPeak = 0.0;
    int mSyllablesToBreath = 0;
};

// Appends `seconds` of noise at `dbfs` (RMS) and, over [toneStart, toneEnd) samples of
// the whole signal, a tone of `hz` at kToneDbfs; 16-bit, clipped at full scale.
struct ToneInNoise {
    double hz = 0.0;
    int64_t toneStart = 0;
    int64_t toneEnd = 0;
    double phase = 0.0;
    double noiseDbfs = -200.0;  // below -150: no noise
};
void synthesize(const ToneInNoise& spec, NoiseSource& noise, int64_t from, int64_t count, std::vector<int16_t>* out);

double dbfsToRms(double dbfs);

}  // namespace envelope
}  // namespace korvo
