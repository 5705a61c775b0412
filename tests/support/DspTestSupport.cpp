#include "support/DspTestSupport.h"

#include <cmath>

#include <korvo/platform/TestControl.h>

namespace korvo {
namespace dsptest {

namespace test = korvo::platform::test;

void LoggedTest::SetUp() {
    test::resetAll();
    test::captureLog(true);
    test::clearLog();
}

void LoggedTest::TearDown() { test::captureLog(false); }

Strings logMessages(int prio, const std::string& tag) {
    Strings out;
    for (const auto& l : test::logLines()) {
        EXPECT_EQ(l.prio, prio) << l.msg;
        EXPECT_EQ(l.tag, tag) << l.msg;
        out.push_back(l.msg);
    }
    return out;
}

std::vector<short> toneFrame(int bin, double amplitude) {
    std::vector<short> s(512);
    for (int j = 0; j < 512; ++j)
        s[j] = static_cast<short>(std::lround(amplitude * 32768.0 * std::sin(2.0 * M_PI * bin * j / 512.0)));
    return s;
}

android::sp<WaveTable_Double> tableOf(const std::vector<double>& v) {
    android::sp<WaveTable_Double> t = new WaveTable_Double(static_cast<int>(v.size()));
    for (size_t i = 0; i < v.size(); ++i) t->data[i] = v[i];
    return t;
}

android::sp<WaveTable_Double> frameTable(const std::vector<short>& samples) {
    android::sp<WaveTable_Double> t = new WaveTable_Double(static_cast<int>(samples.size()));
    for (size_t i = 0; i < samples.size(); ++i) t->data[i] = samples[i] / 32768.0;
    return t;
}

}  // namespace dsptest
}  // namespace korvo
