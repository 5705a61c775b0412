// The real forward transform against a plain DFT, its table layout and the guarded tables.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "analysis/RealDoubleFFT.h"
#include "analysis/WaveTable.h"

using android::sp;
namespace kt = korvo::platform::test;

namespace {

const char kErrorLine[] = "ERROR ================================================\n";

class RealFftTest : public ::testing::Test {
protected:
    void SetUp() override {
        kt::resetAll();
        kt::captureLog(true);
        kt::clearLog();
    }
};

sp<WaveTable_Double> tableOf(const std::vector<double>& v) {
    sp<WaveTable_Double> t = new WaveTable_Double(static_cast<int>(v.size()));
    for (size_t i = 0; i < v.size(); ++i) t->data[i] = v[i];
    return t;
}

// Direct DFT in long double, laid out as the transform's output: sum, then (re, -im) per bin,
// then the alternating sum for an even length.
std::vector<long double> directDft(const std::vector<double>& x) {
    const size_t n = x.size();
    std::vector<long double> r(n, 0.0L);
    const long double pi = 3.141592653589793238462643383279502884L;
    for (size_t j = 0; j < n; ++j) r[0] += x[j];
    for (size_t k = 1; k <= (n - 1) / 2; ++k) {
        long double re = 0.0L, im = 0.0L;
        for (size_t j = 0; j < n; ++j) {
            const long double a = 2.0L * pi * static_cast<long double>((j * k) % n) / n;
            re += x[j] * cosl(a);
            im -= x[j] * sinl(a);
        }
        r[2 * k - 1] = re;
        r[2 * k] = im;
    }
    if (n % 2 == 0) {
        long double s = 0.0L;
        for (size_t j = 0; j < n; ++j) s += (j % 2 == 0) ? x[j] : -x[j];
        r[n - 1] = s;
    }
    return r;
}

std::vector<int> factorsOf(const RealDoubleFFT& fft) {
    const int n = fft.n;
    std::vector<int> f;
    const int nf = static_cast<int>(fft.wavetable->data[2 * n + 1]);
    for (int i = 0; i < nf; ++i) f.push_back(static_cast<int>(fft.wavetable->data[2 * n + 2 + i]));
    return f;
}

}  // namespace

TEST_F(RealFftTest, MatchesDirectDftForManyLengths) {
    std::mt19937 rng(20240517);
    std::uniform_real_distribution<double> dist(-1.0, 1.0);
    std::vector<int> lengths;
    for (int n = 1; n <= 16; ++n) lengths.push_back(n);
    for (int n : {30, 49, 77, 97, 210, 512, 1000}) lengths.push_back(n);
    for (int n : lengths) {
        SCOPED_TRACE("n = " + std::to_string(n));
        std::vector<double> x(n);
        for (double& v : x) v = dist(rng);
        const std::vector<long double> want = directDft(x);
        sp<WaveTable_Double> t = tableOf(x);
        sp<RealDoubleFFT> fft = new RealDoubleFFT(n);
        testing::internal::CaptureStdout();
        fft->forwardTransform(t);
        EXPECT_EQ(testing::internal::GetCapturedStdout(), "");
        const double tol = 1e-12 * n;
        for (int i = 0; i < n; ++i) {
            EXPECT_NEAR(t->data[i], static_cast<double>(want[i]), tol) << "entry " << i;
        }
    }
    EXPECT_TRUE(kt::logLines().empty());
}

TEST_F(RealFftTest, FactorOrderAndTableLayout) {
    const struct {
        int n;
        std::vector<int> factors;
    } cases[] = {{512, {2, 4, 4, 4, 4}},
                 {8, {2, 4}},
                 {12, {4, 3}},
                 {14, {2, 7}},
                 {1000, {2, 4, 5, 5, 5}},
                 {97, {97}},
                 {210, {2, 3, 5, 7}},
                 {2, {2}},
                 {49, {7, 7}}};
    for (const auto& c : cases) {
        SCOPED_TRACE("n = " + std::to_string(c.n));
        RealDoubleFFT fft(c.n);
        const int n = c.n;
        ASSERT_EQ(fft.wavetable->length, 2 * n + 15);
        EXPECT_EQ(fft.wavetable->data[2 * n], n);
        EXPECT_EQ(fft.wavetable->data[2 * n + 1], static_cast<double>(c.factors.size()));
        EXPECT_EQ(factorsOf(fft), c.factors);
        for (int i = 0; i < n; ++i) ASSERT_EQ(fft.wavetable->data[i], 0.0) << i;
        for (int i = 2 * n + 2 + static_cast<int>(c.factors.size()); i < 2 * n + 15; ++i) {
            ASSERT_EQ(fft.wavetable->data[i], 0.0) << i;
        }
    }
    // n = 512: the first factor (2) gets cos/sin of f * 2pi/512 for f = 1..127 at the front.
    RealDoubleFFT fft(512);
    for (int f = 1; f <= 127; ++f) {
        EXPECT_DOUBLE_EQ(fft.wavetable->data[512 + 2 * (f - 1)], std::cos(f * M_PI / 256));
        EXPECT_DOUBLE_EQ(fft.wavetable->data[512 + 2 * (f - 1) + 1], std::sin(f * M_PI / 256));
    }
    // n = 12 (4, 3): one pair per multiple of 2pi/12 at wa 0, 3 and 6; the 3 gets none.
    RealDoubleFFT twelve(12);
    const double a = 6.283185307179586 / 12;
    std::vector<double> want(12, 0.0);
    for (int m = 1; m <= 3; ++m) {
        want[3 * (m - 1)] = std::cos(m * a);
        want[3 * (m - 1) + 1] = std::sin(m * a);
    }
    EXPECT_EQ(std::vector<double>(twelve.wavetable->data + 12, twelve.wavetable->data + 24), want);
}

TEST_F(RealFftTest, LengthOneAndDegenerateLengths) {
    RealDoubleFFT one(1);
    ASSERT_EQ(one.wavetable->length, 17);
    for (int i = 0; i < 17; ++i) EXPECT_EQ(one.wavetable->data[i], 0.0);
    sp<WaveTable_Double> t = tableOf({0.75});
    one.forwardTransform(t);
    EXPECT_EQ(t->data[0], 0.75);

    // Decided: lengths below 1 have no transform; the table is left alone.
    RealDoubleFFT zero(0);
    EXPECT_EQ(zero.wavetable->length, 15);
    sp<WaveTable_Double> empty = new WaveTable_Double(0);
    zero.forwardTransform(empty);
    EXPECT_TRUE(kt::logLines().empty());
}

TEST_F(RealFftTest, KnownSpectraAt512) {
    const int n = 512;
    RealDoubleFFT fft(n);

    std::vector<double> impulse(n, 0.0);
    impulse[0] = 1.0;
    sp<WaveTable_Double> t = tableOf(impulse);
    fft.forwardTransform(t);
    EXPECT_DOUBLE_EQ(t->data[0], 1.0);
    for (int k = 1; k <= 255; ++k) {
        EXPECT_NEAR(t->data[2 * k - 1], 1.0, 1e-14);
        EXPECT_NEAR(t->data[2 * k], 0.0, 1e-14);
    }
    EXPECT_DOUBLE_EQ(t->data[511], 1.0);

    t = tableOf(std::vector<double>(n, 1.0));
    fft.forwardTransform(t);
    EXPECT_NEAR(t->data[0], 512.0, 1e-12);
    for (int i = 1; i < n; ++i) EXPECT_NEAR(t->data[i], 0.0, 1e-12) << i;

    std::vector<double> c(n), s(n);
    for (int j = 0; j < n; ++j) {
        c[j] = std::cos(2.0 * M_PI * 5.0 * j / n);
        s[j] = std::sin(2.0 * M_PI * 5.0 * j / n);
    }
    t = tableOf(c);
    fft.forwardTransform(t);
    for (int i = 0; i < n; ++i) EXPECT_NEAR(t->data[i], i == 9 ? 256.0 : 0.0, 1e-11) << i;
    t = tableOf(s);
    fft.forwardTransform(t);
    for (int i = 0; i < n; ++i) EXPECT_NEAR(t->data[i], i == 10 ? -256.0 : 0.0, 1e-11) << i;
}

TEST_F(RealFftTest, MismatchedDataLength) {
    const int n = 12;
    std::mt19937 rng(7);
    std::uniform_real_distribution<double> dist(-1.0, 1.0);
    std::vector<double> x(n + 3);
    for (double& v : x) v = dist(rng);
    const std::vector<long double> want = directDft(std::vector<double>(x.begin(), x.begin() + n));
    RealDoubleFFT fft(n);

    // Longer: logged, the first n entries transformed, the rest untouched.
    sp<WaveTable_Double> longer = tableOf(x);
    fft.forwardTransform(longer);
    for (int i = 0; i < n; ++i) EXPECT_NEAR(longer->data[i], static_cast<double>(want[i]), 1e-12);
    for (int i = n; i < n + 3; ++i) EXPECT_EQ(longer->data[i], x[i]);
    auto lines = kt::logLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].prio, 3);
    EXPECT_EQ(lines[0].tag, "TQX");
    EXPECT_EQ(lines[0].msg, "[SoundMeter) The length of data can not match that of the wavetable");

    // Decided: a shorter table is refused after the same line and left unchanged.
    kt::clearLog();
    sp<WaveTable_Double> shorter = tableOf(std::vector<double>(x.begin(), x.begin() + n - 1));
    fft.forwardTransform(shorter);
    for (int i = 0; i < n - 1; ++i) EXPECT_EQ(shorter->data[i], x[i]);
    lines = kt::logLines();
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_EQ(lines[0].msg, "[SoundMeter) The length of data can not match that of the wavetable");
}

TEST_F(RealFftTest, GuardedReadsOfEmptyTables) {
    sp<WaveTable_Double> empty = new WaveTable_Double(0);
    sp<WaveTable_Double_2> empty2 = new WaveTable_Double_2(0, 4);
    testing::internal::CaptureStdout();
    EXPECT_EQ(empty->get(0), -2222.0);
    EXPECT_EQ(empty->get(5), -2222.0);
    EXPECT_EQ(empty2->get(1, 2), -2222.0);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              std::string(kErrorLine) + kErrorLine + kErrorLine);

    sp<WaveTable_Double_2> grid = new WaveTable_Double_2(3, 2);
    for (int r = 0; r < 3; ++r)
        for (int c = 0; c < 2; ++c) EXPECT_EQ(grid->get(r, c), 0.0);
    grid->set(2, 1, 4.5);
    EXPECT_EQ(grid->data[5], 4.5);
    EXPECT_EQ(grid->get(2, 1), 4.5);
}

TEST_F(RealFftTest, SystemArraycopy) {
    sp<WaveTable_Double> src = tableOf({1, 2, 3, 4, 5});
    sp<WaveTable_Double> dst = tableOf({9, 9, 9, 9, 9, 9});
    System_arraycopy(src, 1, dst, 2, 3);
    EXPECT_EQ(std::vector<double>(dst->data, dst->data + 6),
              (std::vector<double>{9, 9, 2, 3, 4, 9}));

    System_arraycopy(src, 0, dst, 0, 0);
    System_arraycopy(src, 0, dst, 0, -3);
    EXPECT_EQ(std::vector<double>(dst->data, dst->data + 6),
              (std::vector<double>{9, 9, 2, 3, 4, 9}));

    sp<WaveTable_Double> empty = new WaveTable_Double(0);
    testing::internal::CaptureStdout();
    System_arraycopy(empty, 0, dst, 1, 4);
    EXPECT_EQ(testing::internal::GetCapturedStdout(),
              std::string(kErrorLine) + kErrorLine + kErrorLine + kErrorLine);
    EXPECT_EQ(std::vector<double>(dst->data, dst->data + 6),
              (std::vector<double>{9, -2222, -2222, -2222, -2222, 9}));
}
