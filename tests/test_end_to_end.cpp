// Inside one process: a tone that reaches the microphone shows up, within a
// bounded number of capture steps, as the strongest entry of the read-out.
#include <chrono>
#include <thread>

#include "meter/SoundMeter.h"
#include "support/MeterTestSupport.h"

namespace test = korvo::platform::test;
using korvo::testing::PlatformTest;

namespace {
int strongest(const float* s) {
    int best = 1;
    for (int i = 2; i < 256; ++i) {
        if (s[i] > s[best]) best = i;
    }
    return best;
}
}  // namespace

class EndToEndTest : public PlatformTest {};

TEST_F(EndToEndTest, ScriptedToneBecomesTheStrongestReadoutEntry) {
    test::scriptMic(true);
    SoundMeter meter;
    meter.start_wf_thread();
    meter.startRecord();
    for (int bin : {37, 120, 200}) {
        const double hz = bin * 44100.0 / 512.0;
        bool found = false;
        // Each step captures one frame; the analysis thread takes one frame per 20 ms turn.
        for (int step = 0; step < 200 && !found; ++step) {
            korvo::testing::pushSineFrames(hz, 0.25, 1);
            meter.processAudio();
            float plain[256] = {};
            float masked[256] = {};
            if (meter.getSpectrumData(plain) > 0 && strongest(plain) == bin) {
                meter.getSpectrumData_zorv(masked);
                // The masked read-out carries bin k at index k + 1.
                EXPECT_EQ(masked[bin + 1], (bin + 1) % 10 == 1 || (bin + 1) % 10 == 2 ||
                                                   (bin + 1) % 10 == 8 || (bin + 1) % 10 == 9
                                               ? 0.0f
                                               : plain[bin]);
                found = true;
            } else {
                std::this_thread::sleep_for(std::chrono::milliseconds(3));
            }
        }
        EXPECT_TRUE(found) << "bin " << bin << " never became the strongest entry";
    }
    meter.stopRecord();
    meter.end_wf_thread();
}
