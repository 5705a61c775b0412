// The frame decoder on tones, noise, speech and music made by sox and espeak-ng at test
// time. Statistics belong to bench/decoder; each case here is one signal.
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <korvo/platform/Recording.h>

#include "host/hearing/FrameDecoder.h"
#include "routes/sim/acoustics/RoomReverb.h"

namespace {

using korvo::host::CodeSet;
using korvo::host::FrameDecoder;
using Samples = std::vector<int16_t>;
constexpr int kFrame = korvo::kFrameSamples;

struct Event {
    int frame;
    int code;
};

class FrameDecoderTest : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_NE(mkdtemp(&mDir[0]), nullptr); }
    void TearDown() override { std::filesystem::remove_all(mDir); }

    // Runs sox (or any shell command) writing `name` in the temporary directory, and reads
    // it back as the capture would deliver it.
    Samples make(const std::string& name, const std::string& command) {
        const std::string path = mDir + "/" + name;
        std::string cmd = command;
        for (size_t at; (at = cmd.find("OUT")) != std::string::npos;) cmd.replace(at, 3, path);
        EXPECT_EQ(std::system((cmd + " 2>/dev/null").c_str()), 0) << cmd;
        std::string cause;
        auto rec = korvo::platform::Recording::open(path, korvo::kSampleRate, &cause);
        EXPECT_TRUE(rec) << cause;
        Samples s(static_cast<size_t>(rec->totalSeconds() * korvo::kSampleRate) + kFrame);
        s.resize(static_cast<size_t>(std::max(0L, rec->read(s.data(), static_cast<long>(s.size()), &cause))));
        return s;
    }
    std::vector<Event> decode(const Samples& s) {
        mDecoder.reset();
        std::vector<Event> events;
        for (size_t at = 0; at + kFrame <= s.size(); at += kFrame) {
            const CodeSet began = mDecoder.addFrame(&s[at]);
            for (int c = 0; c < FrameDecoder::kCodes; ++c)
                if (began & korvo::host::codeBit(c)) events.push_back({static_cast<int>(at / kFrame), c});
        }
        return events;
    }
    static std::string codes(const std::vector<Event>& events) {
        std::string s;
        for (const Event& e : events) s += std::to_string(e.code) + "@" + std::to_string(e.frame) + " ";
        return s;
    }

    FrameDecoder mDecoder;
    std::string mDir = "/tmp/korvo-frame-decoder-XXXXXX";
};

// A sine of `hz` for `ms` in Gaussian noise `snrDb` below it, after 300 ms of noise alone.
Samples toneInNoise(double hz, int ms, double snrDb, uint64_t seed, int gapMs = 0) {
    std::mt19937_64 rng(seed);
    const double a = 0.05;
    std::normal_distribution<double> noise(0.0, a / std::sqrt(2.0 * std::pow(10.0, snrDb / 10.0)));
    const int start = korvo::kSampleRate * 3 / 10 + static_cast<int>(rng() % kFrame);
    const int n = korvo::kSampleRate * ms / 1000, gap = korvo::kSampleRate * gapMs / 1000;
    Samples s(static_cast<size_t>(start + 2 * n + gap + korvo::kSampleRate / 2));
    for (size_t i = 0; i < s.size(); ++i) {
        const int t = static_cast<int>(i) - start;
        const bool on = (t >= 0 && t < n) || (gapMs > 0 && t >= n + gap && t < 2 * n + gap);
        const double tone = on ? a * std::sin(2.0 * M_PI * hz * t / korvo::kSampleRate) : 0.0;
        s[i] = static_cast<int16_t>(std::lround((tone + noise(rng)) * 32768.0));
    }
    return s;
}

TEST_F(FrameDecoderTest, EveryCodeAtModerateSnrIsHeardOnceQuickly) {
    for (int c = 0; c < FrameDecoder::kCodes; ++c) {
        const auto events = decode(toneInNoise(korvo::codeHz(c), 200, 0.0, 10u + static_cast<uint64_t>(c)));
        ASSERT_EQ(events.size(), 1u) << "code " << c << ": " << codes(events);
        EXPECT_EQ(events[0].code, c);
        EXPECT_LE(events[0].frame, 26 + 3) << "code " << c;  // the tone starts in frame 25 or 26
    }
    // A 40 ms tone at 0 dB SNR, and the same code said twice with a 150 ms gap.
    EXPECT_EQ(codes(decode(toneInNoise(korvo::codeHz(7), 40, 0.0, 3))).find("7@"), 0u);
    const auto twice = decode(toneInNoise(korvo::codeHz(12), 100, 10.0, 4, 150));
    ASSERT_EQ(twice.size(), 2u) << codes(twice);
    EXPECT_EQ(twice[0].code + twice[1].code, 24);
    // A sender 2 % slow at code 22, whose tone lies nearly as close to code 21.
    const auto low = decode(toneInNoise(korvo::codeHz(22) * 0.98, 200, 10.0, 5));
    EXPECT_EQ(codes(low).substr(0, 3), "22@") << codes(low);
}

// As that tone ends, a long window that it only partly fills reads it nearer code 21.
TEST_F(FrameDecoderTest, ASlowCode22EndsWithoutACode21) {
    EXPECT_EQ(decode(toneInNoise(korvo::codeHz(22) * 0.98, 200, 10.0, 5)).size(), 1u);
}

// In digital silence (no room noise) an overdriven or clipped tone's folded harmonics
// stand far above the floor, longest as the tone ends.
TEST_F(FrameDecoderTest, DistortedAndClippedTonesAreHeardAsTheirOwnCodeOnly) {
    // Code 3's 3rd harmonic lies on code 15, its 2nd on code 9; code 17's 17th folds onto 16.
    for (int c : {3, 17}) {
        const std::string tone = "sox -R -n -r 44100 -b 16 OUT synth 0.3 sine " + std::to_string(korvo::codeHz(c)) + " pad 0.3 0.3 ";
        const auto driven = decode(make("drive.wav", tone + "vol 0.5 overdrive 10"));
        const auto clipped = decode(make("clip.wav", tone + "vol 0.9 gain 6"));
        EXPECT_EQ(codes(driven).find(std::to_string(c) + "@"), 0u) << codes(driven);
        EXPECT_EQ(driven.size(), 1u) << codes(driven);
        ASSERT_EQ(clipped.size(), 1u) << codes(clipped);
        EXPECT_EQ(clipped[0].code, c);
    }
}

// Talk-off: voices' harmonics and a ringtone's steady partials make lines at codes.
TEST_F(FrameDecoderTest, SpeechAndMusicAloneGiveNothing) {
    const auto speech = decode(make("speech.wav",
        "espeak-ng -v en -s 160 -w OUT 'Please leave your message after the tone. Seven hundred and forty two "
        "people were counted in the square at noon, and she sells sea shells by the sea shore.'"));
    EXPECT_TRUE(speech.empty()) << codes(speech);
    const auto voice = decode(make("voice.wav", "sox /usr/share/sounds/alsa/Front_Center.wav -r 44100 -c 1 -b 16 OUT"));
    EXPECT_TRUE(voice.empty()) << codes(voice);
    const auto music = decode(make("music.wav", "sox \"/usr/share/sounds/lomiri/ringtones/Sam's Song.ogg\" -r 44100 -c 1 -b 16 OUT"));
    EXPECT_TRUE(music.empty()) << codes(music);
}

TEST_F(FrameDecoderTest, AReverberantPairOfCodesIsHeardOnceEach) {
    // Codes 4 and 11 (11 = 2 x 4 + 3: its 2nd harmonic's code), 200 ms each, 150 ms apart.
    const auto events = decode(make("room.wav",
        "sox -R -n -r 44100 -b 16 OUT synth 0.2 sine " + std::to_string(korvo::codeHz(4)) + " vol 0.3 pad 0.3 0 : "
        "synth 0.2 sine " + std::to_string(korvo::codeHz(11)) + " vol 0.3 pad 0.15 1.5 reverb 90"));
    ASSERT_EQ(events.size(), 2u) << codes(events);
    EXPECT_EQ(events[0].code, 4);
    EXPECT_EQ(events[1].code, 11);
}

TEST_F(FrameDecoderTest, InALongReverberationWithoutNoiseACodeSaidAgainIsHeardAgain) {
    // Code 4 twice, 64 ms each, half a second apart, heard from 6 m in the simulated hall
    // (T60 2 s, critical distance 2.5 m), with no noise: the first tone's tail still rings far
    // above the silence when the second begins. (sox's reverberation falls into its own
    // quantisation within half a second: it cannot make this case.)
    korvo::platform::acoustics::RoomReverb hall(2.0, 2.5, 7, korvo::kSampleRate);
    const int tone = korvo::kSampleRate * 64 / 1000, second = korvo::kSampleRate / 2;
    std::vector<float> dry(3 * korvo::kSampleRate, 0.0f), wet(dry.size());
    for (int start : {0, second}) {
        for (int i = 0; i < tone; ++i)
            dry[static_cast<size_t>(start + i)] = static_cast<float>(0.45 * std::sin(2 * M_PI * korvo::codeHz(4) * i / korvo::kSampleRate));
    }
    hall.process(dry.data(), wet.data(), static_cast<int>(dry.size()));
    Samples heard(dry.size());
    for (size_t i = 0; i < dry.size(); ++i) heard[i] = static_cast<int16_t>(std::lrint(32767.0 * (dry[i] / 6.0 + wet[i])));
    const auto events = decode(heard);
    ASSERT_EQ(events.size(), 2u) << codes(events);
    EXPECT_EQ(events[0].code, 4);
    EXPECT_EQ(events[1].code, 4);
    EXPECT_NEAR(events[1].frame - events[0].frame, 43, 2) << "half a second apart";
}

TEST_F(FrameDecoderTest, ALoudspeakersHarmonicIsNotACodeWhenItsFundamentalBeatsWithItsEchoes) {
    // Code 0 with its 2nd harmonic (code 3's frequency) 30 dB down, as a cheap loudspeaker
    // plays it; the room's echoes beat with it, and for one frame they all but cancel the
    // fundamental at the microphone (40 dB down) while the harmonic, beating on its own,
    // stands as it was.
    const double f0 = korvo::codeHz(0), second = 0.3 * std::pow(10.0, -30.0 / 20.0);
    const int start = 20 * kFrame, dip = start + 5 * kFrame, end = start + 12 * kFrame;
    Samples s(static_cast<size_t>(end + korvo::kSampleRate / 2), 0);
    for (int i = start; i < end; ++i) {
        const double t = static_cast<double>(i - start) / korvo::kSampleRate;
        const double a = i >= dip && i < dip + kFrame ? 0.003 : 0.3;
        s[static_cast<size_t>(i)] = static_cast<int16_t>(std::lrint(32767.0 * (a * std::sin(2 * M_PI * f0 * t) + second * std::cos(4 * M_PI * f0 * t))));
    }
    const auto events = decode(s);
    ASSERT_EQ(events.size(), 1u) << codes(events);
    EXPECT_EQ(events[0].code, 0);
}

TEST_F(FrameDecoderTest, AnEchoBurstLongAfterACodeIsNotTheCodeAgainButTheCodeSaidAgainIs) {
    // Code 5 for 300 ms; 1.2 s later its echo comes back as a burst 45 dB under it (as sox's
    // reverberation sends it), then at 2.4 s the code is said again at its first level.
    const double hz = korvo::codeHz(5);
    const int second = korvo::kSampleRate;
    Samples s(static_cast<size_t>(3 * second), 0);
    std::mt19937_64 rng(11);
    std::normal_distribution<double> noise(0.0, 3e-5);
    const auto add = [&](int from, int count, double amplitude) {
        for (int i = 0; i < count; ++i) {
            const double t = static_cast<double>(i) / korvo::kSampleRate;
            s[static_cast<size_t>(from + i)] = static_cast<int16_t>(std::lrint(32767.0 * amplitude * std::sin(2 * M_PI * hz * t)));
        }
    };
    add(second / 4, 3 * second / 10, 0.3);
    add(second / 4 + 3 * second / 10 + 6 * second / 5, second / 10, 0.3 * std::pow(10.0, -45.0 / 20.0));
    add(12 * second / 5, 3 * second / 10, 0.3);
    for (int16_t& v : s) v = static_cast<int16_t>(v + std::lrint(32767.0 * noise(rng)));
    const auto events = decode(s);
    ASSERT_EQ(events.size(), 2u) << codes(events);
    EXPECT_EQ(events[1].code, 5);
    EXPECT_GT(events[1].frame, 2 * 86 + 8) << "the code said again, not its echo";
}

TEST_F(FrameDecoderTest, ThresholdsFollowTheNoiseModel) {
    // In noise alone a bin's power and each reference bin's are exponential; the noise
    // estimate is the rank-th smallest of `count` references. The chance that a bin passes
    // t times it, integrated over the order statistic's density on its own.
    auto falseAlarm = [](int count, int rank, double t) {
        const double logNorm = std::lgamma(count + 1.0) - std::lgamma(rank) - std::lgamma(count - rank + 1.0);
        double sum = 0.0;
        const double dz = 1e-4;
        for (double z = dz / 2; z < 20.0; z += dz)
            sum += std::exp(logNorm + (rank - 1) * std::log(-std::expm1(-z)) - z * (count - rank + 1) - t * z) * dz;
        return sum;
    };
    for (int w : {0, 1, FrameDecoder::kWindows - 1}) {
        for (int c : {0, 22}) {
            const int count = FrameDecoder::referenceCount(w);
            const double perFrame = falseAlarm(count, count * 3 / 4, mDecoder.threshold(w, c)) * mDecoder.searchBins(w, c) * FrameDecoder::kWindows;
            EXPECT_NEAR(std::log10(perFrame), -9.0, 0.01) << "window " << w << " code " << c;
        }
    }
}

}  // namespace
