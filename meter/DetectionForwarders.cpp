// The meter object's detection operations: thin forwarders to the detectors, the
// vote and the code plan. The two-peak operations call the single-peak ones through
// the meter object's own virtual operations.
#include <utils/Timers.h>

#include "detection/FrameVoting.h"
#include "detection/PeakDetection.h"
#include "common/LogTags.h"
#include "meter/SoundMeter.h"
#include "tone/MiniToneGenerator.h"

float SoundMeter::detectPeakFreq(float* spectrum, int start, int* index) {
    return korvo::detectPeakFreq(spectrum, start, index);
}

float SoundMeter::detectPeakFreq_zorv(float* spectrum, int start, int* index) {
    return korvo::detectPeakFreq_zorv(spectrum, start, index);
}

float SoundMeter::detectSecondPeakFreq_zorv(float* spectrum, int first, int* index) {
    return korvo::detectSecondPeakFreq_zorv(spectrum, first, index);
}

void SoundMeter::detectTwoPeakFreq(float unused, float* spectrum, int* first, int* second) {
    const float p1 = this->detectPeakFreq(spectrum, 0, first);
    float p2 = 0.0f;
    if (*first < 100) {
        p2 = this->detectPeakFreq(spectrum, 100, second);
    } else {
        p2 = korvo::detectLowBandPeak(spectrum, *first, second);
    }
    korvo::orderPeaks(first, second);
    METER_LOGD("[%s] TIME[%ld] Two Max Power is %d(%f) and %d(%f) END\n",
               static_cast<long>(systemTime(SYSTEM_TIME_MONOTONIC) / 1000000), *first, static_cast<double>(p1),
               *second, static_cast<double>(p2));
}

void SoundMeter::detectTwoPeakFreq_zorv(float unused, float* spectrum, int* first, int* second) {
    this->detectPeakFreq_zorv(spectrum, 0, first);
    this->detectSecondPeakFreq_zorv(spectrum, *first, second);
    korvo::orderPeaks(first, second);
}

int SoundMeter::getFrequentIndex(int* frames, int row) { return korvo::frequentIndex(frames, row); }

void SoundMeter::detectTwoPeakFrame(int* frames, int* first, int* second) {
    *first = getFrequentIndex(frames, 0);
    *second = getFrequentIndex(frames, 1);
}

// Decided: the code plan look-ups answer even without a tone generator, because they
// read only the static tone table (999 / 0 / unchanged until a plan exists).

int SoundMeter::getCodeFromTwoFreq(int first, int second) {
    return android::MiniToneGenerator::getCodeFromTwoFreq(first, second);
}

int SoundMeter::getFreqCodeFromIndex(int index) { return android::MiniToneGenerator::getFreqCodeFromIndex(index); }

void SoundMeter::fixFreq(int* first, int* second) { android::MiniToneGenerator::fixFreq(first, second); }
