// Fixed-point sine generator: constants, exact sequences, fade, continuity, wrap-around.
#include <cmath>
#include <cstdlib>

#include <log/log.h>

#include "support/ToneTestSupport.h"

namespace {

using namespace korvo::tonetest;
using WaveGeneratorTest = ToneTest;
using Fields = std::vector<int>;

// Coefficient, seed, state and gain.
Fields fields(const Gen& g) { return {g.mA1_Q14, g.mS2_0, g.mS1, g.mS2, g.mAmplitude_Q15}; }

// Real-valued counterpart of the integer recursion: with the coefficient
// a1 = 32768 cos(w') and the seed -S, y[k] = S sin(w'(k+1)) / sin(w').
double closedForm(const Gen& g, unsigned k) {
    double w = std::acos(g.mA1_Q14 / 32768.0);
    return -static_cast<double>(g.mS2_0) * std::sin(w * (k + 1)) / std::sin(w);
}

TEST_F(WaveGeneratorTest, ConstantsOfTheConstructor) {
    EXPECT_EQ(fields(Gen(44100, 1000, 0.45f)), (Fields{32435, -4543, 0, -4543, 15098}));
    EXPECT_TRUE(hasToneLine(ANDROID_LOG_ERROR,
                            "WaveGenerator init, mA1_Q14: 32435, mS2_0: -4543, mAmplitude_Q15: 15098"));
    EXPECT_EQ(fields(Gen(44100, 2580, 0.45f)), (Fields{30578, -11499, 0, -11499, 15098}));
    // A frequency of 0 would need 32768: limited to 32767.
    EXPECT_EQ(fields(Gen(44100, 0, 0.45f)), (Fields{32767, 0, 0, 0, 15098}));
    // Gains of one and two waves per segment, and the upper limit.
    EXPECT_EQ(Gen(44100, 3440, 0.9f / 2).mAmplitude_Q15, 15098);
    EXPECT_EQ(Gen(44100, 3440, 0.9f / 3).mAmplitude_Q15, 10065);
    EXPECT_EQ(Gen(44100, 3440, 0.97f).mAmplitude_Q15, 32500);
    EXPECT_EQ(Gen(44100, 3440, 1.0f).mAmplitude_Q15, 32500);
    EXPECT_EQ(Gen(44100, 3440, 0.96f).mAmplitude_Q15, 32210);
    // Other rates: the same formulas at 48000 Hz.
    Gen g48(48000, 2580, 0.45f);
    EXPECT_EQ(g48.mA1_Q14, static_cast<int>(32768.0 * std::cos(2580.0 / 48000.0 * 2 * M_PI)));
    EXPECT_EQ(g48.mS2_0, static_cast<int>(-32000.0 * std::sin(2580.0 / 48000.0 * 2 * M_PI)));
}

TEST_F(WaveGeneratorTest, QuarterRateSequence) {
    RefWave w(44100, 11025, 0.45f);
    // Recursion 32000, 0, -32000, 0 scaled by 15098/32768, rounded toward minus infinity.
    Samples want = {14744, 0, -14745, 0, 14744, 0, -14745, 0};
    EXPECT_EQ(w.block(8, START), want);
    EXPECT_EQ(fields(w.gen), (Fields{0, -32000, 0, -32000, 15098}));
    EXPECT_EQ(w.block(4, CONT), Samples(want.begin(), want.begin() + 4));
}

TEST_F(WaveGeneratorTest, FollowsTheSineOfItsCoefficient) {
    for (unsigned freq : {1000, 2580, 3440, 17200}) {
        RefWave w(44100, freq, 0.45f);
        Samples out = w.block(882, START);
        int peak = 0;
        for (unsigned k = 0; k < out.size(); ++k) {
            // Truncating shifts bias the recursion a little: 48 is 0.15% of full scale.
            ASSERT_NEAR(out[k], w.gen.mAmplitude_Q15 * closedForm(w.gen, k) / 32768.0, 48.0)
                << freq << " Hz, sample " << k;
            peak = std::max(peak, std::abs(static_cast<int>(out[k])));
        }
        // About 32767 x 0.45.
        EXPECT_GE(peak, 14600) << freq;
        EXPECT_LE(peak, 14800) << freq;
    }
}

TEST_F(WaveGeneratorTest, FadeOutBlock) {
    // A fresh generator fades from its seed, like a start.
    RefWave w(44100, 2580, 0.45f);
    Samples fade = w.block(882, STOP);
    EXPECT_EQ(Samples(fade.begin(), fade.begin() + 4), (Samples{5298, 9876, 13124, 14613}));
    // Linear envelope: amplitude 989462528 - k x 1121839 in Q31.
    for (unsigned k = 0; k < fade.size(); ++k) {
        double env = (989462528.0 - k * 1121839.0) / 65536.0 / 32768.0;
        ASSERT_NEAR(fade[k], env * closedForm(w.gen, k), 24.0) << "sample " << k;
    }
    // Ends near 0: the last sample's amplitude is about 15098 / 882 of full scale.
    EXPECT_LE(std::abs(fade.back()), 20);

    // The fade continues a running wave: the first samples equal the continuation's.
    RefWave a(44100, 2580, 0.45f), b(44100, 2580, 0.45f);
    a.block(500, START);
    b.block(500, START);
    Samples cont = a.block(882, CONT), stop = b.block(882, STOP);
    EXPECT_EQ(stop[0], cont[0]);
    EXPECT_NEAR(stop[441], cont[441] / 2, 20);
}

TEST_F(WaveGeneratorTest, StartContinueAndStopRules) {
    // A fresh generator continues from the seed: CONT equals START; other commands continue.
    EXPECT_EQ(RefWave(44100, 2580, 0.45f).block(882, CONT), RefWave(44100, 2580, 0.45f).block(882, START));
    EXPECT_EQ(RefWave(44100, 2580, 0.45f).block(100, 7), RefWave(44100, 2580, 0.45f).block(100, CONT));
    // 441 + 441 equals 882.
    RefWave w(44100, 3440, 0.45f);
    Samples halves = w.block(441, START);
    append(halves, w.block(441, CONT));
    EXPECT_EQ(halves, RefWave(44100, 3440, 0.45f).block(882, START));

    // STOP with count 0 touches neither buffer nor state; START with count 0 resets the state.
    w.block(123, START);
    Fields before = fields(w.gen);
    int16_t canary = 77;
    w.gen.getSamples(&canary, 0, STOP);
    EXPECT_EQ(canary, 77);
    EXPECT_EQ(fields(w.gen), before);
    w.gen.getSamples(&canary, 0, START);
    EXPECT_EQ(canary, 77);
    EXPECT_EQ(w.gen.mS1, 0);
    EXPECT_EQ(w.gen.mS2, w.gen.mS2_0);
    EXPECT_EQ(w.block(300, CONT), RefWave(44100, 3440, 0.45f).block(300, START));
}

TEST_F(WaveGeneratorTest, AddsIntoTheBufferWithWrapAround) {
    // A quarter-rate wave whose samples are exactly 10000, 0, -10000, 0.
    Gen g(44100, 11025, 0.45f);
    g.mAmplitude_Q15 = 10240;
    Samples buf = {30000, 5, -30000, -5};
    g.getSamples(buf.data(), 4, START);
    EXPECT_EQ(buf, (Samples{-25536, 5, 25536, -5}));
    // Two waves mix by addition.
    Samples mix(882, 0);
    RefWave(44100, 2580, 0.3f).addInto(mix, START);
    RefWave(44100, 3440, 0.3f).addInto(mix, START);
    Samples xs = RefWave(44100, 2580, 0.3f).block(882, START);
    Samples ys = RefWave(44100, 3440, 0.3f).block(882, START);
    for (size_t k = 0; k < mix.size(); ++k) ASSERT_EQ(mix[k], xs[k] + ys[k]) << k;
}

}  // namespace
