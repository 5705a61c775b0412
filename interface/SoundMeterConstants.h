// The numbers both ends of the link and every host agree on: capture sizes, the
// analyser's scale, the single-frequency code plan, the masked read-out's bands and the
// pace a host keeps.
// The library and the soundmeter host take them from here; nothing re-derives them.
#pragma once

namespace korvo {

// ---- capture and analysis ------------------------------------------------------
constexpr int kSampleRate = 44100;                    // capture rate, Hz
constexpr int kFrameSamples = 512;                    // samples per frame and FFT length
constexpr int kRingSlots = 5;                         // frames in the capture ring
constexpr int kRingSamples = kFrameSamples * kRingSlots;  // 2560
constexpr int kSpectrumBins = 256;                    // bins kept, and floats of a read-out array
constexpr int kLastSpectrumEntry = kSpectrumBins - 1;
constexpr double kBinHz = static_cast<double>(kSampleRate) / kFrameSamples;  // 86.1328125
constexpr double kInputScale = 1.0 / 32768.0;         // a 16-bit sample as a fraction of full scale
constexpr float kMagnitudeDivisor = 325.6832f;        // a bin's |X| is divided by this

// ---- the single-frequency code plan ---------------------------------------------
constexpr int kPlanCodes = 40;        // codes 0..39
constexpr int kFirstCodeIndex = 30;   // frequency index of code 0
constexpr int kCodeIndexStep = 10;    // between neighbouring codes
constexpr int kIndexHz = 86;          // Hz per frequency index (not the bin spacing)
constexpr int kToneTableRecords = 512;  // records of the tone table, whatever the plan

constexpr int codeIndex(int code) { return kFirstCodeIndex + kCodeIndexStep * code; }
constexpr int codeHz(int code) { return kIndexHz * codeIndex(code); }
// Code named by a frequency index, or -1 when the index is no code of the plan.
constexpr int codeOfIndex(int index) {
    return index >= codeIndex(0) && index <= codeIndex(kPlanCodes - 1) &&
                   (index - kFirstCodeIndex) % kCodeIndexStep == 0
               ? (index - kFirstCodeIndex) / kCodeIndexStep
               : -1;
}

// The code that acknowledges `code`: the next one, modulo the table (signed remainder).
constexpr int acknowledgementOf(int code) { return (code + 1) % kToneTableRecords; }

// ---- the masked read-out ----------------------------------------------------------
// Entry k (carrying bin k - 1) keeps its level only inside the code bands: 26..200,
// with k mod 10 in {0, 3, 4, 5, 6, 7}.
constexpr int kFirstBandEntry = 26;
constexpr int kLastBandEntry = 200;
constexpr bool inCodeBand(int k) {
    return k >= kFirstBandEntry && k <= kLastBandEntry &&
           (k % 10 == 0 || (k % 10 >= 3 && k % 10 <= 7));
}

// Whether a code of the plan can be heard through the masked read-out.
constexpr bool codeHearable(int code) { return code >= 0 && code < kPlanCodes && inCodeBand(codeIndex(code)); }

// ---- what a host needs to know ------------------------------------------------------
// Capture steps (processAudio calls) a device makes before it listens (151 ms): five frames
// of 11.6 ms fill the ring, and the analysis thread, one frame per 20 ms turn, takes frames
// that were captured. A count of steps, not a time: a recording loses the same frames live
// and offline.
constexpr int kWarmUpSteps = 13;
// Time a tone needs after its duration to be out of the room, in ms: the fade-out block
// (20 ms), the route's latency and some slack for a loaded machine.
constexpr int kToneTailMs = 250;

}  // namespace korvo
