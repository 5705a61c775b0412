// The hearing of read-outs: the builtin decoder's guard, code events, the calibration's
// proposals, the simulated capture and analysis, and the levelled ear.
#include <algorithm>
#include <array>
#include <cmath>
#include <random>
#include <set>
#include <vector>

#include <gtest/gtest.h>

#include "host/hearing/BuiltinDecoder.h"
#include "host/hearing/Calibration.h"
#include "host/hearing/CodeEvents.h"
#include "host/hearing/LevelledEar.h"
#include "envelope/simulated/SimulatedEar.h"

namespace {

using namespace korvo::host;
using Levels = std::array<float, korvo::kSpectrumBins>;

// Every bin at `base`, code c's own bin `over` levels above it.
Levels flat(float base, int code = -1, float over = 0.0f) {
    Levels l{};
    for (int b = 1; b < korvo::kSpectrumBins; ++b) l[b] = base;
    if (code >= 0) l[korvo::codeIndex(code)] = base + over;
    return l;
}


class FakeEar : public Ear {
public:
    Levels levels{};
    Levels masked{};
    int first = -1;
    int second = -1;
    int level = 0;
    int spectrum(float* out) override {
        std::copy(levels.begin(), levels.end(), out);
        return 1;
    }
    int maskedSpectrum(float* out) override {
        std::copy(masked.begin(), masked.end(), out);
        return 1;
    }
    void twoPeaks(float*, int* a, int* b) override {
        *a = first;
        *b = second;
    }
    int detectionLevel() override { return level; }
    void setDetectionLevel(int l) override { level = l; }
};

TEST(BuiltinDecoder, ThePeaksAreCodesUnlessAToneAboveTheBandsLeaksIntoThem) {
    FakeEar ear;
    BuiltinDecoder d;
    ear.first = korvo::codeIndex(17);
    ear.second = korvo::codeIndex(4);
    ear.masked[ear.first] = 60.0f;
    ear.masked[ear.second] = 65.0f;
    ear.levels = flat(30.0f);
    EXPECT_EQ(d.decide(ear), codeBit(17) | codeBit(4));
    ear.levels[210] = 71.0f;  // 11 levels over entry 200: not yet leakage
    EXPECT_EQ(d.decide(ear), codeBit(17) | codeBit(4));
    ear.levels[210] = 72.0f;  // code 18's tone: code 17 is its leakage; code 4 stands on its own
    EXPECT_EQ(d.decide(ear), codeBit(4));
    ear.levels[210] = 30.0f;
    ear.levels[korvo::codeIndex(17) + 3] = 30.5f;  // rising towards a tone above the bands
    EXPECT_EQ(d.decide(ear), codeBit(4));
    ear.first = 35;  // between codes
    ear.second = -1;
    EXPECT_EQ(d.decide(ear), 0u);
    ear.masked = Levels{};
    ear.first = korvo::codeIndex(3);
    EXPECT_EQ(d.decide(ear), 0u);  // nothing analysed yet: an empty read-out
}

TEST(CodeEvents, AnOnsetAndAgainOnlyAfterAQuietGap) {
    CodeEvents e;
    EXPECT_EQ(e.update(0, codeBit(2)), codeBit(2));
    EXPECT_EQ(e.update(1, codeBit(2) | codeBit(30)), codeBit(30));
    EXPECT_EQ(e.update(11, codeBit(2)), 0u);   // 10 steps after step 1: the same tone
    EXPECT_EQ(e.update(22, codeBit(2)), codeBit(2));
}

TEST(Calibration, ProposesTheLevelsTheNoiseModelGives) {
    // Every bin at 40 in one analysed frame read over two steps. Each of the 18 codes'
    // entries passes level L with probability exp(-10^(0.12 (L - 40))); per step that is
    // 9 exp(-10^(0.12 d)) < 1e-4 when 10^(0.12 d) > ln 90000 = 11.41, d > 8.81: L = 49.
    Calibration steady;
    const Levels room = flat(40.0f);
    steady.addStep(room.data());
    steady.addStep(room.data());
    EXPECT_EQ(steady.frames(), 1);
    Calibration::Proposal p = steady.propose();
    EXPECT_EQ(p.level, 49);
    EXPECT_LT(p.falsePer10k, 1.0);
    EXPECT_GT(steady.builtinFalsePerStep(48), 1e-4);

    // A steady tone on a code's entry (masked entry 30 + 10c shows bin 29 + 10c) is no level's noise.
    Levels tone = flat(40.0f);
    tone[korvo::codeIndex(6) - 1] = 80.0f;
    Calibration toned;
    toned.addStep(tone.data());
    EXPECT_GE(toned.propose().level, 80);

    Calibration silent;
    const Levels nothing{};
    for (int n = 0; n < 5; ++n) silent.addStep(nothing.data());
    p = silent.propose();
    EXPECT_TRUE(p.silent);
    EXPECT_EQ(p.level, 0);
}

// Frame f holds code (f % 18)'s tone: the read-out after a turn names the frame analysed.
TEST(SimulatedEar, TurnsAnalyseTheRingAsItStoodAndRunsOfFiveFramesAtEachPhase) {
    constexpr int kSteps = 200;
    std::set<int> everAnalysed;
    std::set<std::vector<int>> patterns;
    for (int phase = 0; phase < kPhases; ++phase) {
        SimulatedEar ear(phase);
        std::vector<int16_t> frame(korvo::kFrameSamples);
        std::set<int64_t> analysed;
        for (int64_t f = 0; f < kSteps; ++f) {
            const double hz = korvo::codeHz(static_cast<int>(f % 18));
            for (int i = 0; i < korvo::kFrameSamples; ++i) {
                frame[size_t(i)] = int16_t(std::lrint(9000.0 * std::sin(2.0 * M_PI * hz * double(f * korvo::kFrameSamples + i) / 44100.0)));
            }
            const int64_t before = ear.analysedFrame();
            ear.step(frame.data());
            const int64_t a = ear.analysedFrame();
            if (a < 0 || a == before) continue;
            ASSERT_LT(a, f) << "a turn sees the ring as it stood before this step's frame";
            EXPECT_GE(a, f - korvo::kRingSlots);
            float levels[korvo::kSpectrumBins] = {};
            ear.spectrum(levels);
            const int strongest = int(std::max_element(levels + 1, levels + korvo::kSpectrumBins) - levels);
            EXPECT_EQ(strongest, korvo::codeIndex(static_cast<int>(a % 18))) << "phase " << phase << ", frame " << a;
            if (f >= 20) analysed.insert(a);
        }
        // Five successive frames analysed, five skipped, over and over.
        std::vector<int> residues;
        for (int64_t a : analysed) {
            EXPECT_TRUE(analysed.count(a + 10) || a + 10 >= kSteps - 12) << "phase " << phase << ", frame " << a;
            residues.push_back(int(a % 10));
        }
        std::set<int> distinct(residues.begin(), residues.end());
        ASSERT_EQ(distinct.size(), 5u) << "phase " << phase;
        const int first = *std::find_if(distinct.begin(), distinct.end(), [&](int r) { return !distinct.count((r + 9) % 10); });
        for (int k = 0; k < 5; ++k) EXPECT_TRUE(distinct.count((first + k) % 10)) << "phase " << phase;
        everAnalysed.insert(distinct.begin(), distinct.end());
        patterns.insert(std::vector<int>(distinct.begin(), distinct.end()));
    }
    // Some phase analyses any given frame.
    EXPECT_EQ(everAnalysed.size(), 10u);
    EXPECT_GE(patterns.size(), 5u);
}

// Read at the open level with the level applied by the host, a read-out is the one the
// library gives at that level, entry for entry, in both read-outs.
TEST(LevelledEar, ShowsTheDecoderWhatTheReadOutShowsAtItsLevel) {
    std::mt19937 noise(11);
    std::normal_distribution<double> sample(0.0, 300.0);
    for (const int level : {-100, -5, 0, 37, 62}) {
        SimulatedEar atLevel(3);
        SimulatedEar open(3);
        atLevel.setDetectionLevel(level);
        open.setDetectionLevel(level);
        LevelledEar levelled(open);
        EXPECT_EQ(levelled.detectionLevel(), level);
        std::vector<int16_t> frame(korvo::kFrameSamples);
        long hidden = 0;  // entries the open read-out keeps and the level hides
        for (int f = 0; f < 40; ++f) {
            for (int i = 0; i < korvo::kFrameSamples; ++i) {
                const double tone = f % 7 < 3 ? 4000.0 * std::sin(2.0 * M_PI * korvo::codeHz(f % 18) * i / 44100.0) : 0.0;
                frame[size_t(i)] = int16_t(std::lrint(tone + (f % 5 == 4 ? 0.0 : sample(noise))));
            }
            atLevel.step(frame.data());
            open.step(frame.data());
            Levels want{}, got{}, seen{};
            EXPECT_EQ(levelled.spectrum(got.data()), atLevel.spectrum(want.data()));
            EXPECT_EQ(got, want) << "level " << level << ", frame " << f;
            want.fill(7.0f);
            got.fill(7.0f);
            atLevel.maskedSpectrum(want.data());
            levelled.maskedSpectrum(got.data());
            EXPECT_EQ(got, want) << "level " << level << ", frame " << f;
            levelled.openSpectrum(seen.data());
            hidden += std::count_if(seen.begin(), seen.end(), [&](float v) { return v != 0.0f && v <= level; });
        }
        EXPECT_TRUE(level <= 0 || hidden > 0) << "level " << level;
    }
}

}  // namespace
