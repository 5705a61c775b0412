// Helpers shared by the meter, capture and handshake tests.
#pragma once
#include <chrono>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include <korvo/platform/TestControl.h>

namespace korvo {
namespace testing {

// Every test starts from the platform's defaults with the log kept in memory.
class PlatformTest : public ::testing::Test {
protected:
    void SetUp() override;
    void TearDown() override;
};

// Log lines of one tag ("TQX", "MiniToneGenerator", ...), as "P/message" (P the priority letter).
std::vector<std::string> logOf(const std::string& tag);
// Whether the kept log has the exact message under the tag at the priority.
bool logHas(const std::string& tag, int prio, const std::string& msg);
// Index of the first kept line of the tag with the message, or -1.
int logIndex(const std::string& tag, const std::string& msg);

// Polls pred until it holds or the time is up.
bool waitFor(const std::function<bool()>& pred, std::chrono::milliseconds timeout);

// n samples of a sine of the given frequency (Hz at 44100) and amplitude (fraction of full scale).
std::vector<int16_t> sine(double hz, double amplitude, size_t n, double phase = 0.0);
// Pushes whole frames of a sine into the scripted microphone.
void pushSineFrames(double hz, double amplitude, int frames);
// Pushes whole frames of silence.
void pushSilenceFrames(int frames);

}  // namespace testing
}  // namespace korvo
