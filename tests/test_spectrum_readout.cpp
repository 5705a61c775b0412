// The spectrum read-outs: level arithmetic, counting, thresholds and the masked layout.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <cmath>
#include <set>
#include <string>
#include <vector>

#include "analysis/WaveformCanvas.h"

using android::sp;
using android::WaveformCanvas;
namespace kt = korvo::platform::test;

namespace {

constexpr float kSentinel = 7.5f;

// 256 entries with a guard on each side, all set to the sentinel.
struct GuardedOut {
    std::vector<float> buf = std::vector<float>(258, kSentinel);
    float* out() { return buf.data() + 1; }
    float operator[](int i) const { return buf[1 + i]; }
    bool guardsIntact() const { return buf.front() == kSentinel && buf.back() == kSentinel; }
};

// Entries that can carry a level in the masked layout: 26, 27, then every decade's
// x0 and x3..x7 up to 200.
std::set<int> maskedEntries() {
    std::set<int> s = {26, 27};
    for (int d = 3; d <= 20; ++d) s.insert(10 * d);
    for (int d = 3; d <= 19; ++d)
        for (int u = 3; u <= 7; ++u) s.insert(10 * d + u);
    return s;
}

class SpectrumReadoutTest : public ::testing::Test {
protected:
    void SetUp() override {
        kt::resetAll();
        canvas = new WaveformCanvas();
    }
    void setBin(int i, double m) { canvas->spectrum->data[i] = m; }
    sp<WaveformCanvas> canvas;
};

}  // namespace

TEST_F(SpectrumReadoutTest, EmptySpectrumReportsNothing) {
    GuardedOut a, b;
    EXPECT_EQ(canvas->getSpectrumData(a.out()), 0);
    EXPECT_EQ(canvas->getSpectrumData_zorv(b.out()), 0);
    EXPECT_EQ(a[0], kSentinel);
    for (int i = 1; i < 256; ++i) EXPECT_EQ(a[i], 0.0f) << i;
    EXPECT_EQ(b[0], kSentinel);
    EXPECT_EQ(b[1], kSentinel);
    for (int i = 2; i < 256; ++i) EXPECT_EQ(b[i], 0.0f) << i;
    EXPECT_TRUE(a.guardsIntact());
    EXPECT_TRUE(b.guardsIntact());
}

TEST_F(SpectrumReadoutTest, ExactLevels) {
    setBin(10, 1.0);
    setBin(11, 0.01);
    setBin(12, 1e-6);
    setBin(13, 1e-3);
    setBin(14, 10.0);
    setBin(0, 1.0);  // bin 0 is never reported
    GuardedOut a;
    EXPECT_EQ(canvas->getSpectrumData(a.out()), 4);
    EXPECT_EQ(a[10], 100.0f);
    EXPECT_EQ(a[11], 66.66667f);
    EXPECT_EQ(a[12], 0.0f);  // level 0: neither counted nor above the threshold 0
    EXPECT_EQ(a[13], 50.0f);
    EXPECT_FLOAT_EQ(a[14], 116.66667f);
    EXPECT_EQ(a[0], kSentinel);
    // Level unit: 1.2 dB of magnitude, 0 at 1e-6.
    for (double m : {3e-5, 0.2, 0.77}) {
        setBin(20, m);
        canvas->getSpectrumData(a.out());
        EXPECT_NEAR(a[20], (20.0 * std::log10(m) + 120.0) / 1.2, 1e-4);
    }
    EXPECT_TRUE(a.guardsIntact());
}

TEST_F(SpectrumReadoutTest, ThresholdsAndCounting) {
    const double minusFive = std::pow(10.0, -6.3);
    setBin(5, 1.0);                   // 100
    setBin(6, 1e-3);                  // exactly 50
    setBin(7, 0.01);                  // 66.66667
    setBin(8, minusFive);             // about -5
    setBin(9, std::pow(10.0, -4.5));  // 25
    setBin(10, std::nan(""));
    setBin(11, HUGE_VAL);  // +infinity is not finite either

    for (int level : {0, 50, -10}) {
        SCOPED_TRACE("threshold " + std::to_string(level));
        testing::internal::CaptureStdout();
        if (level != 0) canvas->setDetectionLevel(level);
        testing::internal::GetCapturedStdout();
        GuardedOut a;
        // Bins 5, 6, 7 and 9, whatever the threshold.
        EXPECT_EQ(canvas->getSpectrumData(a.out()), 4);
        EXPECT_EQ(a[5], 100.0f);
        EXPECT_EQ(a[6], level < 50 ? 50.0f : 0.0f);
        EXPECT_EQ(a[7], 66.66667f);
        if (level == -10) {
            EXPECT_NEAR(a[8], -5.0f, 1e-4);
        } else {
            EXPECT_EQ(a[8], 0.0f);
        }
        EXPECT_EQ(a[9], level < 25 ? 25.0f : 0.0f);
        EXPECT_EQ(a[10], 0.0f);
        EXPECT_EQ(a[11], 0.0f);
        for (int i = 12; i < 256; ++i) ASSERT_EQ(a[i], 0.0f) << i;
        for (int i = 1; i < 5; ++i) ASSERT_EQ(a[i], 0.0f) << i;
        EXPECT_EQ(a[0], kSentinel);
        EXPECT_TRUE(a.guardsIntact());
    }
}

TEST_F(SpectrumReadoutTest, MaskedLayout) {
    for (int i = 0; i < 256; ++i) setBin(i, 1.0);
    GuardedOut z;
    EXPECT_EQ(canvas->getSpectrumData_zorv(z.out()), 255);
    const std::set<int> mask = maskedEntries();
    EXPECT_EQ(mask.size(), 2u + 18u + 17u * 5u);
    for (int k = 2; k < 256; ++k) EXPECT_EQ(z[k], mask.count(k) ? 100.0f : 0.0f) << k;
    EXPECT_EQ(z[0], kSentinel);
    EXPECT_EQ(z[1], kSentinel);
    EXPECT_TRUE(z.guardsIntact());

    // Entry k carries bin k - 1: a tone in bin 30 gives nothing at 31 (x1 is masked).
    for (int i = 0; i < 256; ++i) setBin(i, 0.0);
    setBin(30, 1.0);
    setBin(29, 0.5);
    GuardedOut t;
    EXPECT_EQ(canvas->getSpectrumData_zorv(t.out()), 2);
    EXPECT_EQ(t[31], 0.0f);
    EXPECT_FLOAT_EQ(t[30], static_cast<float>((20.0 * std::log10(0.5) + 120.0) / 1.2));
    for (int k = 2; k < 256; ++k) {
        if (k != 30) {
            ASSERT_EQ(t[k], 0.0f) << k;
        }
    }

    // Level 80 at bin 25: entry 26 of the masked layout, entry 25 of the plain one.
    setBin(30, 0.0);
    setBin(29, 0.0);
    setBin(25, std::pow(10.0, -1.2));
    GuardedOut plain, masked;
    canvas->getSpectrumData(plain.out());
    canvas->getSpectrumData_zorv(masked.out());
    EXPECT_NEAR(plain[25], 80.0f, 1e-4);
    EXPECT_EQ(masked[26], plain[25]);
    EXPECT_EQ(masked[25], 0.0f);

    // Bin 255 is counted but has no entry.
    setBin(25, 0.0);
    setBin(255, 1.0);
    GuardedOut last;
    EXPECT_EQ(canvas->getSpectrumData_zorv(last.out()), 1);
    for (int k = 2; k < 256; ++k) ASSERT_EQ(last[k], 0.0f) << k;
    EXPECT_TRUE(last.guardsIntact());
}

TEST_F(SpectrumReadoutTest, MaskedLayoutThresholds) {
    setBin(29, 1e-3);                  // entry 30, level 50
    setBin(32, 0.01);                  // entry 33, level 66.67
    setBin(33, std::pow(10.0, -6.3));  // entry 34, level about -5
    testing::internal::CaptureStdout();
    canvas->setDetectionLevel(50);
    testing::internal::GetCapturedStdout();
    GuardedOut a;
    EXPECT_EQ(canvas->getSpectrumData_zorv(a.out()), 2);
    EXPECT_EQ(a[30], 0.0f);
    EXPECT_EQ(a[33], 66.66667f);
    EXPECT_EQ(a[34], 0.0f);
    testing::internal::CaptureStdout();
    canvas->setDetectionLevel(-10);
    testing::internal::GetCapturedStdout();
    GuardedOut b;
    EXPECT_EQ(canvas->getSpectrumData_zorv(b.out()), 2);
    EXPECT_EQ(b[30], 50.0f);
    EXPECT_NEAR(b[34], -5.0f, 1e-4);
    EXPECT_EQ(b[35], 0.0f);  // magnitude 0: -infinity is never written
}
