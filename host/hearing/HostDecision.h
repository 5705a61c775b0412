// The host's decision: a code is heard when its own bin in the unmasked read-out
// stands above the noise around it, in one analysed frame or summed over a few
// successive ones.
//
// Code c's tone (86 * (30 + 10c) Hz) falls in bin 30 + 10c. In each analysed frame its
// power is divided by the mean power of twelve reference bins at 4 to 9 bins from it,
// which the tone's own leakage hardly reaches: the ratio u does not depend on how loud
// the room is at that moment, and in noise alone it follows an F distribution with 2
// and 24 degrees of freedom. The bin must also stand above its six neighbours (three
// on each side, each divided by the same mean), so a tone between two codes' bins, or
// folded back from above half the output rate, is not taken for a code.
//
// Over the last N analysed frames (N = 1, 2, 3, 4, 6 or 8) the evidence is the sum of
// max(ln u, 0). Each N has the threshold that noise alone passes with a probability of
// 1e-9 per code and frame (the distribution of the sum computed by convolution). A loud
// tone is heard on its first analysed frame, a faint one once enough frames add up;
// the frames count alike however loud the noise was in each, so a noise that swells
// and fades (speech) is no louder evidence than a steady one.
//
// A code once heard stays heard while its bin keeps kHoldDb above the reference, and is
// let go after three analysed frames without it, or when no new frame has come for
// kStaleSteps steps (silence, or a listener whose analysis stopped).
#pragma once
#include <array>

#include "host/hearing/Decoder.h"

namespace korvo {
namespace host {

class HostDecision : public Decoder {
public:
    static constexpr int kMaxWindow = 8;
    static constexpr int kWindows = 6;
    static constexpr std::array<int, kWindows> kWindowFrames = {1, 2, 3, 4, 6, 8};
    // Upper 1e-9 points of the sum of N max(ln u, 0), u ~ F(2, 24), for the windows above.
    static constexpr std::array<double, kWindows> kThresholdNats = {4.018, 5.890, 7.376, 8.626, 10.680, 12.390};
    static constexpr double kHoldDb = 6.0;
    static constexpr int kReleaseFrames = 3;
    static constexpr int kStaleSteps = 12;
    static constexpr int kReferenceBins = 12;
    static constexpr int kNearestReference = 4;  // reference bins start this far from the code's bin
    static constexpr int kNeighbours = 3;        // on each side

    HostDecision();
    CodeSet hear(Ear& ear) override;
    // The bins whose mean power is code `code`'s reference: the twelve nearest from
    // kNearestReference bins away, inside the read-out (code 22 takes more from below).
    static std::array<int, kReferenceBins> referenceBins(int code);
    void reset() override;

    // For one read-out taken as a new analysed frame (levels as getSpectrumData gives
    // them, `level` the detection level it applied): the codes heard afterwards.
    CodeSet addFrame(const float* levels, int level);

private:
    // One frame, every power divided by the mean power of the code's reference bins.
    struct Evidence {
        double code = 0.0;                           // the code's bin: u
        std::array<double, 2 * kNeighbours> near{};  // its neighbours
    };
    struct Track {
        std::array<Evidence, kMaxWindow> frames;  // newest at `newest`, going back
        int count = 0;
        int newest = -1;
        bool heard = false;
        int misses = 0;
    };

    // The evidence of the newest `n` frames (sum of max(ln u, 0)), and whether the
    // code's bin stands above each neighbour over them.
    double evidence(const Track& t, int n, bool* peak) const;
    void release(int code);

    std::array<std::array<int, kReferenceBins>, kHostCodes> mReference;
    std::array<Track, kHostCodes> mTracks;
    std::array<float, korvo::kSpectrumBins> mPrevious{};
    CodeSet mHeard = 0;
    int mStepsWithoutFrame = 0;
};

}  // namespace host
}  // namespace korvo
