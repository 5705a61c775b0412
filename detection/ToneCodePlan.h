// The tone code plan: the records of the tone table, the two plans that can be laid
// into it and the look-ups from frequency indices back to codes. The functions work
// on a table the caller owns (the tone engine's static one); they never read past
// its last record, allocate nothing and take no lock.
#pragma once
#include <cstdint>

#include "interface/SoundMeterConstants.h"

namespace android {

// One segment of a tone.
struct ToneSegment {
    unsigned int duration;       // ms; all ones plays until stopped; 0 ends the list
    unsigned short waveFreq[4];  // Hz, the list ends at the first 0
    unsigned short loopCnt;
    unsigned short loopIndex;
};

// One record of the tone table; its index is its code.
struct ToneDescriptor {
    ToneSegment segments[13];
    unsigned int code;
    int freq_code;  // first index * 1000 + second index
};

static_assert(sizeof(ToneSegment) == 16, "ToneSegment layout");
static_assert(sizeof(ToneDescriptor) == 13 * 16 + 8, "ToneDescriptor layout");

}  // namespace android

namespace korvo {
namespace plan {

constexpr unsigned int kToneForever = 0xFFFFFFFFu;  // a segment that plays until stopped
constexpr unsigned int kEndCode = 999;              // code of the end record; "not in the plan"
constexpr int kEndFreqCode = 99999;                 // freq_code of the end record
constexpr int kTableRecords = kToneTableRecords;     // records of the tone table
constexpr int kSegments = 13;                       // segments of a record

// Lay a plan into the table and return its highest code: the single-frequency plan
// of 40 codes (39), or the two-frequency plan of 120 codes (119).
int layDownSingleFrequencyPlan(android::ToneDescriptor* table);
int layDownTwoFrequencyPlan(android::ToneDescriptor* table);

// freq_code of a record (0 for an index outside the table).
int freqCodeAt(const android::ToneDescriptor* table, int index);
// Code of the tone whose key is first * 1000 + second, or kEndCode.
int codeOfPair(const android::ToneDescriptor* table, int first, int second);
// Moves a pair to the first plan pair of its 3 x 3 neighbourhood, in place.
void fixPair(const android::ToneDescriptor* table, int* first, int* second);

}  // namespace plan
}  // namespace korvo
