// A live listener reproduced offline, step for step, on the recording's own clock.
//
// Live, each capture step reads one frame of 512 samples (11.6 ms) into a five-slot
// ring and publishes the ring. The analysis thread takes one slot per turn, on its own
// slot counter, and sleeps 20 ms between turns. It can only take its turn while no
// read is in progress, that is when a step ends; the copy of the ring it analyses was
// taken when its sleep ended, a little before. 20 ms lie between one and two frames,
// so a turn comes every second step and analyses the ring as it stood one step before:
// runs of five successive frames are analysed, then five are skipped.
//
// Which steps carry the turns and where the slot counter stands when capture begins
// depend on how the threads started: the phase (0..9). Phase N puts the turns on the
// steps of parity N % 2 and the slot counter at N / 2 on the first of them.
#pragma once
#include <array>
#include <cstdint>

#include <utils/StrongPointer.h>

#include "host/hearing/Ear.h"
#include "interface/SoundMeterConstants.h"

namespace android {
class WaveformCanvas;
}

namespace korvo {
namespace host {

constexpr int kPhases = 10;

class SimulatedEar : public Ear {
public:
    explicit SimulatedEar(int phase = 0);
    ~SimulatedEar() override;

    // One capture step: a turn of the analysis thread if one falls on this step, then
    // the frame into its slot of the ring.
    void step(const int16_t* frame);
    int64_t steps() const { return mSteps; }
    // The frame the last turn analysed (0 for the first captured frame; -1 before any
    // turn, or when its slot had not been filled yet).
    int64_t analysedFrame() const { return mAnalysed; }

    int spectrum(float* out) override;
    int maskedSpectrum(float* out) override;
    void twoPeaks(float* masked, int* first, int* second) override;
    int detectionLevel() override;
    void setDetectionLevel(int level) override;

private:
    android::sp<android::WaveformCanvas> mCanvas;  // the library's analysis, never run as a thread
    std::array<int16_t, korvo::kRingSamples> mRing{};
    int64_t mSteps = 0;
    int mParity;
    int mSlot;
    int64_t mAnalysed = -1;
};

}  // namespace host
}  // namespace korvo
