// The tone table and the code plan as members of the tone engine: the static table
// every engine and the listening side share, and forwarders to the plan's functions.
#include "detection/ToneCodePlan.h"
#include "tone/MiniToneGenerator.h"

namespace android {

MiniToneGenerator::ToneDescriptor MiniToneGenerator::sToneDescriptors[NUM_TONE_DESCRIPTORS];

int MiniToneGenerator::generateToneTable_ZORV() { return korvo::plan::layDownSingleFrequencyPlan(sToneDescriptors); }

int MiniToneGenerator::generateToneTable() { return korvo::plan::layDownTwoFrequencyPlan(sToneDescriptors); }

int MiniToneGenerator::getFreqTableSize() { return NUM_TONE_DESCRIPTORS; }

int MiniToneGenerator::getMaxToneIndex() { return static_cast<int>(mMaxToneIndex); }

int MiniToneGenerator::getFreqCodeFromIndex(int index) { return korvo::plan::freqCodeAt(sToneDescriptors, index); }

int MiniToneGenerator::getCodeFromTwoFreq(int first, int second) {
    return korvo::plan::codeOfPair(sToneDescriptors, first, second);
}

void MiniToneGenerator::fixFreq(int* first, int* second) { korvo::plan::fixPair(sToneDescriptors, first, second); }

}  // namespace android
