#include "host/hearing/Calibration.h"

#include <algorithm>
#include <cmath>

#include "host/hearing/LevelPower.h"

namespace korvo {
namespace host {

namespace {

constexpr int kLastBin = korvo::kLastSpectrumEntry;
// The bins the decoders look at: from a little below code 0 to the read-out's end.
constexpr int kFirstRoomBin = 20;

}  // namespace

void Calibration::addStep(const float* levels) {
    ++mSteps;
    if (std::equal(levels + 1, levels + korvo::kSpectrumBins, mPrevious.begin() + 1)) return;
    std::copy(levels, levels + korvo::kSpectrumBins, mPrevious.begin());
    mFrames.push_back(mPrevious);
}

double Calibration::builtinFalsePerStep(int level) const {
    if (mFrames.empty() || mSteps == 0) return 0.0;
    const double threshold = levelPower(level);
    double sum = 0.0;
    for (const auto& f : mFrames) {
        for (int c = 0; c < kBuiltinCodes; ++c) {
            const int bin = korvo::codeIndex(c) - 1;  // masked entry 30 + 10c carries bin 29 + 10c
            double mean = 0.0;
            for (int d = 1; d <= kLocalBins; ++d) {
                mean += (f[bin - d] == 0.0f ? 0.0 : levelPower(f[bin - d])) + (f[bin + d] == 0.0f ? 0.0 : levelPower(f[bin + d]));
            }
            mean /= 2 * kLocalBins;
            if (mean > 0.0) sum += std::exp(-threshold / mean);
        }
    }
    // Per analysed frame, then spread over the steps that read it.
    return sum / mSteps;
}

Calibration::Proposal Calibration::propose() const {
    Proposal p;
    std::vector<float> room;
    float loudestCode = -HUGE_VALF;
    for (const auto& f : mFrames) {
        for (int b = kFirstRoomBin; b <= kLastBin; ++b) {
            if (f[b] != 0.0f) room.push_back(f[b]);
        }
        for (int c = 0; c < kBuiltinCodes; ++c) loudestCode = std::max(loudestCode, f[korvo::codeIndex(c) - 1]);
    }
    if (room.empty()) {
        p.silent = true;
        p.noiseLevel = -HUGE_VAL;
        p.level = 0;
        return p;
    }
    std::sort(room.begin(), room.end());
    p.noiseLevel = room[room.size() / 2];
    int level = std::max(kOpenLevel, static_cast<int>(std::ceil(loudestCode)));
    while (level < kMaxLevel && builtinFalsePerStep(level) >= kTargetPerStep) ++level;
    p.level = level;
    p.falsePer10k = builtinFalsePerStep(level) * 1e4;
    return p;
}

}  // namespace host
}  // namespace korvo
