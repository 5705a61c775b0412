// Helpers shared by the spectrum analysis, read-out, peak, vote and code plan tests.
#pragma once
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <utils/StrongPointer.h>

#include "analysis/WaveTable.h"

namespace korvo {
namespace dsptest {

using Strings = std::vector<std::string>;

// Resets the platform and keeps every log line in memory for the test.
class LoggedTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;
};

// Messages of the kept log lines; each line must carry `prio` and `tag`.
Strings logMessages(int prio, const std::string& tag);

// What f prints to standard output.
template <class F>
std::string stdoutOf(F&& f) {
    testing::internal::CaptureStdout();
    f();
    return testing::internal::GetCapturedStdout();
}

// 512 samples of a sine on `bin` (of 512) at `amplitude` of full scale (32768).
std::vector<short> toneFrame(int bin, double amplitude);

android::sp<WaveTable_Double> tableOf(const std::vector<double>& v);
// Samples as fractions of full scale, the way the analyser converts them.
android::sp<WaveTable_Double> frameTable(const std::vector<short>& samples);

}  // namespace dsptest
}  // namespace korvo
