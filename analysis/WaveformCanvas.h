// The analysis thread: each turn copies the shared frame record, analyses one
// frame into the spectrum table, wakes the capture loop and sleeps 20 ms. It
// also carries the detection level and the spectrum read-outs.
#pragma once
#include <atomic>
#include <cstdint>

#include <utils/StrongPointer.h>
#include <utils/Thread.h>

#include "analysis/WaveTable.h"

namespace android {

class WaveformCanvas : public Thread {
public:
    WaveformCanvas();
    ~WaveformCanvas() override;

    void init_variables();
    void setActive(bool on);
    void setDetectionLevel(int value);
    int getDetectionLevel();
    void release();

    // Spectrum analyser.
    void drawSpectrum(short* samples, int count);
    void SpectrumAnalyser_setInput(short* input, int offset, int count, double* out);
    void SpectrumAnalyser_Transform(sp<WaveTable_Double> data);
    void spectrumAnalyser_getResults_Last(sp<WaveTable_Double> fft, sp<WaveTable_Double> out);
    int spectrumAnalyser_getResults(sp<WaveTable_Double> fft, sp<WaveTable_Double> average,
                                    sp<WaveTable_Double_2> history, int index);

    // Read-outs: levels of the spectrum into the caller's 256 floats.
    int getSpectrumData(float* out);
    int getSpectrumData_zorv(float* out);

    // Fields, in the order of the data model.
    int32_t historyLength;
    sp<WaveTable_Double> spectrum;
    sp<WaveTable_Double_2> history;
    int32_t frameIndex;
    int32_t historyIndex;
    // Written by host threads and read by others without a lock: relaxed atomics.
    std::atomic<bool> active;
    std::atomic<int32_t> detectionLevel;
    int32_t rwFlag;

private:
    friend struct WaveformCanvasTestAccess;  // lets tests run single turns of the loop

    bool threadLoop() override;
};

}  // namespace android
