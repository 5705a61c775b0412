// An ear whose read-outs show every bin, with the detection level applied by the host.
//
// A picture or a meter of the room wants the levels under the detection level too,
// while the decoder must see the read-out as the level leaves it. The inner ear is kept
// at the open level and this one blanks what lies at or under its own level, as the
// read-outs do (an entry keeps its level only when it is strictly greater). For any
// level from the open level up, the decoder sees what a read-out at that level shows.
#pragma once
#include <memory>

#include "host/hearing/Calibration.h"
#include "host/hearing/Ear.h"

namespace korvo {
namespace host {

class LevelledEar : public Ear {
public:
    // Takes over the inner ear's level and opens it.
    explicit LevelledEar(Ear& open) : mOpen(open), mLevel(open.detectionLevel()) {
        mOpen.setDetectionLevel(Calibration::kOpenLevel);
    }

    // The inner ear's read-out: every bin above the open level.
    int openSpectrum(float* out) { return mOpen.spectrum(out); }

    // getSpectrumData writes entries 1..255, getSpectrumData_zorv entries 2..255.
    int spectrum(float* out) override { return blank(out, 1, mOpen.spectrum(out)); }
    int maskedSpectrum(float* out) override { return blank(out, 2, mOpen.maskedSpectrum(out)); }
    void twoPeaks(float* masked, int* first, int* second) override { mOpen.twoPeaks(masked, first, second); }
    int detectionLevel() override { return mLevel; }
    void setDetectionLevel(int level) override { mLevel = level; }

private:
    int blank(float* out, int from, int count) const {
        const float level = static_cast<float>(mLevel);
        for (int i = from; i < korvo::kSpectrumBins; ++i) {
            if (!(out[i] > level)) out[i] = 0.0f;
        }
        return count;
    }

    Ear& mOpen;
    int mLevel;
};

// The ear a decoder hears through: the ear itself, or, to see every bin, a LevelledEar over it.
class DecoderEar {
public:
    DecoderEar(Ear& ear, bool seeAll)
        : mLevelled(seeAll ? std::make_unique<LevelledEar>(ear) : nullptr),
          mEar(mLevelled ? static_cast<Ear&>(*mLevelled) : ear) {}
    Ear& operator*() { return mEar; }
    Ear* operator->() { return &mEar; }

private:
    std::unique_ptr<LevelledEar> mLevelled;
    Ear& mEar;
};

}  // namespace host
}  // namespace korvo
