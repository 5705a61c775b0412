// The real forward transform against a plain DFT, its table layout and the guarded tables.
#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

#include <cmath>
#include <random>
#include <string>
#include <vector>

#include "analysis/RealDoubleFFT.h"
#include "analysis/WaveTable.h"
#include "support/DspTestSupport.h"

using android::sp;
using korvo::dsptest::stdoutOf;
using korvo::dsptest::tableOf;
namespace kt = korvo::platform::test;

namespace {

using RealFftTest = korvo::dsptest::LoggedTest;

std::string errorLines(int n) {
    std::string s;
    for (int i = 0; i < n; ++i) s += "ERROR ================================================\n";
    return s;
}

std::vector<double> randomSignal(std::mt19937& rng, int n) {
    std::uniform_real_distribution<double> dist(-1.0, 1.0);
    std::vector<double> x(n);
    for (double& v : x) v = dist(rng);
    return x;
}

// Direct DFT in long double, laid out as the transform's output: sum, then (re, -im) per bin,
// then the alternating sum for an even length.
std::vector<long double> directDft(const std::vector<double>& x) {
    const size_t n = x.size();
    std::vector<long double> r(n, 0.0L);
    const long double pi = 3.141592653589793238462643383279502884L;
    for (size_t j = 0; j < n; ++j) r[0] += x[j];
    for (size_t k = 1; k <= (n - 1) / 2; ++k) {
        for (size_t j = 0; j < n; ++j) {
            const long double a = 2.0L * pi * static_cast<long double>((j * k) % n) / n;
            r[2 * k - 1] += x[j] * cosl(a);
            r[2 * k] -= x[j] * sinl(a);
        }
    }
    if (n % 2 == 0) {
        for (size_t j = 0; j < n; ++j) r[n - 1] += (j % 2 == 0) ? x[j] : -x[j];
    }
    return r;
}

void expectTransform(const double* got, const std::vector<long double>& want, double tol) {
    for (size_t i = 0; i < want.size(); ++i) EXPECT_NEAR(got[i], static_cast<double>(want[i]), tol) << "entry " << i;
}

}  // namespace

TEST_F(RealFftTest, MatchesDirectDftForManyLengths) {
    std::mt19937 rng(20240517);
    std::vector<int> lengths;
    for (int n = 1; n <= 16; ++n) lengths.push_back(n);
    for (int n : {30, 49, 77, 97, 210, 512, 1000}) lengths.push_back(n);
    for (int n : lengths) {
        SCOPED_TRACE("n = " + std::to_string(n));
        const std::vector<double> x = randomSignal(rng, n);
        sp<WaveTable_Double> t = tableOf(x);
        sp<RealDoubleFFT> fft = new RealDoubleFFT(n);
        EXPECT_EQ(stdoutOf([&] { fft->forwardTransform(t); }), "");
        expectTransform(t->data, directDft(x), 1e-12 * n);
    }
    EXPECT_TRUE(kt::logLines().empty());
}

TEST_F(RealFftTest, FactorOrderAndTableLayout) {
    const struct {
        int n;
        std::vector<int> factors;
    } cases[] = {{512, {2, 4, 4, 4, 4}}, {8, {2, 4}}, {12, {4, 3}}, {14, {2, 7}}, {1000, {2, 4, 5, 5, 5}},
                 {97, {97}}, {210, {2, 3, 5, 7}}, {2, {2}}, {49, {7, 7}}};
    for (const auto& c : cases) {
        SCOPED_TRACE("n = " + std::to_string(c.n));
        const int n = c.n, nf = static_cast<int>(c.factors.size());
        RealDoubleFFT fft(n);
        const double* w = fft.wavetable->data;
        ASSERT_EQ(fft.wavetable->length, 2 * n + 15);
        EXPECT_EQ(w[2 * n], n);
        EXPECT_EQ(w[2 * n + 1], nf);
        EXPECT_EQ(std::vector<int>(w + 2 * n + 2, w + 2 * n + 2 + nf), c.factors);
        for (int i = 0; i < n; ++i) ASSERT_EQ(w[i], 0.0) << i;
        for (int i = 2 * n + 2 + nf; i < 2 * n + 15; ++i) ASSERT_EQ(w[i], 0.0) << i;
    }
    // n = 512: the first factor (2) gets cos/sin of f * 2pi/512 for f = 1..127 at the front.
    RealDoubleFFT fft(512);
    for (int f = 1; f <= 127; ++f) {
        EXPECT_DOUBLE_EQ(fft.wavetable->data[512 + 2 * (f - 1)], std::cos(f * M_PI / 256));
        EXPECT_DOUBLE_EQ(fft.wavetable->data[512 + 2 * (f - 1) + 1], std::sin(f * M_PI / 256));
    }
    // n = 12 (4, 3): one pair per multiple of 2pi/12 at wa 0, 3 and 6; the 3 gets none.
    RealDoubleFFT twelve(12);
    std::vector<double> want(12, 0.0);
    for (int m = 1; m <= 3; ++m) {
        want[3 * (m - 1)] = std::cos(m * 6.283185307179586 / 12);
        want[3 * (m - 1) + 1] = std::sin(m * 6.283185307179586 / 12);
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
    zero.forwardTransform(new WaveTable_Double(0));
    EXPECT_TRUE(kt::logLines().empty());
}

TEST_F(RealFftTest, KnownSpectraAt512) {
    const int n = 512;
    RealDoubleFFT fft(n);
    // An impulse gives 1 in the sum, every real part and the alternating sum; a constant only
    // the sum; a cosine (sine) on bin 5 gives +256 at its real part (-256 at its -im part).
    std::vector<double> impulse(n, 0.0), c(n), s(n);
    std::vector<long double> wantImpulse(n), wantFlat(n, 0.0L), wantCos(n, 0.0L), wantSin(n, 0.0L);
    impulse[0] = 1.0;
    for (int j = 0; j < n; ++j) {
        c[j] = std::cos(2.0 * M_PI * 5.0 * j / n);
        s[j] = std::sin(2.0 * M_PI * 5.0 * j / n);
        wantImpulse[j] = (j == 0 || j % 2 == 1) ? 1.0L : 0.0L;
    }
    wantFlat[0] = 512.0L;
    wantCos[9] = 256.0L;
    wantSin[10] = -256.0L;
    auto run = [&](const std::vector<double>& in) {
        sp<WaveTable_Double> t = tableOf(in);
        fft.forwardTransform(t);
        return t;
    };
    const sp<WaveTable_Double> t = run(impulse);
    expectTransform(t->data, wantImpulse, 1e-14);
    EXPECT_DOUBLE_EQ(t->data[0], 1.0);
    EXPECT_DOUBLE_EQ(t->data[511], 1.0);
    expectTransform(run(std::vector<double>(n, 1.0))->data, wantFlat, 1e-12);
    expectTransform(run(c)->data, wantCos, 1e-11);
    expectTransform(run(s)->data, wantSin, 1e-11);
}

TEST_F(RealFftTest, MismatchedDataLength) {
    const int n = 12;
    std::mt19937 rng(7);
    const std::vector<double> x = randomSignal(rng, n + 3);
    RealDoubleFFT fft(n);
    const char* line = "[SoundMeter) The length of data can not match that of the wavetable";

    // Longer: logged, the first n entries transformed, the rest untouched.
    sp<WaveTable_Double> longer = tableOf(x);
    fft.forwardTransform(longer);
    expectTransform(longer->data, directDft(std::vector<double>(x.begin(), x.begin() + n)), 1e-12);
    for (int i = n; i < n + 3; ++i) EXPECT_EQ(longer->data[i], x[i]);
    EXPECT_EQ(korvo::dsptest::logMessages(3, "TQX"), korvo::dsptest::Strings{line});

    // Decided: a shorter table is refused after the same line and left unchanged.
    kt::clearLog();
    sp<WaveTable_Double> shorter = tableOf(std::vector<double>(x.begin(), x.begin() + n - 1));
    fft.forwardTransform(shorter);
    for (int i = 0; i < n - 1; ++i) EXPECT_EQ(shorter->data[i], x[i]);
    EXPECT_EQ(korvo::dsptest::logMessages(3, "TQX"), korvo::dsptest::Strings{line});
}

TEST_F(RealFftTest, GuardedTablesAndArraycopy) {
    sp<WaveTable_Double> empty = new WaveTable_Double(0);
    sp<WaveTable_Double_2> empty2 = new WaveTable_Double_2(0, 4);
    EXPECT_EQ(stdoutOf([&] {
                  EXPECT_EQ(empty->get(0), -2222.0);
                  EXPECT_EQ(empty->get(5), -2222.0);
                  EXPECT_EQ(empty2->get(1, 2), -2222.0);
              }),
              errorLines(3));
    sp<WaveTable_Double_2> grid = new WaveTable_Double_2(3, 2);
    for (int i = 0; i < 6; ++i) EXPECT_EQ(grid->get(i / 2, i % 2), 0.0);
    grid->set(2, 1, 4.5);
    EXPECT_EQ(grid->data[5], 4.5);
    EXPECT_EQ(grid->get(2, 1), 4.5);

    sp<WaveTable_Double> src = tableOf({1, 2, 3, 4, 5});
    sp<WaveTable_Double> dst = tableOf({9, 9, 9, 9, 9, 9});
    auto dstValues = [&] { return std::vector<double>(dst->data, dst->data + 6); };
    System_arraycopy(src, 1, dst, 2, 3);
    EXPECT_EQ(dstValues(), (std::vector<double>{9, 9, 2, 3, 4, 9}));
    System_arraycopy(src, 0, dst, 0, 0);
    System_arraycopy(src, 0, dst, 0, -3);
    EXPECT_EQ(dstValues(), (std::vector<double>{9, 9, 2, 3, 4, 9}));
    EXPECT_EQ(stdoutOf([&] { System_arraycopy(empty, 0, dst, 1, 4); }), errorLines(4));
    EXPECT_EQ(dstValues(), (std::vector<double>{9, -2222, -2222, -2222, -2222, 9}));
}
