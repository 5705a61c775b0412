// The meter object's code plan look-ups, forwarded to the tone generator.
#include "meter/SoundMeter.h"
#include "tone/MiniToneGenerator.h"

// Decided: these answer even without a tone generator, because the look-ups
// read only the static tone table (999 / 0 / unchanged until a plan exists).

int SoundMeter::getCodeFromTwoFreq(int first, int second) {
    return android::MiniToneGenerator::getCodeFromTwoFreq(first, second);
}

int SoundMeter::getFreqCodeFromIndex(int index) {
    return android::MiniToneGenerator::getFreqCodeFromIndex(index);
}

void SoundMeter::fixFreq(int* first, int* second) { android::MiniToneGenerator::fixFreq(first, second); }
