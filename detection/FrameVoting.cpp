// Majority vote over seven frames of two-peak results. A tally slot packs
// value * 1000 + count; slots are taken in the order the values first appear,
// so a tie goes to the value seen first. No allocation, no lock.
#include <cstdint>

#include <log/log.h>

#include "meter/SoundMeter.h"

namespace {

const int kFrames = 7;
const char* const kTag = "TQX";
const char* const kWho = "SoundMeter";

// Decided: negative or huge values go through the same packing, which wraps
// instead of overflowing; their vote means nothing but stays defined.
int32_t wrapAdd(int32_t a, int32_t b) {
    return static_cast<int32_t>(static_cast<uint32_t>(a) + static_cast<uint32_t>(b));
}
int32_t pack(int32_t value, int32_t count) {
    return wrapAdd(static_cast<int32_t>(static_cast<uint32_t>(value) * 1000u), count);
}

}  // namespace

int SoundMeter::getFrequentIndex(int* frames, int row) {
    const int* values = frames + row * kFrames;
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] DETECTING FREQ IN FRAME [%d]\n", kWho, row);

    // Slot 0 starts with the first frame's value and count 0, so frame 0 is
    // always counted there through the match branch.
    int32_t tp[kFrames] = {pack(values[0], 0), 0, 0, 0, 0, 0, 0};
    for (int i = 0; i < kFrames; ++i) {
        const int v = values[i];
        __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] DETECTING FREQ IN FRAME two peaks[%d]=%d\n", kWho, i, v);
        for (int s = 0; s < kFrames; ++s) {
            if (tp[s] / 1000 == v) {
                tp[s] = wrapAdd(tp[s], 1);
                __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%d] Count added to tp[%d]=%d\n", v, s, tp[s]);
                break;
            }
            if (tp[s] == 0) {
                tp[s] = pack(v, 1);
                break;
            }
        }
    }
    __android_log_print(ANDROID_LOG_DEBUG, kTag, "[%s] TP Debug\n", kWho);

    int winner = 0;
    int32_t best = tp[0] % 1000 > 0 ? tp[0] % 1000 : 0;
    for (int s = 1; s < kFrames; ++s) {
        if (tp[s] % 1000 > best) {
            best = tp[s] % 1000;
            winner = s;
        }
    }
    return tp[winner] / 1000;
}

void SoundMeter::detectTwoPeakFrame(int* frames, int* first, int* second) {
    *first = getFrequentIndex(frames, 0);
    *second = getFrequentIndex(frames, 1);
}
