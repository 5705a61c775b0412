
#include <cmath>
#include <cstdio>

#include "analysis/RealDoubleFFT.h"
#include "analysis/WaveformCanvas.h"
#include "common/LogTags.h"
#include "interface/SoundMeterConstants.h"

namespace android {

namespace {

constexpr int kFrameLength = korvo::kFrameSamples;
constexpr int kBins = korvo::kSpectrumBins;
constexpr double kInputScale = korvo::kInputScale;
constexpr float kMagnitudeDivisor = korvo::kMagnitudeDivisor;

// |X_i| of the transformed table r (r[2i - 1] and r[2i] hold bin i), scaled in single precision.
float binMagnitude(const WaveTable_Reader& r, int i) {
    const double a = r[2 * i];
    const double b = i >= 1 ? r[2 * i - 1] : 0.0;
    const double m = std::sqrt(a * a + b * b);
    return static_cast<float>(m) / kMagnitudeDivisor;
}

}  // namespace

void WaveformCanvas::drawSpectrum(short* samples, int count) {
    // The frame always holds 512 captured samples; a count below 512 (a frame completed by
    // several reads) analyses it from its first sample instead of reading before it.
    const short* frame = samples + (count >= kFrameLength ? count - kFrameLength : 0);
    sp<WaveTable_Double> table = new WaveTable_Double(kFrameLength);
    for (int i = 0; i < kFrameLength; ++i) table->set(i, frame[i] * kInputScale);
    SpectrumAnalyser_Transform(table);
    if (historyLength > 1) {
        historyIndex = spectrumAnalyser_getResults(table, spectrum, history, historyIndex);
    } else {
        spectrumAnalyser_getResults_Last(table, spectrum);
    }
    table.clear();
}

void WaveformCanvas::SpectrumAnalyser_setInput(short* input, int offset, int count, double* out) {
    if (count != kFrameLength) {
        CANVAS_LOG(ANDROID_LOG_ERROR, "[%s] SpectrumAnalyser_setInput: bad input count(%d) in FFT", count);
        return;
    }
    for (int i = 0; i < kFrameLength; ++i) out[i] = input[offset + i] * kInputScale;
}

void WaveformCanvas::SpectrumAnalyser_Transform(sp<WaveTable_Double> data) {
    sp<RealDoubleFFT> fft = new RealDoubleFFT(kFrameLength);
    fft->forwardTransform(data);
    fft.clear();
}

void WaveformCanvas::spectrumAnalyser_getResults_Last(sp<WaveTable_Double> fft,
                                                      sp<WaveTable_Double> out) {
    if (out->length != kBins) {
        CANVAS_LOG(ANDROID_LOG_ERROR, "[%s] bad output buffer size in FFT: must be %d; given %d", kBins, out->length);
    }
    // A shorter table gets the bins that fit: nothing is written past its end.
    const int bins = out->length < kBins ? out->length : kBins;
    const WaveTable_Reader r = fft->reader();
    // Relaxed stores: the read-outs read this table from other threads without a lock.
    for (int i = 0; i < bins; ++i) out->setRelaxed(i, binMagnitude(r, i));
}

int WaveformCanvas::spectrumAnalyser_getResults(sp<WaveTable_Double> fft,
                                                sp<WaveTable_Double> average,
                                                sp<WaveTable_Double_2> hist, int index) {
    std::printf("[%s] spectrumAnalyser_getResults\n", korvo::kCanvasWho);
    if (average->length != kBins) {
        CANVAS_LOG(ANDROID_LOG_ERROR, "[%s] bad average buffer size in FFT: must be %d ; given %d", kBins, average->length);
        return -1;
    }
    if (hist->length != kBins) {
        CANVAS_LOG(ANDROID_LOG_ERROR, "[%s] bad history buffer size in FFT: must be %d ; given %d", kBins, hist->length);
        return -1;
    }
    const int w = hist->width;
    // A history without slots has nowhere to keep a magnitude: refused like a wrong size.
    if (w < 1) return -1;
    // Any index outside -1 .. w - 2 (nothing it could follow) starts again at slot 0.
    const int slot = index >= -1 && index < w - 1 ? index + 1 : 0;
    const float wf = static_cast<float>(w);
    const WaveTable_Reader r = fft->reader();
    for (int i = 0; i < kBins; ++i) {
        const float v = binMagnitude(r, i);
        const double old = hist->get(i, slot);
        hist->set(i, slot, v);
        const double fresh = static_cast<double>(v / wf);
        const double stale = static_cast<double>(static_cast<float>(old) / wf);
        average->setRelaxed(i, fresh + (average->getRelaxed(i) - stale));
    }
    return slot;
}

}  // namespace android
