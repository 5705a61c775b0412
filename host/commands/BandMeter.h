// What monitor shows of each code's band, from read-outs that show every bin: the
// level of the code's own bin now, the highest it reached lately (held for kHoldMs),
// and the band's noise floor (the mean power of twelve bins 4 to 9 bins from the code's,
// which its tone's leakage hardly reaches, averaged over about a second).
#pragma once
#include <array>
#include <cstdint>

#include "host/hearing/Decoder.h"

namespace korvo {
namespace host {

class BandMeter {
public:
    static constexpr int64_t kHoldMs = 2000;
    // Weight of each step in the floor's running mean of power: about 86 steps, one second.
    static constexpr double kFloorWeight = 1.0 / 86.0;

    struct Band {
        float now = 0.0f;    // level of the code's own bin; 0 when it showed nothing
        float peak = 0.0f;   // highest level in the last kHoldMs
        float floor = 0.0f;  // the noise floor as a level; 0 before anything showed
    };

    static constexpr int kReferenceBins = 12;
    static constexpr int kNearestReference = 4;  // reference bins start this far from the code's bin
    // The bins of code `code`'s floor: the twelve nearest from kNearestReference bins away,
    // inside the read-out (code 22 takes more from below).
    static std::array<int, kReferenceBins> referenceBins(int code);

    BandMeter();
    // One read-out (getSpectrumData at the open level) at time `nowMs`.
    void add(const float* levels, int64_t nowMs);
    const Band& band(int code) const { return mBands[static_cast<size_t>(code)]; }

private:
    std::array<Band, kHostCodes> mBands{};
    std::array<int64_t, kHostCodes> mPeakAt{};
    std::array<double, kHostCodes> mFloorPower{};
    std::array<std::array<int, kReferenceBins>, kHostCodes> mReference{};
};

// The codes a listener has heard, newest first, each with the time it began to be
// heard: monitor's "heard" line.
class HeardLog {
public:
    static constexpr int kShown = 3;
    struct Entry {
        int code = -1;
        int64_t atMs = 0;
    };
    void add(CodeSet begun, int64_t nowMs);
    const std::array<Entry, kShown>& entries() const { return mEntries; }

private:
    std::array<Entry, kShown> mEntries{};
};

}  // namespace host
}  // namespace korvo
