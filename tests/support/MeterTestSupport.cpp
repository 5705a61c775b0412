#include "support/MeterTestSupport.h"

#include <cmath>
#include <thread>

namespace korvo {
namespace testing {

namespace test = korvo::platform::test;

void PlatformTest::SetUp() {
    test::resetAll();
    test::captureLog(true);
}

void PlatformTest::TearDown() { test::resetAll(); }

namespace {
char letter(int prio) {
    static const char kLetters[] = "??VDIWEF";
    return prio >= 0 && prio < 8 ? kLetters[prio] : '?';
}
}  // namespace

std::vector<std::string> logOf(const std::string& tag) {
    std::vector<std::string> out;
    for (const auto& line : test::logLines()) {
        if (line.tag == tag) out.push_back(std::string(1, letter(line.prio)) + "/" + line.msg);
    }
    return out;
}

bool logHas(const std::string& tag, int prio, const std::string& msg) {
    for (const auto& line : test::logLines()) {
        if (line.tag == tag && line.prio == prio && line.msg == msg) return true;
    }
    return false;
}

int logIndex(const std::string& tag, const std::string& msg) {
    const auto lines = test::logLines();
    for (size_t i = 0; i < lines.size(); ++i) {
        if (lines[i].tag == tag && lines[i].msg == msg) return static_cast<int>(i);
    }
    return -1;
}

bool waitFor(const std::function<bool()>& pred, std::chrono::milliseconds timeout) {
    const auto deadline = std::chrono::steady_clock::now() + timeout;
    while (!pred()) {
        if (std::chrono::steady_clock::now() >= deadline) return pred();
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}

std::vector<int16_t> sine(double hz, double amplitude, size_t n, double phase) {
    std::vector<int16_t> out(n);
    for (size_t i = 0; i < n; ++i) {
        out[i] = static_cast<int16_t>(std::lround(amplitude * 32767.0 *
                                                  std::sin(2.0 * M_PI * hz * static_cast<double>(i) / 44100.0 + phase)));
    }
    return out;
}

void pushSineFrames(double hz, double amplitude, int frames) {
    const auto samples = sine(hz, amplitude, static_cast<size_t>(frames) * 512);
    test::pushMicSamples(samples.data(), samples.size());
}

void pushSilenceFrames(int frames) {
    const std::vector<int16_t> zeros(static_cast<size_t>(frames) * 512, 0);
    test::pushMicSamples(zeros.data(), zeros.size());
}

}  // namespace testing
}  // namespace korvo
