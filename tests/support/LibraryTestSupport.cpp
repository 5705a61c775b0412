#include "support/LibraryTestSupport.h"

#include <cmath>
#include <thread>

namespace korvo {
namespace testing {

void LoggedTest::SetUp() {
    test::resetAll();
    test::captureLog(true);
}

void LoggedTest::TearDown() { test::resetAll(); }

Strings logOf(const std::string& tag, const std::string& part) {
    static const char kLetters[] = "??VDIWEF";
    Strings out;
    for (const auto& l : test::logLines()) {
        if (l.tag != tag || l.msg.find(part) == std::string::npos) continue;
        out.push_back(std::string(1, l.prio >= 0 && l.prio < 8 ? kLetters[l.prio] : '?') + "/" + l.msg);
    }
    return out;
}

bool waitFor(const std::function<bool()>& pred, int timeoutMs) {
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeoutMs);
    while (!pred()) {
        if (std::chrono::steady_clock::now() >= deadline) return pred();
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

std::vector<int16_t> sine(double hz, double amplitude, size_t n) {
    std::vector<int16_t> out(n);
    for (size_t i = 0; i < n; ++i)
        out[i] = static_cast<int16_t>(std::lround(amplitude * 32767.0 * std::sin(2.0 * M_PI * hz * double(i) / 44100.0)));
    return out;
}

void pushFrames(double hz, double amplitude, int frames) {
    const auto samples = sine(hz, amplitude, static_cast<size_t>(frames) * 512);
    test::pushMicSamples(samples.data(), samples.size());
}

std::vector<short> binTone(int bin, double amplitude) { return sine(bin * 44100.0 / 512.0, amplitude, 512); }

android::sp<WaveTable_Double> tableOf(const std::vector<double>& v) {
    android::sp<WaveTable_Double> t = new WaveTable_Double(static_cast<int>(v.size()));
    for (size_t i = 0; i < v.size(); ++i) t->data[i] = v[i];
    return t;
}

std::vector<double> valuesOf(const android::sp<WaveTable_Double>& t) {
    return std::vector<double>(t->data, t->data + t->length);
}

}  // namespace testing
}  // namespace korvo
