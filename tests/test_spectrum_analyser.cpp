// Frames with known spectra through the analyser, its averaging path and its error lines.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "analysis/WaveformCanvas.h"

using android::sp;
using android::WaveformCanvas;
namespace kt = korvo::platform::test;

namespace {

constexpr double kDivisor = 325.6832;

std::vector<short> sineFrame(int bin, double amplitude, int length = 512, int shift = 0) {
    std::vector<short> s(length);
    for (int j = 0; j < length; ++j) {
        s[j] = static_cast<short>(
            std::lround(amplitude * 32768.0 * std::sin(2.0 * M_PI * bin * (j - shift) / 512.0)));
    }
    return s;
}

std::vector<double> spectrumOf(const WaveformCanvas& w) {
    return std::vector<double>(w.spectrum->data, w.spectrum->data + w.spectrum->length);
}

class SpectrumAnalyserTest : public ::testing::Test {
protected:
    void SetUp() override {
        kt::resetAll();
        kt::captureLog(true);
        kt::clearLog();
        canvas = new WaveformCanvas();
    }
    sp<WaveformCanvas> canvas;
};

}  // namespace

TEST_F(SpectrumAnalyserTest, FramesWithKnownSpectra) {
    std::vector<short> silence(512, 0);
    canvas->drawSpectrum(silence.data(), 512);
    for (double m : spectrumOf(*canvas)) EXPECT_EQ(m, 0.0);

    std::vector<short> constant(512, 16384);
    canvas->drawSpectrum(constant.data(), 512);
    std::vector<double> spec = spectrumOf(*canvas);
    EXPECT_NEAR(spec[0], 256.0 / kDivisor, 1e-6);
    EXPECT_EQ(spec[0], static_cast<double>(256.0f / 325.6832f));
    for (int i = 1; i < 256; ++i) EXPECT_LT(spec[i], 1e-12) << i;

    for (int k : {1, 7, 37, 128, 255}) {
        SCOPED_TRACE("bin " + std::to_string(k));
        const std::vector<short> s = sineFrame(k, 0.5);
        canvas->drawSpectrum(const_cast<short*>(s.data()), 512);
        spec = spectrumOf(*canvas);
        EXPECT_NEAR(spec[k], 256.0 * 0.5 / kDivisor, 1e-4);
        for (int i = 0; i < 256; ++i) {
            if (i != k) EXPECT_LT(spec[i], 1e-4) << i;
        }
    }
    EXPECT_TRUE(kt::logLines().empty());
}

TEST_F(SpectrumAnalyserTest, CountSelectsTheAnalysedSamples) {
    const std::vector<short> tone = sineFrame(20, 0.25);
    canvas->drawSpectrum(const_cast<short*>(tone.data()), 512);
    const std::vector<double> want = spectrumOf(*canvas);

    // count 600: samples[88..599] are the frame; what lies before is not analysed.
    std::vector<short> longer(600);
    std::mt19937 rng(99);
    std::uniform_int_distribution<int> noise(-32768, 32767);
    for (int i = 0; i < 88; ++i) longer[i] = static_cast<short>(noise(rng));
    for (int i = 0; i < 512; ++i) longer[88 + i] = tone[i];
    canvas->drawSpectrum(longer.data(), 600);
    EXPECT_EQ(spectrumOf(*canvas), want);

    // Decided: a count below 512 analyses samples[0..511]; nothing before the frame is read
    // (the frame is its own heap block, so a read before it would trip the address checker).
    for (int count : {511, 100, 0, -7}) {
        SCOPED_TRACE("count " + std::to_string(count));
        canvas->drawSpectrum(silenceOr(nullptr), 0);
        std::vector<short> exact(tone);
        canvas->drawSpectrum(exact.data(), count);
        EXPECT_EQ(spectrumOf(*canvas), want);
    }
}
