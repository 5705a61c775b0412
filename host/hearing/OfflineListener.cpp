#include "host/hearing/OfflineListener.h"

namespace korvo {
namespace host {

OfflineListener::OfflineListener(DecoderKind kind, int phase, bool seeAll)
    : mKind(kind),
      mEar(phase),
      mDecisionEar(mEar, seeAll),
      mDecoder(makeDecoder(kind)) {}

CodeSet OfflineListener::step(const int16_t* frame) {
    mEar.step(frame);
    const int64_t n = mEar.steps();
    if (n <= kWarmUpSteps) return 0;
    if (mCalibrating) {
        if (n == kWarmUpSteps + 1) mEar.setDetectionLevel(Calibration::kOpenLevel);
        float levels[korvo::kSpectrumBins] = {};
        mEar.spectrum(levels);
        mCalibration.addStep(levels);
        if (n == kWarmUpSteps + kAutoCalibrationSteps) {
            mProposal = mCalibration.propose(mKind);
            mDecisionEar->setDetectionLevel(mProposal.level);
            mCalibrating = false;
            mCalibrated = true;
        }
        return 0;
    }
    mHeard = mDecoder->hear(*mDecisionEar);
    return mEvents.update(n, mHeard);
}

}  // namespace host
}  // namespace korvo
