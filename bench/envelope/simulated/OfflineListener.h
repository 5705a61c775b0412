// The envelope's listener of a recording: the host's decoder on its frames, as scan hears
// it, or the plug-in's HearFreqIdx decision the way a live device makes it: the same
// warm-up, the same calibration for --level auto, and a simulation of the plug-in's
// capture and analysis timing (SimulatedEar) in place of the plug-in.
#pragma once
#include <memory>

#include "host/hearing/Calibration.h"
#include "host/hearing/Decoder.h"
#include "host/hearing/LevelledEar.h"
#include "envelope/simulated/SimulatedEar.h"
#include "host/base/Clock.h"

namespace korvo {
namespace host {

class OfflineListener {
public:
    // With `seeAll`, the read-out shows every bin (seenSpectrum) and the decoder sees
    // it with the detection level applied by the host (LevelledEar).
    OfflineListener(DecoderKind kind, int phase, bool seeAll = false);

    // A fixed detection level, or calibration on the room after the warm-up.
    void setLevel(int level) { mDecoderEar->setDetectionLevel(level); }
    void calibrateFirst() { mCalibrating = decoderInfo(mKind).takesLevel; }

    // One capture step with the next frame of 512 samples: the codes that begin to be
    // heard (none during the warm-up and the calibration).
    CodeSet step(const int16_t* frame);
    // Codes heard at the last step.
    CodeSet heardNow() const { return mDecoder->sounding(); }

    int64_t steps() const { return mSteps; }
    // The frame the decision looked at last: the newest for a decoder of frames.
    int64_t analysedFrame() const { return decoderInfo(mKind).offline ? mSteps - 1 : mEar.analysedFrame(); }
    double seconds() const { return stepSeconds(steps()); }
    int level() { return mDecoderEar->detectionLevel(); }
    // The read-out after the last step (getSpectrumData), every bin when seeing all.
    int seenSpectrum(float* out) { return mEar.spectrum(out); }
    // What the calibration proposed, once it has run.
    const Calibration::Proposal& proposal() const { return mProposal; }
    bool calibrated() const { return mCalibrated || !decoderInfo(mKind).takesLevel; }

private:
    DecoderKind mKind;
    SimulatedEar mEar;
    DecoderEar mDecoderEar;
    std::unique_ptr<Decoder> mDecoder;
    int64_t mSteps = 0;
    bool mCalibrating = false;
    bool mCalibrated = false;
    Calibration mCalibration;
    Calibration::Proposal mProposal;
};

}  // namespace host
}  // namespace korvo
