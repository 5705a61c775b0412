// A live device's hearing: capture steps, each followed by its decoder's decision on the
// frames the step completed (and, for the plug-in's own decision, its read-outs), and the
// codes that begin to be heard. Offline, the same decoders hear a recording's frames
// (OfflineRun).
#pragma once
#include <memory>

#include "host/core/Device.h"
#include "host/core/Options.h"
#include "host/hearing/Calibration.h"
#include "host/hearing/Decoder.h"
#include "host/hearing/LevelledEar.h"

namespace korvo {
namespace host {

class LiveHearing {
public:
    // With `seeAll`, the meter's read-out shows every bin (seenSpectrum) and a decoder of
    // read-outs sees it with the detection level applied by the host (LevelledEar).
    LiveHearing(Device& device, DecoderKind kind, bool seeAll = false);

    // One capture step and the decision after it: the codes that begin to be heard.
    CodeSet step();
    // Codes heard at the last step.
    CodeSet heardNow() const { return mDecoder->sounding(); }
    DecoderKind decoder() const { return mKind; }
    // The microphone's clock: the end of the frame where the last step's codes began
    // (the time in a recording, as scan tells it), else of the last frame heard.
    double seconds() const;

    // Steps until one of `codes` begins to be heard (Done, its code in *code), the
    // deadline (monotonic ms), Ctrl-C or a failed route.
    Outcome waitFor(CodeSet codes, int64_t deadlineMs, int* code);

    // Listens to the room for `steps` steps at the open level into *calibration; the
    // level before stays in force afterwards.
    Outcome listenToRoom(int steps, Calibration* calibration);
    // Sets a detection level (a decoder that takes one); the decoder starts afresh.
    void setLevel(int level);
    // The detection level the decoder hears at; -1 for a decoder that takes none.
    int level();
    // What the decoder heard last (its own spectrum), or the meter's read-out now
    // (getSpectrumData, every bin when seeing all).
    int seenSpectrum(float* out);
    // Applies --level: nothing, a number, or calibration first ("auto", said on stderr).
    Outcome applyLevel(const LevelChoice& level);

private:
    Device& mDevice;
    DecoderKind mKind;
    MeterEar mEar;
    DecoderEar mDecoderEar;
    std::unique_ptr<Decoder> mDecoder;
    int64_t mFrames = 0;      // frames the decoder heard
    int64_t mEventFrame = 0;  // where the last step's codes began (0: none began)
};

}  // namespace host
}  // namespace korvo
