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

namespace test = korvo::platform::test;

namespace {

const int kEntries = 256;

// Exactly 256 floats on the heap, so that any read outside 0..255 trips ASan.
struct Spectrum {
    std::unique_ptr<float[]> v{new float[kEntries]()};
    float& operator[](int i) { return v[i]; }
    float* data() { return v.get(); }
};

Spectrum withPeaks(std::initializer_list<std::pair<int, float>> peaks) {
    Spectrum s;
    for (const auto& p : peaks) s[p.first] = p.second;
    return s;
}

class PeakDetection : public ::testing::Test {
protected:
    void SetUp() override {
        test::resetAll();
        meter.reset(new SoundMeter());
        test::captureLog(true);
        test::clearLog();
    }
    void TearDown() override { test::captureLog(false); }

    std::vector<std::string> tqxLines() {
        std::vector<std::string> out;
        for (const auto& l : test::logLines())
            if (l.tag == "TQX") out.push_back(l.msg);
        return out;
    }

    std::unique_ptr<SoundMeter> meter;
};

TEST_F(PeakDetection, AllZeroArray) {
    Spectrum s;
    int idx = 77;
    EXPECT_EQ(meter->detectPeakFreq(s.data(), 0, &idx), 0.0f);
    EXPECT_EQ(idx, 77);
    EXPECT_EQ(meter->detectPeakFreq_zorv(s.data(), 0, &idx), 0.0f);
    EXPECT_EQ(idx, 0);
    idx = 77;
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(s.data(), 40, &idx), 0.0f);
    EXPECT_EQ(idx, 0);
    int a = -1, b = -1;
    meter->detectTwoPeakFreq_zorv(0.9f, s.data(), &a, &b);
    EXPECT_EQ(a, 0);
    EXPECT_EQ(b, 0);
    // Negative levels are no peaks either.
    for (int i = 0; i < kEntries; ++i) s[i] = -5.0f - i;
    idx = 77;
    EXPECT_EQ(meter->detectPeakFreq(s.data(), 0, &idx), 0.0f);
    EXPECT_EQ(idx, 77);
    // Nor are NaNs; and an entry after a NaN is no rise.
    for (int i = 0; i < kEntries; ++i) s[i] = std::numeric_limits<float>::quiet_NaN();
    s[200] = 4.0f;
    idx = 77;
    EXPECT_EQ(meter->detectPeakFreq(s.data(), 0, &idx), 0.0f);
    EXPECT_EQ(idx, 77);
    EXPECT_EQ(meter->detectPeakFreq_zorv(s.data(), 0, &idx), 0.0f);
    EXPECT_EQ(idx, 0);
}

TEST_F(PeakDetection, SinglePeakAndDisplacedMaximum) {
    Spectrum s = withPeaks({{30, 50.0f}});
    int idx = -1;
    EXPECT_EQ(meter->detectPeakFreq_zorv(s.data(), 0, &idx), 50.0f);
    EXPECT_EQ(idx, 30);
    idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(s.data(), 0, &idx), 50.0f);
    EXPECT_EQ(idx, 30);
    idx = -1;
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(s.data(), 30, &idx), 0.0f);
    EXPECT_EQ(idx, 0);
    int a = -1, b = -1;
    meter->detectTwoPeakFreq_zorv(0.9f, s.data(), &a, &b);
    EXPECT_EQ(a, 0);
    EXPECT_EQ(b, 30);

    // 80 is the only running maximum outside the gap: it displaced the initial 0.
    s[80] = 40.0f;
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(s.data(), 30, &idx), 0.0f);
    EXPECT_EQ(idx, 0);
    s[60] = 10.0f;
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(s.data(), 30, &idx), 10.0f);
    EXPECT_EQ(idx, 60);
    meter->detectTwoPeakFreq_zorv(0.9f, s.data(), &a, &b);
    EXPECT_EQ(a, 30);
    EXPECT_EQ(b, 60);  // not 80
}

TEST_F(PeakDetection, EqualMaximaAndPlateaus) {
    Spectrum s = withPeaks({{40, 20.0f}, {90, 20.0f}});
    int idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(s.data(), 0, &idx), 20.0f);
    EXPECT_EQ(idx, 40);
    EXPECT_EQ(meter->detectPeakFreq_zorv(s.data(), 0, &idx), 20.0f);
    EXPECT_EQ(idx, 40);

    Spectrum p = withPeaks({{50, 30.0f}, {51, 30.0f}, {52, 30.0f}});
    idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(p.data(), 0, &idx), 30.0f);
    EXPECT_EQ(idx, 50);
    EXPECT_EQ(meter->detectPeakFreq_zorv(p.data(), 0, &idx), 30.0f);
    EXPECT_EQ(idx, 50);
    // A plateau that starts higher than the maximum so far but follows a rise.
    p[52] = 31.0f;
    EXPECT_EQ(meter->detectPeakFreq_zorv(p.data(), 0, &idx), 31.0f);
    EXPECT_EQ(idx, 52);
}

TEST_F(PeakDetection, EntryZeroAndStartIndexAsComparisonValue) {
    Spectrum s = withPeaks({{0, 60.0f}, {1, 50.0f}});
    int idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(s.data(), 0, &idx), 50.0f);  // entry 1 faces 0.0
    EXPECT_EQ(idx, 1);
    idx = -1;
    EXPECT_EQ(meter->detectPeakFreq_zorv(s.data(), 0, &idx), 0.0f);  // entry 1 faces entry 0
    EXPECT_EQ(idx, 0);
    // Entry 0 never becomes a peak, however large.
    Spectrum z = withPeaks({{0, 99.0f}, {10, 5.0f}});
    EXPECT_EQ(meter->detectPeakFreq(z.data(), 0, &idx), 5.0f);
    EXPECT_EQ(idx, 10);
    EXPECT_EQ(meter->detectPeakFreq_zorv(z.data(), 0, &idx), 5.0f);
    EXPECT_EQ(idx, 10);

    // From 100 the plain scan skips entry 100 and compares 101 with entry 99;
    // the zorv scan compares 101 with entry 100.
    Spectrum h = withPeaks({{99, 40.0f}, {100, 5.0f}, {101, 30.0f}});
    idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(h.data(), 100, &idx), 0.0f);
    EXPECT_EQ(idx, -1);
    EXPECT_EQ(meter->detectPeakFreq_zorv(h.data(), 100, &idx), 30.0f);
    EXPECT_EQ(idx, 101);
    h[99] = 1.0f;
    h[100] = 80.0f;
    idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(h.data(), 100, &idx), 30.0f);
    EXPECT_EQ(idx, 101);
    EXPECT_EQ(meter->detectPeakFreq_zorv(h.data(), 100, &idx), 0.0f);
    EXPECT_EQ(idx, 0);

    // Starts at the end examine nothing; decided: a negative start counts as 0.
    Spectrum e = withPeaks({{255, 9.0f}, {3, 1.0f}});
    idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(e.data(), 254, &idx), 9.0f);
    EXPECT_EQ(idx, 255);
    idx = -1;
    EXPECT_EQ(meter->detectPeakFreq(e.data(), 255, &idx), 0.0f);
    EXPECT_EQ(idx, -1);
    EXPECT_EQ(meter->detectPeakFreq(e.data(), 1000, &idx), 0.0f);
    EXPECT_EQ(idx, -1);
    EXPECT_EQ(meter->detectPeakFreq_zorv(e.data(), 255, &idx), 0.0f);
    EXPECT_EQ(idx, 0);
    EXPECT_EQ(meter->detectPeakFreq_zorv(e.data(), std::numeric_limits<int>::max(), &idx), 0.0f);
    EXPECT_EQ(idx, 0);
    EXPECT_EQ(meter->detectPeakFreq(e.data(), -7, &idx), 9.0f);
    EXPECT_EQ(idx, 255);
    EXPECT_EQ(meter->detectPeakFreq_zorv(e.data(), -7, &idx), 9.0f);
    EXPECT_EQ(idx, 255);
}

TEST_F(PeakDetection, SecondPeakGap) {
    // Entries 36..44 lie in the gap around 40 and are neither compared nor remembered:
    // 45 faces 35 (a rise), not 44.
    Spectrum s = withPeaks({{40, 90.0f}, {44, 70.0f}, {45, 20.0f}, {36, 60.0f}, {200, 50.0f}});
    int idx = -1;
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(s.data(), 40, &idx), 20.0f);
    EXPECT_EQ(idx, 45);
    // Entries 35 and 45 are outside the gap: a high 35 hides the rise at 45.
    s[35] = 25.0f;
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(s.data(), 40, &idx), 25.0f);
    EXPECT_EQ(idx, 35);
    // A gap at the start: first = 3 hides 1..7, so 8 faces entry 0.
    Spectrum g = withPeaks({{0, 10.0f}, {2, 99.0f}, {8, 5.0f}, {9, 12.0f}, {100, 30.0f}});
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(g.data(), 3, &idx), 12.0f);
    EXPECT_EQ(idx, 9);
    g[0] = 3.0f;  // now 8 is a rise too, then 9 displaces it, then 100 displaces 9
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(g.data(), 3, &idx), 12.0f);
    EXPECT_EQ(idx, 9);
    // A gap at the end: first = 253 hides 249..255.
    Spectrum t = withPeaks({{10, 4.0f}, {248, 6.0f}, {250, 90.0f}});
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(t.data(), 253, &idx), 4.0f);
    EXPECT_EQ(idx, 10);
    // Far-off first values leave nothing out, without overflow.
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(t.data(), std::numeric_limits<int>::min(), &idx), 6.0f);
    EXPECT_EQ(idx, 248);
    EXPECT_EQ(meter->detectSecondPeakFreq_zorv(t.data(), std::numeric_limits<int>::max(), &idx), 6.0f);
    EXPECT_EQ(idx, 248);
}

TEST_F(PeakDetection, PlainTwoPeakSearch) {
    int a, b;
    // Strongest below 100: the second search starts at 101.
    Spectrum s = withPeaks({{40, 50.0f}, {100, 30.0f}});
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, s.data(), &a, &b);
    EXPECT_EQ(a, -1);  // nothing found above 100: the preset -1 sorts first
    EXPECT_EQ(b, 40);
    s[101] = 20.0f;
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, s.data(), &a, &b);
    EXPECT_EQ(a, 40);
    EXPECT_EQ(b, 101);

    // Strongest at 150: 120 is outside 1..99 and is never found; the preset survives.
    Spectrum h = withPeaks({{150, 50.0f}, {120, 30.0f}});
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, h.data(), &a, &b);
    EXPECT_EQ(a, -1);
    EXPECT_EQ(b, 150);
    a = -1, b = 500;
    meter->detectTwoPeakFreq(0.9f, h.data(), &a, &b);
    EXPECT_EQ(a, 150);
    EXPECT_EQ(b, 500);

    // Entry 0 is the comparison value of every entry of 1..99.
    Spectrum z = withPeaks({{150, 50.0f}, {50, 20.0f}, {0, 10.0f}});
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, z.data(), &a, &b);
    EXPECT_EQ(a, 50);
    EXPECT_EQ(b, 150);
    z[0] = 30.0f;
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, z.data(), &a, &b);
    EXPECT_EQ(a, -1);
    EXPECT_EQ(b, 150);
    // ... and no predecessor is involved: 60 follows a NaN, which would block it
    // under the peak rule, and of equal values the first one wins.
    Spectrum q = withPeaks({{150, 50.0f}, {60, 20.0f}, {70, 20.0f}});
    q[59] = std::numeric_limits<float>::quiet_NaN();
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, q.data(), &a, &b);
    EXPECT_EQ(a, 60);
    EXPECT_EQ(b, 150);

    // Entries within three of the first peak are left out of the low band.
    Spectrum n = withPeaks({{100, 50.0f}, {97, 20.0f}, {96, 10.0f}});
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, n.data(), &a, &b);
    EXPECT_EQ(a, 96);
    EXPECT_EQ(b, 100);
    // With the first peak at 103 or more nothing of 1..99 is excluded.
    Spectrum m = withPeaks({{103, 50.0f}, {99, 20.0f}});
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, m.data(), &a, &b);
    EXPECT_EQ(a, 99);
    EXPECT_EQ(b, 103);
}

TEST_F(PeakDetection, TwoPeakLogLine) {
    Spectrum n = withPeaks({{100, 50.0f}, {97, 20.0f}, {96, 10.0f}});
    int a = -1, b = -1;
    const long before = static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000);
    meter->detectTwoPeakFreq(0.9f, n.data(), &a, &b);
    const long after = static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000);
    const auto all = test::logLines();
    ASSERT_EQ(all.size(), 1u);
    EXPECT_EQ(all[0].tag, "TQX");
    EXPECT_EQ(all[0].prio, 3);
    long ms = -1;
    char rest[128] = {};
    ASSERT_EQ(std::sscanf(all[0].msg.c_str(), "[SoundMeter] TIME[%ld]%127[^\n]", &ms, rest), 2) << all[0].msg;
    EXPECT_GE(ms, before);
    EXPECT_LE(ms, after);
    // Indices after the swap, levels in the order found.
    EXPECT_STREQ(rest, " Two Max Power is 96(50.000000) and 100(10.000000) END");

    // Nothing second: p2 is 0.0 and the preset shows.
    test::clearLog();
    Spectrum h = withPeaks({{150, 12.5f}});
    a = -1, b = -1;
    meter->detectTwoPeakFreq(0.9f, h.data(), &a, &b);
    const auto l2 = test::logLines();
    ASSERT_EQ(l2.size(), 1u);
    const std::string& msg = l2[0].msg;
    const std::string tail = " Two Max Power is -1(12.500000) and 150(0.000000) END";
    ASSERT_GE(msg.size(), tail.size());
    EXPECT_EQ(msg.substr(msg.size() - tail.size()), tail);

    // The zorv pair logs nothing.
    test::clearLog();
    meter->detectTwoPeakFreq_zorv(0.9f, n.data(), &a, &b);
    EXPECT_TRUE(test::logLines().empty());
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
        if (overrideSecond) {
            *index = 7;
            return 1.0f;
        }
        return SoundMeter::detectSecondPeakFreq_zorv(spectrum, first, index);
    }
    std::vector<std::string> calls;
    bool overrideSecond = false;
};

TEST_F(PeakDetection, TwoPeakOperationsGoThroughTheVirtualOperations) {
    RecordingMeter rec;
    SoundMeter_vir* api = &rec;
    Spectrum s = withPeaks({{40, 50.0f}, {120, 30.0f}});
    int a = -1, b = -1;
    api->detectTwoPeakFreq(0.9f, s.data(), &a, &b);
    EXPECT_EQ(rec.calls, (std::vector<std::string>{"peak(0)", "peak(100)"}));
    EXPECT_EQ(a, 40);
    EXPECT_EQ(b, 120);

    rec.calls.clear();
    Spectrum h = withPeaks({{150, 50.0f}, {20, 30.0f}});
    api->detectTwoPeakFreq(0.9f, h.data(), &a, &b);
    EXPECT_EQ(rec.calls, (std::vector<std::string>{"peak(0)"}));

    rec.calls.clear();
    rec.overrideSecond = true;
    a = -1, b = -1;
    api->detectTwoPeakFreq_zorv(0.9f, s.data(), &a, &b);
    EXPECT_EQ(rec.calls, (std::vector<std::string>{"zorv(0)", "second(40)"}));
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

std::vector<Rise> rises(const float* s, const std::vector<int>& examined, float firstComparison) {
    std::vector<Rise> out;
    for (size_t k = 0; k < examined.size(); ++k) {
        const float before = k == 0 ? firstComparison : s[examined[k - 1]];
        const float v = s[examined[k]];
        if (v > before && v > 0.0f) out.push_back({examined[k], v});
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

std::vector<int> range(int from, int to) {
    std::vector<int> v;
    for (int i = from; i <= to; ++i) v.push_back(i);
    return v;
}

// Final maximum and the maximum it displaced, as detectSecondPeakFreq_zorv sees them.
Ref refSecond(const float* s, int first) {
    std::vector<int> examined;
    for (int i = 1; i < kEntries; ++i)
        if (std::abs(static_cast<long long>(i) - first) >= 5) examined.push_back(i);
    const std::vector<Rise> r = rises(s, examined, s[0]);
    const Ref top = largest(r);
    if (!top.found) return {};
    return largest(r, top.index);
}

float randomLevel(std::mt19937& rng) {
    std::uniform_int_distribution<int> kind(0, 99);
    const int k = kind(rng);
    if (k < 30) return 0.0f;
    if (k < 40) return -std::uniform_real_distribution<float>(0.0f, 50.0f)(rng);
    if (k < 70) return 10.0f * std::uniform_int_distribution<int>(1, 4)(rng);  // many equal values
    if (k < 95) return std::uniform_real_distribution<float>(0.0f, 100.0f)(rng);
    return std::numeric_limits<float>::quiet_NaN();
}

void checkReported(const float* s, int index, float level) {
    if (level == 0.0f) return;
    ASSERT_GT(level, 0.0f);
    ASSERT_GE(index, 1);
    ASSERT_LE(index, 255);
    ASSERT_EQ(level, s[index]);
}

TEST_F(PeakDetection, RandomArraysAgainstReference) {
    test::captureLog(false);
    std::mt19937 rng(20240611u);
    std::uniform_int_distribution<int> firstPick(-10, 270);
    for (int n = 0; n < 2000; ++n) {
        SCOPED_TRACE("array " + std::to_string(n));
        Spectrum sp;
        float* s = sp.data();
        for (int i = 0; i < kEntries; ++i) s[i] = randomLevel(rng);
        if (n % 4 == 0) s[0] = 100.0f;  // a strong entry 0 now and then

        // Plain single peak, from 0 and from 100.
        for (int start : {0, 100}) {
            const Ref want = largest(rises(s, range(start + 1, 255), start == 0 ? 0.0f : s[start - 1]));
            int idx = -12345;
            const float got = meter->detectPeakFreq(s, start, &idx);
            ASSERT_EQ(got, want.level) << "start " << start;
            ASSERT_EQ(idx, want.found ? want.index : -12345) << "start " << start;
            checkReported(s, idx, got);
        }
        // Zorv single peak.
        for (int start : {0, 100}) {
            const Ref want = largest(rises(s, range(start + 1, 255), s[start]));
            int idx = -12345;
            const float got = meter->detectPeakFreq_zorv(s, start, &idx);
            ASSERT_EQ(got, want.level);
            ASSERT_EQ(idx, want.index);
            checkReported(s, idx, got);
        }
        // The lowest index among equal largest values, where the rule lets it win:
        // its comparison value must be smaller than it.
        {
            int j0 = 0;
            for (int i = 1; i < kEntries; ++i)
                if (s[i] > 0.0f && (j0 == 0 || s[i] > s[j0])) j0 = i;
            int idx = -1;
            meter->detectPeakFreq_zorv(s, 0, &idx);
            if (j0 != 0 && s[j0 - 1] < s[j0]) {
                ASSERT_EQ(idx, j0);
            }
            idx = -1;
            meter->detectPeakFreq(s, 0, &idx);
            if (j0 != 0 && (j0 == 1 || s[j0 - 1] < s[j0])) {
                ASSERT_EQ(idx, j0);
            }
        }
        // Second peak, for a random first.
        {
            const int first = firstPick(rng);
            const Ref want = refSecond(s, first);
            int idx = -12345;
            const float got = meter->detectSecondPeakFreq_zorv(s, first, &idx);
            ASSERT_EQ(got, want.level) << "first " << first;
            ASSERT_EQ(idx, want.index) << "first " << first;
            checkReported(s, idx, got);
        }
        // Zorv pair.
        {
            const Ref p = largest(rises(s, range(1, 255), s[0]));
            const Ref q = refSecond(s, p.index);
            int a = -1, b = -1;
            meter->detectTwoPeakFreq_zorv(0.9f, s, &a, &b);
            ASSERT_EQ(a, std::min(p.index, q.index));
            ASSERT_EQ(b, std::max(p.index, q.index));
        }
        // Plain pair, with a preset that is either -1 or an arbitrary index.
        {
            const int preset = (n % 3 == 0) ? -1 : firstPick(rng);
            int wantFirst = preset, wantSecond = preset;
            const Ref p = largest(rises(s, range(1, 255), 0.0f));
            if (p.found) wantFirst = p.index;
            if (wantFirst < 100) {
                const Ref q = largest(rises(s, range(101, 255), s[99]));
                if (q.found) wantSecond = q.index;
            } else {
                std::vector<Rise> low;
                for (int i = 1; i < 100; ++i)
                    if (s[i] > s[0] && s[i] > 0.0f && std::abs(i - wantFirst) > 3) low.push_back({i, s[i]});
                const Ref q = largest(low);
                if (q.found) wantSecond = q.index;
            }
            int a = preset, b = preset;
            meter->detectTwoPeakFreq(0.9f, s, &a, &b);
            ASSERT_EQ(a, std::min(wantFirst, wantSecond));
            ASSERT_EQ(b, std::max(wantFirst, wantSecond));
        }
    }
}

}  // namespace
