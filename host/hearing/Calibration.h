// Proposes a detection level for HearFreqIdx's decision (--decoder builtin) from what a
// listener hears of the room alone; the host's decoder takes no level.
//
// For HearFreqIdx's decision the level is its only defence: a
// masked entry above it may be named as a code. In noise, a bin's power in one frame
// is exponentially distributed about the mean power around it, so the chance that code
// c's entry passes level L in frame t is exp(-P(L) / mu(t, c)), mu(t, c) being the mean
// power of the twelve bins around that entry in frame t (loud and quiet moments of the
// room each count for themselves). The proposal is the lowest level at which these
// chances, summed over the codes and spread over the hearing steps, stay under one false
// code in 10,000 steps, and that no code entry of the room reached during calibration
// (a steady tone in the room would be heard every time).
#pragma once
#include <array>
#include <vector>

#include "host/hearing/Decoder.h"
#include "host/hearing/LevelPower.h"

namespace korvo {
namespace host {

// Steps --level auto listens to the room for (1.5 s).
constexpr int kAutoCalibrationSteps = 129;

class Calibration {
public:
    // The level at which a read-out shows every bin: calibration reads at it.
    static constexpr int kOpenLevel = kMinLevel;
    static constexpr double kTargetPerStep = 1e-4;
    static constexpr int kLocalBins = 6;  // on each side of a code entry's bin

    // One hearing step's read-out (getSpectrumData at kOpenLevel).
    void addStep(const float* levels);
    int steps() const { return mSteps; }
    int frames() const { return static_cast<int>(mFrames.size()); }

    struct Proposal {
        int level = 0;
        double falsePer10k = 0.0;  // expected false codes per 10,000 steps at that level (builtin)
        double noiseLevel = 0.0;   // median bin level of the room (-inf when silent)
        bool silent = false;       // nothing above the read-out's floor: the default level stays
    };
    Proposal propose() const;
    // Expected false codes of HearFreqIdx's decision per step at `level`.
    double builtinFalsePerStep(int level) const;

private:
    std::vector<std::array<float, korvo::kSpectrumBins>> mFrames;  // new analysed frames only
    std::array<float, korvo::kSpectrumBins> mPrevious{};
    int mSteps = 0;
};

}  // namespace host
}  // namespace korvo
