#include "detection/PeakDetection.h"

#include <cstdint>

#include "interface/SoundMeterConstants.h"

namespace korvo {

namespace {

const int kLastEntry = kLastSpectrumEntry;

struct PeakScan {
    float max = 0.0f;
    int index = 0;
    float displaced = 0.0f;
    int displacedIndex = 0;
    bool found = false;

    void examine(float value, float predecessor, int i) {
        if (value > max && value > predecessor) {
            displaced = max;
            displacedIndex = index;
            max = value;
            index = i;
            found = true;
        }
    }
};

// Scans entries from+1..255; the entry before the first one is compared with `predecessor`.
PeakScan scanFrom(const float* spectrum, int from, float predecessor) {
    PeakScan scan;
    for (int i = from + 1; i <= kLastEntry; ++i) {
        scan.examine(spectrum[i], predecessor, i);
        predecessor = spectrum[i];
    }
    return scan;
}

}  // namespace

// Decided: a negative start is taken as 0, so that no entry before 0 is ever read.
float detectPeakFreq(const float* spectrum, int start, int* index) {
    if (start < 0) start = 0;
    if (start >= kLastEntry) return 0.0f;
    // The start entry itself is skipped: the first examined entry faces the one before it.
    const PeakScan scan = scanFrom(spectrum, start, start == 0 ? 0.0f : spectrum[start - 1]);
    if (!scan.found) return 0.0f;
    *index = scan.index;
    return scan.max;
}

float detectPeakFreq_zorv(const float* spectrum, int start, int* index) {
    if (start < 0) start = 0;
    if (start >= kLastEntry) {
        *index = 0;
        return 0.0f;
    }
    const PeakScan scan = scanFrom(spectrum, start, spectrum[start]);
    *index = scan.index;
    return scan.max;
}

float detectSecondPeakFreq_zorv(const float* spectrum, int first, int* index) {
    PeakScan scan;
    float predecessor = spectrum[0];
    for (int i = 1; i <= kLastEntry; ++i) {
        // The nine entries around the first peak are neither compared nor remembered.
        const int64_t distance = static_cast<int64_t>(i) - first;
        if (distance > -5 && distance < 5) continue;
        scan.examine(spectrum[i], predecessor, i);
        predecessor = spectrum[i];
    }
    // The answer is the maximum that the final one displaced, not the final one.
    *index = scan.displacedIndex;
    return scan.displaced;
}

float detectLowBandPeak(const float* spectrum, int first, int* second) {
    // Entry 0 stays the comparison value for every entry (it is not replaced by the
    // predecessor), and entries within three of the first peak are left out.
    float p2 = 0.0f;
    const float floor = spectrum[0];
    const int64_t peak = first;
    for (int i = 1; i < 100; ++i) {
        const float v = spectrum[i];
        const bool apart = i < peak - 3 || i > peak + 3;
        if (v > p2 && v > floor && apart) {
            p2 = v;
            *second = i;
        }
    }
    return p2;
}

void orderPeaks(int* first, int* second) {
    if (*first > *second) {
        const int t = *first;
        *first = *second;
        *second = t;
    }
}

}  // namespace korvo
