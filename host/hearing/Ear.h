// What a decoder sees of a listener after each capture step: the read-outs and the
// detector that the plug-in's interface offers. A live listener answers through its
// meter object; the offline simulation answers through the library's own code.
#pragma once
#include "interface/SoundMeter_vir.h"

namespace korvo {
namespace host {

class Ear {
public:
    virtual ~Ear() = default;
    // getSpectrumData: entry i (1..255) the level of bin i, 0 at or below the detection
    // level; the result counts the bins with a positive level (0 before any analysis).
    virtual int spectrum(float* out) = 0;
    // getSpectrumData_zorv: the masked read-out that the plug-in's own hearing uses.
    virtual int maskedSpectrum(float* out) = 0;
    // detectTwoPeakFreq_zorv on a masked read-out, as the plug-in's hearing calls it.
    virtual void twoPeaks(float* masked, int* first, int* second) = 0;
    virtual int detectionLevel() = 0;
    virtual void setDetectionLevel(int level) = 0;
};

// A live listener: the meter object's operations.
class MeterEar : public Ear {
public:
    explicit MeterEar(SoundMeter_vir& meter) : mMeter(meter) {}
    int spectrum(float* out) override { return mMeter.getSpectrumData(out); }
    int maskedSpectrum(float* out) override { return mMeter.getSpectrumData_zorv(out); }
    void twoPeaks(float* masked, int* first, int* second) override {
        mMeter.detectTwoPeakFreq_zorv(0.9f, masked, first, second);
    }
    int detectionLevel() override { return mMeter.getDetectionLevel(); }
    void setDetectionLevel(int level) override { mMeter.setDetectionLevel(level); }

private:
    SoundMeter_vir& mMeter;
};

}  // namespace host
}  // namespace korvo
