#include <cmath>

#include "analysis/WaveformCanvas.h"
#include "interface/SoundMeterConstants.h"

namespace android {

namespace {

constexpr int kBins = korvo::kSpectrumBins;
constexpr int kLastBin = korvo::kLastSpectrumEntry;

// 100 · (1 + log10(m) / 6): the quotient in double, then narrowed and scaled in single precision.
float levelOf(double m) {
    const float q = static_cast<float>(std::log10(m) / 6.0 + 1.0);
    return q * 100.0f;
}

}  // namespace

int WaveformCanvas::getSpectrumData(float* out) {
    int found = 0;
    for (int i = 1; i <= kLastBin; ++i) {
        // Relaxed: the analysis thread may be rewriting the table during the read-out.
        const float level = levelOf(spectrum->getRelaxed(i));
        const bool finite = std::isfinite(level);
        if (finite && level > 0.0f) ++found;
        const float threshold = static_cast<float>(detectionLevel.load(std::memory_order_relaxed));
        out[i] = finite && level > threshold ? level : 0.0f;
    }
    return found;
}

int WaveformCanvas::getSpectrumData_zorv(float* out) {
    int found = 0;
    for (int i = 1; i <= kLastBin; ++i) {
        const float level = levelOf(spectrum->getRelaxed(i));
        const bool finite = std::isfinite(level);
        if (finite && level > 0.0f) ++found;
        const int k = i + 1;  // the masked layout carries bin k - 1 at entry k
        if (k >= kBins) continue;
        const float threshold = static_cast<float>(detectionLevel.load(std::memory_order_relaxed));
        out[k] = korvo::inCodeBand(k) && finite && level > threshold ? level : 0.0f;
    }
    return found;
}

}  // namespace android
