// A limited tone through the real playback thread into a WAV speaker route, measured
// from the file: frequency, peak, length of the tone and the silence after it.
#include <sndfile.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstdlib>

#include "support/ToneTestSupport.h"

namespace {

using namespace korvo::tonetest;

constexpr double kPi = 3.14159265358979323846;

double dftMagnitude(const Samples& s, size_t begin, size_t end, double hz, double rate) {
    double re = 0, im = 0;
    for (size_t n = begin; n < end; ++n) {
        double ph = 2 * kPi * hz * static_cast<double>(n) / rate;
        re += s[n] * std::cos(ph);
        im -= s[n] * std::sin(ph);
    }
    return std::hypot(re, im) / static_cast<double>(end - begin);
}

int peakAbs(const Samples& s, size_t begin, size_t end) {
    int peak = 0;
    for (size_t n = begin; n < end; ++n) peak = std::max(peak, std::abs(static_cast<int>(s[n])));
    return peak;
}

class ToneWavTest : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        if (const char* old = getenv("KORVO_SPEAKER")) mOldSpeaker = old;
        setenv("KORVO_SPEAKER", ("wav:" + mPath).c_str(), 1);
    }
    void TearDown() override {
        if (mOldSpeaker.empty()) unsetenv("KORVO_SPEAKER");
        else setenv("KORVO_SPEAKER", mOldSpeaker.c_str(), 1);
        std::remove(mPath.c_str());
        test::resetAll();
    }

    std::string mPath = "/tmp/korvo_tone_wav_" + std::to_string(getpid()) + ".wav";
    std::string mOldSpeaker;  // empty: none was set
};

TEST_F(ToneWavTest, LimitedToneInTheFile) {
    {
        Engine gen(AUDIO_STREAM_MUSIC, 0.8f, false);
        ASSERT_TRUE(gen.startTone(1, 200));  // code 1: 3440 Hz
        ASSERT_TRUE(waitUntil([&] { return stateOf(gen) == Engine::TONE_INIT; }, 5000));
        ASSERT_TRUE(test::waitTrackStopped(5000));
    }  // destroying the engine drops the track and closes the file

    SF_INFO info{};
    SNDFILE* f = sf_open(mPath.c_str(), SFM_READ, &info);
    ASSERT_NE(f, nullptr) << sf_strerror(nullptr);
    EXPECT_EQ(info.samplerate, 44100);
    ASSERT_EQ(info.channels, 1);  // the buffer below holds one channel
    EXPECT_EQ(info.format & SF_FORMAT_SUBMASK, SF_FORMAT_PCM_16);
    Samples s(static_cast<size_t>(info.frames));
    s.resize(static_cast<size_t>(sf_readf_short(f, s.data(), info.frames)));
    sf_close(f);

    // 200 ms = 8820 samples; the tone lasts until the first block whose running
    // total exceeds it: 11 blocks of 882, the last one the fade-out.
    const size_t kToneEnd = 11 * 882;
    const size_t kFadeBegin = 10 * 882;
    ASSERT_GE(s.size(), kToneEnd);

    // Frequency: strong at 3440 Hz, weak at the neighbouring codes' frequencies.
    double at = dftMagnitude(s, 0, kFadeBegin, 3440, 44100);
    EXPECT_GT(at, 5000.0);
    for (double other : {2580.0, 3010.0, 3870.0, 4300.0}) {
        EXPECT_GT(at, 50 * dftMagnitude(s, 0, kFadeBegin, other, 44100)) << other;
    }
    int crossings = 0;
    for (size_t n = 1; n < kFadeBegin; ++n) crossings += (s[n - 1] < 0) != (s[n] < 0) ? 1 : 0;
    EXPECT_NEAR(crossings / 2.0 / 0.2, 3440.0, 10.0);

    // Peak about 32767 x 0.45, up to the last full block.
    EXPECT_NEAR(peakAbs(s, 0, kFadeBegin), 14744, 30);
    EXPECT_GE(peakAbs(s, kFadeBegin - 882, kFadeBegin), 14600);
    // The fade-out block falls to nearly nothing.
    EXPECT_GE(peakAbs(s, kFadeBegin, kFadeBegin + 100), 12000);
    EXPECT_LE(peakAbs(s, kToneEnd - 20, kToneEnd), 400);
    EXPECT_GT(peakAbs(s, kToneEnd - 20, kToneEnd), 0);
    // Then silence.
    EXPECT_EQ(peakAbs(s, kToneEnd, s.size()), 0);

    // Sample for sample: a start block, nine continued blocks, one fade-out block.
    RefWave ref(44100, 3440, 0.45f);
    Samples want = ref.block(882, START);
    for (int b = 0; b < 9; ++b) append(want, ref.block(882, CONT));
    append(want, ref.block(882, STOP));
    EXPECT_TRUE(std::equal(want.begin(), want.end(), s.begin()));
}

}  // namespace
