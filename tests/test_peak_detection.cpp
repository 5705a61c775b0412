// Peak detectors: the rule's consequences on hand-made arrays, the call path
// through the meter's own virtual operations, the log line, and a randomised
// comparison against a reference formulated as "rises, then the largest".
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <limits>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>
#include <utils/Timers.h>

#include "meter/SoundMeter.h"
#include "support/DspTestSupport.h"

namespace test = korvo::platform::test;
using korvo::dsptest::Strings;

namespace {

const int kEntries = 256;
const int kIntMax = std::numeric_limits<int>::max();
const float kNaN = std::numeric_limits<float>::quiet_NaN();
using Peaks = std::vector<std::pair<int, float>>;

// Exactly 256 floats on the heap, so that any read outside 0..255 trips ASan.
struct Spectrum {
    std::unique_ptr<float[]> v{new float[kEntries]()};
    explicit Spectrum(const Peaks& peaks = {}, float fill = 0.0f) {
        std::fill(v.get(), v.get() + kEntries, fill);
        for (const auto& p : peaks) v[p.first] = p.second;
    }
    float* data() { return v.get(); }
};

class PeakDetection : public korvo::dsptest::LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        meter.reset(new SoundMeter());
        test::clearLog();  // the meter's construction lines
    }
    std::unique_ptr<SoundMeter> meter;
};

enum Scan { kPlain, kZorv, kSecond };

TEST_F(PeakDetection, SingleScansOnHandMadeArrays) {
    const int kPreset = 77;  // the plain scan leaves the index alone when it finds nothing
    struct Check {
        Scan scan;
        int arg;
        float level;
        int index;
    };
    const struct {
        Peaks peaks;
        std::vector<Check> checks;
        float fill = 0.0f;
    } rows[] = {
        {{}, {{kPlain, 0, 0.0f, kPreset}, {kZorv, 0, 0.0f, 0}, {kSecond, 40, 0.0f, 0}}},
        // NaNs are no peaks, and an entry after a NaN is no rise.
        {{{200, 4.0f}}, {{kPlain, 0, 0.0f, kPreset}, {kZorv, 0, 0.0f, 0}}, kNaN},
        {{{30, 50.0f}}, {{kZorv, 0, 50.0f, 30}, {kPlain, 0, 50.0f, 30}, {kSecond, 30, 0.0f, 0}}},
        // 80 is the only running maximum outside the gap: it displaced the initial 0.
        {{{30, 50.0f}, {80, 40.0f}}, {{kSecond, 30, 0.0f, 0}}},
        {{{30, 50.0f}, {80, 40.0f}, {60, 10.0f}}, {{kSecond, 30, 10.0f, 60}}},
        // Equal maxima and plateaus: the lowest index wins.
        {{{40, 20.0f}, {90, 20.0f}}, {{kPlain, 0, 20.0f, 40}, {kZorv, 0, 20.0f, 40}}},
        {{{50, 30.0f}, {51, 30.0f}, {52, 30.0f}}, {{kPlain, 0, 30.0f, 50}, {kZorv, 0, 30.0f, 50}}},
        // A plateau that starts higher than the maximum so far but follows a rise.
        {{{50, 30.0f}, {51, 30.0f}, {52, 31.0f}}, {{kZorv, 0, 31.0f, 52}}},
        // Entry 1 faces 0.0 in the plain scan, entry 0 in the zorv scan.
        {{{0, 60.0f}, {1, 50.0f}}, {{kPlain, 0, 50.0f, 1}, {kZorv, 0, 0.0f, 0}}},
        // Entry 0 never becomes a peak, however large.
        {{{0, 99.0f}, {10, 5.0f}}, {{kPlain, 0, 5.0f, 10}, {kZorv, 0, 5.0f, 10}}},
        // From 100 the plain scan skips entry 100 and compares 101 with entry 99;
        // the zorv scan compares 101 with entry 100.
        {{{99, 40.0f}, {100, 5.0f}, {101, 30.0f}}, {{kPlain, 100, 0.0f, kPreset}, {kZorv, 100, 30.0f, 101}}},
        {{{99, 1.0f}, {100, 80.0f}, {101, 30.0f}}, {{kPlain, 100, 30.0f, 101}, {kZorv, 100, 0.0f, 0}}},
        // Starts at the end examine nothing; decided: a negative start counts as 0.
        {{{255, 9.0f}, {3, 1.0f}},
         {{kPlain, 254, 9.0f, 255}, {kPlain, 255, 0.0f, kPreset}, {kPlain, 1000, 0.0f, kPreset},
          {kZorv, 255, 0.0f, 0}, {kZorv, kIntMax, 0.0f, 0}, {kPlain, -7, 9.0f, 255}, {kZorv, -7, 9.0f, 255}}},
        // Entries 36..44 lie in the gap around 40 and are neither compared nor
        // remembered: 45 faces 35 (a rise), not 44.
        {{{40, 90.0f}, {44, 70.0f}, {45, 20.0f}, {36, 60.0f}, {200, 50.0f}}, {{kSecond, 40, 20.0f, 45}}},
        // Entries 35 and 45 are outside the gap: a high 35 hides the rise at 45.
        {{{40, 90.0f}, {44, 70.0f}, {45, 20.0f}, {36, 60.0f}, {200, 50.0f}, {35, 25.0f}}, {{kSecond, 40, 25.0f, 35}}},
        // A gap at the start: first = 3 hides 1..7, so 8 faces entry 0.
        {{{0, 10.0f}, {2, 99.0f}, {8, 5.0f}, {9, 12.0f}, {100, 30.0f}}, {{kSecond, 3, 12.0f, 9}}},
        // Now 8 is a rise too, then 9 displaces it, then 100 displaces 9.
        {{{0, 3.0f}, {2, 99.0f}, {8, 5.0f}, {9, 12.0f}, {100, 30.0f}}, {{kSecond, 3, 12.0f, 9}}},
        // A gap at the end: first = 253 hides 249..255; far-off first values leave
        // nothing out, without overflow.
        {{{10, 4.0f}, {248, 6.0f}, {250, 90.0f}},
         {{kSecond, 253, 4.0f, 10}, {kSecond, std::numeric_limits<int>::min(), 6.0f, 248}, {kSecond, kIntMax, 6.0f, 248}}},
    };
    auto run = [&](Scan scan, float* s, int arg, int* idx) {
        if (scan == kPlain) return meter->detectPeakFreq(s, arg, idx);
        if (scan == kZorv) return meter->detectPeakFreq_zorv(s, arg, idx);
        return meter->detectSecondPeakFreq_zorv(s, arg, idx);
    };
    int n = 0;
    for (const auto& r : rows) {
        Spectrum s(r.peaks, r.fill);
        for (const Check& c : r.checks) {
            SCOPED_TRACE("row " + std::to_string(n) + ", scan " + std::to_string(c.scan) + "(" + std::to_string(c.arg) + ")");
            int idx = kPreset;
            EXPECT_EQ(run(c.scan, s.data(), c.arg, &idx), c.level);
            EXPECT_EQ(idx, c.index);
        }
        ++n;
    }

    // Negative levels are no peaks either.
    Spectrum s;
    for (int i = 0; i < kEntries; ++i) s.v[i] = -5.0f - i;
    int idx = kPreset;
    EXPECT_EQ(meter->detectPeakFreq(s.data(), 0, &idx), 0.0f);
    EXPECT_EQ(idx, kPreset);
}

TEST_F(PeakDetection, TwoPeakSearchesAndTheirLogLine) {
    struct Row {
        Peaks peaks;
        bool zorv;
        int presetSecond, wantFirst, wantSecond;  // the first index is preset to -1
        const char* log;  // after the time: indices after the swap, levels in the order found
    } rows[] = {
        {{}, true, -1, 0, 0, nullptr},
        {{{30, 50.0f}}, true, -1, 0, 30, nullptr},
        {{{30, 50.0f}, {80, 40.0f}, {60, 10.0f}}, true, -1, 30, 60, nullptr},  // not 80
        // Strongest below 100: the second search starts at 101; nothing found above
        // 100 leaves the preset -1, which sorts first.
        {{{40, 50.0f}, {100, 30.0f}}, false, -1, -1, 40, "-1(50.000000) and 40(0.000000)"},
        {{{40, 50.0f}, {100, 30.0f}, {101, 20.0f}}, false, -1, 40, 101, "40(50.000000) and 101(20.000000)"},
        // Strongest at 150: 120 is outside 1..99 and is never found; the preset survives.
        {{{150, 50.0f}, {120, 30.0f}}, false, -1, -1, 150, "-1(50.000000) and 150(0.000000)"},
        {{{150, 50.0f}, {120, 30.0f}}, false, 500, 150, 500, "150(50.000000) and 500(0.000000)"},
        {{{150, 12.5f}}, false, -1, -1, 150, "-1(12.500000) and 150(0.000000)"},
        // Entry 0 is the comparison value of every entry of 1..99 ...
        {{{150, 50.0f}, {50, 20.0f}, {0, 10.0f}}, false, -1, 50, 150, "50(50.000000) and 150(20.000000)"},
        {{{150, 50.0f}, {50, 20.0f}, {0, 30.0f}}, false, -1, -1, 150, "-1(50.000000) and 150(0.000000)"},
        // ... and no predecessor is involved: 60 follows a NaN, which would block it
        // under the peak rule, and of equal values the first one wins.
        {{{150, 50.0f}, {60, 20.0f}, {70, 20.0f}, {59, kNaN}}, false, -1, 60, 150, "60(50.000000) and 150(20.000000)"},
        // Entries within three of the first peak are left out of the low band.
        {{{100, 50.0f}, {97, 20.0f}, {96, 10.0f}}, false, -1, 96, 100, "96(50.000000) and 100(10.000000)"},
        // With the first peak at 103 or more nothing of 1..99 is excluded.
        {{{103, 50.0f}, {99, 20.0f}}, false, -1, 99, 103, "99(50.000000) and 103(20.000000)"},
    };
    int n = 0;
    for (const Row& r : rows) {
        SCOPED_TRACE("row " + std::to_string(n++));
        Spectrum s(r.peaks);
        int a = -1, b = r.presetSecond;
        test::clearLog();
        const long before = static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000);
        if (r.zorv) {
            meter->detectTwoPeakFreq_zorv(0.9f, s.data(), &a, &b);
        } else {
            meter->detectTwoPeakFreq(0.9f, s.data(), &a, &b);
        }
        const long after = static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000);
        EXPECT_EQ(a, r.wantFirst);
        EXPECT_EQ(b, r.wantSecond);
        const Strings lines = korvo::dsptest::logMessages(3, "TQX");
        ASSERT_EQ(lines.size(), r.log ? 1u : 0u);  // the zorv pair logs nothing
        if (!r.log) continue;
        long ms = -1;
        char rest[128] = {};
        ASSERT_EQ(std::sscanf(lines[0].c_str(), "[SoundMeter] TIME[%ld]%127[^\n]", &ms, rest), 2) << lines[0];
        EXPECT_GE(ms, before);
        EXPECT_LE(ms, after);
        EXPECT_EQ(rest, " Two Max Power is " + std::string(r.log) + " END");
    }
}

// Records the calls that reach the single-peak operations through the virtual table.
class RecordingMeter : public SoundMeter {
public:
    float detectPeakFreq(float* spectrum, int start, int* index) override {
        calls.push_back("peak(" + std::to_string(start) + ")");
        return SoundMeter::detectPeakFreq(spectrum, start, index);
    }
    float detectPeakFreq_zorv(float* spectrum, int start, int* index) override {
        calls.push_back("zorv(" + std::to_string(start) + ")");
        return SoundMeter::detectPeakFreq_zorv(spectrum, start, index);
    }
    float detectSecondPeakFreq_zorv(float* spectrum, int first, int* index) override {
        calls.push_back("second(" + std::to_string(first) + ")");
        if (!overrideSecond) return SoundMeter::detectSecondPeakFreq_zorv(spectrum, first, index);
        *index = 7;
        return 1.0f;
    }
    Strings calls;
    bool overrideSecond = false;
};

TEST_F(PeakDetection, TwoPeakOperationsGoThroughTheVirtualOperations) {
    RecordingMeter rec;
    SoundMeter_vir* api = &rec;
    Spectrum s({{40, 50.0f}, {120, 30.0f}}), h({{150, 50.0f}, {20, 30.0f}});
    int a = -1, b = -1;
    api->detectTwoPeakFreq(0.9f, s.data(), &a, &b);
    EXPECT_EQ(rec.calls, (Strings{"peak(0)", "peak(100)"}));
    EXPECT_EQ(a, 40);
    EXPECT_EQ(b, 120);
    rec.calls.clear();
    api->detectTwoPeakFreq(0.9f, h.data(), &a, &b);
    EXPECT_EQ(rec.calls, (Strings{"peak(0)"}));

    rec.calls.clear();
    rec.overrideSecond = true;
    a = -1, b = -1;
    api->detectTwoPeakFreq_zorv(0.9f, s.data(), &a, &b);
    EXPECT_EQ(rec.calls, (Strings{"zorv(0)", "second(40)"}));
    EXPECT_EQ(a, 7);
    EXPECT_EQ(b, 40);
}

// ---- reference scans, formulated differently: first collect the entries that
// rise above their comparison value and above 0, then take the largest of them
// (lowest index among equals).
struct Ref {
    int index = 0;
    float level = 0.0f;
    bool found = false;
};
struct Rise {
    int index;
    float level;
};

// Rises among entries from..255, leaving out those within four of `gap`; the first
// examined entry faces firstComparison, every later one the entry examined before it.
std::vector<Rise> rises(const float* s, int from, float firstComparison, long long gap = -1000) {
    std::vector<Rise> out;
    float before = firstComparison;
    for (int i = from; i < kEntries; ++i) {
        if (std::abs(i - gap) < 5) continue;
        if (s[i] > before && s[i] > 0.0f) out.push_back({i, s[i]});
        before = s[i];
    }
    return out;
}

Ref largest(const std::vector<Rise>& r, int belowIndex = kEntries) {
    Ref best;
    for (const Rise& x : r) {
        if (x.index >= belowIndex) break;
        if (!best.found || x.level > best.level) best = {x.index, x.level, true};
    }
    return best;
}

// Final maximum and the maximum it displaced, as detectSecondPeakFreq_zorv sees them.
Ref refSecond(const float* s, int first) {
    const std::vector<Rise> r = rises(s, 1, s[0], first);
    const Ref top = largest(r);
    return top.found ? largest(r, top.index) : Ref{};
}

float randomLevel(std::mt19937& rng) {
    const int k = std::uniform_int_distribution<int>(0, 99)(rng);
    if (k < 30) return 0.0f;
    if (k < 40) return -std::uniform_real_distribution<float>(0.0f, 50.0f)(rng);
    if (k < 70) return 10.0f * std::uniform_int_distribution<int>(1, 4)(rng);  // many equal values
    if (k < 95) return std::uniform_real_distribution<float>(0.0f, 100.0f)(rng);
    return kNaN;
}

// A scan's answer against the reference; a reported level is the level of the reported entry.
void expectScan(const float* s, float got, int index, const Ref& want, int indexIfNone) {
    ASSERT_EQ(got, want.level);
    ASSERT_EQ(index, want.found ? want.index : indexIfNone);
    if (got == 0.0f) return;
    ASSERT_GT(got, 0.0f);
    ASSERT_GE(index, 1);
    ASSERT_LE(index, 255);
    ASSERT_EQ(got, s[index]);
}

TEST_F(PeakDetection, RandomArraysAgainstReference) {
    test::captureLog(false);
    std::mt19937 rng(20240611u);
    std::uniform_int_distribution<int> firstPick(-10, 270);
    for (int n = 0; n < 2000 && !HasFatalFailure(); ++n) {
        SCOPED_TRACE("array " + std::to_string(n));
        Spectrum sp;
        float* s = sp.data();
        for (int i = 0; i < kEntries; ++i) s[i] = randomLevel(rng);
        if (n % 4 == 0) s[0] = 100.0f;  // a strong entry 0 now and then

        int idx;
        for (int start : {0, 100}) {
            SCOPED_TRACE("start " + std::to_string(start));
            idx = -12345;
            float got = meter->detectPeakFreq(s, start, &idx);
            expectScan(s, got, idx, largest(rises(s, start + 1, start == 0 ? 0.0f : s[start - 1])), -12345);
            idx = -12345;
            got = meter->detectPeakFreq_zorv(s, start, &idx);
            expectScan(s, got, idx, largest(rises(s, start + 1, s[start])), 0);
        }
        const int first = firstPick(rng);
        SCOPED_TRACE("first " + std::to_string(first));
        idx = -12345;
        const float got = meter->detectSecondPeakFreq_zorv(s, first, &idx);
        expectScan(s, got, idx, refSecond(s, first), 0);

        // The lowest index among equal largest values, where the rule lets it win:
        // its comparison value must be smaller than it.
        int j0 = 0;
        for (int i = 1; i < kEntries; ++i)
            if (s[i] > 0.0f && (j0 == 0 || s[i] > s[j0])) j0 = i;
        idx = -1;
        meter->detectPeakFreq_zorv(s, 0, &idx);
        if (j0 != 0 && s[j0 - 1] < s[j0]) { ASSERT_EQ(idx, j0); }
        idx = -1;
        meter->detectPeakFreq(s, 0, &idx);
        if (j0 != 0 && (j0 == 1 || s[j0 - 1] < s[j0])) { ASSERT_EQ(idx, j0); }

        const Ref zp = largest(rises(s, 1, s[0]));
        const Ref zq = refSecond(s, zp.index);
        int a = -1, b = -1;
        meter->detectTwoPeakFreq_zorv(0.9f, s, &a, &b);
        ASSERT_EQ(a, std::min(zp.index, zq.index));
        ASSERT_EQ(b, std::max(zp.index, zq.index));

        // Plain pair, with a preset that is either -1 or an arbitrary index.
        const int preset = (n % 3 == 0) ? -1 : firstPick(rng);
        int wantFirst = preset, wantSecond = preset;
        const Ref p = largest(rises(s, 1, 0.0f));
        if (p.found) wantFirst = p.index;
        Ref q;
        if (wantFirst < 100) {
            q = largest(rises(s, 101, s[99]));
        } else {
            std::vector<Rise> low;
            for (int i = 1; i < 100; ++i)
                if (s[i] > s[0] && s[i] > 0.0f && std::abs(i - wantFirst) > 3) low.push_back({i, s[i]});
            q = largest(low);
        }
        if (q.found) wantSecond = q.index;
        a = preset, b = preset;
        meter->detectTwoPeakFreq(0.9f, s, &a, &b);
        ASSERT_EQ(a, std::min(wantFirst, wantSecond));
        ASSERT_EQ(b, std::max(wantFirst, wantSecond));
    }
}

}  // namespace
