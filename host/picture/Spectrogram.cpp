#include "host/picture/Spectrogram.h"

#include <algorithm>
#include <limits>

namespace korvo {
namespace host {

namespace {
constexpr float kNothing = -std::numeric_limits<float>::infinity();
constexpr size_t kBins = korvo::kSpectrumBins;
}  // namespace

Spectrogram::Spectrogram(int64_t plannedSteps)
    : mStepsPerColumn(static_cast<int>(std::max<int64_t>(1, (plannedSteps + kMaxColumns - 1) / kMaxColumns))) {}

void Spectrogram::addStep(int64_t step, const float* levels) {
    if (step < 1) return;
    while (step > static_cast<int64_t>(kMaxColumns) * mStepsPerColumn) mergePairs();
    const size_t column = static_cast<size_t>(columnOf(step));
    if (column >= mFilled.size()) {
        mFilled.resize(column + 1, false);
        mLevels.resize((column + 1) * kBins, kNothing);
    }
    float* at = &mLevels[column * kBins];
    for (size_t b = 1; b < kBins; ++b) {
        if (levels[b] != 0.0f) at[b] = std::max(at[b], levels[b]);
    }
    mFilled[column] = true;
    mLastStep = std::max(mLastStep, step);
}

void Spectrogram::addHeard(int64_t step, int code) { mHeard.push_back({step, code}); }

void Spectrogram::mergePairs() {
    const size_t merged = (mFilled.size() + 1) / 2;
    for (size_t c = 0; c < merged; ++c) {
        float* to = &mLevels[c * kBins];
        const float* a = &mLevels[2 * c * kBins];
        const bool hasB = 2 * c + 1 < mFilled.size();
        for (size_t b = 0; b < kBins; ++b) {
            to[b] = hasB ? std::max(a[b], mLevels[(2 * c + 1) * kBins + b]) : a[b];
        }
        mFilled[c] = mFilled[2 * c] || (hasB && mFilled[2 * c + 1]);
    }
    mFilled.resize(merged);
    mLevels.resize(merged * kBins);
    mStepsPerColumn *= 2;
}

}  // namespace host
}  // namespace korvo
