#include <cmath>

#include "analysis/WaveformCanvas.h"

namespace android {

namespace {

constexpr int kBins = 256;
constexpr int kLastBin = 255;
constexpr int kFirstCodeEntry = 26;
constexpr int kLastCodeEntry = 200;

// 100 · (1 + log10(m) / 6): the quotient in double, then narrowed and scaled in single precision.
float levelOf(double m) {
    const float q = static_cast<float>(std::log10(m) / 6.0 + 1.0);
    return q * 100.0f;
}

// Entries whose index ends in 1, 2, 8 or 9 fall between the code bands.
bool inCodeBand(int k) {
    if (k < kFirstCodeEntry || k > kLastCodeEntry) return false;
    const int d = k % 10;
    return d == 0 || (d >= 3 && d <= 7);
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
        out[k] = inCodeBand(k) && finite && level > threshold ? level : 0.0f;
    }
    return found;
}

}  // namespace android
