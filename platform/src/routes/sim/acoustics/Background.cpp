#include "routes/sim/acoustics/Background.h"

#include <sndfile.h>

#include <array>
#include <cmath>
#include <utility>

#include "routes/sim/SimRoomNoise.h"
#include "routes/sim/acoustics/PinkFilter.h"
#include "routes/sim/acoustics/Response.h"

namespace korvo {
namespace platform {
namespace acoustics {

namespace {

constexpr double kPi = 3.14159265358979323846;
constexpr const char* kNames[] = {"white", "pink", "brown", "fan", "babble", "music"};

// Uniform in [0, 1) from the noise source's bits (the same on every machine).
class Dice {
public:
    explicit Dice(uint64_t seed) : mNoise(seed) {}
    double uniform() { return 0.5 * (1.0 + std::erf(mNoise.next() / std::sqrt(2.0))); }
    double between(double lo, double hi) { return lo + (hi - lo) * uniform(); }
    double gauss() { return mNoise.next(); }

private:
    sim::NoiseSource mNoise;
};

class White : public SoundSource {
public:
    explicit White(uint64_t seed) : mNoise(seed) {}
    float next() override { return static_cast<float>(mNoise.next()); }

private:
    sim::NoiseSource mNoise;
};

class Pink : public SoundSource {
public:
    explicit Pink(uint64_t seed) : mNoise(seed) {}
    float next() override { return static_cast<float>(mFilter.next(mNoise.next())); }

private:
    sim::NoiseSource mNoise;
    PinkFilter mFilter;
};

// Integrated white noise, with a leak so that it does not wander off: -6 dB per octave
// above 7 Hz.
class Brown : public SoundSource {
public:
    explicit Brown(uint64_t seed) : mNoise(seed) {}
    float next() override {
        mY = 0.999 * mY + 0.05 * mNoise.next();
        return static_cast<float>(mY);
    }

private:
    sim::NoiseSource mNoise;
    double mY = 0.0;
};

// A fan: pink noise rolled off above 1.5 kHz, and the blades' tone at 150 Hz.
class Fan : public SoundSource {
public:
    Fan(uint64_t seed, double rate) : mPink(seed), mLow(Biquad::lowPass(1500.0, 0.7071, rate)), mStep(2.0 * kPi * 150.0 / rate) {}
    float next() override {
        mPhase = std::fmod(mPhase + mStep, 2.0 * kPi);
        return static_cast<float>(mLow.process(mPink.next()) + 0.3 * std::sin(mPhase));
    }

private:
    Pink mPink;
    Biquad mLow;
    double mStep;
    double mPhase = 0.0;
};

// One voice: syllables of a glottal pulse train at a gliding pitch through three formant
// resonances, with pauses between words. Voiced speech is a comb of harmonic lines that
// move, which is what a tone decoder must not take for a code.
class Talker : public SoundSource {
public:
    Talker(uint64_t seed, double rate) : mDice(seed), mRate(rate), mTilt(Biquad::lowPass(400.0, 0.7071, rate)) {
        mBreath ^= seed * 0x2545F4914F6CDD1Dull;
        if (mBreath == 0) mBreath = 1;  // a xorshift stays at zero
        startSyllable();
    }
    float next() override {
        if (mAt >= mLength) startSyllable();
        const double t = static_cast<double>(mAt++);
        double out = 0.0;
        if (mVoiced) {
            const double pitch = mPitch * (1.0 + mGlide * t / mLength);
            mPhase += pitch / mRate;
            double e = 0.02 * breath();
            if (mPhase >= 1.0) {
                mPhase -= 1.0;
                e += 1.0;
            }
            double v = mTilt.process(e);
            for (Biquad& f : mFormants) v = f.process(v);
            out = v * mEnvelope;
        }
        // The syllable's half-sine envelope by its recurrence: six voices cannot afford a
        // sine per sample each in a device that must stay light.
        const double next = mEnvelopeStep * mEnvelope - mEnvelopeBefore;
        mEnvelopeBefore = mEnvelope;
        mEnvelope = next;
        return static_cast<float>(out);
    }

private:
    // The breath under the pulses: uniform noise of unit variance from a xorshift, far
    // cheaper than a Gaussian and as formless once through the formants.
    double breath() {
        mBreath ^= mBreath << 13;
        mBreath ^= mBreath >> 7;
        mBreath ^= mBreath << 17;
        return std::sqrt(3.0) * (2.0 * static_cast<double>(mBreath >> 11) * 0x1.0p-53 - 1.0);
    }

    void startSyllable() {
        mAt = 0;
        mVoiced = mDice.uniform() > 0.2;  // one in five: a pause between words
        mLength = static_cast<int>(mRate * (mVoiced ? mDice.between(0.12, 0.3) : mDice.between(0.15, 0.6)));
        const double w = kPi / mLength;
        mEnvelope = 0.0;
        mEnvelopeBefore = -std::sin(w);
        mEnvelopeStep = 2.0 * std::cos(w);
        mPitch = mDice.between(90.0, 240.0);
        mGlide = mDice.between(-0.2, 0.2);
        const double f1 = mDice.between(300.0, 800.0), f2 = mDice.between(900.0, 2400.0), f3 = mDice.between(2400.0, 3400.0);
        mFormants = {Biquad::peak(f1, 20.0, 4.0, mRate), Biquad::peak(f2, 18.0, 5.0, mRate), Biquad::peak(f3, 14.0, 6.0, mRate)};
    }

    Dice mDice;
    double mRate;
    Biquad mTilt;
    std::array<Biquad, 3> mFormants{Biquad::peak(500, 0, 1, 44100), Biquad::peak(1500, 0, 1, 44100), Biquad::peak(2500, 0, 1, 44100)};
    int mAt = 0, mLength = 0;
    bool mVoiced = false;
    double mPitch = 120.0, mGlide = 0.0, mPhase = 0.0;
    double mEnvelope = 0.0, mEnvelopeBefore = 0.0, mEnvelopeStep = 2.0;
    uint64_t mBreath = 0x9E3779B97F4A7C15ull;
};

class Babble : public SoundSource {
public:
    static constexpr int kVoices = 6;
    Babble(uint64_t seed, double rate) {
        for (int v = 0; v < kVoices; ++v) mVoices.emplace_back(seed * 31 + static_cast<uint64_t>(v) + 1, rate);
    }
    float next() override {
        float s = 0.0f;
        for (Talker& t : mVoices) s += t.next();
        return s;
    }

private:
    std::vector<Talker> mVoices;
};

// Music made here: a loop of four chords, each note plucked with eight harmonics that fade
// (the higher the faster), over a bass note and a hi-hat of noise bursts above 7 kHz.
class Synth : public SoundSource {
public:
    Synth(uint64_t seed, double rate)
        : mNoise(seed), mRate(rate), mHat(Biquad::highPass(7000.0, 0.7071, rate)), mHatDecay(std::exp(-1.0 / (0.03 * rate))) {
        mPartials.reserve(32);  // four notes of eight harmonics: strike() never allocates
    }
    float next() override {
        const int chordLength = static_cast<int>(0.6 * mRate);
        if (mAt % chordLength == 0) strike((mAt / chordLength) % 4);
        if (mAt % static_cast<int>(0.15 * mRate) == 0) mHatLevel = 0.3;
        ++mAt;
        double s = 0.0;
        for (Partial& p : mPartials) {
            // A rotating phasor: no sine per sample.
            const double re = p.re * p.cosStep - p.im * p.sinStep;
            p.im = p.re * p.sinStep + p.im * p.cosStep;
            p.re = re;
            p.level *= p.decay;
            s += p.level * p.im;
        }
        mHatLevel *= mHatDecay;
        return static_cast<float>(s + mHatLevel * mHat.process(mNoise.next()));
    }

private:
    struct Partial {
        double re = 1.0, im = 0.0, cosStep = 1.0, sinStep = 0.0, level = 0.0, decay = 1.0;
    };
    void strike(int chord) {
        static constexpr int kChords[4][4] = {{48, 60, 64, 67}, {45, 57, 60, 64}, {41, 57, 60, 65}, {43, 59, 62, 67}};
        mPartials.clear();
        for (int midi : kChords[chord]) {
            const double hz = 440.0 * std::pow(2.0, (midi - 69) / 12.0);
            for (int h = 1; h <= 8 && hz * h < 0.45 * mRate; ++h) {
                Partial p;
                const double w = 2.0 * kPi * hz * h / mRate;
                p.cosStep = std::cos(w);
                p.sinStep = std::sin(w);
                p.level = 1.0 / h;
                p.decay = std::exp(-1.0 / (0.4 / std::sqrt(static_cast<double>(h)) * mRate));
                mPartials.push_back(p);
            }
        }
    }

    sim::NoiseSource mNoise;
    double mRate;
    Biquad mHat;
    double mHatLevel = 0.0;
    double mHatDecay;
    std::vector<Partial> mPartials;
    int mAt = 0;
};

// A recording, looped.
class Loop : public SoundSource {
public:
    explicit Loop(std::vector<float> samples) : mSamples(std::move(samples)) {}
    float next() override {
        const float s = mSamples[mAt];
        mAt = (mAt + 1) % mSamples.size();
        return s;
    }

private:
    std::vector<float> mSamples;
    size_t mAt = 0;
};

std::unique_ptr<SoundSource> rawSound(SoundKind kind, uint64_t seed, double rate, const std::vector<float>& music) {
    switch (kind) {
        case SoundKind::White: return std::make_unique<White>(seed);
        case SoundKind::Pink: return std::make_unique<Pink>(seed);
        case SoundKind::Brown: return std::make_unique<Brown>(seed);
        case SoundKind::Fan: return std::make_unique<Fan>(seed, rate);
        case SoundKind::Babble: return std::make_unique<Babble>(seed, rate);
        case SoundKind::Music:
            if (!music.empty()) return std::make_unique<Loop>(music);
            return std::make_unique<Synth>(seed, rate);
    }
    return nullptr;
}

class Scaled : public SoundSource {
public:
    Scaled(std::unique_ptr<SoundSource> source, float gain) : mSource(std::move(source)), mGain(gain) {}
    float next() override { return mGain * mSource->next(); }

private:
    std::unique_ptr<SoundSource> mSource;
    float mGain;
};

// A recording mixed to mono at `rate` (a rate of its own is converted by taking the nearest
// sample: music in a room is background, not a signal measured).
bool readMusic(const std::string& path, double rate, std::vector<float>* out, std::string* error) {
    SF_INFO info{};
    SNDFILE* f = sf_open(path.c_str(), SFM_READ, &info);
    if (!f) {
        *error = "music file " + path + ": " + sf_strerror(nullptr);
        return false;
    }
    std::vector<float> frames(static_cast<size_t>(info.frames) * static_cast<size_t>(info.channels));
    const sf_count_t got = sf_readf_float(f, frames.data(), info.frames);
    sf_close(f);
    if (got <= 0) {
        *error = "music file " + path + ": no samples";
        return false;
    }
    const double step = info.samplerate / rate;
    for (double at = 0.0; at < static_cast<double>(got); at += step) {
        const size_t i = static_cast<size_t>(at);
        float s = 0.0f;
        for (int c = 0; c < info.channels; ++c) s += frames[i * static_cast<size_t>(info.channels) + static_cast<size_t>(c)];
        out->push_back(s / static_cast<float>(info.channels));
    }
    double energy = 0.0;
    for (float s : *out) energy += double(s) * s;
    if (energy <= 0.0) {
        *error = "music file " + path + ": silent";
        return false;
    }
    return true;
}

}  // namespace

bool soundKindFromName(const std::string& name, SoundKind* kind) {
    for (size_t i = 0; i < std::size(kNames); ++i) {
        if (name == kNames[i]) {
            *kind = static_cast<SoundKind>(i);
            return true;
        }
    }
    return false;
}

const char* soundKindName(SoundKind kind) { return kNames[static_cast<size_t>(kind)]; }

// Scaled by the RMS of ten seconds of the same source (or of the whole recording).
std::unique_ptr<SoundSource> makeSound(SoundKind kind, uint64_t seed, double rate, std::vector<float> music) {
    double energy = 0.0;
    const long n = music.empty() ? static_cast<long>(10.0 * rate) : static_cast<long>(music.size());
    std::unique_ptr<SoundSource> probe = rawSound(kind, seed, rate, music);
    for (long i = 0; i < n; ++i) {
        const double s = probe->next();
        energy += s * s;
    }
    const float gain = static_cast<float>(1.0 / std::sqrt(energy / static_cast<double>(n)));
    return std::make_unique<Scaled>(rawSound(kind, seed, rate, music), gain);
}

std::unique_ptr<Background> Background::make(const std::vector<SoundSpec>& sounds, uint64_t seed, double rate,
                                             const std::string& musicFile, std::string* error) {
    std::unique_ptr<Background> b(new Background);
    std::vector<float> music;
    for (size_t i = 0; i < sounds.size(); ++i) {
        const SoundSpec& s = sounds[i];
        if (s.kind == SoundKind::Music && !musicFile.empty() && music.empty() && !readMusic(musicFile, rate, &music, error)) {
            return nullptr;
        }
        b->mSources.push_back({makeSound(s.kind, seed * 1000003 + i, rate, s.kind == SoundKind::Music ? music : std::vector<float>{}),
                               static_cast<float>(std::pow(10.0, s.dbfs / 20.0))});
    }
    return b;
}

void Background::add(float* samples, int count) {
    for (Source& s : mSources) {
        for (int i = 0; i < count; ++i) samples[i] += s.gain * s.source->next();
    }
}

}  // namespace acoustics
}  // namespace platform
}  // namespace korvo
