// HearFreqIdx's decision, made for every code at once: the masked read-out, its two
// peaks, each looked up as a code. One spectrum decides.
//
// Two guards are added. The masked bands end at entry 200 (code 17), so a tone above it
// (codes 18 and up, or what a code above half the output rate folds back to) leaks
// into entry 200 and would be taken for code 17. A code is not taken when the
// unmasked read-out shows a tone at least kGuardLevels above it beyond the bands; and
// code 17 is not taken when its own bin lies under one of the kEdgeBins bins above it,
// the read-out rising towards what sounds above the bands (the broad splatter of such
// a tone's start, for one).
#pragma once
#include "host/hearing/Decoder.h"

namespace korvo {
namespace host {

class BuiltinDecoder {
public:
    static constexpr float kGuardLevels = 12.0f;  // 14.4 dB; noise alone rarely stands so far out
    static constexpr int kEdgeBins = 3;

    // The codes heard in the read-outs after a capture step.
    CodeSet decide(Ear& ear);

    // Whether the code of masked entry `entry` (level `level`) is leakage of a stronger
    // tone above the bands, by the unmasked read-out `levels`.
    static bool leakFromAbove(const float* levels, float level);
    // Whether code 17's own bin lies under one of the bins just above it.
    static bool risesAboveTheBands(const float* levels);
};

}  // namespace host
}  // namespace korvo
