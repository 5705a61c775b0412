#include "host/commands/BandMeter.h"

#include <algorithm>
#include <cmath>

#include "host/hearing/LevelPower.h"

namespace korvo {
namespace host {

std::array<int, BandMeter::kReferenceBins> BandMeter::referenceBins(int code) {
    std::array<int, kReferenceBins> bins{};
    const int bin = korvo::codeIndex(code);
    int found = 0;
    for (int d = kNearestReference; found < kReferenceBins; ++d) {
        for (int b : {bin - d, bin + d}) {
            if (b >= 1 && b <= korvo::kLastSpectrumEntry && found < kReferenceBins) bins[static_cast<size_t>(found++)] = b;
        }
    }
    return bins;
}

BandMeter::BandMeter() {
    for (int c = 0; c < kHostCodes; ++c) mReference[static_cast<size_t>(c)] = referenceBins(c);
}

void BandMeter::add(const float* levels, int64_t nowMs) {
    for (int c = 0; c < kHostCodes; ++c) {
        const size_t i = static_cast<size_t>(c);
        Band& b = mBands[i];
        b.now = levels[korvo::codeIndex(c)];
        if (b.now >= b.peak || nowMs - mPeakAt[i] > kHoldMs) {
            b.peak = b.now;
            mPeakAt[i] = nowMs;
        }
        double power = 0.0;
        for (int bin : mReference[i]) {
            if (levels[bin] != 0.0f) power += levelPower(levels[bin]);
        }
        power /= static_cast<double>(mReference[i].size());
        if (power <= 0.0) continue;  // nothing shown: the floor keeps what it knew
        double& mean = mFloorPower[i];
        mean = mean == 0.0 ? power : mean + kFloorWeight * (power - mean);
        b.floor = static_cast<float>(std::log10(mean) / 0.12);
    }
}

void HeardLog::add(CodeSet begun, int64_t nowMs) {
    for (int c = 0; c < korvo::kPlanCodes; ++c) {
        if (!(begun & codeBit(c))) continue;
        std::rotate(mEntries.rbegin(), mEntries.rbegin() + 1, mEntries.rend());
        mEntries[0] = {c, nowMs};
    }
}

}  // namespace host
}  // namespace korvo
