#include "host/core/LiveHearing.h"

#include "host/base/Clock.h"
#include "host/output/Output.h"

namespace korvo {
namespace host {

LiveHearing::LiveHearing(Device& device, DecoderKind kind, bool seeAll)
    : mDevice(device),
      mKind(kind),
      mEar(device.meter()),
      mDecoderEar(mEar, seeAll && decoderInfo(kind).takesLevel),
      mDecoder(makeDecoder(kind)) {}

CodeSet LiveHearing::step() {
    mDevice.step();
    const int16_t* frames[Device::kKeptFrames];
    const int count = mDevice.takeFrames(frames);
    mEventFrame = 0;
    if (!decoderInfo(mKind).offline) {  // it hears the plug-in's read-outs after the step
        StepInput in;
        in.frames = frames;
        in.frameCount = count;
        in.ear = &*mDecoderEar;
        return mDecoder->hear(in);
    }
    // Frame by frame, so that a code's time is the frame where it began, as offline.
    CodeSet begun = 0;
    for (int i = 0; i < count; ++i) {
        StepInput in;
        in.frames = &frames[i];
        in.frameCount = 1;
        ++mFrames;
        const CodeSet now = mDecoder->hear(in);
        if (now != 0 && begun == 0) mEventFrame = mFrames;
        begun |= now;
    }
    return begun;
}

double LiveHearing::seconds() const {
    // A decoder of read-outs keeps the step clock: a step reads one frame.
    if (!decoderInfo(mKind).offline) return stepSeconds(mDevice.steps());
    return stepSeconds(mEventFrame > 0 ? mEventFrame : mFrames);
}

Outcome LiveHearing::waitFor(CodeSet codes, int64_t deadlineMs, int* code) {
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

Outcome LiveHearing::listenToRoom(int steps, Calibration* calibration) {
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

void LiveHearing::setLevel(int level) {
    if (!decoderInfo(mKind).takesLevel) return;
    mDecoderEar->setDetectionLevel(level);
    mDecoder->reset();  // what it saw at another level says nothing at this one
}

int LiveHearing::level() { return decoderInfo(mKind).takesLevel ? mDecoderEar->detectionLevel() : -1; }

int LiveHearing::seenSpectrum(float* out) {
    if (mDecoder->spectrum(out)) return korvo::kSpectrumBins;
    return mEar.spectrum(out);
}

Outcome LiveHearing::applyLevel(const LevelChoice& level) {
    if (!level.given || !decoderInfo(mKind).takesLevel) return Outcome::Done;
    if (!level.automatic) {
        setLevel(level.value);
        return Outcome::Done;
    }
    Calibration calibration;
    const Outcome o = listenToRoom(kAutoCalibrationSteps, &calibration);
    if (o != Outcome::Done) return o;
    const Calibration::Proposal p = calibration.propose();
    setLevel(p.level);
    infof("detection level %d (calibrated on %.1f s of the room for the %s decision)\n", p.level,
          stepSeconds(kAutoCalibrationSteps), decoderName(mKind));
    return o;
}

}  // namespace host
}  // namespace korvo
