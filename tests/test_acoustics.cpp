// The simulated room's acoustics, each piece measured against its preset's numbers with
// oracles of the test's own: the analogue Butterworth magnitude through the bilinear map,
// a DFT at the harmonics, zero crossings for a clock, Schroeder's backward integration for
// a decay, a direct convolution sum.
#include <gtest/gtest.h>
#include <sndfile.h>
#include <unistd.h>

#include <array>
#include <cmath>
#include <cstdio>
#include <tuple>
#include <numeric>
#include <random>
#include <string>
#include <vector>

#include "routes/sim/acoustics/Background.h"
#include "routes/sim/acoustics/ClockDrift.h"
#include "routes/sim/acoustics/Convolver.h"
#include "routes/sim/acoustics/Distortion.h"
#include "routes/sim/acoustics/Presets.h"
#include "routes/sim/acoustics/Response.h"
#include "routes/sim/acoustics/RoomReverb.h"

using namespace korvo::platform::acoustics;

namespace {

constexpr double kRate = 44100.0;
constexpr double kPi = 3.14159265358979323846;

double codeHz(int code) { return 86.0 * (30 + 10 * code); }
double db(double ratio) { return 20.0 * std::log10(ratio); }

std::vector<float> sine(double hz, double amplitude, int count) {
    std::vector<float> x(static_cast<size_t>(count));
    for (int i = 0; i < count; ++i) x[static_cast<size_t>(i)] = static_cast<float>(amplitude * std::sin(2.0 * kPi * hz * i / kRate));
    return x;
}

double rms(const std::vector<float>& x, size_t from = 0) {
    double e = 0.0;
    for (size_t i = from; i < x.size(); ++i) e += double(x[i]) * x[i];
    return std::sqrt(e / static_cast<double>(x.size() - from));
}

// |X(f)| of a sine's amplitude, over a whole number of cycles.
double amplitudeAt(const std::vector<float>& x, double hz) {
    double re = 0.0, im = 0.0;
    for (size_t i = 0; i < x.size(); ++i) {
        re += x[i] * std::cos(2.0 * kPi * hz * static_cast<double>(i) / kRate);
        im += x[i] * std::sin(2.0 * kPi * hz * static_cast<double>(i) / kRate);
    }
    return 2.0 * std::hypot(re, im) / static_cast<double>(x.size());
}

// An analogue Butterworth filter through the bilinear transform, warped to match at fc.
double butterworthDb(double f, double fc, int order, bool lowPass) {
    const double ratio = std::tan(kPi * f / kRate) / std::tan(kPi * fc / kRate);
    const double r = lowPass ? ratio : 1.0 / ratio;
    return -10.0 * std::log10(1.0 + std::pow(r, 2.0 * order));
}

// The frequency of a sine from its rising zero crossings (interpolated), first to last.
double measuredHz(const std::vector<float>& x, size_t from) {
    double first = -1.0, last = -1.0;
    int crossings = 0;
    for (size_t i = from + 1; i < x.size(); ++i) {
        if (x[i - 1] < 0.0f && x[i] >= 0.0f) {
            const double t = static_cast<double>(i - 1) + x[i - 1] / (double(x[i - 1]) - x[i]);
            if (first < 0.0) first = t;
            last = t;
            ++crossings;
        }
    }
    return (crossings - 1) * kRate / (last - first);
}

}  // namespace

TEST(Acoustics, ResponsesHaveTheirPresetsCornersAndResonances) {
    const int codes[] = {0, 5, 10, 15, 17, 20, 22};
    for (const DevicePreset& d : devicePresets()) {
        for (ResponseSpec spec : {d.speaker, d.microphone}) {
            spec.peakHz = 0.0;  // the corners alone against the oracle
            for (int c : codes) {
                Response r(spec, kRate);
                std::vector<float> x = sine(codeHz(c), 0.5, 44100);
                r.process(x.data(), static_cast<int>(x.size()));
                double want = 0.0;
                if (spec.highPassHz > 0) want += butterworthDb(codeHz(c), spec.highPassHz, spec.highPassOrder, false);
                if (spec.lowPassHz > 0) want += butterworthDb(codeHz(c), spec.lowPassHz, spec.lowPassOrder, true);
                EXPECT_NEAR(db(rms(x, 22050) / (0.5 / std::sqrt(2.0))), want, 0.05) << d.name << " code " << c;
            }
        }
    }
    // A resonance: its full height at its centre, next to nothing three octaves away.
    ResponseSpec peak;
    peak.peakHz = 4000.0, peak.peakDb = 5.0, peak.peakQ = 2.0;
    for (const auto& [hz, want, tolerance] : {std::tuple{4000.0, 5.0, 0.02}, std::tuple{500.0, 0.0, 0.1}}) {
        Response r(peak, kRate);
        std::vector<float> x = sine(hz, 0.5, 44100);
        r.process(x.data(), static_cast<int>(x.size()));
        EXPECT_NEAR(db(rms(x, 22050) / (0.5 / std::sqrt(2.0))), want, tolerance) << hz;
    }
}

TEST(Acoustics, DistortionHasThePresetsHarmonicsAtFullScaleAndFallsWithLevel) {
    for (const DevicePreset& d : devicePresets()) {
        Distortion distortion(d.secondDb, d.thirdDb);
        EXPECT_EQ(distortion.none(), d.secondDb <= -200.0) << d.name;
        std::array<double, 2> fullScale{};
        for (const double level : {1.0, 0.5}) {
            std::vector<float> x = sine(1000.0, level, 2 * 4410);
            distortion.process(x.data(), static_cast<int>(x.size()));
            x.erase(x.begin(), x.begin() + 4410);  // the last 100 whole cycles, past the filters' start
            const double h1 = amplitudeAt(x, 1000.0), h2 = amplitudeAt(x, 2000.0), h3 = amplitudeAt(x, 3000.0);
            if (distortion.none()) {
                EXPECT_LT(h2 + h3, 1e-6) << d.name;
                continue;
            }
            if (level == 1.0) {
                EXPECT_NEAR(db(h2 / h1), d.secondDb, 0.05) << d.name;
                EXPECT_NEAR(db(h3 / h1), d.thirdDb, 0.05) << d.name;
                fullScale = {h2, h3};
            } else {
                // A driver's distortion grows with level: the second harmonic as its square,
                // the third as its cube.
                EXPECT_NEAR(h2 / fullScale[0], 0.25, 1e-3) << d.name;
                EXPECT_NEAR(h3 / fullScale[1], 0.125, 1e-3) << d.name;
            }
        }
    }
}

TEST(Acoustics, DistortionKeepsItsHarmonicsAboveHalfTheRateOutOfTheBand) {
    const DevicePreset& cheap = *findDevicePreset("cheap-speaker");
    Distortion distortion(cheap.secondDb, cheap.thirdDb);
    // 16.3 kHz at full scale: its harmonics at 32.7 and 49 kHz would fold to 11.4 and 4.9
    // kHz, beside codes 10 and 3. Over 200 whole cycles, the fundamental arrives kDelay late.
    const double hz = 16317.0;
    std::vector<float> x = sine(hz, 1.0, 2 * 44100);
    distortion.process(x.data(), static_cast<int>(x.size()));
    const std::vector<float> clean = sine(hz, 1.0, 2 * 44100);
    x.erase(x.begin(), x.begin() + 44100);
    const double h1 = amplitudeAt(x, hz);
    // In the pass band the fundamental is whole: 1 + 3 a3 / 4 (the cube's share).
    const double r3 = std::pow(10.0, cheap.thirdDb / 20.0);
    EXPECT_NEAR(h1, 1.0 + 3.0 * r3 / (1.0 - 3.0 * r3), 0.01);
    for (const double folded : {44100.0 - 2 * hz, 3 * hz - 44100.0}) EXPECT_LT(db(amplitudeAt(x, folded) / h1), -90.0) << folded;
    // And it is the input, kDelay later, over the square's constant (which the loudspeaker's
    // high-pass takes away).
    const double dc = std::accumulate(x.begin(), x.end(), 0.0) / static_cast<double>(x.size());
    for (size_t i : {1000u, 1001u, 1002u}) EXPECT_NEAR(x[i] - dc, h1 * clean[44100 + i - Distortion::kDelay], 0.01) << i;
}

TEST(Acoustics, AClockOffsetIsReadBackFromATonesFrequency) {
    std::vector<double> offsets = {500.0, -500.0};
    for (const DevicePreset& d : devicePresets()) {
        if (d.clockPpm != 0.0) offsets.push_back(d.clockPpm);
    }
    for (double ppm : offsets) {
        // A loudspeaker: device samples in, room samples out, the tone raised by the offset.
        std::string error;
        auto speaker = ClockDrift::forSpeaker(ppm, &error);
        ASSERT_TRUE(speaker) << error;
        const std::vector<float> in = sine(10000.0, 0.5, 3 * 44100);
        std::vector<float> room(in.size() + 1024);
        long made = 0;
        for (size_t at = 0; at < in.size(); at += 441) made += speaker->push(&in[at], 441, &room[static_cast<size_t>(made)], 441 + 64);
        room.resize(static_cast<size_t>(made));
        EXPECT_NEAR((measuredHz(room, 4410) / 10000.0 - 1.0) * 1e6, ppm, 1.0) << "speaker " << ppm;
        EXPECT_NEAR(static_cast<double>(made), static_cast<double>(in.size()) / (1.0 + ppm * 1e-6), 200.0) << ppm;

        // A microphone: the room's tone, sampled by a clock that runs fast, reads lower.
        struct Tone : ClockDrift::Source {
            std::vector<float> block = std::vector<float>(512);
            long at = 0;
            long fetch(float** data) override {
                for (float& s : block) s = static_cast<float>(0.5 * std::sin(2.0 * kPi * 10000.0 * static_cast<double>(at++) / kRate));
                *data = block.data();
                return static_cast<long>(block.size());
            }
        } tone;
        auto mic = ClockDrift::forMicrophone(ppm, &tone, &error);
        ASSERT_TRUE(mic) << error;
        std::vector<float> device(258 * 512);  // three seconds in whole pulls
        for (size_t at = 0; at < device.size(); at += 512) ASSERT_EQ(mic->pull(&device[at], 512), 512);
        EXPECT_NEAR((1.0 - measuredHz(device, 4410) / 10000.0) * 1e6, ppm, 1.0) << "microphone " << ppm;
    }
}

TEST(Acoustics, ReverberationDecaysInTheRoomsTimeWithTheRoomsEnergy) {
    for (const RoomPreset& room : roomPresets()) {
        RoomReverb reverb(room.decaySeconds, room.criticalDistanceM, 11, kRate);
        EXPECT_EQ(reverb.none(), room.decaySeconds <= 0.0) << room.name;
        if (reverb.none()) continue;
        const std::vector<float>& h = reverb.response();
        // Schroeder: the energy still to come from each instant on, in dB.
        std::vector<double> remaining(h.size() + 1, 0.0);
        for (size_t i = h.size(); i-- > 0;) remaining[i] = remaining[i + 1] + double(h[i]) * h[i];
        EXPECT_NEAR(remaining[0], 1.0 / (room.criticalDistanceM * room.criticalDistanceM), 1e-3 * remaining[0]) << room.name;
        auto when = [&](double levelDb) {
            size_t i = 0;
            while (10.0 * std::log10(remaining[i] / remaining[0]) > levelDb) ++i;
            return static_cast<double>(i) / kRate;
        };
        const double t60 = 3.0 * (when(-25.0) - when(-5.0));  // T20, extrapolated to 60 dB
        EXPECT_NEAR(t60, room.decaySeconds, 0.1 * room.decaySeconds) << room.name;

        // Played through, an impulse gives back the response, early taps and tail.
        std::vector<float> impulse(h.size() + 700, 0.0f), out(impulse.size());
        impulse[0] = 1.0f;
        for (size_t at = 0; at < impulse.size(); at += 700) {
            const int n = static_cast<int>(std::min<size_t>(700, impulse.size() - at));
            reverb.process(&impulse[at], &out[at], n);
        }
        double worst = 0.0;
        for (size_t i = 0; i < h.size(); ++i) worst = std::max(worst, std::fabs(double(out[i]) - h[i]));
        EXPECT_LT(worst, 1e-5) << room.name;
    }
}

TEST(Acoustics, TheConvolverIsADelayedConvolutionSum) {
    std::mt19937 random(5);
    std::uniform_real_distribution<float> u(-1.0f, 1.0f);
    std::vector<float> h(3000), x(9000);
    for (float& v : h) v = u(random);
    for (float& v : x) v = u(random);
    // A silence longer than the response: its tail dies out, then sound comes back.
    std::fill(x.begin() + 1500, x.begin() + 6000, 0.0f);
    Convolver c(h);
    EXPECT_EQ(c.partitions(), 6);
    std::vector<float> y(x.size());
    const int pieces[] = {1, 700, 13, 512, 1024, 3750, 3000};  // uneven, as a capture reads
    size_t at = 0;
    for (int n : pieces) {
        c.process(&x[at], &y[at], n);
        at += static_cast<size_t>(n);
    }
    ASSERT_EQ(at, x.size());
    for (size_t i = 0; i < y.size(); i += 7) {
        double want = 0.0;
        for (size_t k = 0; k < h.size() && k + Convolver::kBlock <= i; ++k) want += double(h[k]) * x[i - Convolver::kBlock - k];
        ASSERT_NEAR(y[i], want, 2e-3) << i;
    }
}

TEST(Acoustics, BackgroundSoundsPlayAtTheirLevels) {
    std::string error;
    for (const char* name : {"white", "pink", "brown", "fan", "babble", "music"}) {
        SoundKind kind;
        ASSERT_TRUE(soundKindFromName(name, &kind));
        EXPECT_STREQ(soundKindName(kind), name);
        auto b = Background::make({{kind, -30.0}}, 3, kRate, "", &error);
        ASSERT_TRUE(b) << error;
        std::vector<float> x(441000, 0.0f);  // the ten seconds its level is set on
        b->add(x.data(), static_cast<int>(x.size()));
        EXPECT_NEAR(db(rms(x)), -30.0, 0.01) << name;
    }
    SoundKind kind;
    EXPECT_FALSE(soundKindFromName("rain", &kind));

    // Music from a recording: looped at its level; a file that is not there is named.
    const std::string path = "/tmp/korvo-acoustics-" + std::to_string(getpid()) + ".wav";
    SF_INFO info{};
    info.samplerate = 22050, info.channels = 2, info.format = SF_FORMAT_WAV | SF_FORMAT_PCM_16;
    SNDFILE* f = sf_open(path.c_str(), SFM_WRITE, &info);
    ASSERT_NE(f, nullptr);
    std::vector<float> stereo;
    for (float s : sine(880.0, 0.5, 22050)) stereo.insert(stereo.end(), {s, s});  // 440 Hz at 22.05 kHz
    sf_writef_float(f, stereo.data(), 22050);
    sf_close(f);
    auto music = Background::make({{SoundKind::Music, -20.0}}, 3, kRate, path, &error);
    std::remove(path.c_str());
    ASSERT_TRUE(music) << error;
    std::vector<float> x(88200, 0.0f);
    music->add(x.data(), static_cast<int>(x.size()));
    EXPECT_NEAR(db(rms(x)), -20.0, 0.05);
    EXPECT_NEAR(measuredHz(x, 0), 440.0, 1.0);
    EXPECT_FALSE(Background::make({{SoundKind::Music, -20.0}}, 3, kRate, path, &error));
    EXPECT_EQ(error.rfind("music file " + path + ": ", 0), 0u) << error;
}

TEST(Acoustics, PresetsAreFoundByNameAndSettingsAreChecked) {
    EXPECT_EQ(roomPresetNames(), "quiet, office, kitchen, hall, street");
    EXPECT_EQ(devicePresetNames(), "ideal, phone, laptop, cheap-speaker");
    EXPECT_STREQ(findRoomPreset("hall")->name, "hall");
    EXPECT_EQ(findDevicePreset("tablet"), nullptr);
    // Today's room: nothing between the devices but gain 1.
    const RoomPreset& quiet = *findRoomPreset("quiet");
    EXPECT_EQ(quiet.decaySeconds, 0.0);
    EXPECT_EQ(quiet.distanceM, 1.0);
    EXPECT_TRUE(quiet.sounds.empty());
    const DevicePreset& ideal = *findDevicePreset("ideal");
    EXPECT_TRUE(ideal.speaker.flat());
    EXPECT_TRUE(ideal.microphone.flat());
    EXPECT_EQ(ideal.clockPpm, 0.0);
}
