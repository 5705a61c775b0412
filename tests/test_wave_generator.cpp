// Fixed-point sine generator: constants, exact sequences, fade, continuity, wrap-around.
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>
#include <log/log.h>

#include "support/ToneTestSupport.h"
#include "tone/MiniToneGenerator.h"

namespace {

namespace test = korvo::platform::test;
using android::MiniToneGenerator;
using Gen = MiniToneGenerator::WaveGenerator;
using korvo::tonetest::hasLine;

class WaveGeneratorTest : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        test::captureLog(true);
        test::clearLog();
    }
};

std::vector<int16_t> run(Gen& g, unsigned count, unsigned command, int16_t fill = 0) {
    std::vector<int16_t> out(count, fill);
    g.getSamples(out.data(), count, command);
    return out;
}

// Real-valued counterpart of the integer recursion: with the coefficient
// a1 = 32768 cos(w') and the seed -S, y[k] = S sin(w'(k+1)) / sin(w').
double closedForm(const Gen& g, unsigned k) {
    double w = std::acos(g.mA1_Q14 / 32768.0);
    double s = -static_cast<double>(g.mS2_0);
    return s * std::sin(w * (k + 1)) / std::sin(w);
}

TEST_F(WaveGeneratorTest, ConstantsOfTheConstructor) {
    Gen g1000(44100, 1000, 0.45f);
    EXPECT_EQ(g1000.mA1_Q14, 32435);
    EXPECT_EQ(g1000.mS2_0, -4543);
    EXPECT_EQ(g1000.mS2, -4543);
    EXPECT_EQ(g1000.mS1, 0);
    EXPECT_EQ(g1000.mAmplitude_Q15, 15098);
    EXPECT_TRUE(hasLine("MiniToneGenerator", ANDROID_LOG_ERROR,
                        "WaveGenerator init, mA1_Q14: 32435, mS2_0: -4543, mAmplitude_Q15: 15098"));

    Gen g2580(44100, 2580, 0.45f);
    EXPECT_EQ(g2580.mA1_Q14, 30578);
    EXPECT_EQ(g2580.mS2_0, -11499);

    // Gains of one and two waves per segment, and the upper limit.
    EXPECT_EQ(Gen(44100, 3440, 0.9f / 2).mAmplitude_Q15, 15098);
    EXPECT_EQ(Gen(44100, 3440, 0.9f / 3).mAmplitude_Q15, 10065);
    EXPECT_EQ(Gen(44100, 3440, 0.97f).mAmplitude_Q15, 32500);
    EXPECT_EQ(Gen(44100, 3440, 1.0f).mAmplitude_Q15, 32500);
    EXPECT_EQ(Gen(44100, 3440, 0.96f).mAmplitude_Q15, 32210);

    // A frequency of 0 would need 32768: limited to 32767.
    Gen g0(44100, 0, 0.45f);
    EXPECT_EQ(g0.mA1_Q14, 32767);
    EXPECT_EQ(g0.mS2_0, 0);

    // Other rates: the same formulas at 48000 Hz.
    Gen g48(48000, 2580, 0.45f);
    EXPECT_EQ(g48.mA1_Q14, static_cast<int>(32768.0 * std::cos(2580.0 / 48000.0 * 2 * M_PI)));
    EXPECT_EQ(g48.mS2_0, static_cast<int>(-32000.0 * std::sin(2580.0 / 48000.0 * 2 * M_PI)));
}

TEST_F(WaveGeneratorTest, QuarterRateSequence) {
    Gen g(44100, 11025, 0.45f);
    EXPECT_EQ(g.mA1_Q14, 0);
    EXPECT_EQ(g.mS2_0, -32000);
    // Recursion 32000, 0, -32000, 0 scaled by 15098/32768, rounded toward minus infinity.
    std::vector<int16_t> want = {14744, 0, -14745, 0, 14744, 0, -14745, 0};
    EXPECT_EQ(run(g, 8, Gen::WAVEGEN_START), want);
    EXPECT_EQ(g.mS1, 0);
    EXPECT_EQ(g.mS2, -32000);
    EXPECT_EQ(run(g, 4, Gen::WAVEGEN_CONT), std::vector<int16_t>(want.begin(), want.begin() + 4));
}

TEST_F(WaveGeneratorTest, FollowsTheSineOfItsCoefficient) {
    for (unsigned freq : {1000u, 2580u, 3440u, 17200u}) {
        Gen g(44100, static_cast<unsigned short>(freq), 0.45f);
        std::vector<int16_t> out = run(g, 882, Gen::WAVEGEN_START);
        int peak = 0;
        for (unsigned k = 0; k < out.size(); ++k) {
            double want = g.mAmplitude_Q15 * closedForm(g, k) / 32768.0;
            // Truncating shifts bias the recursion a little: 48 is 0.15% of full scale.
            ASSERT_NEAR(out[k], want, 48.0) << freq << " Hz, sample " << k;
            peak = std::max(peak, std::abs(static_cast<int>(out[k])));
        }
        // About 32767 x 0.45.
        EXPECT_GE(peak, 14600) << freq;
        EXPECT_LE(peak, 14800) << freq;
    }
}

TEST_F(WaveGeneratorTest, FadeOutBlock) {
    Gen g(44100, 2580, 0.45f);
    ASSERT_EQ(g.mAmplitude_Q15, 15098);
    // A fresh generator fades from its seed, like a start.
    std::vector<int16_t> fade = run(g, 882, Gen::WAVEGEN_STOP);
    EXPECT_EQ(fade[0], 5298);
    EXPECT_EQ(fade[1], 9876);
    EXPECT_EQ(fade[2], 13124);
    EXPECT_EQ(fade[3], 14613);
    // Linear envelope: amplitude 989462528 - k x 1121839 in Q31.
    for (unsigned k = 0; k < fade.size(); ++k) {
        double env = (989462528.0 - k * 1121839.0) / 65536.0 / 32768.0;
        ASSERT_NEAR(fade[k], env * closedForm(g, k), 24.0) << "sample " << k;
    }
    // Ends near 0: the last sample's amplitude is about 15098 / 882 of full scale.
    EXPECT_LE(std::abs(fade.back()), 20);

    // The fade continues a running wave: the first samples equal the continuation's.
    Gen a(44100, 2580, 0.45f);
    Gen b(44100, 2580, 0.45f);
    run(a, 500, Gen::WAVEGEN_START);
    run(b, 500, Gen::WAVEGEN_START);
    std::vector<int16_t> cont = run(a, 882, Gen::WAVEGEN_CONT);
    std::vector<int16_t> stop = run(b, 882, Gen::WAVEGEN_STOP);
    EXPECT_EQ(stop[0], cont[0]);
    EXPECT_NEAR(stop[441], cont[441] / 2, 20);
}

TEST_F(WaveGeneratorTest, StartContinueAndStopRules) {
    // A fresh generator continues from the seed: CONT equals START.
    Gen fresh1(44100, 2580, 0.45f);
    Gen fresh2(44100, 2580, 0.45f);
    EXPECT_EQ(run(fresh1, 882, Gen::WAVEGEN_CONT), run(fresh2, 882, Gen::WAVEGEN_START));
    // Commands other than START and STOP continue.
    Gen odd(44100, 2580, 0.45f);
    Gen ref(44100, 2580, 0.45f);
    EXPECT_EQ(run(odd, 100, 7), run(ref, 100, Gen::WAVEGEN_CONT));

    // 441 + 441 equals 882.
    Gen split(44100, 3440, 0.45f);
    Gen whole(44100, 3440, 0.45f);
    std::vector<int16_t> a = run(split, 441, Gen::WAVEGEN_START);
    std::vector<int16_t> b = run(split, 441, Gen::WAVEGEN_CONT);
    a.insert(a.end(), b.begin(), b.end());
    EXPECT_EQ(a, run(whole, 882, Gen::WAVEGEN_START));

    // STOP with count 0 touches neither buffer nor state.
    Gen g(44100, 3440, 0.45f);
    run(g, 123, Gen::WAVEGEN_START);
    short s1 = g.mS1, s2 = g.mS2;
    std::vector<int16_t> untouched = run(g, 0, Gen::WAVEGEN_STOP);
    int16_t canary = 77;
    g.getSamples(&canary, 0, Gen::WAVEGEN_STOP);
    EXPECT_EQ(canary, 77);
    EXPECT_TRUE(untouched.empty());
    EXPECT_EQ(g.mS1, s1);
    EXPECT_EQ(g.mS2, s2);

    // START with count 0 resets the state to the seed.
    g.getSamples(&canary, 0, Gen::WAVEGEN_START);
    EXPECT_EQ(canary, 77);
    EXPECT_EQ(g.mS1, 0);
    EXPECT_EQ(g.mS2, g.mS2_0);
    Gen again(44100, 3440, 0.45f);
    EXPECT_EQ(run(g, 300, Gen::WAVEGEN_CONT), run(again, 300, Gen::WAVEGEN_START));
}

TEST_F(WaveGeneratorTest, AddsIntoTheBufferWithWrapAround) {
    // A quarter-rate wave whose samples are exactly 10000, 0, -10000, 0.
    Gen g(44100, 11025, 0.45f);
    g.mAmplitude_Q15 = 10240;
    std::vector<int16_t> buf = {30000, 5, -30000, -5};
    g.getSamples(buf.data(), 4, Gen::WAVEGEN_START);
    EXPECT_EQ(buf, (std::vector<int16_t>{-25536, 5, 25536, -5}));

    // Two waves mix by addition.
    Gen x(44100, 2580, 0.3f);
    Gen y(44100, 3440, 0.3f);
    Gen x2(44100, 2580, 0.3f);
    Gen y2(44100, 3440, 0.3f);
    std::vector<int16_t> mix(882, 0);
    x.getSamples(mix.data(), 882, Gen::WAVEGEN_START);
    y.getSamples(mix.data(), 882, Gen::WAVEGEN_START);
    std::vector<int16_t> xs = run(x2, 882, Gen::WAVEGEN_START);
    std::vector<int16_t> ys = run(y2, 882, Gen::WAVEGEN_START);
    for (size_t k = 0; k < mix.size(); ++k) ASSERT_EQ(mix[k], xs[k] + ys[k]) << k;
}

}  // namespace
