// The spectrum read-outs: level arithmetic, counting, thresholds and the masked layout.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <cmath>
#include <set>
#include <string>
#include <vector>

#include "analysis/WaveformCanvas.h"
#include "support/DspTestSupport.h"

using android::sp;
using android::WaveformCanvas;

namespace {

constexpr float kSentinel = 7.5f;

// 256 entries with a guard on each side, all set to the sentinel.
struct GuardedOut {
    std::vector<float> buf = std::vector<float>(258, kSentinel);
    float* out() { return buf.data() + 1; }
    float operator[](int i) const { return buf[1 + i]; }
    bool guardsIntact() const { return buf.front() == kSentinel && buf.back() == kSentinel; }
};

// (20 log10 m + 120) / 1.2: the level unit is 1.2 dB of magnitude, 0 at 1e-6.
double levelOf(double m) { return (20.0 * std::log10(m) + 120.0) / 1.2; }

class SpectrumReadoutTest : public korvo::dsptest::LoggedTest {
protected:
    void SetUp() override {
        LoggedTest::SetUp();
        canvas = new WaveformCanvas();
    }
    void setBin(int i, double m) { canvas->spectrum->data[i] = m; }
    void setLevel(int level) {
        korvo::dsptest::stdoutOf([&] { canvas->setDetectionLevel(level); });
    }
    // Runs a read-out; every entry below `from` must keep the sentinel, and so must the guards.
    GuardedOut readOut(bool masked, int wantCount) {
        GuardedOut a;
        EXPECT_EQ(masked ? canvas->getSpectrumData_zorv(a.out()) : canvas->getSpectrumData(a.out()), wantCount);
        for (int i = 0; i < (masked ? 2 : 1); ++i) EXPECT_EQ(a[i], kSentinel) << i;
        EXPECT_TRUE(a.guardsIntact());
        return a;
    }
    sp<WaveformCanvas> canvas;
};

}  // namespace

TEST_F(SpectrumReadoutTest, EmptySpectrumReportsNothing) {
    const GuardedOut a = readOut(false, 0), b = readOut(true, 0);
    for (int i = 1; i < 256; ++i) EXPECT_EQ(a[i], 0.0f) << i;
    for (int i = 2; i < 256; ++i) EXPECT_EQ(b[i], 0.0f) << i;
}

TEST_F(SpectrumReadoutTest, ExactLevels) {
    const std::vector<std::pair<double, float>> bins = {{1.0, 100.0f}, {0.01, 66.66667f}, {1e-6, 0.0f}, {1e-3, 50.0f}};
    for (size_t k = 0; k < bins.size(); ++k) setBin(10 + static_cast<int>(k), bins[k].first);
    setBin(14, 10.0);
    setBin(0, 1.0);  // bin 0 is never reported
    // Level 0 (bin 12) is neither counted nor above the threshold 0.
    GuardedOut a = readOut(false, 4);
    for (size_t k = 0; k < bins.size(); ++k) EXPECT_EQ(a[10 + static_cast<int>(k)], bins[k].second) << k;
    EXPECT_FLOAT_EQ(a[14], 116.66667f);
    for (double m : {3e-5, 0.2, 0.77}) {
        setBin(20, m);
        a = readOut(false, 5);
        EXPECT_NEAR(a[20], levelOf(m), 1e-4);
    }
}

TEST_F(SpectrumReadoutTest, ThresholdsAndCounting) {
    setBin(5, 1.0);                   // 100
    setBin(6, 1e-3);                  // exactly 50
    setBin(7, 0.01);                  // 66.66667
    setBin(8, std::pow(10.0, -6.3));  // about -5
    setBin(9, std::pow(10.0, -4.5));  // 25
    setBin(10, std::nan(""));
    setBin(11, HUGE_VAL);  // +infinity is not finite either
    for (int level : {0, 50, -10}) {
        SCOPED_TRACE("threshold " + std::to_string(level));
        if (level != 0) setLevel(level);
        const GuardedOut a = readOut(false, 4);  // bins 5, 6, 7 and 9, whatever the threshold
        EXPECT_EQ(a[5], 100.0f);
        EXPECT_EQ(a[6], level < 50 ? 50.0f : 0.0f);
        EXPECT_EQ(a[7], 66.66667f);
        if (level == -10) {
            EXPECT_NEAR(a[8], -5.0f, 1e-4);
        } else {
            EXPECT_EQ(a[8], 0.0f);
        }
        EXPECT_EQ(a[9], level < 25 ? 25.0f : 0.0f);
        for (int i = 1; i < 256; ++i) ASSERT_EQ(i >= 5 && i <= 9 ? 0.0f : a[i], 0.0f) << i;
    }
}

TEST_F(SpectrumReadoutTest, MaskedLayout) {
    // Entries that can carry a level: 26, 27, then every decade's x0 and x3..x7 up to 200.
    std::set<int> mask = {26, 27};
    for (int d = 3; d <= 20; ++d)
        for (int u : {0, 3, 4, 5, 6, 7})
            if (d < 20 || u == 0) mask.insert(10 * d + u);
    ASSERT_EQ(mask.size(), 2u + 18u + 17u * 5u);
    for (int i = 0; i < 256; ++i) setBin(i, 1.0);
    GuardedOut z = readOut(true, 255);
    for (int k = 2; k < 256; ++k) EXPECT_EQ(z[k], mask.count(k) ? 100.0f : 0.0f) << k;

    // Entry k carries bin k - 1: a tone in bin 30 gives nothing at 31 (x1 is masked).
    for (int i = 0; i < 256; ++i) setBin(i, 0.0);
    setBin(30, 1.0);
    setBin(29, 0.5);
    z = readOut(true, 2);
    EXPECT_FLOAT_EQ(z[30], static_cast<float>(levelOf(0.5)));
    for (int k = 2; k < 256; ++k) ASSERT_EQ(k == 30 ? 0.0f : z[k], 0.0f) << k;

    // Level 80 at bin 25: entry 26 of the masked layout, entry 25 of the plain one.
    setBin(30, 0.0);
    setBin(29, 0.0);
    setBin(25, std::pow(10.0, -1.2));
    const GuardedOut plain = readOut(false, 1);
    z = readOut(true, 1);
    EXPECT_NEAR(plain[25], 80.0f, 1e-4);
    EXPECT_EQ(z[26], plain[25]);
    EXPECT_EQ(z[25], 0.0f);

    // Bin 255 is counted but has no entry.
    setBin(25, 0.0);
    setBin(255, 1.0);
    z = readOut(true, 1);
    for (int k = 2; k < 256; ++k) ASSERT_EQ(z[k], 0.0f) << k;
}

TEST_F(SpectrumReadoutTest, MaskedLayoutThresholds) {
    setBin(29, 1e-3);                  // entry 30, level 50
    setBin(32, 0.01);                  // entry 33, level 66.67
    setBin(33, std::pow(10.0, -6.3));  // entry 34, level about -5
    setLevel(50);
    GuardedOut a = readOut(true, 2);
    EXPECT_EQ(a[30], 0.0f);
    EXPECT_EQ(a[33], 66.66667f);
    EXPECT_EQ(a[34], 0.0f);
    setLevel(-10);
    a = readOut(true, 2);
    EXPECT_EQ(a[30], 50.0f);
    EXPECT_NEAR(a[34], -5.0f, 1e-4);
    EXPECT_EQ(a[35], 0.0f);  // magnitude 0: -infinity is never written
}
