// Peak detection on a spectrum array of 256 levels. Every scan follows one rule:
// an entry becomes the running maximum only if it is strictly greater than the
// maximum so far (starting at 0.0) and than the entry examined just before it.
// So nothing at or below 0.0 and no NaN is ever a peak, and among equal largest
// values the lowest index wins. Entry 0 is a comparison value, never a peak.
// The scans run on the caller's thread, read only entries 0..255 and allocate nothing.
#include <cstdint>

#include <log/log.h>
#include <utils/Timers.h>

#include "meter/SoundMeter.h"

namespace {

const int kLastEntry = 255;
const char* const kTag = "TQX";
const char* const kWho = "SoundMeter";

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

void swapIfDescending(int* first, int* second) {
    if (*first > *second) {
        const int t = *first;
        *first = *second;
        *second = t;
    }
}

}  // namespace

// Decided: a negative start is taken as 0, so that no entry before 0 is ever read.
float SoundMeter::detectPeakFreq(float* spectrum, int start, int* index) {
    if (start < 0) start = 0;
    if (start >= kLastEntry) return 0.0f;
    // The start entry itself is skipped: the first examined entry faces the one before it.
    const PeakScan scan = scanFrom(spectrum, start, start == 0 ? 0.0f : spectrum[start - 1]);
    if (!scan.found) return 0.0f;
    *index = scan.index;
    return scan.max;
}

float SoundMeter::detectPeakFreq_zorv(float* spectrum, int start, int* index) {
    if (start < 0) start = 0;
    if (start >= kLastEntry) {
        *index = 0;
        return 0.0f;
    }
    const PeakScan scan = scanFrom(spectrum, start, spectrum[start]);
    *index = scan.index;
    return scan.max;
}

float SoundMeter::detectSecondPeakFreq_zorv(float* spectrum, int first, int* index) {
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

void SoundMeter::detectTwoPeakFreq(float unused, float* spectrum, int* first, int* second) {
    const float p1 = this->detectPeakFreq(spectrum, 0, first);
    float p2 = 0.0f;
    if (*first < 100) {
        p2 = this->detectPeakFreq(spectrum, 100, second);
    } else {
        // Low band: entry 0 stays the comparison value for every entry, and
        // entries within three of the first peak are left out.
        const float floor = spectrum[0];
        const int64_t peak = *first;
        for (int i = 1; i < 100; ++i) {
            const float v = spectrum[i];
            const bool apart = i < peak - 3 || i > peak + 3;
            if (v > p2 && v > floor && apart) {
                p2 = v;
                *second = i;
            }
        }
    }
    swapIfDescending(first, second);
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] TIME[%ld] Two Max Power is %d(%f) and %d(%f) END\n", kWho,
                        static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000), *first,
                        static_cast<double>(p1), *second, static_cast<double>(p2));
}

void SoundMeter::detectTwoPeakFreq_zorv(float unused, float* spectrum, int* first, int* second) {
    this->detectPeakFreq_zorv(spectrum, 0, first);
    this->detectSecondPeakFreq_zorv(spectrum, *first, second);
    swapIfDescending(first, second);
}
