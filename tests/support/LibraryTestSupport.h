// Helpers shared by the library's tests: a fixture with the platform reset and the log
// kept, the kept log as text, bounded waits, and test signals.
#pragma once
#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>
#include <utils/StrongPointer.h>

#include "analysis/WaveTable.h"

namespace korvo {
namespace testing {

namespace test = korvo::platform::test;
using Strings = std::vector<std::string>;

// Every test starts from the platform's defaults with the log kept in memory.
class LoggedTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;
};

// Kept lines of one tag as "P/message" (P the priority letter), optionally only those
// containing `part`.
Strings logOf(const std::string& tag, const std::string& part = "");

// Polls pred until it holds; false when the time ran out first.
bool waitFor(const std::function<bool()>& pred, int timeoutMs = 5000);

// What f prints to standard output.
template <class F>
std::string stdoutOf(F&& f) {
    ::testing::internal::CaptureStdout();
    f();
    return ::testing::internal::GetCapturedStdout();
}

// n samples of a sine of `hz` at 44100 Hz, `amplitude` a fraction of full scale.
std::vector<int16_t> sine(double hz, double amplitude, size_t n);
// Whole 512-sample frames of that sine (or silence, amplitude 0) into the scripted microphone.
void pushFrames(double hz, double amplitude, int frames);
// 512 samples of a sine on spectrum bin `bin`.
std::vector<short> binTone(int bin, double amplitude);

android::sp<WaveTable_Double> tableOf(const std::vector<double>& v);
std::vector<double> valuesOf(const android::sp<WaveTable_Double>& t);

}  // namespace testing
}  // namespace korvo
