// Frames with known spectra through the analyser, its averaging path and its error lines.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "analysis/WaveformCanvas.h"
#include "support/DspTestSupport.h"

using android::sp;
using android::WaveformCanvas;
using korvo::dsptest::frameTable;
using korvo::dsptest::stdoutOf;
using korvo::dsptest::Strings;
using korvo::dsptest::toneFrame;
namespace kt = korvo::platform::test;

namespace {

constexpr double kDivisor = 325.6832;
const std::string kResultsLine = "[WAVEFORM_CANVAS] spectrumAnalyser_getResults\n";

std::vector<double> values(const sp<WaveTable_Double>& t) { return std::vector<double>(t->data, t->data + t->length); }

class SpectrumAnalyserTest : public korvo::dsptest::LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        canvas = new WaveformCanvas();
    }
    // The spectrum of `frame` analysed on its own.
    std::vector<double> spectrumOf(std::vector<short> frame, int count = 512) {
        canvas->drawSpectrum(frame.data(), count);
        return values(canvas->spectrum);
    }
    sp<WaveformCanvas> canvas;
};

}  // namespace

TEST_F(SpectrumAnalyserTest, FramesWithKnownSpectra) {
    for (double m : spectrumOf(std::vector<short>(512, 0))) EXPECT_EQ(m, 0.0);
    std::vector<double> mags = spectrumOf(std::vector<short>(512, 16384));
    EXPECT_NEAR(mags[0], 256.0 / kDivisor, 1e-6);
    EXPECT_EQ(mags[0], static_cast<double>(256.0f / 325.6832f));
    for (int i = 1; i < 256; ++i) EXPECT_LT(mags[i], 1e-12) << i;

    for (int k : {1, 7, 37, 128, 255}) {
        SCOPED_TRACE("bin " + std::to_string(k));
        mags = spectrumOf(toneFrame(k, 0.5));
        EXPECT_NEAR(mags[k], 256.0 * 0.5 / kDivisor, 1e-4);
        for (int i = 0; i < 256; ++i) EXPECT_LT(i == k ? 0.0 : mags[i], 1e-4) << i;
    }
    EXPECT_TRUE(kt::logLines().empty());
}

TEST_F(SpectrumAnalyserTest, CountSelectsTheAnalysedSamples) {
    const std::vector<short> tone = toneFrame(20, 0.25);
    const std::vector<double> want = spectrumOf(tone);

    // count 600: samples[88..599] are the frame; what lies before is not analysed.
    std::vector<short> longer(600);
    std::mt19937 rng(99);
    std::uniform_int_distribution<int> noise(-32768, 32767);
    for (int i = 0; i < 88; ++i) longer[i] = static_cast<short>(noise(rng));
    std::copy(tone.begin(), tone.end(), longer.begin() + 88);
    EXPECT_EQ(spectrumOf(longer, 600), want);

    // Decided: a count below 512 analyses samples[0..511]; nothing before the frame is read
    // (the frame is its own heap block, so a read before it would trip the address checker).
    for (int count : {511, 100, 0, -7}) {
        spectrumOf(std::vector<short>(512, 0));
        EXPECT_EQ(spectrumOf(tone, count), want) << "count " << count;
    }
}

TEST_F(SpectrumAnalyserTest, SetInputConvertsOrRefuses) {
    std::vector<short> in(600);
    for (int i = 0; i < 600; ++i) in[i] = static_cast<short>(i * 100 - 30000);
    std::vector<double> out(514, 5.0);
    canvas->SpectrumAnalyser_setInput(in.data(), 50, 512, out.data() + 1);
    EXPECT_EQ(out[0], 5.0);
    EXPECT_EQ(out[513], 5.0);
    for (int i = 0; i < 512; ++i) EXPECT_EQ(out[1 + i], in[50 + i] / 32768.0) << i;
    EXPECT_TRUE(kt::logLines().empty());

    std::vector<double> untouched(512, 5.0);
    canvas->SpectrumAnalyser_setInput(in.data(), 0, 511, untouched.data());
    canvas->SpectrumAnalyser_setInput(in.data(), 0, 513, untouched.data());
    EXPECT_EQ(untouched, std::vector<double>(512, 5.0));
    EXPECT_EQ(korvo::dsptest::logMessages(6, "TQX"),
              (Strings{"[WAVEFORM_CANVAS] SpectrumAnalyser_setInput: bad input count(511) in FFT",
                       "[WAVEFORM_CANVAS] SpectrumAnalyser_setInput: bad input count(513) in FFT"}));
}

TEST_F(SpectrumAnalyserTest, DirectResultsIntoTablesOfOtherSizes) {
    sp<WaveTable_Double> fft = frameTable(toneFrame(30, 0.5));
    canvas->SpectrumAnalyser_Transform(fft);
    sp<WaveTable_Double> full = new WaveTable_Double(256);
    canvas->spectrumAnalyser_getResults_Last(fft, full);
    EXPECT_TRUE(kt::logLines().empty());
    EXPECT_NEAR(full->data[30], 128.0 / kDivisor, 1e-4);
    // Magnitude: |X_i| narrowed to single precision, then divided in single precision.
    const double a = fft->data[60], b = fft->data[59];
    EXPECT_EQ(full->data[30], static_cast<double>(static_cast<float>(std::sqrt(a * a + b * b)) / 325.6832f));
    EXPECT_EQ(full->data[0], static_cast<double>(static_cast<float>(std::fabs(fft->data[0])) / 325.6832f));

    // Shorter: logged, the entries that fit are written and nothing past the end.
    sp<WaveTable_Double> small = new WaveTable_Double(40);
    canvas->spectrumAnalyser_getResults_Last(fft, small);
    EXPECT_EQ(values(small), std::vector<double>(full->data, full->data + 40));
    // Longer: logged, 256 entries written, the rest kept.
    sp<WaveTable_Double> big = new WaveTable_Double(300);
    for (int i = 0; i < 300; ++i) big->data[i] = -1.0;
    canvas->spectrumAnalyser_getResults_Last(fft, big);
    std::vector<double> want = values(full);
    want.resize(300, -1.0);
    EXPECT_EQ(values(big), want);
    EXPECT_EQ(korvo::dsptest::logMessages(6, "TQX"),
              (Strings{"[WAVEFORM_CANVAS] bad output buffer size in FFT: must be 256; given 40",
                       "[WAVEFORM_CANVAS] bad output buffer size in FFT: must be 256; given 300"}));
}

TEST_F(SpectrumAnalyserTest, AveragingPathWithWidthThree) {
    // Three frames of different tone strengths on bin 12 and noise elsewhere.
    std::vector<sp<WaveTable_Double>> frames;
    std::vector<std::vector<float>> mags;
    std::mt19937 rng(3);
    std::uniform_int_distribution<int> noise(-2000, 2000);
    for (double amp : {0.1, 0.4, 0.7}) {
        std::vector<short> s = toneFrame(12, amp);
        for (short& v : s) v = static_cast<short>(v / 2 + noise(rng));
        sp<WaveTable_Double> t = frameTable(s);
        canvas->SpectrumAnalyser_Transform(t);
        sp<WaveTable_Double> direct = new WaveTable_Double(256);
        canvas->spectrumAnalyser_getResults_Last(t, direct);
        mags.emplace_back(direct->data, direct->data + 256);
        frames.push_back(t);
    }

    sp<WaveTable_Double> average = new WaveTable_Double(256);
    sp<WaveTable_Double_2> history = new WaveTable_Double_2(256, 3);
    int index = 0;
    std::vector<int> slots;
    EXPECT_EQ(stdoutOf([&] {
                  for (int f = 0; f < 3; ++f) {
                      index = canvas->spectrumAnalyser_getResults(frames[f], average, history, index);
                      slots.push_back(index);
                  }
              }),
              kResultsLine + kResultsLine + kResultsLine);
    EXPECT_EQ(slots, (std::vector<int>{1, 2, 0}));
    for (int i = 0; i < 256; ++i) {
        EXPECT_EQ(history->data[i * 3 + 1], mags[0][i]);
        EXPECT_EQ(history->data[i * 3 + 2], mags[1][i]);
        EXPECT_EQ(history->data[i * 3 + 0], mags[2][i]);
        const double mean = (static_cast<double>(mags[0][i]) + mags[1][i] + mags[2][i]) / 3.0;
        EXPECT_NEAR(average->data[i], mean, 1e-6 * (1.0 + mean)) << i;
    }
    // A fourth call overwrites the oldest slot and keeps the mean of the last three.
    stdoutOf([&] { EXPECT_EQ(canvas->spectrumAnalyser_getResults(frames[0], average, history, index), 1); });
    EXPECT_NEAR(average->data[12], (static_cast<double>(mags[1][12]) + mags[2][12] + mags[0][12]) / 3.0, 1e-6);
    EXPECT_TRUE(kt::logLines().empty());
}

TEST_F(SpectrumAnalyserTest, AveragingPathRefusesWrongSizes) {
    sp<WaveTable_Double> fft = new WaveTable_Double(512);
    fft->data[0] = 3.0;
    sp<WaveTable_Double> average = new WaveTable_Double(256);
    sp<WaveTable_Double_2> history = new WaveTable_Double_2(256, 2);
    sp<WaveTable_Double_2> badHistory = new WaveTable_Double_2(10, 2);
    EXPECT_EQ(stdoutOf([&] {
                  EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, new WaveTable_Double(255), badHistory, 0), -1);
                  EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, average, badHistory, 0), -1);
                  // Decided: a history without slots is refused the same way, without a line.
                  EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, average, new WaveTable_Double_2(256, 0), 0), -1);
              }),
              kResultsLine + kResultsLine + kResultsLine);
    EXPECT_EQ(values(average), std::vector<double>(256, 0.0));
    EXPECT_EQ(std::vector<double>(badHistory->data, badHistory->data + 20), std::vector<double>(20, 0.0));
    EXPECT_EQ(korvo::dsptest::logMessages(6, "TQX"),
              (Strings{"[WAVEFORM_CANVAS] bad average buffer size in FFT: must be 256 ; given 255",
                       "[WAVEFORM_CANVAS] bad history buffer size in FFT: must be 256 ; given 10"}));

    // Index -1 (after a refusal) and indices outside the history start again at slot 0.
    stdoutOf([&] {
        for (const auto& c : std::vector<std::pair<int, int>>{{-1, 0}, {0, 1}, {1, 0}, {7, 0}, {-9, 0}})
            EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, average, history, c.first), c.second) << c.first;
    });
}

TEST_F(SpectrumAnalyserTest, DrawSpectrumThroughTheHistory) {
    canvas->historyLength = 3;
    canvas->history = new WaveTable_Double_2(256, 3);
    const std::vector<short> tone = toneFrame(50, 0.6);
    std::vector<int> indices;
    stdoutOf([&] {
        for (int f = 0; f < 4; ++f) {
            spectrumOf(tone);
            indices.push_back(canvas->historyIndex);
        }
        EXPECT_EQ(indices, (std::vector<int>{1, 2, 0, 1}));
        EXPECT_NEAR(canvas->spectrum->data[50], 256.0 * 0.6 / kDivisor, 1e-4);

        // A refusal stores -1; the next frame writes slot 0.
        sp<WaveTable_Double> keep = canvas->spectrum;
        canvas->spectrum = new WaveTable_Double(100);
        spectrumOf(tone);
        EXPECT_EQ(canvas->historyIndex, -1);
        canvas->spectrum = keep;
        spectrumOf(tone);
        EXPECT_EQ(canvas->historyIndex, 0);
    });
    EXPECT_EQ(korvo::dsptest::logMessages(6, "TQX"),
              Strings{"[WAVEFORM_CANVAS] bad average buffer size in FFT: must be 256 ; given 100"});
}
