// Sine oscillator: y[k] = 2cos(w) y[k-1] - y[k-2] in fixed point (coefficient Q14,
// amplitude Q15), seeded so that the wave starts at phase zero with peak 32000.
#include <cmath>
#include <cstdint>

#include "tone/MiniToneGenerator.h"
#include "tone/ToneLog.h"

namespace android {

namespace {

// Truncates toward zero into 32 bits; the clamps only keep the conversion defined.
int32_t truncTo32(double v) {
    if (v >= 2147483647.0) return INT32_MAX;
    if (v <= -2147483648.0) return INT32_MIN;
    return static_cast<int32_t>(v);
}

// 16-bit add that wraps around: samples are mixed without saturation.
inline void addWrapped(short* sample, int64_t value) {
    uint16_t sum = static_cast<uint16_t>(static_cast<uint16_t>(*sample) + static_cast<uint16_t>(value));
    *sample = static_cast<short>(sum);
}

}  // namespace

MiniToneGenerator::WaveGenerator::WaveGenerator(unsigned short samplingRate,
                                                unsigned short frequency, float volume) {
    // Divided by the rate before the 2*pi product: this order fixes the constants' last bits.
    double omega = static_cast<double>(frequency) / static_cast<double>(samplingRate) *
                   6.283185307179586;
    mS2_0 = static_cast<short>(truncTo32(-32000.0 * std::sin(omega)));
    mS2 = mS2_0;
    mS1 = 0;
    // 1073676289 = 32767^2; 32000 is the oscillator's own peak.
    int32_t amp = truncTo32(static_cast<double>(volume) * 1073676289.0 / 32000.0);
    if (amp > 32500) amp = 32500;
    mAmplitude_Q15 = static_cast<short>(amp);
    // 32768 (cos of a frequency near 0) does not fit in 16 bits.
    double a1 = 32768.0 * std::cos(omega);
    if (a1 > 32767.0) a1 = 32767.0;
    mA1_Q14 = static_cast<short>(truncTo32(a1));
    TONE_LOGE("WaveGenerator init, mA1_Q14: %d, mS2_0: %d, mAmplitude_Q15: %d", mA1_Q14, mS2_0,
              mAmplitude_Q15);
}

MiniToneGenerator::WaveGenerator::~WaveGenerator() {}

void MiniToneGenerator::WaveGenerator::getSamples(short* outBuffer, unsigned int count,
                                                  unsigned int command) {
    int64_t lS1;
    int64_t lS2;
    if (command == WAVEGEN_START) {
        lS1 = 0;
        lS2 = mS2_0;
    } else {
        lS1 = mS1;
        lS2 = mS2;
    }
    const int64_t lA1 = mA1_Q14;
    const int64_t lAmplitude = mAmplitude_Q15;

    if (command == WAVEGEN_STOP) {
        if (count == 0) return;
        // Linear fade from full amplitude to about amp/count, in Q31.
        int64_t lAmpQ31 = lAmplitude * 65536;
        const int64_t lDec = lAmpQ31 / static_cast<int64_t>(count);
        for (unsigned int i = 0; i < count; ++i) {
            int64_t y = ((lA1 * lS1) >> 14) - lS2;
            lS2 = lS1;
            lS1 = y;
            addWrapped(&outBuffer[i], ((lAmpQ31 >> 16) * y) >> 15);
            lAmpQ31 -= lDec;
        }
    } else {
        for (unsigned int i = 0; i < count; ++i) {
            int64_t y = ((lA1 * lS1) >> 14) - lS2;
            lS2 = lS1;
            lS1 = y;
            addWrapped(&outBuffer[i], (lAmplitude * y) >> 15);
        }
    }
    mS1 = static_cast<short>(lS1);
    mS2 = static_cast<short>(lS2);
}

}  // namespace android
