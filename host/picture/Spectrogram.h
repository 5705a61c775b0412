// What a listener's read-out showed, step by step, and the codes it heard: the content
// of a spectrogram picture.
//
// A column holds one capture step's read-out, or several once the recording is longer
// than the picture's width allows: each bin then keeps the highest level its steps
// showed, so a short tone stays visible however long the recording. Memory stays
// bounded: past kMaxColumns, neighbouring columns merge and each holds twice the steps.
#pragma once
#include <cstdint>
#include <vector>

#include "host/hearing/Decoder.h"
#include "interface/SoundMeterConstants.h"

namespace korvo {
namespace host {

class Spectrogram {
public:
    static constexpr int kMaxColumns = 2400;

    // Sized for `plannedSteps` capture steps (a guess: more or fewer may come).
    explicit Spectrogram(int64_t plannedSteps);

    // The read-out after capture step `step` (1 for the first), levels as getSpectrumData
    // gives them; 0.0 entries count as nothing shown. Steps never passed show as blank.
    void addStep(int64_t step, const float* levels);
    // Code `code` began to be heard at step `step`.
    void addHeard(int64_t step, int code);

    struct Heard {
        int64_t step;
        int code;
    };
    int stepsPerColumn() const { return mStepsPerColumn; }
    int columns() const { return static_cast<int>(mFilled.size()); }
    // Steps the picture covers: up to the last one added.
    int64_t steps() const { return mLastStep; }
    bool filled(int column) const { return mFilled[static_cast<size_t>(column)]; }
    // The level of `bin` (1..255) in a filled column; -infinity where nothing was shown.
    float level(int column, int bin) const {
        return mLevels[static_cast<size_t>(column) * korvo::kSpectrumBins + static_cast<size_t>(bin)];
    }
    const std::vector<Heard>& heard() const { return mHeard; }
    // The column that holds step `step`.
    int columnOf(int64_t step) const { return static_cast<int>((step - 1) / mStepsPerColumn); }

private:
    void mergePairs();

    int mStepsPerColumn;
    std::vector<float> mLevels;  // kSpectrumBins per column
    std::vector<bool> mFilled;
    std::vector<Heard> mHeard;
    int64_t mLastStep = 0;
};

}  // namespace host
}  // namespace korvo
