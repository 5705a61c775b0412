// A device's hearing: capture steps, each followed by its decoder's decision, and the
// codes that begin to be heard. The same decoders hear a recording offline (scan).
#pragma once
#include <memory>

#include "host/Device.h"
#include "host/Options.h"
#include "host/hearing/Calibration.h"
#include "host/hearing/CodeEvents.h"
#include "host/hearing/Decoder.h"
#include "host/hearing/LevelledEar.h"

namespace korvo {
namespace host {

class Hearing {
public:
    // With `seeAll`, the meter's read-out shows every bin (seenSpectrum) and the decoder
    // sees it with the detection level applied by the host (LevelledEar).
    Hearing(Device& device, DecoderKind kind, bool seeAll = false);

    // One capture step and the decision after it: the codes that begin to be heard.
    CodeSet step();
    // Codes heard at the last step.
    CodeSet heardNow() const { return mHeard; }
    DecoderKind decoder() const { return mKind; }
    // The microphone's clock: the time in a recording.
    double seconds() const { return stepSeconds(mDevice.steps()); }

    // Steps until one of `codes` begins to be heard (Done, its code in *code), the
    // deadline (monotonic ms), Ctrl-C or a failed route.
    Outcome waitFor(CodeSet codes, int64_t deadlineMs, int* code);

    // Listens to the room for `steps` steps at the open level into *calibration; the
    // level before stays in force afterwards.
    Outcome listenToRoom(int steps, Calibration* calibration);
    // Sets a detection level; the decoder starts afresh at it.
    void setLevel(int level);
    // The detection level the decoder hears at.
    int level() { return mDecisionEar->detectionLevel(); }
    // The meter's read-out now (getSpectrumData), every bin when seeing all.
    int seenSpectrum(float* out) { return mEar.spectrum(out); }
    // Applies --level: nothing, a number, or calibration first ("auto", said on stderr).
    Outcome applyLevel(const LevelChoice& level);

private:
    Device& mDevice;
    DecoderKind mKind;
    MeterEar mEar;
    DecisionEar mDecisionEar;
    std::unique_ptr<Decoder> mDecoder;
    CodeEvents mEvents;
    CodeSet mHeard = 0;
};

}  // namespace host
}  // namespace korvo
