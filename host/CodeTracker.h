// Turns the peaks of successive spectra into "code heard" events: a code counts as
// heard once it has stood among the peaks without a break for a little while, and
// is not reported again until it has been gone for a while. A single spectrum
// whose noise happens to peak on a code's index is not a code.
#pragma once
#include <array>
#include <cstdint>

#include "host/CodePlan.h"

namespace korvo {
namespace host {

class CodeTracker {
public:
    static constexpr int64_t kConfirmMs = 60;  // about five capture steps, three spectra
    static constexpr int64_t kReleaseMs = 150;

    // Feeds the codes found in the newest spectrum (-1: none); returns the codes that
    // became heard with this step, bit c for code c.
    uint64_t update(int64_t nowMs, int codeA, int codeB);
    // Code that is currently heard, or -1.
    int current() const;

private:
    struct Track {
        int64_t firstSeen = -1;  // start of the current unbroken presence, -1 when absent
        int64_t lastSeen = -1;
        bool sounding = false;
    };
    std::array<Track, kCodeCount> mTracks{};
};

}  // namespace host
}  // namespace korvo
