#include "envelope/simulated/OfflineListener.h"

namespace korvo {
namespace host {

OfflineListener::OfflineListener(DecoderKind kind, int phase, bool seeAll)
    : mKind(kind),
      mEar(phase),
      mDecoderEar(mEar, seeAll),
      mDecoder(makeDecoder(kind)) {}

CodeSet OfflineListener::step(const int16_t* frame) {
    const int64_t n = ++mSteps;
    if (decoderInfo(mKind).offline) {
        // A decoder of frames hears every frame from the first, as scan feeds it.
        StepInput in;
        in.frames = &frame;
        in.frameCount = 1;
        return mDecoder->hear(in);
    }
    mEar.step(frame);
    if (n <= kWarmUpSteps) return 0;
    if (mCalibrating) {
        if (n == kWarmUpSteps + 1) mEar.setDetectionLevel(Calibration::kOpenLevel);
        float levels[korvo::kSpectrumBins] = {};
        mEar.spectrum(levels);
        mCalibration.addStep(levels);
        if (n == kWarmUpSteps + kAutoCalibrationSteps) {
            mProposal = mCalibration.propose();
            mDecoderEar->setDetectionLevel(mProposal.level);
            mCalibrating = false;
            mCalibrated = true;
        }
        return 0;
    }
    StepInput in;
    in.ear = &*mDecoderEar;
    return mDecoder->hear(in);
}

}  // namespace host
}  // namespace korvo
