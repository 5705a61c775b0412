// A tally slot packs value * 1000 + count; slots are taken in the order the values
// first appear, so a tie goes to the value seen first.
#include "detection/FrameVoting.h"

#include <cstdint>

#include "common/LogTags.h"

namespace korvo {

namespace {

const int kFrames = kVoteFrames;

// Decided: negative or huge values go through the same packing, which wraps
// instead of overflowing; their vote means nothing but stays defined.
int32_t wrapAdd(int32_t a, int32_t b) {
    return static_cast<int32_t>(static_cast<uint32_t>(a) + static_cast<uint32_t>(b));
}
int32_t pack(int32_t value, int32_t count) {
    return wrapAdd(static_cast<int32_t>(static_cast<uint32_t>(value) * 1000u), count);
}

}  // namespace

int frequentIndex(const int* frames, int row) {
    const int* values = frames + row * kFrames;
    METER_LOGD("[%s] DETECTING FREQ IN FRAME [%d]\n", row);

    // Slot 0 starts with the first frame's value and count 0, so frame 0 is
    // always counted there through the match branch.
    int32_t tp[kFrames] = {pack(values[0], 0), 0, 0, 0, 0, 0, 0};
    for (int i = 0; i < kFrames; ++i) {
        const int v = values[i];
        METER_LOGD("[%s] DETECTING FREQ IN FRAME two peaks[%d]=%d\n", i, v);
        for (int s = 0; s < kFrames; ++s) {
            if (tp[s] / 1000 == v) {
                tp[s] = wrapAdd(tp[s], 1);
                __android_log_print(ANDROID_LOG_DEBUG, kMeterTag, "[%d] Count added to tp[%d]=%d\n", v, s, tp[s]);
                break;
            }
            if (tp[s] == 0) {
                tp[s] = pack(v, 1);
                break;
            }
        }
    }
    METER_LOGD("[%s] TP Debug\n");

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

}  // namespace korvo
