// Spectrum analysis: the real FFT against a direct DFT, the analyser's magnitudes and
// averaging, the read-outs, and the analysis thread's turns.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <random>
#include <thread>

#include "analysis/RealDoubleFFT.h"
#include "analysis/WaveformCanvas.h"
#include "capture/FrameExchange.h"
#include "meter/SoundMeter.h"
#include "support/LibraryTestSupport.h"

namespace android {
struct WaveformCanvasTestAccess {
    static bool turn(WaveformCanvas& w) { return w.threadLoop(); }
};
}  // namespace android

namespace {

using namespace korvo::testing;
using android::sp;
using android::WaveformCanvas;
const std::string kErrorLine = "ERROR ================================================\n";
const double kDivisor = 325.6832;

// Direct DFT in long double, in the transform's layout: the sum, (re, -im) per bin,
// and the alternating sum for an even length.
std::vector<long double> directDft(const std::vector<double>& x) {
    const size_t n = x.size();
    std::vector<long double> r(n, 0.0L);
    const long double pi = 3.141592653589793238462643383279502884L;
    for (size_t j = 0; j < n; ++j) {
        r[0] += x[j];
        if (n % 2 == 0) r[n - 1] += (j % 2 == 0) ? x[j] : -x[j];
        for (size_t k = 1; k <= (n - 1) / 2; ++k) {
            const long double a = 2.0L * pi * static_cast<long double>((j * k) % n) / n;
            r[2 * k - 1] += x[j] * cosl(a);
            r[2 * k] -= x[j] * sinl(a);
        }
    }
    return r;
}

using Analysis = LoggedTest;

// Samples as fractions of full scale, the way the analyser converts them.
sp<WaveTable_Double> frameTable(const std::vector<short>& s) {
    std::vector<double> v(s.size());
    for (size_t i = 0; i < s.size(); ++i) v[i] = s[i] / 32768.0;
    return tableOf(v);
}

TEST_F(Analysis, TransformMatchesADirectDft) {
    std::mt19937 rng(20240517);
    std::uniform_real_distribution<double> dist(-1.0, 1.0);
    for (int n : {1, 2, 3, 4, 5, 6, 7, 8, 9, 12, 14, 15, 30, 49, 97, 210, 512, 1000}) {
        SCOPED_TRACE("n = " + std::to_string(n));
        std::vector<double> x(n + 2);
        for (double& v : x) v = dist(rng);
        sp<WaveTable_Double> t = tableOf(x);
        sp<RealDoubleFFT> fft = new RealDoubleFFT(n);
        EXPECT_EQ(stdoutOf([&] { fft->forwardTransform(t); }), "");
        const auto want = directDft(std::vector<double>(x.begin(), x.begin() + n));
        for (int i = 0; i < n; ++i) ASSERT_NEAR(t->data[i], static_cast<double>(want[i]), 1e-12 * n) << i;
        // A longer table is logged and keeps its further entries.
        EXPECT_EQ(t->data[n], x[n]);
        EXPECT_EQ(t->data[n + 1], x[n + 1]);
    }
    EXPECT_EQ(logOf("TQX").size(), 18u);
    EXPECT_EQ(logOf("TQX")[0], "D/[SoundMeter) The length of data can not match that of the wavetable");
    // Decided: a shorter table is refused after the same line and left unchanged.
    sp<WaveTable_Double> shorter = tableOf({1, 2, 3});
    RealDoubleFFT(4).forwardTransform(shorter);
    EXPECT_EQ(valuesOf(shorter), (std::vector<double>{1, 2, 3}));
    // n = 512: an impulse gives 1 in the sum, every real part and the alternating sum; a cosine
    // on bin 5 gives 256 at its real part, a sine -256 at its -im part.
    std::vector<double> impulse(512, 0.0), c(512), s(512);
    impulse[0] = 1.0;
    for (int j = 0; j < 512; ++j) c[j] = std::cos(2 * M_PI * 5 * j / 512), s[j] = std::sin(2 * M_PI * 5 * j / 512);
    RealDoubleFFT fft(512);
    sp<WaveTable_Double> ti = tableOf(impulse), tc = tableOf(c), ts = tableOf(s);
    fft.forwardTransform(ti), fft.forwardTransform(tc), fft.forwardTransform(ts);
    for (int i = 0; i < 512; ++i) {
        ASSERT_NEAR(ti->data[i], i == 0 || i % 2 == 1 ? 1.0 : 0.0, 1e-14) << i;
        ASSERT_NEAR(tc->data[i], i == 9 ? 256.0 : 0.0, 1e-11) << i;
        ASSERT_NEAR(ts->data[i], i == 10 ? -256.0 : 0.0, 1e-11) << i;
    }
}

TEST_F(Analysis, FactorsAndTables) {
    const std::pair<int, std::vector<int>> cases[] = {{512, {2, 4, 4, 4, 4}}, {8, {2, 4}}, {12, {4, 3}}, {14, {2, 7}},
                                                      {1000, {2, 4, 5, 5, 5}}, {210, {2, 3, 5, 7}}, {49, {7, 7}}};
    for (const auto& [n, factors] : cases) {
        RealDoubleFFT fft(n);
        const double* w = fft.wavetable->data;
        const int nf = static_cast<int>(factors.size());
        ASSERT_EQ(fft.wavetable->length, 2 * n + 15);
        EXPECT_EQ(w[2 * n], n);
        EXPECT_EQ(w[2 * n + 1], nf);
        EXPECT_EQ(std::vector<int>(w + 2 * n + 2, w + 2 * n + 2 + nf), factors) << n;
        for (int i = 0; i < n; ++i) ASSERT_EQ(w[i], 0.0) << i;
    }
    // Length 1: 17 entries, none written; decided: length 0 has no transform.
    EXPECT_EQ(valuesOf(RealDoubleFFT(1).wavetable), std::vector<double>(17, 0.0));
    RealDoubleFFT(0).forwardTransform(new WaveTable_Double(0));

    // The guarded read of an empty table, and the copy through it.
    sp<WaveTable_Double> empty = new WaveTable_Double(0);
    sp<WaveTable_Double_2> empty2 = new WaveTable_Double_2(0, 4);
    EXPECT_EQ(stdoutOf([&] { EXPECT_EQ(empty->get(5) + empty2->get(1, 2), -4444.0); }), kErrorLine + kErrorLine);
    sp<WaveTable_Double> src = tableOf({1, 2, 3, 4, 5}), dst = tableOf({9, 9, 9, 9, 9, 9});
    System_arraycopy(src, 1, dst, 2, 3);
    System_arraycopy(src, 0, dst, 0, 0);
    EXPECT_EQ(valuesOf(dst), (std::vector<double>{9, 9, 2, 3, 4, 9}));
    EXPECT_EQ(stdoutOf([&] { System_arraycopy(empty, 0, dst, 1, 2); }), kErrorLine + kErrorLine);
    EXPECT_EQ(valuesOf(dst), (std::vector<double>{9, -2222, -2222, 3, 4, 9}));
}

TEST_F(Analysis, AnalyserMagnitudes) {
    sp<WaveformCanvas> canvas = new WaveformCanvas();
    auto spectrumOf = [&](std::vector<short> frame, int count = 512) {
        canvas->drawSpectrum(frame.data(), count);
        return valuesOf(canvas->spectrum);
    };
    EXPECT_EQ(spectrumOf(std::vector<short>(512, 0)), std::vector<double>(256, 0.0));
    std::vector<double> m = spectrumOf(std::vector<short>(512, 16384));
    EXPECT_EQ(m[0], static_cast<double>(256.0f / 325.6832f));
    for (int i = 1; i < 256; ++i) ASSERT_LT(m[i], 1e-12) << i;
    for (int k : {1, 37, 255}) {
        m = spectrumOf(binTone(k, 0.5));
        for (int i = 0; i < 256; ++i) ASSERT_NEAR(m[i], i == k ? 128.0 / kDivisor : 0.0, 1e-4) << k << "/" << i;
    }
    // The count selects the analysed samples: 600 analyses 88..599; decided: below 512, 0..511.
    const std::vector<short> tone = binTone(20, 0.25);
    const std::vector<double> want = spectrumOf(tone);
    std::vector<short> longer(600, 32000);
    std::copy(tone.begin(), tone.end(), longer.begin() + 88);
    EXPECT_EQ(spectrumOf(longer, 600), want);
    for (int count : {511, 0}) {
        spectrumOf(std::vector<short>(512, 0));
        EXPECT_EQ(spectrumOf(tone, count), want) << count;
    }
    // |X_i| in double, narrowed, divided in single precision.
    sp<WaveTable_Double> fft = frameTable(tone);
    canvas->SpectrumAnalyser_Transform(fft);
    const double a = fft->data[40], b = fft->data[39];
    EXPECT_EQ(want[20], static_cast<double>(static_cast<float>(std::sqrt(a * a + b * b)) / 325.6832f));

    // setInput converts exactly 512 samples, or logs and writes nothing.
    std::vector<double> out(514, 5.0);
    canvas->SpectrumAnalyser_setInput(longer.data(), 50, 512, out.data() + 1);
    EXPECT_TRUE(out[0] == 5.0);
    EXPECT_TRUE(out[513] == 5.0);
    EXPECT_TRUE(out[1] == longer[50] / 32768.0);
    EXPECT_TRUE(out[512] == longer[561] / 32768.0);
    canvas->SpectrumAnalyser_setInput(longer.data(), 0, 511, out.data());
    EXPECT_EQ(out[0], 5.0);
    // Result tables of other sizes: the entries that fit, nothing past the end.
    sp<WaveTable_Double> small = new WaveTable_Double(40), big = tableOf(std::vector<double>(300, -1.0));
    canvas->spectrumAnalyser_getResults_Last(fft, small);
    canvas->spectrumAnalyser_getResults_Last(fft, big);
    EXPECT_EQ(valuesOf(small), std::vector<double>(want.begin(), want.begin() + 40));
    EXPECT_EQ(std::vector<double>(big->data, big->data + 256), want);
    EXPECT_EQ(big->data[256], -1.0);
    EXPECT_EQ(logOf("TQX"), (Strings{"E/[WAVEFORM_CANVAS] SpectrumAnalyser_setInput: bad input count(511) in FFT",
                                     "E/[WAVEFORM_CANVAS] bad output buffer size in FFT: must be 256; given 40",
                                     "E/[WAVEFORM_CANVAS] bad output buffer size in FFT: must be 256; given 300"}));
}

TEST_F(Analysis, AveragingPath) {
    sp<WaveformCanvas> canvas = new WaveformCanvas();
    canvas->historyLength = 3;
    canvas->history = new WaveTable_Double_2(256, 3);
    std::vector<std::vector<double>> mags;
    std::vector<int> slots;
    const std::string line = "[WAVEFORM_CANVAS] spectrumAnalyser_getResults\n";
    EXPECT_EQ(stdoutOf([&] {
                  for (double amp : {0.1, 0.4, 0.7, 0.2}) {
                      const std::vector<short> frame = binTone(12, amp);
                      sp<WaveTable_Double> direct = new WaveTable_Double(256), t = frameTable(frame);
                      canvas->SpectrumAnalyser_Transform(t);
                      canvas->spectrumAnalyser_getResults_Last(t, direct);
                      mags.push_back(valuesOf(direct));
                      canvas->drawSpectrum(const_cast<short*>(frame.data()), 512);
                      slots.push_back(canvas->historyIndex);
                  }
              }),
              line + line + line + line);
    EXPECT_EQ(slots, (std::vector<int>{1, 2, 0, 1}));
    for (int i = 0; i < 256; ++i) {
        EXPECT_EQ(canvas->history->data[i * 3 + 1], mags[3][i]);
        EXPECT_EQ(canvas->history->data[i * 3 + 2], mags[1][i]);
        EXPECT_EQ(canvas->history->data[i * 3], mags[2][i]);
        const double mean = (mags[1][i] + mags[2][i] + mags[3][i]) / 3.0;
        ASSERT_NEAR(canvas->spectrum->data[i], mean, 1e-6 * (1.0 + mean)) << i;
    }
    // Wrong sizes: refused with -1, nothing changed; the next frame then writes slot 0.
    sp<WaveTable_Double> fft = new WaveTable_Double(512);
    sp<WaveTable_Double_2> badHistory = new WaveTable_Double_2(10, 2);
    stdoutOf([&] {
        EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, new WaveTable_Double(255), badHistory, 0), -1);
        EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, canvas->spectrum, badHistory, 0), -1);
        EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, canvas->spectrum, new WaveTable_Double_2(256, 0), 0), -1);
        for (const auto& c : std::vector<std::pair<int, int>>{{-1, 0}, {0, 1}, {1, 2}, {2, 0}, {7, 0}, {-9, 0}})
            EXPECT_EQ(canvas->spectrumAnalyser_getResults(fft, canvas->spectrum, canvas->history, c.first), c.second) << c.first;
        sp<WaveTable_Double> keep = canvas->spectrum;
        canvas->spectrum = new WaveTable_Double(100);
        canvas->drawSpectrum(const_cast<short*>(binTone(3, 0.1).data()), 512);
        EXPECT_EQ(canvas->historyIndex, -1);
        canvas->spectrum = keep;
        canvas->drawSpectrum(const_cast<short*>(binTone(3, 0.1).data()), 512);
        EXPECT_EQ(canvas->historyIndex, 0);
    });
    EXPECT_EQ(logOf("TQX"), (Strings{"E/[WAVEFORM_CANVAS] bad average buffer size in FFT: must be 256 ; given 255",
                                     "E/[WAVEFORM_CANVAS] bad history buffer size in FFT: must be 256 ; given 10",
                                     "E/[WAVEFORM_CANVAS] bad average buffer size in FFT: must be 256 ; given 100"}));
}

TEST_F(Analysis, ReadOutLevelsThresholdsAndMask) {
    sp<WaveformCanvas> canvas = new WaveformCanvas();
    auto readOut = [&](bool masked, int wantCount) {
        std::vector<float> buf(258, 7.5f);  // a guard on each side
        EXPECT_EQ(masked ? canvas->getSpectrumData_zorv(&buf[1]) : canvas->getSpectrumData(&buf[1]), wantCount);
        EXPECT_TRUE(buf[0] == 7.5f);
        EXPECT_TRUE(buf[1] == 7.5f);
        EXPECT_TRUE(buf[257] == 7.5f);
        EXPECT_TRUE((!masked || buf[2] == 7.5f));
        return std::vector<float>(buf.begin() + 1, buf.end() - 1);
    };
    auto setBins = [&](const std::vector<std::pair<int, double>>& bins) {
        std::fill(canvas->spectrum->data, canvas->spectrum->data + 256, 0.0);
        for (const auto& b : bins) canvas->spectrum->data[b.first] = b.second;
    };
    EXPECT_EQ(readOut(false, 0), [] { std::vector<float> v(256, 0.0f); v[0] = 7.5f; return v; }());
    // Levels 100, 66.66667, 0 (neither counted nor written), 50, about -5, 25, NaN, +inf, 116.67.
    setBins({{0, 1.0}, {5, 1.0}, {6, 0.01}, {7, 1e-6}, {8, 1e-3}, {9, std::pow(10.0, -6.3)}, {10, std::pow(10.0, -4.5)},
             {11, std::nan("")}, {12, HUGE_VAL}, {13, 10.0}});
    for (int level : {0, 50, -10}) {
        SCOPED_TRACE("threshold " + std::to_string(level));
        stdoutOf([&] { canvas->setDetectionLevel(level); });
        const std::vector<float> a = readOut(false, 5);  // bins 5, 6, 8, 10, 13 whatever the threshold
        EXPECT_EQ(a[5], 100.0f);
        EXPECT_EQ(a[6], level < 66 ? 66.66667f : 0.0f);
        EXPECT_EQ(a[8], level < 50 ? 50.0f : 0.0f);
        EXPECT_NEAR(a[9], level < -5 ? -5.0f : 0.0f, 1e-4);
        EXPECT_EQ(a[10], level < 25 ? 25.0f : 0.0f);
        EXPECT_FLOAT_EQ(a[13], 116.66667f);
        for (int i : {1, 4, 7, 11, 12, 14, 255}) EXPECT_EQ(a[i], 0.0f) << i;
    }
    stdoutOf([&] { canvas->setDetectionLevel(0); });
    // Masked: entry k carries bin k - 1 inside 26..200 where k mod 10 is 0 or 3..7.
    setBins({});
    std::fill(canvas->spectrum->data, canvas->spectrum->data + 256, 1.0);
    const std::vector<float> z = readOut(true, 255);
    for (int k = 2; k < 256; ++k) {
        const bool band = k >= 26 && k <= 200 && (k % 10 == 0 || (k % 10 >= 3 && k % 10 <= 7));
        ASSERT_EQ(z[k], band ? 100.0f : 0.0f) << k;
    }
    // Level 80 at bin 25: entry 26 masked, entry 25 plain; bin 255 counted without an entry.
    setBins({{25, std::pow(10.0, -1.2)}, {255, 1.0}});
    const std::vector<float> plain = readOut(false, 2), masked = readOut(true, 2);
    EXPECT_NEAR(plain[25], 80.0f, 1e-4);
    EXPECT_EQ(masked[26], plain[25]);
    EXPECT_EQ(masked[25], 0.0f);
    setBins({{29, 1e-3}, {32, 0.01}});
    stdoutOf([&] { canvas->setDetectionLevel(50); });
    const std::vector<float> t = readOut(true, 2);
    EXPECT_TRUE(t[30] == 0.0f);
    EXPECT_TRUE(t[33] == 66.66667f);
}

// Publishes a record whose five slots hold a tone on bin(k).
template <class BinOf>
void publishTones(BinOf bin, int count, int index = 0) {
    Mmic_data_t rec{};
    for (int k = 0; k < 5; ++k) {
        const std::vector<short> tone = binTone(bin(k), 0.5);
        std::copy(tone.begin(), tone.end(), &rec.data[512 * k]);
    }
    rec.index = index;
    rec.count = count;
    read_write_audio(nullptr, 1, &rec);
}

TEST_F(Analysis, ThreadTurnsFollowTheirOwnSlot) {
    sp<WaveformCanvas> w = new WaveformCanvas();
    auto strongest = [&] { return int(std::max_element(w->spectrum->data + 1, w->spectrum->data + 256) - w->spectrum->data); };
    // Slot k holds bin 20 + 10k; the record claims slot 3 throughout.
    publishTones([](int k) { return 20 + 10 * k; }, 512, 3);
    std::vector<int> analysed;
    for (int t = 0; t < 6; ++t) {
        EXPECT_TRUE(android::WaveformCanvasTestAccess::turn(*w));
        analysed.push_back(strongest());
    }
    EXPECT_EQ(analysed, (std::vector<int>{20, 30, 40, 50, 60, 20}));
    // A count beyond the copied ring is cut at its end.
    publishTones([](int k) { return 20 + 10 * k; }, 700);
    w->frameIndex = 4;
    android::WaveformCanvasTestAccess::turn(*w);
    EXPECT_EQ(strongest(), 60);
    EXPECT_EQ(w->frameIndex, 0);

    // A turn signals the capture step's wait.
    bool waiting = false;  // guarded by AudioBufferLock
    int waitResult = -1;
    std::thread waiter([&] {
        pthread_mutex_lock(&AudioBufferLock);
        waiting = true;
        timespec deadline;
        clock_gettime(CLOCK_REALTIME, &deadline);
        deadline.tv_sec += 10;
        waitResult = pthread_cond_timedwait(&WaitAudioBuffer, &AudioBufferLock, &deadline);
        pthread_mutex_unlock(&AudioBufferLock);
    });
    ASSERT_TRUE(waitFor([&] {
        pthread_mutex_lock(&AudioBufferLock);
        const bool ready = waiting;
        pthread_mutex_unlock(&AudioBufferLock);
        return ready;
    }));
    android::WaveformCanvasTestAccess::turn(*w);
    waiter.join();
    EXPECT_EQ(waitResult, 0);

    // The level goes to stdout and the error log; release only logs.
    test::clearLog();
    EXPECT_EQ(stdoutOf([&] { w->setDetectionLevel(-5); }), "[WAVEFORM_CANVAS] detection Level is -5\n");
    EXPECT_EQ(w->getDetectionLevel(), -5);
    w->release();
    EXPECT_EQ(logOf("TQX"), (Strings{"E/[WAVEFORM_CANVAS] detection Level is -5", "D/[WAVEFORM_CANVAS] WaveformCanvas Relese"}));
}

}  // namespace
