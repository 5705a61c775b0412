#include "envelope/simulated/SimulatedEar.h"

#include <algorithm>

#include "analysis/WaveformCanvas.h"
#include "detection/PeakDetection.h"

namespace korvo {
namespace host {

SimulatedEar::SimulatedEar(int phase)
    : mCanvas(new android::WaveformCanvas()), mParity(phase % 2), mSlot((phase / 2) % korvo::kRingSlots) {}

SimulatedEar::~SimulatedEar() = default;

void SimulatedEar::step(const int16_t* frame) {
    if ((mSteps + mParity) % 2 == 0) {
        // The slot as the ring stood before this step's frame arrived.
        mCanvas->drawSpectrum(&mRing[static_cast<size_t>(mSlot) * korvo::kFrameSamples], korvo::kFrameSamples);
        // The newest frame captured into this slot: frames 0, 1, .. went to slots 0, 1, ..
        const int64_t back = ((mSteps - 1 - mSlot) % korvo::kRingSlots + korvo::kRingSlots) % korvo::kRingSlots;
        mAnalysed = mSteps >= 1 && mSteps - 1 - back >= 0 ? mSteps - 1 - back : -1;
        mSlot = (mSlot + 1) % korvo::kRingSlots;
    }
    const size_t at = static_cast<size_t>(mSteps % korvo::kRingSlots) * korvo::kFrameSamples;
    std::copy(frame, frame + korvo::kFrameSamples, mRing.begin() + static_cast<std::ptrdiff_t>(at));
    ++mSteps;
}

int SimulatedEar::spectrum(float* out) { return mCanvas->getSpectrumData(out); }

int SimulatedEar::maskedSpectrum(float* out) { return mCanvas->getSpectrumData_zorv(out); }

void SimulatedEar::twoPeaks(float* masked, int* first, int* second) {
    // detectTwoPeakFreq_zorv: the strongest entry, the maximum it displaced, in order.
    korvo::detectPeakFreq_zorv(masked, 0, first);
    korvo::detectSecondPeakFreq_zorv(masked, *first, second);
    korvo::orderPeaks(first, second);
}

int SimulatedEar::detectionLevel() { return mCanvas->getDetectionLevel(); }

// Stored directly: the library's setter also prints a line on standard output.
void SimulatedEar::setDetectionLevel(int level) { mCanvas->detectionLevel.store(level, std::memory_order_relaxed); }

}  // namespace host
}  // namespace korvo
