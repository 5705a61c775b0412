#include "host/Hearing.h"

#include <cmath>

#include "host/Clock.h"
#include "host/Output.h"

namespace korvo {
namespace host {

Hearing::Hearing(Device& device, DecoderKind kind, bool seeAll)
    : mDevice(device),
      mKind(kind),
      mEar(device.meter()),
      mDecisionEar(mEar, seeAll),
      mDecoder(makeDecoder(kind)) {}

CodeSet Hearing::step() {
    mDevice.step();
    mHeard = mDecoder->hear(*mDecisionEar);
    return mEvents.update(mDevice.steps(), mHeard);
}

Outcome Hearing::waitFor(CodeSet codes, int64_t deadlineMs, int* code) {
    for (;;) {
        const Outcome stop = mDevice.interruption();
        if (stop != Outcome::Done) return stop;
        const CodeSet begun = step() & codes;
        if (begun != 0) {
            int c = 0;
            while (!(begun & codeBit(c))) ++c;
            *code = c;
            return Outcome::Done;
        }
        if (monotonicMs() >= deadlineMs) return Outcome::TimedOut;
    }
}

Outcome Hearing::listenToRoom(int steps, Calibration* calibration) {
    SoundMeter_vir& meter = mDevice.meter();
    const int before = meter.getDetectionLevel();
    meter.setDetectionLevel(Calibration::kOpenLevel);
    float levels[korvo::kSpectrumBins] = {};
    Outcome outcome = Outcome::Done;
    for (int i = 0; i < steps; ++i) {
        if ((outcome = mDevice.interruption()) != Outcome::Done) break;
        mDevice.step();
        meter.getSpectrumData(levels);
        calibration->addStep(levels);
    }
    meter.setDetectionLevel(before);
    return outcome;
}

void Hearing::setLevel(int level) {
    mDecisionEar->setDetectionLevel(level);
    mDecoder->reset();  // what it saw at another level says nothing at this one
}

Outcome Hearing::applyLevel(const LevelChoice& level) {
    if (!level.given) return Outcome::Done;
    if (!level.automatic) {
        setLevel(level.value);
        return Outcome::Done;
    }
    Calibration calibration;
    const Outcome o = listenToRoom(kAutoCalibrationSteps, &calibration);
    if (o != Outcome::Done) return o;
    const Calibration::Proposal p = calibration.propose(mKind);
    setLevel(p.level);
    infof("detection level %d (calibrated on %.1f s of the room for the %s decision)\n", p.level,
          stepSeconds(kAutoCalibrationSteps), decoderName(mKind));
    return o;
}

}  // namespace host
}  // namespace korvo
